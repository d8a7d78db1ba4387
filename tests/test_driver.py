"""CChangeFinder's life cycle and the FindChanges driver: strategy, result, guard, exits."""

import ast
import sys
import unittest

from tallowkit.destroyable import CDestroyable
from pysource.scopebodycache import CChangeFinder

from support import CapturedStderr, Edit, Names, Read, RunPython, WholeListNames

kSource = '''\
class A:
    def f(self):
        pass
    def f(self):
        x = 1
# about g
def g():
    return 2
'''


class Recorder(CChangeFinder):
    """Delegates every driver-level step and records the calls."""

    def __init__(self, lst):
        self.calls = []
        CChangeFinder.__init__(self, lst)

    def _Clear(self):
        self.calls.append('clear')
        CChangeFinder._Clear(self)

    def _PrepareForFind(self):
        self.calls.append('prepare')
        CChangeFinder._PrepareForFind(self)

    def _ProcessRemovedLogicals(self, removed_list):
        self.calls.append(('removed', removed_list))
        return CChangeFinder._ProcessRemovedLogicals(self, removed_list)

    def _FindChangesEntireListAdded(self):
        self.calls.append('whole')
        CChangeFinder._FindChangesEntireListAdded(self)

    def _ProcessAddedLogicals(self, added_list, indicies_to_check):
        self.calls.append(('added', added_list, indicies_to_check))
        CChangeFinder._ProcessAddedLogicals(self, added_list, indicies_to_check)


class DriverTestCase(unittest.TestCase):

    def assertIdle(self, finder):
        """Idle: a new call is not refused as recursive, and runs from clean state."""
        lst = finder._fLogicalList
        self.assertEqual(finder.FindChanges(list(lst), []),
                         CChangeFinder(lst).FindChanges(list(lst), []))

    def assertRaisesMessage(self, exc, message, func, *args):
        with self.assertRaises(exc) as cm:
            func(*args)
        self.assertEqual(str(cm.exception), message)
        return cm.exception


class ConstructionTest(DriverTestCase):

    def testHoldsTheCallersList(self):
        lst = Read('x = 1\n')
        finder = CChangeFinder(lst)
        self.assertIs(finder._fLogicalList, lst)
        # Later edits of the list are seen.
        lst.extend(Read('\nclass B:\n    y = 2\n')[1:])
        self.assertEqual(finder.FindChanges(lst, []), (set(['', 'B#0']), set(['B#0']), set()))
        self.assertEqual(Names(lst), [('', None), ('', 'B#0'), ('B#0', None)])

    def testInitClearsThroughTheStep(self):
        finder = Recorder([])
        self.assertEqual(finder.calls, ['clear'])
        # A second __init__ replaces the list and ends a find in progress.
        finder._PrepareForFind()
        other = Read('def f():\n    pass\n')
        finder.__init__(other)
        self.assertIs(finder._fLogicalList, other)
        self.assertEqual(finder.FindChanges(other, [])[2], set(['f#0']))

    def testInitWithAWrongType(self):
        finder = Recorder([])
        del finder.calls[:]
        self.assertRaisesMessage(TypeError, 'Expected list, got tuple', finder.__init__, ())
        self.assertEqual(finder.calls, [])
        self.assertRaisesMessage(TypeError, 'Expected list, got tuple', CChangeFinder, ())

    def testNoListUntilUsed(self):
        # Allocated without __init__, or given None: the first pass fails,
        # and the finder stays usable.
        for finder in CChangeFinder.__new__(CChangeFinder), CChangeFinder(None):
            self.assertIsNone(finder._fLogicalList)
            for _ in range(2):
                self.assertRaisesMessage(TypeError, "object of type 'NoneType' has no len()",
                                         finder.FindChanges, [], [])

    def testBaseInitRunsFirst(self):
        # A stand-in base class records its __init__; it has the real
        # instance size and method table, so the module accepts it.
        status, out, err = RunPython(r'''
            import ctypes, sys, types
            import tallowkit.destroyable as TD
            real = TD.CDestroyable
            count = (real.__basicsize__ - object.__basicsize__) // ctypes.sizeof(ctypes.c_void_p)
            calls = []
            fail = []
            class Base(object):
                __slots__ = tuple('s%d' % k for k in range(count))
                __vtable__ = real.__dict__['__vtable__']
                def __init__(self):
                    calls.append('base')
                    if fail:
                        raise KeyError('base')
            sub = types.ModuleType(TD.__name__)
            sub.__dict__.update(TD.__dict__)
            sub.CDestroyable = Base
            sys.modules[TD.__name__] = sub
            from pysource.scopebodycache import CChangeFinder
            class F(CChangeFinder):
                def _Clear(self):
                    calls.append('clear')
                    CChangeFinder._Clear(self)
            out = []
            def Try(*args):
                del calls[:]
                try:
                    F(*args)
                    out.append((list(calls), None))
                except Exception as e:
                    out.append((list(calls), '%s: %s' % (type(e).__name__, e)))
            Try([])
            Try(())
            Try()
            fail.append(1)
            Try([])
            finder = F.__new__(F)
            try:
                finder.__init__([1])
            except KeyError:
                pass
            out.append(finder._fLogicalList)
            print repr(out)
            ''')
        self.assertEqual(status, 0, err)
        self.assertEqual(ast.literal_eval(out.strip()), [
            (['base', 'clear'], None),
            (['base'], 'TypeError: Expected list, got tuple'),
            ([], 'TypeError: __init__() takes exactly 1 positional argument (0 given)'),
            (['base'], "KeyError: 'base'"),
            None,
        ])


