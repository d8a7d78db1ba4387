"""The stand-in sibling modules and pysource.logicals: the lookups and the
reader the module and its checks rely on."""

import unittest

from pysource import logicals, symbolinfo
from pysource._fastaccess import FindIndexOfLogical, IndexForLineno, LogicalLineType


def Lines(*linenos):
    return [LogicalLineType(['x'], n, 0, 0) for n in linenos]


class InterfaceTest(unittest.TestCase):

    def testCalls(self):
        lst, ordered, shuffled = Lines(1, 2, 2, 2, 5), Lines(2, 4, 4, 9), Lines(9, 3, 7, 1, 2)
        long_list = Lines(*range(1, 1001))
        long_list.insert(0, long_list[499])  # found by line, not by a scan from the start
        find, index, s = FindIndexOfLogical, IndexForLineno, symbolinfo
        calls = [(find, (lst, lst[3]), 3), (find, (lst, Lines(2)[0]), -1), (find, ([1, None, 'a'], None), 1),
                 (find, (shuffled, shuffled[4]), 4), (find, (long_list, long_list[0]), 500),
                 (index, ([], 3), 0), (s.JoinTwoScopeNames, ('A#0', 'f'), 'A#0.f'),
                 (s.SplitScopeNames, ('A#0.f..g',), ['A#0', 'f', '', 'g']),
                 (s.AppendScopeSuffixes, ('f', 2 ** 70, '()'), 'f#%d()' % 2 ** 70)]
        calls += [(index, (ordered, n), i) for n, i in [(-5, 0), (2, 0), (3, 1), (4, 1), (5, 3), (10, 4)]]
        for name, want in [('f#12', ('f', 12)), ('f', ('f', -1)), ('f#x1', ('f#x1', -1)), ('a#1.b', ('a#1.b', -1)),
                           ('g#2#07', ('g#2', 7))]:
            calls += [(s.SplitScopeNameFromSuffixes, (name,), want),
                      (s.LeafScopeNameHasIndex, (name,), want[1] != -1)]
        for fn, args, want in calls:
            self.assertEqual(fn(*args), want, (fn.__name__, args))
        for args in [('x', 1, 0, 0), ([], 2 ** 31, 0, 0), ([], 1, 2 ** 15, 0), ([], 1, 0, 256)]:
            self.assertRaises((TypeError, OverflowError), LogicalLineType, *args)


class ReadLogicalsTest(unittest.TestCase):

    def testKindsIndentsContinuationsAndErrors(self):
        for source, want in [
                ('@dec\nclass A:  # note\n    # alone\n\n\tdef f(self,\n\n  x):\n'
                 '\t    s = """a\n\nb"""\n\tasync def g(): pass\n  \n',
                 [(1, 0, 0, ('@', 'dec')), (2, 0, 1, ('class', 'A', ':', '# note')),
                  (3, 4, 21, ('# alone',)), (4, 0, 22, ()),
                  (5, 8, 2, ('def', 'f', '(', 'self', ',', 'x', ')', ':')), (8, 12, 0, ('s', '=', '"""a\n\nb"""')),
                  (11, 8, 2, ('async', 'def', 'g', '(', ')', ':', 'pass')), (12, 2, 22, ())]),
                ('x = \\\n  1', [(1, 0, 0, ('x', '=', '1'))]), ('', [])]:
            got = [(l.fLineno, l.fIndent, l.fKind, l.fTokens) for l in logicals.ReadLogicals(source)]
            self.assertEqual(got, want, source)
        for source, lineno in [('x = (1,\n\n', 3), ('a\ns = """\n', 2), ('if 1:\n  x\n y\n', 3)]:
            with self.assertRaises(SyntaxError) as cm:
                logicals.ReadLogicals(source)
            self.assertEqual(cm.exception.lineno, lineno)


if __name__ == '__main__':
    unittest.main()
