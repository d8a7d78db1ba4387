"""CScopeDocument: edits and what they return, the queries, text that does
not read and back, the body cache, pickling and copying."""

import copy
import gc
import os
import pickle
import sys
import unittest

from support import PY3, Picklers, RunPython
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

    def testEditsFarApartAreReadEachWhereItIs(self):
        text = ''.join('v%d = %d\n' % (k, k) for k in range(400))
        doc = CScopeDocument(text)
        keep = doc.GetLogicals()
        # Bottom first, as an editor sends the edits of several cursors.
        r = doc.EditMany([(300, 0, 300, 4, 'w300'), (2, 0, 2, 0, 'def f():\n    pass\n')])
        self.assertLessEqual(doc.GetLastEditStats()['rows_scanned'], 4)
        self.assertEqual([(l.fTokens[0], l.fLineno) for l in r.fAdded], [('def', 2), ('pass', 3), ('w300', 302)])
        # A removed logical carries its number as the edits above it left it.
        self.assertEqual([(l.fTokens[0], l.fLineno) for l in r.fRemoved], [('v299', 302)])
        self.assertEqual(r.fRegion, (2, 299, 301))
        self.assertEqual(sum(1 for a, b in zip(keep[1:], doc.GetLogicals()[3:]) if a is b), 398)
        self.assertMatchesFresh(doc)

    def testEditsThatMeetAreReadTogether(self):
        doc = CScopeDocument(kSample)
        # The first opens a bracket the second closes lines below.
        r = doc.EditMany([(1, 9, 1, 9, ' (1,'), (3, 0, 3, 0, ')\n')])
        self.assertTrue(r.fReadable, r.fError)
        self.assertMatchesFresh(doc)

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


class ReadAgainOnlyWhatChangedTest(DocumentTestCase):
    """The rows an edit reads again are bounded by what its state needs,
    whatever the size of the text."""

    def setUp(self):
        self.text = kSample * 40      # 800 lines
        self.doc = CScopeDocument(self.text)

    def Stats(self, *edit):
        self.doc.Edit(*edit)
        return self.doc.GetLastEditStats()

    def testTypingAndLinesReadOneLogical(self):
        self.assertEqual(self.Stats(407, 16, 407, 16, 'y')['rows_scanned'], 1)
        stats = self.Stats(407, 8, 407, 8, 'z = 1\n        ')
        self.assertEqual((stats['rows_scanned'], stats['logicals_made']), (2, 2))
        # A line put in reads itself and the line it pushed down.
        self.assertEqual(self.Stats(405, 0, 405, 0, 'def new(self):\n')['rows_scanned'], 2)
        # Inside a string spanning rows, its logical is read whole.
        self.assertEqual(self.Stats(439, 5, 439, 5, 'more ')['rows_scanned'], 3)
        self.assertMatchesFresh(self.doc)

    def testOpeningAQuoteReadsToTheEndClosingItReadsALine(self):
        stats = self.Stats(2, 0, 2, 0, "'''")
        self.assertGreater(stats['rows_scanned'], 790)
        self.assertFalse(stats['find_changes_called'])
        r = self.doc.Edit(2, 0, 2, 3, '')
        self.assertEqual(self.doc.GetLastEditStats()['rows_scanned'], 1)
        self.assertEqual(r.fRegion, (2, 1, 1))
        self.assertEqual((r.fAdded, r.fRemoved), ([], []))
        self.assertMatchesFresh(self.doc, self.text)

    def testABackslashJoinsAndSplitsLogicals(self):
        # The blank line under a continued one is no logical of its own.
        r = self.doc.Edit(1, 9, 1, 9, ' \\')
        self.assertEqual(([l.fTokens for l in r.fAdded], [l.fKind for l in r.fRemoved]), ([], [22]))
        self.assertMatchesFresh(self.doc)
        r = self.doc.Edit(12, 16, 12, 16, ' \\')
        self.assertEqual((len(r.fRemoved), [l.fTokens for l in r.fAdded]), (2, [('pass', 'return', 'inner')]))
        self.assertMatchesFresh(self.doc)


