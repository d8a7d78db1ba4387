"""Actions that call the module with arguments of the wrong kind, edit the
list in ways the protocol does not allow, and call steps directly."""

import pysource.scopebodycache as sbc
import pysource.symbolinfo as symbolinfo
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from fuzzkit import hostile, texts
from fuzzkit.calls import Finding, Short
from fuzzkit.edits import CallFindChanges, MakeEdit
from fuzzkit.names import ScopeNames
from fuzzkit.pickles import CraftState, PlainCacheSub, PlainFinderSub, kChecksums

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
