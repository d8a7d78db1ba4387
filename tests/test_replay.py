"""Edits replayed through CChangeFinder agree with a fresh whole-file pass."""

import os
import sys
import tempfile
import unittest

sys.path.insert(0, os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), 'tools'))
import replay  # noqa: E402
from replay import CChangeFinder, LiveDocument, Splice  # noqa: E402

SANITIZED = bool(os.environ.get('SBC_SANITIZED'))


def Edit(text, splices, cache_check=False, finder_class=CChangeFinder):
    doc = LiveDocument(text, cache_check, finder_class)
    before = list(doc.lst)
    return doc, before, doc.Edit(splices, replay.ReadSteps(doc.lines, splices))


class LazyFinder(object):
    """Leaves the names alone after an edit that adds a def line."""

    def __init__(self, lst):
        self.lst, self.real = lst, CChangeFinder(lst)

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


class ReplayToolTest(unittest.TestCase):
    """A clean replay proves something only if the tool edits as an editor
    does and catches wrong finders."""

    def testLiveListUpdatedAsAnEditorDoes(self):
        text = 'class A:\n    def f(self):\n        x = 1\n\ny = 2\n'
        doc, before, outcome = Edit(text, [Splice(1, 0, ['    # c', '']), Splice(4, 1, ['        x = 12'])])
        tokens = lambda lst: [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in lst]  # noqa: E731
        self.assertEqual(tokens(doc.lst), tokens(replay.Read(doc.text)))
        kept = [any(l is b for b in before) for l in doc.lst]
        self.assertEqual(kept, [True, False, False, True, False, True, True])
        self.assertEqual(outcome.removed, [before[2]])
        self.assertEqual(outcome.removed[0].fScopeName, 'A#0.f#0')
        self.assertEqual([l.fTokens for l in outcome.added], [('# c',), (), ('x', '=', '12')])
        self.assertEqual([l.fLineno for l in doc.lst], range(1, 8))

    def testBrokenFindersAreCaught(self):
        text = 'def f():\n    x = 1\n\ny = 2\n'
        outcome = Edit(text, [Splice(3, 0, ['def f():'])], finder_class=LazyFinder)[2]
        self.assertEqual(outcome.problems.invariant, 'names')
        index, logical, want, got = outcome.problems.names[0]
        self.assertEqual((logical.fLineno, want, got), (4, ('', 'f#1'), (None, None)))
        text = 'class A:\n    def f(self):\n        x = 1\n    y = 2\n'
        outcome = Edit(text, [Splice(2, 1, [])], cache_check=True, finder_class=ForgetfulFinder)[2]
        self.assertEqual(outcome.problems.invariant, 'cache')
        self.assertTrue(any("'A#0.f#0'" in p and 'not in the returned changes' in p
                            for p in outcome.problems.cache), outcome.problems.cache)


