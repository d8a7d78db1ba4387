"""CScopeBodyCache: scope defs and bodies by full dotted name."""

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


def Named(source):
    lst = ReadLogicals(textwrap.dedent(source))
    CChangeFinder(lst).FindChanges(lst, [])
    return lst


def Logical(tokens, indent=0, kind=0, lineno=1):
    return LogicalLineType(list(tokens), lineno, indent, kind)


def Lines(logicals):
    return [l.fLineno for l in logicals]


def Sub(lst, **methods):
    return type('Sub', (CScopeBodyCache,), methods)(lst)


class CountingCache(CScopeBodyCache):

    def __init__(self, lst):
        CScopeBodyCache.__init__(self, lst)
        self.calls = []

    def _FindScopeDef(self, scope_name):
        self.calls.append(('def', scope_name))
        return CScopeBodyCache._FindScopeDef(self, scope_name)

    def _FindBodyOfScopeDef(self, scope_def):
        self.calls.append(('body', scope_def))
        return CScopeBodyCache._FindBodyOfScopeDef(self, scope_def)

    def Asked(self, what):
        return [n for w, n in self.calls if w == what]


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


class CacheTestCase(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)
        self.cache = CScopeBodyCache(self.lst)

    def Fails(self, exc, message, fn, *args, **kwargs):
        with self.assertRaises(exc) as cm:
            fn(*args, **kwargs)
        self.assertEqual(cm.exception.args[0] if exc is KeyError else str(cm.exception), message)

    def Cached(self, cache=None):
        cache = cache or self.cache
        return sorted(cache._fScopeBodyCache), sorted(cache._fScopeDefCache)


class ResolutionTest(CacheTestCase):

    def testNamesResolveDownThroughCachedBodies(self):
        self.assertIsNone(self.cache.GetScopeDef(''))
        self.assertEqual(Lines(self.cache.GetBodyOfScope('')), [1, 8, 10])
        for name, line, body in [('A#0', 1, [2, 7]), ('A#0.f#0', 2, [3, 4, 6]), ('A#0.f#0.g#0', 4, [5]),
                                 ('f#0', 8, [9]), ('f#1', 10, [11]), ('f#1.B#0', 11, [12, 13])]:
            d = self.cache.GetScopeDef(name)
            self.assertEqual((d.fLineno, GetFullNameForScopeDef(d)), (line, name))
            self.assertEqual(Lines(self.cache.GetBodyOfScope(name)), body, name)

    def testAncestorsAskedInOrderAndCached(self):
        cache = CountingCache(self.lst)
        cache.GetBodyOfScope('A#0.f#0.g#0')
        self.assertEqual(cache.Asked('def'), ['A#0.f#0.g#0', 'A#0.f#0', 'A#0', ''])
        names = ['', 'A#0', 'A#0.f#0', 'A#0.f#0.g#0']
        self.assertEqual(self.Cached(cache), (names, names))
        self.assertIsNone(cache._fScopeDefCache[''])

    def testNamelessDefOpensNoScope(self):
        lst = [Logical(['def', 'f', ':'], 0, 2, 1), Logical(['def'], 4, 2, 2), Logical(['x'], 8, 0, 3)]
        self.assertEqual(CScopeBodyCache(lst).GetBodyOfScope('f'), lst[1:])

    def testNamesWithoutIndices(self):
        one, two = [Logical(['def', 'f', '(', ')', ':'], kind=2, lineno=n) for n in (1, 2)]
        self.assertIs(CScopeBodyCache([one, two]).GetScopeDef('f'), one)
        d = Logical(['async', 'def', 'h', '(', ')', ':'], kind=2)
        self.assertIs(CScopeBodyCache([d]).GetScopeDef('h'), d)
        a = Logical(['class', 'A', ':'], kind=1)
        a.fLocalScopeName = 'Renamed'
        self.assertIs(CScopeBodyCache([a]).GetScopeDef('Renamed'), a)
        self.assertRaises(KeyError, CScopeBodyCache([a]).GetScopeDef, 'A')


class BodyTest(unittest.TestCase):

    def testBlocksInNestedScopesAndWhitespaceOut(self):
        cache = CScopeBodyCache(Named("""\
            def f():
                if a:
                    for b in c:
                        try:
                            d = 1
            # at the margin

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
            class A:
                # only a comment
            """))
        for name, lines in [('', [1, 18, 19]), ('f#0', [2, 3, 4, 5, 8, 9, 11, 12, 17]),
                            ('f#0.g#0', [13, 14, 15]), ('f#0.g#0.H#0', [16]), ('A#0', [])]:
            self.assertEqual(Lines(cache.GetBodyOfScope(name)), lines, name)
        fresh = cache._FindBodyOfScopeDef(None)
        self.assertEqual(fresh, cache.GetBodyOfScope(''))
        self.assertIsNot(fresh, cache._FindBodyOfScopeDef(None))
        self.assertIsNot(fresh, cache.GetBodyOfScope(''))


