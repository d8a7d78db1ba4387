"""The edit replay: its editor model, its oracle, and the product under it.

The replay is only as good as its model of an editor and its oracle, so
the first groups check those against hand-made edits and deliberately
broken finders; the last ones replay seeded and hand-written edits
through CChangeFinder and expect it to agree with a fresh pass.
"""

import os
import random
import shutil
import subprocess
import sys
import tempfile
import unittest

_kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
sys.path.insert(0, os.path.join(_kRepoDir, 'tools'))

import replay  # noqa: E402
from replay import CChangeFinder, LiveDocument, Splice  # noqa: E402

_kSanitized = bool(os.environ.get('SBC_SANITIZED'))
_kCacheNotice = replay.CacheCheckAvailable()


def Tokens(lst):
    return [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in lst]


def Edit(text, splices, cache_check=False, finder_class=CChangeFinder):
    doc = LiveDocument(text, cache_check, finder_class)
    before = list(doc.lst)
    outcome = doc.Edit(splices, replay.ReadSteps(doc.lines, splices))
    return doc, before, outcome


class LazyFinder(object):
    """Leaves the names alone after any edit that adds a def line."""

    def __init__(self, lst):
        self.lst = lst
        self.real = CChangeFinder(lst)

    def FindChanges(self, added, removed):
        if len(added) != len(self.lst) and any(l.fKind == replay.kDefKind for l in added):
            return set(), set(), set()
        return self.real.FindChanges(added, removed)


class ForgetfulFinder(LazyFinder):
    """Names everything right but reports no changed function scopes."""

    def FindChanges(self, added, removed):
        contents, classes, functions = self.real.FindChanges(added, removed)
        if len(added) != len(self.lst):
            return set([''] if '' in contents else []), classes, set()
        return contents, classes, functions


