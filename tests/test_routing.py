"""How the module calls its overridable steps and the globals it looks up at use."""

import __builtin__
import unittest

import pysource.scopebodycache as sbc
import pysource.symbolinfo as symbolinfo
from pysource.scopebodycache import CChangeFinder

from support import (CapturedStderr, Edit, ModuleGlobal, Names, Read, RemovedModuleGlobal,
                     WholeListNames)

kSteps = ['_Clear', '_PrepareForFind', 'FindChanges', '_FindChangesEntireListAdded',
          '_GetLeafScopeWithIndex', '_ProcessRemovedLogicals', '_ProcessAddedLogicals',
          '_ProcessDedentedComments', '_LogicalInScopeChanged', '_SetLogicalScopeNames',
          '_UpdateLogicalScopeName', '_UpdateContainingScope',
          '_PropagateScopeIndexChangeForward', '_FindScopeIndexForLogical',
          '_FindScopeNameContainingLogical']

kSource = '''\
def f():
    pass
class A:
    def f(self):
        pass
# dedented comment
    def f(self):
        x = 1
def f():
    y = 1
'''

# Edits that between them make the passes use every step.
kEdits = [
    kSource.replace('x = 1', 'x = 2'),
    'def f():\n    return 0\n' + kSource,
    kSource.replace('class A:', 'class B:'),
    kSource.replace('# dedented comment', '  # less dedented'),
    kSource.replace('def f():\n    pass\n', ''),
    kSource + 'class A:\n    pass\n',
    kSource.replace('class A:', 'def f():\n    return 0\nclass A:'),
]


def MakeSpy(calls):
    """A subclass whose every step records its name and runs the built-in one."""
    def Step(name):
        def Method(self, *args):
            calls.append(name)
            return getattr(CChangeFinder, name)(self, *args)
        return Method
    return type('Spy', (CChangeFinder,), dict((name, Step(name)) for name in kSteps))


def Prepared(source=kSource, cls=CChangeFinder):
    lst = Read(source)
    finder = cls(lst)
    finder.FindChanges(lst, [])
    return lst, finder


class Recorder(object):
    """Stands in for a sibling module: records calls, then delegates."""

    def __init__(self, real, *names):
        self.calls = []
        for name in names:
            setattr(self, name, self.Wrap(name, getattr(real, name)))

    def Wrap(self, name, func):
        def Call(*args):
            self.calls.append((name, args))
            return func(*args)
        return Call


