"""The native reader against the reference one: the same logicals and the
same errors on the texts where reading carries state, its argument checks,
how it makes records, resumed scans, references, and a short run of the
generated texts.
"""

import gc
import os
import shutil
import sys
import tempfile
import unittest

import support  # noqa: F401 (puts tools/ on the path)
import reader_adversarial
import test_reader_corners as corners
from pysource import _reader, logicals
from pysource._fastaccess import LogicalLineType

kPy2 = sys.version_info[0] == 2


def Outcome(source, reference, filename='f.py'):
    try:
        got = logicals.ReadLogicals(source, filename, reference=reference)
    except Exception as exc:
        return type(exc), exc.args
    return [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in got]


# Texts whose reading turns on state carried across rows or on one rule of a
# row; each must read (or fail) exactly as the reference reads it.
kStateTexts = [
    # Every quote, with and without prefixes, closed, open, continued.
    "a = ur'x' + Br\"y\" + rb'z' + bu'w' + f'v'\n",
    "s = '''a\n'b''\n\"\"\"'''\nx\n", 's = """a\\\n"""\n', "s = 'a\\\n\\\nb'\n",
    "s = 'a\\\r\nb'\r\n", "s = 'a\\\rb'\n", "s = ''''\n", "''''''\n", "s = r'\\'\n",
    # A failed continued string, then 2.7's sticky continuation rule.
    "s = 'a\\\nb\nt = '''c\nd'''\n", "s = 'a\\\nb\nt = '''c\\\nd'''\n", "s = 'a\\\nb\n\nx\n",
    "s = 'a\\\nb\n# c\nx\n", "s = 'a\\\nb\n  y\n", "s = 'a\\\nb",
    # Backslashes outside strings.
    "x = 1 + \\\n 2\n", "\\\nx\n", "x \\\r\n y\n", "x = \\\r y\n", "x \\ y\n", "x = 1 \\", "\\\n\\\n\n",
    # Newlines: CRLF, lone CR in code, in comments, at a row's start.
    "x\r\n\r\n  \r\ny\r\n", "x # c\ry\n", "# c\r\ry\n", "\rx\n", "  \r\n", "x\r", "# a\r# b\r\n",
    # Brackets in the wrong order, stray closers, depth below zero.
    "f(a]\n", "x)\ny\n\n# c\n", ")\n(\n", "a = [1,\n# c\n\n 2]\n", "a = {)\n}\n", "]]\n[[\n",
    # Tabs and form feeds in indentation; dedents off the stack.
    "if 1:\n\tx\n        y\n", "if 1:\n  \f  x\n\fy\n", "if 1:\n    x\n  y\n", "if 1:\n  x\n\f\n y\n",
    "if 1:\n \tx\n\t y\n", "\t\f x\n", "  x\n\ty\n",
    # The last row: no newline, whitespace only, a comment, open.
    "x", "x\n  ", "x\n\t\f", "  ", "\n", "", "# c", "x = (", "s = '''", "if 1:\n  x\n ",
    # Numbers and operators as 2.7 reads them.
    "0x 0xg 0b2 0o8 09 1e 1e+ .e1 1.e5j 0777L 0L 1_0 1__0\n", "a <> b != c ! d $ ? ` @ -> :=\n",
    # Kinds.
    "def f(): pass\nclass C: pass\nasync def g(): pass\nasync = 1\n  # c\n#\n",
]


