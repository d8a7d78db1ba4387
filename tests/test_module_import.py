"""The module's import: its namespace, its classes, and each way loading fails."""

import difflib
import gc
import sys
import unittest

import pysource.symbolinfo
import tallowkit
from tallowkit.destroyable import CDestroyable

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from support import ImportWith, Outcome, Read, Text, builtins

kModule = 'pysource.scopebodycache'
kFastaccess = ['LogicalCheck', 'RaiseIfNotLogical', 'IsWhitespaceLogical', 'IsScopeStartLogical',
               'GetLocalScopeDefined', 'SetLogicalLocalScopeDefined', 'PySet_InplaceOr', 'GetNowTime', 'OutOfTime',
               'ULongLongValueForDoubleBits', 'DoubleValueForULongLongBits', 'DoubleValueForPyIntBits']
kFunctions = dict([(n, 'pysource._fastaccess') for n in kFastaccess] +
                  [(n, 'pysource.symbolinfo') for n in ('IsDefKind', 'GetInfoBytesKind')] +
                  [(n, kModule) for n in ('GetFullNameForScopeDef', '__pyx_unpickle_CChangeFinder',
                                          '__pyx_unpickle_CScopeBodyCache')])
kMethods = {
    CChangeFinder: [
        '_destroy_impl', '_Clear', '_PrepareForFind', 'FindChanges', '_FindChangesEntireListAdded',
        '_GetLeafScopeWithIndex', '_ProcessRemovedLogicals', '_ProcessAddedLogicals', '_ProcessDedentedComments',
        '_LogicalInScopeChanged', '_SetLogicalScopeNames', '_UpdateLogicalScopeName', '_UpdateContainingScope',
        '_PropagateScopeIndexChangeForward', '_FindScopeIndexForLogical', '_FindScopeNameContainingLogical'],
    CScopeBodyCache: ['_destroy_impl', 'GetBodyOfScope', 'Clear', 'GetScopeDef', '_FindScopeDef',
                      '_FindBodyOfScopeDef'],
}
kUpdateDoc = (" Update the fScopeName and the fLocalScopeName (if applicable) for the\n"
              "    logical if possible and return fScopeName if it succeeds.  Returns None\n"
              "    and does not update anything if it fails.  Updates both names even if they\n"
              "    are already set.  The i argument is the index of the logical in the logical\n"
              "    list.  Succeeds if given a scope_name or if all logicals prior to this one\n"
              "    have already been updated ")
