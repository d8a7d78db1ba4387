"""Episodes against pysource.scopedocument.CScopeDocument: random edit calls
with good and hostile arguments, and the document held against itself.

Good calls (Edit, EditMany, SetText as the text-edit replay makes them) must
leave the text the fuzzer keeps; bad ones (ranges outside the text or
reversed, columns past a line or inside a character, wrong types and
counts, the other kind of text, a later edit of a batch that is bad) must
raise TypeError or ValueError and change nothing; hostile ones (columns
whose __index__ edits the document, batches whose iteration does, huge
texts, pickles and copies taken mid-sequence, bad pickled states) may do
what they like but must not crash, and after every action SelfCheck must
pass and the text must be the one the fuzzer expects.
"""

import copy
import pickle
import sys

from fuzzkit import texts
from fuzzkit.calls import Finding, Short

try:
    from pysource.scopedocument import CScopeDocument
except ImportError:
    CScopeDocument = None

kPy2 = sys.version_info[0] == 2
kOtherText = unicode if kPy2 else bytes  # noqa: F821 (2.7 only)

# Actions and their weights.
kActions = (('GoodEdit', 10), ('BadRange', 5), ('BadTypes', 5), ('BadBatch', 3),
            ('Reentrant', 2), ('HugeText', 1), ('PickleMidway', 3), ('BadState', 2),
            ('BadQueries', 3), ('BadCreate', 2))


def Available():
    return CScopeDocument is not None


def _Other(text):
    return text.decode('latin-1') if kPy2 else text.encode('utf-8')


class DocContext(object):
    """One document, the text it must hold, and the episode's tools."""

    def __init__(self, ctx):
        from dockit.makers import TextEditMaker
        self.ctx, self.rng, self.rec = ctx, ctx.rng, ctx.rec
        text = ctx.src.Make()
        if self.rng.random() < 0.2:
            text = text.replace('\n', '\r\n') if self.rng.random() < 0.5 else text + '"""'
        self.maker = TextEditMaker(self.rng, utf16_fraction=0.3)
        self.maker.Reset(text)
        self.doc = self.Make(text)
        self.text = text

    def Make(self, text):
        ok, doc = self.rec.Call('CScopeDocument()', 'CScopeDocument(%s)' % Short(text),
                                CScopeDocument, text, 'fuzz.py')
        if not ok:
            raise Finding('document', 'CScopeDocument(text) raised %r for %r' % (doc, text))
        return doc

    def Call(self, kind, func, *args, **kwargs):
        return self.rec.Call('CScopeDocument.' + kind, '%s(%s)' % (kind, ', '.join(
            [Short(a) for a in args] + ['%s=%s' % (k, Short(v)) for k, v in kwargs.items()])),
            func, *args, **kwargs)

    def Check(self, where):
        ok, got = self.Call('GetText', self.doc.GetText)
        if not ok or got != self.text:
            raise Finding('document', '%s: the text is %r, expected %r' % (
                where, got if ok else 'raised', self.text))
        ok, err = self.Call('SelfCheck', self.doc.SelfCheck)
        if not ok:
            raise Finding('document', '%s: SelfCheck raised %s: %s' % (where, type(err).__name__, err))

    def Refused(self, where, func, *args, **kwargs):
        """A call that must raise TypeError or ValueError and change nothing."""
        ok, got = self.Call(where, func, *args, **kwargs)
        if ok:
            raise Finding('document', '%s accepted bad arguments %s and returned %r' % (
                where, Short(args), got))
        if not isinstance(got, (TypeError, ValueError, OverflowError)):
            raise Finding('document', '%s raised %s (%s) for bad arguments %s' % (
                where, type(got).__name__, got, Short(args)))
        self.Check('after a refused %s' % where)


# --- Actions ------------------------------------------------------------------------

def GoodEdit(d):
    readable = d.doc.IsReadable()
    op = d.maker.Next(d.text, readable)
    if op is None:
        return
    args = op.Args(d.text)
    func = getattr(d.doc, op.method)
    kwargs = {} if op.method == 'SetText' else {'utf16': op.utf16}
    ok, got = d.Call(op.method, func, *args, **kwargs)
    if not ok:
        raise Finding('document', '%s(%s) raised %s: %s' % (op.method, Short(args),
                                                            type(got).__name__, got))
    d.text = op.Result(d.text)
    d.Check('after %s' % op.Describe())


def _Place(d):
    lines = d.text.split('\n')
    n = d.rng.randrange(len(lines))
    return n + 1, d.rng.randint(0, len(lines[n])), lines


