"""The definition index kept between calls: every call that can use it must
give what the table walk gives (a finder whose class overrides a step takes
that walk), also after the index could have gone stale. Each scenario runs
the same operations on two copies of a list, one per kind of finder, and
compares names and change sets after each operation."""
import os
import pickle
import unittest

from support import CChangeFinder, Edit, Names, Read, RunPython, WholeListNames

kSource = '''\
def f():
    x = 1
class A:
    def f(self):
        pass
    def g(self):
        y = 2
    def f(self):
        z = 3
def f():
    w = 4
'''


class TableWalk(CChangeFinder):
    """Any override sends the call down the table walk, which keeps no index."""

    def _Clear(self):
        CChangeFinder._Clear(self)


def Outcome(call):
    try:
        return call()
    except Exception as e:
        return type(e), str(e)


class Twins(object):
    """A list and its finder, once with the index and once without."""

    def __init__(self, source=kSource):
        self.sides = []
        for cls in (CChangeFinder, TableWalk):
            lst = Read(source)
            finder = cls(lst)
            finder.FindChanges(lst, [])
            self.sides.append((lst, finder))

    def Do(self, operation):
        """Runs operation(lst, finder) on both; returns both outcomes."""
        return [Outcome(lambda: operation(lst, finder)) for lst, finder in self.sides]

    def Edit(self, new_source):
        return self.Do(lambda lst, finder: finder.FindChanges(*Edit(lst, new_source)))


class IndexMatchesTheTableWalk(unittest.TestCase):

    def assertTwinsAgree(self, twins, outcomes):
        self.assertEqual(outcomes[0], outcomes[1])
        (native, _), (walked, _) = twins.sides
        self.assertEqual(Names(native), Names(walked))

    def RunEdits(self, twins, sources):
        for source in sources:
            self.assertTwinsAgree(twins, twins.Edit(source))

    # Edits that renumber: same-named definitions in and out above others,
    # and a rename that moves a body to another scope.
    kRenumbering = [kSource.replace('class A:', 'def f():\n    v = 0\nclass A:'),
                    kSource.replace('    def g(self):', '    def f(self):\n        q = 0\n    def g(self):'),
                    kSource.replace('def f():\n    x = 1', 'def h():\n    x = 1'),
                    kSource]

    def testPlainEditsAndFreshPass(self):
        twins = Twins()
        self.RunEdits(twins, self.kRenumbering)
        self.assertEqual(Names(twins.sides[0][0]), WholeListNames(kSource))

    def testAfterUnpickling(self):
        twins = Twins()
        self.RunEdits(twins, self.kRenumbering[:1])
        native_list, native = twins.sides[0]
        # The index is not in the pickled state: the copy builds its own.
        copy = pickle.loads(pickle.dumps(native, 2))
        twins.sides[0] = (copy._fLogicalList, copy)
        self.RunEdits(twins, self.kRenumbering[1:])

    def testAfterADirectCallOfAStep(self):
        twins = Twins()

        def Rename(lst, finder):
            # Outside a call the step stores the name, then fails to record
            # it: g now claims to be a second f, which no index saw stored.
            return finder._SetLogicalScopeNames(lst[5], 5, ('A#0', 'f#1'))
        self.assertTwinsAgree(twins, twins.Do(Rename))
        self.RunEdits(twins, self.kRenumbering)

    def testAfterAnExceptionMidCall(self):
        twins = Twins()
        renamed = kSource.replace('def g(self):', 'def f(self):')

        def Broken(lst, finder):
            # g renamed to f renumbers the f after it, whose body runs into
            # an item that is not a logical: the call fails part way.
            added, removed = Edit(lst, renamed)
            lst.insert(9, 'not a logical')
            try:
                return finder.FindChanges(added, removed)
            finally:
                del lst[9]
        outcomes = twins.Do(Broken)
        self.assertEqual(outcomes[0][0], TypeError)
        self.assertTwinsAgree(twins, outcomes)
        self.RunEdits(twins, [kSource] + self.kRenumbering)

    def testAfterTheListChangedUntold(self):
        for untold in (lambda lst: lst.insert(2, Read('def f():\n')[0]),  # one more definition
                       lambda lst: lst.__setitem__(slice(7, 9), lst[9:7:-1] and lst[7:9][::-1])):
            twins = Twins()
            twins.Do(lambda lst, finder: untold(lst))
            # The next call passes nothing in; the one after is an honest edit.
            self.assertTwinsAgree(twins, twins.Do(lambda lst, finder: finder.FindChanges([], [])))
            self.RunEdits(twins, self.kRenumbering[1:2])

    def testSelfCheckAfterEveryCall(self):
        code = '''
            import sys
            sys.path[:0] = %r
            from test_definition_index import Twins, IndexMatchesTheTableWalk as T
            twins = Twins()
            for source in T.kRenumbering * 3:
                twins.Edit(source)
            print('ok')
        ''' % [os.path.dirname(os.path.abspath(__file__))]
        env = dict(os.environ, SBC_CHECK_INDEX='1')
        status, out, err = RunPython(code, env=env)
        self.assertEqual((status, out.strip()), (0, 'ok'), err)


