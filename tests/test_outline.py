"""The scope outline tool: its output, options and errors."""

import ast
import os
import re
import shutil
import subprocess
import sys
import tempfile
import textwrap
import types
import unittest

from support import kRepoDir, TextBuffer
import outline  # tools/ is on the path through support
import toolpath
import progress

kTool = os.path.join(kRepoDir, 'tools', 'outline.py')
# The sanitized build is not in build/, where the tool looks by itself.
kFindsBuildItself = not os.environ.get('SBC_SANITIZED') and os.path.exists(
    os.path.join(toolpath.BuildDir(), 'python', 'pysource', 'scopebodycache.so'))


def Main(*args):
    """(exit status, stdout, stderr) of outline.main(args)."""
    saved = sys.stdout, sys.stderr
    sys.stdout, sys.stderr = out, err = TextBuffer(), TextBuffer()
    try:
        status = outline.main(list(args))
    finally:
        sys.stdout, sys.stderr = saved
    return status, out.getvalue(), err.getvalue()


def OutlineRows(out):
    """[(lineno, depth, keyword, local name, full name)] of the outline table."""
    rows = []
    for line in out.splitlines():
        m = re.match(r'^ *(\d+)  ( *)(class|def) (\S+) +(\S+)$', line)
        if m:
            rows.append((int(m.group(1)), len(m.group(2)) // 2, m.group(3), m.group(4), m.group(5)))
        elif rows:
            break  # the outline ends at the first line that is no row
    return rows


class SampleTest(unittest.TestCase):

    def Run(self, *args):
        env = dict(os.environ)
        if kFindsBuildItself:
            env.pop('PYTHONPATH', None)
        return subprocess.Popen([sys.executable, kTool] + list(args), env=env, cwd='/',
                                stdout=subprocess.PIPE, stderr=subprocess.PIPE, universal_newlines=True)

    def testRunAsAScriptOutlinesTheSample(self):
        proc = self.Run()
        out, err = proc.communicate()
        self.assertEqual((0, ''), (proc.returncode, err))
        self.assertIn('outline_sample.py', out.splitlines()[0])
        rows = OutlineRows(out)
        with open(outline.kSamplePath) as f:
            tree = ast.parse(f.read())
        self.assertEqual(len(rows), len([n for n in ast.walk(tree)
                                         if isinstance(n, (ast.ClassDef, ast.FunctionDef))]))
        self.assertEqual(sorted(r[0] for r in rows), [r[0] for r in rows])
        for lineno, depth, _, local, full in rows:
            self.assertTrue(full.endswith(local), full)
            self.assertEqual(depth, full.count('.'), full)
        # What the sample exists to show; a rewrite must keep it.
        self.assertTrue(any(r[3].endswith('#2') for r in rows))
        self.assertGreaterEqual(max(r[1] for r in rows), 2)
        self.assertTrue(any(r[2] == 'class' and r[1] >= 1 for r in rows))

    def testReaderThatStopsEarlyEndsItQuietly(self):
        proc = self.Run('--logicals')
        proc.stdout.close()  # before the tool has written anything
        self.assertEqual(proc.stderr.read(), '')
        proc.wait()


class FileTest(unittest.TestCase):

    def setUp(self):
        self.dir = tempfile.mkdtemp()

    def tearDown(self):
        shutil.rmtree(self.dir)

    def Write(self, text, name='mod.py'):
        path = os.path.join(self.dir, name)
        with open(path, 'w') as f:
            f.write(textwrap.dedent(text))
        return path

    def testOutline(self):
        status, out, err = Main(self.Write('''\
            import os

            class Outer(object):
                class Inner:
                    def method(self):
                        def helper():
                            pass

                def method(self):
                    pass

            @decorate
            def Outer():
                pass
            '''))
        self.assertEqual((0, ''), (status, err))
        self.assertEqual([(3, 0, 'class', 'Outer#0', 'Outer#0'),
                          (4, 1, 'class', 'Inner#0', 'Outer#0.Inner#0'),
                          (5, 2, 'def', 'method#0', 'Outer#0.Inner#0.method#0'),
                          (6, 3, 'def', 'helper#0', 'Outer#0.Inner#0.method#0.helper#0'),
                          (9, 1, 'def', 'method#0', 'Outer#0.method#0'),
                          (13, 0, 'def', 'Outer#1', 'Outer#1')], OutlineRows(out))
        self.assertIn('14 logicals, 2 classes, 4 defs', out.splitlines()[0])
        self.assertNotIn(' line  kind', out)
        status, out, err = Main(self.Write(''))
        self.assertEqual((0, '', []), (status, err, OutlineRows(out)))
        self.assertIn('0 logicals', out)

    def testScopeOption(self):
        path = self.Write('''\
            class A:
                def f(self):
                    x = 1
                    def g():
                        pass
                    return g
                def f(self):
                    pass
            ''')
        status, out, err = Main(path, '--scope', 'A#0.f#0', '--scope', '', '--scope', 'A#0.f#1')
        self.assertEqual((0, ''), (status, err))
        section = out[out.index("scope 'A#0.f#0'"):out.index("scope ''")].strip().splitlines()
        self.assertIn('defined at line 2: def f(self):', section[0])
        self.assertEqual(['3', '4', '6'], [line.split()[0] for line in section[1:]])
        self.assertIn('return g', section[-1])
        self.assertIn("scope '': the module (1 body logicals)", out)
        self.assertIn("scope 'A#0.f#1': defined at line 7", out)
        status, out, err = Main(path, '--scope', 'A#0.h#0')
        self.assertEqual((1, "error: No logical found for scope name: 'A#0.h#0'\n"), (status, err))
        self.assertIn('class A#0', out)  # the outline still came first

    def testErrorsAreOneLine(self):
        for text, name, pattern in [
                ('def f():\n    x = (1,\n', 'a.py', r':\d+: EOF in multi-line statement$'),
                ('if x:\n        a\n    b\n', 'c.py', r':3: unindent does not match'),
                (None, 'absent.py', r': No such file or directory$')]:
            path = self.Write(text, name) if text else os.path.join(self.dir, name)
            status, out, err = Main(path)
            self.assertEqual(1, status, name)
            self.assertTrue(re.match(r'error: %s%s' % (re.escape(path), pattern), err), err)
            self.assertEqual(1, len(err.splitlines()), err)


class ReplayOptionTest(unittest.TestCase):

    def testHandsTheRestToReplayWhenFirst(self):
        calls = []
        fake = types.ModuleType('replay')
        fake.main = lambda argv: calls.append(argv) or 7
        saved = sys.modules.get('replay', fake)
        sys.modules['replay'] = fake
        try:
            self.assertEqual(7, outline.main(['--replay', 'a.py', '--scope', 'x']))
            self.assertEqual(2, Main('a.py', '--replay')[0])
        finally:
            sys.modules['replay'] = saved
        self.assertEqual([['a.py', '--scope', 'x']], calls)


class ProgressTest(unittest.TestCase):

    def testShownOnATerminalOnly(self):
        for isatty in False, True:
            stream = TextBuffer()
            stream.isatty = lambda: isatty
            with progress.Progress(2, 'files', stream) as shown:
                shown.kInterval = 0
                for k in range(2):
                    shown.Step(note='%d edits' % k)
            # Each redraw pads over the line before; the last is wiped.
            self.assertEqual([l.rstrip() for l in stream.getvalue().split('\r')],
                             ['', '1/2 files, 0 edits, 0s elapsed, about 0s left', '2/2 files, 1 edits, 0s elapsed',
                              '', ''] if isatty else [''])


if __name__ == '__main__':
    unittest.main()
