"""The incremental pass: which indices are visited, how far changes are
carried, and that every edit leaves the names a fresh whole-file pass gives."""

import unittest

from support import (OPTIMIZED, CChangeFinder, Code, Edit, FinderFields, Named,
                     Names, Outcome, Read, ScopeNames, WholeListNames, WholePass)


class Spy(CChangeFinder):
    """Records the indices the pass asks about, and the comment runs it places."""

    def __init__(self, lst):
        CChangeFinder.__init__(self, lst)
        self.looked_up, self.runs, self.fields = [], [], []

    def _FindScopeNameContainingLogical(self, i):
        self.looked_up.append(i)
        self.fields.append(FinderFields(self))
        return CChangeFinder._FindScopeNameContainingLogical(self, i)

    def _ProcessDedentedComments(self, i):
        self.runs.append(i)
        return CChangeFinder._ProcessDedentedComments(self, i)


class Routed(CChangeFinder):
    """Takes every step through the overrides' route."""

    def _Clear(self):
        CChangeFinder._Clear(self)


def Edited(old, *new, **kwargs):
    """(list, finder, result) of the edit old -> new after a whole-list pass."""
    lst = Read(old)
    finder = WholePass(lst, kwargs.get('finder_class', CChangeFinder))[0]
    if isinstance(finder, Spy):
        finder.__init__(lst)
    return lst, finder, finder.FindChanges(*Edit(lst, *new))


class VisitingOrderTest(unittest.TestCase):

    def testSortedAndEachIndexOnceAtItsLastOccurrence(self):
        lst = [Code(n + 1, 0) for n in range(12)]
        finder = WholePass(lst, Spy)[0]
        for l in (lst[4], lst[9]):
            del l.fScopeName
        finder.looked_up = []
        finder._PrepareForFind()
        indices = [9, 2]
        finder._ProcessAddedLogicals([lst[4], lst[9]], indices)
        finder._Clear()
        self.assertEqual(indices, [2, 4, 9, 9])
        # Each index once, plus one scan step after each logical that changed.
        self.assertEqual(finder.looked_up, [2, 4, 5, 9, 10])
        self.assertEqual(ScopeNames(lst), [''] * 12)

    def testTypingVisitsOneIndexAndScansOneStep(self):
        source = "def f():\n    a = 1\n    b = 2\n    c = 3\n"
        lst, finder, result = Edited(source, source.replace('b = 2', 'b = 23'), finder_class=Spy)
        self.assertEqual(finder.looked_up, [2, 3])
        self.assertEqual(result, (set(['f#0']), set(), set()))
        lst = Named("x = 1\ny = 2\n")
        self.assertEqual(CChangeFinder(lst).FindChanges([], [lst[1]]), (set(['']), set(), set()))

    def testLookBackStopsAtTheFirstLineNotDeeper(self):
        # An unnamed line above the sibling is not reached: the sibling decides.
        def Find(self, i):
            del self._fLogicalList[1].fScopeName
            return CChangeFinder._FindScopeNameContainingLogical(self, i)

        old = "def f():\n    a = 1\n    b = 2\n    c = 3\n"
        lst = Edited(old, old.replace('3', '4'),
                     finder_class=type('F', (CChangeFinder,), {'_FindScopeNameContainingLogical': Find}))[0]
        self.assertEqual(ScopeNames(lst), ['', None, 'f#0', 'f#0'])

    def testNextChangeAndLastProcessedIndices(self):
        old = "a = 1\nb = 2\nc = 3\nd = 4\ne = 5\n"
        first = old.replace('2', '20')
        lst, finder, _ = Edited(old, first, first.replace('4', '40'), finder_class=Spy)
        visits = [(i, f['next_change_index'], f['last_processed_index'])
                  for i, f in zip(finder.looked_up, finder.fields)]
        # 1 and 3 are visited (each also mapped from a removed logical);
        # the scans after them look at 2 and 4 and stop there.
        self.assertEqual(visits, [(1, 3, -1), (2, 3, -1), (3, 5, 1), (4, 5, 1)])
        self.assertEqual(FinderFields(finder)['next_change_index'], -1)

    def testDedentedRunIsPlacedOnceAndMarkedProcessed(self):
        old = "def f():\n    a = 1\n# c1\n# c2\n# c3\nz = 2\n"
        for new in old.replace('c1', 'c1x'), old.replace('c2', 'c2x'):
            lst, finder, _ = Edited(old, new, finder_class=Spy)
            self.assertEqual(finder.runs, [2])
            self.assertEqual(Names(lst), WholeListNames(new))
        # The run 2..4 is placed from the code line at 5; then 5 is visited
        # with the run marked as processed.
        self.assertEqual([(i, f['last_processed_index']) for i, f in zip(finder.looked_up, finder.fields)],
                         [(5, -1), (5, 4)])


