"""The module's import: its namespace, its classes, and each way loading fails."""

import __builtin__
import gc
import sys
import unittest
import zlib

import pysource.symbolinfo
import tallowkit
from tallowkit.destroyable import CDestroyable

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from support import ImportWith, Outcome, Read

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
# Docstrings by qualified name: the text, or the CRC-32 of a long one; None for any other.
kUpdateDoc, kFinder = 0x69b8065d, 'CChangeFinder.'
kDocs = dict([(kFinder + n, d) for n, d in [
    ('_Clear', " Clear everything but _fLogicalList "), ('_PrepareForFind', " Set up to find changes "),
    ('_FindChangesEntireListAdded', " Find changes when the entire list has been added. "),
    ('_FindScopeIndexForLogical', " Find the scope index for the given logical "),
    ('_GetLeafScopeWithIndex', 0x5d11b15b), ('_ProcessRemovedLogicals', 0x446932f9),
    ('_ProcessAddedLogicals', 0x15472779), ('_ProcessDedentedComments', 0xf39c470e),
    ('_LogicalInScopeChanged', 0x3e234f79), ('_SetLogicalScopeNames', kUpdateDoc),
    ('_UpdateLogicalScopeName', kUpdateDoc), ('_UpdateContainingScope', kUpdateDoc),
    ('_PropagateScopeIndexChangeForward', 0x497c6c96), ('_FindScopeNameContainingLogical', 0x18ab0a97)]] + [
    ('CChangeFinder', 0xb6d1a1ca), ('CScopeBodyCache._FindScopeDef', 0x58817988), ('PySet_InplaceOr', 0xd13df4f5),
    ('DoubleValueForPyIntBits', 0x3d712d5d), ('OutOfTime', " Return whether now is past end time "),
    ('GetNowTime', " Get the time value of now; equivalent to time.time() "),
    ('DoubleValueForULongLongBits', " Returns double with the bit value of given unsigned long long "),
    ('ULongLongValueForDoubleBits', " Returns the long long value with the same bit values as double ")])


class NamespaceTest(unittest.TestCase):

    def assertDoc(self, name, obj):
        expected, doc = kDocs.get(name), obj.__doc__
        if isinstance(expected, (int, long)) and doc is not None:
            doc = zlib.crc32(doc) & 0xffffffff
        self.assertEqual(doc, expected, '%s has the docstring %r' % (name, obj.__doc__))

    def testSiblingModulesAreBoundAsModules(self):
        # The submodule, not the package that `import pysource._fastaccess` yields.
        self.assertIs(sbc._fastaccess, sys.modules['pysource._fastaccess'])
        self.assertIs(sbc.symbolinfo, pysource.symbolinfo)
        self.assertIs(sbc.tallowkit, tallowkit)
        self.assertIs(sbc.__builtins__, __builtin__)

    def testFunctions(self):
        for name, module in sorted(kFunctions.items()):
            func = getattr(sbc, name)
            self.assertEqual((func.__name__, func.__module__), (name, module))
            self.assertDoc(name, func)

    def testClassesAndMethods(self):
        for cls, names in kMethods.items():
            self.assertEqual((cls.__module__, cls.__base__), (kModule, CDestroyable))
            self.assertDoc(cls.__name__, cls)
            self.assertTrue(gc.is_tracked(cls([])))
            self.assertIn('__init__', cls.__dict__)
            for name in names + ['__reduce__', '__setstate__']:
                qualname = cls.__name__ + '.' + name
                self.assertIn(name, cls.__dict__, qualname)
                method = getattr(cls, name)
                self.assertEqual((method.__name__, method.__qualname__, method.__module__),
                                 (name, qualname, kModule))
                self.assertDoc(qualname, method)
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
    ("Substitute(SI, drop_capi=['AppendScopeSuffixes'])", 'ImportError',
     'pysource.symbolinfo does not export expected C function AppendScopeSuffixes'),
    ("v['e'] = Signature(FA, 'LogicalLineType')\n"
     "Substitute(FA, capi={'LogicalLineType': Capsule(v['e'] + ' const')})", 'TypeError',
     'C variable pysource._fastaccess.LogicalLineType has wrong signature (expected %(e)s, got %(e)s const)'),
    ("v['e'], v['g'] = Signature(SI, 'kFunctionKind'), Signature(SI, 'kFunctionPrefix')\n"
     "Substitute(SI, capi={'kFunctionKind': Capsule(v['g'])})", 'TypeError',
     'C variable pysource.symbolinfo.kFunctionKind has wrong signature (expected %(e)s, got %(g)s)'),
    ("v['e'], v['g'] = Signature(SI, 'JoinTwoScopeNames'), Signature(SI, 'SplitScopeNames')\n"
     "Substitute(SI, capi={'JoinTwoScopeNames': Capsule(v['g'])})", 'TypeError',
     'C function pysource.symbolinfo.JoinTwoScopeNames has wrong signature (expected %(e)s, got %(g)s)'),
    ("Substitute(SI, drop=['_capi'])", 'AttributeError', "'module' object has no attribute '_capi'"),
    ("Substitute(TD, CDestroyable=lambda: None)", 'TypeError',
     'tallowkit.destroyable.CDestroyable is not a type object', [], ['CScopeBodyCache', 'CChangeFinder']),
    ("Substitute(TD, drop=['CDestroyable'])", 'AttributeError', "'module' object has no attribute 'CDestroyable'"),
    ("Substitute(SI, CDefInfo='x')", 'TypeError', 'pysource.symbolinfo.CDefInfo is not a type object'),
    ("Substitute(TD, drop=['_CEmissionStackItem'])", 'AttributeError',
     "'module' object has no attribute '_CEmissionStackItem'"),
    (kSmaller % 'TD.CDestroyable' + "Substitute(TD, CDestroyable=Slotted(v['got']))",
     'ValueError', kSizeMessage % 'tallowkit.destroyable.CDestroyable', [], ['CChangeFinder']),
    (kSmaller % 'FA.CBytesTokenizer' + "Substitute(FA, CBytesTokenizer=Slotted(v['got'], 'CBytesTokenizer'))",
     'ValueError', kSizeMessage % 'pysource._fastaccess.CBytesTokenizer'),
    # The right size but no native method table.
    ("Substitute(TD, CDestroyable=Slotted(TD.CDestroyable.__basicsize__))", 'RuntimeError',
     'invalid vtable found for imported type'),
    ("Substitute(SI, CSingleResolvedInfo=Slotted(SI.CSingleResolvedInfo.__basicsize__))", 'RuntimeError',
     'invalid vtable found for imported type'),
    ("import __builtin__; del __builtin__.enumerate", 'NameError', "name 'enumerate' is not defined", [],
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
