"""The whole-list pass: names of a freshly read file, and the change sets."""
import unittest

from finder_support import (CChangeFinder, blank, code, comment, deff, finder_fields, logical,
                            names, read_named, run_python, scope_names, whole_pass)
from pysource.logicals import ReadLogicals


class HandBuiltLists(unittest.TestCase):

    def test_def_at_same_indent_closes_the_previous_one(self):
        lst = [deff(1, 0, 'f'), deff(2, 0, 'g'), code(3, 4)]
        whole_pass(lst)
        self.assertEqual(scope_names(lst), ['', '', 'g#0'])

    def test_comment_at_left_margin_does_not_close_the_function(self):
        lst = [deff(1, 0, 'f'), code(2, 4), comment(3, 0), blank(4), code(5, 4), comment(6, 0)]
        whole_pass(lst)
        self.assertEqual(scope_names(lst), ['', 'f#0', 'f#0', 'f#0', 'f#0', ''])

    def test_async_def(self):
        lst = read_named("async def f():\n    pass\n")
        self.assertEqual(names(lst), [('', 'f#0'), ('f#0', None)])


class RepeatedDefinitions(unittest.TestCase):

    def test_change_sets(self):
        lst = ReadLogicals("class A:\n    def f(self): pass\ndef g(): pass\ndef g(): pass\n")
        finder, (contents, classes, functions) = whole_pass(lst)
        self.assertEqual(contents, set(['', 'A#0', 'A#0.f#0', 'g#0', 'g#1']))
        self.assertEqual(classes, set(['A#0']))
        self.assertEqual(functions, set(['A#0.f#0', 'g#0', 'g#1']))

    def test_empty_list(self):
        self.assertEqual(whole_pass([])[1], (set(['']), set(), set()))

    def test_scopes_seen_table_after_the_pass(self):
        tables = []

        class Watch(CChangeFinder):
            def _FindChangesEntireListAdded(self):
                CChangeFinder._FindChangesEntireListAdded(self)
                tables.append(finder_fields(self))

        lst = ReadLogicals("def f(): pass\ndef f(): pass\nclass C:\n    def f(self): pass\n")
        finder, result = whole_pass(lst, Watch)
        fields = tables[0]
        self.assertEqual(fields['scopes_seen'], {'f': 1, 'C': 0, 'C#0.f': 0})
        # The pass counts without moving the indices.
        self.assertEqual((fields['end_index_for_scopes_seen'], fields['next_change_index'],
                          fields['last_processed_index']), (0, -1, -1))
        self.assertEqual(finder_fields(finder)['scopes_seen'], None)

    def test_second_whole_pass_gives_the_same_names(self):
        source = ("def f():\n    pass\ndef f():\n    x = 1\n"
                  "class C:\n    def m(self): pass\n    def m(self): pass\n")
        lst = read_named(source)
        first = names(lst)
        finder, result = whole_pass(lst)
        self.assertEqual(names(lst), first)
        self.assertEqual(result[2], set(['f#0', 'f#1', 'C#0.m#0', 'C#0.m#1']))

    def test_stale_index_on_a_fresh_pass_is_renumbered(self):
        lst = [deff(1, 0, 'f'), deff(2, 0, 'f')]
        lst[0].fLocalScopeName = 'f#5'
        lst[1].fLocalScopeName = 'f#5'
        whole_pass(lst)
        self.assertEqual([l.fLocalScopeName for l in lst], ['f#0', 'f#1'])


class ScopeStartWithoutName(unittest.TestCase):

    def test_no_unraisable_noise(self):
        status, out, err = run_python(
            "from pysource._fastaccess import LogicalLineType as L\n"
            "from pysource.scopebodycache import CChangeFinder\n"
            "lst = [L(['def'], 1, 0, 2), L(['x'], 2, 4, 0)]\n"
            "CChangeFinder(lst).FindChanges(lst, [])\n"
            "print [l.fScopeName for l in lst]\n")
        self.assertEqual((status, out.strip(), err), (0, "['', '']", ''))


