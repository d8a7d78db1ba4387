"""Helpers shared by the suites of pysource.scopedocument."""

import random

try:
    from pysource.logicals import ReadReference
except ImportError:  # a reader without the native scanner
    from pysource.logicals import ReadLogicals as ReadReference

from support import PY3, CChangeFinder, ReadLogicals, kBlankKind, kCommentKind  # noqa: F401
from pysource.scopebodycache import GetFullNameForScopeDef
from pysource.scopedocument import CScopeDocument, CEditResult  # noqa: F401

kSample = '''\
import os

class A(object):
    """Doc."""

    def f(self, x):
        return x  # one

    # between
    def f(self):
        def inner():
            pass
        return inner

def g(a,
      b):
    s = """
    not code
    """
    return s
'''


def Fields(logical):
    return (logical.fTokens, logical.fLineno, logical.fIndent, logical.fKind,
            logical.fScopeName, logical.fLocalScopeName)


def Fresh(text, filename='<string>'):
    """The logicals of `text` named by a whole-file pass, or the reader's error,
    by the reference reader (the rules written out in Python)."""
    try:
        lst = ReadReference(text, filename)
    except SyntaxError as exc:
        return exc
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def ErrorFields(exc):
    return (type(exc), exc.msg, exc.lineno, exc.offset, exc.text, exc.filename)


def Outline(lst, text):
    """GetOutline's answer by its definition, the slow way."""
    out = []
    for h, header in enumerate(lst):
        if header.fKind not in (1, 2) or not header.fLocalScopeName:
            continue
        name = GetFullNameForScopeDef(header)
        last = h
        for k in range(h, len(lst)):
            l = lst[k]
            if l.fKind in (kCommentKind, kBlankKind):
                continue
            if l.fScopeName == name or l.fScopeName.startswith(name + '.'):
                last = k
        if last + 1 < len(lst):
            end = lst[last + 1].fLineno - 1
        else:
            end = text.count('\n') + 1 - (1 if text.endswith('\n') else 0)
        out.append((name, header.fKind, header.fLineno, end))
    return out


def Place(text, offset):
    """(line, column) of a character offset, as the document counts them."""
    line = text.count('\n', 0, offset) + 1
    return line, offset - (text.rfind('\n', 0, offset) + 1)


def Apply(text, start, end, new):
    return text[:start] + new + text[end:]


# Pieces random edits put in: quotes, brackets, backslashes, tabs, CR, and
# lines that open and close scopes.
kPieces = ['x', ' ', '\n', '    ', '\t', '"', "'", '"""', "'''", 'r"', '(', ')', '[', ']', '\\', '\\\n',
           '#', '\r\n', '\r', 'def f():\n', 'class C:\n', '    pass\n', 'if x:\n', 'async def h():\n',
           '\f', 'return 1\n', 'u"', ':', '    def m(self):\n        y = 2\n', '  ', '\n  x\n', 'b\'\'\'',
           "ur'", '}', '\t\t', '\\\r\n', '"a\\\n', '\n\n']
if PY3:
    # Characters that widen the text's storage.
    kPieces += [u'\xe9', u'\u4e2d', u'\U0001F600']
else:
    kPieces += ['\xc3\xa9', '\xef\xbb\xbf']


def RandomEdit(rng, text):
    """(start, end, new text) of a random edit of `text`, in offsets."""
    n = len(text)
    start = rng.randint(0, n)
    length = rng.choice([0, 0, 0, 1, 1, 2, 5, 20])
    end = min(n, start + length)
    if rng.random() < 0.5:
        new = ''.join(rng.choice(kPieces) for _ in range(rng.choice([0, 1, 1, 2, 3])))
    elif n:
        # A piece of the text itself, as a paste.
        a = rng.randint(0, n)
        new = text[a:a + rng.choice([1, 10, 40])]
    else:
        new = 'x = 1\n'
    return start, end, new


def Random(seed):
    return random.Random(seed)
