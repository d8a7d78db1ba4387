"""The actions an episode is made of. Each takes the episode Context, makes its
calls through ctx.Call and checks what its oracles can check."""

import copy
import gc
import pickle
import sys
import time

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
import pysource._fastaccess as fastaccess
import pysource.symbolinfo as symbolinfo
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache
from tallowkit.destroyable import CDestroyable

from fuzzkit import hostile, texts
from fuzzkit.calls import Finding, Short
from fuzzkit.episode import (NameScript, Rows, ScopeNames, kRecursion)

kClean = [('Edit', 12), ('Lookups', 3), ('CacheClear', 2), ('RoundTrip', 2), ('Destroy', 1),
          ('WholePassAgain', 1), ('Undo', 1)]
kBad = [('Edit', 3), ('BadCall', 12), ('BadEdit', 5), ('BadListItem', 3), ('DirectStep', 3),
        ('Propagate', 2)]
kHostile = [('Edit', 2), ('HostileEdit', 12), ('HostileCache', 4), ('GlobalRebind', 4),
            ('ThreadEdit', 2)]
kPickles = [('Edit', 2), ('RoundTrip', 3), ('BadUnpickle', 10), ('BadSetstate', 4)]
kTables = {'edits': kClean, 'badargs': kBad, 'hostile': kHostile, 'pickles': kPickles,
           'mixed': kClean + kBad + kHostile + kPickles}

kChecksums = {CChangeFinder: 0x093a2af, CScopeBodyCache: 0xa66c71f}
kUnpicklers = {CChangeFinder: '__pyx_unpickle_CChangeFinder',
               CScopeBodyCache: '__pyx_unpickle_CScopeBodyCache'}


class PlainFinderSub(CChangeFinder):
    pass


class PlainCacheSub(CScopeBodyCache):
    pass


# ---------------------------------------------------------------------------
# Edits

def MakeEdit(ctx, allow_undo=False):
    """Applies a random edit to the document; returns the Edit or None."""
    rng, doc = ctx.rng, ctx.doc
    for _ in range(10):
        r = rng.random()
        try:
            if allow_undo and r < 0.1 and doc.undo is not None:
                ctx.tags.add('undo')
                return doc.Undo()
            if r < 0.13:
                return doc.Replace(ctx.src.Make(), 'replace_all')
            if r < 0.15:
                return doc.Replace(rng.choice(['', 'x = 1\n', '# c\n', '\n\n']), 'replace_small')
            lines = texts.Lines(doc.text)
            if r < 0.22:
                splices = _Move(ctx, lines)
            elif r < 0.4:
                splices = _Batch(ctx, lines)
            else:
                s = ctx.edits.One(lines)
                splices = [s] if s else []
            if not splices:
                continue
            return doc.Apply(splices, '+'.join(s.kind for s in splices))
        except texts.Rejected:
            continue
    return None


def _Batch(ctx, lines):
    splices, lo = [], 0
    for _ in range(ctx.rng.randint(2, 5)):
        s = ctx.edits.One(lines, lo)
        if s is None:
            continue
        lines = s.Apply(lines)
        splices.append(s)
        lo = s.start + len(s.new)
    return splices


def _Move(ctx, lines):
    if len(lines) < 3:
        return []
    rng = ctx.rng
    a = rng.randrange(len(lines))
    n = min(len(lines) - a, rng.randint(1, 6))
    block = lines[a:a + n]
    b = rng.randint(0, len(lines) - n)
    if b >= a:   # top to bottom: cut first, then paste below it
        return [texts.Splice(a, n, [], 'cut'), texts.Splice(b, 0, block, 'paste')]
    return [texts.Splice(b, 0, block, 'paste'), texts.Splice(a + n, n, [], 'cut')]


def CallFindChanges(ctx, finder, added, removed, kind='FindChanges[edit]'):
    """FindChanges by position, by keyword or through a **kwargs dict."""
    how = ctx.rng.random()
    if how < 0.6:
        return ctx.Call(kind, 'finder.FindChanges(%s, %s)' % (ctx.S(added), ctx.S(removed)),
                        finder.FindChanges, added, removed)
    if how < 0.8:
        return ctx.Call(kind, 'finder.FindChanges(removed_list=%s, added_list=%s)' % (
            ctx.S(removed), ctx.S(added)), finder.FindChanges, removed_list=removed,
            added_list=added)
    # The dict goes to the call as it is and holds the only references to
    # the lists, as when a caller builds it in place.
    text = 'finder.FindChanges(**kw)  # kw = {added_list: %s, removed_list: %s}' % (
        ctx.S(added), ctx.S(removed))
    ctx.kwargs = {'added_list': list(added) if type(added) is list else added,
                  'removed_list': list(removed) if type(removed) is list else removed}
    try:
        return ctx.rec.CallWith(kind, text, finder.FindChanges, (), ctx.kwargs)
    finally:
        ctx.kwargs = None


def _ResultShape(ctx, result):
    if not (type(result) is tuple and len(result) == 3 and all(type(s) is set for s in result)):
        raise Finding('result', 'FindChanges returned %s, not a tuple of three sets'
                      % Short(result))
    return result[0] | result[1] | result[2]


def Edit(ctx, allow_undo=False):
    lst = ctx.doc.lst
    old_names = ScopeNames(lst)
    edit = MakeEdit(ctx, allow_undo)
    if edit is None:
        return
    ctx.rec.Note('edit %s: %d added, %d removed' % (edit.kind, len(edit.added), len(edit.removed)))
    ids = dict((id(l), k) for k, l in enumerate(lst))
    before = Rows(lst)
    removed_rows = Rows(edit.removed)
    added_at = [ids[id(l)] for l in edit.added]
    ok, result = CallFindChanges(ctx, ctx.finder, edit.added, edit.removed)
    if not ok:
        raise Finding('raised', 'FindChanges of a clean %s edit raised %s: %s' % (
            edit.kind, type(result).__name__, result), NameScript(
                before, removed_rows, added_at, edit.text_after, 'FindChanges(added, removed)'))
    changes = _ResultShape(ctx, result)
    ctx.CheckNames('after a %s edit' % edit.kind, NameScript(
        before, removed_rows, added_at, edit.text_after, 'FindChanges(added, removed)'))
    ctx.CheckCache(old_names, changes, 'after a %s edit' % edit.kind)


