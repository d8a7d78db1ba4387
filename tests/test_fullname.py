"""GetFullNameForScopeDef: the full dotted name of the scope a class/def opens."""

import ast
import unittest

import pysource.symbolinfo as symbolinfo
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import CChangeFinder, GetFullNameForScopeDef

from support import Logical, Read, RunPython, kClassKind, kCommentKind, kDefKind

Join = symbolinfo.JoinTwoScopeNames


def ScopeDef(tokens, kind, scope_name=None, local=None):
    l = Logical(tokens, kind=kind)
    l.fScopeName, l.fLocalScopeName = scope_name, local
    return l


def Outcome(scope_def):
    try:
        return GetFullNameForScopeDef(scope_def)
    except Exception as e:
        return type(e), str(e)


class FullNameTest(unittest.TestCase):

    def testCases(self):
        try:
            Join(5, 'f')
        except Exception as e:
            join_error = (type(e), str(e))
        not_logical = (TypeError, 'Argument must be a logical')
        cases = [
            (None, ''),
            (ScopeDef(['class', 'A', ':'], kClassKind, ''), Join('', 'A')),
            (ScopeDef(['def', 'f', '(', ')', ':'], kDefKind, 'A#0', 'f#2'), Join('A#0', 'f#2')),
            (ScopeDef(['async', 'def', 'g', ':'], kDefKind, 'A#0.f#2'), Join('A#0.f#2', 'g')),
            (1, not_logical), ('', not_logical), (['class', 'A'], not_logical),
            (type('Sub', (LogicalLineType,), {})(['class', 'A'], 1, 0, kClassKind), not_logical),
            # Not a scope start, scope name unset, no name: bare assertions.
            (ScopeDef(['x', '=', '1'], 0, ''), (AssertionError, '')),
            (ScopeDef(['# class A'], kCommentKind, '', 'A'), (AssertionError, '')),
            (ScopeDef(['class', 'A', ':'], kClassKind, None), (AssertionError, '')),
            (ScopeDef(['def', 'f', ':'], kDefKind, None, 'f#0'), (AssertionError, '')),
            (ScopeDef(['def'], kDefKind, 'A#0'), (AssertionError, '')),
            (ScopeDef(['\\', 'class'], kClassKind, ''), (AssertionError, '')),
            (ScopeDef(['def', 'f', ':'], kDefKind, '', 5), (TypeError, 'Expected bytes, got int')),
            (ScopeDef(['def', 'f', ':'], kDefKind, 5), join_error),
        ]
        for scope_def, expected in cases:
            got = Outcome(scope_def)
            self.assertEqual(got, expected, scope_def)
            if isinstance(got, str):
                self.assertIs(type(got), str)

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
        self.assertEqual(GetFullNameForScopeDef(lst[4]), Join('A#0.f#1', 'B#0'))

    def testWithAssertionsDisabled(self):
        status, out, err = RunPython(r'''
            from pysource._fastaccess import LogicalLineType as L
            from pysource.scopebodycache import GetFullNameForScopeDef as Full
            def Def(tokens, kind, scope, local=None):
                l = L(tokens, 1, 0, kind)
                l.fScopeName, l.fLocalScopeName = scope, local
                return Full(l)
            print repr([Def(['def'], 2, 'A#0'), Def(['\\', 'class'], 1, None),
                        Def(['x', '=', '1'], 0, 'A#0'), Def(['x', '=', '1'], 0, 'A#0', 'f#1'),
                        Def(['def', 'g'], 2, 'A#0')])
            ''', '-O')
        self.assertEqual(status, 0, err)
        self.assertEqual(ast.literal_eval(out.strip()),
                         ['A#0', None, 'A#0', Join('A#0', 'f#1'), Join('A#0', 'g')])


if __name__ == '__main__':
    unittest.main()
