"""Faults of reloads, shared lists, failed calls and stray brackets: each
case runs with assertions on and under -O (ctest runs the suite both ways),
and where a path is named, on the native path and through the overrides."""
import copy
import pickle
import sys
import unittest

import pysource.symbolinfo as symbolinfo
from support import PY3, Edit, Names, Read, RunPython, WholeListNames
from pysource.scopebodycache import CChangeFinder, GetInfoBytesKind, IsDefKind

OPTIMISED = bool(sys.flags.optimize)


class Routed(CChangeFinder):
    """Takes every step through the overrides' route."""

    def _Clear(self):
        CChangeFinder._Clear(self)


kPaths = (CChangeFinder, Routed)


def Named(source, finder_class=CChangeFinder):
    lst = Read(source)
    finder = finder_class(lst)
    finder.FindChanges(lst, [])
    return lst, finder


# Run in a fresh interpreter: a finder made before #DROP keeps working
# after it, and honours a rebinding of GetFullNameForScopeDef in the module
# that sys.modules then holds.
kReloadScript = r'''
import gc, sys
import pysource, pysource.scopebodycache
from pysource.logicals import ReadLogicals
#FIRST
mod = sys.modules['pysource.scopebodycache']
lst = ReadLogicals('class A:\n    def f(self):\n        x = 1\n')
finder = mod.CChangeFinder(lst)
finder.FindChanges(lst, [])
#DROP
del mod
gc.collect()
# What reuses the freed memory must not be taken for the module's globals.
class Trap(object):
    def __call__(self, *args):
        raise RuntimeError('a stray object was called')
    def __getattr__(self, name):
        return self
junk = [dict(_fastaccess=Trap(), symbolinfo=Trap(), GetFullNameForScopeDef=Trap()) for _ in range(2000)]

def Type(text):
    new = ReadLogicals('class A:\n    def f(self):\n        %s\n' % text)[2]
    old, lst[2] = lst[2], new
    return finder.FindChanges([new], [old])

assert Type('x = 2')[0] == set(['A#0.f#0'])
current = sys.modules.get('pysource.scopebodycache')
if current is not None:
    seen, real = [], current.GetFullNameForScopeDef
    current.GetFullNameForScopeDef = lambda d: seen.append(d) or real(d)
    assert Type('x = 3')[0] == set(['A#0.f#0'])
    assert [l.fTokens[1] for l in seen] == ['f'], seen
    current.GetFullNameForScopeDef = real
    assert current.CChangeFinder is type(finder)
assert [l.fScopeName for l in lst] == ['', 'A#0', 'A#0.f#0']
sys.stdout.write('ok\n')
'''


class Reloads(unittest.TestCase):

    def Run(self, drop, first=''):
        code = kReloadScript.replace('#FIRST', first).replace('#DROP', drop)
        status, out, err = RunPython(code)
        self.assertEqual((status, out), (0, 'ok\n'), err)

    def testFinderOutlivesTheModuleObject(self):
        # Out of sys.modules and of the package, as a plugin reloader does.
        self.Run("del sys.modules['pysource.scopebodycache'], pysource.scopebodycache")

    def testRebindingHonouredAfterASecondImport(self):
        self.Run("del sys.modules['pysource.scopebodycache']\nimport pysource.scopebodycache")
        # The module object kept by the package is not the one callers see.
        self.Run("del sys.modules['pysource.scopebodycache']\n"
                 "import pysource.scopebodycache\nmod = pysource\n")

    @unittest.skipUnless(PY3, 'subinterpreters of the test module are 3.x')
    def testRebindingHonouredAfterASubinterpreterImportedFirst(self):
        try:
            import _testcapi
            _testcapi.run_in_subinterp
        except (ImportError, AttributeError):
            self.skipTest('no legacy subinterpreters here')
        self.Run('', first="import _testcapi\n"
                           "assert _testcapi.run_in_subinterp('import pysource.scopebodycache') == 0\n"
                           "import pysource.scopebodycache\n")


class StrayBrackets(unittest.TestCase):

    def testHeaderTakenOutWithLinesOfNoLogical(self):
        # After `x = a]` the blank line reads as no logical. Taking it out
        # with the header under it leaves the old body numbered below the
        # header's number; the body must still lose the removed scope. The
        # second text takes the header out after a line of another kind and
        # leaves a module-level line between the body and the header's number.
        cases = [
            ('class K:\n    x = a]\n\n    def f(self):\n        y = 2\n    z = [\n',
             'class K:\n    x = a]\n        y = 2\n    z = [\n'),
            (')\n  w = 1\n\n        y = 2\nclass K:\n    def f(self):\nx = (\n',
             ')\n  w = 1\n    def f(self):\nx = (\n'),
        ]
        for old, new in cases:
            for path in kPaths:
                lst, finder = Named(old, path)
                finder.FindChanges(*Edit(lst, new))
                self.assertEqual(Names(lst), WholeListNames(new), (path.__name__, new))


