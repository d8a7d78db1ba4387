"""The whole-list pass: names of a freshly read file, and the change sets."""

import unittest

from support import (OPTIMIZED, CapturedStderr, CChangeFinder, Code, Def, FinderFields,
                     Logical, Named, Names, Outcome, Read, ScopeNames, WholePass, kBlankKind,
                     kCommentKind)


class HandBuiltListTest(unittest.TestCase):

    def testScopesCloseAtTheirOwnIndentNotAtDedentedComments(self):
        lst = [Def(1, 0, 'f'), Def(2, 0, 'g'), Code(3, 4)]
        WholePass(lst)
        self.assertEqual(ScopeNames(lst), ['', '', 'g#0'])
        comment = lambda lineno: Logical(['# c'], lineno, 0, kCommentKind)  # noqa: E731
        lst = [Def(1, 0, 'f'), Code(2, 4), comment(3), Logical([], 4, 0, kBlankKind), Code(5, 4), comment(6)]
        WholePass(lst)
        self.assertEqual(ScopeNames(lst), ['', 'f#0', 'f#0', 'f#0', 'f#0', ''])
        self.assertEqual(Names(Named('async def f():\n    pass\n')), [('', 'f#0'), ('f#0', None)])

    def testNegativeIndentWouldCloseTheModuleScope(self):
        # Optimised, the assert before closing is skipped and the empty stack has no top.
        self.assertEqual(Outcome(WholePass, [Code(1, -1)]),
                         (IndexError, 'list index out of range') if OPTIMIZED else (AssertionError, ''))

    def testStaleIndicesAreCountedAfresh(self):
        lst = [Def(1, 0, 'f'), Def(2, 0, 'f')]
        lst[0].fLocalScopeName = lst[1].fLocalScopeName = 'f#5'
        WholePass(lst)
        self.assertEqual([l.fLocalScopeName for l in lst], ['f#0', 'f#1'])

    def testNamelessDefinitionOpensNoScopeAndReportsNothing(self):
        lst = [Logical(tokens, n, indent, kind) for n, (tokens, indent, kind) in enumerate([
            (['class', 'A', ':'], 0, 1), (['def'], 4, 2), (['x', '=', '1'], 8, 0),
            (['def', 'g', '(', ')', ':'], 4, 2), (['y'], 8, 0), (['def'], 0, 2), (['z'], 4, 0)], 1)]
        with CapturedStderr() as err:
            WholePass(lst)
        self.assertEqual((ScopeNames(lst), err.getvalue()), (['', 'A#0', 'A#0', 'A#0', 'A#0.g#0', '', ''], ''))
        self.assertEqual(lst[3].fLocalScopeName, 'g#0')


class ChangeSetTest(unittest.TestCase):

    def testEveryScopeMetIsAChange(self):
        lst = Read("class A:\n    def f(self): pass\ndef g(): pass\ndef g(): pass\n")
        self.assertEqual(WholePass(lst)[1], (set(['', 'A#0', 'A#0.f#0', 'g#0', 'g#1']), set(['A#0']),
                                             set(['A#0.f#0', 'g#0', 'g#1'])))
        self.assertEqual(WholePass([])[1], (set(['']), set(), set()))
        # A second pass over named logicals keeps the names and reports them again.
        first = Names(lst)
        self.assertEqual(WholePass(lst)[1][2], set(['A#0.f#0', 'g#0', 'g#1']))
        self.assertEqual(Names(lst), first)

    def testScopesSeenTableAfterThePass(self):
        tables = []

        class Watch(CChangeFinder):
            def _FindChangesEntireListAdded(self):
                CChangeFinder._FindChangesEntireListAdded(self)
                tables.append(FinderFields(self))

        finder = WholePass(Read("def f(): pass\ndef f(): pass\nclass C:\n    def f(self): pass\n"), Watch)[0]
        self.assertEqual(tables[0]['scopes_seen'], {'f': 1, 'C': 0, 'C#0.f': 0})
        # The pass counts without moving the indices.
        self.assertEqual([tables[0][k] for k in ('end_index_for_scopes_seen', 'next_change_index',
                                                 'last_processed_index')], [0, -1, -1])
        self.assertIsNone(FinderFields(finder)['scopes_seen'])


class FailureAndOverrideTest(unittest.TestCase):

    def testNonLogicalStopsThePassAndLeavesTheFinderIdle(self):
        lst = [Code(1, 0), 'not a logical']
        finder = CChangeFinder(lst)
        # Idle again: the second call is not refused as recursive.
        self.assertEqual([Outcome(finder.FindChanges, lst, []) for _ in range(2)],
                         [(TypeError, 'Argument must be a logical')] * 2)
        self.assertEqual(lst[0].fScopeName, '')
        self.assertEqual(Outcome(finder._FindChangesEntireListAdded),
                         (AttributeError, "'NoneType' object has no attribute 'add'"))

    def testOverridesSeeEveryLogicalAndNameTheScopes(self):
        seen = []

        class Spy(CChangeFinder):
            def _SetLogicalScopeNames(self, logical, i, pair):
                seen.append((i, pair))
                return CChangeFinder._SetLogicalScopeNames(self, logical, i, pair)

            def _GetLeafScopeWithIndex(self, logical, scope_index):
                return 'F%d' % scope_index

        lst = Read("def f():\n    x = 1\n")
        self.assertEqual(WholePass(lst, Spy)[1], (set(['', 'F0']), set(), set(['F0'])))
        self.assertEqual(seen, [(0, ('', 'F0')), (1, ('F0', None))])
        self.assertEqual(Names(lst), [('', 'F0'), ('F0', None)])

    def testDedentedCommentStepThatDoesNotAdvance(self):
        def Raise(self, i):
            raise KeyError('boom')

        for step in Raise, lambda self, i: 0:
            lst = Read('def f():\n    x = 1\n# c\ny = 2\n')
            finder = type('Stuck', (CChangeFinder,), {'_ProcessDedentedComments': step})(lst)
            with CapturedStderr() as err:
                # Optimised, going on would leave the run unnamed.
                self.assertRaises(RuntimeError if OPTIMIZED else AssertionError,
                                  finder.FindChanges, lst, [])
            if step is Raise:
                self.assertIn("KeyError: 'boom'", err.getvalue())
                self.assertIn('pysource.scopebodycache.CChangeFinder._ProcessDedentedComments',
                              err.getvalue())


if __name__ == '__main__':
    unittest.main()
