"""Actions that pickle and copy the finder and the cache, and that load
crafted states and pickles."""

import copy
import pickle

try:
    import cPickle
except ImportError:  # 3.x: the native pickler is pickle's; the Python one is its _dumps/_loads
    cPickle, pickle = pickle, type('PurePickle', (), {'dumps': staticmethod(pickle._dumps),
                                                      'loads': staticmethod(pickle._loads)})

try:
    long
except NameError:  # 3.x
    long = int

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache
from tallowkit.destroyable import CDestroyable

from fuzzkit import hostile, texts
from fuzzkit.calls import Finding, Short
from fuzzkit.edits import Lookups
from fuzzkit.names import ScopeNames, kRecursion

kChecksums = {CChangeFinder: 0x093a2af, CScopeBodyCache: 0xa66c71f}
kUnpicklers = {CChangeFinder: '__pyx_unpickle_CChangeFinder',
               CScopeBodyCache: '__pyx_unpickle_CScopeBodyCache'}


class PlainFinderSub(CChangeFinder):
    pass


class PlainCacheSub(CScopeBodyCache):
    pass


def _State(obj):
    reduced = obj.__reduce__()
    return reduced[2] if len(reduced) > 2 else reduced[1][2]


def _SameState(a, b, what):
    sa, sb = _State(a), _State(b)
    if len(sa) != len(sb):
        return 'state lengths %d and %d' % (len(sa), len(sb))
    for k, (x, y) in enumerate(zip(sa, sb)):
        if type(x) is list and type(y) is list:
            if [texts.Signature(l) + (l.fLineno,) for l in x] != \
                    [texts.Signature(l) + (l.fLineno,) for l in y]:
                return 'item %d (the logical list) differs' % k
        elif type(x) is dict and what == 'cache' and k in (3, 4):
            if sorted(x) != sorted(y):
                return 'item %d has keys %s, was %s' % (k, Short(sorted(y)), Short(sorted(x)))
        elif x != y and not (x is None and y is None):
            return 'item %d is %s, was %s' % (k, Short(y), Short(x))
    return None


def RoundTrip(ctx):
    rng = ctx.rng
    how = rng.choice(['pickle0', 'pickle1', 'pickle2', 'cPickle0', 'cPickle1', 'cPickle2',
                      'copy', 'deepcopy'])
    bundle = (ctx.finder, ctx.cache, ctx.doc.lst)
    if how == 'copy':
        func = copy.copy
    elif how == 'deepcopy':
        func = copy.deepcopy
    else:
        module = pickle if how.startswith('pickle') else cPickle
        proto = int(how[-1])
        func = lambda obj: module.loads(module.dumps(obj, proto))  # noqa: E731
    plain = type(ctx.finder) is CChangeFinder and type(ctx.cache) is CScopeBodyCache
    if how == 'copy':
        which = rng.choice(['finder', 'cache'])
        ok, new = ctx.Call('copy.copy', 'copy.copy(%s)' % which, func, getattr(ctx, which))
        if not ok:
            if plain:
                raise Finding('pickle', 'copy.copy(%s) raised %r' % (which, new))
            return
        problem = _SameState(getattr(ctx, which), new, which)
        if problem:
            raise Finding('pickle', 'copy.copy(%s): %s' % (which, problem))
        if new._fLogicalList is not ctx.doc.lst:
            raise Finding('pickle', 'a shallow copy does not share the logical list')
        setattr(ctx, which, new)
        if which == 'cache':   # the copy shares its dicts with the original
            Lookups(ctx)
        return
    ok, new = ctx.Call(how, '%s((finder, cache, lst))' % how, func, bundle)
    if not ok:
        if plain:
            raise Finding('pickle', '%s of the finder, cache and list raised %r' % (how, new))
        return
    finder, cache, lst = new
    for obj, old, what in ((finder, ctx.finder, 'finder'), (cache, ctx.cache, 'cache')):
        problem = _SameState(old, obj, what)
        if problem:
            raise Finding('pickle', '%s of the %s: %s' % (how, what, problem))
        if obj._fLogicalList is not lst:
            raise Finding('pickle', '%s: the %s does not hold the restored list' % (how, what))
    if rng.random() < 0.6:
        # Carry on with the restored objects: the logicals come back unnamed.
        old_names = ScopeNames(ctx.doc.lst)
        ctx.rec.Note('carry on with the restored finder, cache and list')
        ctx.doc.lst, ctx.finder, ctx.cache = lst, finder, cache
        ctx.doc.undo = None
        ctx.WholePass('after %s' % how)
        ctx.CheckCache(old_names, set(), 'the restored cache after %s' % how)


def _FinderState(ctx, lst=None):
    return [False, None, None, None, None, 0, -1,
            list(ctx.doc.lst) if lst is None else lst, -1, None]


def _CacheState(ctx):
    return [False, None, list(ctx.doc.lst), {}, {}]