class CacheTest(CacheTestCase):

    def Fill(self):
        self.cache = CScopeBodyCache(self.lst)
        for name in ['A#0.f#0.g#0', 'f#1.B#0', 'f#0']:
            self.cache.GetBodyOfScope(name)

    def testServedUnchangedUntilCleared(self):
        body = self.cache.GetBodyOfScope('A#0')
        d = self.cache.GetScopeDef('A#0')
        self.lst.insert(7, Logical(['new'], 4, 0, 7))
        self.assertIs(self.cache.GetBodyOfScope('A#0'), body)
        self.assertIs(self.cache.GetScopeDef('A#0'), d)
        self.assertEqual(len(body), 2)
        self.cache.Clear(['A#0'])
        self.assertEqual(len(self.cache.GetBodyOfScope('A#0')), 3)

    def testCachedAgainstNoneNotEmptiness(self):
        cache = CountingCache(self.lst)
        for _ in range(3):
            cache.GetBodyOfScope('A#0.f#0')
            self.assertIsNone(cache.GetScopeDef(''))
        # The module's def is None, so it is asked for again each time.
        self.assertEqual(cache.Asked('def'), ['A#0.f#0', 'A#0', '', '', '', ''])
        self.assertEqual(len(cache.Asked('body')), 3)
        cache._fScopeBodyCache['A#0'] = None
        self.assertEqual(Lines(cache.GetBodyOfScope('A#0')), [2, 7])
        cache = CountingCache(Named('class A:\n    # only a comment\n'))
        self.assertEqual(cache.GetBodyOfScope('A#0'), [])
        del cache.calls[:]
        self.assertEqual(cache.GetBodyOfScope('A#0'), [])
        self.assertEqual(cache.calls, [])

    def testClear(self):
        kept = ['', 'A#0.f#0', 'A#0.f#0.g#0', 'f#1', 'f#1.B#0']
        some = ['A#0', 'f#0']
        # Items after "*" are not looked at: len(5) would raise.
        for args, kwargs, left in [
                ((), {}, []), (('*',), {}, []), ((['*'],), {}, []), ((('*',),), {}, []), ((iter(['*']),), {}, []),
                (('a*',), {}, []), ((['f#0', '*', 5],), {}, []), ((some + ['not cached', '**', '*x'],), {}, kept),
                ((tuple(some),), {}, kept), ((iter(some),), {}, kept), (((n for n in some),), {}, kept),
                ((dict.fromkeys(some),), {}, kept), ((), {'scope_names': some}, kept)]:
            self.Fill()
            self.cache.Clear(*args, **kwargs)
            self.assertEqual(self.Cached(), (left, left), (args, kwargs))

    def testClearItemErrors(self):
        self.Fill()
        self.Fails(TypeError, "object of type 'int' has no len()", self.cache.Clear, ['f#0', 5])
        self.assertNotIn('f#0', self.cache._fScopeBodyCache)  # earlier items done
        self.Fails(TypeError, "'NoneType' object is not iterable", self.cache.Clear, None)
        self.assertRaises(TypeError, self.cache.Clear, [['unhashable']])


