"""The whole-file pass against the `ast` module, on the standard library and
on small sources that pin down each naming rule."""

import ast
import os
import sys
import textwrap
import unittest
from cStringIO import StringIO

_kRepoDir = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
sys.path.insert(0, os.path.join(_kRepoDir, 'tools'))

import crosscheck_ast  # noqa: E402
from pysource._fastaccess import LogicalLineType  # noqa: E402
from pysource.logicals import ReadLogicals  # noqa: E402
from pysource.scopebodycache import CChangeFinder  # noqa: E402

kSanitized = bool(os.environ.get('SBC_SANITIZED'))
kBigFiles = ['decimal.py', 'inspect.py', 'pydoc.py', os.path.join('test', 'test_descr.py')]


def StdlibSample():
    """A fixed sample: every Nth file of the sorted library plus some big ones."""
    root = crosscheck_ast.StdlibDir()
    paths = crosscheck_ast.StdlibFiles(root)
    count = 12 if kSanitized else 40
    sample = paths[::max(1, len(paths) // count)][:count]
    big = kBigFiles[:1] if kSanitized else kBigFiles
    return sample + [os.path.join(root, name) for name in big]


def Pass(source):
    lst = ReadLogicals(textwrap.dedent(source))
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def Names(source):
    """{lineno: (fScopeName, fLocalScopeName)} after a whole-file pass."""
    return dict((l.fLineno, (l.fScopeName, l.fLocalScopeName)) for l in Pass(source))


def Scopes(source):
    return dict((l.fLineno, l.fScopeName) for l in Pass(source))


class StdlibTest(unittest.TestCase):

    def testSampleAgreesWithAst(self):
        files = logicals = 0
        found = []
        for path in StdlibSample():
            checked, disagreements = crosscheck_ast.check_file(path, whitespace=True)
            if checked:
                files += 1
            logicals += checked
            found.extend(disagreements)
        self.assertEqual([], [repr(d) for d in found[:20]])
        # A sample that parses nothing would agree vacuously.
        self.assertGreater(files, 10)
        self.assertGreater(logicals, 5000)

    def testMainReportsCountsAndExitStatus(self):
        path = os.path.join(crosscheck_ast.StdlibDir(), 'bisect.py')
        saved, sys.stdout = sys.stdout, StringIO()
        try:
            status = crosscheck_ast.main([path])
        finally:
            out, sys.stdout = sys.stdout.getvalue(), saved
        self.assertEqual(0, status)
        self.assertIn('files checked: 1 ', out)
        self.assertIn('disagreements: 0 ', out)

    def testRefusedFileIsSkipped(self):
        path = os.path.join(crosscheck_ast.StdlibDir(), 'lib2to3', 'tests', 'data',
                            'py3_test_grammar.py')
        if not os.path.exists(path):
            self.skipTest('no Python 3 grammar sample in this library')
        self.assertEqual((0, []), crosscheck_ast.check_file(path))


class CheckerCatchesFaultsTest(unittest.TestCase):
    """The oracle must notice wrong names, or its silence proves nothing."""

    kSource = textwrap.dedent('''\
        class A(object):
            @staticmethod
            def f():
                try:
                    pass
                except ValueError:
                    def f():
                        pass
                else:
                    x = 1
            def f(self):
                """Doc
                string."""
        ''')

    def Compare(self, mutate):
        lst = ReadLogicals(self.kSource)
        CChangeFinder(lst).FindChanges(lst, [])
        mutate(lst)
        return crosscheck_ast.CompareWithAst(lst, ast.parse(self.kSource), whitespace=True)[1]

    def testCorrectNamesGiveNothing(self):
        self.assertEqual([], self.Compare(lambda lst: None))

    def testEachWrongFieldIsReported(self):
        def Corrupt(lineno, field, value):
            def Mutate(lst):
                logical = [l for l in lst if l.fLineno == lineno][0]
                setattr(logical, field, value)
            found = self.Compare(Mutate)
            # A def's full name goes wrong with its scope name: same line.
            self.assertEqual([lineno], sorted(set(d.lineno for d in found)), found)
            self.assertEqual(value, found[0].actual)
        Corrupt(2, 'fScopeName', 'A#0.f#0')       # a decorator belongs outside the def
        Corrupt(3, 'fLocalScopeName', 'f#1')
        Corrupt(7, 'fLocalScopeName', 'f#1')      # counted per containing scope
        Corrupt(9, 'fScopeName', 'A#0.f#0.f#0')   # `else:` belongs to the try
        Corrupt(12, 'fScopeName', 'A#0')          # a multi-line docstring's first line
        Corrupt(11, 'fScopeName', '')


class NestingTest(unittest.TestCase):

    def testStatementsTakeTheInnermostClassOrDef(self):
        names = Names('''\
            x = 1
            class A:
                y = 2
                class B(object):
                    def m(self):
                        def inner():
                            return 3
                        return inner
                z = 4
            w = 5
            ''')
        self.assertEqual({
            1: ('', None), 2: ('', 'A#0'), 3: ('A#0', None), 4: ('A#0', 'B#0'),
            5: ('A#0.B#0', 'm#0'), 6: ('A#0.B#0.m#0', 'inner#0'),
            7: ('A#0.B#0.m#0.inner#0', None), 8: ('A#0.B#0.m#0', None),
            9: ('A#0', None), 10: ('', None)}, names)

    def testSiblingScopesAndOneLineBodies(self):
        scopes = Scopes('''\
            def f(): return 1
            def g():
                if x: return 2
                for i in y:
                    pass
                else:
                    pass
            class C: pass
            ''')
        self.assertEqual({1: '', 2: '', 3: 'g#0', 4: 'g#0', 5: 'g#0', 6: 'g#0',
                          7: 'g#0', 8: ''}, scopes)

    def testClauseHeadersStayInTheStatementsScope(self):
        source = '''\
            def f():
                try:
                    def g():
                        pass
                except (IOError,
                        OSError):
                    pass
                finally:
                    pass
                while 1:
                    class K:
                        pass
                else:
                    pass
                with a as b:
                    pass
            '''
        scopes = Scopes(source)
        for lineno in (5, 8, 13, 15):
            self.assertEqual('f#0', scopes[lineno], lineno)
        self.assertEqual([], crosscheck_ast.check_source(textwrap.dedent(source))[1])


class RepeatedDefinitionsTest(unittest.TestCase):

    def testNumberedPerContainingScope(self):
        names = Names('''\
            def f(): pass
            class A:
                def f(self): pass
                def f(self): pass
                def g(self):
                    def f(): pass
                def f(self): pass
            def f(): pass
            def f(): pass
            ''')
        locals_ = dict((n, v[1]) for n, v in names.items())
        self.assertEqual(['f#0', 'f#0', 'f#1', 'f#0', 'f#2', 'f#1', 'f#2'],
                         [locals_[n] for n in (1, 3, 4, 6, 7, 8, 9)])
        self.assertEqual('A#0.g#0', names[6][0])

    def testClassAndDefOfOneNameShareACounter(self):
        names = Names('''\
            class X: pass
            def X(): pass
            class X:
                def X(self): pass
                class X: pass
            ''')
        self.assertEqual(['X#0', 'X#1', 'X#2', 'X#0', 'X#1'],
                         [names[n][1] for n in range(1, 6)])
        self.assertEqual('X#2', names[4][0])

    def testBodiesOfRepeatedDefinitionsAreKeptApart(self):
        scopes = Scopes('''\
            class P(object):
                @property
                def v(self):
                    return self._v
                @v.setter
                def v(self, value):
                    self._v = value
            ''')
        self.assertEqual({1: '', 2: 'P#0', 3: 'P#0', 4: 'P#0.v#0', 5: 'P#0', 6: 'P#0',
                          7: 'P#0.v#1'}, scopes)


class DecoratorTest(unittest.TestCase):

    def testDecoratorLinesBelongToTheEnclosingScope(self):
        source = '''\
            class A:
                @one
                # between decorators
                @two(lambda x: x,
                     3)

                def f(self):
                    @three
                    class B: pass
            '''
        names = Names(source)
        self.assertEqual(('A#0', None), names[2])
        self.assertEqual(('A#0', None), names[4])
        self.assertEqual(('A#0', 'f#0'), names[7])
        self.assertEqual(('A#0.f#0', None), names[8])
        self.assertEqual(('A#0.f#0', 'B#0'), names[9])
        self.assertEqual([], crosscheck_ast.check_source(textwrap.dedent(source),
                                                         whitespace=True)[1])


class WhitespacePlacementTest(unittest.TestCase):
    """Comments and blank lines: the next code line's scope when indented no
    deeper than it, otherwise decided by the first code line above."""

    def Check(self, source, expected):
        scopes = Scopes(source)
        self.assertEqual(expected, dict((n, scopes[n]) for n in expected))
        self.assertEqual([], crosscheck_ast.check_source(textwrap.dedent(source),
                                                         whitespace=True)[1])

    def testDedentedCommentInsideABodyTakesTheNextLinesScope(self):
        self.Check('''\
            class A:
                def f(self):
                    x = 1
            # at the margin
              # between margins
                    y = 2
            ''', {4: 'A#0.f#0', 5: 'A#0.f#0'})

    def testCommentsBeforeADedent(self):
        self.Check('''\
            def f():
                x = 1

                # deeper than the next code line: stays with x
            # about g
            def g():
                pass
            ''', {3: '', 4: 'f#0', 5: ''})

    def testCommentDeeperThanTheInnermostScope(self):
        self.Check('''\
            def f():
                x = 1
                        # deeper than any code
                y = 2
            def g():
                        # deeper, right after the header
                pass
            ''', {3: 'f#0', 6: 'g#0'})

    def testCommentAfterAHeaderAtTheHeadersIndent(self):
        # Not deeper than the header: the header's own scope, not the one it opens.
        self.Check('''\
            class A:
                def f(self):
                # level with the def
                    pass
            ''', {3: 'A#0.f#0'})
        self.Check('''\
            class A:
                def f(self): pass
                # level with the def, before a dedent
            x = 1
            ''', {3: 'A#0'})

    def testTrailingCommentsActAsIfAModuleLineFollowed(self):
        self.Check('''\
            class A:
                def f(self):
                    pass
                # in A, as the last code sees it
            # module level
                    # deeper again

            ''', {4: 'A#0.f#0', 5: '', 6: 'A#0.f#0', 7: ''})

    def testBlankLinesWithTrailingSpaces(self):
        source = 'def f():\n    x = 1\n        \n    y = 2\n    \nz = 3\n'
        lst = ReadLogicals(source)  # not Pass: dedent would empty the blank lines
        CChangeFinder(lst).FindChanges(lst, [])
        self.assertEqual([8, 4], [l.fIndent for l in lst if l.fKind == 22])
        # Both deeper than the next code line: the code above decides.
        self.assertEqual(['f#0', 'f#0'], [l.fScopeName for l in lst if l.fKind == 22])
        self.assertEqual([], crosscheck_ast.check_source(source, whitespace=True)[1])


class NamelessDefTest(unittest.TestCase):
    """A def line whose name cannot be read opens no scope of its own."""

    def Run(self, specs):
        lst = [LogicalLineType(tokens, n, indent, kind)
               for n, (tokens, indent, kind) in enumerate(specs, 1)]
        CChangeFinder(lst).FindChanges(lst, [])
        return lst

    def testBodyStaysInTheEnclosingScope(self):
        lst = self.Run([
            (['class', 'A', ':'], 0, 1),
            (['def'], 4, 2),
            (['x', '=', '1'], 8, 0),
            (['def', 'g', '(', ')', ':'], 4, 2),
            (['y'], 8, 0),
            (['def'], 0, 2),
            (['z'], 4, 0),
        ])
        self.assertEqual(['', 'A#0', 'A#0', 'A#0', 'A#0.g#0', '', ''],
                         [l.fScopeName for l in lst])
        self.assertEqual('g#0', lst[3].fLocalScopeName)


if __name__ == '__main__':
    unittest.main()
