"""CScopeDocument: what it takes as text, places and edits; bad input raises
and changes nothing."""

import unittest

from support import PY3, OtherText
from docsupport import CScopeDocument, Fields, Fresh, kSample


def State(doc):
    return (doc.GetText(), doc.GetLineCount(), doc.IsReadable(), [Fields(l) for l in doc.GetLogicals()],
            doc.GetOutline())


class SourceTest(unittest.TestCase):

    def testTextKinds(self):
        doc = CScopeDocument(OtherText('x = "\xc3\xa9"\n' if not PY3 else u'x = "\xe9"\n'))
        self.assertEqual(doc.GetText(), 'x = "\xc3\xa9"\n' if not PY3 else u'x = "\xe9"\n')
        doc.SelfCheck()
        for bad in (None, 5, ['x'], bytearray(b'x') if not PY3 else 1.5):
            self.assertRaises(TypeError, CScopeDocument, bad)
        self.assertRaises(TypeError, CScopeDocument, 'x', 5)
        self.assertRaises(TypeError, CScopeDocument)

    @unittest.skipUnless(PY3, 'bytes are decoded on 3.x only')
    def testBytesDecodedAsDeclared(self):
        doc = CScopeDocument(b'# -*- coding: latin-1 -*-\nx = "\xe9"\n', 'l.py')
        self.assertEqual(doc.GetLine(2), u'x = "\xe9"')
        doc.SelfCheck()
        doc = CScopeDocument(bytearray(b'\xef\xbb\xbfx = 1\n'))
        self.assertEqual(doc.GetText(), u'\ufeffx = 1\n')
        doc.SelfCheck()
        with self.assertRaises(SyntaxError):
            CScopeDocument(b'x = "\xff"\n')

    def testBomKeptAndSkipped(self):
        bom = u'\ufeff' if PY3 else '\xef\xbb\xbf'
        doc = CScopeDocument(bom + 'def f():\n    pass\n')
        self.assertEqual(doc.GetOutline(), [('f#0', 2, 1, 2)])
        doc.Edit(1, len(bom) + 4, 1, len(bom) + 5, 'g')
        self.assertEqual(doc.GetOutline(), [('g#0', 2, 1, 2)])
        doc.Edit(1, 0, 1, len(bom), '')
        doc.SelfCheck()
        doc.Edit(1, 0, 1, 0, bom)
        doc.SelfCheck()


class PlacesTest(unittest.TestCase):

    def testColumnsCountCharactersOfTheText(self):
        text = u'x = "\xe9\u4e2d"; y = 1\n' if PY3 else 'x = "\xc3\xa9\xe4\xb8\xad"; y = 1\n'
        doc = CScopeDocument(text)
        # The 'y' after the string: code points on 3.x, bytes on 2.7.
        col = text.index('y')
        doc.Edit(1, col, 1, col + 1, 'zz')
        self.assertEqual(doc.GetLine(1), text[:col] + 'zz' + text[col + 1:-1])
        doc.SelfCheck()

    def testUtf16Columns(self):
        # U+1F600 takes two UTF-16 units; U+00E9 one.
        if PY3:
            text = u's = "\U0001F600\xe9"; t = 1\n'
        else:
            text = 's = "\xf0\x9f\x98\x80\xc3\xa9"; t = 1\n'
        doc = CScopeDocument(text)
        # 't' is at UTF-16 unit 5 + 2 + 1 + 3 = 11.
        doc.Edit(1, 11, 1, 12, 'u', utf16=True)
        self.assertEqual(doc.GetLine(1), text[:text.index('t')] + 'u' + text[text.index('t') + 1:-1])
        # Inside the pair: refused.
        with self.assertRaises(ValueError):
            doc.Edit(1, 6, 1, 6, 'x', utf16=True)
        # Past the end in units, though not in characters on 2.7.
        length16 = 16
        self.assertRaises(ValueError, doc.Edit, 1, length16 + 1, 1, length16 + 1, 'x', utf16=True)
        doc.Edit(1, length16, 1, length16, '#', utf16=True)
        self.assertTrue(doc.GetLine(1).endswith('#'))
        doc.EditMany([(1, 5, 1, 7, u'\xe9' if PY3 else '\xc3\xa9')], utf16=True)
        doc.SelfCheck()

    def testCrlfAndLoneCr(self):
        text = 'def f():\r\n    x = 1 \\\r\n        + 2\r\n    # c\r\r\n'
        doc = CScopeDocument(text)
        self.assertEqual(doc.GetLine(1), 'def f():\r')
        doc.Edit(2, 4, 2, 5, 'y')
        doc.Edit(3, 0, 3, 0, '\r')
        doc.SelfCheck()
        doc.Edit(2, 10, 2, 12, '')      # the backslash-CR goes: the logical splits
        doc.SelfCheck()
        self.assertEqual(State(doc)[3], [Fields(l) for l in Fresh(doc.GetText())])

    def testNoFinalNewlineAndWhitespaceLastLine(self):
        doc = CScopeDocument('def f():\n    pass')
        for edit in [(2, 8, 2, 8, '\n'), (3, 0, 3, 0, '   '), (3, 3, 3, 3, 'x'), (2, 8, 3, 4, ''),
                     (1, 0, 2, 8, '')]:
            doc.Edit(*edit)
            doc.SelfCheck()
        self.assertEqual(doc.GetText(), '')
        doc.Edit(1, 0, 1, 0, '\t \f')
        doc.SelfCheck()

    def testEditsInTheFirstTwoLines(self):
        doc = CScopeDocument('#!/usr/bin/python\n# -*- coding: utf-8 -*-\nx = 1\n')
        for edit in [(1, 0, 1, 1, ''), (2, 0, 2, 0, 'def f():'), (1, 0, 3, 0, 'class C:\n    '),
                     (1, 0, 1, 0, '\n\n')]:
            doc.Edit(*edit)
            doc.SelfCheck()


