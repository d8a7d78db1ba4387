"""The stand-in sibling modules and pysource.logicals."""

import ctypes
import gc
import pickle
import sys
import time
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
P = ctypes.py_object


def Entry(module, name):
    """(signature, address) of one typed entry point."""
    capsule = module._capi[name]
    sig = _GetCapsuleName(capsule)
    return sig, _GetCapsulePointer(capsule, sig)


def Lines(*linenos):
    return [LogicalLineType(['x'], n, 0, 0) for n in linenos]


class SubLogical(LogicalLineType):
    pass


class InterfaceTest(unittest.TestCase):

    def testCalls(self):
        lst, ordered, shuffled = Lines(1, 2, 2, 2, 5), Lines(2, 4, 4, 9), Lines(9, 3, 7, 1)
        self.assertEqual([FindIndexOfLogical(lst, l) for l in lst], range(5))
        self.assertEqual([FindIndexOfLogical(shuffled, l) for l in shuffled], range(4))
        shuffled.insert(2, 'not a logical')
        long_list = Lines(*range(1, 1001))
        long_list.insert(0, long_list[499])  # found by line, not by a scan from the start
        find, index, s = FindIndexOfLogical, IndexForLineno, symbolinfo
        join, split, append = s.JoinTwoScopeNames, s.SplitScopeNames, s.AppendScopeSuffixes
        calls = [(find, (lst, Lines(2)[0]), -1), (find, (lst, None), -1), (find, ([1, None, 'a'], None), 1),
                 (find, ([], lst[0]), -1), (find, (tuple(lst), lst[0]), TypeError),
                 (find, (shuffled, shuffled[4]), 4), (find, (long_list, long_list[0]), 500),
                 (index, ([], 3), 0), (index, (ordered[:2] + [None] + ordered[2:], 4), TypeError),
                 (index, (ordered, '4'), TypeError),
                 (join, ('', 'f'), 'f'), (join, ('A#0', 'f'), 'A#0.f'), (join, ('A', None), TypeError),
                 (split, ('A#0.f..g',), ['A#0', 'f', '', 'g']), (split, ('',), ['']), (split, (None,), TypeError),
                 (append, ('f', 3, None), 'f#3'), (append, ('f', 2 ** 70, '()'), 'f#%d()' % 2 ** 70),
                 (append, ('f', 3, 5), TypeError), (append, ('f', '3', None), TypeError),
                 (s.LeafScopeNameHasIndex, (None,), False)]
        calls += [(index, (ordered, n), i) for n, i in [(-5, 0), (2, 0), (3, 1), (4, 1), (5, 3), (9, 3),
                                                        (10, 4), (2 ** 40, 4)]]
        for name, want in [('f#12', ('f', 12)), ('f', ('f', -1)), ('f#', ('f#', -1)), ('f#x1', ('f#x1', -1)),
                           ('a#1.b', ('a#1.b', -1)), ('#0', ('', 0)), ('g#2#07', ('g#2', 7)),
                           ('h#%d' % 2 ** 70, ('h', 2 ** 70))]:
            calls += [(s.SplitScopeNameFromSuffixes, (name,), want),
                      (s.LeafScopeNameHasIndex, (name,), want[1] != -1)]
        calls += [(LogicalLineType, args, exc) for args, exc in [
            (('x', 1, 0, 0), TypeError), ((['a', 1], 1, 0, 0), TypeError), (([], 1.0, 0, 0), TypeError),
            (([], 2 ** 31, 0, 0), OverflowError), (([], 1, 2 ** 15, 0), OverflowError),
            (([], 1, 0, 256), OverflowError), (([], 1, 0, -1), OverflowError),
            (([], 1, 0, 2 ** 70), OverflowError)]]
        l = LogicalLineType([], 2 ** 31 - 1, -2 ** 15, 255)
        calls += [(setattr, (l, 'fKind', 300), OverflowError), (delattr, (l, 'fLineno'), TypeError),
                  (setattr, (l, 'fTokenCount', 3), AttributeError),
                  (destroyable.CDestroyable, (1,), TypeError),
                  (setattr, (destroyable.CDestroyable(), '__fSignalCatchers', []), TypeError)]
        for fn, args, want in calls:
            if isinstance(want, type) and issubclass(want, Exception):
                self.assertRaises(want, fn, *args)
            else:
                self.assertEqual(fn(*args), want, (fn.__name__, args))
        self.assertEqual((l.fLineno, l.fIndent, l.fKind), (2 ** 31 - 1, -2 ** 15, 255))

    def testPublishedEntries(self):
        kinds = [getattr(symbolinfo, n) for n in symbolinfo._capi if n.endswith('Kind')]
        self.assertEqual((len(kinds), len(set(kinds))), (27, 27))
        self.assertTrue(all(chr(v).isalpha() for v in kinds))
        self.assertTrue(all(len(getattr(symbolinfo, n)) == symbolinfo.kPrefixLen == 2
                            for n in symbolinfo._capi if n.endswith('Prefix')))
        self.assertEqual((symbolinfo.kScopeIndexSep, symbolinfo.kModuleScopeName), ('#', ''))
        self.assertEqual(len([n for n in symbolinfo._capi if n.startswith('k')]), 61)
        readers = {'char': lambda a: ord(ctypes.c_char.from_address(a).value),
                   'Py_ssize_t': lambda a: ctypes.c_ssize_t.from_address(a).value,
                   'PyObject *': lambda a: P.from_address(a).value}
        for name in symbolinfo._capi:
            sig, address = Entry(symbolinfo, name)
            if sig in readers:
                got, want = readers[sig](address), getattr(symbolinfo, name)
                self.assertTrue(got is want if sig == 'PyObject *' else got == want, name)
        sig, address = Entry(symbolinfo, 'JoinTwoScopeNames')
        self.assertEqual(sig, 'PyObject *(PyObject *, PyObject *, int)')
        join = ctypes.PYFUNCTYPE(P, P, P, ctypes.c_int)(address)
        self.assertEqual(join('A', 'b', 1), 'A.b')
        self.assertRaises(TypeError, join, 1, 'b', 0)
        append = ctypes.PYFUNCTYPE(P, P, P, P, ctypes.c_int)(Entry(symbolinfo, 'AppendScopeSuffixes')[1])
        self.assertEqual(append('f', 1, None, 0), 'f#1')
        for module, name, value in [(_fastaccess, 'LogicalLineType', LogicalLineType),
                                    (_fastaccess, '__TimeFunc', time.time),
                                    (destroyable, '_gEmissionStack', destroyable._gEmissionStack)]:
            self.assertIs(P.from_address(Entry(module, name)[1]).value, value, name)
        self.assertEqual(Entry(destroyable, '_gLogAllEmissions')[0], 'int')
        for cls in (_fastaccess.CBytesTokenizer, symbolinfo.CSingleResolvedInfo):
            self.assertIn('__vtable__', cls.__dict__)
        vtable = destroyable.CDestroyable.__dict__['__vtable__']
        self.assertEqual(_GetCapsuleName(vtable), 'DestroyableVtable')


