"""Tests of the stand-in sibling modules and of pysource.logicals."""

import ast
import copy
import ctypes
import gc
import glob
import os
import pickle
import sys
import unittest
import weakref

from pysource import _fastaccess, logicals, symbolinfo
from pysource._fastaccess import FindIndexOfLogical, IndexForLineno, LogicalLineType
from tallowkit import destroyable

_GetCapsuleName = ctypes.pythonapi.PyCapsule_GetName
_GetCapsuleName.restype, _GetCapsuleName.argtypes = ctypes.c_char_p, [ctypes.py_object]
_GetCapsulePointer = ctypes.pythonapi.PyCapsule_GetPointer
_GetCapsulePointer.restype = ctypes.c_void_p
_GetCapsulePointer.argtypes = [ctypes.py_object, ctypes.c_char_p]


def Entry(module, name):
    """(signature, address) of one typed entry point."""
    capsule = module._capi[name]
    sig = _GetCapsuleName(capsule)
    return sig, _GetCapsulePointer(capsule, sig)


def Lines(*linenos):
    return [LogicalLineType(['x'], n, 0, 0) for n in linenos]


class SubLogical(LogicalLineType):
    pass


class LogicalRecordTest(unittest.TestCase):

    def testFieldsAndKeywords(self):
        l = LogicalLineType(tokens=('def', 'f'), lineno=7, indent=4, kind=2)
        self.assertEqual((l.fTokens, l.fTokenCount, l.fLineno, l.fIndent, l.fKind),
                         (('def', 'f'), 2, 7, 4, 2))
        self.assertEqual((l.fScopeName, l.fLocalScopeName), (None, None))

    def testRangesAndTypesChecked(self):
        for args, exc in [(('x', 1, 0, 0), TypeError), ((['a', 1], 1, 0, 0), TypeError),
                          (([], 2 ** 31, 0, 0), OverflowError), (([], 1, 2 ** 15, 0), OverflowError),
                          (([], 1, 0, 256), OverflowError), (([], 1, 0, -1), OverflowError),
                          (([], 1.0, 0, 0), TypeError), (([], 1, 0, 2 ** 70), OverflowError)]:
            self.assertRaises(exc, LogicalLineType, *args)
        l = LogicalLineType([], 2 ** 31 - 1, -2 ** 15, 255)
        self.assertRaises(OverflowError, setattr, l, 'fKind', 300)
        self.assertRaises(TypeError, delattr, l, 'fLineno')
        self.assertRaises(AttributeError, setattr, l, 'fTokenCount', 3)
        self.assertEqual((l.fLineno, l.fIndent, l.fKind), (2 ** 31 - 1, -2 ** 15, 255))

    def testScopeNamesCanBeAbsent(self):
        l = LogicalLineType([], 1, 0, 0)
        l.fScopeName, l.fLocalScopeName = 'A#0', ('any', 'object')
        del l.fScopeName
        self.assertEqual((l.fScopeName, l.fLocalScopeName), (None, ('any', 'object')))
        self.assertEqual(l.__reduce__()[2], {'fLocalScopeName': ('any', 'object')})
        del l.fLocalScopeName
        self.assertIsNone(l.__reduce__()[2])

    def testPickleAndCopyKeepFieldsAndSubclass(self):
        l = SubLogical(['class', 'A', ':'], 3, 4, 1)
        l.fLocalScopeName = 'A#0'
        l.extra = [1]
        for clone in (pickle.loads(pickle.dumps(l, 2)), copy.copy(l), copy.deepcopy(l)):
            self.assertIs(type(clone), SubLogical)
            self.assertEqual((clone.fTokens, clone.fLineno, clone.fIndent, clone.fKind),
                             (l.fTokens, 3, 4, 1))
            self.assertEqual((clone.fLocalScopeName, clone.extra), ('A#0', [1]))
            self.assertNotIn('fScopeName', clone.__reduce__()[2])
        plain = pickle.loads(pickle.dumps(LogicalLineType(['x'], 1, 0, 0)))
        self.assertEqual((plain.fTokens, plain.fScopeName), (('x',), None))

    def testRepr(self):
        l = LogicalLineType(['def', 'f', '(', ')', ':'], 3, 4, 2)
        l.fScopeName = 'A#0'
        text = repr(l)
        for part in ('line 3', 'kind 2', 'indent 4', "'def', 'f', '(', ...", "'A#0'"):
            self.assertIn(part, text)

    def testCycleThroughScopeNameIsCollected(self):
        l = SubLogical([], 1, 0, 0)
        l.fScopeName = [l]
        ref = weakref.ref(l)
        del l
        gc.collect()
        self.assertIsNone(ref())


