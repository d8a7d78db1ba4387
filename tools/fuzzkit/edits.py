"""Actions that edit the document as a user does, and the plain calls around
them: each edit is checked against a whole pass and a fresh cache."""

from pysource.scopebodycache import CScopeBodyCache

from fuzzkit import hostile, texts
from fuzzkit.calls import Finding, Short
from fuzzkit.names import NameScript, Rows, ScopeNames, kRecursion

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