class EditorModelTest(unittest.TestCase):
    """The live list is updated as an editor does: untouched logicals stay."""

    kText = 'class A:\n    def f(self):\n        x = 1\n\ny = 2\n'

    def testTypingReplacesOnlyTheTypedLogical(self):
        doc, before, outcome = Edit(self.kText, [Splice(2, 1, ['        x = 12'])])
        self.assertEqual(Tokens(doc.lst), Tokens(replay.Read(doc.text)))
        self.assertEqual([l is b for l, b in zip(doc.lst, before)],
                         [True, True, False, True, True])
        self.assertEqual(outcome.removed, [before[2]])
        self.assertEqual([l.fTokens for l in outcome.added], [('x', '=', '12')])
        self.assertEqual(outcome.removed[0].fLineno, 3)
        self.assertEqual(outcome.removed[0].fScopeName, 'A#0.f#0')

    def testSpacesBetweenTokensStillReplaceTheLogical(self):
        # Same tokens, but the editor read the line again: a new object.
        doc, before, outcome = Edit(self.kText, [Splice(4, 1, ['y  = 2'])])
        self.assertIsNot(doc.lst[4], before[4])
        self.assertEqual(outcome.removed, [before[4]])

    def testInsertedLinesMoveTheLaterLogicals(self):
        doc, before, outcome = Edit(self.kText, [Splice(1, 0, ['    # c', ''])])
        self.assertEqual(outcome.removed, [])
        self.assertEqual([l.fLineno for l in outcome.added], [2, 3])
        self.assertTrue(all(a is b for a, b in zip(doc.lst[3:], before[1:])))
        self.assertEqual([l.fLineno for l in doc.lst[3:]], [4, 5, 6, 7])

    def testDeletedLinesKeepTheirOldLineNumbers(self):
        doc, before, outcome = Edit(self.kText, [Splice(0, 2, [])])
        self.assertEqual(outcome.removed, before[:2])
        self.assertEqual([l.fLineno for l in outcome.removed], [1, 2])
        # The body line reads with another indent context but the same tokens.
        self.assertIs(doc.lst[0], before[2])
        self.assertEqual(doc.lst[0].fLineno, 1)

    def testEditInsideABracketReplacesTheWholeStatement(self):
        text = 'x = (1,\n     2)\ny = 3\n'
        doc, before, outcome = Edit(text, [Splice(1, 1, ['     22)'])])
        self.assertEqual(outcome.removed, [before[0]])
        self.assertIs(doc.lst[1], before[1])

    def testBatchRemovedLogicalsCarryTheEarlierShift(self):
        text = 'a = 1\nb = 2\nc = 3\nd = 4\n'
        splices = [Splice(0, 0, ['z = 0']), Splice(3, 1, [])]   # c = 3, now on line 4
        doc, before, outcome = Edit(text, splices)
        self.assertEqual(outcome.removed, [before[2]])
        self.assertEqual(before[2].fLineno, 4)
        self.assertEqual([l.fLineno for l in doc.lst], [1, 2, 3, 4])
        self.assertIs(doc.lst[3], before[3])

    def testBatchDropsLogicalsAddedAndRemovedInTheSameCall(self):
        text = 'a = 1\nb = 2\nc = 3\n'
        # The first change joins `b = 2` to a new line; the second edits that
        # line again, so the joined logical never reaches the finder.
        splices = [Splice(1, 0, ['y = 1 + \\']), Splice(2, 1, ['b + 3'])]
        doc, before, outcome = Edit(text, splices)
        self.assertEqual(len(outcome.steps), 2)
        joined = outcome.steps[0].new
        self.assertEqual([l.fTokens for l in joined], [('y', '=', '1', '+', 'b', '=', '2')])
        self.assertNotIn(joined[0], outcome.added)
        self.assertNotIn(joined[0], outcome.removed)
        self.assertEqual(outcome.removed, [before[1]])
        self.assertEqual([l.fTokens for l in outcome.added], [('y', '=', '1', '+', 'b', '+', '3')])
        self.assertEqual(Tokens(doc.lst), Tokens(replay.Read(doc.text)))

    def testSplicesBetweenRebuildTheNewText(self):
        old = 'a = 1\nb = 2\nc = 3\nd = 4\ne = 5\n'
        new = 'a = 1\nz = 0\nb = 2\nd = 4\ne = 55\n'
        splices = replay.SplicesBetween(old, new)
        self.assertEqual(len(splices), 3)
        lines = replay.SplitLines(old)
        for splice in splices:
            splice.Apply(lines)
        self.assertEqual(replay.JoinLines(lines), new)
        self.assertEqual(len(replay.SplicesBetween(old, new, batch=False)), 1)

    def testUnreadableEditIsRejected(self):
        with self.assertRaises(replay.SourceRejected):
            replay.ReadSteps(['def f():', '    x = 1'], [Splice(1, 1, ['    x = """'])])


class EditMakerTest(unittest.TestCase):

    def testSameSeedSameEdits(self):
        lines = replay.SplitLines(open(replay.kSamplePath).read())

        def Run(seed):
            maker = replay.EditMaker(random.Random(seed), 0.3)
            out, current = [], lines
            for _ in range(60):
                made = maker.Next(current)
                if made and made[1]:
                    out.append([s.Describe() for s in made[0]])
                    current = made[1][-1][0]
            return out

        self.assertEqual(Run(5), Run(5))
        self.assertNotEqual(Run(5), Run(6))

    def testBatchSplicesAreOrderedAndApart(self):
        lines = replay.SplitLines(open(replay.kSamplePath).read())
        maker = replay.EditMaker(random.Random(2), 1.0)
        batches = 0
        for _ in range(40):
            made = maker.Next(lines)
            if not made or not made[1] or len(made[0]) < 2:
                continue
            batches += 1
            for a, b in zip(made[0], made[0][1:]):
                self.assertGreaterEqual(b.start, a.start + len(a.new_lines))
        self.assertGreater(batches, 10)


