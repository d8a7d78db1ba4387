"""Tests of pickling and copying CChangeFinder and CScopeBodyCache."""

import copy
import cPickle
import gc
import pickle
import sys
import textwrap
import unittest

from pysource import scopebodycache
from pysource.logicals import ReadLogicals
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

# Module-level names: inside a class body `__pyx_...` would be mangled.
UnpickleFinder = scopebodycache.__dict__['__pyx_unpickle_CChangeFinder']
UnpickleCache = scopebodycache.__dict__['__pyx_unpickle_CScopeBodyCache']

kFinderSum, kCacheSum = 0x093a2af, 0xa66c71f
kFinderFields = ('(__fDestroyed, __fSignalCatchers, _fCurrentClassChanges, _fCurrentContentsChanges, '
                 '_fCurrentFunctionChanges, _fEndIndexForScopesSeen, _fLastProcessedIndex, '
                 '_fLogicalList, _fNextChangeIndex, _fScopesSeen)')
kCacheFields = '(__fDestroyed, __fSignalCatchers, _fLogicalList, _fScopeBodyCache, _fScopeDefCache)'

kSource = """\
class A:
    def f(self):
        return 1
    def f(self):
        return 2
# trailing comment
def g():
    pass
"""


def Named(source=kSource):
    lst = ReadLogicals(textwrap.dedent(source))
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def Names(lst):
    return [(l.fLineno, l.fScopeName, l.fLocalScopeName) for l in lst]


def Picklers():
    """(label, dumps, loads) of every pickling route under test."""
    for module in (pickle, cPickle):
        for proto in (0, 1, 2):
            yield ('%s/%d' % (module.__name__, proto), lambda o, m=module, p=proto: m.dumps(o, p),
                   module.loads)


def Plain(value):
    """`value` with logicals replaced by their fields, for comparing copies."""
    if isinstance(value, LogicalLineType):
        return ('logical', value.fTokens, value.fLineno, value.fIndent, value.fKind, value.fScopeName,
                value.fLocalScopeName)
    if isinstance(value, (list, tuple)):
        return type(value)(Plain(v) for v in value)
    if isinstance(value, dict):
        return dict((k, Plain(v)) for k, v in value.items())
    return value


def FinderFields(cf):
    return Plain((cf.IsDestroyed(), getattr(cf, '__fSignalCatchers'), cf.__reduce__()[-1][2:10]))


def CacheFields(c):
    return Plain((c.IsDestroyed(), getattr(c, '__fSignalCatchers'), c._fLogicalList, c._fScopeBodyCache,
                  c._fScopeDefCache))


class SubFinder(CChangeFinder):
    pass


class SubCache(CScopeBodyCache):
    pass


class SnapshotFinder(CChangeFinder):
    """Pickles itself from inside FindChanges."""

    def _FindChangesEntireListAdded(self):
        self.during = pickle.dumps(self, 2)
        return CChangeFinder._FindChangesEntireListAdded(self)


class SlottedCache(CScopeBodyCache):
    __slots__ = ()