def Undo(ctx):
    if ctx.known:
        return Edit(ctx)
    lst = ctx.doc.lst
    if ctx.doc.undo is None:
        return Edit(ctx)
    old_names = ScopeNames(lst)
    ctx.tags.add('undo')
    edit = ctx.doc.Undo()
    if not texts.SameReading(lst, texts.Read(ctx.doc.text)):
        raise AssertionError('fuzzer bug: undo does not read like the old text')
    ids = dict((id(l), k) for k, l in enumerate(lst))
    script = NameScript(Rows(lst), Rows(edit.removed), [ids[id(l)] for l in edit.added],
                        edit.text_after, 'FindChanges(added, removed)')
    ok, result = CallFindChanges(ctx, ctx.finder, edit.added, edit.removed)
    if not ok:
        raise Finding('raised', 'FindChanges of an undo raised %r' % (result,), script)
    changes = _ResultShape(ctx, result)
    ctx.CheckNames('after an undo (the removed logicals put back)', script)
    ctx.CheckCache(old_names, changes, 'after an undo')


def WholePassAgain(ctx):
    ctx.WholePass('again')
    ctx.Call('Clear', 'cache.Clear("*")', ctx.cache.Clear, '*')
    ctx.Warm()


def Lookups(ctx):
    fresh = CScopeBodyCache(ctx.doc.lst)
    names = ScopeNames(ctx.doc.lst) + ['nope', 'A#0.zz', 'f#99', '.', 'A#0.', hostile.Other(u'f#0')]
    for _ in range(ctx.rng.randint(1, 6)):
        name = ctx.rng.choice(names)
        method = ctx.rng.choice(['GetScopeDef', 'GetBodyOfScope', '_FindScopeDef'])
        ok, got = ctx.Call(method, 'cache.%s(%r)' % (method, name),
                           getattr(ctx.cache, method), name)
        try:
            want = (True, getattr(fresh, method)(name))
        except Exception as e:
            want = (False, e)
        same = ok == want[0] and (
            (not ok and type(got) is type(want[1])) or
            (ok and (got is want[1] or (type(got) is list and type(want[1]) is list and
                                        len(got) == len(want[1]) and
                                        all(a is b for a, b in zip(got, want[1]))))))
        # A unicode name can hit the cache although a lookup would refuse it.
        if not same and type(name) is str:
            raise Finding('cache', '%s(%r): warm cache gives %s, a fresh one %s' % (
                method, name, ctx.S(got), ctx.S(want[1])))


def CacheClear(ctx):
    names = ScopeNames(ctx.doc.lst)
    rng = ctx.rng
    some = [n for n in names if rng.random() < 0.3]
    arg = rng.choice([some, tuple(some), set(some), iter(some), '*', some + ['*'], [], None])
    if arg is None:
        ctx.Call('Clear', 'cache.Clear()', ctx.cache.Clear)
    else:
        ctx.Call('Clear', 'cache.Clear(%s)' % Short(arg), ctx.cache.Clear, arg)
    Lookups(ctx)


def Destroy(ctx):
    rng = ctx.rng
    target = rng.choice(['finder', 'cache'])
    obj = getattr(ctx, target)
    how = rng.choice(['_destroy_impl', 'destroy'])
    ctx.Call(how, '%s.%s()' % (target, how), getattr(obj, how))
    if target == 'finder':
        ok, err = ctx.Call('FindChanges[destroyed]', 'finder.FindChanges([], [])',
                           obj.FindChanges, [], [])
        if not ok and isinstance(err, ValueError) and str(err) == kRecursion:
            raise Finding('stuck', 'a destroyed finder refuses FindChanges as recursive')
    else:
        ctx.Call('GetBodyOfScope[destroyed]', "cache.GetBodyOfScope('')",
                 obj.GetBodyOfScope, '')
        ctx.Call('Clear[destroyed]', 'cache.Clear()', obj.Clear)
    ctx.Renew()


# ---------------------------------------------------------------------------
# Pickling and copies

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


# ---------------------------------------------------------------------------
# Bad arguments

kFinderMethods = (
    ('__init__', ('logical_list',), 1), ('_destroy_impl', (), 0), ('_Clear', (), 0),
    ('_PrepareForFind', (), 0), ('FindChanges', ('added_list', 'removed_list'), 2),
    ('_FindChangesEntireListAdded', (), 0), ('_GetLeafScopeWithIndex', ('logical', 'scope_index'), 2),
    ('_ProcessRemovedLogicals', ('removed_list',), 1),
    ('_ProcessAddedLogicals', ('added_list', 'indicies_to_check'), 2),
    ('_ProcessDedentedComments', ('first_comment_i',), 1),
    ('_LogicalInScopeChanged', ('logical', 'scope_name', 'old_containing_scope',
                                'old_leaf_scope'), 2),
    ('_SetLogicalScopeNames', ('logical', 'i', 'scope_name_pair'), 3),
    ('_UpdateLogicalScopeName', ('logical', 'i', 'scope_name'), 3),
    ('_UpdateContainingScope', ('logical', 'i', 'scope_name'), 3),
    ('_PropagateScopeIndexChangeForward', ('old_scope_name', 'new_scope_name', 'start_i',
                                           'end_i'), 4),
    ('_FindScopeIndexForLogical', ('logical', 'i'), 2),
    ('_FindScopeNameContainingLogical', ('i',), 1), ('__reduce__', (), 0),
    ('__setstate__', ('state',), 1), ('destroy', (), 0), ('IsDestroyed', (), 0))