# The docstrings by qualified name; any other function or method has none.
kDocs = {
    'CChangeFinder': (
        " Finds changes in logical list and updates fScopeName attribute on all\n"
        "  logicals and the fLocalScopeName attribute on start scope logicals.  The\n"
        "  fLocalScopeName attribute is updated with the scope index, which complicates\n"
        "  things substantially.\n  \n"
        "  Uses an optimized method is the list of added logicals == the _fLogicalList\n"
        "  which is case when the file is first read of the contents are entirely replaced\n  \n"
        "  If the added logicals != _fLogicalList, approach is to find an ordered list\n"
        "  of indicies that may have changed.  This ordered list contains the indicies\n"
        "  of all added logicals and the indicies of the logical following where each\n"
        "  removed logical.  Once the ordered list is found, each index is visited \n"
        "  in order to see if there are changes and to find scope names.\n  \n"
        "  Often times there will be a small number of changes that won't change the\n"
        "  scope structure -- think of a char types that translates into one logical\n"
        "  removed and one logical added.  Containing scope is usually found by looking\n"
        "  at prior logicals and finding one with an indent <= the indent of the logical\n"
        "  in question.\n  \n"
        "  Dedented comments are special cased and are given the scope of the logical\n"
        "  following, if their indent <= the indent of the line above.  Otherwise,\n"
        "  they're given the scope of the line above.\n  \n  \n  \n  "),
    'CChangeFinder._Clear': " Clear everything but _fLogicalList ",
    'CChangeFinder._PrepareForFind': " Set up to find changes ",
    'CChangeFinder._FindChangesEntireListAdded': " Find changes when the entire list has been added. ",
    'CChangeFinder._GetLeafScopeWithIndex': (" Get the leaf scope name with the given index.  Returns None if \n"
                                             "    stack_index is -1 or logical is malformed "),
    'CChangeFinder._ProcessRemovedLogicals': (
        " Find changes from the list of logicals removed and return list of \n"
        "    the indicies of the logical with the first lineno >= lineno removed.\n"
        "    Does not update logical scope names. "),
    'CChangeFinder._ProcessAddedLogicals': (
        " Process all added logicals.  The indicies_to_check arg is a list of \n"
        "    logicals that should be scanned for scope changes.  Note: not used\n    when whole file changes "),
    'CChangeFinder._ProcessDedentedComments': (" Process the added commment.  Returns index of next non-comment\n"
                                               "    logical "),
    'CChangeFinder._LogicalInScopeChanged': (
        " Record that the logical has changed.  The added argument indicates\n"
        "    whether its been added to the list; if it hasn't been added, it has been\n    removed "),
    'CChangeFinder._SetLogicalScopeNames': kUpdateDoc,
    'CChangeFinder._UpdateLogicalScopeName': kUpdateDoc,
    'CChangeFinder._UpdateContainingScope': kUpdateDoc,
    'CChangeFinder._PropagateScopeIndexChangeForward': (
        " Propagate change from old scope to new scope.  Only changes logicals\n"
        "    whose containing scope starts with old scope "),
    'CChangeFinder._FindScopeIndexForLogical': " Find the scope index for the given logical ",
    'CChangeFinder._FindScopeNameContainingLogical': (
        " Get the name of the scope given logical is in. Succeeds if all prior\n"
        "    non whitespace have scope name set.  Returns None if the scope name\n    can't be found "),
    'CScopeBodyCache._FindScopeDef': (
        " Finds the scope def for the name without using the _fScopeDefCache\n"
        "    for the name (this is used to find the value to put in the cache).\n"
        "    Raises KeyError if scope isn't found "),
    'PySet_InplaceOr': (" Performs a |= on the set object.  The to_add needs to be a set\n"
                        "  or frozenset.  Returns if any items were added. "),
    'GetNowTime': " Get the time value of now; equivalent to time.time() ",
    'OutOfTime': " Return whether now is past end time ",
    'DoubleValueForPyIntBits': (" Returns double with the bit value of given PyInt.  Needed because\n"
                                "  passing a negative number to DoubleValueForULongLongBits raises an\n  exception "),
    'DoubleValueForULongLongBits': " Returns double with the bit value of given unsigned long long ",
    'ULongLongValueForDoubleBits': " Returns the long long value with the same bit values as double ",
}


def DocLines(docs):
    """One line per docstring line, named, for a readable difference."""
    return ['%s: %r' % (name, line) for name in sorted(docs)
            for line in (docs[name].split('\n') if docs[name] is not None else [None])]


class NamespaceTest(unittest.TestCase):

    def testSiblingModulesAreBoundAsModules(self):
        # The submodule, not the package that `import pysource._fastaccess` yields.
        self.assertIs(sbc._fastaccess, sys.modules['pysource._fastaccess'])
        self.assertIs(sbc.symbolinfo, pysource.symbolinfo)
        self.assertIs(sbc.tallowkit, tallowkit)
        self.assertIs(sbc.__builtins__, builtins)

    def testDocstrings(self):
        objects = dict((name, getattr(sbc, name)) for name in kFunctions)
        for cls, names in kMethods.items():
            objects[cls.__name__] = cls
            objects.update((cls.__name__ + '.' + name, getattr(cls, name))
                           for name in names + ['__reduce__', '__setstate__'])
        got = DocLines(dict((name, obj.__doc__) for name, obj in objects.items()))
        want = DocLines(dict((name, kDocs.get(name)) for name in objects))
        self.assertTrue(got == want, 'docstrings differ:\n' + '\n'.join(
            difflib.unified_diff(want, got, 'expected', 'actual', lineterm='')))

    def testFunctions(self):
        for name, module in sorted(kFunctions.items()):
            func = getattr(sbc, name)
            self.assertEqual((func.__name__, func.__module__), (name, module))

    def testClassesAndMethods(self):
        for cls, names in kMethods.items():
            self.assertEqual((cls.__module__, cls.__base__), (kModule, CDestroyable))
            self.assertTrue(gc.is_tracked(cls([])))
            self.assertIn('__init__', cls.__dict__)
            for name in names + ['__reduce__', '__setstate__']:
                qualname = cls.__name__ + '.' + name
                self.assertIn(name, cls.__dict__, qualname)
                method = getattr(cls, name)
                self.assertEqual((method.__name__, method.__qualname__, method.__module__),
                                 (name, qualname, kModule))
                # Taken from the class dict, a method can be handed any object.
                self.assertEqual(Outcome(cls.__dict__[name], object()), (TypeError, "descriptor '%s' requires a "
                                 "'%s.%s' object but received a 'object'" % (name, kModule, cls.__name__)))
        finder = CChangeFinder([])
        self.assertIs(finder._Clear.__self__, finder)
        self.assertIsNone(CChangeFinder._Clear(finder))

    def testInstanceAttributes(self):
        finder = CChangeFinder([])
        for name in ['_ProcessNonDedentedComment', '_ScanForwardForChangedScopes', '_UpdateScopesSeen',
                     '_UpdateScopesSeenWithStartScopeLogical', '_fCurrentClassChanges', '_fCurrentFunctionChanges',
                     '_fCurrentContentsChanges', '_fScopesSeen', '_fEndIndexForScopesSeen', '_fNextChangeIndex',
                     '_fLastProcessedIndex']:
            self.assertFalse(hasattr(finder, name), name)
        lst = Read('x = 1\n')
        for obj, name in [(CChangeFinder(lst), '_fLogicalList'), (CScopeBodyCache(lst), '_fLogicalList'),
                          (CScopeBodyCache(lst), '_fScopeBodyCache'), (CScopeBodyCache(lst), '_fScopeDefCache')]:
            value = getattr(obj, name)
            self.assertRaises((AttributeError, TypeError), setattr, obj, name, {})
            self.assertRaises((AttributeError, TypeError), delattr, obj, name)
            self.assertIs(getattr(obj, name), value, name)
        # No instance dict unless a subclass adds one.
        for cls in CChangeFinder, CScopeBodyCache:
            self.assertRaises(AttributeError, setattr, cls.__new__(cls), 'fExtra', 1)
            self.assertRaises(AttributeError, setattr, type('Slotted', (cls,), {'__slots__': ()})([]), 'fExtra', 1)
            sub = type('Sub', (cls,), {})([])
            sub.fExtra = 1
            self.assertEqual(sub.__dict__, {'fExtra': 1})


