"""How the module calls its overridable steps and the globals it looks up at use."""

import __builtin__
import unittest

import pysource.scopebodycache as sbc
import pysource.symbolinfo as symbolinfo
from pysource.scopebodycache import CChangeFinder

from support import CapturedStderr, Edit, ModuleGlobal, Names, Read, WholeListNames

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
kBody = kSource.replace('x = 1', 'x = 2')
kNewDef = 'def f():\n    return 0\n' + kSource

# Edits that between them make the passes use every step.
kEdits = [kBody, kNewDef, kSource.replace('class A:', 'class B:'),
          kSource.replace('# dedented comment', '  # less dedented'),
          kSource.replace('def f():\n    pass\n', ''), kSource + 'class A:\n    pass\n',
          kSource.replace('class A:', 'def f():\n    return 0\nclass A:')]


def Prepared(cls=CChangeFinder):
    lst = Read(kSource)
    finder = cls(lst)
    finder.FindChanges(lst, [])
    return lst, finder


def Subclass(**methods):
    return type('Finder', (CChangeFinder,), methods)


def StandIn(**functions):
    """Stands in for a sibling module."""
    return type('StandIn', (object,), dict((k, staticmethod(f)) for k, f in functions.items()))()


def Recording(real, calls, *names):
    """A stand-in that records the calls of `names`, then delegates to `real`."""
    wrap = lambda name, func: lambda *args: calls.append((name, args)) or func(*args)
    return StandIn(**dict((name, wrap(name, getattr(real, name))) for name in names))


class OverrideTest(unittest.TestCase):

    def testDelegatingOverridesChangeNothing(self):
        calls = []

        def Step(name):
            def Method(self, *args):
                calls.append(name)
                return getattr(CChangeFinder, name)(self, *args)
            return Method

        def Fail(self, *args):
            raise AssertionError('internal step was routed')

        # Slotted, to check that routing does not rely on an instance dict.
        Spy = Subclass(__slots__=(), _ProcessNonDedentedComment=Fail,
                       _ScanForwardForChangedScopes=Fail, _UpdateScopesSeen=Fail,
                       _UpdateScopesSeenWithStartScopeLogical=Fail,
                       **dict((name, Step(name)) for name in kSteps))
        for new_source in kEdits:
            lst, finder = Prepared(Spy)
            plain_lst, plain = Prepared()
            result = finder.FindChanges(*Edit(lst, new_source))
            self.assertEqual(result, plain.FindChanges(*Edit(plain_lst, new_source)))
            self.assertEqual(Names(lst), Names(plain_lst))
            self.assertEqual(Names(lst), WholeListNames(new_source))
        self.assertEqual(sorted(set(calls)), sorted(kSteps))

    def testOverrideResultsAndErrorsCount(self):
        lst, finder = Prepared(Subclass())
        seen = []

        def Rename(i):
            seen.append(i)
            name = CChangeFinder._FindScopeNameContainingLogical(finder, i)
            return 'Elsewhere' if name == 'A#0.f#1' else name

        def Raise(i):
            raise KeyError('override')

        # Instance attributes override too.
        finder._FindScopeNameContainingLogical = Rename
        added, removed = Edit(lst, kBody)
        self.assertIn('Elsewhere', finder.FindChanges(added, removed)[0])
        self.assertEqual(added[0].fScopeName, 'Elsewhere')
        self.assertIn(lst.index(added[0]), seen)
        finder._FindScopeNameContainingLogical = Raise
        added, removed = Edit(lst, kSource.replace('x = 1', 'x = 3'))
        with self.assertRaises(KeyError) as cm:
            finder.FindChanges(added, removed)
        self.assertEqual(cm.exception.args, ('override',))
        del finder._FindScopeNameContainingLogical, seen[:]
        self.assertEqual(finder.FindChanges(added, []), (set(['A#0.f#1']), set(), set()))
        self.assertEqual(seen, [])
        # A long result of an integer step is converted.
        lst, finder = Prepared(Subclass(_FindScopeIndexForLogical=lambda self, l, i: 7L))
        self.assertIn('f#7', finder.FindChanges(*Edit(lst, kNewDef))[2])


