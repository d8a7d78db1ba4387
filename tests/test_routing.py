"""How the module calls its overridable steps and the globals it looks up at use."""

import re
import unittest

import pysource.scopebodycache as sbc
import pysource.symbolinfo as symbolinfo
from pysource.scopebodycache import CChangeFinder

from support import OPTIMIZED, CapturedStderr, Edit, ModuleGlobal, Names, Read, WholeListNames

kSteps = sorted(n for n in vars(CChangeFinder) if re.match('_?[A-Z]', n))
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
kContext = 'pysource.scopebodycache.CChangeFinder.'


def Prepared(cls=CChangeFinder):
    lst = Read(kSource)
    finder = cls(lst)
    finder.FindChanges(lst, [])
    return lst, finder


def Subclass(**methods):
    return type('Finder', (CChangeFinder,), methods)


def Recording(real, calls, *names):
    """Stands in for a sibling module: records the calls of `names`, then delegates to `real`."""
    wrap = lambda name, func: staticmethod(lambda *args: calls.append((name, args)) or func(*args))  # noqa: E731
    return type('StandIn', (object,), dict((name, wrap(name, getattr(real, name))) for name in names))()


class OverrideTest(unittest.TestCase):

    def testDelegatingOverridesChangeNothing(self):
        calls = []

        def Step(name):
            return lambda self, *args: calls.append(name) or getattr(CChangeFinder, name)(self, *args)

        def Fail(self, *args):
            raise AssertionError('internal step was routed')

        # Slotted, to check that routing does not rely on an instance dict.
        Spy = Subclass(__slots__=(), _ProcessNonDedentedComment=Fail, _ScanForwardForChangedScopes=Fail,
                       _UpdateScopesSeen=Fail, _UpdateScopesSeenWithStartScopeLogical=Fail,
                       **dict((name, Step(name)) for name in kSteps))
        for new_source in kEdits:
            (lst, finder), (plain_lst, plain) = Prepared(Spy), Prepared()
            result = finder.FindChanges(*Edit(lst, new_source))
            self.assertEqual(result, plain.FindChanges(*Edit(plain_lst, new_source)))
            self.assertEqual(Names(lst), Names(plain_lst))
            self.assertEqual(Names(lst), WholeListNames(new_source))
        self.assertEqual(sorted(set(calls)), kSteps)

    def testOverrideResultsCount(self):
        lst, finder = Prepared(Subclass())
        seen = []

        def Rename(i):
            seen.append(i)
            name = CChangeFinder._FindScopeNameContainingLogical(finder, i)
            return 'Elsewhere' if name == 'A#0.f#1' else name

        # Instance attributes override too.
        finder._FindScopeNameContainingLogical = Rename
        added, removed = Edit(lst, kBody)
        self.assertIn('Elsewhere', finder.FindChanges(added, removed)[0])
        self.assertEqual(added[0].fScopeName, 'Elsewhere')
        self.assertIn(lst.index(added[0]), seen)
        del finder._FindScopeNameContainingLogical, seen[:]
        added = Edit(lst, kSource.replace('x = 1', 'x = 3'))[0]
        self.assertEqual((finder.FindChanges(added, []), seen), ((set(['A#0.f#1']), set(), set()), []))
        # A long result of an integer step is converted.
        lst, finder = Prepared(Subclass(_FindScopeIndexForLogical=lambda self, l, i: 2 ** 64 // 2 ** 61 - 1))
        self.assertIn('f#7', finder.FindChanges(*Edit(lst, kNewDef))[2])


class NeverRaisingStepTest(unittest.TestCase):

    def testBadResultsAndDirectCallsAreReported(self):
        with CapturedStderr() as err:
            lst, finder = Prepared(Subclass(_FindScopeIndexForLogical=lambda *args: 'x'))
            finder.FindChanges(*Edit(lst, kNewDef))
        # Reported, and counted as index 0.
        self.assertIn(kContext + '_FindScopeIndexForLogical', err.getvalue())
        self.assertEqual(lst[0].fLocalScopeName, 'f#0')
        lst, finder = Prepared()
        with CapturedStderr() as err:
            # Optimised, nothing checks the index: the scan past the end finds
            # no following logical, and the run ends at the end of the list.
            self.assertEqual(finder._ProcessDedentedComments(len(lst) + 10), len(lst) if OPTIMIZED else 0)
            # Outside a find there is no scopes-seen table to consult.
            self.assertEqual(finder._FindScopeIndexForLogical(lst[0], 0), 0)
            # Asked below the end of the table: refused, or, optimised, counted from the whole table.
            finder._PrepareForFind()
            finder._FindScopeIndexForLogical(lst[8], 8)
            self.assertEqual(finder._FindScopeIndexForLogical(lst[0], 0), 1 if OPTIMIZED else 0)
            finder._Clear()
        for step in ['_FindScopeIndexForLogical'] + ['_ProcessDedentedComments'] * (not OPTIMIZED):
            self.assertIn(kContext + step, err.getvalue())
        self.assertEqual(err.getvalue().count(kContext + '_FindScopeIndexForLogical'), 1 + (not OPTIMIZED))


class GlobalsLookedUpAtUseTest(unittest.TestCase):

    def testSiblingModulesAreLookedUpAtEachUse(self):
        for name, functions, first_ok in [
                ('symbolinfo', ['LeafScopeNameHasIndex'], lambda arg, lst: type(arg) is str),
                ('_fastaccess', ['IndexForLineno', 'FindIndexOfLogical'], lambda arg, lst: arg is lst)]:
            calls = []
            with ModuleGlobal(sbc, name, Recording(getattr(sbc, name), calls, *functions)):
                lst, finder = Prepared()
                for new_source in kEdits[:3]:
                    finder.FindChanges(*Edit(lst, new_source))
                    self.assertEqual(Names(lst), WholeListNames(new_source), name)
            self.assertEqual(set(f for f, _ in calls), set(functions), name)
            self.assertTrue(all(first_ok(args[0], lst) for _, args in calls), name)
        # Their results count.
        lst, finder = Prepared()
        finder._PrepareForFind()
        expected = finder._GetLeafScopeWithIndex(lst[3], 3)
        inverted = type('StandIn', (object,), {'LeafScopeNameHasIndex': staticmethod(
            lambda name: not symbolinfo.LeafScopeNameHasIndex(name))})
        with ModuleGlobal(sbc, 'symbolinfo', inverted):
            self.assertNotEqual(finder._GetLeafScopeWithIndex(lst[3], 3), expected)
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
        builtins = sbc.__builtins__
        with ModuleGlobal(sbc, 'symbolinfo'):
            builtins.symbolinfo = Recording(symbolinfo, calls, 'LeafScopeNameHasIndex')
            try:
                Prepared()
            finally:
                del builtins.symbolinfo
        self.assertTrue(calls)

    def testGetFullNameForScopeDef(self):
        seen = []
        lst, finder = Prepared()
        added, removed = Edit(lst, kBody)
        with ModuleGlobal(sbc, 'GetFullNameForScopeDef', lambda scope_def: seen.append(scope_def) or 'Renamed'):
            finder.FindChanges(added, removed)
        self.assertIn(lst[6], seen)
        self.assertEqual(added[0].fScopeName, 'Renamed')


if __name__ == '__main__':
    unittest.main()