kCacheMethods = (
    ('__init__', ('logical_list',), 1), ('_destroy_impl', (), 0),
    ('GetBodyOfScope', ('scope_name',), 1), ('Clear', ('scope_names',), 0),
    ('GetScopeDef', ('scope_name',), 1), ('_FindScopeDef', ('scope_name',), 1),
    ('_FindBodyOfScopeDef', ('scope_def',), 1), ('__reduce__', (), 0),
    ('__setstate__', ('state',), 1))
kFunctions = (
    ('GetFullNameForScopeDef', ('scope_def',), 1),
    ('__pyx_unpickle_CChangeFinder', ('__pyx_type', '__pyx_checksum', '__pyx_state'), 3),
    ('__pyx_unpickle_CScopeBodyCache', ('__pyx_type', '__pyx_checksum', '__pyx_state'), 3),
    ('LogicalCheck', ('logical',), 1), ('RaiseIfNotLogical', ('logical',), 1),
    ('IsWhitespaceLogical', ('logical',), 1), ('IsScopeStartLogical', ('logical',), 1),
    ('GetLocalScopeDefined', ('logical',), 1), ('SetLogicalLocalScopeDefined', ('logical', 'name'), 2),
    ('PySet_InplaceOr', ('set_obj', 'to_add'), 2), ('ULongLongValueForDoubleBits', ('f',), 1),
    ('DoubleValueForULongLongBits', ('l',), 1), ('DoubleValueForPyIntBits', ('l',), 1),
    ('GetNowTime', (), 0), ('OutOfTime', ('end_time',), 1), ('IsDefKind', ('kind',), 1),
    ('GetInfoBytesKind', ('ibytes',), 1))


def Plausible(ctx, param, junk_only=False):
    """A value for `param` that is right or near-right more often than not."""
    rng, lst = ctx.rng, ctx.doc.lst
    if rng.random() < 0.25:
        return hostile.Value(rng, lst, junk_only)
    n = len(lst)
    names = ScopeNames(lst)
    if param in ('logical', 'scope_def'):
        if lst and rng.random() < 0.8:
            scopes = [l for l in lst if type(l) is hostile.LogicalLineType and l.fKind in (1, 2)]
            return rng.choice(scopes if scopes and rng.random() < 0.5 else lst)
        return None if junk_only else hostile.OddLogical(rng)
    if param in ('i', 'first_comment_i', 'start_i', 'end_i', 'scope_index'):
        return rng.choice([rng.randint(-3, n + 3), rng.randint(0, max(0, n - 1)), -2 ** 63,
                           2 ** 63 - 1, n])
    if param in ('scope_name', 'old_scope_name', 'new_scope_name', 'old_containing_scope',
                 'old_leaf_scope', 'name'):
        return rng.choice(names + [None, 'zz', 'f#1', hostile.StrSub('A#0')])
    if param == 'scope_name_pair':
        return rng.choice([(rng.choice(names), 'f#0'), [rng.choice(names), None], ('',),
                           ('', 'f', 'g'), iter(['', 'f#0']), 'ab', None])
    if param in ('added_list', 'removed_list', 'indicies_to_check', 'logical_list'):
        if param == 'indicies_to_check':
            return [rng.randint(-2, n + 2) for _ in range(rng.randint(0, 4))]
        pool = list(lst[:rng.randint(0, n)]) if rng.random() < 0.7 else []
        if not junk_only and rng.random() < 0.3:
            pool.append(hostile.OddLogical(rng))
        if rng.random() < 0.2:
            pool.insert(rng.randint(0, len(pool)), hostile.Value(rng, lst, True))
        return rng.choice([pool, pool, lst if param != 'added_list' else pool,
                           hostile.ListSub(pool), tuple(pool), None])
    if param == 'scope_names':
        some = names[:rng.randint(0, len(names))]
        return rng.choice([some, tuple(some), '*', some + ['*'], iter(some), [hostile.Evil()],
                           [hostile.Trap(lambda: ctx.cache.Clear(), '*')], None, 5])
    if param == 'state':
        return CraftState(ctx, rng.choice([CChangeFinder, CScopeBodyCache]))
    if param == '__pyx_type':
        return rng.choice([CChangeFinder, CScopeBodyCache, PlainFinderSub, int, None])
    if param == '__pyx_checksum':
        return rng.choice(list(kChecksums.values()) + [0, -1, 2 ** 64])
    if param == '__pyx_state':
        return CraftState(ctx, rng.choice([CChangeFinder, CScopeBodyCache]))
    if param == 'set_obj':
        return rng.choice([set(['a']), None, hostile.SetSub(['a']), frozenset(), {}])
    if param == 'to_add':
        return rng.choice([set(['b']), frozenset(['a']), ['x'], None, hostile.SetSub(['c'])])
    if param in ('f', 'end_time'):
        return rng.choice([0.0, -1.5, float('inf'), float('nan'), 1e300, 2 ** 80, 'x'])
    if param in ('l', 'kind'):
        return rng.choice([0, -1, 127, 128, -129, 2 ** 64 - 1, 2 ** 64, -2 ** 63, 1.0])
    if param == 'ibytes':
        return rng.choice(['', ':', ':x', 'ab', None, hostile.Other(u':x'), hostile.StrSub(':y'), bytearray(b':z')])
    return hostile.Value(rng, lst, junk_only)


