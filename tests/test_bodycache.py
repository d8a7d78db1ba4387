"""Tests of CScopeBodyCache: scope defs and bodies by full dotted name."""

import gc
import os
import sys
import textwrap
import unittest
import weakref

from pysource._fastaccess import LogicalLineType
from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache, GetFullNameForScopeDef

sys.path.insert(0, os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), 'tools'))
import crosscheck_bodies  # noqa: E402

SANITIZED = bool(os.environ.get('SBC_SANITIZED'))

kClass, kDef, kComment, kBlank = 1, 2, 21, 22


def Named(source):
    """Logicals of `source` (dedented) after a whole-list pass."""
    lst = ReadLogicals(textwrap.dedent(source))
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def Logical(tokens, indent=0, kind=0, lineno=1, local=None):
    l = LogicalLineType(list(tokens), lineno, indent, kind)
    if local is not None:
        l.fLocalScopeName = local
    return l


def Lines(logicals):
    return [l.fLineno for l in logicals]


class CountingCache(CScopeBodyCache):
    """Counts the calls the lookups make to each other."""

    def __init__(self, lst):
        CScopeBodyCache.__init__(self, lst)
        self.calls = []

    def _FindScopeDef(self, scope_name):
        self.calls.append(('_FindScopeDef', scope_name))
        return CScopeBodyCache._FindScopeDef(self, scope_name)

    def _FindBodyOfScopeDef(self, scope_def):
        self.calls.append(('_FindBodyOfScopeDef', scope_def))
        return CScopeBodyCache._FindBodyOfScopeDef(self, scope_def)


kNested = """\
class A:
    def f(self):
        x = 1
        def g():
            y = 2
        return g
    z = 3
def f():
    pass
def f():
    class B:
        if 1:
            w = 4
"""


class ResolutionTest(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)
        self.cache = CScopeBodyCache(self.lst)

    def testModuleScope(self):
        self.assertIsNone(self.cache.GetScopeDef(''))
        self.assertEqual(Lines(self.cache.GetBodyOfScope('')), [1, 8, 10])
        self.assertIn('', self.cache._fScopeBodyCache)

    def testNamesResolveDownThroughBodies(self):
        for name, line in [('A#0', 1), ('A#0.f#0', 2), ('A#0.f#0.g#0', 4), ('f#0', 8), ('f#1', 10),
                           ('f#1.B#0', 11)]:
            d = self.cache.GetScopeDef(name)
            self.assertEqual(d.fLineno, line, name)
            self.assertEqual(GetFullNameForScopeDef(d), name)

    def testScopeIndexSelectsAmongSameNames(self):
        self.assertEqual(Lines(self.cache.GetBodyOfScope('f#0')), [9])
        self.assertEqual(Lines(self.cache.GetBodyOfScope('f#1')), [11])

    def testEveryAncestorCachedOnTheWay(self):
        self.cache.GetBodyOfScope('A#0.f#0.g#0')
        self.assertEqual(sorted(self.cache._fScopeBodyCache), ['', 'A#0', 'A#0.f#0', 'A#0.f#0.g#0'])
        self.assertEqual(sorted(self.cache._fScopeDefCache), ['', 'A#0', 'A#0.f#0', 'A#0.f#0.g#0'])
        self.assertIsNone(self.cache._fScopeDefCache[''])

    def testFirstOfSameNamesWithoutIndices(self):
        one = Logical(['def', 'f', '(', ')', ':'], kind=kDef, lineno=1)
        two = Logical(['def', 'f', '(', ')', ':'], kind=kDef, lineno=2)
        cache = CScopeBodyCache([one, two])
        self.assertIs(cache.GetScopeDef('f'), one)

    def testLocalScopeNameWinsOverTokens(self):
        a = Logical(['class', 'A', ':'], kind=kClass, local='Renamed')
        cache = CScopeBodyCache([a])
        self.assertIs(cache.GetScopeDef('Renamed'), a)
        self.assertRaises(KeyError, cache.GetScopeDef, 'A')

    def testNameFromTokensSkipsKeywords(self):
        d = Logical(['async', 'def', 'h', '(', ')', ':'], kind=kDef)
        self.assertIs(CScopeBodyCache([d]).GetScopeDef('h'), d)

    def testThreePartNameJoinsParentWithDots(self):
        cache = CountingCache(self.lst)
        cache.GetScopeDef('A#0.f#0.g#0')
        asked = [n for what, n in cache.calls if what == '_FindScopeDef']
        self.assertEqual(asked, ['A#0.f#0.g#0', 'A#0.f#0', 'A#0', ''])


