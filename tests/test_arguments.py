"""Argument passing of the module's functions and methods: counts, keywords, types."""

import unittest

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder

from support import Logical, Read, kDefKind


class MyList(list):
    pass


class ArgumentTestCase(unittest.TestCase):

    def setUp(self):
        self.lst = Read('def f():\n    pass\n')
        self.finder = CChangeFinder(self.lst)
        self.finder.FindChanges(self.lst, [])
        self.logical = self.lst[0]

    def assertTypeError(self, message, func, *args, **kwargs):
        with self.assertRaises(TypeError) as cm:
            func(*args, **kwargs)
        self.assertEqual(str(cm.exception), message)


class CountTest(ArgumentTestCase):

    def testFixedCount(self):
        f = self.finder
        for args, given in [((), 0), (([],), 1), (([], [], []), 3)]:
            self.assertTypeError(
                'FindChanges() takes exactly 2 positional arguments (%d given)' % given,
                f.FindChanges, *args)
        self.assertTypeError(
            '_PropagateScopeIndexChangeForward() takes exactly 4 positional arguments (5 given)',
            f._PropagateScopeIndexChangeForward, 'a', 'b', 0, 1, 2)
        self.assertTypeError('PySet_InplaceOr() takes exactly 2 positional arguments (3 given)',
                             sbc.PySet_InplaceOr, set(), set(), set())

    def testSingularForACountOfOne(self):
        self.assertTypeError('__init__() takes exactly 1 positional argument (0 given)',
                             CChangeFinder)
        self.assertTypeError('__init__() takes exactly 1 positional argument (2 given)',
                             CChangeFinder, [], [])

    def testOptionalParameters(self):
        f = self.finder
        self.assertTypeError(
            '_LogicalInScopeChanged() takes at least 2 positional arguments (1 given)',
            f._LogicalInScopeChanged, self.logical)
        self.assertTypeError(
            '_LogicalInScopeChanged() takes at most 4 positional arguments (5 given)',
            f._LogicalInScopeChanged, self.logical, '', None, None, None)

    def testNoParameters(self):
        f = self.finder
        self.assertTypeError('_Clear() takes no arguments (1 given)', f._Clear, 1)
        self.assertTypeError('_PrepareForFind() takes no arguments (2 given)',
                             f._PrepareForFind, 1, 2)
        self.assertTypeError('_destroy_impl() takes no arguments (1 given)', f._destroy_impl, 1)
        self.assertTypeError('_FindChangesEntireListAdded() takes no arguments (1 given)',
                             f._FindChangesEntireListAdded, None)
        self.assertTypeError('GetNowTime() takes no arguments (1 given)', sbc.GetNowTime, 1)
        self.assertIs(f._fLogicalList, self.lst)

    def testSingleParameter(self):
        f = self.finder
        self.assertTypeError('_ProcessRemovedLogicals() takes exactly one argument (2 given)',
                             f._ProcessRemovedLogicals, [], [])
        self.assertTypeError('_ProcessRemovedLogicals() takes exactly one argument (0 given)',
                             f._ProcessRemovedLogicals)
        self.assertTypeError('_ProcessDedentedComments() takes exactly one argument (2 given)',
                             f._ProcessDedentedComments, 0, 1)
        self.assertTypeError('GetFullNameForScopeDef() takes exactly one argument (0 given)',
                             sbc.GetFullNameForScopeDef)
        self.assertTypeError('LogicalCheck() takes exactly one argument (2 given)',
                             sbc.LogicalCheck, 1, 2)
        self.assertTypeError('IsDefKind() takes exactly one argument (0 given)', sbc.IsDefKind)


class KeywordTest(ArgumentTestCase):

    def testNoKeywordsForNoOrOneParameter(self):
        f = self.finder
        for func, kwargs in [(f._Clear, {'x': 1}), (f._PrepareForFind, {'x': 1}),
                             (f._destroy_impl, {'x': 1}), (sbc.GetNowTime, {'x': 1}),
                             (f._ProcessRemovedLogicals, {'removed_list': []}),
                             (f._ProcessDedentedComments, {'first_comment_i': 0}),
                             (f._FindScopeNameContainingLogical, {'i': 0}),
                             (sbc.GetFullNameForScopeDef, {'scope_def': None}),
                             (sbc.LogicalCheck, {'logical': None}),
                             (sbc.OutOfTime, {'end_time': 0.0}),
                             (sbc.IsDefKind, {'kind': 1}),
                             (sbc.GetInfoBytesKind, {'ibytes': ''}),
                             (sbc.DoubleValueForPyIntBits, {'l': 1})]:
            self.assertTypeError('%s() takes no keyword arguments' % func.__name__, func, **kwargs)
        self.assertIs(f._fLogicalList, self.lst)

    def testParametersByKeyword(self):
        lst = Read('class A:\n    pass\n')
        finder = CChangeFinder(logical_list=lst)
        self.assertIs(finder._fLogicalList, lst)
        self.assertEqual(finder.FindChanges(removed_list=[], added_list=lst)[1], set(['A#0']))
        self.assertEqual(finder.FindChanges(lst, removed_list=[])[1], set(['A#0']))
        l = Logical(['def', 'g'], kind=kDefKind)
        self.assertIsNone(sbc.SetLogicalLocalScopeDefined(name='g#4', logical=l))
        self.assertEqual(l.fLocalScopeName, 'g#4')
        s = set([1])
        self.assertTrue(sbc.PySet_InplaceOr(to_add=set([2]), set_obj=s))
        self.assertEqual(s, set([1, 2]))

    def testOptionalParametersByKeyword(self):
        f = self.finder
        f._PrepareForFind()
        try:
            f._LogicalInScopeChanged(self.lst[1], 'f#0', old_leaf_scope=None)
            f._LogicalInScopeChanged(scope_name='f#0', logical=self.lst[1],
                                     old_containing_scope=None)
        finally:
            f._Clear()

    def testUnexpectedKeyword(self):
        self.assertTypeError("FindChanges() got an unexpected keyword argument 'bogus'",
                             self.finder.FindChanges, [], [], bogus=1)
        self.assertTypeError("__init__() got an unexpected keyword argument 'logicals'",
                             CChangeFinder, [], logicals=[])
        self.assertTypeError("PySet_InplaceOr() got an unexpected keyword argument 'other'",
                             sbc.PySet_InplaceOr, set(), set(), other=1)

    def testKeywordThatIsNotAString(self):
        # A Python-level wrapper would refuse such keywords itself.
        self.assertTypeError('FindChanges() keywords must be strings',
                             lambda: self.finder.FindChanges([], [], **{1: 2}))
        self.assertTypeError('SetLogicalLocalScopeDefined() keywords must be strings',
                             lambda: sbc.SetLogicalLocalScopeDefined(self.logical, 'x', **{(): 1}))
        self.assertEqual(self.logical.fLocalScopeName, 'f#0')

    def testParameterGivenTwice(self):
        self.assertTypeError("FindChanges() got multiple values for keyword argument 'added_list'",
                             self.finder.FindChanges, [], removed_list=[], added_list=[])
        self.assertTypeError(
            "SetLogicalLocalScopeDefined() got multiple values for keyword argument 'logical'",
            sbc.SetLogicalLocalScopeDefined, self.logical, name='x', logical=self.logical)
        self.assertEqual(self.logical.fLocalScopeName, 'f#0')