def _BadArgs(ctx, params, required, junk_only):
    rng = ctx.rng
    mode = rng.choice(['values'] * 5 + ['count', 'kw', 'kw_unknown', 'kw_dup', 'kw_nonstr'])
    top = rng.randint(required, len(params))
    args = [Plausible(ctx, p, junk_only) for p in params[:top]]
    kwargs = {}
    if mode == 'count':
        wrong = [k for k in range(len(params) + 3) if not required <= k <= len(params)]
        k = rng.choice(wrong)
        args = [Plausible(ctx, params[j] if j < len(params) else 'x', junk_only)
                for j in range(k)]
    elif mode == 'kw' and args:
        cut = rng.randint(0, len(args))
        kwargs = dict(zip(params[cut:top], args[cut:]))
        args = args[:cut]
    elif mode == 'kw_unknown':
        kwargs = {rng.choice(['bogus', (params[0] if params else 'x') + '_']): 1}
    elif mode == 'kw_dup' and params:
        args = [Plausible(ctx, p, junk_only) for p in params]
        kwargs = {params[0]: args[0]}
    elif mode == 'kw_nonstr':
        kwargs = {1: 2}
    return args, kwargs


def BadCall(ctx):
    rng = ctx.rng
    r = rng.random()
    where = 'finder'
    if r < 0.5:
        name, params, required = rng.choice(kFinderMethods)
        which = rng.choice(['live', 'live', 'finding', 'new', 'destroyed', 'subclass'])
        if which in ('live', 'finding'):
            target = ctx.finder
        elif which == 'new':
            target = CChangeFinder.__new__(rng.choice([CChangeFinder, PlainFinderSub]))
        elif which == 'destroyed':
            target = CChangeFinder(list(ctx.doc.lst))
            target._destroy_impl()
        else:
            target = PlainFinderSub(ctx.doc.lst)
        func = getattr(target, name) if rng.random() < 0.9 else (
            lambda *a, **k: getattr(CChangeFinder, name)(rng.choice([ctx.cache, None, 5]), *a,
                                                         **k))
        where = '%s finder' % which
    elif r < 0.75:
        name, params, required = rng.choice(kCacheMethods)
        which = rng.choice(['live', 'live', 'new', 'subclass'])
        target = ctx.cache if which == 'live' else (
            CScopeBodyCache.__new__(CScopeBodyCache) if which == 'new'
            else PlainCacheSub(ctx.doc.lst))
        func = getattr(target, name)
        where = '%s cache' % which
    else:
        name, params, required = rng.choice(kFunctions)
        func = getattr(sbc, name)
        where = 'module'
        which = 'module'
    junk_only = name in ('FindChanges', '_ProcessAddedLogicals') and not ctx.ForeignOK()
    args, kwargs = _BadArgs(ctx, params, required, junk_only)
    if which == 'finding':
        ctx.Call('_PrepareForFind', 'CChangeFinder._PrepareForFind(finder)',
                 CChangeFinder._PrepareForFind, ctx.finder)
    text = '%s.%s(%s%s)' % (where, name, ', '.join(ctx.S(a) for a in args),
                            ''.join(', %s=%s' % (k, ctx.S(v)) for k, v in kwargs.items()))
    ok, result = ctx.rec.CallWith('%s[bad]' % name, text, func, args, kwargs)
    if which == 'finding':
        ctx.Call('_Clear', 'CChangeFinder._Clear(finder)', CChangeFinder._Clear, ctx.finder)
    if which == 'live' and name in ('_PrepareForFind', '__setstate__', '__init__'):
        ctx.legit_finding = True
    if ok and name == 'FindChanges' and which == 'live' and ctx.finder._fLogicalList is \
            ctx.doc.lst and _ListIsClean(ctx):
        if any(type(l) is hostile.LogicalLineType and not _InList(ctx, l)
               for l in (args[0] if args else kwargs.get('added_list')) or []):
            ctx.tags.add('foreign-added-O' if ctx.optimized else 'foreign-added')
        ctx.CheckNames('a FindChanges with odd arguments returned normally')
    ctx.CheckUsable('%s.%s with odd arguments' % (where, name))
    ctx.dirty = True
    ctx.Resync()


def _InList(ctx, l):
    return any(x is l for x in ctx.doc.lst)


def _ListIsClean(ctx):
    return texts.SameReading(ctx.doc.lst, texts.Read(ctx.doc.text))


def BadEdit(ctx):
    """A real edit whose added and removed lists carry something more."""
    rng = ctx.rng
    edit = MakeEdit(ctx)
    if edit is None:
        return
    added, removed = list(edit.added), list(edit.removed)
    lst = ctx.doc.lst
    for _ in range(rng.randint(1, 3)):
        target = rng.choice([added, removed])
        junk = rng.choice([
            hostile.Value(rng, lst, target is added and not ctx.ForeignOK()),
            rng.choice(lst) if lst else None,
            hostile.OddLogical(rng) if target is removed or ctx.ForeignOK() else hostile.Evil(),
            added[0] if added else None, hostile.LogicalSub(['x'], 1, 0, 0)])
        target.insert(rng.randint(0, len(target)), junk)
    if rng.random() < 0.15:
        added = rng.choice([hostile.ListSub(added), tuple(added), None])
    if rng.random() < 0.1:
        removed = rng.choice([hostile.ListSub(removed), None, set()])
    foreign = type(added) is list and any(
        type(l) is hostile.LogicalLineType and not _InList(ctx, l) for l in added)
    if foreign:
        ctx.tags.add('foreign-added-O' if ctx.optimized else 'foreign-added')
    ok, result = CallFindChanges(ctx, ctx.finder, added, removed, 'FindChanges[bad edit]')
    if ok:
        ctx.CheckNames('a %s edit with extra items in added/removed returned normally' % edit.kind)
    ctx.CheckUsable('an edit with bad added/removed lists')
    ctx.dirty = True
    ctx.Resync()