class ParityTest(unittest.TestCase):

    def testCornerTablesReadAsExpected(self):
        for source, want in corners.kPython2Source + corners.kLayout + corners.kNewlinesAndStrings:
            got = [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in logicals.ReadLogicals(source)]
            self.assertEqual(got, want, repr(source))

    def testStateTextsAsReference(self):
        sources = kStateTexts + [s for s, _, _ in corners.kErrors]
        for source in sources:
            self.assertEqual(Outcome(source, False), Outcome(source, True), repr(source))

    def testEveryRowEndingAndPrefix(self):
        # Each state-carrying piece ended by each row ending, then more text.
        pieces = ["'a", "'a\\", '"""a', "u'''a", "br'a\\", '(', ')', '\\', '# c', 'x', '  ', '\t']
        for piece in pieces:
            for end in ['\n', '\r\n', '\r', '']:
                for after in ['', 'y\n', "'''\n", "b'\n", ')\n']:
                    source = piece + end + after
                    self.assertEqual(Outcome(source, False), Outcome(source, True), repr(source))

    def testGeneratedTexts(self):
        # A short run of tools/reader_parity.py --adversarial.
        differing = []
        for text in reader_adversarial.Texts(20261206, 3000):
            problem = reader_adversarial.CheckText(text)
            if problem is not None:
                differing.append('%r\n%s' % (text, problem))
        self.assertEqual(differing[:3], [])

    @unittest.skipIf(kPy2, 'str kinds are 3.x')
    def testWideCharacters(self):
        for source in [u'caf\xe9 = "\xe9"\n', u'x = "\u20ac" # \u20ac\n\u20ac\n', u"s = '''\U0001d11e\n'''\n",
                       u'\U0001d11e\u20ac\xe9 = 1\n', u'if 1:\n  x\n\u3000y\n', u's = "\u20ac\\\nx\n']:
            self.assertEqual(Outcome(source, False), Outcome(source, True), repr(source))


class ErrorTest(unittest.TestCase):

    def Raised(self, source, filename='f.py'):
        with self.assertRaises(SyntaxError) as cm:
            logicals.ReadLogicals(source, filename)
        return type(cm.exception), cm.exception.args

    def testEofErrorsNameTheLineOfTheSplitText(self):
        # The text of an EOF error is the line of that number when the text
        # is split at CR too; past the last line it is None.
        for source, want in [
                ("a\ns = r'''x\ny", ('EOF in multi-line string', ('f.py', 2, 4, "s = r'''x"))),
                ('x = 1\ry = (\n', ('EOF in multi-line statement', ('f.py', 2, 0, 'y = ('))),
                ('x = (\n', ('EOF in multi-line statement', ('f.py', 2, 0, None))),
                ('x = \\\n', ('EOF in multi-line statement', ('f.py', 2, 0, None))),
                ('a)\n', ('EOF in multi-line statement', ('f.py', 2, 0, None))),
                ('x = (\r\r\r', ('EOF in multi-line statement', ('f.py', 2, 0, ''))),
        ]:
            self.assertEqual(self.Raised(source), (SyntaxError, want), repr(source))

    def testIndentationErrorNamesTheRow(self):
        self.assertEqual(self.Raised('if 1:\n    x\n  y = 1\r\nz\n', '<mine>'),
                         (IndentationError, ('unindent does not match any outer indentation level',
                                             ('<mine>', 3, 2, '  y = 1\r\n'))))

    def testFilenameIsPassedAsGiven(self):
        name = object()
        self.assertIs(self.Raised('(', name)[1][1][0], name)