class NeverRaisingStepTest(unittest.TestCase):

    kContext = 'pysource.scopebodycache.CChangeFinder.'

    def testOverrideErrorsAreReported(self):
        def Raise(self, *args):
            raise KeyError('step')

        # (step, override, edit; None for a whole-list pass)
        for step, override, new_source in [('_FindScopeIndexForLogical', Raise, kNewDef),
                                           ('_FindScopeIndexForLogical', lambda *a: 'x', kNewDef),
                                           ('_ProcessDedentedComments', Raise, None)]:
            lst = Read(kSource)
            finder = Subclass(**{step: override})(lst)
            with CapturedStderr() as err:
                if new_source:
                    finder.FindChanges(lst, [])
                    # The step gave 0, so the new definition was first numbered 0.
                    self.assertIn('f#0', finder.FindChanges(*Edit(lst, new_source))[2])
                else:
                    try:
                        finder.FindChanges(lst, [])
                    except AssertionError:
                        pass  # a pass may refuse the 0 the step gave
            report = err.getvalue()
            self.assertIn(self.kContext + step, report)
            if override is Raise:
                self.assertIn('Traceback', report)
                self.assertIn("KeyError: 'step'", report)
            delattr(type(finder), step)
            self.assertEqual(finder.FindChanges(lst, [])[1], set(['A#0']))

    def testBuiltinStepsCalledDirectlyReport(self):
        lst, finder = Prepared()
        with CapturedStderr() as err:
            self.assertEqual(finder._ProcessDedentedComments(len(lst) + 10), 0)
            # Outside a find there is no scopes-seen table to consult.
            self.assertEqual(finder._FindScopeIndexForLogical(lst[0], 0), 0)
        for step in '_ProcessDedentedComments', '_FindScopeIndexForLogical':
            self.assertIn(self.kContext + step, err.getvalue())


class GlobalsLookedUpAtUseTest(unittest.TestCase):

    def testSiblingModulesAreLookedUpAtEachUse(self):
        for name, functions, first_ok in [
                ('symbolinfo', ['LeafScopeNameHasIndex'], lambda arg, lst: type(arg) is str),
                ('_fastaccess', ['IndexForLineno', 'FindIndexOfLogical'],
                 lambda arg, lst: arg is lst)]:
            calls = []
            with ModuleGlobal(sbc, name, Recording(getattr(sbc, name), calls, *functions)):
                lst, finder = Prepared()
                for new_source in kEdits[:3]:
                    finder.FindChanges(*Edit(lst, new_source))
                    self.assertEqual(Names(lst), WholeListNames(new_source), name)
            self.assertEqual(set(f for f, _ in calls), set(functions), name)
            self.assertTrue(all(first_ok(args[0], lst) for _, args in calls), name)

    def testSymbolinfoResultChangesTheSteps(self):
        lst, finder = Prepared()
        finder._PrepareForFind()
        try:
            expected = finder._GetLeafScopeWithIndex(lst[3], 3)
            inverted = lambda name: not symbolinfo.LeafScopeNameHasIndex(name)
            with ModuleGlobal(sbc, 'symbolinfo', StandIn(LeafScopeNameHasIndex=inverted)):
                self.assertNotEqual(finder._GetLeafScopeWithIndex(lst[3], 3), expected)
        finally:
            finder._Clear()

    def testMissingModuleGlobals(self):
        for name in 'symbolinfo', '_fastaccess':
            lst, finder = Prepared()
            added, removed = Edit(lst, kNewDef)
            with ModuleGlobal(sbc, name), CapturedStderr():
                with self.assertRaises(NameError) as cm:
                    finder.FindChanges(added, removed)
                self.assertEqual(str(cm.exception), "name '%s' is not defined" % name)
            finder.FindChanges(added, removed)
            self.assertEqual(Names(lst), WholeListNames(kNewDef), name)
        # The builtins are searched after the module's namespace.
        calls = []
        with ModuleGlobal(sbc, 'symbolinfo'):
            __builtin__.symbolinfo = Recording(symbolinfo, calls, 'LeafScopeNameHasIndex')
            try:
                Prepared()
            finally:
                del __builtin__.symbolinfo
        self.assertTrue(calls)

    def testGetFullNameForScopeDef(self):
        seen = []

        def FullName(scope_def):
            seen.append(scope_def)
            return 'Renamed'

        lst, finder = Prepared()
        added, removed = Edit(lst, kBody)
        with ModuleGlobal(sbc, 'GetFullNameForScopeDef', FullName):
            finder.FindChanges(added, removed)
        self.assertIn(lst[6], seen)
        self.assertEqual(added[0].fScopeName, 'Renamed')


if __name__ == '__main__':
    unittest.main()
