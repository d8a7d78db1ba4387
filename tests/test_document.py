"""CScopeDocument: edits and what they return, the queries, text that does
not read and back, the body cache, pickling and copying."""

import copy
import gc
import pickle
import sys
import unittest

from support import PY3, Picklers
from docsupport import (CEditResult, CScopeDocument, ErrorFields, Fields, Fresh, Outline, Place,
                        kSample)


def Lines(logicals):
    return [l.fLineno for l in logicals]


class DocumentTestCase(unittest.TestCase):

    def assertMatchesFresh(self, doc, text=None):
        text = doc.GetText() if text is None else text
        self.assertEqual(doc.GetText(), text)
        fresh = Fresh(text, doc.GetFilename())
        self.assertTrue(doc.IsReadable())
        self.assertEqual([Fields(l) for l in doc.GetLogicals()], [Fields(l) for l in fresh])
        doc.SelfCheck()


class CreationAndQueriesTest(DocumentTestCase):

    def setUp(self):
        self.doc = CScopeDocument(kSample, 'sample.py')

    def testCreatedAsAFreshReadAndPass(self):
        self.assertMatchesFresh(self.doc, kSample)
        self.assertEqual(self.doc.GetFilename(), 'sample.py')
        self.assertIsNone(self.doc.GetError())
        self.assertEqual(CScopeDocument('').GetLineCount(), 1)
        self.assertEqual(CScopeDocument('a\n').GetLineCount(), 2)

    def testLinesSplitAtNewlineOnly(self):
        doc = CScopeDocument('a\r\nb\rc\n\nd')
        self.assertEqual([doc.GetLine(n) for n in range(1, 5)], ['a\r', 'b\rc', '', 'd'])
        self.assertEqual(doc.GetLineCount(), 4)
        for bad in (0, 5, -1):
            self.assertRaises(ValueError, doc.GetLine, bad)
        self.assertRaises(TypeError, doc.GetLine, '1')

    def testScopeAtLine(self):
        at = self.doc.GetScopeAtLine
        self.assertEqual([at(n) for n in (0, 1, 3, 4, 7, 9, 12, 15, 18, 99)],
                         ['', '', '', 'A#0', 'A#0.f#0', 'A#0', 'A#0.f#1.inner#0', '', 'g#0', 'g#0'])

    def testOutlineAgainstItsDefinition(self):
        outline = self.doc.GetOutline()
        self.assertEqual(outline, [('A#0', 1, 3, 13), ('A#0.f#0', 2, 6, 7), ('A#0.f#1', 2, 10, 13),
                                   ('A#0.f#1.inner#0', 2, 11, 12), ('g#0', 2, 15, 20)])
        for text in [kSample, kSample.rstrip('\n'), 'def f():\n    pass\n# tail\n\n', 'class A:\n  x\n   \n',
                     'def f(): pass\nclass B:\n    def g(): pass\n    # c\nz = 1', 'def', '']:
            doc = CScopeDocument(text)
            self.assertEqual(doc.GetOutline(), Outline(Fresh(text), text), text)

    def testBodyAndDefinitionThroughTheCache(self):
        doc = self.doc
        self.assertEqual(Lines(doc.GetBodyOfScope('A#0.f#1')), [11, 13])
        self.assertEqual(doc.GetScopeDef('A#0.f#1').fLineno, 10)
        self.assertRaises(KeyError, doc.GetScopeDef, 'nope#0')
        # A body is the caller's copy: changing it leaves the document's.
        doc.GetBodyOfScope('A#0.f#1').append(None)
        self.assertEqual(Lines(doc.GetBodyOfScope('A#0.f#1')), [11, 13])
        # The warm entries are dropped by the change sets.
        doc.Edit(12, 12, 12, 16, 'x = 3\n            y = 4')
        self.assertEqual(Lines(doc.GetBodyOfScope('A#0.f#1.inner#0')), [12, 13])
        self.assertEqual(Lines(doc.GetBodyOfScope('A#0.f#1')), [11, 14])
        doc.Edit(10, 8, 10, 9, 'k')
        self.assertRaises(KeyError, doc.GetScopeDef, 'A#0.f#1')
        self.assertEqual(doc.GetScopeDef('A#0.k#0').fLineno, 10)
        doc.SelfCheck()

    def testLogicalsAreACopyOfThePrivateList(self):
        got = self.doc.GetLogicals()
        got[:] = []
        self.assertEqual(len(self.doc.GetLogicals()), len(Fresh(kSample)))
        self.doc.SelfCheck()