class ArgumentTest(unittest.TestCase):

    def testBadSourcesFailAsTheReference(self):
        for source in [None, 1, [b'x'], object()]:
            native, ref = Outcome(source, False), Outcome(source, True)
            self.assertEqual(native, ref, repr(source))
            self.assertTrue(issubclass(native[0], (TypeError, AttributeError)), native)

    def testOtherTextsReadAsTheReference(self):
        class Text(type('')):
            pass
        sources = [Text('x = 1\n'), u'\ufeffx\n', u'y = "\xe9"\n', bytearray(b'x\n'),
                   b'\xef\xbb\xbfx\n', b'# coding: latin-1\nx = "\xe9"\n', b'x = "\xe9"\n']
        for source in sources:
            self.assertEqual(Outcome(source, False), Outcome(source, True), repr(source))

    def testMissingFile(self):
        path = os.path.join(tempfile.gettempdir(), 'no-such-dir-for-the-reader', 'm.py')
        errors = []
        for reference in (False, True):
            try:
                logicals.ReadLogicalsFromFile(path, reference=reference)
            except EnvironmentError as exc:
                errors.append((type(exc), exc.errno, exc.filename))
        self.assertEqual(len(errors), 2)
        self.assertEqual(errors[0], errors[1])

    def testFileReadAlike(self):
        tmp = tempfile.mkdtemp()
        try:
            path = os.path.join(tmp, 'm.py')
            with open(path, 'wb') as f:
                f.write(b'class A:\r\n\tdef f(self): pass\r# c\r\n\r\nx = (1,\r 2)')
            native = logicals.ReadLogicalsFromFile(path)
            ref = logicals.ReadLogicalsFromFile(path, reference=True)
            self.assertEqual([(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in native],
                             [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in ref])
        finally:
            shutil.rmtree(tmp)

    def testReaderChecksItsText(self):
        for text in [None, b'x' if not kPy2 else u'x', bytearray(b'x')]:
            self.assertRaises(TypeError, _reader.Read, text, 'f', LogicalLineType)
        self.assertRaises(TypeError, _reader.Read, 'x')


class RecordTest(unittest.TestCase):

    def testRecordsAreThePublishedType(self):
        got = logicals.ReadLogicals('def f(x):\n  return x\n\n')
        self.assertTrue(all(type(l) is LogicalLineType for l in got))
        self.assertEqual([(l.fScopeName, l.fLocalScopeName) for l in got], [(None, None)] * 3)

    def testAnotherRecordTypeIsCalled(self):
        calls = []

        def Make(*args):
            calls.append(args)
            return len(calls)
        source = 'x = 1\n\n# c\n'
        self.assertEqual(_reader.Read(source, 'f', Make), [1, 2, 3])
        self.assertEqual(calls, [(('x', '=', '1'), 1, 0, 0), ((), 2, 0, 22), (('# c',), 3, 0, 21)])
        self.assertTrue(all(type(v) is int for args in calls for v in args[1:]))

    def testIndentOutOfRangeComesBeforeALaterError(self):
        # The reference makes each record as it reads it.
        for source in [' ' * 40000 + 'x\n', '\t' * 5000 + 'x\n(\n']:
            native, ref = Outcome(source, False), Outcome(source, True)
            self.assertEqual(native, ref)
            self.assertIs(native[0], OverflowError)

    def testEqualShortTokensShareAString(self):
        got = logicals.ReadLogicals('self.x = self\nself\n')
        self.assertIs(got[0].fTokens[0], got[1].fTokens[0])
        self.assertIs(got[0].fTokens[0], got[0].fTokens[4])


class ResumeTest(unittest.TestCase):

    def testRowStates(self):
        # (string, needcont, cont, open, depth, indentation column)
        source = "if 1:\n  f(a,\n  '''\n''')\n  s = 'x\\\ny\n\\\n)\n"
        self.assertEqual(_reader.RowStates(source), [
            (0, 0, 0, 0, 0, 0), (0, 0, 0, 0, 0, 2), (0, 0, 0, 1, 1, -1), (3, 0, 0, 1, 1, -1),
            (0, 0, 0, 0, 0, 2), (1, 1, 0, 1, 0, -1), (0, 1, 0, 1, 0, 0), (0, 1, 1, 1, 0, -1),
            (0, 1, 0, 0, -1, -1)])

    def testResumedScansReadAsTheWholeScan(self):
        sources = kStateTexts + [s for s, _ in corners.kLayout + corners.kNewlinesAndStrings]
        sources += list(reader_adversarial.Texts(7, 500))
        checked = sum(_reader.CheckResume(source) for source in sources)
        self.assertGreater(checked, 1000)


class ReferenceTest(unittest.TestCase):

    def testNoReferencesLeft(self):
        name = 'f.py'
        sources = ['x = (1,\n 2)\n# c\n\n' * 20, "s = '''\n", 'if 1:\n  x\n y\n', ' ' * 40000 + 'x\n']
        for source in sources:
            counts = []
            for _ in range(3):  # the first batch lets the interpreter's caches settle
                for _ in range(50):
                    Outcome(source, False, name)
                gc.collect()
                counts.append((sys.getrefcount(name), sys.getrefcount(source), len(gc.get_objects())))
            # A leak of anything made per call would add 50.
            self.assertEqual(counts[1][:2], counts[2][:2], (source[:20], counts))
            self.assertLessEqual(counts[2][2], counts[1][2], (source[:20], counts))


if __name__ == '__main__':
    unittest.main()