def BadListItem(ctx):
    """A real edit, then a bad item put into the list before FindChanges."""
    rng = ctx.rng
    edit = MakeEdit(ctx)
    if edit is None:
        return
    lst = ctx.doc.lst
    bad = rng.choice([None, 5, 'x', hostile.Evil(), hostile.LogicalSub(['x'], 1, 0, 0),
                      hostile.OddLogical(rng), [], hostile.Trap(lambda: None)])
    p = rng.randint(0, len(lst))
    near_ws = any(0 <= q < len(lst) and type(lst[q]) is hostile.LogicalLineType and
                  lst[q].fKind in (21, 22) for q in range(p - 3, p))
    if near_ws and ctx.optimized:
        if ctx.known:
            p = len(lst) if not lst or lst[-1].fKind not in (21, 22) else 0
        else:
            ctx.tags.add('bad-after-comment-O')
    lst.insert(p, bad)
    ctx.rec.Note('put %s into the list at %d' % (Short(bad), p))
    added = list(edit.added)
    if rng.random() < 0.3:
        added.insert(rng.randint(0, len(added)), bad)
    ok, result = CallFindChanges(ctx, ctx.finder, added, edit.removed, 'FindChanges[bad list]')
    if ok and type(bad) is not hostile.LogicalLineType:
        ctx.CheckUnnamed(edit.added, 'FindChanges with %s in the list' % Short(bad))
    ctx.CheckUsable('FindChanges with a bad item in the list')
    ctx.dirty = True
    ctx.Resync()


kDirectSteps = [s for s in kFinderMethods if s[0] in (
    '_GetLeafScopeWithIndex', '_ProcessRemovedLogicals', '_ProcessAddedLogicals',
    '_ProcessDedentedComments', '_LogicalInScopeChanged', '_SetLogicalScopeNames',
    '_UpdateLogicalScopeName', '_UpdateContainingScope', '_PropagateScopeIndexChangeForward',
    '_FindScopeIndexForLogical', '_FindScopeNameContainingLogical',
    '_FindChangesEntireListAdded')]


def DirectStep(ctx):
    """Steps called from outside, inside a find the fuzzer opened itself."""
    rng = ctx.rng
    ctx.Call('_PrepareForFind', 'finder._PrepareForFind()', ctx.finder._PrepareForFind)
    ctx.legit_finding = True
    for _ in range(rng.randint(1, 4)):
        name, params, required = rng.choice(kDirectSteps)
        junk_only = name == '_ProcessAddedLogicals' and not ctx.ForeignOK()
        args = [Plausible(ctx, p, junk_only) for p in params[:rng.randint(required, len(params))]]
        ctx.Call('%s[direct]' % name, 'finder.%s(%s)' % (name, ', '.join(ctx.S(a) for a in args)),
                 getattr(ctx.finder, name), *args)
    ctx.CheckUsable('steps called directly')
    ctx.dirty = True
    ctx.Resync()


def Propagate(ctx):
    """_PropagateScopeIndexChangeForward rewrites only names inside the old scope."""
    rng, lst = ctx.rng, ctx.doc.lst
    named = [k for k, l in enumerate(lst) if l.fScopeName]
    if not named:
        return
    k = rng.choice(named)
    name = lst[k].fScopeName
    # Whole components, or the last one with trailing index digits dropped:
    # each is a scope name that can occur.
    parts = name.split('.')
    cuts = ['.'.join(parts[:j]) for j in range(1, len(parts) + 1)]
    for j, part in enumerate(parts):
        bare, _, index = part.rpartition('#')
        if len(index) > 1:
            cuts.append('.'.join(parts[:j] + [bare + '#' + index[:-1]]))
    old = rng.choice(cuts)
    sep = symbolinfo.JoinTwoScopeNames('a', 'b')[1:-1]
    collides = any(l.fScopeName and l.fScopeName.startswith(old) and l.fScopeName != old and
                   not l.fScopeName.startswith(old + sep) for l in lst)
    if collides:
        if ctx.known:
            return
        ctx.tags.add('propagate-prefix')
    new = old + '9' if rng.random() < 0.5 else 'Z#0'
    end = rng.choice([len(lst), k + rng.randint(0, 8), len(lst) + 3])
    before = [l.fScopeName for l in lst]
    ctx.Call('_PrepareForFind', 'finder._PrepareForFind()', ctx.finder._PrepareForFind)
    ctx.legit_finding = True
    ctx.Call('_PropagateScopeIndexChangeForward[direct]',
             'finder._PropagateScopeIndexChangeForward(%r, %r, %d, %d)' % (old, new, k, end),
             ctx.finder._PropagateScopeIndexChangeForward, old, new, k, end)
    wrong = [(j, b, l.fScopeName) for j, (b, l) in enumerate(zip(before, lst))
             if l.fScopeName != b and not (b == old or b.startswith(old + sep))]
    if wrong:
        raise Finding('propagate', '_PropagateScopeIndexChangeForward(%r, %r, %d, %d) rewrote '
                      'names outside %r: %s' % (old, new, k, end, old, Short(wrong)))
    ctx.CheckUsable('_PropagateScopeIndexChangeForward')
    ctx.dirty = True
    ctx.Resync()


# ---------------------------------------------------------------------------
# Hostile overrides

def _Raise(ctx):
    exc = ctx.rng.choice([ValueError('hostile'), KeyError('k'), RuntimeError('r'), MemoryError(),
                          hostile.HostileBase(), StopIteration(), AssertionError(),
                          IndexError('i'), hostile.HostileError('h'), SystemExit(3)])
    raise exc


def act_raise(ctx, self, base, args, kwargs):
    _Raise(ctx)


def act_raise_after(ctx, self, base, args, kwargs):
    base(self, *args, **kwargs)
    _Raise(ctx)


def act_wrong(ctx, self, base, args, kwargs):
    if base.__name__ == '_Clear':
        ctx.legit_finding = True   # an override that skips the base _Clear keeps the find open
    return hostile.Value(ctx.rng, ctx.doc.lst)


