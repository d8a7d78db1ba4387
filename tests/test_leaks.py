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

# Each scenario returns (a function to repeat, the objects whose counts must stay).


def Calls(*calls):
    """One function making each call (func, args..., expected exception or None)."""
    def Run():
        for call in calls:
            try:
                call[0](*call[1:-1])
            except Exception as e:
                assert call[-1] is not None and isinstance(e, call[-1]), (call, e)
            else:
                assert call[-1] is None, (call, 'no error')
    return Run


def Prepared(cls=CChangeFinder):
    lst = Read(kSource)
    finder = cls(lst)
    finder.FindChanges(lst, [])
    return lst, finder, [lst, finder] + lst + [t for l in lst for t in l.fTokens]


def Swapping(finder, lst, i, other):
    """Puts `other` and the original logical at lst[i] by turns, finding the changes."""
    state = [lst[i], other]

    def Run():
        lst[i] = state[1]
        with CapturedStderr():
            finder.FindChanges([state[1]], [state[0]])
        state.reverse()
    return Run, state


def WholePass():
    lst, finder, watched = Prepared()
    removed = []

    def Run():
        assert map(sys.getrefcount, finder.FindChanges(lst, removed)) == [2, 2, 2]
        # Names may be replaced by equal new strings; either way none piles up.
        names = [n for l in lst for n in (l.fScopeName, l.fLocalScopeName) if n]
        assert max(map(sys.getrefcount, names)) < 20
    return Run, watched + [removed]


def IncrementalPass():
    lst, finder, watched = Prepared()
    run, more = Swapping(finder, lst, 5, Logical(['x', '=', '2'], lst[5].fLineno, lst[5].fIndent))
    return run, watched + more + [lst[4].fLocalScopeName]


def OverridesAndReportedErrors():
    def Raise(self, logical, i):
        raise KeyError('reported')

    lst, finder, watched = Prepared(type('Finder', (CChangeFinder,), {
        '_FindScopeNameContainingLogical':
            lambda self, i: CChangeFinder._FindScopeNameContainingLogical(self, i),
        '_FindScopeIndexForLogical': Raise}))
    other = Logical(['def', 'h', '(', ')', ':'], lst[1].fLineno, lst[1].fIndent, kDefKind)
    run, more = Swapping(finder, lst, 1, other)
    return run, watched + more


def ScopeRenumbering():
    lst, finder, watched = Prepared()
    extra = Read('def g():\n    pass\n')

    def Run():
        lst[0:0] = extra
        finder.FindChanges(extra, [])
        del lst[0:2]
        finder.FindChanges([], extra)
    return Run, watched + extra


def ConstructionAndCycles():
    lst, _, watched = Prepared()
    Finder = type('Finder', (CChangeFinder,), {})

    def Run():
        CChangeFinder(lst)
        finder = Finder(lst)
        finder.fSelf = finder
        cyclic = []
        cyclic.append(CChangeFinder(cyclic))
        CChangeFinder(lst).destroy()
    return Run, watched


def ErrorPaths():
    lst, finder, watched = Prepared()
    bad = Read(kSource) + [['not a logical']]
    busy, destroyed = CChangeFinder(lst), CChangeFinder(lst)
    busy._PrepareForFind()
    destroyed._destroy_impl()
    failing = type('Failing', (CChangeFinder,), {
        '_FindChangesEntireListAdded': lambda self: {}['step']})(lst)
    tup = tuple(lst)
    return Calls(
        (finder.FindChanges, tup, [], TypeError), (finder.FindChanges, lst, TypeError),
        (lambda: finder.FindChanges(lst, [], bogus=1), TypeError),
        (lambda: finder.FindChanges(lst, removed_list=[], added_list=lst), TypeError),
        (CChangeFinder, tup, TypeError),
        (lambda: CChangeFinder(bad).FindChanges(bad, []), TypeError),
        (busy.FindChanges, lst, [], ValueError), (failing.FindChanges, lst, [], KeyError),
        (destroyed.FindChanges, lst, [], TypeError),
        (finder._UpdateLogicalScopeName, lst[0], 0, 5, TypeError),
        (finder._ProcessDedentedComments, 2 ** 70, OverflowError),
    ), watched + bad + [tup, busy, failing]