class FailuresAndOverrides(unittest.TestCase):

    def test_non_logical_stops_the_pass_and_leaves_the_finder_idle(self):
        lst = [code(1, 0), 'not a logical']
        finder = CChangeFinder(lst)
        with self.assertRaisesRegexp(TypeError, '^Argument must be a logical$'):
            finder.FindChanges(lst, [])
        self.assertEqual(lst[0].fScopeName, '')
        # Idle again: the next call is not refused as recursive.
        with self.assertRaisesRegexp(TypeError, '^Argument must be a logical$'):
            finder.FindChanges(lst, [])

    def test_called_outside_find_changes(self):
        finder = CChangeFinder([code(1, 0)])
        with self.assertRaisesRegexp(AttributeError, "^'NoneType' object has no attribute 'add'$"):
            finder._FindChangesEntireListAdded()

    def test_overrides_see_every_logical(self):
        seen = []

        class Spy(CChangeFinder):
            def _SetLogicalScopeNames(self, logical, i, pair):
                seen.append((i, pair))
                return CChangeFinder._SetLogicalScopeNames(self, logical, i, pair)

        lst = read_named("class A:\n    x = 1\n")
        whole_pass(lst, Spy)
        self.assertEqual(seen, [(0, ('', 'A#0')), (1, ('A#0', None))])

    def test_leaf_override_names_the_scopes(self):
        class Upper(CChangeFinder):
            def _GetLeafScopeWithIndex(self, logical, scope_index):
                return 'F%d' % scope_index

        lst = ReadLogicals("def f():\n    x = 1\n")
        finder, result = whole_pass(lst, Upper)
        self.assertEqual(names(lst), [('', 'F0'), ('F0', None)])
        self.assertEqual(result, (set(['', 'F0']), set(), set(['F0'])))

    def test_reentry_from_an_override_is_refused(self):
        class Reenter(CChangeFinder):
            def _SetLogicalScopeNames(self, logical, i, pair):
                self.FindChanges([], [])

        lst = ReadLogicals("x = 1\n")
        finder = Reenter(lst)
        with self.assertRaisesRegexp(ValueError, 'FindChanges cannot be called recursively'):
            finder.FindChanges(lst, [])
        finder._SetLogicalScopeNames = lambda *a: None
        self.assertEqual(finder.FindChanges(lst, [])[0], set(['']))

    def test_override_emptying_the_list_mid_pass(self):
        class Shrink(CChangeFinder):
            def _SetLogicalScopeNames(self, logical, i, pair):
                del self._fLogicalList[:]
                return CChangeFinder._SetLogicalScopeNames(self, logical, i, pair)

        lst = ReadLogicals("class A:\n    x = 1\n    y = 2\n")
        finder = Shrink(lst)
        with self.assertRaisesRegexp(IndexError, 'list index out of range'):
            finder.FindChanges(lst, [])
        self.assertEqual(lst, [])

    def test_dedented_comment_step_failure_is_reported(self):
        status, out, err = run_python(
            "from pysource.logicals import ReadLogicals\n"
            "from pysource.scopebodycache import CChangeFinder\n"
            "class Bad(CChangeFinder):\n"
            "    def _ProcessDedentedComments(self, i):\n"
            "        raise KeyError('boom')\n"
            "lst = ReadLogicals('def f():\\n    x = 1\\n# c\\ny = 2\\n')\n"
            "try:\n"
            "    Bad(lst).FindChanges(lst, [])\n"
            "except AssertionError:\n"
            "    print 'assertion'\n")
        self.assertEqual((status, out.strip()), (0, 'assertion'))
        self.assertIn("KeyError: 'boom'", err)
        self.assertIn('pysource.scopebodycache.CChangeFinder._ProcessDedentedComments', err)

    def test_optimised_run_refuses_a_step_that_does_not_advance(self):
        status, out, err = run_python(
            "from pysource.logicals import ReadLogicals\n"
            "from pysource.scopebodycache import CChangeFinder\n"
            "class Stuck(CChangeFinder):\n"
            "    def _ProcessDedentedComments(self, i):\n"
            "        return 0\n"
            "lst = ReadLogicals('def f():\\n    x = 1\\n# c\\ny = 2\\n')\n"
            "try:\n"
            "    Stuck(lst).FindChanges(lst, [])\n"
            "except RuntimeError as e:\n"
            "    print str(e).split(',')[0]\n", optimize=True)
        self.assertEqual((status, out.strip()),
                         (0, "_ProcessDedentedComments answered 0 for the comment or blank line at index 2"),
                         err)


if __name__ == '__main__':
    unittest.main()
