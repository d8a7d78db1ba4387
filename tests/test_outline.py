"""The scope outline tool, run as a user runs it."""

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
from cStringIO import StringIO

_kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
kTool = os.path.join(_kRepoDir, 'tools', 'outline.py')
kSample = os.path.join(_kRepoDir, 'samples', 'outline_sample.py')
sys.path.insert(0, os.path.join(_kRepoDir, 'tools'))

import outline  # noqa: E402
from pysource.scopebodycache import CScopeBodyCache  # noqa: E402

kHasBodyCache = hasattr(CScopeBodyCache, 'GetScopeDef')


def Run(*args, **kw):
    """(exit status, stdout, stderr) of the tool."""
    env = dict(os.environ)
    env.update(kw.get('env', {}))
    proc = subprocess.Popen([sys.executable, kTool] + list(args), env=env,
                            stdout=subprocess.PIPE, stderr=subprocess.PIPE, cwd=_kRepoDir)
    out, err = proc.communicate()
    return proc.returncode, out, err


def OutlineRows(out):
    """[(lineno, depth, keyword, local name, full name)] of the outline table."""
    rows = []
    for line in out.splitlines():
        m = re.match(r'^ *(\d+)  ( *)(class|def) (\S+) +(\S+)$', line)
        if m:
            rows.append((int(m.group(1)), len(m.group(2)) // 2, m.group(3), m.group(4),
                         m.group(5)))
        elif rows:
            break  # the outline ends at the first line that is no row
    return rows


class TempFileTest(unittest.TestCase):

    def setUp(self):
        self.dir = tempfile.mkdtemp()

    def tearDown(self):
        shutil.rmtree(self.dir)

    def Write(self, text, name='mod.py'):
        path = os.path.join(self.dir, name)
        with open(path, 'w') as f:
            f.write(textwrap.dedent(text))
        return path


class SampleTest(unittest.TestCase):

    def setUp(self):
        status, self.out, err = Run()
        self.assertEqual((0, ''), (status, err))
        self.rows = OutlineRows(self.out)

    def testSampleIsValidAndOutlinedByDefault(self):
        with open(kSample) as f:
            tree = ast.parse(f.read())
        defs = [n for n in ast.walk(tree) if isinstance(n, (ast.ClassDef, ast.FunctionDef))]
        self.assertEqual(len(defs), len(self.rows))
        self.assertIn('outline_sample.py', self.out.splitlines()[0])

    def testSampleShowsRepeatedAndNestedDefinitions(self):
        locals_ = [r[3] for r in self.rows]
        depths = [r[1] for r in self.rows]
        # What the sample exists to show; a rewrite must keep it.
        self.assertTrue(any(name.endswith('#2') for name in locals_))
        self.assertGreaterEqual(max(depths), 2)
        self.assertTrue(any(r[2] == 'class' and r[1] >= 1 for r in self.rows))

    def testRowsAreInLineOrderAndConsistent(self):
        self.assertEqual(sorted(r[0] for r in self.rows), [r[0] for r in self.rows])
        for lineno, depth, _, local, full in self.rows:
            self.assertTrue(full.endswith(local), full)
            self.assertEqual(depth, full.count('.'), full)


class OutlineTest(TempFileTest):

    def testNamesIndicesNestingAndLineNumbers(self):
        path = self.Write('''\
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
            ''')
        status, out, err = Run(path)
        self.assertEqual((0, ''), (status, err))
        self.assertEqual([
            (3, 0, 'class', 'Outer#0', 'Outer#0'),
            (4, 1, 'class', 'Inner#0', 'Outer#0.Inner#0'),
            (5, 2, 'def', 'method#0', 'Outer#0.Inner#0.method#0'),
            (6, 3, 'def', 'helper#0', 'Outer#0.Inner#0.method#0.helper#0'),
            (9, 1, 'def', 'method#0', 'Outer#0.method#0'),
            (13, 0, 'def', 'Outer#1', 'Outer#1'),
        ], OutlineRows(out))
        self.assertIn('14 logicals, 2 classes, 4 defs', out.splitlines()[0])

    def testFileWithoutDefinitionsHasAnEmptyOutline(self):
        status, out, err = Run(self.Write('x = 1\n'))
        self.assertEqual((0, ''), (status, err))
        self.assertEqual([], OutlineRows(out))

    def testEmptyFile(self):
        status, out, _ = Run(self.Write(''))
        self.assertEqual(0, status)
        self.assertIn('0 logicals', out)


class LogicalsTest(TempFileTest):

    def testEveryLogicalWithKindAndNames(self):
        path = self.Write('''\
            class A:
                # note
                def f(self): return 1

            x = f(*a, **k)
            ''')
        status, out, _ = Run(path, '--logicals')
        self.assertEqual(0, status)
        table = out[out.index(' line  kind'):].splitlines()[1:]
        rows = [re.split(r'\s{2,}', line.strip()) for line in table]
        self.assertEqual([
            ['1', 'class', "''", 'A#0', 'class A:'],
            ['2', 'comment', "'A#0'", '# note'],
            ['3', 'def', "'A#0'", 'f#0', 'def f(self): return 1'],
            ['4', 'blank', "''"],
            ['5', 'code', "''", 'x = f(*a, **k)'],
        ], rows)

    def testWithoutTheFlagNoLogicalsTable(self):
        _, out, _ = Run(self.Write('x = 1\n'))
        self.assertNotIn(' line  kind', out)


