"""The editor protocol, and edits replayed through CChangeFinder agreeing
with a fresh whole-file pass."""

import os
import subprocess
import sys
import tempfile
import unittest

from support import SANITIZED, CChangeFinder, Read, kDefKind
from replaykit import checks, cli, editor, repro  # tools/ is on the path through support
from replaykit.editor import ReadSteps, Splice


def Edit(text, splices, cache_check=False, finder_class=CChangeFinder):
    doc = checks.LiveDocument(text, cache_check, finder_class)
    before = list(doc.lst)
    return doc, before, doc.Edit(splices, ReadSteps(doc.lines, splices))


class LazyFinder(object):
    """Leaves the names alone after an edit that adds a def line."""

    def __init__(self, lst):
        self.lst, self.real = lst, CChangeFinder(lst)

    def FindChanges(self, added, removed):
        if len(added) != len(self.lst) and any(l.fKind == kDefKind for l in added):
            return set(), set(), set()
        return self.real.FindChanges(added, removed)


class ForgetfulFinder(LazyFinder):
    """Names everything right but reports no changed function scopes."""

    def FindChanges(self, added, removed):
        contents, classes, functions = self.real.FindChanges(added, removed)
        if len(added) != len(self.lst):
            return set([''] if '' in contents else []), classes, set()
        return contents, classes, functions


def Fields(lst):
    return [(l.fTokens, l.fLineno, l.fIndent, l.fKind) for l in lst]


class EditorProtocolTest(unittest.TestCase):
    """A clean replay proves something only if the tools and the tests edit as
    an editor does, and the tool catches wrong finders."""

    def testPrefixAndSuffixStayAndTheMiddleIsReplaced(self):
        lst = Read('x = (1,\n     2)\ny = 2\nz = 3\n')
        before = list(lst)
        # The first logical reads the same but is one line shorter: the line
        # numbers of a kept prefix never change, so y is replaced too.
        added, removed = editor.Edit(lst, 'x = (1, 2)\ny = 2\nw = 0\nz = 3\n')
        self.assertEqual(Fields(lst), Fields(Read('x = (1, 2)\ny = 2\nw = 0\nz = 3\n')))
        self.assertEqual([any(l is b for b in before) for l in lst], [True, False, False, True])
        self.assertEqual((removed, added), ([before[1]], lst[1:3]))

    def testBatchReportsEachLogicalOnceWithItsLastLineNumber(self):
        text = 'class A:\n    def f(self):\n        x = 1\n\ny = 2\n'
        doc, before, outcome = Edit(text, [Splice(1, 0, ['    # c', '']), Splice(4, 1, ['        x = 12']),
                                           Splice(1, 1, ['    # d'])])
        self.assertEqual(Fields(doc.lst), Fields(Read(doc.text)))
        self.assertEqual([any(l is b for b in before) for l in doc.lst], [True, False, False, True, False, True, True])
        # x = 1 moved two lines down before its own change; `# c` came and went.
        self.assertEqual([(l.fLineno, l.fTokens) for l in outcome.removed], [(5, ('x', '=', '1'))])
        self.assertEqual([l.fTokens for l in outcome.added], [(), ('x', '=', '12'), ('# d',)])
        self.assertEqual(outcome.problems.invariant, None)

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

    def testReproducerReplaysTheEditThroughTheSameHelpers(self):
        text = 'class A:\n    def f(self):\n        x = 1\n    y = 2\n'
        where = tempfile.mkdtemp()
        path, note = repro.WriteReproducer(where, 'r', text, [Splice(2, 1, [])], 'cache', True, 'here',
                                           ForgetfulFinder)
        self.assertIn('shrunk', note)
        # The real finder agrees, so the reproducer passes.
        proc = subprocess.Popen([sys.executable, path], stdout=subprocess.PIPE, env=dict(os.environ))
        self.assertEqual((proc.communicate()[0].splitlines()[-1:], proc.returncode), ([b'no disagreements'], 0))
        os.remove(path)
        os.rmdir(where)


class StdlibReplayTest(unittest.TestCase):

    def testSeededEditsOnAFixedSampleAgree(self):
        files, edits = (8, 80) if SANITIZED else (16, 150)
        paths = cli.SampleFiles(cli.StdlibFiles(), files, 'test_replay', max_lines=1500)
        self.assertEqual(len(paths), files)
        log = tempfile.TemporaryFile('w+')
        summary = cli.RunReplay(paths, seed='test_replay', edits_per_file=edits, batch_fraction=0.2,
                                cache_check=True, repro_dir=None, quiet=True, out=log)
        log.seek(0)
        self.assertGreaterEqual(summary['edits'], files * edits * 9 // 10)
        self.assertGreater(summary['batches'], 0)
        self.assertFalse(cli.Failed(summary), log.read()[:6000])


def Body(name, count):
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
    ('def f():\n' + Body('a', 40) + 'def f():\n' + Body('b', 40),
     'def f():\n    pass\ndef f():\n' + Body('a', 40) + 'def f():\n' + Body('b', 40)),
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
    # A forward scan stops at an added logical not visited yet; a rename
    # reaches past comments that sit in the parent.
    ('def f():\n    a = 1\n    b = 2\n', 'def g():\n    a = 1\n    c = 9\n    b = 2\n'),
    ('def f():\n    x = 1\n# c\n        # deep\ny = 2\n',
     'def f():\n    pass\ndef f():\n    x = 1\n# c\n        # deep\ny = 2\n'),
]
# Several changes in one call.
kBatchScenarios = [
    ('import os\n\ndef f():\n' + Body('a', 30) + 'def f():\n' + Body('b', 30) + '    return b1\n',
     'import os\ndef f(): pass\n\ndef f():\n' + Body('a', 30) + 'def f():\n' + Body('b', 30) +
     '    return b2\n'),
    ('class A:\n' + ''.join('    def %s(self):\n        pass\n' % n for n in 'fgf'),
     'class A:\n' + ''.join('    def %s(self):\n        pass\n' % n for n in 'ggg')),
]


class ScenarioTest(unittest.TestCase):

    def testHandWrittenEditsAgree(self):
        failures = []
        for i, (old, new) in enumerate(kScenarios + kBatchScenarios):
            if i >= len(kScenarios):
                self.assertGreater(len(checks.SplicesBetween(old, new)), 1, i)
            outcome = checks.CheckPair(old, new, cache_check=True)
            if outcome.problems.invariant is not None:
                edit = ', '.join(s.Describe() for s in outcome.splices)
                failures.append('\n'.join(['scenario %d: %s' % (i, edit)] + outcome.problems.Lines(8)))
        self.assertEqual([], failures, '\n\n'.join(failures))


if __name__ == '__main__':
    unittest.main()