def act_wrong_after(ctx, self, base, args, kwargs):
    base(self, *args, **kwargs)
    return hostile.Value(ctx.rng, ctx.doc.lst)


def act_reenter(ctx, self, base, args, kwargs):
    try:
        self.FindChanges([], [])
    except ValueError:
        if ctx.rng.random() < 0.3:
            raise
    return base(self, *args, **kwargs)


def act_reenter_other(ctx, self, base, args, kwargs):
    lst = getattr(self, '_fLogicalList', None)
    other = CChangeFinder(lst)
    other.FindChanges(lst, [])
    return base(self, *args, **kwargs)


def _Mutate(ctx, lst):
    if type(lst) is not list:
        return
    rng = ctx.rng
    ctx.dirty = True
    r = rng.random()
    if r < 0.3 and lst:
        del lst[rng.randrange(len(lst))]
    elif r < 0.5:
        lst.insert(rng.randint(0, len(lst)), texts.Clone(rng.choice(lst)) if lst else
                   hostile.Logical(['x']))
    elif r < 0.6:
        lst.insert(rng.randint(0, len(lst)), hostile.Value(rng, lst, True))
    elif r < 0.7:
        del lst[rng.randint(0, len(lst)):]
    elif r < 0.8:
        lst.reverse()
    elif r < 0.9:
        lst.append(hostile.OddLogical(rng))
    else:
        del lst[:]


def act_mutate(ctx, self, base, args, kwargs):
    _Mutate(ctx, getattr(self, '_fLogicalList', None))
    return base(self, *args, **kwargs)


def act_clear_mid(ctx, self, base, args, kwargs):
    base_class = CChangeFinder if isinstance(self, CChangeFinder) else CScopeBodyCache
    (CChangeFinder._Clear if base_class is CChangeFinder else CScopeBodyCache.Clear)(self)
    return base(self, *args, **kwargs)


def act_destroy_mid(ctx, self, base, args, kwargs):
    self._destroy_impl() if ctx.rng.random() < 0.5 else self.destroy()
    return base(self, *args, **kwargs)


def act_prepare_mid(ctx, self, base, args, kwargs):
    if isinstance(self, CChangeFinder):
        CChangeFinder._PrepareForFind(self)
    return base(self, *args, **kwargs)


def act_gc(ctx, self, base, args, kwargs):
    gc.collect()
    result = base(self, *args, **kwargs)
    gc.collect()
    return result


def act_copy_self(ctx, self, base, args, kwargs):
    twin = copy.copy(self)
    reduced = self.__reduce__()
    if len(reduced) > 2:
        rebuilt = reduced[0](*reduced[1])
        rebuilt.__setstate__(reduced[2])
    del twin
    return base(self, *args, **kwargs)


def act_setstate_mid(ctx, self, base, args, kwargs):
    cls = CChangeFinder if isinstance(self, CChangeFinder) else CScopeBodyCache
    state = list(_State(self))
    k = 7 if cls is CChangeFinder else 2
    if ctx.rng.random() < 0.5:
        state[k] = ctx.rng.choice([None, [], list(ctx.doc.lst)[:3], list(ctx.doc.lst)])
    else:
        state[ctx.rng.randrange(len(state))] = None
    ctx.dirty = True
    self.__setstate__(tuple(state[:len(_State(self))]))
    return base(self, *args, **kwargs)


def act_rebind(ctx, self, base, args, kwargs):
    Rebind(ctx)
    return base(self, *args, **kwargs)


def act_thread(ctx, self, base, args, kwargs):
    rng = ctx.rng
    lst = getattr(self, '_fLogicalList', None)
    finder, cache = ctx.finder, ctx.cache
    job = rng.choice([lambda: finder.FindChanges([], []), lambda: cache.GetBodyOfScope(''),
                      lambda: _Mutate(ctx, lst), lambda: CChangeFinder._Clear(finder),
                      lambda: finder._destroy_impl(), lambda: CScopeBodyCache.Clear(cache),
                      lambda: sbc.GetFullNameForScopeDef(lst[-1] if lst else None)])
    t = ctx.threads.Start(job)
    t.join(rng.choice([0, 0.01, 0.5]))
    return base(self, *args, **kwargs)


def act_kwargs_clear(ctx, self, base, args, kwargs):
    if ctx.kwargs is not None:
        ctx.tags.add('kwargs-clear')
        ctx.kwargs.clear()
        gc.collect()
    return base(self, *args, **kwargs)


def act_instance_attr(ctx, self, base, args, kwargs):
    rng = ctx.rng
    steps = [s for s in hostile.kFinderSteps if not (ctx.known and s == '_Clear')]
    step = rng.choice(steps)
    value = rng.choice([5, None, lambda *a: hostile.Value(rng, ctx.doc.lst),
                        getattr(CChangeFinder, step).__get__(self)])
    if step == '_Clear':
        if callable(value) and not hasattr(value, '__self__'):
            ctx.legit_finding = True   # a _Clear that skips the base one keeps the find open
        elif not callable(value):
            ctx.tags.add('clear-fails')
    ctx.rec.Note('instance attribute %s = %s' % (step, Short(value)))
    try:
        self.__dict__[step] = value
    except AttributeError:
        pass
    return base(self, *args, **kwargs)


def act_mangle(ctx, self, base, args, kwargs):
    rng = ctx.rng
    args = list(args)
    name = base.__name__
    if name == '_ProcessAddedLogicals' and len(args) == 2:
        added = list(args[0]) if type(args[0]) is list else []
        added.append(hostile.Value(rng, ctx.doc.lst, not ctx.ForeignOK()))
        ind = args[1]
        if type(ind) is list:
            ind.append(rng.choice([2 ** 40, -5, hostile.Evil(), 'x', hostile.Trap(
                lambda: _Mutate(ctx, ctx.doc.lst), 0)]))
        args[0] = added
    elif name == '_ProcessDedentedComments' and args:
        args[0] = args[0] + rng.choice([1, -1, 1000, -1000]) if isinstance(args[0], int) else 0
    elif args:
        k = rng.randrange(len(args))
        args[k] = hostile.Value(rng, ctx.doc.lst, not ctx.ForeignOK())
    return base(self, *args, **kwargs)


