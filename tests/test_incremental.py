"""The incremental pass: which indices are visited, how far changes are
carried, and that every edit leaves the names a fresh whole-file pass gives."""
import unittest

from finder_support import (CChangeFinder, apply_edit, code, finder_fields, fresh_names,
                            names, read_named, run_python, scope_names, whole_pass)
from pysource.logicals import ReadLogicals


class Spy(CChangeFinder):
    """Records the indices the pass asks about."""

    def __init__(self, lst):
        CChangeFinder.__init__(self, lst)
        self.looked_up = []
        self.runs = []

    def _FindScopeNameContainingLogical(self, i):
        self.looked_up.append(i)
        return CChangeFinder._FindScopeNameContainingLogical(self, i)

    def _ProcessDedentedComments(self, i):
        self.runs.append(i)
        return CChangeFinder._ProcessDedentedComments(self, i)


def edited(old, new, finder_class=CChangeFinder):
    lst = ReadLogicals(old)
    finder, _ = whole_pass(lst, finder_class)
    if isinstance(finder, Spy):
        finder.looked_up, finder.runs = [], []
    result, added, removed = apply_edit(lst, finder, new)
    return lst, finder, result


class VisitingOrder(unittest.TestCase):

    def test_sorted_and_each_index_once_at_its_last_occurrence(self):
        lst = [code(n + 1, 0) for n in range(12)]
        finder = Spy(lst)
        finder.FindChanges(lst, [])
        for l in (lst[4], lst[9]):
            del l.fScopeName
        finder._PrepareForFind()
        indices = [9, 2]
        finder._ProcessAddedLogicals([lst[4], lst[9]], indices)
        finder._Clear()
        self.assertEqual(indices, [2, 4, 9, 9])
        # Each index once, plus one scan step after each logical that changed.
        self.assertEqual(finder.looked_up, [2, 4, 5, 9, 10])
        self.assertEqual(scope_names(lst), [''] * 12)

    def test_typing_visits_one_index_and_scans_one_step(self):
        source = "def f():\n    a = 1\n    b = 2\n    c = 3\n"
        lst, finder, result = edited(source, source.replace('b = 2', 'b = 23'), Spy)
        self.assertEqual(finder.looked_up, [2, 3])
        self.assertEqual(result, (set(['f#0']), set(), set()))

    def test_unchanged_logical_records_nothing(self):
        lst = read_named("x = 1\ny = 2\n")
        finder = CChangeFinder(lst)
        self.assertEqual(finder.FindChanges([], [lst[1]]), (set(['']), set(), set()))

    def test_dedented_run_is_placed_once_and_visiting_resumes_after_it(self):
        source = "def f():\n    a = 1\n# c1\n# c2\n# c3\nz = 2\n"
        new = "def f():\n    a = 1\n# c1\n# c2x\n# c3\nz = 2\n"
        lst, finder, result = edited(source, new, Spy)
        self.assertEqual(finder.runs, [2])
        self.assertEqual(names(lst), fresh_names(new))


class IndicesWhileVisiting(unittest.TestCase):

    def test_next_change_and_last_processed_indices(self):
        snapshots = []

        class Watch(CChangeFinder):
            def _ProcessAddedLogicals(self, added_list, indicies_to_check):
                CChangeFinder._ProcessAddedLogicals(self, added_list, indicies_to_check)
                snapshots.append(('end', finder_fields(self)))

            def _FindScopeNameContainingLogical(self, i):
                snapshots.append((i, finder_fields(self)))
                return CChangeFinder._FindScopeNameContainingLogical(self, i)

        lst = read_named("a = 1\nb = 2\nc = 3\nd = 4\ne = 5\n")
        finder = Watch(lst)
        new = ReadLogicals("a = 1\nb = 20\nc = 3\nd = 40\ne = 5\n")
        removed = [lst[1], lst[3]]
        lst[1], lst[3] = new[1], new[3]
        finder.FindChanges([new[1], new[3]], removed)
        visits = [(i, f['next_change_index'], f['last_processed_index'])
                  for i, f in snapshots if i != 'end']
        # 1 and 3 are visited (each also mapped from a removed logical);
        # the scans after them look at 2 and 4 and stop there.
        self.assertEqual(visits, [(1, 3, -1), (2, 3, -1), (3, 5, 1), (4, 5, 1)])
        end = snapshots[-1][1]
        self.assertEqual((end['next_change_index'], end['last_processed_index']), (5, 3))
        self.assertEqual(finder_fields(finder)['next_change_index'], -1)

    def test_dedented_run_sets_last_processed_to_the_end_of_the_run(self):
        seen = []

        class Watch(CChangeFinder):
            def _FindScopeNameContainingLogical(self, i):
                seen.append((i, finder_fields(self)['last_processed_index']))
                return CChangeFinder._FindScopeNameContainingLogical(self, i)

        lst = read_named("def f():\n    a = 1\n# c1\n# c2\n# c3\nz = 2\n")
        finder = Watch(lst)
        new = ReadLogicals("def f():\n    a = 1\n# c1x\n# c2\n# c3\nz = 2\n")
        removed = [lst[2]]
        lst[2] = new[2]
        finder.FindChanges([new[2]], removed)
        # The run 2..4 is placed from the code line at 5; then 5 is visited
        # with the run marked as processed.
        self.assertEqual(seen, [(5, -1), (5, 4)])