class RoundTripTest(unittest.TestCase):

    def Objects(self):
        lst = Named()
        idle = CChangeFinder(lst)
        idle.FindChanges(lst, [])
        cache = CScopeBodyCache(lst)
        cache.GetBodyOfScope('A#0.f#1')
        destroyed = CScopeBodyCache(lst)
        destroyed.destroy()
        signals = CChangeFinder(lst)
        setattr(signals, '__fSignalCatchers', {'sig': [1]})
        sub = SubCache(lst)
        sub.note = 'kept'
        return [CChangeFinder(lst), idle, cache, destroyed, signals, sub, SubFinder(None),
                CChangeFinder.__new__(CChangeFinder), CScopeBodyCache.__new__(SubCache),
                SlottedCache(None)]

    def assertSame(self, a, b):
        self.assertIs(type(a), type(b))
        fields = FinderFields if isinstance(a, CChangeFinder) else CacheFields
        self.assertEqual(fields(a), fields(b))
        self.assertEqual(getattr(a, '__dict__', None), getattr(b, '__dict__', None))

    def testPicklers(self):
        for label, dumps, loads in Picklers():
            for obj in self.Objects():
                self.assertSame(loads(dumps(obj)), obj)

    def testCopies(self):
        for obj in self.Objects():
            shallow = copy.copy(obj)
            self.assertSame(shallow, obj)
            deep = copy.deepcopy(obj)
            self.assertSame(deep, obj)
            for name in ('_fLogicalList', '_fScopeBodyCache'):
                if getattr(obj, name, None):
                    self.assertIs(getattr(shallow, name), getattr(obj, name))
                    self.assertIsNot(getattr(deep, name), getattr(obj, name))

    def testCacheKeepsServingSharedLogicals(self):
        lst = Named()
        cache = CScopeBodyCache(lst)
        body = cache.GetBodyOfScope('A#0')
        for label, dumps, loads in Picklers():
            lst2, cache2 = loads(dumps((lst, cache)))
            self.assertIs(cache2._fLogicalList, lst2)
            self.assertEqual(Names(cache2.GetBodyOfScope('A#0')), Names(body))
            self.assertIs(cache2.GetBodyOfScope('A#0')[0], lst2[1])
            self.assertIs(cache2.GetScopeDef('A#0.f#1'), lst2[3])

    def testFinderKeepsWorkingOnRestoredList(self):
        lst = Named()
        cf = CChangeFinder(lst)
        cf.FindChanges(lst, [])
        for label, dumps, loads in Picklers():
            cf2, lst2 = loads(dumps((cf, lst)))
            self.assertIs(cf2._fLogicalList, lst2)
            self.assertEqual(Names(lst2), Names(lst))
            # Delete the first `def f` with its body: the second becomes f#0.
            removed = lst2[1:3]
            del lst2[1:3]
            contents, classes, functions = cf2.FindChanges([], removed)
            self.assertIn('A#0', contents)
            self.assertEqual(functions, set(['A#0.f#0', 'A#0.f#1']))
            fresh = ReadLogicals(textwrap.dedent(kSource))
            del fresh[1:3]
            CChangeFinder(fresh).FindChanges(fresh, [])
            self.assertEqual([n[1:] for n in Names(lst2)], [n[1:] for n in Names(fresh)], label)


class ReduceFormTest(unittest.TestCase):

    def testFreshFinderUsesSetstateForm(self):
        lst = Named()
        cf = CChangeFinder(lst)
        self.assertEqual(cf.__reduce__(),
                         (UnpickleFinder, (CChangeFinder, kFinderSum, None),
                          (False, None, None, None, None, 0, -1, lst, -1, None)))

    def testAllNoneUsesInlineForm(self):
        for cls, fn, checksum, state in [
                (CChangeFinder, UnpickleFinder, kFinderSum,
                 (False, None, None, None, None, 0, 0, None, 0, None)),
                (CScopeBodyCache, UnpickleCache, kCacheSum,
                 (False, None, None, None, None))]:
            self.assertEqual(cls.__new__(cls).__reduce__(), (fn, (cls, checksum, state)))

    def testDestroyedFlagAndDicts(self):
        c = CScopeBodyCache(None)
        c.destroy()
        self.assertEqual(c.__reduce__()[1][2], (True, None, None, None, None))
        reduced = SubCache(None).__reduce__()
        self.assertEqual(reduced[1], (SubCache, kCacheSum, None))
        self.assertEqual(reduced[2], (False, None, None, {}, {}, {}))
        slotted = SlottedCache.__new__(SlottedCache)
        self.assertEqual(len(slotted.__reduce__()), 2)

    def testRebuildFunctionLookedUpAtEachReduce(self):
        marker = lambda *args: None  # noqa: E731
        name = '__pyx_unpickle_CScopeBodyCache'
        saved = getattr(scopebodycache, name)
        setattr(scopebodycache, name, marker)
        try:
            self.assertIs(CScopeBodyCache(None).__reduce__()[0], marker)
        finally:
            setattr(scopebodycache, name, saved)
        self.assertIs(CScopeBodyCache(None).__reduce__()[0], saved)

    def testPickleRefersToFunctionsByName(self):
        for fn in (UnpickleFinder, UnpickleCache):
            self.assertEqual(fn.__module__, 'pysource.scopebodycache')
            self.assertIs(pickle.loads(pickle.dumps(fn)), fn)
        data = pickle.dumps(CChangeFinder(None), 0)
        self.assertIn('pysource.scopebodycache\n__pyx_unpickle_CChangeFinder', data)

    def testInstalledHooks(self):
        for cls in (CChangeFinder, CScopeBodyCache):
            self.assertIn('__reduce__', cls.__dict__)
            self.assertIn('__setstate__', cls.__dict__)
            self.assertNotIn('__reduce_ex__', cls.__dict__)
            self.assertFalse(hasattr(cls, '__getstate__'))
            self.assertEqual(cls.__reduce__.__module__, 'pysource.scopebodycache')