def ModuleFunctions():
    lst, _, _ = Prepared()
    scope_def, plain = lst[1], lst[2]
    nameless = Logical(['def'], kind=kDefKind)
    nameless.fScopeName = 'A#0'
    d = Logical(['async', 'def', 'f', '(', ')', ':'], kind=kDefKind)
    c = Logical(['\\', 'class'], kind=kClassKind)
    stored, wrong = Logical(['x']), Logical(['def', 'f'], kind=kDefKind)
    wrong.fLocalScopeName = 5
    name, target, more, huge = 'g#2', set([1, 2]), frozenset([2, 3]), 2 ** 70

    def Fresh():
        full = GetFullNameForScopeDef(scope_def)
        assert sys.getrefcount(full) == 2
        with CapturedStderr():
            sbc.GetInfoBytesKind(None)

    return Calls(
        (Fresh, None), (GetFullNameForScopeDef, None, None),
        (GetFullNameForScopeDef, nameless, AssertionError),
        (GetFullNameForScopeDef, plain, AssertionError), (GetFullNameForScopeDef, 1, TypeError),
        (sbc.LogicalCheck, d, None), (sbc.LogicalCheck, None, None),
        (sbc.RaiseIfNotLogical, d, None), (sbc.RaiseIfNotLogical, 1, TypeError),
        (sbc.IsWhitespaceLogical, d, None), (sbc.IsScopeStartLogical, c, None),
        (sbc.GetLocalScopeDefined, d, None), (sbc.GetLocalScopeDefined, c, None),
        (sbc.SetLogicalLocalScopeDefined, stored, name, None),
        (sbc.GetLocalScopeDefined, stored, None),
        (sbc.SetLogicalLocalScopeDefined, stored, None, None),
        (sbc.GetLocalScopeDefined, wrong, TypeError),
        (sbc.SetLogicalLocalScopeDefined, 1, name, TypeError),
        (sbc.PySet_InplaceOr, target, more, None), (sbc.PySet_InplaceOr, None, more, TypeError),
        (sbc.PySet_InplaceOr, target, [4], TypeError), (sbc.PySet_InplaceOr, more, more, TypeError),
        (sbc.GetNowTime, None), (sbc.OutOfTime, 0.0, None),
        (lambda: sbc.DoubleValueForULongLongBits(sbc.ULongLongValueForDoubleBits(1.5)), None),
        (sbc.DoubleValueForPyIntBits, -1, None),
        (sbc.DoubleValueForULongLongBits, -1, OverflowError),
        (sbc.DoubleValueForPyIntBits, huge, OverflowError),
        (sbc.IsDefKind, 70, None), (sbc.IsDefKind, 128, OverflowError),
        (sbc.GetInfoBytesKind, ':x', None), (sbc.GetInfoBytesKind, 5, TypeError),
    ), ([scope_def, scope_def.fScopeName, scope_def.fLocalScopeName, nameless,
         nameless.fScopeName, plain, d, c, stored, wrong, name, target, more, huge] +
        list(d.fTokens) + list(target))


class LeakTest(unittest.TestCase):

    def assertFlat(self, func, watched, case):
        """Runs func kRepeats times; the watched counts and the GC population stay."""
        for _ in range(10):
            func()
        gc.collect()
        counts = map(sys.getrefcount, watched)
        population = len(gc.get_objects())
        for _ in range(kRepeats):
            func()
        gc.collect()
        self.assertEqual(map(sys.getrefcount, watched), counts, case)
        grown = len(gc.get_objects()) - population
        self.assertLess(grown, 10, '%s: object count grew by %d' % (case, grown))


for _case in [WholePass, IncrementalPass, OverridesAndReportedErrors, ScopeRenumbering,
              ConstructionAndCycles, ErrorPaths, ModuleFunctions]:
    setattr(LeakTest, 'test' + _case.__name__,
            lambda self, case=_case: self.assertFlat(*case(), case=case.__name__))


if __name__ == '__main__':
    unittest.main()