kSizeMessage = ('%s size changed, may indicate binary incompatibility. '
                'Expected %%(real)d from C header, got %%(got)d from PyObject')
kSmaller = "v['real'], v['got'] = %s.__basicsize__, object.__basicsize__\n"

# (setup, exception, message % result['v'], names bound after, names not bound)
kFailures = [
    ("Substitute(TD, drop_capi=['_gTriedToImportQObject'])", 'ImportError',
     'tallowkit.destroyable does not export expected C variable _gTriedToImportQObject'),
    ("Substitute(SI, drop_capi=['JoinTwoScopeNames'])", 'ImportError',
     'pysource.symbolinfo does not export expected C function JoinTwoScopeNames',
     ['CScopeBodyCache', 'CChangeFinder'], ['tallowkit', '_fastaccess', 'symbolinfo', 'GetFullNameForScopeDef']),
    ("v['e'] = Signature(FA, 'LogicalLineType')\n"
     "Substitute(FA, capi={'LogicalLineType': Capsule(v['e'] + ' const')})", 'TypeError',
     'C variable pysource._fastaccess.LogicalLineType has wrong signature (expected %(e)s, got %(e)s const)'),
    ("v['e'], v['g'] = Signature(SI, 'JoinTwoScopeNames'), Signature(SI, 'SplitScopeNames')\n"
     "Substitute(SI, capi={'JoinTwoScopeNames': Capsule(v['g'])})", 'TypeError',
     'C function pysource.symbolinfo.JoinTwoScopeNames has wrong signature (expected %(e)s, got %(g)s)'),
    ("Substitute(SI, drop=['_capi'])", 'AttributeError', Text("'module' object has no attribute '%(attr)s'", module='pysource.symbolinfo', attr='_capi')),
    ("Substitute(TD, CDestroyable=lambda: None)", 'TypeError',
     'tallowkit.destroyable.CDestroyable is not a type object', [], ['CScopeBodyCache', 'CChangeFinder']),
    ("Substitute(TD, drop=['CDestroyable'])", 'AttributeError', Text("'module' object has no attribute '%(attr)s'", module='tallowkit.destroyable', attr='CDestroyable')),
    (kSmaller % 'TD.CDestroyable' + "Substitute(TD, CDestroyable=Slotted(v['got']))",
     'ValueError', kSizeMessage % 'tallowkit.destroyable.CDestroyable', [], ['CChangeFinder']),
    # The right size but no native method table.
    ("Substitute(TD, CDestroyable=Slotted(TD.CDestroyable.__basicsize__))", 'RuntimeError',
     'invalid vtable found for imported type'),
    ("import %s as b; del b.enumerate" % builtins.__name__, 'NameError', "name 'enumerate' is not defined", [],
     ['CScopeBodyCache']),
    # In sys.modules but no longer an attribute of the package.
    ("import pysource; del pysource.symbolinfo", 'ImportError', 'cannot import name symbolinfo',
     ['CChangeFinder', 'tallowkit', '_fastaccess'],
     ['symbolinfo', 'GetFullNameForScopeDef', 'LogicalCheck', 'CChangeFinder.FindChanges']),
    # Two steps broken: the earlier one's error wins.
    ("Substitute(TD, CDestroyable=3, drop_capi=['_gEmissionStack'])\n"
     "Substitute(FA, drop_capi=['LogicalLineType'])",
     'TypeError', 'tallowkit.destroyable.CDestroyable is not a type object'),
    ("Substitute(FA, CLogger=3, drop_capi=['LogicalLineType'])", 'TypeError',
     'pysource._fastaccess.CLogger is not a type object'),
    ("Substitute(SI, CFullyScopedName=3); Substitute(FA, CBytesTokenizer=4)", 'TypeError',
     'pysource._fastaccess.CBytesTokenizer is not a type object'),
    ("Substitute(TD, _CHandlerRecord=3); Substitute(SI, CDefInfo=4)", 'TypeError',
     'pysource.symbolinfo.CDefInfo is not a type object'),
    ("Substitute(SI, drop_capi=['kSetPrefix']); Substitute(FA, drop_capi=['__TimeFunc'])", 'ImportError',
     'pysource._fastaccess does not export expected C variable __TimeFunc'),
    ("Substitute(SI, drop_capi=['kSetKind']); Substitute(TD, drop_capi=['_gEmissionStack'])", 'ImportError',
     'pysource.symbolinfo does not export expected C variable kSetKind'),
    ("Substitute(SI, drop_capi=['kModuleScopeName', 'JoinTwoScopeNames'])", 'ImportError',
     'pysource.symbolinfo does not export expected C variable kModuleScopeName'),
    ("Substitute(SI, drop_capi=['SplitScopeNames', 'SplitScopeNameFromSuffixes'])", 'ImportError',
     'pysource.symbolinfo does not export expected C function SplitScopeNameFromSuffixes'),
]