class ForwardScan(unittest.TestCase):

    def test_new_def_moves_deeper_lines_into_its_scope(self):
        old = "x = 0\n    a = 1\n    b = 2\nc = 3\n"
        new = "def g():\n    a = 1\n    b = 2\nc = 3\n"
        lst, finder, (contents, classes, functions) = edited(old, new)
        self.assertEqual(scope_names(lst), ['', 'g#0', 'g#0', ''])
        self.assertEqual(contents, set(['', 'g#0']))
        self.assertEqual(functions, set(['g#0']))

    def test_scan_stops_at_an_added_logical_not_yet_visited(self):
        old = "def f():\n    a = 1\n    b = 2\n"
        new = "def g():\n    a = 1\n    c = 9\n    b = 2\n"
        lst, finder, result = edited(old, new)
        self.assertEqual(names(lst), fresh_names(new))

    def test_renamed_class_renames_its_methods_and_reports_old_names(self):
        old = "class A:\n    def f(self):\n        pass\n    def g(self):\n        pass\n"
        new = old.replace('class A', 'class B')
        lst, finder, (contents, classes, functions) = edited(old, new)
        self.assertEqual(names(lst), fresh_names(new))
        self.assertEqual(classes, set(['A#0', 'B#0']))
        self.assertEqual(functions, set(['A#0.f#0', 'A#0.g#0', 'B#0.f#0', 'B#0.g#0']))


class IndexRepair(unittest.TestCase):

    def test_new_definition_above_renumbers_later_ones_and_their_bodies(self):
        old = "def f():\n    a = 1\ndef f():\n    b = 1\n    def f():\n        c = 1\n"
        new = "def f():\n    pass\n" + old
        lst, finder, (contents, classes, functions) = edited(old, new)
        self.assertEqual(names(lst), fresh_names(new))
        self.assertEqual([l.fLocalScopeName for l in lst if l.fKind == 2],
                         ['f#0', 'f#1', 'f#2', 'f#0'])
        self.assertEqual(scope_names(lst)[-1], 'f#2.f#0')
        # The old first header stays (same object, same name); the others move on.
        self.assertEqual(functions, set(['f#1', 'f#2', 'f#1.f#0', 'f#2.f#0']))
        self.assertTrue(set(['f#0', 'f#1', 'f#2', 'f#1.f#0', 'f#2.f#0']) <= contents)

    def test_removed_definition_renumbers_the_next_one(self):
        old = "def f():\n    a = 1\ndef f():\n    b = 1\n"
        new = "def f():\n    b = 1\n"
        lst, finder, (contents, classes, functions) = edited(old, new)
        self.assertEqual(names(lst), [('', 'f#0'), ('f#0', None)])
        # The first header and the last body line are kept; the second def went.
        self.assertEqual(functions, set(['f#1']))
        self.assertEqual(contents, set(['', 'f#0', 'f#1']))

    def test_several_changes_in_one_call(self):
        body = "".join("    x%d = %d\n" % (n, n) for n in range(6))
        old = "def f():\n" + body + "def f():\n" + body
        new_lines = ("def f():\n    pass\n" + old).splitlines(True)
        new_lines[-2] = "    changed = 1\n"
        new = "".join(new_lines)
        lst = ReadLogicals(old)
        finder, _ = whole_pass(lst)
        fresh = ReadLogicals(new)
        # Two separate edits, top first, as an editor reports them.
        added = fresh[:2] + [fresh[-2]]
        removed = [lst[-2]]
        for l, f in zip(lst, fresh[2:]):
            l.fLineno = f.fLineno
        lst[-2:-1] = [fresh[-2]]
        lst[0:0] = fresh[:2]
        finder.FindChanges(added, removed)
        self.assertEqual(names(lst), fresh_names(new))

    def test_prefix_rename_reaches_past_comments_in_the_parent(self):
        old = "def f():\n    x = 1\n# c\n        # deep\ny = 2\n"
        new = "def f():\n    pass\n" + old
        lst, finder, result = edited(old, new)
        self.assertEqual(names(lst), fresh_names(new))


