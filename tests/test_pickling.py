"""Pickling and copying CChangeFinder and CScopeBodyCache."""

import copy
import cPickle
import gc
import pickle
import sys
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

kGoodFinderState = (False, None, set(), set(), set(), 0, -1, [], -1, {})
kGoodCacheState = (True, None, None, None, None)
kFullFinderState = (True, {}, set(['x']), set(), set(), 3, 4, [], 5, {})

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
    lst = ReadLogicals(source)
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


def Fields(obj):
    if isinstance(obj, CChangeFinder):
        return Plain((obj.IsDestroyed(), getattr(obj, '__fSignalCatchers'), obj.__reduce__()[-1][2:10]))
    return Plain((obj.IsDestroyed(), getattr(obj, '__fSignalCatchers'), obj._fLogicalList,
                  obj._fScopeBodyCache, obj._fScopeDefCache))


SubFinder = type('SubFinder', (CChangeFinder,), {})
SubCache = type('SubCache', (CScopeBodyCache,), {})
SlottedCache = type('SlottedCache', (CScopeBodyCache,), {'__slots__': ()})
SubDict = type('SubDict', (dict,), {})


class SnapshotFinder(CChangeFinder):
    """Pickles itself from inside FindChanges."""

    def _FindChangesEntireListAdded(self):
        self.during = pickle.dumps(self, 2)
        return CChangeFinder._FindChangesEntireListAdded(self)


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
        mid = SnapshotFinder(ReadLogicals(kSource))
        mid.FindChanges(mid._fLogicalList, [])
        return [CChangeFinder(lst), idle, cache, destroyed, signals, sub, SubFinder(None), mid,
                pickle.loads(mid.during), CChangeFinder.__new__(CChangeFinder),
                CScopeBodyCache.__new__(SubCache), SlottedCache(None)]

    def testPicklesAndCopies(self):
        same = lambda o: o  # noqa: E731
        routes = list(Picklers()) + [('copy', copy.copy, same), ('deepcopy', copy.deepcopy, same)]
        for label, dumps, loads in routes:
            for obj in self.Objects():
                clone = loads(dumps(obj))
                self.assertIs(type(clone), type(obj), label)
                self.assertEqual(Fields(clone), Fields(obj), (label, obj))
                self.assertEqual(getattr(clone, '__dict__', None), getattr(obj, '__dict__', None), label)
                for name in ('_fLogicalList', '_fScopeBodyCache'):
                    if label.endswith('copy') and getattr(obj, name, None):
                        self.assertEqual(getattr(clone, name) is getattr(obj, name), label == 'copy')

    def testRestoredObjectsKeepWorkingOnTheirList(self):
        lst = Named()
        cf, cache = CChangeFinder(lst), CScopeBodyCache(lst)
        cf.FindChanges(lst, [])
        body = cache.GetBodyOfScope('A#0')
        expected = Named(kSource.replace('    def f(self):\n        return 1\n', ''))
        for label, dumps, loads in Picklers():
            lst2, cache2, cf2 = loads(dumps((lst, cache, cf)))
            self.assertIs(cache2._fLogicalList, lst2, label)
            self.assertIs(cf2._fLogicalList, lst2, label)
            self.assertEqual(Names(lst2), Names(lst))
            self.assertEqual(Names(cache2.GetBodyOfScope('A#0')), Names(body))
            self.assertIs(cache2.GetBodyOfScope('A#0')[0], lst2[1])
            self.assertIs(cache2.GetScopeDef('A#0.f#1'), lst2[3])
            removed = lst2[1:3]  # the first `def f`: the second becomes f#0
            del lst2[1:3]
            contents, classes, functions = cf2.FindChanges([], removed)
            self.assertIn('A#0', contents)
            self.assertEqual(functions, set(['A#0.f#0', 'A#0.f#1']))
            self.assertEqual([n[1:] for n in Names(lst2)], [n[1:] for n in Names(expected)], label)

    def testPickledDuringFindChanges(self):
        lst = ReadLogicals(kSource)
        cf = SnapshotFinder(lst)
        cf.FindChanges(lst, [])
        loaded = pickle.loads(cf.during)
        self.assertEqual(loaded.__dict__.keys(), [])  # taken before `during` was set
        state = loaded.__reduce__()[2]
        self.assertEqual(state[2:5], (set(), set(), set()))  # a call in progress
        self.assertIsInstance(state[9], dict)
        self.assertEqual(Names(loaded._fLogicalList), [(l.fLineno, None, None) for l in lst])
        with self.assertRaises(ValueError) as cm:
            loaded.FindChanges([], [])
        self.assertEqual(str(cm.exception), 'FindChanges cannot be called recursively')
        loaded._Clear()
        loaded.FindChanges(loaded._fLogicalList, [])
        self.assertEqual(Names(loaded._fLogicalList), Names(Named()))