class StrategyTest(DriverTestCase):

    def testWholeListWhenCountsMatch(self):
        lst = Read(kSource)
        finder = Recorder(lst)
        removed = []
        finder.calls = []
        result = finder.FindChanges(lst, removed)
        self.assertEqual(finder.calls, ['prepare', ('removed', removed), 'whole', 'clear'])
        self.assertIs(finder.calls[1][1], removed)
        self.assertEqual(result, (set(['', 'A#0', 'A#0.f#0', 'A#0.f#1', 'g#0']), set(['A#0']),
                                  set(['A#0.f#0', 'A#0.f#1', 'g#0'])))

    def testOnlyTheCountOfAddedLogicalsMatters(self):
        lst = Read(kSource)
        expected = CChangeFinder(lst).FindChanges(lst, [])
        names = Names(lst)
        for l in lst:
            l.fScopeName = l.fLocalScopeName = None
        finder = Recorder(lst)
        self.assertEqual(finder.FindChanges([None] * len(lst), []), expected)
        self.assertIn('whole', finder.calls)
        self.assertEqual(Names(lst), names)

    def testEmptyListTakesTheWholeListPath(self):
        finder = Recorder([])
        self.assertEqual(finder.FindChanges([], []), (set(['']), set(), set()))
        self.assertIn('whole', finder.calls)

    def testIncrementalPassGetsTheRemovedIndices(self):
        lst = Read(kSource)
        CChangeFinder(lst).FindChanges(lst, [])
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 3'))
        indices = []

        class Finder(Recorder):
            def _ProcessRemovedLogicals(self, removed_list):
                indices.append(Recorder._ProcessRemovedLogicals(self, removed_list))
                return indices[-1]

        finder = Finder(lst)
        finder.calls = []
        self.assertEqual(finder.FindChanges(added, removed), (set(['A#0.f#1']), set(), set()))
        self.assertEqual([c if isinstance(c, str) else c[0] for c in finder.calls],
                         ['prepare', 'removed', 'added', 'clear'])
        self.assertIs(finder.calls[2][1], added)
        self.assertIs(finder.calls[2][2], indices[0])
        self.assertIsInstance(indices[0], list)

    def testRemovedIndicesMustBeAListOrNone(self):
        lst = Read(kSource)
        CChangeFinder(lst).FindChanges(lst, [])

        class Finder(Recorder):
            result = ()

            def _ProcessRemovedLogicals(self, removed_list):
                return self.result

            def _ProcessAddedLogicals(self, added_list, indicies_to_check):
                self.calls.append(('added', added_list, indicies_to_check))

        finder = Finder(lst)
        finder.calls = []
        self.assertRaisesMessage(TypeError, 'Expected list, got tuple',
                                 finder.FindChanges, [], [])
        self.assertEqual(finder.calls, ['prepare', 'clear'])
        self.assertIdle(finder)
        # The whole-list pass ignores that result.
        self.assertEqual(finder.FindChanges(lst, [])[1], set(['A#0']))
        finder.result = None
        finder.calls = []
        finder.FindChanges([], [])
        self.assertEqual(finder.calls, ['prepare', ('added', [], None), 'clear'])

    def testNamelessDefinitionOpensNoScope(self):
        source = 'class A:\n    def\n        x = 1\n    y = 2\n'
        lst = Read(source)
        finder = CChangeFinder(lst)
        with CapturedStderr() as err:
            self.assertEqual(finder.FindChanges(lst, []), (set(['', 'A#0']), set(['A#0']), set()))
            self.assertEqual(Names(lst), [('', 'A#0')] + [('A#0', None)] * 3)
            for new_source in [source.replace('x = 1', 'x = 2'),
                               source.replace('def', 'def f():'), source]:
                added, removed = Edit(lst, new_source)
                finder.FindChanges(added, removed)
                self.assertEqual(Names(lst), WholeListNames(new_source))
        self.assertEqual(err.getvalue(), '')

    def testIncrementalEditsMatchAFreshPass(self):
        # A class or function change makes the driver renumber to the end.
        edits = [
            kSource.replace('x = 1', 'x = 3'),
            'def f():\n    pass\n' + kSource,
            kSource.replace('    def f(self):\n        pass\n', ''),
            kSource.replace('class A:', 'class A(object):'),
            kSource.replace('def g():', 'def f():'),
            kSource + 'class A:\n    def f(self):\n        pass\n',
        ]
        for new_source in edits:
            lst = Read(kSource)
            finder = CChangeFinder(lst)
            finder.FindChanges(lst, [])
            added, removed = Edit(lst, new_source)
            finder.FindChanges(added, removed)
            self.assertEqual(Names(lst), WholeListNames(new_source), new_source)