class IndentationBelowTheEditTest(DocumentTestCase):

    def testADedentBelowIsCheckedAgainstTheNewStack(self):
        text = 'if a:\n  if b:\n    x\n  y\n'
        doc = CScopeDocument(text)
        r = doc.Edit(2, 0, 2, 0, ' ')
        self.assertEqual(r.fRegion, (2, 1, 1))
        self.assertEqual((r.fError.msg, r.fError.lineno, r.fError.offset, r.fError.text),
                         ('unindent does not match any outer indentation level', 4, 2, '  y\n'))
        doc.SelfCheck()
        r = doc.Edit(4, 0, 4, 0, ' ')
        self.assertTrue(r.fReadable)
        self.assertMatchesFresh(doc, 'if a:\n   if b:\n    x\n   y\n')

    def testTheLinesKeptWhileTheTextDoesNotReadAreTheLastReadables(self):
        doc = CScopeDocument(kSample)
        doc.EditMany([(16, 7, 16, 7, '['), (3, 0, 3, 0, '  ')])
        self.assertFalse(doc.IsReadable())
        doc.SelfCheck()   # the rows outside the edits against the last text that read
        doc.Edit(10, 0, 12, 0, '')
        doc.SelfCheck()
        r = doc.EditMany([(14, 7, 14, 8, ''), (3, 0, 3, 2, '')])
        self.assertTrue(r.fReadable, r.fError)
        self.assertEqual([l.fTokens[:2] for l in r.fRemoved if l.fKind == 2], [('def', 'f'), ('def', 'inner')])
        self.assertMatchesFresh(doc)

    def testTheEmptyLastLineRunsNoCheck(self):
        # The last line taken out leaves its row empty: what it held before
        # must not be checked under a deeper block put in above.
        doc = CScopeDocument('x = 1\n    y\n')
        doc.Edit(2, 0, 3, 0, '')
        doc.SelfCheck()
        r = doc.Edit(1, 0, 1, 0, 'if a:\n        ')
        self.assertTrue(r.fReadable, r.fError)
        self.assertMatchesFresh(doc, 'if a:\n        x = 1\n')


class HandEditedLogicalsTest(unittest.TestCase):

    def testALineNumberChangedFromOutsideIsRefusedAndDetected(self):
        doc = CScopeDocument(kSample)
        doc.GetLogicals()[5].fLineno = 100
        with self.assertRaises(RuntimeError):
            doc.Edit(6, 0, 6, 0, '#')
        self.assertEqual(doc.GetText(), kSample)
        self.assertRaises(AssertionError, doc.SelfCheck)

    def testANameChangedFromOutsideIsDetected(self):
        doc = CScopeDocument(kSample)
        doc.GetLogicals()[6].fScopeName = 'elsewhere'
        with self.assertRaises(AssertionError) as caught:
            doc.SelfCheck()
        self.assertIn('elsewhere', str(caught.exception))


class CheckEveryEditTest(unittest.TestCase):

    def testTheEnvironmentSwitchChecksEachEdit(self):
        code = """
            from pysource.scopedocument import CScopeDocument
            doc = CScopeDocument('def f():\\n    pass\\n')
            doc.Edit(2, 4, 2, 8, 'return')
            doc.GetLogicals()[1].fKind = 1
            try:
                doc.Edit(1, 0, 1, 0, '#')
            except AssertionError as exc:
                print('checked: %s' % str(exc).splitlines()[0])
        """
        status, out, err = RunPython(code, dict(os.environ, SBC_CHECK_DOCUMENT='1'))
        self.assertEqual(status, 0, err)
        self.assertIn('checked: the document differs', out)
        status, out, err = RunPython(code, dict(os.environ, SBC_CHECK_DOCUMENT='0'))
        self.assertEqual((status, out), (0, ''), err)


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