class ReduceFormTest(unittest.TestCase):

    def testSetstateAndInlineForms(self):
        lst = Named()
        self.assertEqual(CChangeFinder(lst).__reduce__(),
                         (UnpickleFinder, (CChangeFinder, kFinderSum, None),
                          (False, None, None, None, None, 0, -1, lst, -1, None)))
        self.assertEqual(CChangeFinder.__new__(CChangeFinder).__reduce__(),
                         (UnpickleFinder, (CChangeFinder, kFinderSum,
                                           (False, None, None, None, None, 0, 0, None, 0, None))))
        self.assertEqual(CScopeBodyCache.__new__(CScopeBodyCache).__reduce__(),
                         (UnpickleCache, (CScopeBodyCache, kCacheSum, (False, None, None, None, None))))
        c = CScopeBodyCache(None)
        c.destroy()
        self.assertEqual(c.__reduce__()[1][2], (True, None, None, None, None))
        self.assertEqual(SubCache(None).__reduce__()[1:],
                         ((SubCache, kCacheSum, None), (False, None, None, {}, {}, {})))
        self.assertEqual(len(SlottedCache.__new__(SlottedCache).__reduce__()), 2)
        self.assertEqual(CScopeBodyCache.__new__(SubCache).__reduce__()[1:],
                         ((SubCache, kCacheSum, None), (False, None, None, None, None, {})))
        state = (False, None, set(['a']), set(), set(), 7, 5, [], 9, {'k': 1})
        cf = CChangeFinder(None)
        cf.__setstate__(state)
        self.assertEqual(cf.__reduce__()[2], state)

    def testRebuildFunctionsByNameLookedUpAtEachReduce(self):
        for fn in (UnpickleFinder, UnpickleCache):
            self.assertIs(pickle.loads(pickle.dumps(fn)), fn)
        self.assertIn('pysource.scopebodycache\n__pyx_unpickle_CChangeFinder',
                      pickle.dumps(CChangeFinder(None), 0))
        marker = lambda *args: None  # noqa: E731
        setattr(scopebodycache, '__pyx_unpickle_CScopeBodyCache', marker)
        try:
            self.assertIs(CScopeBodyCache(None).__reduce__()[0], marker)
        finally:
            setattr(scopebodycache, '__pyx_unpickle_CScopeBodyCache', UnpickleCache)
        self.assertIs(CScopeBodyCache(None).__reduce__()[0], UnpickleCache)
        for cls in (CChangeFinder, CScopeBodyCache):
            self.assertNotIn('__reduce_ex__', cls.__dict__)
            self.assertFalse(hasattr(cls, '__getstate__'))


