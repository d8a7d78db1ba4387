"""Corners where the 2.7 and 3.x tokenizers part ways: the reader gives the
records 2.7 gives, as (tokens, line number, indent, kind) tuples.

Runs on 2.7 and on 3.x; what needs the built record type is skipped where it
cannot be imported.
"""

import os
import shutil
import sys
import tempfile
import tokenize
import unittest

try:
    from pysource import logicals
except ImportError:
    sys.path.insert(0, os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))),
                                    'python'))
    from pysource import logicals
try:
    from pysource._fastaccess import LogicalLineType
except ImportError:  # not built for this interpreter
    LogicalLineType = None

kPy2 = sys.version_info[0] == 2


def Native(text, encoding='utf-8'):
    """`text` as the reader's tokens hold it: bytes on 2.7, text on 3.x."""
    return text.encode(encoding) if kPy2 else text


def Records(source, filename='<string>'):
    return list(logicals._Records(source, filename))


# (source, records) that both interpreters must read alike.
kPython2Source = [
    ("x = `y`\nif a <> b: pass\n",
     [(('x', '=', '`', 'y', '`'), 1, 0, 0), (('if', 'a', '<>', 'b', ':', 'pass'), 2, 0, 0)]),
    ("n = 0777 + 0777L + 10L + 0xffL + 0o17 + 0b1L + 1e5j + 09\n",
     [(('n', '=', '0777', '+', '0777L', '+', '10L', '+', '0xffL', '+', '0o17', '+', '0b1L', '+',
        '1e5j', '+', '0', '9'), 1, 0, 0)]),
    # 2.7 knows no rb or f prefix: a name, then the string.
    ("s = ur'a' + b'b' + br'c' + UR\"d\" + rb'e' + f'g'\n",
     [(('s', '=', "ur'a'", '+', "b'b'", '+', "br'c'", '+', 'UR"d"', '+', 'rb', "'e'", '+', 'f',
        "'g'"), 1, 0, 0)]),
    ("print >>f, 'x',\nexec code in ns\n",
     [(('print', '>>', 'f', ',', "'x'", ','), 1, 0, 0), (('exec', 'code', 'in', 'ns'), 2, 0, 0)]),
    ("def f(*, a=1_000) -> None: x @= ...\n",
     [(('def', 'f', '(', '*', ',', 'a', '=', '1', '_000', ')', '-', '>', 'None', ':', 'x', '@',
        '=', '.', '.', '.'), 1, 0, 2)]),
]
kLayout = [
    ("if 1:\n\tx = 1\n        y = 2\n  \t z\n",
     [(('if', '1', ':'), 1, 0, 0), (('x', '=', '1'), 2, 8, 0), (('y', '=', '2'), 3, 8, 0),
      (('z',), 4, 9, 0)]),
    ("\fx = 1\nif 1:\n  \f  y\n",
     [(('x', '=', '1'), 1, 0, 0), (('if', '1', ':'), 2, 0, 0), (('y',), 3, 2, 0)]),
    ("x = 1 + \\\n    2; z\ny\n", [(('x', '=', '1', '+', '2', ';', 'z'), 1, 0, 0), (('y',), 3, 0, 0)]),
    # Within brackets a blank line is no logical and a comment is a token.
    ("f(a,\n\n  # note\n  b)\ndef g():\n        # deep\n    pass\n",
     [(('f', '(', 'a', ',', '# note', 'b', ')'), 1, 0, 0), (('def', 'g', '(', ')', ':'), 5, 0, 2),
      (('# deep',), 6, 8, 21), (('pass',), 7, 4, 0)]),
    ("x = (1,\n 2)", [(('x', '=', '(', '1', ',', '2', ')'), 1, 0, 0)]),
    ("x\n  \t", [(('x',), 1, 0, 0), ((), 2, 8, 22)]),
    ("\n\n", [((), 1, 0, 22), ((), 2, 0, 22)]),
]
kNewlinesAndStrings = [
    ("x = 1\r\ny = 2\r\n# c\r\n\r\n",
     [(('x', '=', '1'), 1, 0, 0), (('y', '=', '2'), 2, 0, 0), (('# c',), 3, 0, 21),
      ((), 4, 0, 22)]),
    # Only '\n' ends a line of a string; a lone '\r' is an error token.
    ("x = 1\ry = 2\n", [(('x', '=', '1', '\r', 'y', '=', '2'), 1, 0, 0)]),
    ("s = '''a\r\nb'''\r\n", [(('s', '=', "'''a\r\nb'''"), 1, 0, 0)]),
    ('s = """a\n\nb"""\nx\n', [(('s', '=', '"""a\n\nb"""'), 1, 0, 0), (('x',), 4, 0, 0)]),
    ("s = 'a\\\nb'\nx\n", [(('s', '=', "'a\\\nb'"), 1, 0, 0), (('x',), 3, 0, 0)]),
    # An unterminated string: the whitespace and the quote are error tokens.
    ("s = 'abc\nx\n", [(('s', '=', ' ', "'", 'abc'), 1, 0, 0), (('x',), 2, 0, 0)]),
    # A continued string that does not go on: no NEWLINE, so x joins the line.
    ("s = 'a\\\nb\nx\n", [(('s', '=', "'a\\\nb\n", 'x'), 1, 0, 0)]),
]
# (source, exception, line number); the file name is 'f.py'.
kErrors = [
    ('a\ns = """\n', SyntaxError, 2),
    ('x = (1,\n\n', SyntaxError, 3),
    ('x = 1 + \\\n', SyntaxError, 2),
    ('x = 1)\ny\n', SyntaxError, 3),
    ('if 1:\n  x\n y\n', IndentationError, 3),
    ('if 1:\n\tx\n    y\n', IndentationError, 3),
    # After a continued string that did not go on, 2.7 wants a backslash at
    # the end of each line of the next multi-line string too.
    ("x = 'a\\\nb\ny = '''c\nd\ne'''\n", SyntaxError, 5),
]