class BodyTest(unittest.TestCase):

    def testExampleOfNestingAndComments(self):
        lst = [Logical(['class', 'A', ':'], 0, kClass, 1), Logical(['def', 'f', ':'], 4, kDef, 2),
               Logical(['x', '=', '1'], 8, 0, 3), Logical(['# c'], 0, kComment, 4),
               Logical(['y', '=', '2'], 4, 0, 5), Logical(['z', '=', '3'], 0, 0, 6)]
        cache = CScopeBodyCache(lst)
        self.assertEqual(cache.GetBodyOfScope('A'), [lst[1], lst[4]])
        self.assertEqual(cache.GetBodyOfScope(''), [lst[0], lst[5]])
        self.assertEqual(cache.GetBodyOfScope('A.f'), [lst[2]])

    def testBlocksInNestedScopesOut(self):
        lst = Named("""\
            def f():
                if a:
                    for b in c:
                        try:
                            d = 1
                        except E:
                            pass
                    # comment
                @deco
                def g():
                    while 1:
                        pass
                    class H:
                        pass
                e = 2
            q = 3
            """)
        cache = CScopeBodyCache(lst)
        self.assertEqual(Lines(cache.GetBodyOfScope('f#0')), [2, 3, 4, 5, 6, 7, 9, 10, 15])
        self.assertEqual(Lines(cache.GetBodyOfScope('f#0.g#0')), [11, 12, 13])
        self.assertEqual(Lines(cache.GetBodyOfScope('f#0.g#0.H#0')), [14])
        self.assertEqual(Lines(cache.GetBodyOfScope('')), [1, 16])

    def testDeepNestingReturnsToOuterDepth(self):
        # A nested scope ends at a line no deeper than its header; the
        # lines after it belong to the outer body again.
        lst = Named("""\
            class A:
                class B:
                    class C:
                        def d(self):
                            pass
                    c = 1
                b = 2
            """)
        cache = CScopeBodyCache(lst)
        self.assertEqual(Lines(cache.GetBodyOfScope('A#0')), [2, 7])
        self.assertEqual(Lines(cache.GetBodyOfScope('A#0.B#0')), [3, 6])
        self.assertEqual(Lines(cache.GetBodyOfScope('A#0.B#0.C#0')), [4])
        self.assertEqual(Lines(cache.GetBodyOfScope('A#0.B#0.C#0.d#0')), [5])

    def testWhitespaceNeitherJoinsNorEnds(self):
        lst = [Logical(['def', 'f', ':'], 4, kDef, 1), Logical([], 0, kBlank, 2),
               Logical(['# x'], 0, kComment, 3), Logical(['a'], 8, 0, 4), Logical(['b'], 4, 0, 5)]
        cache = CScopeBodyCache(lst)
        self.assertEqual(cache._FindBodyOfScopeDef(lst[0]), [lst[3]])

    def testHeaderAndEarlierLinesExcluded(self):
        lst = Named("x = 1\ndef f():\n    y = 2\n")
        body = CScopeBodyCache(lst)._FindBodyOfScopeDef(lst[1])
        self.assertEqual(Lines(body), [3])

    def testEmptyBody(self):
        lst = Named("class A:\n    # only a comment\nx = 1\n")
        self.assertEqual(CScopeBodyCache(lst).GetBodyOfScope('A#0'), [])

    def testFindBodyGivesNewListEachTime(self):
        lst = Named(kNested)
        cache = CScopeBodyCache(lst)
        one = cache._FindBodyOfScopeDef(None)
        self.assertEqual(one, cache._FindBodyOfScopeDef(None))
        self.assertIsNot(one, cache._FindBodyOfScopeDef(None))
        self.assertEqual(cache._fScopeBodyCache, {})