class TypeCheckTest(ArgumentTestCase):

    def testListParameters(self):
        f = self.finder
        self.assertTypeError(
            "Argument 'added_list' has incorrect type (expected list, got tuple)",
            f.FindChanges, (), [])
        self.assertTypeError(
            "Argument 'removed_list' has incorrect type (expected list, got tuple)",
            f.FindChanges, [], ())
        # The exact type: a subclass of list is refused.
        self.assertTypeError(
            "Argument 'added_list' has incorrect type (expected list, got MyList)",
            f.FindChanges, MyList(self.lst), [])
        # Checked in parameter order.
        self.assertTypeError(
            "Argument 'added_list' has incorrect type (expected list, got dict)",
            f.FindChanges, {}, ())
        self.assertTypeError(
            "Argument 'removed_list' has incorrect type (expected list, got tuple)",
            f._ProcessRemovedLogicals, ())
        self.assertTypeError(
            "Argument 'indicies_to_check' has incorrect type (expected list, got tuple)",
            f._ProcessAddedLogicals, [], ())

    def testNoneIsAcceptedOnEntryAndFailsWhereUsed(self):
        self.assertTypeError("object of type 'NoneType' has no len()",
                             self.finder.FindChanges, None, [])
        # The failure came from inside: the finder is idle again.
        self.assertEqual(self.finder.FindChanges([], []), (set(), set(), set()))

    def testStrParameters(self):
        f = self.finder
        f._PrepareForFind()
        try:
            for method in f._UpdateLogicalScopeName, f._UpdateContainingScope:
                self.assertTypeError(
                    "Argument 'scope_name' has incorrect type (expected str, got int)",
                    method, self.logical, 0, 5)
                self.assertTypeError(
                    "Argument 'scope_name' has incorrect type (expected str, got unicode)",
                    method, self.logical, 0, u'')
        finally:
            f._Clear()
        self.assertEqual(self.logical.fScopeName, '')

    def testIntegerParameters(self):
        f = self.finder
        self.assertRaises(TypeError, f._ProcessDedentedComments, 1.5)
        self.assertRaises(TypeError, f._ProcessDedentedComments, '1')
        self.assertRaises(TypeError, f._GetLeafScopeWithIndex, self.logical, 1.0)
        self.assertRaises(TypeError, f._FindScopeNameContainingLogical, None)
        self.assertRaises(TypeError, f._UpdateContainingScope, self.logical, 0.0, '')
        self.assertRaises(TypeError, f._PropagateScopeIndexChangeForward, 'a', 'b', 0, 1.0)
        self.assertRaises(OverflowError, f._ProcessDedentedComments, 2 ** 70)
        self.assertRaises(OverflowError, f._FindScopeIndexForLogical, self.logical, -2 ** 70)

    def testArgumentErrorsComeBeforeTheRecursionGuard(self):
        f = self.finder
        f._PrepareForFind()
        try:
            self.assertTypeError(
                "Argument 'added_list' has incorrect type (expected list, got tuple)",
                f.FindChanges, (), [])
            self.assertTypeError('FindChanges() takes exactly 2 positional arguments (1 given)',
                                 f.FindChanges, [])
            self.assertRaises(ValueError, f.FindChanges, [], [])
        finally:
            f._Clear()

    def testArgumentErrorsComeBeforeAnyStep(self):
        calls = []

        class Finder(CChangeFinder):
            def _PrepareForFind(self):
                calls.append('prepare')
                CChangeFinder._PrepareForFind(self)

        finder = Finder(self.lst)
        self.assertRaises(TypeError, finder.FindChanges, [], (), )
        self.assertRaises(TypeError, finder.FindChanges, [], [], bogus=1)
        self.assertEqual(calls, [])

    def testInitChecksTheListAfterParsing(self):
        self.assertTypeError('Expected list, got tuple', CChangeFinder, ())
        self.assertTypeError('Expected list, got MyList', CChangeFinder, MyList())
        self.assertIsNone(CChangeFinder(None)._fLogicalList)


if __name__ == '__main__':
    unittest.main()