def BadRange(d):
    line, col, lines = _Place(d)
    count = len(lines)
    rng = d.rng
    bad = rng.choice([
        (0, 0, 1, 0), (-1, 0, 1, 0), (count + 1, 0, count + 1, 0), (1, 0, count + 1, 0),
        (line, len(lines[line - 1]) + 1, line, len(lines[line - 1]) + 1),
        (line, -1, line, col), (line, col, line, -1),
        (count, 0, 1, 0) if count > 1 else (1, 1, 1, 0) if lines[0] else (1, 0, 1, 5),
        (line, col + 1, line, col) if col < len(lines[line - 1]) else (line, col, line, col + 7),
        (2 ** 40, 0, 2 ** 40, 0), (1, 2 ** 63, 1, 2 ** 63), (-2 ** 70, 0, 1, 0),
    ])
    d.Refused('Edit', d.doc.Edit, *bad + ('x',))
    wide = u'\U0001F600'
    if rng.random() < 0.5:
        # A column inside a pair of UTF-16 units.
        d.doc.Edit(line, 0, line, 0, wide if not kPy2 else wide.encode('utf-8'))
        d.text = '\n'.join(lines[:line - 1] + [(wide if not kPy2 else wide.encode('utf-8')) +
                                                lines[line - 1]] + lines[line:])
        d.Check('after a wide character typed')
        d.Refused('Edit', d.doc.Edit, line, 1, line, 1, 'x', utf16=True)


def BadTypes(d):
    line, col, _ = _Place(d)
    rng = d.rng
    junk = rng.choice([None, 1.5, '1', [1], object(), 2 ** 200])
    args = [line, col, line, col, 'x']
    pick = rng.randrange(6)
    if pick < 4:
        args[pick] = junk
    else:
        args[4] = rng.choice([None, 5, _Other('x'), ['x'], bytearray(b'x')])
    d.Refused('Edit', d.doc.Edit, *args)
    d.Refused('Edit', d.doc.Edit, line, col, line)
    d.Refused('SetText', d.doc.SetText, rng.choice([None, 7, _Other(d.text), [d.text]]))
    d.Refused('EditMany', d.doc.EditMany, rng.choice([None, 5, [(1, 0, 1, 0)], [None],
                                                      [(1, 0, 1, 0, 'x', 'y')], ['abcde']]))


def BadBatch(d):
    """Good edits, then a bad one: nothing may be applied."""
    line, col, lines = _Place(d)
    good = [(line, col, line, col, 'a'), (1, 0, 1, 0, '\n')]
    bad = d.rng.choice([(len(lines) + 5, 0, len(lines) + 5, 0, 'x'), (1, 0, 1, 10 ** 6, ''),
                        (2, 0, 1, 0, ''), (1, 0, 1, 0, None), (1, 0, 1, 0)])
    d.Refused('EditMany', d.doc.EditMany, good + [bad])


class _SneakyIndex(object):
    """A column that edits the document while it is being read."""

    def __init__(self, d, value, action):
        self.d, self.value, self.action = d, value, action

    def __index__(self):
        if self.action == 'edit':
            self.d.doc.Edit(1, 0, 1, 0, '#')
        elif self.action == 'settext':
            self.d.doc.SetText('')
        elif self.action == 'raise':
            raise RuntimeError('from __index__')
        return self.value

    __int__ = __index__


def _SneakyBatch(d, ranges):
    for r in ranges:
        d.doc.SetText(d.doc.GetText() + 'y = 1\n')
        yield r


def Reentrant(d):
    line, col, _ = _Place(d)
    action = d.rng.choice(['edit', 'settext', 'raise'])
    if d.rng.random() < 0.6:
        ok, got = d.Call('Edit', d.doc.Edit, line, _SneakyIndex(d, col, action), line, col, 'z')
    else:
        ok, got = d.Call('EditMany', d.doc.EditMany, _SneakyBatch(d, [(line, col, line, col, 'z')]))
    # Whatever happened, the document must still be whole; take its text.
    ok, d.text = d.Call('GetText', d.doc.GetText)
    if not ok:
        raise Finding('document', 'GetText raised after a re-entrant call: %r' % (d.text,))
    d.maker.Reset(d.text)
    d.Check('after a re-entrant call')


def HugeText(d):
    rng = d.rng
    pick = rng.randrange(4)
    if pick == 0:
        text = 'x = ' + 'a' * 300000 + '\n'
    elif pick == 1:
        text = 'def f():\n' + '    x = 1\n' * 30000
    elif pick == 2:
        text = '(' * 3000 + ')' * 3000 + '\n'
    else:
        text = '"""' + '\\\n' * 20000
    ok, got = d.Call('SetText', d.doc.SetText, text)
    if not ok:
        raise Finding('document', 'SetText of a huge text raised %r' % (got,))
    d.text = text
    d.Check('after a huge text')
    d.Call('SetText', d.doc.SetText, d.maker._texts[0] if d.maker._texts else 'x = 1\n')
    d.text = d.doc.GetText()
    d.Check('after the huge text went')