class FailureTest(CacheTestCase):

    def testMessagesAndNothingCachedForTheFailingName(self):
        plain, c, none = self.lst[2], self.cache, CScopeBodyCache(None)
        missing, no_len = 'No logical found for scope name: %r', "object of type '%s' has no len()"
        for exc, message, fn, arg in [
                (KeyError, missing % 'A#0.nope#0', c.GetBodyOfScope, 'A#0.nope#0'),
                (KeyError, missing % 'A', c.GetScopeDef, 'A'),
                (KeyError, missing % 'f#2', c._FindScopeDef, 'f#2'),
                (ValueError, 'logical must start a scope: %r' % plain, c._FindBodyOfScopeDef, plain),
                (TypeError, 'Argument must be a logical', c._FindBodyOfScopeDef, 3),
                (TypeError, "unhashable type: 'list'", c.GetBodyOfScope, ['x']),
                (TypeError, no_len % 'int', c.GetScopeDef, 5),
                (TypeError, 'Argument must be a logical', CScopeBodyCache([plain, 'x']).GetBodyOfScope, ''),
                (TypeError, no_len % 'NoneType', none.GetBodyOfScope, ''),
                (TypeError, no_len % 'NoneType', none._FindScopeDef, None)]:
            self.Fails(exc, message, fn, arg)
        self.assertEqual(self.Cached(), (['', 'A#0'], ['', 'A#0']))

    def testLogicalsChangedUnderTheCache(self):
        d = self.cache.GetScopeDef('f#1.B#0')
        self.lst.remove(d)
        self.Fails(IndexError, 'scope defining logical is not in logical list',
                   self.cache.GetBodyOfScope, 'f#1.B#0')
        # A plain line given a defined name resolves as a def, but has no body.
        plain = self.lst[2]
        plain.fLocalScopeName = 'odd#0'
        self.assertIs(self.cache.GetScopeDef('A#0.f#0.odd#0'), plain)
        self.Fails(ValueError, 'logical must start a scope: %r' % plain,
                   self.cache.GetBodyOfScope, 'A#0.f#0.odd#0')
        self.assertEqual(self.Cached()[0], ['', 'A#0', 'A#0.f#0', 'f#1'])
        self.lst[0].fLocalScopeName = u'A#0'
        self.Fails(TypeError, 'Expected bytes, got unicode', CScopeBodyCache(self.lst).GetScopeDef, 'A#0')

    def testDestroyedCache(self):
        self.cache.GetBodyOfScope('A#0')
        self.cache.destroy()
        self.assertTrue(self.cache.IsDestroyed())
        self.assertEqual((self.cache._fScopeBodyCache, self.cache._fScopeDefCache), (None, None))
        self.assertIs(self.cache._fLogicalList, self.lst)
        c = self.cache
        for attr, fn, args in [('get', c.GetBodyOfScope, ['A#0']), ('get', c.GetScopeDef, ['A#0']),
                               ('clear', c.Clear, []), ('pop', c.Clear, [['A#0']])]:
            self.Fails(AttributeError, "'NoneType' object has no attribute '%s'" % attr, fn, *args)
        self.assertEqual(Lines(self.cache._FindBodyOfScopeDef(None)), [1, 8, 10])

    def testArguments(self):
        c = self.cache
        for message, fn, args, kwargs in [
                ('Expected list, got tuple', CScopeBodyCache, [()], {}),
                ('__init__() takes exactly 1 positional argument (0 given)', CScopeBodyCache, [], {}),
                ('GetBodyOfScope() takes no keyword arguments', c.GetBodyOfScope, [], {'scope_name': ''}),
                ('GetScopeDef() takes exactly one argument (2 given)', c.GetScopeDef, ['', ''], {}),
                ('Clear() takes at most 1 positional argument (2 given)', c.Clear, [[], []], {}),
                ("Clear() got an unexpected keyword argument 'names'", c.Clear, [], {'names': []}),
                ('_destroy_impl() takes no arguments (1 given)', c._destroy_impl, [1], {})]:
            self.Fails(TypeError, message, fn, *args, **kwargs)
        self.Fails(TypeError, "descriptor 'GetBodyOfScope' requires a 'pysource.scopebodycache.CScopeBodyCache' "
                   "object but received a 'int'", CScopeBodyCache.__dict__['GetBodyOfScope'], 5, '')
        self.assertIs(CScopeBodyCache(logical_list=self.lst)._fLogicalList, self.lst)
        fresh = CScopeBodyCache.__new__(CScopeBodyCache)
        self.assertEqual((fresh._fLogicalList, fresh._fScopeBodyCache, fresh._fScopeDefCache), (None,) * 3)


