"""CChangeFinder's life cycle and the FindChanges driver: strategy, result, guard, exits."""

import gc
import unittest
import weakref

from pysource.scopebodycache import CChangeFinder

from support import (Edit, ImportWith, Names, Outcome, Read, WholeListNames, kSampleSource)

kRecursive = 'FindChanges cannot be called recursively'
kNoLen = "object of type 'NoneType' has no len()"
kErrors = dict((name, KeyError(name)) for name in ['prepare', 'prepared', 'whole', 'clear'])


class Recorder(CChangeFinder):
    """Records the driver-level steps; `fail` names the points that raise."""
    fail = ()
    removed_result = 'delegate'

    def __init__(self, lst):
        self.calls, self.seen = [], []
        CChangeFinder.__init__(self, lst)

    def Raise(self, point):
        if point in self.fail:
            raise kErrors[point]

    def _Clear(self):
        self.calls.append('clear')
        try:  # Python code that raises and catches must not disturb a pending error
            {}['missing']
        except KeyError:
            pass
        CChangeFinder._Clear(self)
        self.Raise('clear')

    def _PrepareForFind(self):
        self.calls.append('prepare')
        self.Raise('prepare')
        CChangeFinder._PrepareForFind(self)
        self.Raise('prepared')

    def _ProcessRemovedLogicals(self, removed_list):
        self.calls.append('removed')
        if 'caught' in self.fail:
            try:
                self.FindChanges([], [])
            except ValueError as e:
                self.calls.append(str(e))
        self.seen = [removed_list, CChangeFinder._ProcessRemovedLogicals(self, removed_list)]
        return self.seen[1] if self.removed_result == 'delegate' else self.removed_result

    def _FindChangesEntireListAdded(self):
        self.calls.append('whole')
        self.Raise('whole')
        if 'nested' in self.fail:
            self.FindChanges(self._fLogicalList, [])
        CChangeFinder._FindChangesEntireListAdded(self)

    def _ProcessAddedLogicals(self, added_list, indicies_to_check):
        self.calls.append('added')
        self.seen += [added_list, indicies_to_check]
        if indicies_to_check is not None:  # the built-in step would fail on None
            CChangeFinder._ProcessAddedLogicals(self, added_list, indicies_to_check)


class Box(object):
    pass


