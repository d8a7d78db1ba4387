"""Reference leaks: repeated calls keep reference counts and the object count flat."""

import gc
import sys
import unittest

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, GetFullNameForScopeDef

from support import CapturedStderr, Logical, Read, SANITIZED, kClassKind, kDefKind

kRepeats = 40 if SANITIZED else 300

kSource = '''\
class A:
    def f(self):
        pass
# comment
    def f(self):
        x = 1
def g():
    return 2
'''


def Raises(exc, func, *args, **kwargs):
    try:
        func(*args, **kwargs)
    except exc:
        return
    raise AssertionError('%s not raised by %r' % (exc.__name__, func))


class LeakTestCase(unittest.TestCase):

    def assertFlat(self, func, *watched):
        """Runs func kRepeats times; watched objects' counts and the GC population stay."""
        for _ in range(10):
            func()
        gc.collect()
        counts = [sys.getrefcount(o) for o in watched]
        population = len(gc.get_objects())
        for _ in range(kRepeats):
            func()
        gc.collect()
        self.assertEqual([sys.getrefcount(o) for o in watched], counts)
        grown = len(gc.get_objects()) - population
        self.assertLess(grown, 10, 'object count grew by %d' % grown)

    def Logicals(self, lst):
        """The logicals and the name objects they hold, to watch."""
        objs = list(lst)
        for l in lst:
            objs.extend(t for t in l.fTokens)
        return objs


class FinderLeakTest(LeakTestCase):

    def testWholeListPass(self):
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        removed = []

        def Run():
            contents, classes, functions = finder.FindChanges(lst, removed)
            assert sys.getrefcount(contents) == 2

        self.assertFlat(Run, lst, removed, finder, *self.Logicals(lst))
        # Names may be replaced by equal new strings; either way none piles up.
        for l in lst:
            for name in l.fScopeName, l.fLocalScopeName:
                if name:
                    self.assertLess(sys.getrefcount(name), 20, name)

    def testIncrementalPass(self):
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        finder.FindChanges(lst, [])
        # Two versions of one body line, swapped in and out.
        one = lst[5]
        two = Logical(['x', '=', '2'], one.fLineno, one.fIndent, 0)
        state = [one, two]

        def Run():
            old, new = state
            lst[5] = new
            finder.FindChanges([new], [old])
            state.reverse()

        self.assertFlat(Run, lst, finder, one, two, lst[4], lst[4].fLocalScopeName)

    def testScopeRenumbering(self):
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        finder.FindChanges(lst, [])
        extra = Read('def g():\n    pass\n')

        def Run():
            lst[0:0] = extra
            finder.FindChanges(extra, [])
            del lst[0:2]
            finder.FindChanges([], extra)

        self.assertFlat(Run, lst, finder, *(extra + self.Logicals(lst)))

    def testConstructionAndCycles(self):
        lst = Read(kSource)

        class Finder(CChangeFinder):
            pass

        def Run():
            CChangeFinder(lst)
            finder = Finder(lst)
            finder.fSelf = finder
            cyclic = []
            cyclic.append(CChangeFinder(cyclic))
            destroyed = CChangeFinder(lst)
            destroyed.destroy()

        self.assertFlat(Run, lst, *lst)

    def testErrorPaths(self):
        lst = Read(kSource)
        bad = Read(kSource) + [['not a logical']]
        finder = CChangeFinder(lst)
        busy = CChangeFinder(lst)
        busy._PrepareForFind()

        class Failing(CChangeFinder):
            def _FindChangesEntireListAdded(self):
                raise KeyError('step')

        failing = Failing(lst)
        destroyed = CChangeFinder(lst)
        destroyed._destroy_impl()
        tup = tuple(lst)

        def Run():
            Raises(TypeError, finder.FindChanges, tup, [])
            Raises(TypeError, finder.FindChanges, lst, [], bogus=1)
            Raises(TypeError, finder.FindChanges, lst, removed_list=[], added_list=lst)
            Raises(TypeError, finder.FindChanges, lst)
            Raises(TypeError, CChangeFinder, tup)
            Raises(TypeError, CChangeFinder(bad).FindChanges, bad, [])
            Raises(ValueError, busy.FindChanges, lst, [])
            Raises(KeyError, failing.FindChanges, lst, [])
            Raises(TypeError, destroyed.FindChanges, lst, [])
            Raises(TypeError, finder._UpdateLogicalScopeName, lst[0], 0, 5)
            Raises(OverflowError, finder._ProcessDedentedComments, 2 ** 70)

        self.assertFlat(Run, lst, tup, finder, busy, failing, *(bad + self.Logicals(lst)))

    def testOverridesAndReportedErrors(self):
        lst = Read(kSource)

        class Finder(CChangeFinder):
            def _FindScopeNameContainingLogical(self, i):
                return CChangeFinder._FindScopeNameContainingLogical(self, i)

            def _FindScopeIndexForLogical(self, logical, i):
                raise KeyError('reported')

        finder = Finder(lst)
        finder.FindChanges(lst, [])
        line = lst[1]
        other = Logical(['def', 'h', '(', ')', ':'], line.fLineno, line.fIndent, kDefKind)
        state = [line, other]

        def Run():
            old, new = state
            lst[1] = new
            with CapturedStderr():
                finder.FindChanges([new], [old])
            state.reverse()

        self.assertFlat(Run, lst, finder, line, other, *lst)