class MidFindChangesTest(unittest.TestCase):

    def testPickledDuringFindChanges(self):
        lst = ReadLogicals(kSource)
        cf = SnapshotFinder(lst)
        cf.FindChanges(lst, [])
        loaded = pickle.loads(cf.during)
        self.assertIs(type(loaded), SnapshotFinder)
        self.assertEqual(loaded.__dict__.keys(), [])  # taken before `during` was set
        state = loaded.__reduce__()[2]
        self.assertEqual(state[3], set())  # contents changes: a call in progress
        self.assertIsInstance(state[9], dict)
        self.assertEqual(state[2:5], (set(), set(), set()))
        self.assertEqual(Names(loaded._fLogicalList), [(l.fLineno, None, None) for l in lst])
        with self.assertRaises(ValueError) as cm:
            loaded.FindChanges([], [])
        self.assertEqual(str(cm.exception), 'FindChanges cannot be called recursively')
        loaded._Clear()
        lst2 = loaded._fLogicalList
        loaded.FindChanges(lst2, [])
        self.assertEqual(Names(lst2), Names(Named()))

    def testIndicesCarried(self):
        cf = CChangeFinder(None)
        state = (False, None, set(['a']), set(), set(), 7, 5, [], 9, {'k': 1})
        cf.__setstate__(state)
        self.assertEqual(cf.__reduce__()[2], state)


