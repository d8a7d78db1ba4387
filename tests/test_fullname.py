"""GetFullNameForScopeDef: the full dotted name of the scope a class/def opens."""

import ast
import unittest

import pysource.symbolinfo as symbolinfo
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import CChangeFinder, GetFullNameForScopeDef

from support import Logical, Read, RunPython, kClassKind, kCommentKind, kDefKind


class SubLogical(LogicalLineType):
    pass


def ScopeDef(tokens, kind, scope_name=None, local=None):
    l = Logical(tokens, kind=kind)
    l.fScopeName = scope_name
    l.fLocalScopeName = local
    return l


class FullNameTest(unittest.TestCase):

    def assertAssertionError(self, scope_def):
        with self.assertRaises(AssertionError) as cm:
            GetFullNameForScopeDef(scope_def)
        self.assertEqual(str(cm.exception), '')

    def testModuleScope(self):
        self.assertEqual(GetFullNameForScopeDef(None), '')

    def testTopLevelClass(self):
        name = GetFullNameForScopeDef(ScopeDef(['class', 'A', ':'], kClassKind, ''))
        self.assertIs(type(name), str)
        self.assertEqual(name, symbolinfo.JoinTwoScopeNames('', 'A'))
        self.assertEqual(symbolinfo.SplitScopeNames(name), ['A'])

    def testStoredIndexedNameIsUsed(self):
        d = ScopeDef(['def', 'f', '(', ')', ':'], kDefKind, 'A#0', 'f#2')
        name = GetFullNameForScopeDef(d)
        self.assertEqual(name, symbolinfo.JoinTwoScopeNames('A#0', 'f#2'))
        self.assertEqual(symbolinfo.SplitScopeNames(name)[-1], 'f#2')
        # Without a stored name, the tokens give it.
        d = ScopeDef(['async', 'def', 'g', ':'], kDefKind, 'A#0.f#2')
        self.assertEqual(GetFullNameForScopeDef(d),
                         symbolinfo.JoinTwoScopeNames('A#0.f#2', 'g'))

    def testMatchesTheNamesOfAWholeListPass(self):
        lst = Read('''\
            class A:
                def f(self):
                    pass
                def f(self):
                    class B:
                        x = 1
            ''')
        CChangeFinder(lst).FindChanges(lst, [])
        for k, scope_def in enumerate(lst[:-1]):
            if scope_def.fKind in (kClassKind, kDefKind):
                self.assertEqual(GetFullNameForScopeDef(scope_def), lst[k + 1].fScopeName)
        self.assertEqual(GetFullNameForScopeDef(lst[4]),
                         symbolinfo.JoinTwoScopeNames('A#0.f#1', 'B#0'))

    def testNotALogical(self):
        for obj in [1, '', ['class', 'A'], SubLogical(['class', 'A'], 1, 0, kClassKind)]:
            with self.assertRaises(TypeError) as cm:
                GetFullNameForScopeDef(obj)
            self.assertEqual(str(cm.exception), 'Argument must be a logical')

    def testNotAScopeStart(self):
        self.assertAssertionError(ScopeDef(['x', '=', '1'], 0, ''))
        self.assertAssertionError(ScopeDef(['# class A'], kCommentKind, '', 'A'))

    def testScopeNameUnset(self):
        self.assertAssertionError(ScopeDef(['class', 'A', ':'], kClassKind, None))
        self.assertAssertionError(ScopeDef(['def', 'f', ':'], kDefKind, None, 'f#0'))

    def testNamelessScopeDef(self):
        self.assertAssertionError(ScopeDef(['def'], kDefKind, 'A#0'))
        self.assertAssertionError(ScopeDef(['\\', 'class'], kClassKind, ''))

    def testStoredNameOfTheWrongType(self):
        d = ScopeDef(['def', 'f', ':'], kDefKind, '', 5)
        with self.assertRaises(TypeError) as cm:
            GetFullNameForScopeDef(d)
        self.assertEqual(str(cm.exception), 'Expected bytes, got int')

    def testJoinErrorsPropagate(self):
        d = ScopeDef(['def', 'f', ':'], kDefKind, 5)
        try:
            symbolinfo.JoinTwoScopeNames(5, 'f')
        except Exception as e:
            expected = (type(e), str(e))
        with self.assertRaises(Exception) as cm:
            GetFullNameForScopeDef(d)
        self.assertEqual((type(cm.exception), str(cm.exception)), expected)

    def testWithAssertionsDisabled(self):
        status, out, err = RunPython(r'''
            from pysource._fastaccess import LogicalLineType as L
            from pysource.scopebodycache import GetFullNameForScopeDef as Full
            def Def(tokens, kind, scope, local=None):
                l = L(tokens, 1, 0, kind)
                l.fScopeName = scope
                l.fLocalScopeName = local
                return l
            print repr([
                Full(Def(['def'], 2, 'A#0')),
                Full(Def(['\\', 'class'], 1, None)),
                Full(Def(['x', '=', '1'], 0, 'A#0')),
                Full(Def(['x', '=', '1'], 0, 'A#0', 'f#1')),
                Full(Def(['def', 'g'], 2, 'A#0')),
            ])
            ''', '-O')
        self.assertEqual(status, 0, err)
        self.assertEqual(ast.literal_eval(out.strip()), [
            'A#0', None, 'A#0', symbolinfo.JoinTwoScopeNames('A#0', 'f#1'),
            symbolinfo.JoinTwoScopeNames('A#0', 'g')])


if __name__ == '__main__':
    unittest.main()