class ImportTest(unittest.TestCase):

    def testEachFailure(self):
        for case in kFailures:
            setup, exc, message, bound, unbound = (case + ([], []))[:5]
            result = ImportWith(setup)
            self.assertEqual(result.get('error'), (exc, message % result['v']), setup)
            self.assertTrue(result['init_in_tb'], setup)
            names = set(result['names'])
            self.assertEqual((set(bound) - names, set(unbound) & names), (set(), set()), setup)

    def testLargerBaseClassWarnsAndWorks(self):
        result = ImportWith("""
            v['real'] = TD.CDestroyable.__basicsize__
            v['got'] = v['real'] + 3 * ctypes.sizeof(ctypes.c_void_p)
            Substitute(TD, CDestroyable=Slotted(v['got'], __vtable__=TD.CDestroyable.__dict__['__vtable__']))
            """, r"""
            import gc
            from pysource.logicals import ReadLogicals
            from pysource.scopebodycache import CChangeFinder, CScopeBodyCache
            lst = ReadLogicals('class A:\n    def f(self):\n        pass\n')
            for cls in CChangeFinder, type('Sub', (CChangeFinder,), {}):
                finder = cls(lst)
                result['found'] = [sorted(found) for found in finder.FindChanges(lst, [])]
                result['scopes'] = [(l.fScopeName, l.fLocalScopeName) for l in lst]
                finder._destroy_impl()
                del finder
            CScopeBodyCache(lst)
            gc.collect()
            """)
        self.assertNotIn('error', result)
        self.assertEqual(result['warnings'], [kSizeMessage % 'tallowkit.destroyable.CDestroyable' % result['v']])
        self.assertEqual(result['found'], [['', 'A#0', 'A#0.f#0'], ['A#0'], ['A#0.f#0']])
        self.assertEqual(result['scopes'], [('', 'A#0'), ('A#0', 'f#0'), ('A#0.f#0', None)])

    def testSymbolinfoIsTakenFromThePackage(self):
        result = ImportWith("import pysource; pysource.symbolinfo = types.ModuleType('stand_in')",
                            "result['bound'] = mod.symbolinfo.__name__")
        self.assertNotIn('error', result)
        self.assertEqual(result['bound'], 'stand_in')


if __name__ == '__main__':
    unittest.main()