class ResultTest(DriverTestCase):

    def testEachCallMakesNewSets(self):
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        first = finder.FindChanges(lst, [])
        saved = [set(s) for s in first]
        second = finder.FindChanges(lst, [])
        self.assertIsInstance(first, tuple)
        self.assertEqual(len(first), 3)
        for a, b, copy in zip(first, second, saved):
            self.assertIs(type(a), set)
            self.assertIsNot(a, b)
            self.assertEqual(a, copy)
        first[0].clear()
        self.assertTrue(second[0])

    def testTheFinderKeepsNoReferenceToTheSets(self):
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        contents, classes, functions = finder.FindChanges(lst, [])
        self.assertEqual(sys.getrefcount(contents), 2)
        self.assertEqual(sys.getrefcount(classes), 2)
        self.assertEqual(sys.getrefcount(functions), 2)


class GuardTest(DriverTestCase):

    def testNestedCallIsRefusedAndTheOuterCallFails(self):
        lst = Read(kSource)

        class Finder(Recorder):
            armed = True

            def _FindChangesEntireListAdded(self):
                if self.armed:
                    self.calls.append('whole')
                    self.FindChanges(lst, [])
                Recorder._FindChangesEntireListAdded(self)

        finder = Finder(lst)
        finder.calls = []
        self.assertRaisesMessage(ValueError, 'FindChanges cannot be called recursively',
                                 finder.FindChanges, lst, [])
        # The refused call neither prepared nor cleared.
        self.assertEqual(finder.calls, ['prepare', ('removed', []), 'whole', 'clear'])
        finder.armed = False
        self.assertIdle(finder)

    def testRefusedNestedCallLeavesTheOuterStateAlone(self):
        lst = Read(kSource)
        expected = CChangeFinder(lst).FindChanges(lst, [])
        refused = []

        class Finder(Recorder):
            def _ProcessRemovedLogicals(self, removed_list):
                try:
                    self.FindChanges([], [])
                except ValueError as e:
                    refused.append(str(e))
                return Recorder._ProcessRemovedLogicals(self, removed_list)

        finder = Finder(lst)
        finder.calls = []
        self.assertEqual(finder.FindChanges(lst, []), expected)
        self.assertEqual(refused, ['FindChanges cannot be called recursively'])
        self.assertEqual(finder.calls.count('prepare'), 1)
        self.assertEqual(finder.calls.count('clear'), 1)

    def testDirectPrepareBlocksUntilClear(self):
        lst = Read(kSource)
        finder = Recorder(lst)
        finder._PrepareForFind()
        finder.calls = []
        for _ in range(2):
            self.assertRaisesMessage(ValueError, 'FindChanges cannot be called recursively',
                                     finder.FindChanges, lst, [])
        self.assertEqual(finder.calls, [])
        finder._Clear()
        self.assertIdle(finder)