class BadInputTest(unittest.TestCase):

    def setUp(self):
        self.doc = CScopeDocument(kSample)
        self.before = State(self.doc)

    def tearDown(self):
        self.assertEqual(State(self.doc), self.before)
        self.doc.SelfCheck()

    def testRangesOutsideTheText(self):
        doc = self.doc
        for args in [(0, 0, 1, 0), (1, 0, 22, 0), (22, 0, 22, 0), (1, 0, 1, 11), (1, -1, 1, 0),
                     (3, 0, 2, 0), (3, 5, 3, 4), (-1, 0, 1, 0)]:
            with self.assertRaises(ValueError) as caught:
                doc.Edit(*(args + ('x',)))
            self.assertTrue('line' in str(caught.exception) or 'range' in str(caught.exception))
        self.assertRaises((ValueError, OverflowError), doc.Edit, 1, 2 ** 70, 1, 0, 'x')

    def testWrongTypes(self):
        doc = self.doc
        for args in [(1.0, 0, 1, 0, 'x'), (1, '0', 1, 0, 'x'), (1, 0, 1, 0, None), (1, 0, 1, 0, 5),
                     (1, 0, 1, 0, OtherText('x')), (1, 0, 1, 0, ['x'])]:
            self.assertRaises(TypeError, doc.Edit, *args)
        self.assertRaises(TypeError, doc.Edit, 1, 0, 1, 0, 'x', utf16='yes')
        self.assertRaises(TypeError, doc.Edit, 1, 0, 1, 0)
        self.assertRaises(TypeError, doc.SetText, OtherText(kSample))
        self.assertRaises(TypeError, doc.SetText, None)
        self.assertRaises(TypeError, doc.GetScopeAtLine, None)

    def testABadEditInABatchUndoesTheOnesBefore(self):
        doc = self.doc
        good = (1, 0, 1, 0, 'import sys\n')
        for bad in [(30, 0, 30, 0, 'x'), (1, 0, 1, 0, OtherText('x')), (1, 0, 1), 'abcde', 5,
                    (1, 0, 1, 0, 'x', 1), (1, 0, 1, 0.5, 'x')]:
            self.assertRaises((ValueError, TypeError), doc.EditMany, [good, good, bad])
        # Each edit is checked in the text the ones before it left: line 23
        # exists only after the first.
        self.assertRaises(ValueError, doc.EditMany, [(22, 0, 22, 0, 'x')])
        self.assertRaises(TypeError, doc.EditMany, 'abc')
        self.assertRaises(TypeError, doc.EditMany, None)

    def testBatchesCheckedInTheTextBeforeThem(self):
        doc = self.doc
        r = doc.EditMany([(21, 0, 21, 0, 'x\n'), (22, 0, 22, 0, 'y')])
        self.assertTrue(r.fReadable)
        self.assertEqual(doc.GetText(), kSample + 'x\ny')
        doc.EditMany([(21, 0, 22, 1, '')])
        self.assertEqual(doc.GetText(), kSample)
        # Not what tearDown checks: the same state again.
        self.before = State(doc)


class UninitialisedTest(unittest.TestCase):

    def testMethodsRefuseADocumentWithoutText(self):
        doc = CScopeDocument.__new__(CScopeDocument)
        for call in (doc.GetText, doc.GetLogicals, lambda: doc.Edit(1, 0, 1, 0, 'x'), doc.SelfCheck):
            self.assertRaises(ValueError, call)

    def testAFailedInitKeepsTheOldText(self):
        doc = CScopeDocument('x = 1\n')
        self.assertRaises(TypeError, doc.__init__, 5)
        self.assertEqual(doc.GetText(), 'x = 1\n')
        doc.__init__('y = 2\n')
        self.assertEqual([l.fTokens for l in doc.GetLogicals()], [('y', '=', '2')])
        doc.SelfCheck()


if __name__ == '__main__':
    unittest.main()