class CacheTest(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)
        self.cache = CountingCache(self.lst)

    def testServedUnchangedUntilCleared(self):
        body = self.cache.GetBodyOfScope('A#0')
        d = self.cache.GetScopeDef('A#0')
        self.lst.insert(7, Logical(['new'], 4, 0, 7))
        self.assertIs(self.cache.GetBodyOfScope('A#0'), body)
        self.assertIs(self.cache.GetScopeDef('A#0'), d)
        self.assertEqual(len(self.cache.GetBodyOfScope('A#0')), 2)
        self.cache.Clear(['A#0'])
        self.assertEqual(len(self.cache.GetBodyOfScope('A#0')), 3)

    def testEachAnswerComputedOnce(self):
        for _ in range(3):
            self.cache.GetBodyOfScope('A#0.f#0')
        found = [n for what, n in self.cache.calls if what == '_FindScopeDef']
        # The module's def is None, which counts as absent: asked again
        # only when the module body itself is recomputed.
        self.assertEqual(found, ['A#0.f#0', 'A#0', ''])
        self.assertEqual(len([c for c in self.cache.calls if c[0] == '_FindBodyOfScopeDef']), 3)

    def testModuleDefRecomputedEveryTime(self):
        for _ in range(3):
            self.assertIsNone(self.cache.GetScopeDef(''))
        self.assertEqual(self.cache.calls, [('_FindScopeDef', '')] * 3)

    def testEmptyBodyCachedAgainstNoneNotEmptiness(self):
        cache = CountingCache(Named("class A:\n    # only a comment\n"))
        self.assertEqual(cache.GetBodyOfScope('A#0'), [])
        del cache.calls[:]
        self.assertEqual(cache.GetBodyOfScope('A#0'), [])
        self.assertEqual(cache.calls, [])

    def testStoredNoneCountsAsAbsent(self):
        self.cache._fScopeBodyCache['A#0'] = None
        self.assertEqual(Lines(self.cache.GetBodyOfScope('A#0')), [2, 7])

    def Fill(self):
        for name in ['A#0.f#0.g#0', 'f#1.B#0', 'f#0']:
            self.cache.GetBodyOfScope(name)

    def testClearEverything(self):
        for everything in [(), ('*',), (['*'],), (('*',),), (iter(['*']),), ('a*',)]:
            self.Fill()
            self.cache.Clear(*everything)
            self.assertEqual((self.cache._fScopeBodyCache, self.cache._fScopeDefCache), ({}, {}),
                             everything)

    def testClearNamesLeavesNestedScopes(self):
        self.Fill()
        self.cache.Clear(['A#0', 'f#0', 'not cached'])
        self.assertEqual(sorted(self.cache._fScopeBodyCache),
                         ['', 'A#0.f#0', 'A#0.f#0.g#0', 'f#1', 'f#1.B#0'])
        self.assertNotIn('A#0', self.cache._fScopeDefCache)
        self.assertIn('A#0.f#0', self.cache._fScopeDefCache)

    def testClearByTupleIteratorAndKeyword(self):
        for names in [('A#0',), iter(['A#0']), (n for n in ['A#0']), {'A#0': 1}]:
            self.Fill()
            self.cache.Clear(names)
            self.assertNotIn('A#0', self.cache._fScopeBodyCache)
        self.Fill()
        self.cache.Clear(scope_names=['f#0'])
        self.assertNotIn('f#0', self.cache._fScopeBodyCache)

    def testStarStopsAtOnce(self):
        self.Fill()
        # Items after "*" are not looked at: len(5) would raise.
        self.cache.Clear(['f#0', '*', 5])
        self.assertEqual(self.cache._fScopeBodyCache, {})

    def testStarMustBeTheWholeItem(self):
        self.Fill()
        self.cache.Clear(['**', '*x'])
        self.assertIn('A#0', self.cache._fScopeBodyCache)

    def testClearItemErrors(self):
        self.Fill()
        with self.assertRaises(TypeError) as cm:
            self.cache.Clear(['f#0', 5])
        self.assertEqual(str(cm.exception), "object of type 'int' has no len()")
        self.assertNotIn('f#0', self.cache._fScopeBodyCache)  # earlier items done
        with self.assertRaises(TypeError) as cm:
            self.cache.Clear(None)
        self.assertEqual(str(cm.exception), "'NoneType' object is not iterable")
        self.assertRaises(TypeError, self.cache.Clear, [['unhashable']])


