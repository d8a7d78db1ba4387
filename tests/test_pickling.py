"""Pickling and copying CChangeFinder and CScopeBodyCache."""

import binascii
import copy
import json
import os
import pickle
import unittest

from pysource import scopebodycache
from pysource._fastaccess import LogicalLineType
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from support import PY3, Named, Names, Outcome, Picklers, Read, WholeListNames, kRepoDir

# Module-level names: inside a class body `__pyx_...` would be mangled.
UnpickleFinder = scopebodycache.__dict__['__pyx_unpickle_CChangeFinder']
UnpickleCache = scopebodycache.__dict__['__pyx_unpickle_CScopeBodyCache']

kFinderSum, kCacheSum = 0x093a2af, 0xa66c71f
kGoodFinderState = (False, None, set(), set(), set(), 0, -1, [], -1, {})
kGoodCacheState = (True, None, None, None, None)

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

SubFinder = type('SubFinder', (CChangeFinder,), {})
SubCache = type('SubCache', (CScopeBodyCache,), {})
SubDict = type('SubDict', (dict,), {})


def Plain(value):
    """`value` with logicals replaced by their fields, for comparing copies."""
    if isinstance(value, LogicalLineType):
        return (value.fTokens, value.fLineno, value.fIndent, value.fKind, value.fScopeName, value.fLocalScopeName)
    if isinstance(value, (list, tuple)):
        return type(value)(Plain(v) for v in value)
    if isinstance(value, dict):
        return dict((k, Plain(v)) for k, v in value.items())
    return value


def Fields(obj):
    r = obj.__reduce__()
    return Plain((obj.IsDestroyed(), getattr(obj, '__fSignalCatchers'), obj._fLogicalList) +
                 (r[2] if len(r) > 2 else r[1][2])[2:])


class SnapshotFinder(CChangeFinder):
    """Pickles itself from inside FindChanges."""

    def _FindChangesEntireListAdded(self):
        self.during = pickle.dumps(self, 2)
        return CChangeFinder._FindChangesEntireListAdded(self)


class RoundTripTest(unittest.TestCase):

    def testPicklesAndCopies(self):
        lst = Named(kSource)
        cache, destroyed, sub = CScopeBodyCache(lst), CScopeBodyCache(lst), SubCache(lst)
        cache.GetBodyOfScope('A#0.f#1')
        destroyed.destroy()
        setattr(destroyed, '__fSignalCatchers', {'sig': [1]})
        sub.note = 'kept'
        mid = SnapshotFinder(Read(kSource))
        mid.FindChanges(mid._fLogicalList, [])
        same = lambda o: o  # noqa: E731
        for label, dumps, loads in list(Picklers()) + [(f.__name__, f, same) for f in (copy.copy, copy.deepcopy)]:
            for obj in [CChangeFinder(lst), cache, destroyed, sub, SubFinder(None), mid,
                        CChangeFinder.__new__(CChangeFinder)]:
                clone = loads(dumps(obj))
                self.assertIs(type(clone), type(obj), label)
                self.assertEqual(Fields(clone), Fields(obj), (label, obj))
                self.assertEqual(getattr(clone, '__dict__', None), getattr(obj, '__dict__', None), label)
                if label.endswith('copy') and obj._fLogicalList:
                    self.assertEqual(clone._fLogicalList is obj._fLogicalList, label == 'copy')

    def testRestoredObjectsShareTheirList(self):
        lst = Named(kSource)
        cache = CScopeBodyCache(lst)
        cache.GetBodyOfScope('A#0')
        for label, dumps, loads in Picklers():
            lst2, cache2, cf2 = loads(dumps((lst, cache, CChangeFinder(lst))))
            self.assertTrue(cache2._fLogicalList is cf2._fLogicalList is lst2, label)
            self.assertIs(cache2.GetBodyOfScope('A#0')[0], lst2[1])
            self.assertIs(cache2.GetScopeDef('A#0.f#1'), lst2[3])
            removed = lst2[1:3]  # the first `def f`: the second becomes f#0
            del lst2[1:3]
            self.assertEqual(cf2.FindChanges([], removed)[2], set(['A#0.f#0', 'A#0.f#1']))
            self.assertEqual(Names(lst2), WholeListNames(kSource.replace('    def f(self):\n        return 1\n', '')),
                             label)

    def testPickledDuringFindChanges(self):
        cf = SnapshotFinder(Read(kSource))
        cf.FindChanges(cf._fLogicalList, [])
        # The pickle holds the call in progress, taken before `during` was
        # set; the finder loaded from it is idle.
        loaded = pickle.loads(cf.during)
        state = loaded.__reduce__()[2]
        self.assertEqual((state[2:7], state[8:10]), ((None, None, None, 0, -1), (-1, None)))
        self.assertEqual(Names(loaded._fLogicalList), [(None, None)] * len(cf._fLogicalList))
        loaded.FindChanges(loaded._fLogicalList, [])
        self.assertEqual(Names(loaded._fLogicalList), WholeListNames(kSource))