class LookupTest(unittest.TestCase):

    def testFindsThatVeryObject(self):
        lst = Lines(1, 2, 2, 2, 5)
        self.assertEqual([FindIndexOfLogical(lst, l) for l in lst], range(5))
        self.assertEqual(FindIndexOfLogical(lst, Lines(2)[0]), -1)
        self.assertEqual(FindIndexOfLogical(lst, None), -1)
        self.assertEqual(FindIndexOfLogical([1, None, 'a'], None), 1)
        self.assertEqual(FindIndexOfLogical([], lst[0]), -1)
        self.assertRaises(TypeError, FindIndexOfLogical, tuple(lst), lst[0])

    def testOutOfOrderListStillFound(self):
        lst = Lines(9, 3, 7, 1)
        self.assertEqual([FindIndexOfLogical(lst, l) for l in lst], range(4))
        lst.insert(2, 'not a logical')
        self.assertEqual(FindIndexOfLogical(lst, lst[4]), 4)

    def testSearchesByLineNotFromTheStart(self):
        lst = Lines(*range(1, 1001))
        target = lst[499]
        lst.insert(0, target)  # a scan from the start would stop here
        self.assertEqual(FindIndexOfLogical(lst, target), 500)

    def testIndexForLineno(self):
        lst = Lines(2, 4, 4, 9)
        got = [IndexForLineno(lst, n) for n in (-5, 2, 3, 4, 5, 9, 10, 2 ** 40)]
        self.assertEqual(got, [0, 0, 1, 1, 3, 3, 4, 4])
        self.assertEqual(IndexForLineno([], 3), 0)
        with self.assertRaisesRegexp(TypeError, 'Argument must be a logical'):
            IndexForLineno(lst[:2] + [None] + lst[2:], 4)
        self.assertRaises(TypeError, IndexForLineno, lst, '4')