class OverridingSubclasses(unittest.TestCase):

    def edit_with(self, finder_class):
        old = "def f():\n    a = 1\n    b = 2\n"
        lst = ReadLogicals(old)
        finder, _ = whole_pass(lst, CChangeFinder)
        sub = finder_class(lst)
        return lst, sub, lambda: apply_edit(lst, sub, old.replace('a = 1', 'a = 10'))

    def test_override_that_raises_propagates_and_leaves_the_finder_idle(self):
        class Raise(CChangeFinder):
            def _LogicalInScopeChanged(self, *args):
                raise RuntimeError('no')

        lst, finder, edit = self.edit_with(Raise)
        with self.assertRaisesRegexp(RuntimeError, 'no'):
            edit()
        # Idle again: the next call runs (and meets the override again).
        with self.assertRaisesRegexp(RuntimeError, 'no'):
            finder.FindChanges([lst[1]], [])

    def test_reentering_find_changes_is_refused(self):
        class Reenter(CChangeFinder):
            def _FindScopeNameContainingLogical(self, i):
                return self.FindChanges([], [])

        lst, finder, edit = self.edit_with(Reenter)
        with self.assertRaisesRegexp(ValueError, '^FindChanges cannot be called recursively$'):
            edit()

    def test_override_that_clears_the_list_mid_pass_fails_cleanly(self):
        class Clear(CChangeFinder):
            def _FindScopeNameContainingLogical(self, i):
                del self._fLogicalList[:]
                return ''

        lst, finder, edit = self.edit_with(Clear)
        with self.assertRaises(IndexError):
            edit()

    def test_override_that_destroys_the_finder_mid_pass_fails_cleanly(self):
        class Destroy(CChangeFinder):
            def _FindScopeNameContainingLogical(self, i):
                self._destroy_impl()
                return ''

        lst, finder, edit = self.edit_with(Destroy)
        with self.assertRaises((TypeError, AttributeError)):
            edit()

    def test_scope_index_override_failure_is_reported_and_counts_as_zero(self):
        status, out, err = run_python(
            "from pysource.logicals import ReadLogicals\n"
            "from pysource.scopebodycache import CChangeFinder\n"
            "lst = ReadLogicals('x = 1\\n')\n"
            "class Bad(CChangeFinder):\n"
            "    def _FindScopeIndexForLogical(self, logical, i):\n"
            "        raise KeyError('idx')\n"
            "f = Bad(lst)\n"
            "f.FindChanges(lst, [])\n"
            "new = ReadLogicals('x = 1\\ndef g(): pass\\n')\n"
            "lst.append(new[1])\n"
            "f.FindChanges([new[1]], [])\n"
            "print new[1].fLocalScopeName\n")
        self.assertEqual((status, out.strip()), (0, 'g#0'), err)
        self.assertIn('pysource.scopebodycache.CChangeFinder._FindScopeIndexForLogical', err)


class OptimisedMode(unittest.TestCase):

    def test_added_logical_missing_from_the_list(self):
        code_text = (
            "from pysource.logicals import ReadLogicals\n"
            "from pysource.scopebodycache import CChangeFinder\n"
            "lst = ReadLogicals('x = 1\\ny = 2\\n')\n"
            "f = CChangeFinder(lst)\n"
            "f.FindChanges(lst, [])\n"
            "stray = ReadLogicals('z = 3\\n')[0]\n"
            "try:\n"
            "    f.FindChanges([stray], [])\n"
            "    print 'ok', stray.fScopeName\n"
            "except AssertionError:\n"
            "    print 'assertion'\n")
        self.assertEqual(run_python(code_text)[1].strip(), 'assertion')
        # Optimised, index -1 stands for the last logical of the list.
        self.assertEqual(run_python(code_text, optimize=True)[1].strip(), 'ok None')


if __name__ == '__main__':
    unittest.main()