class FailureTest(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)
        self.cache = CScopeBodyCache(self.lst)

    def assertRaisesMessage(self, exc, message, fn, *args):
        with self.assertRaises(exc) as cm:
            fn(*args)
        self.assertEqual(str(cm.exception) if exc is not KeyError else cm.exception.args[0], message)

    def testUnknownName(self):
        self.assertRaisesMessage(KeyError, "No logical found for scope name: 'A#0.nope#0'",
                                 self.cache.GetBodyOfScope, 'A#0.nope#0')
        self.assertEqual(sorted(self.cache._fScopeBodyCache), ['', 'A#0'])
        self.assertEqual(sorted(self.cache._fScopeDefCache), ['', 'A#0'])
        self.assertRaisesMessage(KeyError, "No logical found for scope name: 'A'",
                                 self.cache.GetScopeDef, 'A')
        self.assertRaisesMessage(KeyError, "No logical found for scope name: 'f#2'",
                                 self.cache._FindScopeDef, 'f#2')

    def testNonLogicals(self):
        cache = CScopeBodyCache([self.lst[0], 'x'])
        self.assertRaisesMessage(TypeError, 'Argument must be a logical', cache.GetBodyOfScope, '')
        self.assertEqual(cache._fScopeBodyCache, {})
        self.assertRaisesMessage(TypeError, 'Argument must be a logical', self.cache._FindBodyOfScopeDef, 3)

        class Override(CScopeBodyCache):
            def GetBodyOfScope(self, name):
                return ['not a logical']
        self.assertRaisesMessage(TypeError, 'Argument must be a logical',
                                 Override(self.lst).GetScopeDef, 'A#0')

    def testScopeDefMustStartAScope(self):
        plain = self.lst[2]
        self.assertRaisesMessage(ValueError, 'logical must start a scope: %r' % plain,
                                 self.cache._FindBodyOfScopeDef, plain)

    def testNonScopeDefinitionFound(self):
        # A plain line given a defined name resolves as a def, but has no body.
        plain = self.lst[2]
        plain.fLocalScopeName = 'odd#0'
        self.assertIs(self.cache.GetScopeDef('A#0.f#0.odd#0'), plain)
        self.assertRaisesMessage(ValueError, 'logical must start a scope: %r' % plain,
                                 self.cache.GetBodyOfScope, 'A#0.f#0.odd#0')
        self.assertNotIn('A#0.f#0.odd#0', self.cache._fScopeBodyCache)

    def testUnhashableName(self):
        self.assertRaisesMessage(TypeError, "unhashable type: 'list'", self.cache.GetBodyOfScope, ['x'])
        self.assertRaisesMessage(TypeError, "object of type 'int' has no len()", self.cache.GetScopeDef, 5)
        self.assertEqual(self.cache._fScopeDefCache, {})

    def testRemovedScopeDef(self):
        d = self.cache.GetScopeDef('f#1.B#0')
        self.lst.remove(d)
        self.assertRaisesMessage(IndexError, 'scope defining logical is not in logical list',
                                 self.cache.GetBodyOfScope, 'f#1.B#0')
        self.assertNotIn('f#1.B#0', self.cache._fScopeBodyCache)

    def testDestroyedCache(self):
        self.cache.GetBodyOfScope('A#0')
        self.cache.destroy()
        self.assertTrue(self.cache.IsDestroyed())
        self.assertIsNone(self.cache._fScopeBodyCache)
        self.assertIsNone(self.cache._fScopeDefCache)
        self.assertIs(self.cache._fLogicalList, self.lst)
        msg = "'NoneType' object has no attribute '%s'"
        self.assertRaisesMessage(AttributeError, msg % 'get', self.cache.GetBodyOfScope, 'A#0')
        self.assertRaisesMessage(AttributeError, msg % 'get', self.cache.GetScopeDef, 'A#0')
        self.assertRaisesMessage(AttributeError, msg % 'clear', self.cache.Clear)
        self.assertRaisesMessage(AttributeError, msg % 'pop', self.cache.Clear, ['A#0'])
        # The uncached steps still work.
        self.assertEqual(Lines(self.cache._FindBodyOfScopeDef(None)), [1, 8, 10])

    def testNoneLogicalList(self):
        cache = CScopeBodyCache(None)
        self.assertRaisesMessage(TypeError, "object of type 'NoneType' has no len()",
                                 cache.GetBodyOfScope, '')
        self.assertRaisesMessage(TypeError, "object of type 'NoneType' has no len()",
                                 cache._FindScopeDef, None)

    def testLocalScopeNameMustBeStr(self):
        self.lst[0].fLocalScopeName = u'A#0'
        self.assertRaisesMessage(TypeError, 'Expected bytes, got unicode', self.cache.GetScopeDef, 'A#0')

    def testArguments(self):
        self.assertRaisesMessage(TypeError, 'Expected list, got tuple', CScopeBodyCache, ())
        self.assertRaisesMessage(TypeError, '__init__() takes exactly 1 positional argument (0 given)',
                                 CScopeBodyCache)
        self.assertIs(CScopeBodyCache(logical_list=self.lst)._fLogicalList, self.lst)
        self.assertRaisesMessage(TypeError, 'GetBodyOfScope() takes no keyword arguments',
                                 lambda: self.cache.GetBodyOfScope(scope_name=''))
        self.assertRaisesMessage(TypeError, 'GetScopeDef() takes exactly one argument (2 given)',
                                 self.cache.GetScopeDef, '', '')
        self.assertRaisesMessage(TypeError, 'Clear() takes at most 1 positional argument (2 given)',
                                 self.cache.Clear, [], [])
        self.assertRaisesMessage(TypeError, "Clear() got an unexpected keyword argument 'names'",
                                 lambda: self.cache.Clear(names=[]))
        self.assertRaisesMessage(TypeError, '_destroy_impl() takes no arguments (1 given)',
                                 self.cache._destroy_impl, 1)
        self.assertRaises(TypeError, CScopeBodyCache.__dict__['GetBodyOfScope'], 5, '')

    def testInterface(self):
        self.assertIsNone(CScopeBodyCache.__doc__)
        self.assertEqual(CScopeBodyCache._FindScopeDef.__doc__,
                         " Finds the scope def for the name without using the _fScopeDefCache\n"
                         "    for the name (this is used to find the value to put in the cache).\n"
                         "    Raises KeyError if scope isn't found ")
        for name in ['GetBodyOfScope', 'GetScopeDef', 'Clear', '_FindBodyOfScopeDef', '_destroy_impl']:
            self.assertIsNone(getattr(CScopeBodyCache, name).__doc__, name)
        self.assertEqual(CScopeBodyCache.GetBodyOfScope.__module__, 'pysource.scopebodycache')
        for attr in ['_fLogicalList', '_fScopeBodyCache', '_fScopeDefCache']:
            self.assertRaises(AttributeError, setattr, self.cache, attr, None)
        fresh = CScopeBodyCache.__new__(CScopeBodyCache)
        self.assertEqual((fresh._fLogicalList, fresh._fScopeBodyCache, fresh._fScopeDefCache),
                         (None, None, None))