class StdlibReplayTest(unittest.TestCase):

    def testSeededEditsOnAFixedSampleAgree(self):
        files, edits = (8, 80) if SANITIZED else (16, 150)
        paths = replay.SampleFiles(replay.StdlibFiles(), files, 'test_replay', max_lines=1500)
        self.assertEqual(len(paths), files)
        log = tempfile.TemporaryFile()
        summary = replay.run_replay(paths, seed='test_replay', edits_per_file=edits, batch_fraction=0.2,
                                    cache_check=True, repro_dir=None, quiet=True, out=log)
        log.seek(0)
        self.assertGreaterEqual(summary['edits'], files * edits * 9 // 10)
        self.assertGreater(summary['batches'], 0)
        self.assertFalse(replay.Failed(summary), log.read()[:6000])


def _Body(name, count):
    return ''.join('    %s%d = %d\n' % (name, i, i) for i in range(count))


# (old source, new source): each edit is one FindChanges call, with one
# change per differing run of lines.
kScenarios = [
    ('class A:\n    def f(self):\n        x = 1\n\ny = 2\n',
     'class A:\n    def f(self):\n        x = 12\n\ny = 2\n'),
    ('def f():\n    x = 1\n\ny = 2\n',
     'def f():\n    x = 1\n\n    z = 3\ny = 2\n'),
    ('class A:\n    x = 1\n    def f(self):\n        pass\n',
     'class A:\n\n    x = 1\n    def f(self):\n        pass\n'),
    ('class A:\n\n    x = 1\n',
     'class A:\n    x = 1\n'),
    ('if True:\n\n    y = 2\n',
     'def g():\n\n    y = 2\n'),
    ('def f():\n' + _Body('a', 40) + 'def f():\n' + _Body('b', 40),
     'def f():\n    pass\ndef f():\n' + _Body('a', 40) + 'def f():\n' + _Body('b', 40)),
    ('def f():\n    a = 1\ndef f():\n    b = 1\ndef f():\n    c = 1\n',
     'def f():\n    b = 1\ndef f():\n    c = 1\n'),
    ('class A:\n    x = 1\nclass A:\n    y = 1\nclass A:\n    z = 1\n',
     'class A:\n    x = 1\nclass B:\n    y = 1\nclass A:\n    z = 1\n'),
    # Runs of comments after the last code line, dedented below it.
    ('def f():\n    x = 1\n# a\n    # b\n# c\n',
     'def f():\n    x = 1\n# a\n    # b\n    # c\n'),
    ('def f():\n    x = 1\n# a\n    # b\n# c\n',
     'def f():\n    x = 1\n# a\n        # new\n    # b\n# c\n'),
    ('class A:\n    def f(self):\n        x = 1\n    # a\n# b\n',
     'class A:\n    def f(self):\n        x = 1\n    # a\n# bc\n'),
    ('class A:\n    def f(self):\n        x = 1\n# a\n        # b\n',
     'class A:\n    def f(self):\n# a\n        # b\n'),
    ('class A:\n    def f(self):\n        x = 1\n# a\n        y = 2\n',
     'class A:\n    def f(self):\n        x = 1\n# a\n    # b\n        y = 2\n'),
    ('class A:\n    def f(self):\n        x = 1\n    def g(self):\n        y = 2\n',
     'class A:\n    def f(self):\n        x = 1\n        y = 2\n'),
    ('class A:\n    x = 1\ndef f():\n    y = 2\nz = 3\n',
     'class A:\n    x = 1\n    def f():\n        y = 2\nz = 3\n'),
    ('if True:\n    def g():\n        pass\n',
     'def\n    def g():\n        pass\n'),
    # A re-indented header takes (or drops) a later line past an unchanged one.
    ('    def t(self):\n        a = 1\n        b = 2\n    c = 3\n',
     'def t(self):\n    a = 1\n        b = 2\n    c = 3\n'),
    ('def s(obj):\n    a = 1\n        b = 2\n    c = 3\n',
     '    def s(obj):\n        a = 1\n        b = 2\n    c = 3\n'),
    ('def f():\n    x = 1\ny = 2\n',
     'def f():\n    x = 1\n    \ny = 2\n'),
    ('def f():\n    x = 1\n\n        y = 2\n', 'def f():\n    x = 1\n\n'),
    ('class A:\n    x = 1\n', 'class A:\n# note\n    x = 1\n'),
    ('def f():\n    x = 1\n# c\n    y = 2\nz = 3\n', 'def f():\n    x = 1\n# c\nz = 3\n'),
    ('def f():\n    x = 1\n', 'def f():\n    x = 1\n# end\n'),
]
# Several changes in one call.
kBatchScenarios = [
    ('import os\n\ndef f():\n' + _Body('a', 30) + 'def f():\n' + _Body('b', 30) + '    return b1\n',
     'import os\ndef f(): pass\n\ndef f():\n' + _Body('a', 30) + 'def f():\n' + _Body('b', 30) +
     '    return b2\n'),
    ('class A:\n' + ''.join('    def %s(self):\n        pass\n' % n for n in 'fgf'),
     'class A:\n' + ''.join('    def %s(self):\n        pass\n' % n for n in 'ggg')),
]


class ScenarioTest(unittest.TestCase):

    def testHandWrittenEditsAgree(self):
        failures = []
        for i, (old, new) in enumerate(kScenarios + kBatchScenarios):
            if i >= len(kScenarios):
                self.assertGreater(len(replay.SplicesBetween(old, new)), 1, i)
            outcome = replay.CheckPair(old, new, cache_check=True)
            if outcome.problems.invariant is not None:
                edit = ', '.join(s.Describe() for s in outcome.splices)
                failures.append('\n'.join(['scenario %d: %s' % (i, edit)] + outcome.problems.Lines(8)))
        self.assertEqual([], failures, '\n\n'.join(failures))


if __name__ == '__main__':
    unittest.main()