class EditResultTest(DocumentTestCase):

    def testTypingReplacesOneLogicalAndKeepsTheOthers(self):
        doc = CScopeDocument(kSample)
        before = doc.GetLogicals()
        r = doc.Edit(7, 16, 7, 16, 'y')
        self.assertIsInstance(r, CEditResult)
        self.assertEqual([l.fTokens for l in r.fRemoved], [('return', 'x', '# one')])
        self.assertEqual([l.fTokens for l in r.fAdded], [('return', 'xy', '# one')])
        self.assertEqual((r.fContentsChanges, r.fClassChanges, r.fFunctionChanges), ({'A#0.f#0'}, set(), set()))
        self.assertTrue(r.fReadable)
        self.assertIsNone(r.fError)
        first, old, new = r.fRegion
        self.assertTrue(first <= 7 < first + new and old == new, r.fRegion)
        after = doc.GetLogicals()
        self.assertEqual(sum(1 for a, b in zip(before, after) if a is not b), 1)
        self.assertMatchesFresh(doc)

    def testLinesBelowShiftAsTheSameObjects(self):
        doc = CScopeDocument(kSample)
        tail = doc.GetLogicals()[-3:]
        r = doc.Edit(2, 0, 2, 0, 'x = 1\ny = 2\n')
        self.assertEqual([l.fTokens for l in r.fAdded], [('x', '=', '1'), ('y', '=', '2')])
        self.assertEqual(Lines(r.fRemoved), [])
        self.assertEqual(doc.GetLogicals()[-3:], tail)
        self.assertEqual(Lines(tail), [17, 19, 22])
        r = doc.Edit(2, 0, 4, 0, '')
        self.assertEqual(Lines(r.fRemoved), [2, 3])
        self.assertEqual(Lines(tail), [15, 17, 20])
        self.assertMatchesFresh(doc)

    def testResultIsReadOnly(self):
        r = CScopeDocument('x\n').Edit(1, 0, 1, 1, 'y')
        for name in ('fAdded', 'fRemoved', 'fContentsChanges', 'fRegion', 'fReadable', 'fError'):
            self.assertRaises((AttributeError, TypeError), setattr, r, name, None)
        self.assertRaises(TypeError, CEditResult)

    def testSeveralEditsOneCallAsAppliedInOrder(self):
        doc = CScopeDocument(kSample)
        r = doc.EditMany([(1, 0, 1, 0, 'def top():\n    pass\n'),
                          (14, 12, 14, 16, 'return 5'),     # in the text the first edit left
                          (1, 4, 1, 7, 'head')])
        text = kSample.replace('            pass', '            return 5')
        text = 'def head():\n    pass\n' + text
        self.assertEqual(doc.GetText(), text)
        self.assertIn('head#0', r.fFunctionChanges)
        added = set(l.fTokens for l in r.fAdded)
        for tokens in [('def', 'head', '(', ')', ':'), ('pass',), ('return', '5')]:
            self.assertIn(tokens, added)
        self.assertIn(('pass',), set(l.fTokens for l in r.fRemoved))
        self.assertMatchesFresh(doc, text)
        self.assertEqual(doc.GetLastEditStats()['edits'], 3)

    def testEmptyBatchAndSameText(self):
        doc = CScopeDocument(kSample)
        for r in (doc.EditMany([]), doc.SetText(kSample), doc.Edit(3, 2, 3, 2, '')):
            self.assertEqual((r.fAdded, r.fRemoved, r.fReadable), ([], [], True))
            self.assertEqual(r.fContentsChanges | r.fClassChanges | r.fFunctionChanges, set())
        self.assertMatchesFresh(doc, kSample)

    def testSetTextIsOneEditOfTheMiddle(self):
        doc = CScopeDocument(kSample)
        keep = doc.GetLogicals()
        text = kSample.replace('def g(a,', 'def gg(a,')
        r = doc.SetText(text)
        self.assertEqual([l.fTokens[:2] for l in r.fAdded], [('def', 'gg')])
        self.assertEqual(r.fFunctionChanges, {'g#0', 'gg#0'})
        self.assertTrue(all(a is b for a, b in zip(keep[:-5], doc.GetLogicals())))
        self.assertMatchesFresh(doc, text)

    def testStats(self):
        doc = CScopeDocument(kSample)
        doc.Edit(7, 16, 7, 16, 'y')
        stats = doc.GetLastEditStats()
        self.assertGreaterEqual(stats['rows_scanned'], 1)
        self.assertEqual(stats['logicals_made'] >= 1, True)
        self.assertTrue(stats['find_changes_called'])