class OverrideTest(unittest.TestCase):

    def testDelegatingOverridesChangeNothing(self):
        calls = []
        Spy = MakeSpy(calls)
        for new_source in kEdits:
            lst, finder = Prepared(cls=Spy)
            plain_lst, plain = Prepared()
            added, removed = Edit(lst, new_source)
            plain_added, plain_removed = Edit(plain_lst, new_source)
            self.assertEqual(finder.FindChanges(added, removed),
                             plain.FindChanges(plain_added, plain_removed))
            self.assertEqual(Names(lst), Names(plain_lst))
        # Every visible step is reached through its name.
        self.assertEqual(sorted(set(calls)), sorted(kSteps))

    def testSlottedSubclassIsRoutedToo(self):
        calls = []

        class Finder(CChangeFinder):
            __slots__ = ()

            def _FindChangesEntireListAdded(self):
                calls.append('whole')
                CChangeFinder._FindChangesEntireListAdded(self)

        Prepared(cls=Finder)
        self.assertEqual(calls, ['whole'])

    def testInstanceAttributeOverrides(self):
        class Finder(CChangeFinder):
            pass

        lst, finder = Prepared(cls=Finder)
        seen = []

        def FindScopeName(i):
            seen.append(i)
            return CChangeFinder._FindScopeNameContainingLogical(finder, i)

        finder._FindScopeNameContainingLogical = FindScopeName
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 2'))
        finder.FindChanges(added, removed)
        self.assertIn(lst.index(added[0]), seen)
        del finder._FindScopeNameContainingLogical
        del seen[:]
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 3'))
        finder.FindChanges(added, removed)
        self.assertEqual(seen, [])

    def testOverrideResultIsUsed(self):
        class Finder(CChangeFinder):
            def _FindScopeNameContainingLogical(self, i):
                name = CChangeFinder._FindScopeNameContainingLogical(self, i)
                return 'Elsewhere' if name == 'A#0.f#1' else name

        lst, finder = Prepared(cls=Finder)
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 2'))
        contents = finder.FindChanges(added, removed)[0]
        self.assertEqual(added[0].fScopeName, 'Elsewhere')
        self.assertIn('Elsewhere', contents)

    def testIntegerResultOfAnOverrideIsConverted(self):
        class Finder(CChangeFinder):
            def _FindScopeIndexForLogical(self, logical, i):
                return 7L

        lst, finder = Prepared(cls=Finder)
        new_source = 'def f():\n    return 0\n' + kSource
        added, removed = Edit(lst, new_source)
        self.assertIn('f#7', finder.FindChanges(added, removed)[2])

    def testStepsHiddenFromPythonCannotBeOverridden(self):
        class Finder(CChangeFinder):
            def Fail(self, *args):
                raise AssertionError('internal step was routed')

            _ProcessNonDedentedComment = _ScanForwardForChangedScopes = Fail
            _UpdateScopesSeen = _UpdateScopesSeenWithStartScopeLogical = Fail

        for new_source in kEdits:
            lst, finder = Prepared(cls=Finder)
            added, removed = Edit(lst, new_source)
            finder.FindChanges(added, removed)
            self.assertEqual(Names(lst), WholeListNames(new_source))

    def testRaisingOverridePropagates(self):
        class Finder(CChangeFinder):
            armed = False

            def _FindScopeNameContainingLogical(self, i):
                if self.armed:
                    raise KeyError('override')
                return CChangeFinder._FindScopeNameContainingLogical(self, i)

        lst, finder = Prepared(cls=Finder)
        finder.armed = True
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 2'))
        with self.assertRaises(KeyError) as cm:
            finder.FindChanges(added, removed)
        self.assertEqual(cm.exception.args, ('override',))
        finder.armed = False
        self.assertEqual(finder.FindChanges(added, []), (set(['A#0.f#1']), set(), set()))


class NeverRaisingStepTest(unittest.TestCase):

    kContext = 'pysource.scopebodycache.CChangeFinder.'

    def testScopeIndexOverrideErrorIsReported(self):
        class Finder(CChangeFinder):
            def _FindScopeIndexForLogical(self, logical, i):
                raise KeyError('index step')

        lst, finder = Prepared(cls=Finder)
        new_source = 'def f():\n    return 0\n' + kSource
        added, removed = Edit(lst, new_source)
        with CapturedStderr() as err:
            result = finder.FindChanges(added, removed)
        report = err.getvalue()
        self.assertIn(self.kContext + '_FindScopeIndexForLogical', report)
        self.assertIn('Traceback', report)
        self.assertIn("KeyError: 'index step'", report)
        # The step gave 0, so the new definition was first numbered 0.
        self.assertIn('f#0', result[2])

    def testDedentedCommentOverrideErrorIsReported(self):
        class Finder(CChangeFinder):
            def _ProcessDedentedComments(self, first_comment_i):
                raise KeyError('comment step')

        lst = Read(kSource)
        finder = Finder(lst)
        with CapturedStderr() as err:
            try:
                finder.FindChanges(lst, [])
            except AssertionError:
                pass  # a pass may refuse the index 0 the step gave
        report = err.getvalue()
        self.assertIn(self.kContext + '_ProcessDedentedComments', report)
        self.assertIn("KeyError: 'comment step'", report)
        del Finder._ProcessDedentedComments
        self.assertEqual(finder.FindChanges(lst, [])[1], set(['A#0']))

    def testNonIntegerOverrideResultIsReported(self):
        class Finder(CChangeFinder):
            def _FindScopeIndexForLogical(self, logical, i):
                return 'three'

        lst, finder = Prepared(cls=Finder)
        added, removed = Edit(lst, 'def f():\n    return 0\n' + kSource)
        with CapturedStderr() as err:
            result = finder.FindChanges(added, removed)
        self.assertIn(self.kContext + '_FindScopeIndexForLogical', err.getvalue())
        self.assertIn('f#0', result[2])

    def testBuiltinStepsCalledDirectlyReport(self):
        lst, finder = Prepared()
        with CapturedStderr() as err:
            self.assertEqual(finder._ProcessDedentedComments(len(lst) + 10), 0)
            # Outside a find there is no scopes-seen table to consult.
            self.assertEqual(finder._FindScopeIndexForLogical(lst[0], 0), 0)
        report = err.getvalue()
        self.assertIn(self.kContext + '_ProcessDedentedComments', report)
        self.assertIn(self.kContext + '_FindScopeIndexForLogical', report)