class OverrideTest(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)

    def testOverridesTakePartInResolution(self):
        class Renaming(CScopeBodyCache):
            def GetBodyOfScope(self, name):
                return CScopeBodyCache.GetBodyOfScope(self, name.replace('Z', 'A'))
        cache = Renaming(self.lst)
        self.assertEqual(cache.GetScopeDef('Z#0.f#0').fLineno, 2)
        self.assertIn('A#0', cache._fScopeBodyCache)

        class Defs(CScopeBodyCache):
            def GetScopeDef(self, name):
                return self._fLogicalList[10]
        self.assertEqual(Lines(Defs(self.lst).GetBodyOfScope('anything')), [12, 13])

        class Bodies(CScopeBodyCache):
            def _FindBodyOfScopeDef(self, scope_def):
                return 'served'
        self.assertEqual(Bodies(self.lst).GetBodyOfScope(''), 'served')

    def testFailingOverrideCachesNothing(self):
        class Failing(CScopeBodyCache):
            def _FindBodyOfScopeDef(self, scope_def):
                if scope_def is not None:
                    raise RuntimeError('no')
                return CScopeBodyCache._FindBodyOfScopeDef(self, scope_def)
        cache = Failing(self.lst)
        self.assertRaises(RuntimeError, cache.GetBodyOfScope, 'A#0')
        self.assertEqual(sorted(cache._fScopeBodyCache), [''])
        self.assertEqual(sorted(cache._fScopeDefCache), ['', 'A#0'])

    def testDestroyedWhileResolving(self):
        class Destroying(CScopeBodyCache):
            def _FindBodyOfScopeDef(self, scope_def):
                self.destroy()
                return []
        with self.assertRaises(TypeError) as cm:
            Destroying(self.lst).GetBodyOfScope('')
        self.assertEqual(str(cm.exception), "'NoneType' object is not subscriptable")

    def testListEmptiedUnderTheLookup(self):
        class Emptying(CScopeBodyCache):
            def GetBodyOfScope(self, name):
                body = CScopeBodyCache.GetBodyOfScope(self, name)
                del self._fLogicalList[:]
                return body
        self.assertEqual(Emptying(self.lst).GetScopeDef('A#0').fLineno, 1)

    def testKeyWhoseComparisonClears(self):
        cache = CScopeBodyCache(self.lst)

        class Key(object):
            def __len__(self):
                return 3

            def __hash__(self):
                return hash('A#0')

            def __eq__(self, other):
                cache.Clear()
                return False
        cache.GetBodyOfScope('A#0')
        cache.Clear([Key()])
        self.assertEqual(cache._fScopeBodyCache, {})

    def testDestroyImplOverridden(self):
        class Keeping(CScopeBodyCache):
            def _destroy_impl(self):
                pass
        cache = Keeping(self.lst)
        cache.destroy()
        self.assertEqual(cache._fScopeBodyCache, {})