def PickleMidway(d):
    how = d.rng.choice(['pickle', 'copy', 'deepcopy'])
    if how == 'pickle':
        proto = d.rng.randint(0, pickle.HIGHEST_PROTOCOL)
        ok, other = d.Call('pickle', lambda: pickle.loads(pickle.dumps(d.doc, proto)))
    else:
        ok, other = d.Call(how, getattr(copy, how), d.doc)
    if not ok:
        raise Finding('document', '%s of a document raised %r' % (how, other))
    same = [(other.GetText(), other.IsReadable(), len(other.GetLogicals()), other.GetOutline()),
            (d.doc.GetText(), d.doc.IsReadable(), len(d.doc.GetLogicals()), d.doc.GetOutline())]
    if same[0] != same[1]:
        raise Finding('document', 'a %s differs from its original: %r' % (how, same))
    if set(map(id, other.GetLogicals())) & set(map(id, d.doc.GetLogicals())):
        raise Finding('document', 'a %s shares logicals with its original' % how)
    if d.rng.random() < 0.5:
        d.doc = other
    d.Check('after a %s' % how)


def BadState(d):
    """A document made again from a pickled state that was tampered with:
    it may be refused, or load and then fail its SelfCheck, but not crash."""
    ok, reduced = d.Call('__reduce_ex__', d.doc.__reduce_ex__, 2)
    if not ok or not isinstance(reduced, tuple) or len(reduced) < 2:
        return
    rng = d.rng
    parts = list(reduced) + [None] * (3 - len(reduced))
    junk = rng.choice([None, (), (1, 2), ('x',) * 9, (d.text, 5), (_Other(d.text),), 7,
                       {'text': None}])
    if parts[2] is None or rng.random() < 0.5:
        parts[1] = junk if isinstance(junk, tuple) else (junk,)
    else:
        parts[2] = junk
    ok, obj = d.Call('reconstruct', parts[0], *parts[1])
    if ok and parts[2] is not None and hasattr(obj, '__setstate__'):
        ok, _ = d.Call('__setstate__', obj.__setstate__, parts[2])
    if ok and isinstance(obj, CScopeDocument):
        for query in (obj.GetText, obj.GetLogicals, obj.GetOutline, obj.SelfCheck):
            d.Call(query.__name__, query)


def BadQueries(d):
    rng = d.rng
    doc = d.doc
    calls = [(doc.GetLine, (rng.choice([0, -1, 10 ** 6, None, '1', 2 ** 70]),)),
             (doc.GetScopeAtLine, (rng.choice([None, '1', 1.5, []]),)),
             (doc.GetBodyOfScope, (rng.choice([None, 7, _Other('f#0')]),)),
             (doc.GetScopeDef, (rng.choice([None, 7, _Other('f#0')]),))]
    func, args = rng.choice(calls)
    ok, got = d.Call(func.__name__, func, *args)
    if ok and func is doc.GetLine:
        raise Finding('document', 'GetLine%r returned %r' % (args, got))
    if not ok and not isinstance(got, (TypeError, ValueError, IndexError, KeyError,
                                       OverflowError)):
        raise Finding('document', '%s%r raised %r' % (func.__name__, args, got))
    for n in (-5, 0, 10 ** 9):
        d.Call('GetScopeAtLine', doc.GetScopeAtLine, n)
    d.Check('after bad queries')


def BadCreate(d):
    rng = d.rng
    args = rng.choice([(None,), (5,), ([],), ('x', 5), ('x', None), (memoryview(b'x'),)] +
                      ([(b'x = "\xff"\n',), (b'# coding: nope\n',)] if not kPy2 else []))
    ok, got = d.Call('CScopeDocument', CScopeDocument, *args)
    if ok:
        raise Finding('document', 'CScopeDocument%s accepted bad arguments' % Short(args))
    if not isinstance(got, (TypeError, ValueError, SyntaxError)):
        raise Finding('document', 'CScopeDocument%s raised %r' % (Short(args), got))


def Run(ctx, steps):
    """An episode of `steps` actions on one document."""
    d = DocContext(ctx)
    d.Check('after making the document')
    for n in range(steps):
        action = ctx.Pick(kActions)
        ctx.rec.Note('document action %d: %s' % (n, action))
        globals()[action](d)
    return ctx
