"""The whole-file pass against the `ast` module: on the standard library and
on small sources that pin down each naming rule."""

import ast
import os
import sys
import unittest
from textwrap import dedent as D

from support import SANITIZED, Named, ReadLogicals, WholePass
import crosscheck_ast  # tools/ is on the path through support

# 3.x's decimal.py is a stub over the one written in Python.
kBigFiles = ['decimal.py' if sys.version_info[0] == 2 else '_pydecimal.py', 'inspect.py', 'pydoc.py',
             os.path.join('test', 'test_descr.py')]


class StdlibTest(unittest.TestCase):

    def testSampleAgreesWithAst(self):
        root = crosscheck_ast.StdlibDir()
        paths = crosscheck_ast.StdlibFiles(root)
        count = 12 if SANITIZED else 40
        sample = paths[::max(1, len(paths) // count)][:count]
        sample += [os.path.join(root, name) for name in kBigFiles[:1 if SANITIZED else None]]
        files = logicals = 0
        found = []
        for path in sample:
            checked, disagreements = crosscheck_ast.CheckFile(path, whitespace=True)
            files += bool(checked)
            logicals += checked
            found.extend(disagreements)
        self.assertEqual([], [repr(d) for d in found[:20]])
        # A sample that parses nothing would agree vacuously.
        self.assertGreater(files, 10)
        self.assertGreater(logicals, 5000)

    def testCheckerCatchesAPlantedWrongName(self):
        source = 'class A(object):\n    @staticmethod\n    def f():\n        pass\n'
        lst = Named(source)
        self.assertEqual([], crosscheck_ast.CompareWithAst(lst, ast.parse(source), whitespace=True)[1])
        lst[1].fScopeName = 'A#0.f#0'  # a decorator belongs outside the def
        found = crosscheck_ast.CompareWithAst(lst, ast.parse(source), whitespace=True)[1]
        self.assertEqual([(2, 'A#0.f#0')], [(d.lineno, d.actual) for d in found])


# (source, {lineno: fScopeName or (fScopeName, fLocalScopeName)}); every
# source also agrees with the ast, comments and blank lines included.
kSources = [
    (D('''\
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
        '''), {1: ('', None), 2: ('', 'A#0'), 3: ('A#0', None), 4: ('A#0', 'B#0'), 5: ('A#0.B#0', 'm#0'),
               6: ('A#0.B#0.m#0', 'inner#0'), 7: ('A#0.B#0.m#0.inner#0', None), 8: ('A#0.B#0.m#0', None),
               9: ('A#0', None), 10: ('', None)}),
    # Clause headers stay in the statement's scope.
    (D('''\
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
        '''), {5: 'f#0', 8: 'f#0', 13: 'f#0', 15: 'f#0'}),
    # Repeated names are numbered per containing scope.
    (D('''\
        def f(): pass
        class A:
            def f(self): pass
            def f(self): pass
            def g(self):
                def f(): pass
            def f(self): pass
        def f(): pass
        def f(): pass
        '''), {1: ('', 'f#0'), 3: ('A#0', 'f#0'), 4: ('A#0', 'f#1'), 6: ('A#0.g#0', 'f#0'),
               7: ('A#0', 'f#2'), 8: ('', 'f#1'), 9: ('', 'f#2')}),
    ('class X: pass\ndef X(): pass\nclass X:\n    def X(self): pass\n    class X: pass\n',
     {1: ('', 'X#0'), 2: ('', 'X#1'), 3: ('', 'X#2'), 4: ('X#2', 'X#0'), 5: ('X#2', 'X#1')}),
    (D('''\
        class A:
            @one
            # between decorators
            @two(lambda x: x,
                 3)

            def f(self):
                @three
                class B: pass
        '''), {2: ('A#0', None), 4: ('A#0', None), 7: ('A#0', 'f#0'), 8: ('A#0.f#0', None),
               9: ('A#0.f#0', 'B#0')}),
    # Comments and blank lines: the next code line's scope when indented no
    # deeper than it, otherwise decided by the first code line above.
    ('class A:\n    def f(self):\n        x = 1\n# at the margin\n  # between margins\n        y = 2\n',
     {4: 'A#0.f#0', 5: 'A#0.f#0'}),
    (D('''\
        def f():
            x = 1

            # deeper than the next code line: stays with x
        # about g
        def g():
            pass
        '''), {3: '', 4: 'f#0', 5: ''}),
    (D('''\
        def f():
            x = 1
                    # deeper than any code
            y = 2
        def g():
                    # deeper, right after the header
            pass
        '''), {3: 'f#0', 6: 'g#0'}),
    # Level with a header: the header's own scope, not the one it opens.
    ('class A:\n    def f(self):\n    # level with the def\n        pass\n', {3: 'A#0.f#0'}),
    ('class A:\n    def f(self): pass\n    # level with the def, before a dedent\nx = 1\n', {3: 'A#0'}),
    # Trailing comments act as if a module-level line followed.
    (D('''\
        class A:
            def f(self):
                pass
            # in A, as the last code sees it
        # module level
                # deeper again

        '''), {4: 'A#0.f#0', 5: '', 6: 'A#0.f#0', 7: ''}),
    # Blank lines with trailing spaces, deeper than the next code line.
    ('def f():\n    x = 1\n        \n    y = 2\n    \nz = 3\n', {3: 'f#0', 5: 'f#0'}),
]


class HandWrittenSourcesTest(unittest.TestCase):

    def testNames(self):
        for i, (source, expected) in enumerate(kSources):
            lst = ReadLogicals(source)
            WholePass(lst)
            got = dict((l.fLineno, (l.fScopeName, l.fLocalScopeName)) for l in lst)
            for lineno, want in expected.items():
                self.assertEqual(got[lineno] if isinstance(want, tuple) else got[lineno][0], want,
                                 'source %d, line %d' % (i, lineno))
            self.assertEqual([], crosscheck_ast.CheckSource(source, whitespace=True)[1], i)


if __name__ == '__main__':
    unittest.main()