def AssertFlat(test, fn, watched, rounds=200):
    """fn() run many times leaves refcounts of `watched` and gc objects flat."""
    for _ in range(5):
        fn()
    gc.collect()
    counts = [sys.getrefcount(w) for w in watched]
    objects = len(gc.get_objects())
    for _ in range(rounds):
        fn()
    gc.collect()
    test.assertEqual([sys.getrefcount(w) for w in watched], counts)
    test.assertLessEqual(len(gc.get_objects()), objects + 2)


class LeakTest(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)

    def testLookupsAndClears(self):
        name = 'A#0.f#0.g#0'
        cache = CScopeBodyCache(self.lst)
        body = cache.GetBodyOfScope(name)
        d = cache.GetScopeDef(name)

        def Run():
            cache.GetBodyOfScope(name)
            cache.GetScopeDef(name)
            cache.Clear([name, 'f#1'])
            cache.GetBodyOfScope(name)
            cache._FindBodyOfScopeDef(d)
            cache.Clear('*')
        AssertFlat(self, Run, [name, self.lst, d, body, cache] + self.lst)

    def testFailures(self):
        cache = CScopeBodyCache(self.lst)
        plain = self.lst[2]
        missing = 'A#0.nope#0'

        def Run():
            for fn, arg in [(cache.GetBodyOfScope, missing), (cache._FindBodyOfScopeDef, plain),
                            (cache.Clear, [5]), (cache.GetScopeDef, 3)]:
                try:
                    fn(arg)
                except (KeyError, ValueError, TypeError):
                    pass
        AssertFlat(self, Run, [missing, plain, cache])

    def testCycleThroughCacheCollected(self):
        class Sub(CScopeBodyCache):
            pass
        cache = Sub(self.lst)
        cache._fScopeBodyCache['self'] = [cache]
        ref = weakref.ref(cache)
        del cache
        gc.collect()
        self.assertIsNone(ref())


def StdlibSample(step):
    files = crosscheck_bodies.PythonFiles(crosscheck_bodies.StdlibDir())
    return files[::step]


class CrossCheckTest(unittest.TestCase):
    """Bodies and defs agree with the ast module on real code."""

    def testStdlibSample(self):
        totals = crosscheck_bodies.CheckFiles(StdlibSample(270 if SANITIZED else 90))
        self.assertGreater(totals['files'], 3)
        self.assertGreater(totals['scopes'], 100)
        self.assertEqual(totals['details'], [])

    def testCheckCatchesWrongBodies(self):
        source = textwrap.dedent("""\
            class A:
                def f(self):
                    if x:
                        pass
                    else:
                        y = 1
                @property
                def g(self):
                    return 1
                def h(self): return 2
            """)
        self.assertEqual(crosscheck_bodies.CheckSource(source), (5, []))
        real = CScopeBodyCache._FindBodyOfScopeDef
        try:
            # Scope bodies that lose their last line must be caught.
            crosscheck_bodies.CScopeBodyCache = type('Short', (CScopeBodyCache,), {
                '_FindBodyOfScopeDef': lambda s, d: real(s, d)[:-1] if d else real(s, d)})
            scopes, disagreements = crosscheck_bodies.CheckSource(source)
        finally:
            crosscheck_bodies.CScopeBodyCache = CScopeBodyCache
        self.assertTrue(any('lacks lines [6]' in d for d in disagreements), disagreements)
        self.assertTrue(any('lacks lines [10]' in d for d in disagreements), disagreements)


if __name__ == '__main__':
    unittest.main()