class SharedLists(unittest.TestCase):
    kSource = 'class A:\n    def f(self):\n        pass\n    def g(self):\n        pass\n'
    kSteps = [kSource.replace('class A:', 'class B:'),
              kSource.replace('class A:', 'class B:').replace('def g', 'def f')]

    def Run(self, path, tell):
        """Names after each step, where tell(k, finders, edit) passes step k's
        edit to one or more of the finders."""
        lst, first = Named(self.kSource, path)
        finders = [first, copy.copy(first), path(lst)]
        seen = []
        for k, text in enumerate(self.kSteps):
            tell(k, finders, Edit(lst, text))
            seen.append(Names(lst))
        return seen

    def testFindersOverOneListAgreeWithTheRoutedPath(self):
        fresh = [WholeListNames(text) for text in self.kSteps]
        tellings = {
            # two finders told of every edit, in turn
            'both': lambda k, f, edit: [f[0].FindChanges(*edit), f[2].FindChanges(*edit)],
            # a copy (sharing the list) told of one edit, the original of the next
            'copy': lambda k, f, edit: f[1 - k].FindChanges(*edit),
            # each finder told of a different edit
            'alternate': lambda k, f, edit: f[2 * (k % 2)].FindChanges(*edit),
        }
        for label, tell in sorted(tellings.items()):
            routed = self.Run(Routed, tell)
            self.assertEqual(routed, fresh, label)
            self.assertEqual(self.Run(CChangeFinder, tell), routed, label)


class Namesakes(unittest.TestCase):

    def testManyNamesakesRenumberedFromTheTop(self):
        # Adding and taking out one of many same-named definitions near the
        # top renumbers every later one; the native path answers as the
        # routed one does (its cost is shown by bench/bench_edits.py).
        defs = ['def f():\n    x = %d\n\n' % k for k in range(300)]
        source = ''.join(defs)
        header = 'def f():\n    y = 0\n'
        outcomes = []
        for path in kPaths:
            lst, finder = Named(source, path)
            seen = []
            for text in (header + source, source, ''.join(defs[:5]) + header + ''.join(defs[5:]), source):
                changes = finder.FindChanges(*Edit(lst, text))
                seen.append((changes, Names(lst)))
                self.assertEqual(Names(lst), WholeListNames(text), path.__name__)
            outcomes.append(seen)
        self.assertEqual(outcomes[0], outcomes[1])


class FailedCalls(unittest.TestCase):

    def testBadAddedItemAfterGoodOnesChangesNoLogical(self):
        # The good items carry names (an undo puts back named objects); the
        # call fails on the bad one and must leave them named, so the next
        # call that keeps to the protocol works.
        source = 'class A:\n    def f(self):\n        x = 1\n    y = 2\n'
        for path in kPaths:
            for bad in (None, 3, 'x'):
                lst, finder = Named(source, path)
                before = Names(lst)
                self.assertRaises(TypeError, finder.FindChanges, [lst[1], lst[2], bad], [])
                self.assertEqual(Names(lst), before, (path.__name__, bad))
                self.assertEqual(finder.FindChanges([], []), (set(), set(), set()))
                new = source.replace('x = 1', 'x = 2')
                finder.FindChanges(*Edit(lst, new))
                self.assertEqual(Names(lst), WholeListNames(new))


class Characters(unittest.TestCase):

    def testKindCharacterAboveOneByteIsNoKind(self):
        # U+0146 ends in the byte of 'F' (the function kind), U+013A in that
        # of ':'. On 2.7 the text is its UTF-8 bytes, read byte by byte.
        plain = symbolinfo.kPlainEquivKind
        for text in (u':\u0146', u':\u0146name', u'\u013ax', u'\u013a\u0146', u'\u013a:F'):
            ibytes = text if PY3 else text.encode('utf-8')
            kind = GetInfoBytesKind(ibytes)
            self.assertFalse(IsDefKind(kind), repr(text))
            self.assertNotEqual(kind, symbolinfo.kFunctionKind, repr(text))
            if PY3 or not text.startswith(u':'):
                self.assertEqual(kind, plain, repr(text))
        # A character of the one-byte range is its byte, as 2.7 reads it.
        self.assertEqual(GetInfoBytesKind(u':\xe9' if PY3 else ':\xe9'), -23)


class Taking(CChangeFinder):
    """Pickles and copies itself from inside FindChanges."""
    takers = [('pickle', lambda f: pickle.loads(pickle.dumps(f, 2))), ('copy', copy.copy),
              ('deepcopy', copy.deepcopy)]
    taken = []

    def _ProcessAddedLogicals(self, added, indices):
        CChangeFinder._ProcessAddedLogicals(self, added, indices)
        self.taken.extend((label, take(self)) for label, take in self.takers)


class Copies(unittest.TestCase):

    def testFinderTakenDuringACallLoadsIdle(self):
        # Pickled and copied from inside an override while the call runs:
        # each loaded finder's next call works and names the list as a
        # fresh pass does, and the call it was taken from ends as usual.
        source = 'class A:\n    def f(self):\n        x = 1\n'
        del Taking.taken[:]
        lst, finder = Named(source, Taking)
        new = source.replace('x = 1', 'x = 2')
        self.assertEqual(finder.FindChanges(*Edit(lst, new))[0], set(['A#0.f#0']))
        taken_all, Taking.takers = list(Taking.taken), []
        self.assertEqual(len(taken_all), 3)
        for label, taken in taken_all:
            self.assertEqual(taken.FindChanges([], []), (set(), set(), set()), label)
            other = source.replace('x = 1', 'x = 3')
            mine = taken._fLogicalList
            taken.FindChanges(*Edit(mine, other))
            self.assertEqual(Names(mine), WholeListNames(other), label)
            if mine is lst:
                finder.FindChanges(*Edit(lst, new))


if __name__ == '__main__':
    unittest.main()
