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
                            stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    out = proc.communicate()[0]
    return proc.returncode, out


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
                                stderr=subprocess.STDOUT)
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
