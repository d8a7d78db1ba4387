"""Argument passing of the module's functions and methods: counts, keywords, types."""

import unittest

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder

from support import Logical, OtherText, Outcome, Read, Text, kDefKind, kOtherTextName


class MyList(list):
    pass


def TypeMessage(param, expected, got):
    return "Argument '%s' has incorrect type (expected %s, got %s)" % (param, expected, got)


class ArgumentTest(unittest.TestCase):

    def setUp(self):
        self.lst = Read('def f():\n    pass\n')
        self.finder = CChangeFinder(self.lst)
        self.finder.FindChanges(self.lst, [])
        self.logical = self.lst[0]

    def testRefusedArguments(self):
        f, l = self.finder, self.logical
        # (function, args, kwargs, exception, message or None)
        # One case per message form.
        cases = [
            (f.FindChanges, ([], [], []), {}, TypeError,
             'FindChanges() takes exactly 2 positional arguments (3 given)'),
            (f.FindChanges, (), {'added_list': []}, TypeError,
             'FindChanges() takes exactly 2 positional arguments (1 given)'),
            (CChangeFinder, ([], []), {}, TypeError,
             '__init__() takes exactly 1 positional argument (2 given)'),
            (f._LogicalInScopeChanged, (l,), {}, TypeError,
             '_LogicalInScopeChanged() takes at least 2 positional arguments (1 given)'),
            (f._LogicalInScopeChanged, (l, '', None, None, None), {}, TypeError,
             '_LogicalInScopeChanged() takes at most 4 positional arguments (5 given)'),
            (sbc.GetNowTime, (1,), {}, TypeError, 'GetNowTime() takes no arguments (1 given)'),
            (sbc.GetFullNameForScopeDef, (), {}, TypeError,
             'GetFullNameForScopeDef() takes exactly one argument (0 given)'),
            (f._ProcessDedentedComments, (), {'first_comment_i': 0}, TypeError,
             '_ProcessDedentedComments() takes no keyword arguments'),
            (CChangeFinder, ([],), {'logicals': []}, TypeError,
             "__init__() got an unexpected keyword argument 'logicals'"),
            (f.FindChanges, ([], []), {1: 2}, TypeError, Text('%(function)s() keywords must be strings', function='FindChanges')),
            (sbc.SetLogicalLocalScopeDefined, (l,), {'name': 'x', 'logical': l}, TypeError,
             "SetLogicalLocalScopeDefined() got multiple values for keyword argument 'logical'"),
            # Typed parameters take the exact type, checked in parameter order.
            (f.FindChanges, (MyList(self.lst), ()), {}, TypeError, TypeMessage('added_list', 'list', 'MyList')),
            (f._UpdateContainingScope, (l, 0, OtherText('')), {}, TypeError,
             TypeMessage('scope_name', 'str', kOtherTextName)),
            # The constructor checks its list after parsing.
            (CChangeFinder, (MyList(),), {}, TypeError, 'Expected list, got MyList'),
            (f._ProcessDedentedComments, (1.5,), {}, TypeError, None),
            (f._FindScopeIndexForLogical, (l, -2 ** 70), {}, OverflowError, None),
            # None passes the type check and fails where it is used.
            (f.FindChanges, (None, []), {}, TypeError, "object of type 'NoneType' has no len()"),
        ]
        for func, args, kwargs, exc, message in cases:
            got = Outcome(lambda: func(*args, **kwargs))
            self.assertEqual(got if message else got[0], (exc, message) if message else exc,
                             (func.__name__, args, kwargs))
        # Nothing ran: the finder is idle and the logical unchanged.
        self.assertEqual(self.logical.fLocalScopeName, 'f#0')
        self.assertEqual(self.logical.fScopeName, '')
        self.assertIs(f._fLogicalList, self.lst)
        self.assertEqual(f.FindChanges([], []), (set(), set(), set()))

    def testParametersByKeyword(self):
        lst = Read('class A:\n    pass\n')
        finder = CChangeFinder(logical_list=lst)
        self.assertEqual(finder.FindChanges(removed_list=[], added_list=lst)[1], set(['A#0']))
        self.assertEqual(finder.FindChanges(lst, removed_list=[])[1], set(['A#0']))
        l, s = Logical(['def', 'g'], kind=kDefKind), set([1])
        sbc.SetLogicalLocalScopeDefined(name='g#4', logical=l)
        self.assertEqual((l.fLocalScopeName, sbc.PySet_InplaceOr(to_add=set([2]), set_obj=s)), ('g#4', True))
        finder._PrepareForFind()
        finder._LogicalInScopeChanged(scope_name='', logical=lst[1], old_containing_scope=None, old_leaf_scope=None)
        finder._Clear()

    def testArgumentErrorsComeBeforeTheGuardAndAnyStep(self):
        calls = []
        finder = type('Finder', (CChangeFinder,), {'_PrepareForFind': lambda s: calls.append(s)})(self.lst)
        self.assertRaises(TypeError, finder.FindChanges, [], [], bogus=1)
        self.assertEqual(calls, [])
        CChangeFinder._PrepareForFind(finder)
        # Busy, the finder refuses a call only once its arguments are right.
        self.assertEqual([Outcome(finder.FindChanges, *args)[0] for args in [((), []), ([],), ([], [])]],
                         [TypeError, TypeError, ValueError])


if __name__ == '__main__':
    unittest.main()