class OracleTest(unittest.TestCase):
    """Broken finders must be caught, or a clean run proves nothing."""

    def setUp(self):
        self.dir = tempfile.mkdtemp()

    def tearDown(self):
        shutil.rmtree(self.dir)

    def testStaleNamesAreReported(self):
        text = 'def f():\n    x = 1\n\ny = 2\n'
        _, _, outcome = Edit(text, [Splice(3, 0, ['def f():'])], finder_class=LazyFinder)
        self.assertEqual(outcome.problems.invariant, 'names')
        index, logical, want, got = outcome.problems.names[0]
        self.assertEqual((logical.fLineno, want, got), (4, ('', 'f#1'), (None, None)))

    def testNamesOfUnchangedLogicalsAreComparedToo(self):
        text = 'def f():\n    x = 1\ny = 2\nz = 3\n'
        _, _, outcome = Edit(text, [Splice(2, 0, ['    def g(self):'])],
                             finder_class=LazyFinder)
        lines = sorted(l.fLineno for _, l, _, _ in outcome.problems.names)
        self.assertEqual(lines, [3])

    @unittest.skipIf(_kCacheNotice, _kCacheNotice)
    def testMissingChangeIsReportedThroughTheCache(self):
        text = 'class A:\n    def f(self):\n        x = 1\n    y = 2\n'
        _, _, outcome = Edit(text, [Splice(2, 1, [])], cache_check=True,
                             finder_class=ForgetfulFinder)
        self.assertEqual(outcome.problems.invariant, 'cache')
        self.assertTrue(any("'A#0.f#0'" in p and 'not in the returned changes' in p
                            for p in outcome.problems.cache), outcome.problems.cache)

    def testRunReplayCountsAndWritesReproducers(self):
        summary = replay.run_replay([replay.kSamplePath], seed=3, edits_per_file=40,
                                    cache_check=False, repro_dir=self.dir, max_repros=1,
                                    quiet=True, out=open(os.devnull, 'w'),
                                    finder_class=LazyFinder)
        self.assertGreater(summary['names_disagreements'], 0)
        self.assertTrue(replay.Failed(summary))
        self.assertEqual(summary['edits'], 40)
        written = [f['repro'] for f in summary['failures'] if f['repro']]
        self.assertEqual(len(written), 1)
        self.assertTrue(os.path.exists(written[0]))

    def testShrinkKeepsTheFailureAndDropsFarLines(self):
        body = ''.join('    a%d = %d\n' % (i, i) for i in range(40))
        text = 'import os\n' + 'def f():\n' + body + 'def g():\n' + body + 'x = 1\n'
        lines = replay.SplitLines(text)
        at = lines.index('def g():') + 10
        splices = [Splice(at, 0, ['    def h(self):'])]
        small, small_splices, tries = replay.Shrink(text, splices, 'names', False,
                                                    finder_class=LazyFinder)
        self.assertLess(len(replay.SplitLines(small)), 10)
        got = replay.RunScenario(small, small_splices, finder_class=LazyFinder)
        self.assertEqual(got[0].problems.invariant, 'names')
        self.assertIn('    def h(self):', replay.SplitLines(got[1]))

    def testShrinkDropsUnneededChangesOfABatch(self):
        text = ''.join('x%d = %d\n' % (i, i) for i in range(30))
        splices = [Splice(2, 1, ['y = 2']), Splice(15, 0, ['def f():']),
                   Splice(25, 1, ['y = 25'])]
        _, small_splices, _ = replay.Shrink(text, splices, 'names', False,
                                            finder_class=LazyFinder)
        self.assertEqual([s.new_lines for s in small_splices], [['def f():']])

    def testShrinkThinsTheEditedLines(self):
        text = ''.join('x%d = %d\n' % (i, i) for i in range(10))
        rewrite = Splice(3, 4, ['a = 1', 'def f():', 'b = 2', 'c = 3'])
        insert = Splice(3, 0, ['a = 1', 'def f():', 'b = 2'])
        for splice in (rewrite, insert):
            small, small_splices, _ = replay.Shrink(text, [splice], 'names', False,
                                                    finder_class=LazyFinder)
            self.assertEqual([s.new_lines for s in small_splices], [['def f():']])
            got = replay.RunScenario(small, small_splices, finder_class=LazyFinder)
            self.assertEqual(got[0].problems.invariant, 'names')

    def testReproducerRebuildsTheNewText(self):
        text = 'class A:\n    def f(self):\n        x = 1\n    # c\n\ny = 2\n' * 3
        splices = [Splice(1, 0, ['    def f(self):']), Splice(9, 0, ['z = 1'])]
        path, note = replay.WriteReproducer(self.dir, 'r', text, splices, 'names', False,
                                            'test', finder_class=LazyFinder)
        env = dict(os.environ)
        proc = subprocess.Popen([sys.executable, path], stdout=subprocess.PIPE,
                                stderr=subprocess.STDOUT, env=env)
        out = proc.communicate()[0]
        # The script runs the real finder: it may agree (0) or not (1), but its
        # steps must rebuild the new text (2) and it must not crash.
        self.assertIn(proc.returncode, (0, 1), out)
        self.assertIn('disagreements', out)


