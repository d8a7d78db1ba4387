"""Actions where the finder is not alone: other finders and copies over the
same list, the module taken out of sys.modules and imported again mid-run,
and calls that fail on an added list holding a bad item after good ones."""

import copy
import importlib
import sys

from pysource.scopebodycache import CChangeFinder

from fuzzkit.calls import Finding, Short
from fuzzkit.edits import CallFindChanges, Edit, MakeEdit, _ResultShape
from fuzzkit.names import Names, ScopeNames

kModule = 'pysource.scopebodycache'


def SharedFinders(ctx):
    """An edit told to another finder of the list, a copy of the finder, or
    both in turn (with the same added and removed lists); then the episode's
    finder goes on."""
    rng, lst = ctx.rng, ctx.doc.lst
    others = [('finder2', CChangeFinder(lst))]
    if type(ctx.finder) is CChangeFinder:
        others.append(('copy', copy.copy(ctx.finder)))
    old_names = ScopeNames(lst)
    edit = MakeEdit(ctx)
    if edit is None:
        return
    told = [rng.choice(others)]
    if rng.random() < 0.5:
        told.append(('finder', ctx.finder))
        rng.shuffle(told)
    ctx.tags.add('shared-list')
    changes = set()
    for label, finder in told:
        ctx.rec.Note('%s is told of the %s edit' % (label, edit.kind))
        ok, result = CallFindChanges(ctx, finder, list(edit.added), list(edit.removed))
        if not ok:
            raise Finding('raised', '%s over the shared list raised %s: %s' % (
                label, type(result).__name__, result))
        changes |= _ResultShape(ctx, result)
    ctx.CheckNames('after a %s edit told to %s' % (edit.kind, ' then '.join(l for l, _ in told)))
    ctx.CheckCache(old_names, changes, 'after an edit told to another finder')
    Edit(ctx)   # the episode's finder, after the others wrote the names


def Reload(ctx):
    """The module out of sys.modules (and of its package), or imported a
    second time (its globals rebound there), around an ordinary edit."""
    rng = ctx.rng
    original = sys.modules[kModule]
    package = sys.modules['pysource']
    how = rng.choice(['drop', 'second-import', 'second-import-rebind'])
    ctx.tags.add('reload-' + how)
    seen = []
    del sys.modules[kModule]
    kept = package.__dict__.pop('scopebodycache', None)
    try:
        if how != 'drop':
            again = importlib.import_module(kModule)
            if how.endswith('rebind'):
                real = again.GetFullNameForScopeDef
                again.GetFullNameForScopeDef = lambda d: seen.append(d) or real(d)
        Edit(ctx)
    finally:
        sys.modules[kModule] = original
        if kept is not None:
            package.scopebodycache = kept
    ctx.rec.Note('module back in sys.modules; the rebound function was called %d time(s)' % len(seen))


def BadAfterGood(ctx):
    """An edit reported with a bad item after its added logicals: the call
    must fail on it and change no logical; the call that keeps to the
    protocol then names the list as a whole pass does."""
    rng = ctx.rng
    lst = ctx.doc.lst
    old_names = ScopeNames(lst)
    edit = MakeEdit(ctx, allow_undo=not ctx.known)
    if edit is None:
        return
    bad = rng.choice([None, 3, 'x', 2.5])
    added = list(edit.added) + [bad]
    before = [Names(l) for l in lst]
    plain = type(ctx.finder) is CChangeFinder
    ctx.tags.add('bad-after-good')
    ok, result = CallFindChanges(ctx, ctx.finder, added, list(edit.removed), 'FindChanges[bad item]')
    whole = len(added) == len(lst)   # the whole-list pass reads only the list
    if plain and not whole:
        if ok or not isinstance(result, TypeError):
            raise Finding('bad-item', 'FindChanges with %s after the added logicals gave %s, not '
                          'TypeError' % (Short(bad), Short(result)))
        changed = [k for k, l in enumerate(lst) if Names(l) != before[k]]
        if changed:
            raise Finding('bad-item', 'a call that failed on %s changed %d logical(s), first '
                          'lst[%d]: %r, was %r' % (Short(bad), len(changed), changed[0],
                                                   Names(lst[changed[0]]), before[changed[0]]))
    ctx.CheckUsable('FindChanges with a bad item after the added logicals')
    if ok and whole:
        ctx.CheckNames('after a whole pass with a bad added item')
        return
    ok, result = CallFindChanges(ctx, ctx.finder, list(edit.added), list(edit.removed))
    if not ok:
        if plain:
            raise Finding('bad-item', 'the call after a failed one raised %s: %s' % (
                type(result).__name__, result))
        ctx.dirty = True
        ctx.Resync()
        return
    changes = _ResultShape(ctx, result)
    ctx.CheckNames('after a %s edit, told again after a failed call' % edit.kind)
    ctx.CheckCache(old_names, changes, 'after a call that followed a failed one')
