"""CScopeBodyCache: scope defs and bodies by full dotted name."""

import unittest

from pysource.scopebodycache import CScopeBodyCache, GetFullNameForScopeDef

from support import SANITIZED, Logical, Named, OtherText, Outcome, Text, kDefKind, kOtherTextName
import crosscheck_bodies  # tools/ is on the path through support

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


def Lines(logicals):
    return [l.fLineno for l in logicals]


def Sub(lst, **methods):
    return type('Sub', (CScopeBodyCache,), methods)(lst)


def Counting(lst):
    """A cache recording the names _FindScopeDef is asked for, and 'body' for each _FindBodyOfScopeDef."""
    calls = []
    return Sub(lst, _FindScopeDef=lambda s, n: calls.append(n) or CScopeBodyCache._FindScopeDef(s, n),
               _FindBodyOfScopeDef=lambda s, d: calls.append('body')
               or CScopeBodyCache._FindBodyOfScopeDef(s, d)), calls


class CacheTestCase(unittest.TestCase):

    def setUp(self):
        self.lst = Named(kNested)
        self.cache = CScopeBodyCache(self.lst)

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
        cache, calls = Counting(self.lst)
        cache.GetBodyOfScope('A#0.f#0.g#0')
        self.assertEqual([n for n in calls if n != 'body'], ['A#0.f#0.g#0', 'A#0.f#0', 'A#0', ''])
        names = ['', 'A#0', 'A#0.f#0', 'A#0.f#0.g#0']
        self.assertEqual(self.Cached(cache), (names, names))
        self.assertIsNone(cache._fScopeDefCache[''])

    def testNamelessAndRepeatedDefs(self):
        # A nameless def opens no scope: the lines under it stay in the body.
        lst = [Logical(['def', 'f', ':'], 1, 0, kDefKind), Logical(['def'], 2, 4, kDefKind), Logical(['x'], 3, 8)]
        self.assertEqual(CScopeBodyCache(lst).GetBodyOfScope('f'), lst[1:])
        one, two = [Logical(['def', 'f', '(', ')', ':'], n, kind=kDefKind) for n in (1, 2)]
        self.assertIs(CScopeBodyCache([one, two]).GetScopeDef('f'), one)

    def testBlocksInNestedScopesAndWhitespaceOut(self):
        cache = CScopeBodyCache(Named("""\
            def f():
                if a:
            # at the margin

                    d = 1
                @deco
                def g():
                    class H:
                        pass
                e = 2
            class A:
                # only a comment
            """))
        for name, lines in [('', [1, 11]), ('f#0', [2, 5, 6, 7, 10]), ('f#0.g#0', [8]), ('f#0.g#0.H#0', [9]),
                            ('A#0', [])]:
            self.assertEqual(Lines(cache.GetBodyOfScope(name)), lines, name)
        fresh = cache._FindBodyOfScopeDef(None)
        self.assertEqual((fresh, fresh is cache._FindBodyOfScopeDef(None)), (cache.GetBodyOfScope(''), False))


class CacheTest(CacheTestCase):

    def testServedUnchangedUntilCleared(self):
        body, d = self.cache.GetBodyOfScope('A#0'), self.cache.GetScopeDef('A#0')
        self.lst.insert(7, Logical(['new'], 7, 4))
        self.assertIs(self.cache.GetBodyOfScope('A#0'), body)
        self.assertIs(self.cache.GetScopeDef('A#0'), d)
        self.cache.Clear(['A#0'])
        self.assertEqual(len(self.cache.GetBodyOfScope('A#0')), 3)

    def testCachedAgainstNoneNotEmptiness(self):
        cache, calls = Counting(self.lst)
        for _ in range(3):
            cache.GetBodyOfScope('A#0.f#0')
            self.assertIsNone(cache.GetScopeDef(''))
        # The module's def is None, so it is asked for again each time.
        self.assertEqual(calls, ['A#0.f#0', 'A#0', '', 'body', 'body', 'body', '', '', ''])
        cache._fScopeBodyCache['A#0'] = None
        self.assertEqual(Lines(cache.GetBodyOfScope('A#0')), [2, 7])
        cache, calls = Counting(Named('class A:\n    # only a comment\n'))
        self.assertEqual(cache.GetBodyOfScope('A#0'), [])
        del calls[:]
        self.assertEqual((cache.GetBodyOfScope('A#0'), calls), ([], []))

    def testClear(self):
        kept = ['', 'A#0.f#0', 'A#0.f#0.g#0', 'f#1', 'f#1.B#0']
        some = ['A#0', 'f#0']
        # Items after "*" are not looked at: len(5) would raise.
        for args, kwargs, left in [
                ((), {}, []), (('*',), {}, []), ((['f#0', '*', 5],), {}, []),
                ((some + ['not cached', '**', '*x'],), {}, kept), ((iter(some),), {}, kept),
                ((), {'scope_names': some}, kept)]:
            self.cache = CScopeBodyCache(self.lst)
            for name in ['A#0.f#0.g#0', 'f#1.B#0', 'f#0']:
                self.cache.GetBodyOfScope(name)
            self.cache.Clear(*args, **kwargs)
            self.assertEqual(self.Cached(), (left, left), (args, kwargs))
        self.cache.GetBodyOfScope('f#0')
        self.assertEqual(Outcome(self.cache.Clear, ['f#0', 5]), (TypeError, "object of type 'int' has no len()"))
        self.assertNotIn('f#0', self.cache._fScopeBodyCache)  # earlier items done
        self.assertEqual(Outcome(self.cache.Clear, None), (TypeError, "'NoneType' object is not iterable"))
        self.assertRaises(TypeError, self.cache.Clear, [['unhashable']])