class StdlibReplayTest(unittest.TestCase):
    """Seeded edits over a fixed sample of the standard library."""

    def testNoDisagreements(self):
        files, edits = (3, 30) if _kSanitized else (12, 150)
        paths = replay.SampleFiles(replay.StdlibFiles(), files, 'test_replay', max_lines=1500)
        self.assertEqual(len(paths), files)
        log = tempfile.TemporaryFile()
        summary = replay.run_replay(paths, seed='test_replay', edits_per_file=edits,
                                    batch_fraction=0.2, cache_check=True, repro_dir=None,
                                    quiet=True, out=log)
        log.seek(0)
        self.assertGreaterEqual(summary['edits'], files * edits * 9 // 10)
        self.assertGreater(summary['batches'], 0)
        self.assertFalse(replay.Failed(summary), log.read()[:6000])


def _Body(name, count):
    return ''.join('    %s%d = %d\n' % (name, i, i) for i in range(count))


# (name, old source, new source): each is replayed as one FindChanges call
# (several changes when the texts differ in several places).
kScenarios = [
    ('typing_last_body_line_before_blank_and_dedent',
     'class A:\n    def f(self):\n        x = 1\n\ny = 2\n',
     'class A:\n    def f(self):\n        x = 12\n\ny = 2\n'),
    ('insert_body_line_after_blank',
     'def f():\n    x = 1\n\ny = 2\n',
     'def f():\n    x = 1\n\n    z = 3\ny = 2\n'),
    ('blank_line_after_class_header',
     'class A:\n    x = 1\n    def f(self):\n        pass\n',
     'class A:\n\n    x = 1\n    def f(self):\n        pass\n'),
    ('blank_line_after_class_header_removed',
     'class A:\n\n    x = 1\n',
     'class A:\n    x = 1\n'),
    ('if_header_becomes_def_over_blank',
     'if True:\n\n    y = 2\n',
     'def g():\n\n    y = 2\n'),
    ('new_def_above_two_same_named_defs',
     'def f():\n' + _Body('a', 40) + 'def f():\n' + _Body('b', 40),
     'def f():\n    pass\ndef f():\n' + _Body('a', 40) + 'def f():\n' + _Body('b', 40)),
    ('first_of_three_same_named_defs_deleted',
     'def f():\n    a = 1\ndef f():\n    b = 1\ndef f():\n    c = 1\n',
     'def f():\n    b = 1\ndef f():\n    c = 1\n'),
    ('same_named_class_renamed_in_the_middle',
     'class A:\n    x = 1\nclass A:\n    y = 1\nclass A:\n    z = 1\n',
     'class A:\n    x = 1\nclass B:\n    y = 1\nclass A:\n    z = 1\n'),
    ('dedented_comment_run_at_end_reindented',
     'def f():\n    x = 1\n# a\n    # b\n# c\n',
     'def f():\n    x = 1\n# a\n    # b\n    # c\n'),
    ('dedented_comment_run_at_end_grows',
     'def f():\n    x = 1\n# a\n    # b\n# c\n',
     'def f():\n    x = 1\n# a\n        # new\n    # b\n# c\n'),
    ('dedented_comment_run_at_end_typed_into',
     'class A:\n    def f(self):\n        x = 1\n    # a\n# b\n',
     'class A:\n    def f(self):\n        x = 1\n    # a\n# bc\n'),
    ('dedented_comment_run_at_end_loses_its_code',
     'class A:\n    def f(self):\n        x = 1\n# a\n        # b\n',
     'class A:\n    def f(self):\n# a\n        # b\n'),
    ('dedented_comment_inside_body_then_code',
     'class A:\n    def f(self):\n        x = 1\n# a\n        y = 2\n',
     'class A:\n    def f(self):\n        x = 1\n# a\n    # b\n        y = 2\n'),
    ('def_header_deleted_body_joins_previous_scope',
     'class A:\n    def f(self):\n        x = 1\n    def g(self):\n        y = 2\n',
     'class A:\n    def f(self):\n        x = 1\n        y = 2\n'),
    ('module_function_indented_into_class',
     'class A:\n    x = 1\ndef f():\n    y = 2\nz = 3\n',
     'class A:\n    x = 1\n    def f():\n        y = 2\nz = 3\n'),
    ('header_typed_without_a_name_over_a_nested_def',
     'if True:\n    def g():\n        pass\n',
     'def\n    def g():\n        pass\n'),
    ('dedented_header_takes_a_later_line_past_an_unchanged_one',
     '    def t(self):\n        a = 1\n        b = 2\n    c = 3\n',
     'def t(self):\n    a = 1\n        b = 2\n    c = 3\n'),
    ('indented_header_drops_a_later_line_past_an_unchanged_one',
     'def s(obj):\n    a = 1\n        b = 2\n    c = 3\n',
     '    def s(obj):\n        a = 1\n        b = 2\n    c = 3\n'),
    ('whitespace_only_line_at_end_of_body',
     'def f():\n    x = 1\ny = 2\n',
     'def f():\n    x = 1\n    \ny = 2\n'),
    ('batch_def_near_top_and_edit_deep_in_later_same_named_def',
     'import os\n\ndef f():\n' + _Body('a', 30) + 'def f():\n' + _Body('b', 30) +
     '    return b1\n',
     'import os\ndef f(): pass\n\ndef f():\n' + _Body('a', 30) + 'def f():\n' +
     _Body('b', 30) + '    return b2\n'),
    ('batch_two_headers_swap_names',
     'class A:\n    def f(self):\n        pass\n    def g(self):\n        pass\n'
     '    def f(self):\n        pass\n',
     'class A:\n    def g(self):\n        pass\n    def g(self):\n        pass\n'
     '    def g(self):\n        pass\n'),
]


class ScenarioTest(unittest.TestCase):
    """Hand-written edits the product must get right, against a fresh pass."""

    def Check(self, old, new):
        outcome = replay.CheckPair(old, new, cache_check=not _kCacheNotice)
        self.assertIsNone(outcome.problems.invariant, '\n'.join(
            ['edit: ' + ', '.join(s.Describe() for s in outcome.splices)] +
            outcome.problems.Lines(8)))


def _AddScenario(name, old, new):
    def Test(self):
        self.Check(old, new)
    Test.__name__ = 'test_' + name
    setattr(ScenarioTest, Test.__name__, Test)


for _scenario in kScenarios:
    _AddScenario(*_scenario)


class ScenarioTableTest(unittest.TestCase):

    def testBatchScenariosReplayAsSeveralChanges(self):
        for name, old, new in kScenarios:
            if name.startswith('batch_'):
                self.assertGreater(len(replay.SplicesBetween(old, new)), 1, name)


if __name__ == '__main__':
    unittest.main()