class ReduceFormTest(unittest.TestCase):

    def testSetstateAndInlineForms(self):
        lst = Read(kSource)
        self.assertEqual(CChangeFinder(lst).__reduce__(), (UnpickleFinder, (CChangeFinder, kFinderSum, None),
                                                           (False, None, None, None, None, 0, -1, lst, -1, None)))
        self.assertEqual(CChangeFinder.__new__(CChangeFinder).__reduce__(), (
            UnpickleFinder, (CChangeFinder, kFinderSum, (False, None, None, None, None, 0, 0, None, 0, None))))
        self.assertEqual(CScopeBodyCache.__new__(CScopeBodyCache).__reduce__(),
                         (UnpickleCache, (CScopeBodyCache, kCacheSum, (False, None, None, None, None))))
        self.assertEqual(SubCache(None).__reduce__()[1:],
                         ((SubCache, kCacheSum, None), (False, None, None, {}, {}, {})))
        # Contents changes None: a state that marks no call in progress
        # (one that does loads idle) is applied field by field.
        state = (False, None, set(['a']), None, set(), 7, 5, [], 9, {'k': 1})
        cf = CChangeFinder(None)
        cf.__setstate__(state)
        self.assertEqual(cf.__reduce__()[2], state)

    def testRebuildFunctionsByNameLookedUpAtEachReduce(self):
        self.assertIn(b'scopebodycache\n__pyx_unpickle_CChangeFinder', pickle.dumps(CChangeFinder(None), 0))
        marker = lambda *args: None  # noqa: E731
        setattr(scopebodycache, '__pyx_unpickle_CScopeBodyCache', marker)
        try:
            self.assertIs(CScopeBodyCache(None).__reduce__()[0], marker)
        finally:
            setattr(scopebodycache, '__pyx_unpickle_CScopeBodyCache', UnpickleCache)


class RefusedTest(unittest.TestCase):

    def testRebuildAndSetstateArguments(self):
        checksums = 'Incompatible checksums (%s vs %s = (__fDestroyed, __fSignalCatchers, %s))'
        c = CScopeBodyCache(None)
        for expected, fn, args in [
                ((pickle.PickleError, checksums % (kCacheSum, '0x093a2af', '_fCurrentClassChanges, '
                  '_fCurrentContentsChanges, _fCurrentFunctionChanges, _fEndIndexForScopesSeen, '
                  '_fLastProcessedIndex, _fLogicalList, _fNextChangeIndex, _fScopesSeen')),
                 UnpickleFinder, (CChangeFinder, kCacheSum, None)),
                ((pickle.PickleError, checksums % (-1, '0xa66c71f', '_fLogicalList, _fScopeBodyCache, '
                  '_fScopeDefCache')), UnpickleCache, (CScopeBodyCache, -1, None)),
                ((TypeError, 'Expected tuple, got list'), UnpickleCache, (CScopeBodyCache, kCacheSum, [])),
                ((IndexError, 'tuple index out of range'), UnpickleCache, (CScopeBodyCache, kCacheSum, (False,))),
                ((TypeError, "'NoneType' object is not subscriptable"), c.__setstate__, (None,)),
                ((TypeError, 'Expected tuple, got list'), c.__setstate__, ([],))]:
            self.assertEqual(Outcome(fn, *args), expected)
        for cls, checksum in [(CScopeBodyCache, float(kCacheSum)), (CChangeFinder, kCacheSum)]:
            self.assertRaises(TypeError, UnpickleCache, cls, checksum, None)
        self.assertRaises(ValueError, SubCache(None).__setstate__, (False, None, None, None, None, 'no'))

    def testWrongTypeAtEachItem(self):
        for good, i, bad, expected in [
                (kGoodFinderState, 1, SubDict(), 'dict'), (kGoodFinderState, 3, frozenset(), 'set'),
                (kGoodFinderState, 7, (), 'list'), (kGoodFinderState, 9, set(), 'dict'),
                (kGoodCacheState, 2, (), 'list'), (kGoodCacheState, 4, SubDict(), 'dict'),
                (kGoodFinderState, 5, 1.5, None), (kGoodFinderState, 8, 2 ** 80, None)]:
            state = list(good)
            state[i] = bad
            obj = (CChangeFinder if good is kGoodFinderState else CScopeBodyCache)(None)
            got = Outcome(obj.__setstate__, tuple(state))
            self.assertEqual(got[0], OverflowError if bad == 2 ** 80 else TypeError, (good, i))
            if expected:
                self.assertEqual(got[1], 'Expected %s, got %s' % (expected, type(bad).__name__))

    def testPartialStates(self):
        obj = UnpickleCache(__pyx_state=None, __pyx_checksum=kCacheSum, __pyx_type=SubCache)
        self.assertEqual((type(obj), obj.__reduce__()[2]), (SubCache, (False, None, None, None, None, {})))
        c, lst = CScopeBodyCache([]), []
        self.assertRaises(TypeError, c.__setstate__, (1, {'s': 1}, lst, 'bad', {}))
        self.assertEqual(c.__reduce__()[2], (True, {'s': 1}, lst, {}, {}))  # earlier fields kept
        self.assertIs(c._fLogicalList, lst)
        cf = CChangeFinder(None)
        self.assertEqual(Outcome(cf.__setstate__, (True, {}, set(['x']))), (IndexError, 'tuple index out of range'))
        self.assertTrue(cf.IsDestroyed())
        c.__setstate__(([], None, None, None, None, {'x': 1}, 'ignored'))  # no __dict__: ignored
        self.assertFalse(c.IsDestroyed())
        sub = SubCache(None)
        sub.__setstate__((False, None, None, None, None, {'x': 1}, 'ignored'))
        self.assertEqual(sub.x, 1)