def act_trap_result(ctx, self, base, args, kwargs):
    """An int-like result whose conversion changes the finder's world."""
    result = base(self, *args, **kwargs)
    lst = getattr(self, '_fLogicalList', None)
    action = ctx.rng.choice([lambda: _Mutate(ctx, lst), lambda: CChangeFinder._Clear(self),
                             lambda: gc.collect(), lambda: self.FindChanges([], [])])
    if isinstance(result, (int, long)):
        return hostile.Trap(action, result)
    if type(result) is list:
        return [hostile.Trap(action, x) if isinstance(x, (int, long)) else x for x in result]
    return result


def act_yield(ctx, self, base, args, kwargs):
    time.sleep(0)
    return base(self, *args, **kwargs)


kActs = [act_raise, act_raise_after, act_wrong, act_wrong_after, act_reenter, act_reenter_other,
         act_mutate, act_clear_mid, act_destroy_mid, act_prepare_mid, act_gc, act_copy_self,
         act_setstate_mid, act_rebind, act_thread, act_kwargs_clear, act_instance_attr,
         act_mangle, act_trap_result]
kClearSafe = (act_wrong, act_wrong_after, act_gc, act_thread, act_rebind, act_yield)


def ScheduleActs(ctx, steps):
    rng = ctx.rng
    for _ in range(rng.choice([1, 1, 2, 3])):
        step = rng.choice(steps)
        acts = list(kActs)
        if ctx.known:
            acts.remove(act_kwargs_clear)
            if step == '_PrepareForFind':
                acts.remove(act_raise_after)
            if step == '_Clear':
                acts = list(kClearSafe)
        act = rng.choice(acts)
        if not ctx.known and rng.random() < 0.05:
            act = act_kwargs_clear
        repeat = act in (act_gc, act_wrong, act_raise, act_yield, act_trap_result) and \
            rng.random() < 0.2
        on_call = rng.randint(1, 6)
        ctx.rec.Note('schedule %s on call %d%s of %s' % (act.__name__, on_call,
                                                        ' and after' if repeat else '', step))
        ctx.plan.Add(step, on_call, act, repeat)


def OnFire(ctx, step, act):
    """Tags the known shapes when their act runs."""
    if step == '_PrepareForFind' and act is act_raise_after:
        ctx.tags.add('prepare-raise-after-base')
    if step == '_Clear' and act not in kClearSafe:
        ctx.tags.add('clear-fails')


def _OverriddenSteps(ctx, cls, names):
    return [s for s in names if s in cls.__dict__]


def HostileEdit(ctx):
    steps = _OverriddenSteps(ctx, ctx.finder_class, hostile.kFinderSteps)
    if not steps:
        return Edit(ctx)
    ctx.plan.acts.clear()
    ctx.plan.calls.clear()
    ScheduleActs(ctx, steps)
    edit = MakeEdit(ctx)
    if edit is None:
        return
    ctx.plan.armed = True
    try:
        if ctx.rng.random() < 0.15:
            CallFindChanges(ctx, ctx.finder, ctx.doc.lst, [], 'FindChanges[hostile whole]')
        else:
            CallFindChanges(ctx, ctx.finder, edit.added, edit.removed, 'FindChanges[hostile]')
    finally:
        ctx.plan.armed = False
    ctx.rec.Note('acts fired: %s' % (ctx.plan.fired[-6:],))
    ctx.CheckUsable('a FindChanges with hostile overrides')
    ctx.dirty = True
    ctx.Resync()


def HostileCache(ctx):
    steps = _OverriddenSteps(ctx, ctx.cache_class, hostile.kCacheSteps)
    rng = ctx.rng
    ctx.plan.acts.clear()
    ctx.plan.calls.clear()
    for _ in range(rng.randint(1, 3)):
        if steps:
            ctx.plan.Add(rng.choice(steps), rng.randint(1, 4), rng.choice(
                [act_raise, act_wrong, act_wrong_after, act_mutate, act_clear_mid,
                 act_destroy_mid, act_gc, act_rebind, act_thread, act_setstate_mid, act_copy_self]))
    ctx.plan.armed = True
    try:
        names = ScopeNames(ctx.doc.lst) + ['nope']
        for _ in range(rng.randint(2, 8)):
            method = rng.choice(['GetScopeDef', 'GetBodyOfScope', '_FindScopeDef',
                                 '_FindBodyOfScopeDef', 'Clear'])
            if method == '_FindBodyOfScopeDef':
                arg = rng.choice([None] + [l for l in ctx.doc.lst if type(l) is
                                          hostile.LogicalLineType and l.fKind in (1, 2)] +
                                 [hostile.Value(rng, ctx.doc.lst)])
            elif method == 'Clear':
                arg = Plausible(ctx, 'scope_names')
            else:
                arg = rng.choice(names)
            ctx.Call('%s[hostile]' % method, 'cache.%s(%s)' % (method, ctx.S(arg)),
                     getattr(ctx.cache, method), arg)
    finally:
        ctx.plan.armed = False
    ctx.CheckUsable('cache lookups with hostile overrides')
    ctx.dirty = True
    ctx.Resync()