class ForwardScanTest(unittest.TestCase):

    def testNewDefMovesDeeperLinesIntoItsScope(self):
        lst, _, result = Edited("x = 0\n    a = 1\n    b = 2\nc = 3\n",
                                "def g():\n    a = 1\n    b = 2\nc = 3\n")
        self.assertEqual(ScopeNames(lst), ['', 'g#0', 'g#0', ''])
        self.assertEqual(result, (set(['', 'g#0']), set(), set(['g#0'])))

    def testRenamedClassRenamesItsMethodsAndReportsOldNames(self):
        old = "class A:\n    def f(self):\n        pass\n    def g(self):\n        pass\n"
        lst, _, (contents, classes, functions) = Edited(old, old.replace('class A', 'class B'))
        self.assertEqual(Names(lst), WholeListNames(old.replace('class A', 'class B')))
        self.assertEqual(classes, set(['A#0', 'B#0']))
        self.assertEqual(functions, set(['A#0.f#0', 'A#0.g#0', 'B#0.f#0', 'B#0.g#0']))

    def testHeaderTypedInPlaceAgreesWithTheRoutedSteps(self):
        # A header that reads as before spares the scan of its body; every
        # other edit of it still renames what follows.
        body = ''.join('        v%d = %d\n' % (k, k) for k in range(6))
        nested = ('class C:\n    def f(self):\n' + body + '    for x in y:\n' + body +
               '    def g(self):\n        pass\n    z = 1\n')
        block = 'def f():\n    a = 1\n    if a:\n' + body + 'b = 2\n'
        method = 'class C:\n    x = 1\n    def f(self):\n' + body + 'y = 2\n'
        for old, new in [(nested, nested.replace('def f(self)', 'def f(self, q)')),
                         (nested, nested.replace('for x in y', 'for x in yz')),
                         (nested, nested.replace('def f(self)', 'class f(object)')),
                         (nested, nested.replace('def f(self)', 'def g(self)')),
                         (nested, nested.replace('def f(self)', 'def h(self)')),
                         (block, block.replace('    if a:', 'if a:')),
                         (method, method.replace('    def f(self)', 'def f(self)'))]:
            lst, _, result = Edited(old, new)
            self.assertEqual(Names(lst), WholeListNames(new), new)
            self.assertEqual(result, Edited(old, new, finder_class=Routed)[2], new)


class IndexRepairTest(unittest.TestCase):

    def testNewDefinitionAboveRenumbersLaterOnesAndTheirBodies(self):
        old = "def f():\n    a = 1\ndef f():\n    b = 1\n    def f():\n        c = 1\n"
        new = "def f():\n    pass\n" + old
        lst, _, (contents, classes, functions) = Edited(old, new)
        self.assertEqual(Names(lst), WholeListNames(new))
        self.assertEqual(ScopeNames(lst)[-1], 'f#2.f#0')
        # The old first header stays (same object, same name); the others move on.
        self.assertEqual(functions, set(['f#1', 'f#2', 'f#1.f#0', 'f#2.f#0']))
        self.assertTrue(set(['f#0', 'f#1', 'f#2', 'f#1.f#0', 'f#2.f#0']) <= contents)

    def testRemovedDefinitionRenumbersTheNextOne(self):
        lst, _, (contents, classes, functions) = Edited("def f():\n    a = 1\ndef f():\n    b = 1\n",
                                                        "def f():\n    b = 1\n")
        self.assertEqual(Names(lst), [('', 'f#0'), ('f#0', None)])
        # The first header and the last body line are kept; the second def went.
        self.assertEqual((contents, functions), (set(['', 'f#0', 'f#1']), set(['f#1'])))


class OverrideTest(unittest.TestCase):

    def Edit(self, **methods):
        """The outcome of an edit through a finder with `methods` overridden."""
        old = "def f():\n    a = 1\n    b = 2\n"
        lst = Named(old)
        finder = type('Finder', (CChangeFinder,), methods)(lst)
        return lst, finder, Outcome(finder.FindChanges, *Edit(lst, old.replace('a = 1', 'a = 10')))

    def testOverrideThatRaisesPropagatesAndLeavesTheFinderIdle(self):
        def Raise(self, *args):
            raise RuntimeError('no')

        lst, finder, outcome = self.Edit(_LogicalInScopeChanged=Raise)
        # Idle again: the next call runs (and meets the override again).
        self.assertEqual([outcome, Outcome(finder.FindChanges, [lst[1]], [])], [(RuntimeError, 'no')] * 2)

    def testOverrideThatEmptiesTheListOrDestroysTheFinderFailsCleanly(self):
        def Empty(self, i):
            del self._fLogicalList[:]
            return ''

        self.assertEqual(self.Edit(_FindScopeNameContainingLogical=Empty)[2],
                         (IndexError, 'list index out of range'))
        outcome = self.Edit(_FindScopeNameContainingLogical=lambda self, i: self._destroy_impl() or '')[2]
        self.assertIn(outcome[0], (TypeError, AttributeError))


if __name__ == '__main__':
    unittest.main()