def CraftState(ctx, cls):
    """A state tuple for cls with one to three things wrong (or none)."""
    rng = ctx.rng
    state = _FinderState(ctx) if cls is CChangeFinder else _CacheState(ctx)
    if cls is CChangeFinder and rng.random() < 0.3:   # a finder saved mid-find
        state[2], state[3], state[4], state[9] = set(['A#0']), set(['']), set(), {'f': 0}
        state[5], state[6], state[8] = rng.choice([(3, 2, 5), (0, -1, -1), (2 ** 40, -7, 2 ** 62)])
    for _ in range(rng.choice([0, 1, 1, 2, 3])):
        k = rng.randrange(len(state))
        state[k] = rng.choice([hostile.Value(rng, ctx.doc.lst), hostile.SetSub(),
                               hostile.DictSub(), hostile.ListSub(ctx.doc.lst), None,
                               [None, 1], 2 ** 70, -2 ** 70, -1, hostile.Evil(), set([1, None]),
                               {None: None}, ctx.doc.lst])
    r = rng.random()
    if r < 0.15:
        state = state[:rng.randrange(len(state))]
    elif r < 0.35:
        state.append(rng.choice([{'x': 1}, hostile.DictSub(y=2), 5, [1], None, hostile.Evil(),
                                 {1: 2}]))
        if rng.random() < 0.3:
            state.extend([1, 2])
    box = rng.random()
    if box < 0.05:
        return hostile.TupleSub(state)
    if box < 0.1:
        return state
    if box < 0.12:
        return None
    return tuple(state)


def _Exercise(ctx, obj, cls):
    """Uses an object made from a crafted state; nothing here may crash."""
    name = 'restored'
    ctx.Call('__reduce__', '%s.__reduce__()' % name, obj.__reduce__)
    if cls is CChangeFinder:
        ctx.Call('_Clear', 'CChangeFinder._Clear(%s)' % name, CChangeFinder._Clear, obj)
        ok, err = ctx.Call('FindChanges[restored]', '%s.FindChanges([], [])' % name,
                           obj.FindChanges, [], [])
        if not ok and isinstance(err, ValueError) and str(err) == kRecursion:
            raise Finding('stuck', 'a restored finder refuses FindChanges after _Clear')
        lst = getattr(obj, '_fLogicalList', None)
        if type(lst) is list and lst is not ctx.doc.lst:
            ctx.Call('FindChanges[restored]', '%s.FindChanges(its list, [])' % name,
                     obj.FindChanges, lst, [])
    else:
        ctx.Call('GetBodyOfScope', "%s.GetBodyOfScope('')" % name, obj.GetBodyOfScope, '')
        ctx.Call('Clear', '%s.Clear()' % name, obj.Clear)
    ctx.Call('copy.copy', 'copy.copy(%s)' % name, copy.copy, obj)
    ctx.Call('_destroy_impl', '%s._destroy_impl()' % name, obj._destroy_impl)


def BadUnpickle(ctx):
    rng = ctx.rng
    cls = rng.choice([CChangeFinder, CScopeBodyCache])
    other = CScopeBodyCache if cls is CChangeFinder else CChangeFinder
    func = getattr(sbc, kUnpicklers[cls])
    typ = rng.choice([cls, cls, cls, PlainFinderSub if cls is CChangeFinder else PlainCacheSub,
                      other, CDestroyable, object, int, None, 'CChangeFinder', hostile.Evil()])
    checksum = rng.choice([kChecksums[cls]] * 4 + [kChecksums[other], 0, -1, 2 ** 64, 'x', None,
                                                  long(kChecksums[cls]), 1.5, hostile.Evil()])
    state = CraftState(ctx, cls) if rng.random() < 0.9 else hostile.Value(rng, ctx.doc.lst)
    text = '%s(%s, %s, %s)' % (kUnpicklers[cls], Short(typ), Short(checksum), ctx.S(state))
    if rng.random() < 0.3:
        ok, obj = ctx.Call(kUnpicklers[cls], text + '  # by keyword', func, __pyx_type=typ,
                           __pyx_checksum=checksum, __pyx_state=state)
    else:
        ok, obj = ctx.Call(kUnpicklers[cls], text, func, typ, checksum, state)
    if ok and isinstance(obj, cls):
        _Exercise(ctx, obj, cls)
    if isinstance(state, (tuple, list)) and any(x is ctx.doc.lst for x in state):
        ctx.dirty = True


def BadSetstate(ctx):
    rng = ctx.rng
    which = rng.choice(['finder', 'cache', 'new'])
    cls = rng.choice([CChangeFinder, CScopeBodyCache]) if which == 'new' else \
        (CChangeFinder if which == 'finder' else CScopeBodyCache)
    obj = cls(list(ctx.doc.lst)) if which == 'new' else getattr(ctx, which)
    state = CraftState(ctx, cls)
    ctx.Call('__setstate__', '%s.__setstate__(%s)' % (which, ctx.S(state)), obj.__setstate__, state)
    if which == 'finder':
        ctx.legit_finding = True
    _Exercise(ctx, obj, cls)
    ctx.dirty = True
    if which == 'finder':
        ctx.CheckUsable('__setstate__')
    if which != 'new':
        ctx.Renew()
