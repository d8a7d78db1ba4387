"""Actions with hostile overrides: steps that raise, re-enter, mutate the
list, copy or clear the finder mid-call; rebound module globals; a second
thread."""

import copy
import gc
import sys
import time

try:
    long
except NameError:  # 3.x
    long = int

import pysource.scopebodycache as sbc
import pysource._fastaccess as fastaccess
import pysource.symbolinfo as symbolinfo
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from fuzzkit import hostile, texts
from fuzzkit.badargs import Plausible
from fuzzkit.calls import Short
from fuzzkit.edits import CallFindChanges, Edit, MakeEdit
from fuzzkit.names import ScopeNames
from fuzzkit.pickles import _State

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