class ObjectTest(unittest.TestCase):

    def testLogicalFieldsPickleCopyAndRepr(self):
        l = LogicalLineType(tokens=('def', 'f'), lineno=7, indent=4, kind=2)
        self.assertEqual((l.fTokens, l.fTokenCount, l.fLineno, l.fIndent, l.fKind, l.fScopeName,
                          l.fLocalScopeName), (('def', 'f'), 2, 7, 4, 2, None, None))
        l.fScopeName, l.fLocalScopeName = 'A#0', ('any', 'object')
        del l.fScopeName
        self.assertEqual((l.fScopeName, l.__reduce__()[2]), (None, {'fLocalScopeName': ('any', 'object')}))
        del l.fLocalScopeName
        self.assertIsNone(l.__reduce__()[2])
        l = SubLogical(['class', 'A', ':'], 3, 4, 1)
        l.fLocalScopeName, l.extra = 'A#0', [1]
        clone = pickle.loads(pickle.dumps(l, 2))
        self.assertEqual((type(clone), clone.fTokens, clone.fLineno, clone.fIndent, clone.fKind,
                          clone.fLocalScopeName, clone.extra, clone.fScopeName),
                         (SubLogical, l.fTokens, 3, 4, 1, 'A#0', [1], None))
        l = LogicalLineType(['def', 'f', '(', ')', ':'], 3, 4, 2)
        l.fScopeName = 'A#0'
        for part in ('line 3', 'kind 2', 'indent 4', "'def', 'f', '(', ...", "'A#0'"):
            self.assertIn(part, repr(l))

    def testDestroyRunsOverrideOnce(self):
        calls = []
        Thing = type('Thing', (destroyable.CDestroyable,), {
            '_destroy_impl': lambda self: calls.append(self) or self.destroy()})
        t = Thing()
        # Read by getattr: in a class body the names would be mangled.
        self.assertEqual((t.IsDestroyed(), getattr(t, '__fDestroyed'), getattr(t, '__fSignalCatchers')),
                         (False, 0, None))
        t.destroy()
        t.destroy()
        self.assertEqual((calls, t.IsDestroyed()), ([t], True))

    def testCyclesCollected(self):
        for make, attr in [(lambda: SubLogical([], 1, 0, 0), 'fScopeName'),
                           (type('D', (destroyable.CDestroyable,), {}), '__fSignalCatchers')]:
            obj = make()
            setattr(obj, attr, {'self': obj})
            ref = weakref.ref(obj)
            del obj
            gc.collect()
            self.assertIsNone(ref(), attr)

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


class ReadLogicalsTest(unittest.TestCase):

    def testKindsIndentsContinuationsAndErrors(self):
        for source, want in [
                ('@dec\nclass A:  # note\n    # alone\n\n\tdef f(self,\n\n  x):\n'
                 '\t    s = """a\n\nb"""\n\tasync def g(): pass\n  \n',
                 [(1, 0, 0, ('@', 'dec')), (2, 0, 1, ('class', 'A', ':', '# note')),
                  (3, 4, 21, ('# alone',)), (4, 0, 22, ()),
                  (5, 8, 2, ('def', 'f', '(', 'self', ',', 'x', ')', ':')), (8, 12, 0, ('s', '=', '"""a\n\nb"""')),
                  (11, 8, 2, ('async', 'def', 'g', '(', ')', ':', 'pass')), (12, 2, 22, ())]),
                ('x = \\\n  1', [(1, 0, 0, ('x', '=', '1'))]),
                ('x\n\n \t', [(1, 0, 0, ('x',)), (2, 0, 22, ()), (3, 8, 22, ())]),
                ('# c', [(1, 0, 21, ('# c',))]), ('', [])]:
            got = [(l.fLineno, l.fIndent, l.fKind, l.fTokens) for l in logicals.ReadLogicals(source)]
            self.assertEqual(got, want, source)
        for source, lineno in [('x = (1,\n\n', 3), ('a\ns = """\n', 2), ('if 1:\n  x\n y\n', 3)]:
            with self.assertRaises(SyntaxError) as cm:
                logicals.ReadLogicals(source)
            self.assertEqual(cm.exception.lineno, lineno)


if __name__ == '__main__':
    unittest.main()