class DriverTest(unittest.TestCase):

    def assertIdle(self, finder):
        """Idle: a new call is not refused, and runs from a clean state."""
        lst = finder._fLogicalList
        self.assertEqual(finder.FindChanges(list(lst), []), CChangeFinder(lst).FindChanges(list(lst), []))

    def testInitHoldsTheCallersList(self):
        lst = Read('x = 1\n')
        finder = Recorder(lst)
        self.assertEqual(finder.calls, ['clear'])
        self.assertIs(finder._fLogicalList, lst)
        lst.extend(Read('\nclass B:\n    y = 2\n')[1:])
        self.assertEqual(finder.FindChanges(lst, []), (set(['', 'B#0']), set(['B#0']), set()))
        self.assertEqual(Names(lst), [('', None), ('', 'B#0'), ('B#0', None)])
        # A wrong type is refused before clearing; a second __init__ ends a find in progress.
        finder.calls = []
        self.assertEqual(Outcome(CChangeFinder.__init__, finder, ()), (TypeError, 'Expected list, got tuple'))
        self.assertEqual(finder.calls, [])
        finder._PrepareForFind()
        other = Read('def f():\n    pass\n')
        finder.__init__(other)
        self.assertIs(finder._fLogicalList, other)
        self.assertEqual(finder.FindChanges(other, [])[2], set(['f#0']))
        # Allocated without __init__, or given None: each pass fails, the finder stays usable.
        for finder in CChangeFinder.__new__(CChangeFinder), CChangeFinder(None):
            self.assertIsNone(finder._fLogicalList)
            self.assertEqual([Outcome(finder.FindChanges, [], []) for _ in range(2)], [(TypeError, kNoLen)] * 2)

    def testBaseInitRunsFirst(self):
        # A stand-in base class with the real size and method table records its __init__.
        result = ImportWith("""
            calls, fail = [], []
            def BaseInit(self):
                calls.append('base')
                if fail:
                    raise KeyError('base')
            Substitute(TD, CDestroyable=Slotted(TD.CDestroyable.__basicsize__, __init__=BaseInit,
                                                __vtable__=TD.CDestroyable.__dict__['__vtable__']))
            """, """
            F = type('F', (mod.CChangeFinder,), {'_Clear': lambda self: calls.append('clear')})
            out = result['out'] = []
            for args in [([],), ((),), (), ([1],)]:
                calls[:], fail[:], finder = [], [1] * (args == ([1],)), F.__new__(F)
                try:
                    finder.__init__(*args)
                    out.append((calls[:], None))
                except Exception as e:
                    out.append((calls[:], '%s: %s' % (type(e).__name__, e), finder._fLogicalList))
            """)
        self.assertEqual(result['out'], [
            (['base', 'clear'], None), (['base'], 'TypeError: Expected list, got tuple', None),
            ([], 'TypeError: __init__() takes exactly 1 positional argument (0 given)', None),
            (['base'], "KeyError: 'base'", None)])

    def testStrategyByTheCountOfAddedLogicals(self):
        lst = Read(kSampleSource)
        functions = set(['A#0.f#0', 'A#0.f#1', 'g#0'])
        expected = (functions | set(['', 'A#0']), set(['A#0']), functions)
        # Only the count of added logicals matters, not what they are.
        for added in lst, [None] * len(lst):
            finder = Recorder(lst)
            finder.calls = []
            self.assertEqual(finder.FindChanges(added, []), expected)
            self.assertEqual(finder.calls, ['prepare', 'removed', 'whole', 'clear'])
            self.assertEqual(Names(lst), WholeListNames(kSampleSource))
            for l in lst:
                l.fScopeName = l.fLocalScopeName = None
        finder = Recorder([])
        self.assertEqual(finder.FindChanges([], []), (set(['']), set(), set()))
        self.assertIn('whole', finder.calls)
        # Otherwise the indices the removed step gives go to the added step.
        CChangeFinder(lst).FindChanges(lst, [])
        added, removed = Edit(lst, kSampleSource.replace('x = 1', 'x = 3'))
        finder = Recorder(lst)
        finder.calls = []
        self.assertEqual(finder.FindChanges(added, removed), (set(['A#0.f#1']), set(), set()))
        self.assertEqual(finder.calls, ['prepare', 'removed', 'added', 'clear'])
        indices = finder.seen[1]
        self.assertIs(type(indices), list)
        self.assertEqual([id(x) for x in finder.seen], [id(x) for x in (removed, indices, added, indices)])
        # They must be a list or None; the whole-list pass ignores them.
        finder.removed_result, finder.calls = (), []
        self.assertEqual(Outcome(finder.FindChanges, [], []), (TypeError, 'Expected list, got tuple'))
        self.assertEqual(finder.calls, ['prepare', 'removed', 'clear'])
        self.assertEqual(finder.FindChanges(lst, [])[1], set(['A#0']))
        finder.removed_result = None
        finder.FindChanges([], [])
        self.assertEqual(finder.seen[2:], [[], None])

    def testResultsStayTheCallers(self):
        # A call may reuse the sets of a result its caller has dropped, never
        # ones the caller still reaches, watches or filled with its own objects.
        lst = Read(kSampleSource)
        finder = CChangeFinder(lst)
        finder.FindChanges(lst, [])
        typed, back = kSampleSource.replace('x = 1', 'x = 3'), kSampleSource

        def Type(source, finder=finder, lst=lst):
            return finder.FindChanges(*Edit(lst, source))
        kept = Type(typed)
        self.assertIsNot(Type(back), kept)
        contents = Type(typed)[0]
        watched = weakref.ref(Type(typed)[0])
        self.assertIsNot(Type(back)[0], watched())
        self.assertIsNone(watched())

        class Noted(object):
            freed = []

            def __init__(self, ref=None):
                self.ref = ref

            def __del__(self):
                Noted.freed.append(1)
        Type(back)[1].add(Noted())
        self.assertEqual(Noted.freed, [])
        for source in [typed, back] * 3:
            result = Type(source)
            self.assertEqual(result, (set(['A#0.f#1']), set(), set()))
        self.assertEqual(Noted.freed, [1])
        self.assertEqual((kept, contents), ((set(['A#0.f#1']), set(), set()), set(['A#0.f#1'])))
        self.assertIsNot(result[0], contents)
        # A set that refers back to its finder does not keep the two alive.
        del result
        box = Box()
        box.finder = finder
        Type(typed)[0].add(box)
        probe = weakref.ref(box)
        del finder, lst, Type, box
        gc.collect()
        self.assertIsNone(probe())

    def testStateAfterEachKindOfExit(self):
        done = ['prepare', 'removed', 'whole', 'clear']
        # (failure points, expected error, steps called, busy afterwards)
        for fail, error, calls, busy in [
                ((), None, done, False),
                (('whole',), 'whole', done, False),
                (('clear',), 'clear', done, False),  # the result is dropped
                (('whole', 'clear'), 'clear', done, False),  # the pending error is replaced
                # The refused nested call neither prepares nor clears.
                (('nested',), (ValueError, kRecursive), done, False),
                (('caught',), None, ['prepare', 'removed', kRecursive, 'whole', 'clear'], False),
                (('prepare',), 'prepare', ['prepare'], False),
                # Prepared, then failed: _Clear is not called, yet the
                # finder is not left marked as in a call.
                (('prepared',), 'prepared', ['prepare'], False)]:
            lst = Read(kSampleSource)
            finder = Recorder(lst)
            finder.fail, finder.calls = fail, []
            try:
                finder.FindChanges(lst, [])
                got = None
            except Exception as e:
                got = e if isinstance(error, str) else (type(e), str(e))
            self.assertEqual((got, finder.calls), (kErrors.get(error, error), calls), fail)
            finder.fail, finder.calls = (), []
            if busy:
                self.assertEqual([Outcome(finder.FindChanges, lst, []) for _ in range(2)],
                                 [(ValueError, kRecursive)] * 2)
                self.assertEqual(finder.calls, [])
                finder._Clear()
            self.assertIdle(finder)

    def testDestroy(self):
        destroyed = []
        finder = type('Finder', (Recorder,), {'_destroy_impl': lambda self: destroyed.append(self)
                                              or Recorder._destroy_impl(self)})(Read(kSampleSource))
        finder._PrepareForFind()
        finder.calls = []
        finder.destroy()
        finder.destroy()
        self.assertTrue(finder.IsDestroyed())
        self.assertEqual((destroyed, finder.calls, finder._fLogicalList), ([finder], ['clear'], None))
        # Cleared: a call is not refused, it fails on the missing list; methods still run.
        for _ in range(2):
            self.assertEqual(Outcome(finder.FindChanges, [], []), (TypeError, kNoLen))
            self.assertEqual(finder.calls[-1], 'clear')
        finder._PrepareForFind()
        finder._Clear()
        self.assertIsNone(finder._destroy_impl())


if __name__ == '__main__':
    unittest.main()