class RefusedTest(unittest.TestCase):

    def Fails(self, exc, message, fn, *args, **kwargs):
        with self.assertRaises(exc) as cm:
            fn(*args, **kwargs)
        if message is not None:
            self.assertEqual(str(cm.exception), message)

    def testRebuildAndSetstateArguments(self):
        checksums = 'Incompatible checksums (%s vs %s = %s)'
        self.Fails(pickle.PickleError, checksums % (kCacheSum, '0x093a2af', kFinderFields),
                   UnpickleFinder, CChangeFinder, kCacheSum, None)
        self.Fails(pickle.PickleError, checksums % (9675439, '0xa66c71f', kCacheFields),
                   UnpickleCache, *CChangeFinder(None).__reduce__()[1])
        self.Fails(pickle.PickleError, checksums % (-1, '0xa66c71f', kCacheFields),
                   UnpickleCache, CScopeBodyCache, -1, None)
        data = pickle.dumps(CScopeBodyCache(None), 2).replace('\x1f\xc7\x66\x0a', '\x20\xc7\x66\x0a')
        self.Fails(pickle.PickleError, None, pickle.loads, data)
        for cls, checksum in [(CScopeBodyCache, float(kCacheSum)), (CChangeFinder, kCacheSum), (5, kCacheSum)]:
            self.Fails(TypeError, None, UnpickleCache, cls, checksum, None)
        self.Fails(TypeError, '__pyx_unpickle_CChangeFinder() takes exactly 3 positional arguments (2 given)',
                   UnpickleFinder, CChangeFinder, kFinderSum)
        self.Fails(TypeError, 'Expected tuple, got list',
                   UnpickleCache, CScopeBodyCache, kCacheSum, [False, None, None, None, None])
        self.Fails(IndexError, 'tuple index out of range',
                   UnpickleCache, CScopeBodyCache, kCacheSum, (False, None, None, None))
        c = CScopeBodyCache(None)
        self.Fails(TypeError, "'NoneType' object is not subscriptable", c.__setstate__, None)
        self.Fails(TypeError, 'Expected tuple, got list', c.__setstate__, [])
        self.Fails(TypeError, '__setstate__() takes no keyword arguments', c.__setstate__, __pyx_state=())
        self.Fails(TypeError, '__reduce__() takes no arguments (1 given)', c.__reduce__, 2)
        self.Fails(TypeError, None, CScopeBodyCache.__dict__['__reduce__'], CChangeFinder(None))
        self.Fails(TypeError, None, CChangeFinder.__dict__['__setstate__'], c, ())
        self.Fails(ValueError, None, SubCache(None).__setstate__, (False, None, None, None, None, 'no'))

    def testWrongTypeAtEachItem(self):
        for good, i, bad, expected in [
                (kGoodFinderState, 1, [], 'dict'), (kGoodFinderState, 1, SubDict(), 'dict'),
                (kGoodFinderState, 2, [], 'set'), (kGoodFinderState, 3, frozenset(), 'set'),
                (kGoodFinderState, 4, {}, 'set'), (kGoodFinderState, 7, (), 'list'),
                (kGoodFinderState, 9, set(), 'dict'), (kGoodCacheState, 1, set(), 'dict'),
                (kGoodCacheState, 2, (), 'list'), (kGoodCacheState, 3, [], 'dict'),
                (kGoodCacheState, 4, SubDict(), 'dict')] + [
                (kGoodFinderState, i, bad, None) for i in (5, 6, 8) for bad in (1.5, 2 ** 80)]:
            state = list(good)
            state[i] = bad
            obj = (CChangeFinder if good is kGoodFinderState else CScopeBodyCache)(None)
            self.Fails(OverflowError if bad == 2 ** 80 else TypeError,
                       expected and 'Expected %s, got %s' % (expected, type(bad).__name__),
                       obj.__setstate__, tuple(state))

    def testPartialStates(self):
        obj = UnpickleCache(__pyx_state=None, __pyx_checksum=kCacheSum, __pyx_type=SubCache)
        self.assertEqual((type(obj), Fields(obj)), (SubCache, (False, None, None, None, None)))
        c, lst = CScopeBodyCache([]), []
        self.assertRaises(TypeError, c.__setstate__, (1, {'s': 1}, lst, 'bad', {}))
        self.assertEqual(Fields(c), (True, {'s': 1}, lst, {}, {}))  # earlier fields kept
        self.assertIs(c._fLogicalList, lst)
        for n in range(10):
            cf = CChangeFinder(None)
            self.Fails(IndexError, 'tuple index out of range', cf.__setstate__, kFullFinderState[:n])
            self.assertEqual(cf.IsDestroyed(), n > 0)
        falsy = type('Falsy', (object,), {'__nonzero__': lambda s: False})()
        for flag, destroyed in [([1], True), (falsy, False)]:
            c.__setstate__((flag, None, None, None, None))
            self.assertEqual(c.IsDestroyed(), destroyed)
        c.__setstate__((False, None, None, None, None, {'x': 1}, 'ignored'))  # no __dict__: ignored
        sub = SubCache(None)
        sub.__setstate__((False, None, None, None, None, {'x': 1}, 'ignored'))
        self.assertEqual(sub.x, 1)


class LeakTest(unittest.TestCase):

    def testReduceAndRebuildFlat(self):
        lst = Named()
        cf, cache = CChangeFinder(lst), SubCache(lst)
        cache.GetBodyOfScope('A#0')
        cache.note = [1]
        bad = (False, None, None, 'x', None)

        def Run():
            for obj in (cf, cache):
                copy.copy(obj)
                cPickle.loads(cPickle.dumps(obj, 2))
            self.assertRaises(TypeError, CScopeBodyCache(None).__setstate__, bad)
            self.assertRaises(pickle.PickleError, UnpickleFinder, CChangeFinder, 1, None)
        for _ in range(5):
            Run()
        gc.collect()
        watched = [lst, cf, cache, cache.__dict__, bad, CScopeBodyCache, SubCache] + lst
        counts, objects = [sys.getrefcount(w) for w in watched], len(gc.get_objects())
        for _ in range(200):
            Run()
        gc.collect()
        self.assertEqual([sys.getrefcount(w) for w in watched], counts)
        self.assertLessEqual(len(gc.get_objects()), objects + 2)


if __name__ == '__main__':
    unittest.main()