class OverrideTest(CacheTestCase):

    def testOverridesTakePartInResolution(self):
        Renamed = lambda s, n: CScopeBodyCache.GetBodyOfScope(s, n.replace('Z', 'A'))  # noqa: E731
        cache = Sub(self.lst, GetBodyOfScope=Renamed)
        self.assertEqual(cache.GetScopeDef('Z#0.f#0').fLineno, 2)
        self.assertIn('A#0', cache._fScopeBodyCache)
        cache = Sub(self.lst, GetScopeDef=lambda s, n: s._fLogicalList[10])
        self.assertEqual(Lines(cache.GetBodyOfScope('x')), [12, 13])
        cache = Sub(self.lst, _FindBodyOfScopeDef=lambda s, d: 'served')
        self.assertEqual(cache.GetBodyOfScope(''), 'served')
        self.Fails(TypeError, 'Argument must be a logical',
                   Sub(self.lst, GetBodyOfScope=lambda s, n: ['not a logical']).GetScopeDef, 'A#0')
        cache = Sub(self.lst, _destroy_impl=lambda s: None)
        cache.destroy()
        self.assertEqual(cache._fScopeBodyCache, {})

    def testFailingOverrideCachesNothing(self):
        def Find(s, d):
            if d is not None:
                raise RuntimeError('no')
            return CScopeBodyCache._FindBodyOfScopeDef(s, d)
        cache = Sub(self.lst, _FindBodyOfScopeDef=Find)
        self.assertRaises(RuntimeError, cache.GetBodyOfScope, 'A#0')
        self.assertEqual(self.Cached(cache), ([''], ['', 'A#0']))

    def testPythonCodeChangingStateUnderTheCall(self):
        def Destroy(s, d):
            s.destroy()
            return []
        self.Fails(TypeError, "'NoneType' object is not subscriptable",
                   Sub(self.lst, _FindBodyOfScopeDef=Destroy).GetBodyOfScope, '')

        def Empty(s, n):
            body = CScopeBodyCache.GetBodyOfScope(s, n)
            del s._fLogicalList[:]
            return body
        self.assertEqual(Sub(self.lst, GetBodyOfScope=Empty).GetScopeDef('A#0').fLineno, 1)

        # A key equal to a cached name that empties the cache once found there.
        cache, compared = CScopeBodyCache(Named(kNested)), []
        key = type('Key', (object,), {'__len__': lambda s: 3, '__hash__': lambda s: hash('A#0'),
                                      '__eq__': lambda s, o: compared.append(o) or len(compared) != 2
                                      or cache.Clear() or True})()
        cache.GetBodyOfScope('A#0')
        cache.Clear([key])
        self.assertEqual(cache._fScopeBodyCache, {})


class LeakTest(CacheTestCase):

    def testLookupsClearsAndFailuresFlat(self):
        name, missing, plain, cache = 'A#0.f#0.g#0', 'A#0.nope#0', self.lst[2], self.cache
        body, d = cache.GetBodyOfScope(name), cache.GetScopeDef(name)

        def Run():
            cache.GetBodyOfScope(name)
            cache.GetScopeDef(name)
            cache.Clear([name, 'f#1'])
            cache.GetBodyOfScope(name)
            cache._FindBodyOfScopeDef(d)
            cache.Clear('*')
            for fn, arg in [(cache.GetBodyOfScope, missing), (cache._FindBodyOfScopeDef, plain),
                            (cache.Clear, [5]), (cache.GetScopeDef, 3)]:
                self.assertRaises((KeyError, ValueError, TypeError), fn, arg)
        for _ in range(5):
            Run()
        watched = [name, missing, self.lst, d, body, cache] + self.lst
        gc.collect()
        counts, objects = [sys.getrefcount(w) for w in watched], len(gc.get_objects())
        for _ in range(200):
            Run()
        gc.collect()
        self.assertEqual([sys.getrefcount(w) for w in watched], counts)
        self.assertLessEqual(len(gc.get_objects()), objects + 2)

    def testCycleThroughCacheCollected(self):
        cache = Sub(self.lst)
        cache._fScopeBodyCache['self'] = [cache]
        ref = weakref.ref(cache)
        del cache
        gc.collect()
        self.assertIsNone(ref())


class CrossCheckTest(unittest.TestCase):

    def testStdlibSampleAgreesWithAst(self):
        files = crosscheck_bodies.PythonFiles(crosscheck_bodies.StdlibDir())
        totals = crosscheck_bodies.CheckFiles(files[::270 if SANITIZED else 90])
        self.assertGreater(totals['files'], 3)
        self.assertGreater(totals['scopes'], 100)
        self.assertEqual(totals['details'], [])

    def testCheckCatchesShortBodies(self):
        source = 'class A:\n    def f(self):\n        if x:\n            pass\n' \
                 '        else:\n            y = 1\n'
        self.assertEqual(crosscheck_bodies.CheckSource(source), (3, []))
        real = CScopeBodyCache._FindBodyOfScopeDef
        try:
            crosscheck_bodies.CScopeBodyCache = type('Short', (CScopeBodyCache,), {
                '_FindBodyOfScopeDef': lambda s, d: real(s, d)[:-1] if d else real(s, d)})
            disagreements = crosscheck_bodies.CheckSource(source)[1]
        finally:
            crosscheck_bodies.CScopeBodyCache = CScopeBodyCache
        self.assertIn("body of 'A#0' lacks lines [2]", disagreements)


if __name__ == '__main__':
    unittest.main()