class RefusedTest(unittest.TestCase):

    def assertRaisesMessage(self, exc, message, fn, *args, **kwargs):
        with self.assertRaises(exc) as cm:
            fn(*args, **kwargs)
        self.assertEqual(str(cm.exception), message)

    def testWrongChecksum(self):
        self.assertRaisesMessage(
            pickle.PickleError, 'Incompatible checksums (%d vs 0x093a2af = %s)' % (kCacheSum, kFinderFields),
            UnpickleFinder, CChangeFinder, kCacheSum, None)
        # A change finder's pickle handed to the other rebuild function.
        args = CChangeFinder(None).__reduce__()[1]
        self.assertRaisesMessage(
            pickle.PickleError, 'Incompatible checksums (9675439 vs 0xa66c71f = %s)' % kCacheFields,
            UnpickleCache, *args)
        self.assertRaisesMessage(
            pickle.PickleError, 'Incompatible checksums (-1 vs 0xa66c71f = %s)' % kCacheFields,
            UnpickleCache, CScopeBodyCache, -1, None)
        self.assertRaises(TypeError, UnpickleCache, CScopeBodyCache, float(kCacheSum), None)
        data = pickle.dumps(CScopeBodyCache(None), 2).replace('\x1f\xc7\x66\x0a', '\x20\xc7\x66\x0a')
        self.assertRaises(pickle.PickleError, pickle.loads, data)

    def testRebuildArguments(self):
        obj = UnpickleCache(__pyx_state=None, __pyx_checksum=kCacheSum, __pyx_type=SubCache)
        self.assertIs(type(obj), SubCache)
        self.assertEqual(CacheFields(obj), (False, None, None, None, None))
        self.assertRaises(TypeError, UnpickleCache, CChangeFinder, kCacheSum, None)
        self.assertRaises(TypeError, UnpickleCache, 5, kCacheSum, None)
        self.assertRaisesMessage(
            TypeError, '__pyx_unpickle_CChangeFinder() takes exactly 3 positional arguments (2 given)',
            UnpickleFinder, CChangeFinder, kFinderSum)
        self.assertRaisesMessage(TypeError, 'Expected tuple, got list', UnpickleCache,
                                 CScopeBodyCache, kCacheSum, [False, None, None, None, None])

    def testSetstateArguments(self):
        c = CScopeBodyCache(None)
        self.assertRaisesMessage(TypeError, "'NoneType' object is not subscriptable", c.__setstate__, None)
        self.assertRaisesMessage(TypeError, 'Expected tuple, got list', c.__setstate__, [])
        self.assertRaisesMessage(TypeError, '__setstate__() takes no keyword arguments',
                                 c.__setstate__, __pyx_state=())
        self.assertRaisesMessage(TypeError, '__reduce__() takes no arguments (1 given)', c.__reduce__, 2)
        self.assertRaises(TypeError, CScopeBodyCache.__dict__['__reduce__'], CChangeFinder(None))
        self.assertRaises(TypeError, CChangeFinder.__dict__['__setstate__'], CScopeBodyCache(None), ())

    def testWrongTypeAtEachItem(self):
        class SubDict(dict):
            pass
        good = [False, None, set(), set(), set(), 0, -1, [], -1, {}]
        for i, bad, expected in [(1, [], 'dict'), (1, SubDict(), 'dict'), (2, [], 'set'),
                                 (3, frozenset(), 'set'), (4, {}, 'set'), (7, (), 'list'),
                                 (9, set(), 'dict')]:
            state = list(good)
            state[i] = bad
            self.assertRaisesMessage(TypeError, 'Expected %s, got %s' % (expected, type(bad).__name__),
                                     CChangeFinder(None).__setstate__, tuple(state))
        for i in (5, 6, 8):
            state = list(good)
            state[i] = 1.5
            self.assertRaises(TypeError, CChangeFinder(None).__setstate__, tuple(state))
            state[i] = 2 ** 80
            self.assertRaises(OverflowError, CChangeFinder(None).__setstate__, tuple(state))
        for i, bad, expected in [(1, set(), 'dict'), (2, (), 'list'), (3, [], 'dict'), (4, SubDict(), 'dict')]:
            state = [True, None, None, None, None]
            state[i] = bad
            self.assertRaisesMessage(TypeError, 'Expected %s, got %s' % (expected, type(bad).__name__),
                                     CScopeBodyCache(None).__setstate__, tuple(state))

    def testFailureKeepsEarlierFields(self):
        c = CScopeBodyCache([])
        lst = []
        with self.assertRaises(TypeError):
            c.__setstate__((1, {'s': 1}, lst, 'bad', {}))
        self.assertEqual(CacheFields(c), (True, {'s': 1}, lst, {}, {}))
        self.assertIs(c._fLogicalList, lst)

    def testShortTuples(self):
        for n in range(10):
            cf = CChangeFinder(None)
            state = (True, {}, set(['x']), set(), set(), 3, 4, [], 5, {})[:n]
            self.assertRaisesMessage(IndexError, 'tuple index out of range', cf.__setstate__, state)
            self.assertEqual(cf.IsDestroyed(), n > 0)
        self.assertRaisesMessage(IndexError, 'tuple index out of range', UnpickleCache,
                                 CScopeBodyCache, kCacheSum, (False, None, None, None))

    def testTruthOfDestroyedFlag(self):
        class Falsy(object):
            def __nonzero__(self):
                return False
        c = CScopeBodyCache(None)
        c.__setstate__(([1], None, None, None, None))
        self.assertTrue(c.IsDestroyed())
        c.__setstate__((Falsy(), None, None, None, None))
        self.assertFalse(c.IsDestroyed())

    def testExtraItems(self):
        c = CScopeBodyCache(None)
        c.__setstate__((False, None, None, None, None, {'x': 1}, 'ignored'))  # no __dict__: ignored
        sub = SubCache(None)
        sub.__setstate__((False, None, None, None, None, {'x': 1}, 'ignored'))
        self.assertEqual(sub.x, 1)
        self.assertRaises(ValueError, SubCache(None).__setstate__, (False, None, None, None, None, 'no'))


class LeakTest(unittest.TestCase):

    def testReduceAndRebuildFlat(self):
        lst = Named()
        cf = CChangeFinder(lst)
        cache = SubCache(lst)
        cache.GetBodyOfScope('A#0')
        bad = (False, None, None, 'x', None)

        def Run():
            for obj in (cf, cache):
                copy.copy(obj)
                cPickle.loads(cPickle.dumps(obj, 2))
            try:
                CScopeBodyCache(None).__setstate__(bad)
            except TypeError:
                pass
            try:
                UnpickleFinder(CChangeFinder, 1, None)
            except pickle.PickleError:
                pass
        for _ in range(5):
            Run()
        gc.collect()
        watched = [lst, cf, cache, bad, CScopeBodyCache, SubCache] + lst
        counts = [sys.getrefcount(w) for w in watched]
        objects = len(gc.get_objects())
        for _ in range(200):
            Run()
        gc.collect()
        self.assertEqual([sys.getrefcount(w) for w in watched], counts)
        self.assertLessEqual(len(gc.get_objects()), objects + 2)


if __name__ == '__main__':
    unittest.main()