class CornersTest(unittest.TestCase):

    def testRecordsAsOn27(self):
        for source, want in kPython2Source + kLayout + kNewlinesAndStrings:
            self.assertEqual(Records(source), want, repr(source))

    def testErrorsNameTheLineAndFile(self):
        for source, exc_type, lineno in kErrors:
            with self.assertRaises(exc_type) as cm:
                Records(source, 'f.py')
            self.assertEqual((type(cm.exception), cm.exception.lineno, cm.exception.filename),
                             (exc_type, lineno, 'f.py'), repr(source))

    @unittest.skipUnless(kPy2, "2.7's tokenize is the reference")
    def testScannerGivesTokenizeTokens(self):
        from cStringIO import StringIO

        def Run(tokens):
            try:
                return list(tokens)
            except (tokenize.TokenError, IndentationError) as exc:
                return type(exc), exc.args
        sources = [s for s, _ in kPython2Source + kLayout + kNewlinesAndStrings]
        sources += [s for s, _, _ in kErrors] + ['x = "\xc3\xa9" # \xe9\ncaf\xc3\xa9 = 1\n', '']
        for source in sources:
            self.assertEqual(Run(logicals._Scan(source)),
                             Run(tokenize.generate_tokens(StringIO(source).readline)), repr(source))


class EncodingTest(unittest.TestCase):

    def testBomAndDeclaredEncoding(self):
        e_acute = Native(u'"\xe9"', 'latin-1')
        for source, want in [
                (u'\ufeffx = 1\n', [(('x', '=', '1'), 1, 0, 0)]),
                (b'\xef\xbb\xbf# coding: utf-8\nx\n', [(('# coding: utf-8',), 1, 0, 21), (('x',), 2, 0, 0)]),
                (b'#!/bin/sh\n# -*- coding: latin-1 -*-\ns = "\xe9"\n',
                 [(('#!/bin/sh',), 1, 0, 21), (('# -*- coding: latin-1 -*-',), 2, 0, 21),
                  (('s', '=', e_acute), 3, 0, 0)])]:
            self.assertEqual(Records(source), want, repr(source))

    def testCharacterOutsideAsciiOutsideStrings(self):
        # One error token per byte on 2.7 and per character on 3.x.
        name = [b'caf', b'\xc3', b'\xa9'] if kPy2 else [u'caf', u'\xe9']
        self.assertEqual(Records(u'caf\xe9 = 1\n'), [(tuple(name) + ('=', '1'), 1, 0, 0)])

    def testBytesThatDoNotDecode(self):
        for source, lineno in [(b'x = 1\ny = "\xe9"\n', 2),
                               (b'#!/bin/sh\n# coding: no-such-codec\nx\n', 2),
                               (b'\xef\xbb\xbf# coding: latin-1\nx\n', 1)]:
            if kPy2:
                self.assertTrue(Records(source))  # 2.7 reads the bytes as they are
                continue
            with self.assertRaises(SyntaxError) as cm:
                Records(source, 'f.py')
            self.assertEqual((cm.exception.lineno, cm.exception.filename), (lineno, 'f.py'))


class FileTest(unittest.TestCase):

    def setUp(self):
        self.dir = tempfile.mkdtemp()

    def tearDown(self):
        shutil.rmtree(self.dir)

    def Write(self, data):
        path = os.path.join(self.dir, 'm.py')
        with open(path, 'wb') as f:
            f.write(data)
        return path

    def testNewlinesNormalisedAndEncodingApplied(self):
        path = self.Write(b'# coding: latin-1\r\nx = (1,\r\r  "\xe9")\ry\r')
        want = [(('# coding: latin-1',), 1, 0, 21),
                (('x', '=', '(', '1', ',', Native(u'"\xe9"', 'latin-1'), ')'), 2, 0, 0),
                (('y',), 5, 0, 0)]
        self.assertEqual(list(logicals._Records(logicals._SourceOfFile(path), path)), want)

    @unittest.skipIf(LogicalLineType is None, 'the record type is not built for this interpreter')
    def testRecordTypeHoldsTheRecords(self):
        path = self.Write(b'class A:\r\n    def f(self): pass\r\n\r\n# c')
        got = [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in logicals.ReadLogicalsFromFile(path)]
        self.assertEqual(got, [(('class', 'A', ':'), 1, 0, 1),
                               (('def', 'f', '(', 'self', ')', ':', 'pass'), 2, 4, 2),
                               ((), 3, 0, 22), (('# c',), 4, 0, 21)])
        self.assertTrue(all(type(l) is LogicalLineType for l in logicals.ReadLogicals('x\n')))


if __name__ == '__main__':
    unittest.main()