class JoinTokensTest(unittest.TestCase):

    def testSpacingReadsLikeSource(self):
        cases = [
            (['x', '=', 'a', '.', 'b', '(', '1', ',', '2', ')', '[', '0', ']'], 'x = a.b(1, 2)[0]'),
            (['def', 'f', '(', '*', 'a', ',', '**', 'k', ')', ':'], 'def f(*a, **k):'),
            (['y', '=', 'a', '*', 'b', '**', '2'], 'y = a * b ** 2'),
            (['print', '(', 'x', ')'], 'print (x)'),
            (['@', 'p', '.', 'setter'], '@p.setter'),
            (['def', 'g', '(', 'a', '=', '1', ')', ':', 'b', '=', 'g', '(', 'a', '=', '2', ')'],
             'def g(a=1): b = g(a=2)'),
        ]
        for tokens, text in cases:
            self.assertEqual(text, outline.JoinTokens(tokens))


@unittest.skipUnless(kHasBodyCache, 'CScopeBodyCache.GetScopeDef not available yet')
class ScopeTest(TempFileTest):

    kSource = '''\
        class A:
            def f(self):
                x = 1
                def g():
                    pass
                return g
            def f(self):
                pass
        '''

    def testDefiningLineAndBody(self):
        status, out, err = Run(self.Write(self.kSource), '--scope', 'A#0.f#0')
        self.assertEqual((0, ''), (status, err))
        section = out[out.index("scope 'A#0.f#0'"):].splitlines()
        self.assertIn('defined at line 2: def f(self):', section[0])
        self.assertEqual(['3', '4', '6'], [line.split()[0] for line in section[1:]])
        self.assertIn('return g', section[-1])

    def testModuleScopeAndRepeatedOption(self):
        status, out, _ = Run(self.Write(self.kSource), '--scope', '', '--scope', 'A#0.f#1')
        self.assertEqual(0, status)
        self.assertIn("scope '': the module (1 body logicals)", out)
        self.assertIn("scope 'A#0.f#1': defined at line 7", out)

    def testUnknownNameIsAnError(self):
        status, out, err = Run(self.Write(self.kSource), '--scope', 'A#0.h#0')
        self.assertEqual(1, status)
        self.assertEqual("error: No logical found for scope name: 'A#0.h#0'\n", err)
        self.assertIn('class A#0', out)  # the outline still came first


class ErrorTest(TempFileTest):

    def AssertError(self, args, pattern):
        status, out, err = Run(*args)
        self.assertEqual(1, status)
        self.assertNotIn('Traceback', err)
        self.assertRegexpMatches(err, pattern)
        self.assertEqual(1, len(err.splitlines()), err)

    def testUntokenizableFiles(self):
        path = self.Write('def f():\n    x = (1,\n')
        self.AssertError([path], r'^error: %s:\d+: EOF in multi-line statement$'
                         % re.escape(path))
        path = self.Write('s = """open\n', 'string.py')
        self.AssertError([path], r'^error: %s:1: EOF in multi-line string$' % re.escape(path))

    def testInconsistentDedentNamesItsLine(self):
        path = self.Write('if x:\n        a\n    b\n')
        self.AssertError([path], r'^error: %s:3: unindent does not match' % re.escape(path))

    def testMissingFile(self):
        path = os.path.join(self.dir, 'absent.py')
        self.AssertError([path], r'^error: %s: No such file or directory$' % re.escape(path))

    def testDirectoryIsNotAFile(self):
        self.AssertError([self.dir], r'^error: %s: ' % re.escape(self.dir))


class ReplayTest(unittest.TestCase):
    """--replay hands everything after it to replay.main."""

    def setUp(self):
        self.calls = []
        fake = types.ModuleType('replay')
        fake.main = lambda argv: self.calls.append(argv) or 7
        self.saved = sys.modules.get('replay')
        sys.modules['replay'] = fake

    def tearDown(self):
        if self.saved is None:
            del sys.modules['replay']
        else:
            sys.modules['replay'] = self.saved

    def testArgumentsAndStatusPassThrough(self):
        self.assertEqual(7, outline.main(['--replay', 'a.py', '--scope', 'x']))
        self.assertEqual([['a.py', '--scope', 'x']], self.calls)

    def testReplayMustComeFirst(self):
        saved, sys.stderr = sys.stderr, StringIO()
        try:
            status = outline.main(['a.py', '--replay'])
        finally:
            sys.stderr = saved
        self.assertEqual(2, status)
        self.assertEqual([], self.calls)


class StartupTest(unittest.TestCase):

    @unittest.skipIf(os.environ.get('SBC_SANITIZED'), 'the build dir holds the plain build')
    @unittest.skipUnless(os.path.exists(os.path.join(_kRepoDir, 'build', 'python', 'pysource',
                                                     'scopebodycache.so')), 'no build/ dir')
    def testFindsTheBuildWithoutPythonPath(self):
        env = dict(os.environ)
        env.pop('PYTHONPATH', None)
        proc = subprocess.Popen([sys.executable, kTool], env=env, stdout=subprocess.PIPE,
                                stderr=subprocess.PIPE, cwd='/')
        out, err = proc.communicate()
        self.assertEqual((0, ''), (proc.returncode, err))
        self.assertTrue(OutlineRows(out))


if __name__ == '__main__':
    unittest.main()
