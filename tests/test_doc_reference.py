"""The document that re-reads its whole text on every edit
(tools/dockit/reference.py): the interface the native document shares,
held against fresh reads. The contract cases also run against
pysource.scopedocument.CScopeDocument when it is built."""

import copy
import unittest

from support import PY3, OtherText, Picklers, ReadLogicals, WholePass
from dockit.reference import CReferenceDocument

try:
    from pysource.scopedocument import CScopeDocument
except ImportError:
    CScopeDocument = None

kText = '''\
class A:
    def f(self):
        pass
# dedented
    def f(self):
        x = 1

def g():
    return 2
'''


def Fields(lst):
    return [(l.fTokens, l.fLineno, l.fIndent, l.fKind, l.fScopeName, l.fLocalScopeName)
            for l in lst]


def Fresh(text):
    lst = ReadLogicals(text)
    WholePass(lst)
    return Fields(lst)


def ErrorOf(text):
    try:
        ReadLogicals(text)
    except SyntaxError as exc:
        return type(exc), exc.msg, exc.lineno, exc.offset, exc.text
    raise AssertionError('%r reads' % text)


def ErrorFields(exc):
    return type(exc), exc.msg, exc.lineno, exc.offset, exc.text


class DocumentContract(object):
    """What every document must do; a subclass names the class."""

    Document = None

    def Check(self, doc):
        self.assertEqual(Fields(doc.GetLogicals()), Fresh(doc.GetText()))
        doc.SelfCheck()

    def testEditsKeepUnchangedLogicalsAndAgreeWithAFreshRead(self):
        doc = self.Document(kText)
        before = doc.GetLogicals()
        result = doc.Edit(6, 12, 6, 13, '2')
        self.assertEqual(doc.GetLine(6), '        x = 2')
        self.Check(doc)
        after = doc.GetLogicals()
        self.assertEqual([l.fTokens for l in result.fAdded], [('x', '=', '2')])
        self.assertEqual([l for l in result.fRemoved], [before[5]])
        self.assertTrue(all(a is b for a, b in zip(after, before) if b is not before[5]))
        self.assertEqual(result.fContentsChanges, set(['A#0.f#1']))
        # Enter in the middle of a header, then Backspace joining it again.
        doc.Edit(2, 14, 2, 14, '\n')
        self.assertEqual(doc.GetLineCount(), 11)
        self.Check(doc)
        doc.Edit(2, 14, 3, 0, '')
        self.Check(doc)
        self.assertEqual(doc.GetText(), kText.replace('x = 1', 'x = 2'))

    def testRangesAreCheckedAndABadEditChangesNothing(self):
        doc = self.Document('ab\ncd\r\n')
        self.assertEqual((doc.GetLineCount(), doc.GetLine(2), doc.GetLine(3)), (3, 'cd\r', ''))
        for bad in [(0, 0, 1, 0), (4, 0, 4, 0), (1, 3, 1, 3), (2, 0, 1, 0), (1, 2, 1, 1),
                    (1, -1, 1, 0), (3, 1, 3, 1)]:
            self.assertRaises(ValueError, doc.Edit, *bad + ('x',))
        self.assertRaises(TypeError, doc.Edit, 1, 0, 1, 0, OtherText('x'))
        self.assertRaises(TypeError, doc.Edit, 1, '0', 1, 0, 'x')
        self.assertRaises(TypeError, doc.Edit, 1, 0, 1, 0, None)
        # The second edit is bad in the text the first leaves: none is applied.
        self.assertRaises(ValueError, doc.EditMany, [(1, 0, 2, 0, ''), (3, 0, 3, 0, 'x')])
        self.assertRaises(TypeError, doc.EditMany, [(1, 0, 1, 0)])
        self.assertEqual(doc.GetText(), 'ab\ncd\r\n')
        # The '\r' is a character of its line.
        doc.Edit(2, 2, 2, 3, '')
        self.assertEqual(doc.GetText(), 'ab\ncd\n')

    def testEditManyTakesEachEditInTheTextTheOnesBeforeLeft(self):
        doc = self.Document(kText)
        result = doc.EditMany([(1, 0, 1, 0, 'import os\n'), (2, 6, 2, 7, 'B'),
                               (10, 0, 10, 0, 'def h():\n    pass\n')])
        self.assertTrue(result.fReadable)
        self.assertEqual(doc.GetText().splitlines()[:2], ['import os', 'class B:'])
        self.Check(doc)
        self.assertIn('B#0', result.fClassChanges)
        self.assertIn('h#0', result.fFunctionChanges)

    def testUnreadableTextKeepsTheBaselineUntilItReadsAgain(self):
        doc = self.Document(kText)
        baseline = Fields(doc.GetLogicals())
        outline = doc.GetOutline()
        result = doc.Edit(1, 0, 1, 0, 'u"""')
        self.assertFalse(result.fReadable or doc.IsReadable())
        self.assertEqual((result.fAdded, result.fRemoved), ([], []))
        self.assertEqual(ErrorFields(result.fError), ErrorOf(doc.GetText()))
        self.assertEqual(ErrorFields(doc.GetError()), ErrorOf(doc.GetText()))
        self.assertEqual(Fields(doc.GetLogicals()), baseline)
        self.assertEqual((doc.GetOutline(), doc.GetScopeAtLine(3)), (outline, 'A#0.f#0'))
        self.assertEqual(doc.GetLine(1), 'u"""class A:')
        doc.SelfCheck()
        # Still unreadable after a second edit; then the closing quote.
        doc.Edit(3, 0, 3, 0, '\n')
        doc.Edit(2, 0, 2, 0, '"""\n')
        self.assertTrue(doc.IsReadable())
        self.assertEqual(doc.GetError(), None)
        self.Check(doc)

    def testUnreadableTextFromTheStart(self):
        doc = self.Document('def f():\n    x = (\n', 'f.py')
        self.assertEqual((doc.IsReadable(), doc.GetLogicals(), doc.GetOutline()), (False, [], []))
        self.assertEqual(doc.GetError().filename, 'f.py')
        self.assertEqual(doc.GetScopeAtLine(2), '')
        result = doc.Edit(2, 9, 2, 9, ')')
        self.assertEqual(len(result.fAdded), 2)
        self.Check(doc)

    def testIndentationErrorIsReportedLikeTheReader(self):
        doc = self.Document('if x:\n        a\n    b\n')
        self.assertEqual(ErrorFields(doc.GetError()), ErrorOf(doc.GetText()))
        self.assertTrue(isinstance(doc.GetError(), IndentationError))

    def testOutlineEndsAtTheLastCodeLineOfTheScope(self):
        doc = self.Document(kText + '# trailing\n    # comment')
        self.assertEqual(doc.GetOutline(), [('A#0', 1, 1, 6), ('A#0.f#0', 2, 2, 3),
                                            ('A#0.f#1', 2, 5, 6), ('g#0', 2, 8, 9)])
        doc = self.Document('def f():\n  def g(): pass\n  y = 1')
        self.assertEqual(doc.GetOutline(), [('f#0', 2, 1, 3), ('f#0.g#0', 2, 2, 2)])
        doc = self.Document('def f():\n  pass\n\n')
        self.assertEqual(doc.GetOutline(), [('f#0', 2, 1, 2)])
        # The last logical: the outline ends at the last line holding a character.
        doc.Edit(3, 0, 3, 0, '  x = 1')
        self.assertEqual(doc.GetOutline(), [('f#0', 2, 1, 3)])

    def testScopeAtLine(self):
        doc = self.Document('\n' + kText)
        self.assertEqual([doc.GetScopeAtLine(n) for n in range(0, 12)],
                         ['', '', '', 'A#0', 'A#0.f#0', 'A#0', 'A#0', 'A#0.f#1', '', '',
                          'g#0', 'g#0'])
        self.assertEqual(doc.GetBodyOfScope('g#0')[0].fTokens, ('return', '2'))
        self.assertEqual(doc.GetScopeDef('A#0.f#1').fLineno, 6)
        self.assertRaises(KeyError, doc.GetScopeDef, 'h#0')
        doc.Edit(9, 4, 9, 5, 'h')
        self.assertEqual(doc.GetScopeDef('h#0').fLineno, 9)
        self.assertRaises(KeyError, doc.GetBodyOfScope, 'g#0')

    def testUtf16ColumnsCountPairsForCharactersOutsideTheBmp(self):
        smile = u'\U0001F600'
        text = u's = "%s%s"; t = 1\n' % (smile, smile)
        doc = self.Document(text if PY3 else text.encode('utf-8'))
        doc.Edit(1, 16, 1, 17, '2', utf16=True)
        self.assertRaises(ValueError, doc.Edit, 1, 6, 1, 6, 'x', utf16=True)
        self.assertRaises(ValueError, doc.Edit, 1, 18, 1, 18, 'x', utf16=True)
        want = u's = "%s%s"; t = 2\n' % (smile, smile)
        self.assertEqual(doc.GetText(), want if PY3 else want.encode('utf-8'))
        self.Check(doc)

    def testSetTextAndTheKindsOfText(self):
        doc = self.Document(OtherText('x = 1\n'))
        self.assertEqual(doc.GetText(), 'x = 1\n')
        self.assertRaises(TypeError, self.Document, 1)
        self.assertRaises(TypeError, doc.SetText, OtherText('y = 2\n'))
        doc.SetText('def f():\n    pass\n')
        self.Check(doc)
        if PY3:
            doc = self.Document(b'\xef\xbb\xbfx = "\xc3\xa9"\n')
            self.assertEqual(doc.GetText(), u'\ufeffx = "\xe9"\n')
            self.Check(doc)
            doc = self.Document(b'# coding: latin-1\nx = "\xe9"\n')
            self.assertEqual(doc.GetLine(2), u'x = "\xe9"')
            self.assertRaises(SyntaxError, self.Document, b'x = "\xff"\n')

    def testPicklesAndCopiesAreIndependent(self):
        doc = self.Document(kText, 'a.py')
        doc.Edit(1, 0, 1, 0, '"""')
        copies = [copy.copy(doc), copy.deepcopy(doc)]
        copies.extend(loads(dumps(doc)) for _, dumps, loads in Picklers())
        doc.Edit(1, 0, 1, 3, '')
        for other in copies:
            self.assertEqual((other.GetText()[:3], other.IsReadable(), other.GetFilename()),
                             ('"""', False, 'a.py'))
            self.assertEqual(Fields(other.GetLogicals()), Fields(doc.GetLogicals()))
            self.assertFalse(set(map(id, other.GetLogicals())) & set(map(id, doc.GetLogicals())))
            other.Edit(1, 0, 1, 3, '')
            self.Check(other)


class ReferenceDocumentTest(DocumentContract, unittest.TestCase):
    Document = CReferenceDocument

    def testEveryEditRereadsTheWholeText(self):
        doc = self.Document(kText)
        result = doc.Edit(9, 11, 9, 12, '3')
        self.assertEqual(result.fRegion, (1, 10, 10))
        self.assertEqual(doc.GetLastEditStats(), dict(rows_scanned=10, logicals_made=9))


@unittest.skipIf(CScopeDocument is None, 'pysource.scopedocument is not built')
class NativeDocumentContractTest(DocumentContract, unittest.TestCase):
    Document = CScopeDocument


if __name__ == '__main__':
    unittest.main()