class FunctionLeakTest(LeakTestCase):

    def testFullName(self):
        lst = Read(kSource)
        CChangeFinder(lst).FindChanges(lst, [])
        scope_def = lst[1]
        nameless = Logical(['def'], kind=kDefKind)
        nameless.fScopeName = 'A#0'
        plain = lst[2]

        def Run():
            name = GetFullNameForScopeDef(scope_def)
            assert sys.getrefcount(name) == 2
            GetFullNameForScopeDef(None)
            Raises(AssertionError, GetFullNameForScopeDef, nameless)
            Raises(AssertionError, GetFullNameForScopeDef, plain)
            Raises(TypeError, GetFullNameForScopeDef, 1)

        self.assertFlat(Run, scope_def, scope_def.fScopeName, scope_def.fLocalScopeName,
                        nameless, nameless.fScopeName, plain)

    def testLogicalAccessors(self):
        d = Logical(['async', 'def', 'f', '(', ')', ':'], kind=kDefKind)
        c = Logical(['\\', 'class'], kind=kClassKind)
        stored = Logical(['x'], kind=0)
        wrong = Logical(['def', 'f'], kind=kDefKind)
        wrong.fLocalScopeName = 5
        name = 'g#2'

        def Run():
            sbc.LogicalCheck(d)
            sbc.LogicalCheck(None)
            sbc.RaiseIfNotLogical(d)
            Raises(TypeError, sbc.RaiseIfNotLogical, 1)
            sbc.IsWhitespaceLogical(d)
            sbc.IsScopeStartLogical(c)
            sbc.GetLocalScopeDefined(d)
            sbc.GetLocalScopeDefined(c)
            sbc.SetLogicalLocalScopeDefined(stored, name)
            sbc.GetLocalScopeDefined(stored)
            sbc.SetLogicalLocalScopeDefined(stored, None)
            Raises(TypeError, sbc.GetLocalScopeDefined, wrong)
            Raises(TypeError, sbc.SetLogicalLocalScopeDefined, 1, name)

        self.assertFlat(Run, d, c, stored, wrong, name, d.fTokens[2], *d.fTokens)

    def testSetAndNumberUtilities(self):
        target = set([1, 2])
        more = frozenset([2, 3])
        huge = 2 ** 70

        def Run():
            sbc.PySet_InplaceOr(target, more)
            Raises(TypeError, sbc.PySet_InplaceOr, None, more)
            Raises(TypeError, sbc.PySet_InplaceOr, target, [4])
            Raises(TypeError, sbc.PySet_InplaceOr, more, more)
            sbc.GetNowTime()
            sbc.OutOfTime(0.0)
            bits = sbc.ULongLongValueForDoubleBits(1.5)
            sbc.DoubleValueForULongLongBits(bits)
            sbc.DoubleValueForPyIntBits(-1)
            Raises(OverflowError, sbc.DoubleValueForULongLongBits, -1)
            Raises(OverflowError, sbc.DoubleValueForPyIntBits, huge)
            sbc.IsDefKind(70)
            Raises(OverflowError, sbc.IsDefKind, 128)
            sbc.GetInfoBytesKind(':x')
            Raises(TypeError, sbc.GetInfoBytesKind, 5)
            with CapturedStderr():
                sbc.GetInfoBytesKind(None)

        self.assertFlat(Run, target, more, huge, *target)


if __name__ == '__main__':
    unittest.main()