class ExitTest(DriverTestCase):

    def testFailureInsideAPassClears(self):
        lst = Read(kSource)
        finder = Recorder(lst)
        lst.append(5)
        finder.calls = []
        self.assertRaisesMessage(TypeError, 'Argument must be a logical',
                                 finder.FindChanges, lst, [])
        self.assertEqual(finder.calls[-1], 'clear')
        # Names written before the failure stay.
        self.assertEqual(lst[0].fLocalScopeName, 'A#0')
        lst.pop()
        self.assertIdle(finder)

    def testOverrideErrorPropagatesUnchanged(self):
        lst = Read(kSource)
        error = KeyError('step')

        class Finder(Recorder):
            def _FindChangesEntireListAdded(self):
                raise error

        finder = Finder(lst)
        finder.calls = []
        with self.assertRaises(KeyError) as cm:
            finder.FindChanges(lst, [])
        self.assertIs(cm.exception, error)
        self.assertEqual(finder.calls[-1], 'clear')
        del Finder._FindChangesEntireListAdded
        self.assertIdle(finder)

    def testClearRunsWithThePendingErrorSetAside(self):
        lst = Read(kSource)
        seen = []

        class Finder(CChangeFinder):
            def _FindChangesEntireListAdded(self):
                raise KeyError('step')

            def _Clear(self):
                # Python code that itself raises and catches must work here.
                try:
                    {}['missing']
                except KeyError:
                    seen.append(sys.exc_info()[1].args)
                CChangeFinder._Clear(self)

        finder = Finder(lst)
        del seen[:]
        with self.assertRaises(KeyError) as cm:
            finder.FindChanges(lst, [])
        self.assertEqual(cm.exception.args, ('step',))
        self.assertEqual(seen, [('missing',)])

    def testClearErrorWins(self):
        lst = Read(kSource)

        class Finder(CChangeFinder):
            armed = False
            fail_step = False

            def _FindChangesEntireListAdded(self):
                if self.fail_step:
                    raise KeyError('step')
                CChangeFinder._FindChangesEntireListAdded(self)

            def _Clear(self):
                CChangeFinder._Clear(self)
                if self.armed:
                    raise IndexError('clear')

        finder = Finder(lst)
        finder.armed = True
        # On success the result is dropped; on failure the pending error is replaced.
        self.assertRaisesMessage(IndexError, 'clear', finder.FindChanges, lst, [])
        finder.fail_step = True
        self.assertRaisesMessage(IndexError, 'clear', finder.FindChanges, lst, [])
        finder.armed = finder.fail_step = False
        self.assertIdle(finder)

    def testPrepareErrorSkipsClear(self):
        lst = Read(kSource)

        class Finder(Recorder):
            mode = None

            def _PrepareForFind(self):
                self.calls.append('prepare')
                if self.mode != 'before':
                    CChangeFinder._PrepareForFind(self)
                if self.mode:
                    raise KeyError(self.mode)

        finder = Finder(lst)
        finder.mode = 'before'
        finder.calls = []
        self.assertRaises(KeyError, finder.FindChanges, lst, [])
        self.assertEqual(finder.calls, ['prepare'])
        # Prepared, then failed: nothing clears, so the finder stays busy.
        finder.mode = 'after'
        self.assertRaises(KeyError, finder.FindChanges, lst, [])
        finder.mode = None
        self.assertRaisesMessage(ValueError, 'FindChanges cannot be called recursively',
                                 finder.FindChanges, lst, [])
        self.assertNotIn('clear', finder.calls)
        finder._Clear()
        self.assertIdle(finder)


class DestroyTest(DriverTestCase):

    def testDestroyImpl(self):
        lst = Read(kSource)
        finder = Recorder(lst)
        finder._PrepareForFind()
        finder.calls = []
        self.assertIsNone(finder._destroy_impl())
        self.assertIsNone(finder._fLogicalList)
        self.assertEqual(finder.calls, ['clear'])
        # Cleared: the call is not refused, it fails on the missing list.
        self.assertRaisesMessage(TypeError, "object of type 'NoneType' has no len()",
                                 finder.FindChanges, [], [])
        self.assertEqual(finder.calls[-1], 'clear')
        self.assertRaisesMessage(TypeError, "object of type 'NoneType' has no len()",
                                 finder.FindChanges, [], [])
        # Its methods still run.
        finder._PrepareForFind()
        finder._Clear()
        finder._destroy_impl()

    def testDestroyCallsDestroyImpl(self):
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        self.assertIsInstance(finder, CDestroyable)
        finder.destroy()
        self.assertTrue(finder.IsDestroyed())
        self.assertIsNone(finder._fLogicalList)

        destroyed = []

        class Finder(Recorder):
            def _destroy_impl(self):
                destroyed.append(self)
                Recorder._destroy_impl(self)

        finder = Finder(lst)
        finder.calls = []
        finder.destroy()
        finder.destroy()
        self.assertEqual(destroyed, [finder])
        self.assertEqual(finder.calls, ['clear'])
        self.assertIsNone(finder._fLogicalList)


if __name__ == '__main__':
    unittest.main()