class FailureTest(CacheTestCase):

    def testMessagesAndNothingCachedForTheFailingName(self):
        plain, c, none = self.lst[2], self.cache, CScopeBodyCache(None)
        missing, no_len = 'No logical found for scope name: %r', "object of type '%s' has no len()"
        for exc, message, fn, args in [
                (KeyError, missing % 'A#0.nope#0', c.GetBodyOfScope, ['A#0.nope#0']),
                (KeyError, missing % 'A', c.GetScopeDef, ['A']),
                (ValueError, 'logical must start a scope: %r' % plain, c._FindBodyOfScopeDef, [plain]),
                (TypeError, 'Argument must be a logical', c._FindBodyOfScopeDef, [3]),
                (TypeError, "unhashable type: 'list'", c.GetBodyOfScope, [['x']]),
                (TypeError, no_len % 'int', c.GetScopeDef, [5]),
                (TypeError, 'Argument must be a logical', CScopeBodyCache([plain, 'x']).GetBodyOfScope, ['']),
                (TypeError, no_len % 'NoneType', none.GetBodyOfScope, ['']),
                (TypeError, 'Expected list, got tuple', CScopeBodyCache, [()])]:
            self.assertEqual(Outcome(fn, *args), (exc, message))
        self.assertEqual(self.Cached(), (['', 'A#0'], ['', 'A#0']))

    def testLogicalsChangedUnderTheCache(self):
        d = self.cache.GetScopeDef('f#1.B#0')
        self.lst.remove(d)
        self.assertEqual(Outcome(self.cache.GetBodyOfScope, 'f#1.B#0'),
                         (IndexError, 'scope defining logical is not in logical list'))
        # A plain line given a defined name resolves as a def, but has no body.
        plain = self.lst[2]
        plain.fLocalScopeName = 'odd#0'
        self.assertIs(self.cache.GetScopeDef('A#0.f#0.odd#0'), plain)
        self.assertEqual(Outcome(self.cache.GetBodyOfScope, 'A#0.f#0.odd#0'),
                         (ValueError, 'logical must start a scope: %r' % plain))
        self.assertEqual(self.Cached()[0], ['', 'A#0', 'A#0.f#0', 'f#1'])
        self.lst[0].fLocalScopeName = OtherText('A#0')
        self.assertEqual(Outcome(CScopeBodyCache(self.lst).GetScopeDef, 'A#0'),
                         (TypeError, Text('Expected bytes, got %s', kOtherTextName)))

    def testDestroyedCache(self):
        c = self.cache
        c.GetBodyOfScope('A#0')
        c.destroy()
        self.assertTrue(c.IsDestroyed())
        self.assertEqual((c._fScopeBodyCache, c._fScopeDefCache), (None, None))
        self.assertIs(c._fLogicalList, self.lst)
        for attr, fn, args in [('get', c.GetBodyOfScope, ['A#0']), ('get', c.GetScopeDef, ['A#0']),
                               ('clear', c.Clear, []), ('pop', c.Clear, [['A#0']])]:
            self.assertEqual(Outcome(fn, *args), (AttributeError, "'NoneType' object has no attribute %r" % attr))
        self.assertEqual(Lines(c._FindBodyOfScopeDef(None)), [1, 8, 10])


class OverrideTest(CacheTestCase):

    def testOverridesTakePartInResolution(self):
        cache = Sub(self.lst, GetBodyOfScope=lambda s, n: CScopeBodyCache.GetBodyOfScope(s, n.replace('Z', 'A')))
        self.assertEqual(cache.GetScopeDef('Z#0.f#0').fLineno, 2)
        self.assertIn('A#0', cache._fScopeBodyCache)
        cache = Sub(self.lst, GetScopeDef=lambda s, n: s._fLogicalList[10])
        self.assertEqual(Lines(cache.GetBodyOfScope('x')), [12, 13])
        self.assertEqual(Sub(self.lst, _FindBodyOfScopeDef=lambda s, d: 'served').GetBodyOfScope(''), 'served')
        self.assertEqual(Outcome(Sub(self.lst, GetBodyOfScope=lambda s, n: ['x']).GetScopeDef, 'A#0'),
                         (TypeError, 'Argument must be a logical'))

    def testFailingOverrideCachesNothing(self):
        def Find(s, d):
            if d is not None:
                raise RuntimeError('no')
            return CScopeBodyCache._FindBodyOfScopeDef(s, d)
        cache = Sub(self.lst, _FindBodyOfScopeDef=Find)
        self.assertRaises(RuntimeError, cache.GetBodyOfScope, 'A#0')
        self.assertEqual(self.Cached(cache), ([''], ['', 'A#0']))

    def testPythonCodeChangingStateUnderTheCall(self):
        destroy = lambda s, d: s.destroy() or []  # noqa: E731
        self.assertEqual(Outcome(Sub(self.lst, _FindBodyOfScopeDef=destroy).GetBodyOfScope, ''),
                         (TypeError, "'NoneType' object is not subscriptable"))

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


class CrossCheckTest(unittest.TestCase):

    def testStdlibSampleAgreesWithAst(self):
        files = crosscheck_bodies.PythonFiles(crosscheck_bodies.StdlibDir())
        totals = crosscheck_bodies.CheckFiles(files[::270 if SANITIZED else 90])
        self.assertGreater(totals['files'], 3)
        self.assertGreater(totals['scopes'], 100)
        self.assertEqual(totals['details'], [])


if __name__ == '__main__':
    unittest.main()