def _FakeFunc(ctx, real):
    rng = ctx.rng
    kind = rng.choice(['junk', 'raise', 'shift', 'mutate', 'reenter', 'real'])

    def fake(*args):
        if kind == 'junk':
            return hostile.Value(rng, ctx.doc.lst)
        if kind == 'raise':
            raise hostile.HostileError('fake')
        if kind == 'mutate':
            _Mutate(ctx, args[0] if args and type(args[0]) is list else ctx.doc.lst)
        if kind == 'reenter':
            try:
                ctx.finder.FindChanges([], [])
            except ValueError:
                pass
            ctx.cache.GetBodyOfScope('')
        result = real(*args)
        if kind == 'shift' and isinstance(result, (int, long)):
            return result + rng.choice([-2, -1, 1, 2, 10 ** 6, -10 ** 6])
        return result
    fake.__name__ = 'fake_%s_%s' % (kind, getattr(real, '__name__', '?'))
    return fake


def Rebind(ctx):
    rng = ctx.rng
    name = rng.choice(hostile.kGlobals)
    r = rng.random()
    if r < 0.1:
        value = hostile.Missing
    elif r < 0.2:
        value = rng.choice([None, 5, hostile.Evil(), 'x'])
    elif name == '_fastaccess':
        attr = rng.choice(['IndexForLineno', 'FindIndexOfLogical'])
        value = hostile.FakeModule(fastaccess, attr, hostile.Missing if rng.random() < 0.1 else
                                   _FakeFunc(ctx, getattr(fastaccess, attr)))
    elif name == 'symbolinfo':
        value = hostile.FakeModule(symbolinfo, 'LeafScopeNameHasIndex', rng.choice([
            hostile.Missing, _FakeFunc(ctx, symbolinfo.LeafScopeNameHasIndex),
            lambda n: hostile.Trap(lambda: _Mutate(ctx, ctx.doc.lst), 1),
            lambda n: hostile.Evil()]))
    else:
        value = _FakeFunc(ctx, sbc.GetFullNameForScopeDef)
    what = Short(value)
    if isinstance(value, type(sys)):
        what = 'a copy of %s with %s' % (value.__name__, ', '.join(
            '%s=%s' % (k, getattr(value.__dict__.get(k), '__name__', 'missing'))
            for k in ('IndexForLineno', 'FindIndexOfLogical', 'LeafScopeNameHasIndex')
            if k in sys.modules[value.__name__].__dict__ and
            getattr(value.__dict__.get(k), '__name__', 'missing') != k))
    ctx.rec.Note('rebind %s to %s' % (name, what))
    ctx.globals.Set(name, value)


def GlobalRebind(ctx):
    Rebind(ctx)
    try:
        if ctx.rng.random() < 0.7:
            edit = MakeEdit(ctx)
            if edit is not None:
                CallFindChanges(ctx, ctx.finder, edit.added, edit.removed, 'FindChanges[rebound]')
        for _ in range(ctx.rng.randint(0, 3)):
            name = ctx.rng.choice(ScopeNames(ctx.doc.lst) + ['zz'])
            ctx.Call('GetBodyOfScope[rebound]', 'cache.GetBodyOfScope(%r)' % name,
                     ctx.cache.GetBodyOfScope, name)
            ctx.Call('GetScopeDef[rebound]', 'cache.GetScopeDef(%r)' % name,
                     ctx.cache.GetScopeDef, name)
    finally:
        ctx.globals.Restore()
    ctx.CheckUsable('calls with a module global rebound')
    ctx.dirty = True
    ctx.Resync()


def ThreadEdit(ctx):
    """A second thread works on the same finder and cache while the first is
    inside FindChanges (the interpreter switches threads in the overrides)."""
    steps = _OverriddenSteps(ctx, ctx.finder_class, hostile.kFinderSteps)
    if not steps:
        return Edit(ctx)
    rng = ctx.rng
    ctx.plan.acts.clear()
    ctx.plan.calls.clear()
    for step in steps[:4]:
        ctx.plan.Add(step, 1, act_yield, True)
    stop = []
    finder, cache = ctx.finder, ctx.cache

    def Worker():
        while not stop:
            for job in (lambda: finder.FindChanges([], []), lambda: cache.GetBodyOfScope(''),
                        lambda: cache.Clear(), lambda: finder.__reduce__()):
                try:
                    job()
                except Exception:
                    pass
            time.sleep(0)
    hostile.SetSwitchInterval(rng.choice([1, 5, 50]))
    ctx.threads.Start(Worker)
    edit = MakeEdit(ctx)
    ctx.plan.armed = True
    try:
        if edit is not None:
            CallFindChanges(ctx, ctx.finder, edit.added, edit.removed, 'FindChanges[threaded]')
    finally:
        ctx.plan.armed = False
        stop.append(1)
    ctx.CheckUsable('FindChanges with a second thread in the finder')
    hostile.SetSwitchInterval(100)
    ctx.dirty = True
    ctx.Resync()


# ---------------------------------------------------------------------------
# Planted faults: they check that the oracles and the supervisor report

def Plant(ctx):
    if ctx.plant == 'crash':
        import os
        os.abort()
    elif ctx.plant == 'hang':
        while True:
            time.sleep(1)
    elif ctx.plant == 'stuck':
        ctx.finder._PrepareForFind()
        ctx.CheckUsable('a planted _PrepareForFind')
    elif ctx.plant == 'names':
        # A kept logical with a wrong name, then a call that visits nothing.
        if not ctx.doc.lst:
            ctx.doc.Replace('x = 1\n', 'replace_small')
            ctx.WholePass('planted')
        ctx.doc.lst[-1].fScopeName = 'planted'
        script = NameScript(Rows(ctx.doc.lst), [], [], ctx.doc.text, 'FindChanges([], [])')
        ctx.Call('FindChanges[edit]', 'finder.FindChanges([], [])', ctx.finder.FindChanges, [], [])
        ctx.CheckNames('a planted name', script)
    elif ctx.plant == 'leak':
        _kPlanted.append([object() for _ in range(5)])


_kPlanted = []
