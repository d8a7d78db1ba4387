"""The fuzzer runs clean on plain editing for a few seconds, and each of its
oracles reports a planted fault with a reproducer that replays it."""

import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest

ROOT = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
FUZZ = os.path.join(ROOT, 'tools', 'fuzz.py')
SANITIZED = bool(os.environ.get('SBC_SANITIZED'))


def Fuzz(*args, **kw):
    """(exit status, stdout) of tools/fuzz.py in this interpreter and environment."""
    flags = ['-O'] if kw.get('optimize') else []
    proc = subprocess.Popen([sys.executable] + flags + [FUZZ] + list(args),
                            stdout=subprocess.PIPE, stderr=subprocess.STDOUT, universal_newlines=True)
    out = proc.communicate()[0]
    return proc.returncode, out


sys.path.insert(0, os.path.join(ROOT, 'tools'))
from fuzzkit import texts  # noqa: E402


class EditorModelTest(unittest.TestCase):
    """The fuzzer's editor keeps what an editor keeps; a slip here would show
    up as false names findings."""

    kText = 'class A:\n    def f(self):\n        pass\n# c\nx = 1\n'

    def testSpliceKeepsPrefixAndSuffixObjectsWithNewLineNumbers(self):
        doc = texts.Document(self.kText)
        old = list(doc.lst)
        edit = doc.Apply([texts.Splice(2, 0, ['        y = 2', ''], 'insert')], 'insert')
        self.assertEqual([l.fTokens for l in edit.added], [('y', '=', '2'), ()])
        self.assertEqual(edit.removed, [])
        self.assertTrue(all(a is b for a, b in zip(doc.lst[:2], old[:2])))
        self.assertTrue(all(a is b for a, b in zip(doc.lst[-3:], old[-3:])))
        self.assertEqual([l.fLineno for l in doc.lst], [1, 2, 3, 4, 5, 6, 7])

    def testChangedLineIsReplacedEvenWhenItReadsTheSame(self):
        doc = texts.Document(self.kText)
        old = doc.lst[4]
        edit = doc.Apply([texts.Splice(4, 1, ['x =  1'], 'type')], 'type')
        self.assertEqual(edit.removed, [old])
        self.assertIsNot(doc.lst[4], old)

    def testBatchDropsWhatOneSubEditAddsAndALaterOneRemoves(self):
        doc = texts.Document(self.kText)
        edit = doc.Apply([texts.Splice(3, 0, ['z = 0'], 'a'), texts.Splice(3, 1, [], 'b')],
                         'batch')
        self.assertEqual((edit.added, edit.removed), ([], []))
        self.assertEqual(doc.text, self.kText)

    def testUndoPutsBackTheRemovedObjects(self):
        doc = texts.Document(self.kText)
        old = list(doc.lst)
        doc.Apply([texts.Splice(1, 2, [], 'delete')], 'delete')
        edit = doc.Undo()
        self.assertEqual(doc.text, self.kText)
        self.assertTrue(all(a is b for a, b in zip(doc.lst, old)))
        self.assertEqual([l.fLineno for l in doc.lst], [1, 2, 3, 4, 5])
        self.assertEqual(len(edit.added), 2)


class FuzzSmokeTest(unittest.TestCase):

    def setUp(self):
        self.reports = tempfile.mkdtemp(prefix='fuzz-smoke-')
        self.addCleanup(shutil.rmtree, self.reports)

    def Run(self, *args, **kw):
        return Fuzz('--report-dir', self.reports, *args, **kw)

    def Report(self):
        names = sorted(os.listdir(self.reports))
        self.assertEqual(len(names), 1, names)
        with open(os.path.join(self.reports, names[0])) as f:
            return f.read()

    def testPlainEditingRunsClean(self):
        for optimize in (False, True):
            status, out = self.Run('--seconds', '2' if SANITIZED else '4', '--seed', 'smoke',
                                   '--profile', 'edits', '--known', optimize=optimize)
            self.assertEqual(status, 0, out)
            self.assertIn('no findings', out)
            calls = re.search(r'FindChanges\[edit\]\s+(\d+) returned', out)
            self.assertTrue(calls and int(calls.group(1)) > 0, out)

    def testEpisodeReplaysTheSameCalls(self):
        logs = []
        for _ in range(2):
            status, out = self.Run('--seed', '7', '--episode', '3', '--profile', 'mixed',
                                   '--known')
            logs.append(out[out.index('call log:'):])
        self.assertEqual(logs[0], logs[1])
        self.assertGreater(logs[0].count('\n'), 20)

    def Planted(self, plant, kind, *extra):
        status, out = self.Run('--seed', '5', '--episode', '2', '--profile', 'edits',
                               '--plant', plant, *extra)
        self.assertEqual(status, 1, out)
        self.assertIn('FINDING 1: %s in episode 2' % kind, out)
        report = self.Report()
        self.assertIn('replay: ', report)
        self.assertIn('--seed 5 --episode 2', report)
        return report

    def testCrashIsReportedWithTheCallLog(self):
        report = self.Planted('crash', 'crash')
        self.assertIn('killed by signal', report)
        self.assertIn('# action 1: Plant', report)

    def testHangIsReported(self):
        self.Planted('hang', 'hang', '--episode-timeout', '3')

    def testStuckFinderIsReported(self):
        self.assertIn('refuses every FindChanges', self.Planted('stuck', 'stuck'))

    def testNamesFindingCarriesAScriptThatFails(self):
        report = self.Planted('names', 'names')
        script = report.split('standalone script (the list right before the call):\n', 1)[1]
        script = script.split('\ncall log of the episode:', 1)[0]
        path = os.path.join(self.reports, 'repro.py')
        with open(path, 'w') as f:
            f.write(script)
        proc = subprocess.Popen([sys.executable, path], stdout=subprocess.PIPE,
                                stderr=subprocess.STDOUT, universal_newlines=True)
        out = proc.communicate()[0]
        self.assertEqual(proc.returncode, 1, out)
        self.assertIn("got ('planted', None)", out)

    def testGrowthIsFoundByTheLeakProbe(self):
        status, out = self.Run('--seed', '5', '--episode', '2', '--profile', 'edits',
                               '--plant', 'leak', '--leak-probe')
        self.assertEqual(status, 1, out)
        self.assertIn('leak', out)
        self.assertIn('list', self.Report())


if __name__ == '__main__':
    unittest.main()