class SymbolInfoTest(unittest.TestCase):

    def testScopeNames(self):
        self.assertEqual(symbolinfo.JoinTwoScopeNames('', 'f'), 'f')
        self.assertEqual(symbolinfo.JoinTwoScopeNames('A#0', 'f'), 'A#0.f')
        self.assertEqual(symbolinfo.SplitScopeNames('A#0.f..g'), ['A#0', 'f', '', 'g'])
        self.assertEqual(symbolinfo.SplitScopeNames(''), [''])
        with self.assertRaisesRegexp(TypeError, "object of type 'NoneType' has no len"):
            symbolinfo.SplitScopeNames(None)
        self.assertRaises(TypeError, symbolinfo.JoinTwoScopeNames, 'A', None)

    def testSuffixes(self):
        Append, Split = symbolinfo.AppendScopeSuffixes, symbolinfo.SplitScopeNameFromSuffixes
        self.assertEqual(Append('f', 3, None), 'f#3')
        self.assertEqual(Append('f', 2 ** 70, '()'), 'f#%d()' % 2 ** 70)
        self.assertRaises(TypeError, Append, 'f', 3, 5)
        self.assertRaises(TypeError, Append, 'f', '3', None)
        for name, want in [('f#12', ('f', 12)), ('f', ('f', -1)), ('f#', ('f#', -1)),
                           ('f#x1', ('f#x1', -1)), ('a#1.b', ('a#1.b', -1)), ('#0', ('', 0)),
                           ('g#2#07', ('g#2', 7)), ('h#%d' % 2 ** 70, ('h', 2 ** 70))]:
            self.assertEqual(Split(name), want, name)
            self.assertEqual(symbolinfo.LeafScopeNameHasIndex(name), want[1] != -1, name)
        self.assertIs(symbolinfo.LeafScopeNameHasIndex(None), False)

    def testConstantsPublishedAsVariables(self):
        kinds = [n for n in symbolinfo._capi if n.endswith('Kind')]
        values = [getattr(symbolinfo, n) for n in kinds]
        self.assertEqual(len(values), 27)
        self.assertEqual(len(set(values)), len(values))
        self.assertTrue(all(chr(v).isalpha() for v in values))
        prefixes = [n for n in symbolinfo._capi if n.endswith('Prefix')]
        self.assertTrue(all(len(getattr(symbolinfo, n)) == symbolinfo.kPrefixLen == 2
                            for n in prefixes))
        self.assertEqual((symbolinfo.kScopeIndexSep, symbolinfo.kModuleScopeName), ('#', ''))
        self.assertEqual(len([n for n in symbolinfo._capi if n.startswith('k')]), 61)
        for name in symbolinfo._capi:
            sig, address = Entry(symbolinfo, name)
            if sig == 'char':
                self.assertEqual(ord(ctypes.c_char.from_address(address).value),
                                 getattr(symbolinfo, name))
            elif sig == 'Py_ssize_t':
                self.assertEqual(ctypes.c_ssize_t.from_address(address).value, 2)
            elif sig == 'PyObject *':
                self.assertIs(ctypes.py_object.from_address(address).value,
                              getattr(symbolinfo, name))

    def testTypedFunctionsMatchPythonLevel(self):
        P = ctypes.py_object
        sig, address = Entry(symbolinfo, 'JoinTwoScopeNames')
        self.assertEqual(sig, 'PyObject *(PyObject *, PyObject *, int)')
        join = ctypes.PYFUNCTYPE(P, P, P, ctypes.c_int)(address)
        self.assertEqual(join('A', 'b', 1), 'A.b')
        self.assertRaises(TypeError, join, 1, 'b', 0)
        append = ctypes.PYFUNCTYPE(P, P, P, P, ctypes.c_int)(Entry(symbolinfo,
                                                                   'AppendScopeSuffixes')[1])
        self.assertEqual(append('f', 1, None, 0), 'f#1')


class OtherSiblingsTest(unittest.TestCase):

    def testPublishedEntries(self):
        address = Entry(_fastaccess, 'LogicalLineType')[1]
        self.assertIs(ctypes.py_object.from_address(address).value, LogicalLineType)
        address = Entry(_fastaccess, '__TimeFunc')[1]
        self.assertIs(ctypes.py_object.from_address(address).value, __import__('time').time)
        self.assertEqual(Entry(destroyable, '_gLogAllEmissions')[0], 'int')
        address = Entry(destroyable, '_gEmissionStack')[1]
        self.assertIs(ctypes.py_object.from_address(address).value, destroyable._gEmissionStack)
        for cls in (_fastaccess.CBytesTokenizer, symbolinfo.CSingleResolvedInfo):
            self.assertIn('__vtable__', cls.__dict__)

    def testDestroyRunsOverrideOnce(self):
        calls = []

        class Thing(destroyable.CDestroyable):
            def __init__(self, tag):
                destroyable.CDestroyable.__init__(self)
                self.tag = tag

            def _destroy_impl(self):
                calls.append(self.tag)
                self.destroy()

        t = Thing('t')
        # Read by getattr: in a class body the names would be mangled.
        fields = (t.IsDestroyed(), getattr(t, '__fDestroyed'), getattr(t, '__fSignalCatchers'))
        self.assertEqual(fields, (False, 0, None))
        t.destroy()
        t.destroy()
        self.assertEqual((calls, t.IsDestroyed()), (['t'], True))
        self.assertRaises(TypeError, destroyable.CDestroyable, 1)
        self.assertRaises(TypeError, setattr, t, '__fSignalCatchers', [])
        self.assertEqual(_GetCapsuleName(destroyable.CDestroyable.__dict__['__vtable__']),
                         'DestroyableVtable')

    def testSignalCatchersCycleCollected(self):
        d = type('D', (destroyable.CDestroyable,), {})()
        setattr(d, '__fSignalCatchers', {'self': d})
        ref = weakref.ref(d)
        del d
        gc.collect()
        self.assertIsNone(ref())