class GlobalsLookedUpAtUseTest(unittest.TestCase):

    def testSymbolinfo(self):
        stand_in = Recorder(symbolinfo, 'LeafScopeNameHasIndex')
        with ModuleGlobal(sbc, 'symbolinfo', stand_in):
            lst, finder = Prepared()
            for new_source in kEdits[1:3]:
                added, removed = Edit(lst, new_source)
                finder.FindChanges(added, removed)
                self.assertEqual(Names(lst), WholeListNames(new_source))
        self.assertIs(sbc.symbolinfo, symbolinfo)
        self.assertTrue(stand_in.calls)
        self.assertTrue(all(isinstance(args[0], str) for _, args in stand_in.calls))

    def testSymbolinfoResultChangesTheSteps(self):
        lst, finder = Prepared()
        finder._PrepareForFind()
        try:
            expected = finder._GetLeafScopeWithIndex(lst[3], 3)
            answers = []

            class Never(object):
                def LeafScopeNameHasIndex(self, name):
                    answers.append(name)
                    return not symbolinfo.LeafScopeNameHasIndex(name)

            with ModuleGlobal(sbc, 'symbolinfo', Never()):
                changed = finder._GetLeafScopeWithIndex(lst[3], 3)
        finally:
            finder._Clear()
        self.assertTrue(answers)
        self.assertNotEqual(changed, expected)

    def testSymbolinfoFromBuiltinsThenNameError(self):
        stand_in = Recorder(symbolinfo, 'LeafScopeNameHasIndex')
        with RemovedModuleGlobal(sbc, 'symbolinfo'):
            __builtin__.symbolinfo = stand_in
            try:
                lst, finder = Prepared()
            finally:
                del __builtin__.symbolinfo
            self.assertTrue(stand_in.calls)
            with self.assertRaises(NameError) as cm:
                Prepared()
            self.assertEqual(str(cm.exception), "name 'symbolinfo' is not defined")

    def testFastaccess(self):
        stand_in = Recorder(sbc._fastaccess, 'IndexForLineno', 'FindIndexOfLogical')
        lst, finder = Prepared()
        with ModuleGlobal(sbc, '_fastaccess', stand_in):
            for new_source in kEdits[:3]:
                added, removed = Edit(lst, new_source)
                finder.FindChanges(added, removed)
                self.assertEqual(Names(lst), WholeListNames(new_source))
        names = set(name for name, _ in stand_in.calls)
        self.assertEqual(names, set(['IndexForLineno', 'FindIndexOfLogical']))
        for name, args in stand_in.calls:
            self.assertIs(args[0], lst)

    def testFastaccessMissing(self):
        lst, finder = Prepared()
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 2'))
        with RemovedModuleGlobal(sbc, '_fastaccess'):
            with self.assertRaises(NameError) as cm:
                finder.FindChanges(added, removed)
        self.assertEqual(str(cm.exception), "name '_fastaccess' is not defined")
        self.assertEqual(finder.FindChanges(added, removed)[0], set(['A#0.f#1']))

    def testGetFullNameForScopeDef(self):
        seen = []

        def FullName(scope_def):
            seen.append(scope_def)
            return 'Renamed'

        lst, finder = Prepared()
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 2'))
        with ModuleGlobal(sbc, 'GetFullNameForScopeDef', FullName):
            finder.FindChanges(added, removed)
        self.assertIn(lst[6], seen)
        self.assertEqual(added[0].fScopeName, 'Renamed')
        self.assertIsNot(sbc.GetFullNameForScopeDef, FullName)


if __name__ == '__main__':
    unittest.main()