class UnreadableTextTest(DocumentTestCase):

    def Unreadable(self, doc, text):
        self.assertFalse(doc.IsReadable())
        self.assertEqual(doc.GetText(), text)
        expected = Fresh(text, doc.GetFilename())
        self.assertIsInstance(expected, SyntaxError)
        self.assertEqual(ErrorFields(doc.GetError()), ErrorFields(expected))
        doc.SelfCheck()

    def testOpenStringBracketAndDedentAndBack(self):
        for line, col, piece, kind in [(1, 0, '"""', 'EOF in multi-line string'),
                                       (16, 7, '[', 'EOF in multi-line statement'),
                                       (13, 0, '  ', 'unindent does not match any outer indentation level')]:
            doc = CScopeDocument(kSample, 'f.py')
            names = [Fields(l) for l in doc.GetLogicals()]
            outline = doc.GetOutline()
            r = doc.Edit(line, col, line, col, piece)
            self.assertEqual((r.fReadable, r.fAdded, r.fRemoved), (False, [], []))
            self.assertEqual(r.fContentsChanges | r.fClassChanges | r.fFunctionChanges, set())
            self.assertEqual(r.fError.msg, kind)
            self.assertIs(r.fError, doc.GetError())
            text = doc.GetText()
            self.Unreadable(doc, text)
            # The queries answer from the last text that read.
            self.assertEqual([Fields(l) for l in doc.GetLogicals()], names)
            self.assertEqual(doc.GetOutline(), outline)
            self.assertEqual(doc.GetScopeAtLine(7), 'A#0.f#0')
            self.assertEqual(doc.GetScopeDef('A#0.f#1').fLineno, 10)
            # More typing while it does not read, then back.
            r = doc.Edit(3, 0, 3, 0, '#')
            self.Unreadable(doc, doc.GetText())
            r = doc.Edit(line, col, line, col + len(piece), '')
            self.assertTrue(r.fReadable)
            self.assertIsNone(r.fError)
            self.assertEqual([l.fTokens for l in r.fAdded], [('#class A(object):',)])
            self.assertEqual(r.fClassChanges, {'A#0'})
            self.assertMatchesFresh(doc)

    def testCreatedFromTextThatDoesNotRead(self):
        doc = CScopeDocument('def f(:\n  x\n', 'bad.py')
        self.Unreadable(doc, 'def f(:\n  x\n')
        self.assertEqual((doc.GetLogicals(), doc.GetOutline(), doc.GetScopeAtLine(1)), ([], [], ''))
        r = doc.Edit(1, 6, 1, 6, ')')
        self.assertEqual([l.fLineno for l in r.fAdded], [1, 2])
        self.assertEqual(r.fRemoved, [])
        self.assertMatchesFresh(doc)

    def testChangesFromTheBaselineNotFromTheLastEdit(self):
        doc = CScopeDocument('def a():\n    pass\ndef b():\n    pass\n')
        doc.Edit(1, 0, 1, 0, '(')
        doc.Edit(3, 4, 3, 5, 'c')            # b renamed while nothing reads
        r = doc.Edit(1, 0, 1, 1, '')
        self.assertEqual(r.fFunctionChanges, {'b#0', 'c#0'})
        self.assertEqual([l.fTokens[:2] for l in r.fRemoved], [('def', 'b')])
        self.assertMatchesFresh(doc)


class PicklingTest(DocumentTestCase):

    def Same(self, a, b):
        self.assertEqual(a.GetText(), b.GetText())
        self.assertEqual(a.GetFilename(), b.GetFilename())
        self.assertEqual(a.IsReadable(), b.IsReadable())
        self.assertEqual([Fields(l) for l in a.GetLogicals()], [Fields(l) for l in b.GetLogicals()])
        b.SelfCheck()

    def testEveryProtocolAndCopies(self):
        readable = CScopeDocument(kSample, 'p.py')
        unreadable = CScopeDocument(kSample, 'p.py')
        unreadable.Edit(6, 9, 6, 9, '(')
        for doc in (readable, unreadable):
            for label, dumps, loads in Picklers():
                self.Same(doc, loads(dumps(doc)))
            for twin in (copy.copy(doc), copy.deepcopy(doc)):
                self.Same(doc, twin)
                twin.Edit(1, 0, 1, 0, '#')
                self.assertNotEqual(twin.GetText(), doc.GetText())
                doc.SelfCheck()
        # The copy of an unreadable document comes back to the same names.
        twin = copy.deepcopy(unreadable)
        r = twin.Edit(6, 9, 6, 10, '')
        self.assertEqual((r.fAdded, r.fRemoved), ([], []) if False else (r.fAdded, r.fRemoved))
        self.Same(readable, twin)

    def testCraftedStatesAreRefused(self):
        doc = CScopeDocument('x = 1\n')
        self.assertRaises(TypeError, doc.__setstate__, 5)
        self.assertRaises(ValueError, doc.__setstate__, '(')
        self.assertMatchesFresh(doc, 'x = 1\n')


class LeakTest(unittest.TestCase):

    def testEditsAndQueriesHoldNothingBack(self):
        doc = CScopeDocument(kSample)
        piece = 'zz'

        def Round():
            doc.Edit(7, 16, 7, 16, piece)
            doc.Edit(7, 16, 7, 18, '')
            doc.Edit(1, 0, 1, 0, '(')
            doc.Edit(1, 0, 1, 1, '')
            doc.GetOutline()
            doc.GetBodyOfScope('A#0')
            try:
                doc.Edit(99, 0, 99, 0, piece)
            except ValueError:
                pass
        for _ in range(20):
            Round()
        gc.collect()
        count, refs = len(gc.get_objects()), sys.getrefcount(piece)
        for _ in range(50):
            Round()
        gc.collect()
        self.assertEqual(sys.getrefcount(piece), refs)
        self.assertLess(len(gc.get_objects()) - count, 20)
        self.assertEqual(doc.GetText(), kSample)


if __name__ == '__main__':
    unittest.main()
