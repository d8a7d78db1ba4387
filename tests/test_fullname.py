"""GetFullNameForScopeDef: the full dotted name of the scope a class/def opens."""

import unittest

import pysource.symbolinfo as symbolinfo
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import GetFullNameForScopeDef

from support import OPTIMIZED, Logical, Outcome, Text, kClassKind, kCommentKind, kDefKind

Join = symbolinfo.JoinTwoScopeNames


def ScopeDef(tokens, kind, scope_name=None, local=None):
    l = Logical(tokens, kind=kind)
    l.fScopeName, l.fLocalScopeName = scope_name, local
    return l


class FullNameTest(unittest.TestCase):

    def testCases(self):
        not_logical = (TypeError, 'Argument must be a logical')
        # Optimised, the asserts are skipped: a logical that defines no name
        # gives its fScopeName, and a None scope name fails in the join.
        fails = lambda optimised: optimised if OPTIMIZED else (AssertionError, '')  # noqa: E731
        cases = [
            (None, ''),
            (ScopeDef(['class', 'A', ':'], kClassKind, ''), Join('', 'A')),
            (ScopeDef(['def', 'f', '(', ')', ':'], kDefKind, 'A#0', 'f#2'), Join('A#0', 'f#2')),
            (ScopeDef(['async', 'def', 'g', ':'], kDefKind, 'A#0.f#2'), Join('A#0.f#2', 'g')),
            (1, not_logical), ('', not_logical), (['class', 'A'], not_logical),
            (type('Sub', (LogicalLineType,), {})(['class', 'A'], 1, 0, kClassKind), not_logical),
            # Not a scope start, scope name unset, no name.
            (ScopeDef(['x', '=', '1'], 0, 'A#0'), fails('A#0')),
            (ScopeDef(['x', '=', '1'], 0, 'A#0', 'f#1'), fails(Join('A#0', 'f#1'))),
            (ScopeDef(['# class A'], kCommentKind, '', 'A'), fails('A')),
            (ScopeDef(['class', 'A', ':'], kClassKind, None), fails(Outcome(Join, None, 'A'))),
            (ScopeDef(['def', 'f', ':'], kDefKind, None, 'f#0'), fails(Outcome(Join, None, 'f#0'))),
            (ScopeDef(['def'], kDefKind, 'A#0'), fails('A#0')),
            (ScopeDef(['\\', 'class'], kClassKind, None), fails(None)),
            (ScopeDef(['def', 'f', ':'], kDefKind, '', 5), (TypeError, Text('Expected bytes, got %s', 'int'))),
            (ScopeDef(['def', 'f', ':'], kDefKind, 5), Outcome(Join, 5, 'f')),
        ]
        for scope_def, expected in cases:
            got = Outcome(GetFullNameForScopeDef, scope_def)
            self.assertEqual(got, expected, scope_def)
            if isinstance(got, str):
                self.assertIs(type(got), str)


if __name__ == '__main__':
    unittest.main()