def Read(source):
    return [(l.fLineno, l.fIndent, l.fKind, l.fTokens) for l in logicals.ReadLogicals(source)]


class LogicalsTest(unittest.TestCase):

    def testKindsIndentsAndContinuations(self):
        source = ('@dec\nclass A:  # note\n    # alone\n\n\tdef f(self,\n\n  x):\n'
                  '\t    s = """a\n\nb"""\n\tasync def g(): pass\n  \n')
        self.assertEqual(Read(source), [
            (1, 0, 0, ('@', 'dec')), (2, 0, 1, ('class', 'A', ':', '# note')),
            (3, 4, 21, ('# alone',)), (4, 0, 22, ()),
            (5, 8, 2, ('def', 'f', '(', 'self', ',', 'x', ')', ':')),
            (8, 12, 0, ('s', '=', '"""a\n\nb"""')),
            (11, 8, 2, ('async', 'def', 'g', '(', ')', ':', 'pass')), (12, 2, 22, ())])

    def testEndOfText(self):
        self.assertEqual(Read('x = \\\n  1'), [(1, 0, 0, ('x', '=', '1'))])
        self.assertEqual(Read('x\n\n \t'), [(1, 0, 0, ('x',)), (2, 0, 22, ()), (3, 8, 22, ())])
        self.assertEqual(Read('# c'), [(1, 0, 21, ('# c',))])
        self.assertEqual(Read(''), [])

    def testErrorsCarryLineNumbers(self):
        for source, lineno in [('x = (1,\n\n', 3), ('a\ns = """\n', 2), ('if 1:\n  x\n y\n', 3)]:
            with self.assertRaises(SyntaxError) as cm:
                logicals.ReadLogicals(source)
            self.assertEqual(cm.exception.lineno, lineno)

    def testDefinitionsAgreeWithAst(self):
        lib = os.path.dirname(ast.__file__)
        for path in sorted(glob.glob(os.path.join(lib, '*.py')))[::25]:
            tree = ast.parse(open(path, 'rU').read())
            defs = [n for n in ast.walk(tree) if isinstance(n, (ast.ClassDef, ast.FunctionDef))]
            got = logicals.ReadLogicalsFromFile(path)
            self.assertEqual(len([l for l in got if l.fKind in (1, 2)]), len(defs), path)
            self.assertEqual(sorted(l.fLineno for l in got), [l.fLineno for l in got], path)


class ReferenceLeakTest(unittest.TestCase):

    def testCallsLeakNothing(self):
        lst = Lines(1, 2, 3)
        name, plain, index = 'A#0.f#7', 'A.f', 7  # a leaked result tuple would hold 7

        def Work():
            LogicalLineType(['a', 'b'], 1, 0, 0).__reduce__()
            FindIndexOfLogical(lst, lst[2])
            IndexForLineno(lst, 2)
            self.assertRaises(TypeError, IndexForLineno, [None], 2)
            symbolinfo.SplitScopeNames(name)
            symbolinfo.SplitScopeNameFromSuffixes(name)
            symbolinfo.SplitScopeNameFromSuffixes(plain)
            symbolinfo.AppendScopeSuffixes(plain, index, '()')
            symbolinfo.JoinTwoScopeNames('', plain)
            destroyable.CDestroyable().destroy()

        def Counts():
            gc.collect()
            # As text: a list of ints would itself hold a reference to 7.
            return repr([sys.getrefcount(o) for o in (name, plain, index, lst[2])])

        Work()
        refs, objects = Counts(), len(gc.get_objects())
        for _ in range(2000):
            Work()
        self.assertEqual(Counts(), refs)
        # A leak per call would show in thousands; the test's own frames vary by a few.
        self.assertLess(abs(len(gc.get_objects()) - objects), 10)


if __name__ == '__main__':
    unittest.main()