class IndexLife(unittest.TestCase):
    """When the index is built, dropped and rebuilt (SBC_TRACE_INDEX=1
    writes each event to stderr)."""

    kScript = '''
        import pickle, sys
        sys.path[:0] = %r
        from support import CChangeFinder, Edit, Read
        from test_definition_index import kSource, IndexMatchesTheTableWalk as T
        def mark(text):
            sys.stderr.write('-- %%s\\n' %% text)
        lst = Read(kSource)
        finder = CChangeFinder(lst)
        mark('read'); finder.FindChanges(lst, [])
        mark('edit'); finder.FindChanges(*Edit(lst, T.kRenumbering[0]))
        copy = pickle.loads(pickle.dumps(finder, 2))
        mark('unpickled'); copy.FindChanges(*Edit(copy._fLogicalList, kSource))
        mark('direct'); finder._GetLeafScopeWithIndex(lst[0], 0)
        mark('after direct'); finder.FindChanges(*Edit(lst, kSource))
        added, removed = Edit(lst, T.kRenumbering[1])
        lst.append('not a logical')
        mark('failing')
        try:
            finder.FindChanges(added, removed)
        except TypeError:
            pass
        del lst[-1]
        mark('after failing'); finder.FindChanges(*Edit(lst, kSource))
        lst.insert(0, Read('def f():\\n')[0])
        mark('untold'); finder.FindChanges([], [])
        mark('after untold'); finder.FindChanges(*Edit(lst, T.kRenumbering[0]))
        mark('end')
    ''' % [os.path.dirname(os.path.abspath(__file__))]

    def testEvents(self):
        status, out, err = RunPython(self.kScript, env=dict(os.environ, SBC_TRACE_INDEX='1'))
        self.assertEqual(status, 0, err)
        events, mark = {}, None
        for line in err.splitlines():
            if line.startswith('-- '):
                mark = line[3:]
                events[mark] = []
            elif line.startswith('definition index '):
                events[mark].append(line[len('definition index '):])
        self.assertEqual(events, {
            'read': ['built'],
            'edit': [],                           # kept from the read
            'unpickled': ['rebuilt'],             # not in the pickle
            'direct': ['dropped'],                # a step called from Python
            'after direct': ['rebuilt'],
            'failing': ['dropped'],               # the call failed part way
            'after failing': ['rebuilt'],
            'untold': ['dropped'],                # the list is not what was passed in
            'after untold': ['rebuilt'],
            'end': []})


class OverridesGetTheSteps(unittest.TestCase):
    """A subclass overriding a step that reads or writes scope indices is
    called for every use of it, as in the table walk, and its finder
    ends where the plain one does."""

    kSteps = ['_FindScopeIndexForLogical', '_GetLeafScopeWithIndex', '_SetLogicalScopeNames',
              '_UpdateLogicalScopeName', '_PropagateScopeIndexChangeForward', '_LogicalInScopeChanged']

    def testEachStep(self):
        for step in self.kSteps:
            calls = []

            def Recording(self, *args, **kwargs):
                calls.append(args)
                return getattr(CChangeFinder, step)(self, *args, **kwargs)

            cls = type('Recording', (CChangeFinder,), {step: Recording})
            plain, recorded = Read(kSource), Read(kSource)
            CChangeFinder(plain).FindChanges(plain, [])
            cls(recorded).FindChanges(recorded, [])
            for source in IndexMatchesTheTableWalk.kRenumbering:
                a = CChangeFinder(plain).FindChanges(*Edit(plain, source))
                b = cls(recorded).FindChanges(*Edit(recorded, source))
                self.assertEqual(a, b, step)
            self.assertEqual(Names(plain), Names(recorded), step)
            self.assertTrue(calls, step)


if __name__ == '__main__':
    unittest.main()