class FromPython27Test(unittest.TestCase):
    """Pickles made by 2.7 with protocol 2 (tests/fixtures/make_pickles27.py)
    load on 3.x with the same state, 2.7's str decoded."""

    def setUp(self):
        with open(os.path.join(kRepoDir, 'tests', 'fixtures', 'pickles27.json')) as f:
            fixture = json.load(f)
        self.source = binascii.unhexlify(fixture['source'])
        self.pickles = dict((k, binascii.unhexlify(v)) for k, v in fixture.items() if k != 'source')

    def Load(self, key, encoding):
        if not PY3:
            return pickle.loads(self.pickles[key])
        return pickle.loads(self.pickles[key], encoding=encoding)

    def Fresh(self):
        """What this interpreter makes of the same source: a finder after a
        whole pass and a cache asked the same questions."""
        lst = Read(self.source.decode('utf-8') if PY3 else self.source)
        finder = CChangeFinder(lst)
        finder.FindChanges(lst, [])
        cache = CScopeBodyCache(lst)
        cache.GetBodyOfScope('A#0.f#1')
        cache.GetScopeDef('g#0.A#0')
        return finder, cache

    def testSameStateAsAFreshPass(self):
        finder, cache = self.Fresh()
        # utf-8 gives 2.7's tokens as this interpreter reads the source.
        for key, fresh in [('finder', finder), ('cache', cache)]:
            loaded = self.Load(key, 'utf-8')
            self.assertIs(type(loaded), type(fresh))
            self.assertEqual(Fields(loaded), Fields(fresh), key)
        loaded_finder, loaded_cache = self.Load('pair', 'utf-8')
        self.assertIs(loaded_finder._fLogicalList, loaded_cache._fLogicalList)

    def testNamesDecodedWithLatin1(self):
        # latin1 takes every byte for a character: the names (ASCII) are the
        # same; the one token outside ASCII is its UTF-8 bytes as characters.
        finder, _ = self.Fresh()
        loaded = self.Load('finder', 'latin1')
        self.assertEqual(Names(loaded._fLogicalList), Names(finder._fLogicalList))
        for name in [n for pair in Names(loaded._fLogicalList) for n in pair if n is not None]:
            self.assertIs(type(name), str)
        tokens = [t for l in loaded._fLogicalList for t in l.fTokens]
        self.assertIn("'\xc3\xa9t\xc3\xa9'", tokens)

    def testLoadedObjectsWork(self):
        finder, cache = self.Fresh()
        loaded_finder, loaded_cache = self.Load('pair', 'latin1')
        lst = loaded_finder._fLogicalList
        # An edit through the loaded finder: the last line removed.
        removed = [lst.pop()]
        self.assertEqual(loaded_finder.FindChanges([], removed), ({'g#0.A#0'}, set(), set()))
        loaded_cache.Clear(['g#0.A#0', 'g#0'])
        self.assertEqual([l.fLineno for l in loaded_cache.GetBodyOfScope('A#0.f#1')],
                         [l.fLineno for l in cache.GetBodyOfScope('A#0.f#1')])
        self.assertEqual(Names(lst), Names(finder._fLogicalList)[:-1])


if __name__ == '__main__':
    unittest.main()
