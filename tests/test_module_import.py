"""The module's import: its namespace, its classes, and each way loading fails."""

import __builtin__
import ast
import gc
import sys
import unittest

import pysource
import pysource._fastaccess
import pysource.symbolinfo
import tallowkit
import tallowkit.destroyable
from tallowkit.destroyable import CDestroyable

import pysource.scopebodycache as sbc
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache

from support import Read, RunPython

kModule = 'pysource.scopebodycache'

kFinderMethods = [
    '__init__', '_destroy_impl', '_Clear', '_PrepareForFind', 'FindChanges',
    '_FindChangesEntireListAdded', '_GetLeafScopeWithIndex', '_ProcessRemovedLogicals',
    '_ProcessAddedLogicals', '_ProcessDedentedComments', '_LogicalInScopeChanged',
    '_SetLogicalScopeNames', '_UpdateLogicalScopeName', '_UpdateContainingScope',
    '_PropagateScopeIndexChangeForward', '_FindScopeIndexForLogical',
    '_FindScopeNameContainingLogical']

kBodyCacheMethods = ['__init__', '_destroy_impl', 'GetBodyOfScope', 'Clear', 'GetScopeDef',
                     '_FindScopeDef', '_FindBodyOfScopeDef']

kFastaccessFunctions = ['LogicalCheck', 'RaiseIfNotLogical', 'IsWhitespaceLogical',
                        'IsScopeStartLogical', 'GetLocalScopeDefined',
                        'SetLogicalLocalScopeDefined', 'PySet_InplaceOr',
                        'ULongLongValueForDoubleBits', 'DoubleValueForULongLongBits',
                        'DoubleValueForPyIntBits', 'GetNowTime', 'OutOfTime']
kSymbolinfoFunctions = ['IsDefKind', 'GetInfoBytesKind']
kUnpickleFunctions = ['__pyx_unpickle_CScopeBodyCache', '__pyx_unpickle_CChangeFinder']

kUpdateDoc = (
    " Update the fScopeName and the fLocalScopeName (if applicable) for the\n"
    "    logical if possible and return fScopeName if it succeeds.  Returns None\n"
    "    and does not update anything if it fails.  Updates both names even if they\n"
    "    are already set.  The i argument is the index of the logical in the logical\n"
    "    list.  Succeeds if given a scope_name or if all logicals prior to this one\n"
    "    have already been updated ")

kFinderDocs = {
    '_Clear': " Clear everything but _fLogicalList ",
    '_PrepareForFind': " Set up to find changes ",
    '_FindChangesEntireListAdded': " Find changes when the entire list has been added. ",
    '_GetLeafScopeWithIndex': " Get the leaf scope name with the given index.  Returns None if \n"
                              "    stack_index is -1 or logical is malformed ",
    '_ProcessRemovedLogicals':
        " Find changes from the list of logicals removed and return list of \n"
        "    the indicies of the logical with the first lineno >= lineno removed.\n"
        "    Does not update logical scope names. ",
    '_ProcessAddedLogicals':
        " Process all added logicals.  The indicies_to_check arg is a list of \n"
        "    logicals that should be scanned for scope changes.  Note: not used\n"
        "    when whole file changes ",
    '_ProcessDedentedComments': " Process the added commment.  Returns index of next non-comment\n"
                                "    logical ",
    '_LogicalInScopeChanged':
        " Record that the logical has changed.  The added argument indicates\n"
        "    whether its been added to the list; if it hasn't been added, it has been\n"
        "    removed ",
    '_SetLogicalScopeNames': kUpdateDoc,
    '_UpdateLogicalScopeName': kUpdateDoc,
    '_UpdateContainingScope': kUpdateDoc,
    '_PropagateScopeIndexChangeForward':
        " Propagate change from old scope to new scope.  Only changes logicals\n"
        "    whose containing scope starts with old scope ",
    '_FindScopeIndexForLogical': " Find the scope index for the given logical ",
    '_FindScopeNameContainingLogical':
        " Get the name of the scope given logical is in. Succeeds if all prior\n"
        "    non whitespace have scope name set.  Returns None if the scope name\n"
        "    can't be found ",
    'FindChanges': None,
    '_destroy_impl': None,
}

kFinderClassDoc = (
    " Finds changes in logical list and updates fScopeName attribute on all\n"
    "  logicals and the fLocalScopeName attribute on start scope logicals.  The\n"
    "  fLocalScopeName attribute is updated with the scope index, which complicates\n"
    "  things substantially.\n"
    "  \n"
    "  Uses an optimized method is the list of added logicals == the _fLogicalList\n"
    "  which is case when the file is first read of the contents are entirely replaced\n"
    "  \n"
    "  If the added logicals != _fLogicalList, approach is to find an ordered list\n"
    "  of indicies that may have changed.  This ordered list contains the indicies\n"
    "  of all added logicals and the indicies of the logical following where each\n"
    "  removed logical.  Once the ordered list is found, each index is visited \n"
    "  in order to see if there are changes and to find scope names.\n"
    "  \n"
    "  Often times there will be a small number of changes that won't change the\n"
    "  scope structure -- think of a char types that translates into one logical\n"
    "  removed and one logical added.  Containing scope is usually found by looking\n"
    "  at prior logicals and finding one with an indent <= the indent of the logical\n"
    "  in question.\n"
    "  \n"
    "  Dedented comments are special cased and are given the scope of the logical\n"
    "  following, if their indent <= the indent of the line above.  Otherwise,\n"
    "  they're given the scope of the line above.\n"
    "  \n"
    "  \n"
    "  \n"
    "  ")

kUtilityDocs = {
    'PySet_InplaceOr': " Performs a |= on the set object.  The to_add needs to be a set\n"
                       "  or frozenset.  Returns if any items were added. ",
    'GetNowTime': " Get the time value of now; equivalent to time.time() ",
    'OutOfTime': " Return whether now is past end time ",
    'DoubleValueForPyIntBits': " Returns double with the bit value of given PyInt.  Needed because\n"
                               "  passing a negative number to DoubleValueForULongLongBits raises an\n"
                               "  exception ",
    'DoubleValueForULongLongBits': " Returns double with the bit value of given unsigned long long ",
    'ULongLongValueForDoubleBits': " Returns the long long value with the same bit values as double ",
}


class NamespaceTest(unittest.TestCase):

    def testSiblingModulesAreBoundAsModules(self):
        # The submodule, not the package that `import pysource._fastaccess` yields.
        self.assertIs(sbc._fastaccess, sys.modules['pysource._fastaccess'])
        self.assertIs(sbc.symbolinfo, pysource.symbolinfo)
        self.assertIs(sbc.tallowkit, tallowkit)
        self.assertIs(sbc.__builtins__, __builtin__)

    def testFunctionsAreBound(self):
        for name in ['GetFullNameForScopeDef'] + kFastaccessFunctions + kSymbolinfoFunctions:
            self.assertTrue(callable(getattr(sbc, name, None)), name)
            self.assertEqual(getattr(sbc, name).__name__, name)

    def testUnpickleFunctionsAreBound(self):
        for name in kUnpickleFunctions:
            self.assertTrue(callable(getattr(sbc, name, None)), name)
            self.assertEqual(getattr(sbc, name).__module__, kModule)

    def testModuleOfFunctions(self):
        self.assertEqual(sbc.GetFullNameForScopeDef.__module__, kModule)
        for name in kFastaccessFunctions:
            self.assertEqual(getattr(sbc, name).__module__, 'pysource._fastaccess', name)
        for name in kSymbolinfoFunctions:
            self.assertEqual(getattr(sbc, name).__module__, 'pysource.symbolinfo', name)

    def testUtilityDocstrings(self):
        for name in kFastaccessFunctions + kSymbolinfoFunctions:
            self.assertEqual(getattr(sbc, name).__doc__, kUtilityDocs.get(name), name)
        self.assertEqual(sbc.GetFullNameForScopeDef.__doc__, None)


class ChangeFinderClassTest(unittest.TestCase):

    def testClassDocstring(self):
        self.assertEqual(CChangeFinder.__doc__, kFinderClassDoc)
        self.assertEqual(CChangeFinder.__module__, kModule)
        self.assertEqual(CChangeFinder.__name__, 'CChangeFinder')

    def testMethodsWithDocstringsModuleAndQualifiedName(self):
        for name in kFinderMethods:
            self.assertIn(name, CChangeFinder.__dict__, name)
            if name == '__init__':
                continue
            method = getattr(CChangeFinder, name)
            self.assertEqual(method.__doc__, kFinderDocs[name], name)
            self.assertEqual(method.__module__, kModule, name)
            self.assertEqual(method.__name__, name)
            self.assertEqual(method.__qualname__, 'CChangeFinder.' + name)

    def testInternalStepsAreNotVisible(self):
        finder = CChangeFinder([])
        for name in ['_ProcessNonDedentedComment', '_ScanForwardForChangedScopes',
                     '_UpdateScopesSeen', '_UpdateScopesSeenWithStartScopeLogical']:
            self.assertFalse(hasattr(finder, name), name)
        # Nor the per-call fields.
        for name in ['_fCurrentClassChanges', '_fCurrentFunctionChanges',
                     '_fCurrentContentsChanges', '_fScopesSeen', '_fEndIndexForScopesSeen',
                     '_fNextChangeIndex', '_fLastProcessedIndex']:
            self.assertFalse(hasattr(finder, name), name)

    def testMethodsAreBoundToTheInstance(self):
        finder = CChangeFinder([])
        self.assertIs(finder._Clear.__self__, finder)
        self.assertIsNone(CChangeFinder._Clear(finder))
        # An unbound method refuses an instance of another class.
        self.assertRaises(TypeError, CChangeFinder._Clear, object())
        self.assertRaises(TypeError, CChangeFinder.FindChanges, CDestroyable(), [], [])

    def testLogicalListIsReadOnly(self):
        lst = Read('x = 1\n')
        finder = CChangeFinder(lst)
        self.assertIs(finder._fLogicalList, lst)
        self.assertRaises((AttributeError, TypeError), setattr, finder, '_fLogicalList', [])
        self.assertRaises((AttributeError, TypeError), delattr, finder, '_fLogicalList')
        self.assertIs(finder._fLogicalList, lst)

    def testPicklingMethods(self):
        for cls in CChangeFinder, CScopeBodyCache:
            self.assertIn('__reduce__', cls.__dict__, cls)
            self.assertIn('__setstate__', cls.__dict__, cls)
            self.assertEqual(cls.__setstate__.__qualname__, cls.__name__ + '.__setstate__')


class BodyCacheClassTest(unittest.TestCase):

    def testMethods(self):
        self.assertIsNone(CScopeBodyCache.__doc__)
        for name in kBodyCacheMethods:
            self.assertIn(name, CScopeBodyCache.__dict__, name)
            if name == '__init__':
                continue
            method = getattr(CScopeBodyCache, name)
            self.assertEqual(method.__module__, kModule, name)
            self.assertEqual(method.__qualname__, 'CScopeBodyCache.' + name)
        self.assertEqual(
            CScopeBodyCache._FindScopeDef.__doc__,
            " Finds the scope def for the name without using the _fScopeDefCache\n"
            "    for the name (this is used to find the value to put in the cache).\n"
            "    Raises KeyError if scope isn't found ")

    def testReadOnlyAttributes(self):
        cache = CScopeBodyCache([])
        for name in ['_fLogicalList', '_fScopeBodyCache', '_fScopeDefCache']:
            self.assertTrue(hasattr(cache, name), name)
            self.assertRaises((AttributeError, TypeError), setattr, cache, name, {})


class ClassShapeTest(unittest.TestCase):

    def testBothClassesDeriveFromDestroyable(self):
        for cls in CChangeFinder, CScopeBodyCache:
            self.assertIs(cls.__base__, CDestroyable)
            self.assertTrue(gc.is_tracked(cls([])))

    def testNoInstanceDictUnlessASubclassAddsOne(self):
        for cls in CChangeFinder, CScopeBodyCache:
            plain = cls.__new__(cls)
            self.assertRaises(AttributeError, setattr, plain, 'fExtra', 1)
            self.assertFalse(hasattr(plain, '__dict__'))

            class Sub(cls):
                pass

            sub = Sub.__new__(Sub)
            sub.fExtra = 1
            self.assertEqual(sub.__dict__, {'fExtra': 1})

            class Slotted(cls):
                __slots__ = ()

            self.assertRaises(AttributeError, setattr, Slotted.__new__(Slotted), 'fExtra', 1)

    def testSubclassesWork(self):
        class Finder(CChangeFinder):
            pass

        lst = Read('class A:\n    x = 1\n')
        finder = Finder(lst)
        self.assertIs(finder._fLogicalList, lst)
        self.assertEqual(finder.FindChanges(lst, []), (set(['', 'A#0']), set(['A#0']), set()))


# --- Failing imports --------------------------------------------------------
#
# Each case runs in a fresh interpreter where a substitute for one sibling
# module (a copy of the real one with a change) stands in sys.modules before
# pysource.scopebodycache is imported.

kPrelude = r'''
import ctypes, sys, traceback, types, warnings
import pysource._fastaccess, pysource.symbolinfo, tallowkit.destroyable
FA = sys.modules['pysource._fastaccess']
SI = sys.modules['pysource.symbolinfo']
TD = sys.modules['tallowkit.destroyable']

_GetName = ctypes.pythonapi.PyCapsule_GetName
_GetName.restype, _GetName.argtypes = ctypes.c_char_p, [ctypes.py_object]
_New = ctypes.pythonapi.PyCapsule_New
_New.restype = ctypes.py_object
_New.argtypes = [ctypes.c_void_p, ctypes.c_void_p, ctypes.c_void_p]
_keep = []

def Signature(module, name):
    return _GetName(module._capi[name])

def Capsule(signature):
    # The capsule keeps only pointers: its name and target must outlive it.
    name = ctypes.create_string_buffer(signature)
    target = ctypes.c_long(0)
    _keep.extend([name, target])
    return _New(ctypes.addressof(target), ctypes.addressof(name), None)

def Substitute(real, drop_capi=(), capi=None, drop=(), **attrs):
    sub = types.ModuleType(real.__name__)
    sub.__dict__.update(real.__dict__)
    table = dict(real._capi)
    for name in drop_capi:
        del table[name]
    table.update(capi or {})
    sub._capi = table
    for name in drop:
        delattr(sub, name)
    for name, value in attrs.items():
        setattr(sub, name, value)
    sys.modules[real.__name__] = sub
    return sub

def Slotted(base_size, name='CDestroyable', **extra):
    # A Python class whose instances are exactly base_size bytes.
    per = ctypes.sizeof(ctypes.c_void_p)
    count, rest = divmod(base_size - object.__basicsize__, per)
    assert rest == 0 and count >= 0, base_size
    extra['__slots__'] = tuple('s%d' % k for k in range(count))
    return type(name, (object,), extra)

def Outcome():
    """Imports the module; prints a repr'd dict of what happened."""
    result = {}
    with warnings.catch_warnings(record=True) as caught:
        warnings.simplefilter('always')
        try:
            import pysource.scopebodycache
        except Exception as e:
            result['error'] = (type(e).__name__, str(e))
            result['init_in_tb'] = 'init pysource.scopebodycache' in traceback.format_exc()
    result['warnings'] = [str(w.message) for w in caught]
    mod = sys.modules.get('pysource.scopebodycache')
    result['names'] = sorted(mod.__dict__) if mod is not None else None
    return result

def Report(result):
    sys.stdout.write('RESULT %r\n' % (result,))
'''


class FailingImportTest(unittest.TestCase):

    def Run(self, setup, after=''):
        """Runs setup, imports, runs `after` (which may add to `result`)."""
        code = kPrelude + setup + '\nresult = Outcome()\n' + after + '\nReport(result)\n'
        status, out, err = RunPython(code)
        lines = [l for l in out.splitlines() if l.startswith('RESULT ')]
        self.assertEqual(status, 0, err)
        self.assertEqual(len(lines), 1, out + err)
        return ast.literal_eval(lines[0][len('RESULT '):])

    def assertFails(self, setup, exc, message=None, after=''):
        result = self.Run(setup, after)
        self.assertIn('error', result, result)
        self.assertEqual(result['error'][0], exc)
        if message is not None:
            self.assertEqual(result['error'][1], message)
        self.assertTrue(result['init_in_tb'])
        return result

    def testMissingVariable(self):
        self.assertFails("Substitute(FA, drop_capi=['LogicalLineType'])", 'ImportError',
                         'pysource._fastaccess does not export expected C variable LogicalLineType')
        self.assertFails("Substitute(SI, drop_capi=['kPlainEquivKind'])", 'ImportError',
                         'pysource.symbolinfo does not export expected C variable kPlainEquivKind')
        # Variables that the module takes but never reads are required too.
        self.assertFails("Substitute(TD, drop_capi=['_gTriedToImportQObject'])", 'ImportError',
                         'tallowkit.destroyable does not export expected C variable '
                         '_gTriedToImportQObject')

    def testMissingFunction(self):
        self.assertFails("Substitute(SI, drop_capi=['JoinTwoScopeNames'])", 'ImportError',
                         'pysource.symbolinfo does not export expected C function JoinTwoScopeNames')
        self.assertFails("Substitute(SI, drop_capi=['AppendScopeSuffixes'])", 'ImportError',
                         'pysource.symbolinfo does not export expected C function '
                         'AppendScopeSuffixes')

    def testVariableWithWrongSignature(self):
        result = self.Run(
            "expected = Signature(FA, 'LogicalLineType')\n"
            "Substitute(FA, capi={'LogicalLineType': Capsule(expected + ' const')})",
            "result['expected'] = expected")
        self.assertEqual(result['error'], (
            'TypeError', 'C variable pysource._fastaccess.LogicalLineType has wrong signature '
            '(expected %s, got %s const)' % (result['expected'], result['expected'])))
        # A char variable published as an object.
        result = self.Run(
            "expected = Signature(SI, 'kFunctionKind'); got = Signature(SI, 'kFunctionPrefix')\n"
            "Substitute(SI, capi={'kFunctionKind': Capsule(got)})",
            "result['expected'] = expected; result['got'] = got")
        self.assertNotEqual(result['expected'], result['got'])
        self.assertEqual(result['error'], (
            'TypeError', 'C variable pysource.symbolinfo.kFunctionKind has wrong signature '
            '(expected %(expected)s, got %(got)s)' % result))

    def testFunctionWithWrongSignature(self):
        result = self.Run(
            "expected = Signature(SI, 'JoinTwoScopeNames'); got = Signature(SI, 'SplitScopeNames')\n"
            "Substitute(SI, capi={'JoinTwoScopeNames': Capsule(got)})",
            "result['expected'] = expected; result['got'] = got")
        self.assertNotEqual(result['expected'], result['got'])
        self.assertEqual(result['error'], (
            'TypeError', 'C function pysource.symbolinfo.JoinTwoScopeNames has wrong signature '
            '(expected %(expected)s, got %(got)s)' % result))

    def testMissingEntryTablePropagatesAttributeError(self):
        result = self.assertFails("Substitute(SI, drop=['_capi'])", 'AttributeError')
        self.assertIn('_capi', result['error'][1])

    def testBaseClassNotAType(self):
        result = self.assertFails("Substitute(TD, CDestroyable=lambda: None)", 'TypeError',
                                  'tallowkit.destroyable.CDestroyable is not a type object')
        # Nothing after the base-class check was bound.
        self.assertNotIn('CScopeBodyCache', result['names'])
        self.assertNotIn('CChangeFinder', result['names'])

    def testMissingBaseClassPropagatesAttributeError(self):
        result = self.assertFails("Substitute(TD, drop=['CDestroyable'])", 'AttributeError')
        self.assertIn('CDestroyable', result['error'][1])

    def testOtherTypeNotATypeOrMissing(self):
        self.assertFails("Substitute(FA, CLogger=3)", 'TypeError',
                         'pysource._fastaccess.CLogger is not a type object')
        self.assertFails("Substitute(SI, CDefInfo='x')", 'TypeError',
                         'pysource.symbolinfo.CDefInfo is not a type object')
        self.assertFails("Substitute(TD, drop=['_CEmissionStackItem'])", 'AttributeError')

    def testSmallerBaseClass(self):
        result = self.Run(
            "real = TD.CDestroyable.__basicsize__\n"
            "small = Slotted(object.__basicsize__)\n"
            "Substitute(TD, CDestroyable=small)",
            "result['sizes'] = (real, object.__basicsize__)")
        self.assertEqual(result['error'], (
            'ValueError', 'tallowkit.destroyable.CDestroyable size changed, may indicate binary '
            'incompatibility. Expected %d from C header, got %d from PyObject' % result['sizes']))
        self.assertNotIn('CChangeFinder', result['names'])

    def testSmallerOtherType(self):
        result = self.Run(
            "real = FA.CBytesTokenizer.__basicsize__\n"
            "Substitute(FA, CBytesTokenizer=Slotted(object.__basicsize__, 'CBytesTokenizer'))",
            "result['sizes'] = (real, object.__basicsize__)")
        self.assertGreater(result['sizes'][0], result['sizes'][1])
        self.assertEqual(result['error'], (
            'ValueError', 'pysource._fastaccess.CBytesTokenizer size changed, may indicate binary '
            'incompatibility. Expected %d from C header, got %d from PyObject' % result['sizes']))

    def testMissingNativeMethodTable(self):
        # Right size, but no method table in the class dictionary.
        self.assertFails("Substitute(TD, CDestroyable=Slotted(TD.CDestroyable.__basicsize__))",
                         'RuntimeError', 'invalid vtable found for imported type')
        self.assertFails(
            "Substitute(SI, CSingleResolvedInfo=Slotted(SI.CSingleResolvedInfo.__basicsize__))",
            'RuntimeError', 'invalid vtable found for imported type')

    def testLargerBaseClassWarnsAndWorks(self):
        setup = (
            "real = TD.CDestroyable\n"
            "per = ctypes.sizeof(ctypes.c_void_p)\n"
            "big = Slotted(real.__basicsize__ + 3 * per,\n"
            "              __vtable__=real.__dict__['__vtable__'])\n"
            "Substitute(TD, CDestroyable=big)\n")
        after = r'''
import gc
from pysource.logicals import ReadLogicals
from pysource.scopebodycache import CChangeFinder, CScopeBodyCache
result['sizes'] = (real.__basicsize__, big.__basicsize__)
lst = ReadLogicals('class A:\n    def f(self):\n        pass\n')
class Sub(CChangeFinder):
    pass
try:
    for cls in CChangeFinder, Sub:
        finder = cls(lst)
        result['found'] = [sorted(found) for found in finder.FindChanges(lst, [])]
        result['scopes'] = [(l.fScopeName, l.fLocalScopeName) for l in lst]
        finder._destroy_impl()
        del finder
    cache = CScopeBodyCache(lst)
    del cache
except Exception as e:
    result['use_error'] = (type(e).__name__, str(e))
gc.collect()
'''
        result = self.Run(setup, after)
        self.assertNotIn('error', result)
        self.assertEqual(result['warnings'], [
            'tallowkit.destroyable.CDestroyable size changed, may indicate binary '
            'incompatibility. Expected %d from C header, got %d from PyObject' % result['sizes']])
        self.assertNotIn('use_error', result)
        self.assertEqual(result['found'], [['', 'A#0', 'A#0.f#0'], ['A#0'], ['A#0.f#0']])
        self.assertEqual(result['scopes'], [('', 'A#0'), ('A#0', 'f#0'), ('A#0.f#0', None)])

    def testMissingBuiltinName(self):
        result = self.assertFails("import __builtin__; del __builtin__.enumerate", 'NameError',
                                  "name 'enumerate' is not defined")
        self.assertNotIn('CScopeBodyCache', result['names'])

    def testSymbolinfoMissingFromPackage(self):
        # In sys.modules but no longer an attribute of the package: the
        # relative import of the name fails.
        result = self.assertFails("import pysource; del pysource.symbolinfo", 'ImportError',
                                  'cannot import name symbolinfo')
        # tallowkit and _fastaccess are bound before, the methods after.
        names = set(result['names'])
        self.assertTrue(set(['CChangeFinder', 'tallowkit', '_fastaccess']) <= names, names)
        self.assertFalse(set(['symbolinfo', 'GetFullNameForScopeDef', 'LogicalCheck']) & names)
        result = self.Run("import pysource; del pysource.symbolinfo",
                          "result['methods'] = 'FindChanges' in "
                          "sys.modules['pysource.scopebodycache'].CChangeFinder.__dict__")
        self.assertFalse(result['methods'])

    def testSymbolinfoIsTakenFromThePackage(self):
        result = self.Run("import pysource; pysource.symbolinfo = types.ModuleType('stand_in')",
                          "result['bound'] = sys.modules['pysource.scopebodycache'].symbolinfo"
                          ".__name__")
        self.assertNotIn('error', result)
        self.assertEqual(result['bound'], 'stand_in')

    def testStepsRunInOrder(self):
        # Each case breaks two steps; the earlier step's error wins.
        cases = [
            ("Substitute(TD, CDestroyable=3, drop_capi=['_gEmissionStack']); "
             "Substitute(FA, drop_capi=['LogicalLineType'])",
             'tallowkit.destroyable.CDestroyable is not a type object'),
            ("Substitute(FA, CLogger=3, drop_capi=['LogicalLineType'])",
             'pysource._fastaccess.CLogger is not a type object'),
            ("Substitute(SI, CFullyScopedName=3); Substitute(FA, CBytesTokenizer=4)",
             'pysource._fastaccess.CBytesTokenizer is not a type object'),
            ("Substitute(TD, _CHandlerRecord=3); Substitute(SI, CDefInfo=4)",
             'pysource.symbolinfo.CDefInfo is not a type object'),
            ("Substitute(SI, drop_capi=['kSetPrefix']); Substitute(FA, drop_capi=['__TimeFunc'])",
             'pysource._fastaccess does not export expected C variable __TimeFunc'),
            ("Substitute(SI, drop_capi=['kSetKind']); "
             "Substitute(TD, drop_capi=['_gEmissionStack'])",
             'pysource.symbolinfo does not export expected C variable kSetKind'),
            ("Substitute(SI, drop_capi=['kModuleScopeName', 'JoinTwoScopeNames'])",
             'pysource.symbolinfo does not export expected C variable kModuleScopeName'),
            ("Substitute(SI, drop_capi=['SplitScopeNames', 'SplitScopeNameFromSuffixes'])",
             'pysource.symbolinfo does not export expected C function SplitScopeNameFromSuffixes'),
        ]
        for setup, message in cases:
            result = self.Run(setup)
            self.assertEqual(result.get('error', (None, None))[1], message, setup)

    def testNamesBoundBeforeAFailureStay(self):
        result = self.assertFails("Substitute(SI, drop_capi=['JoinTwoScopeNames'])", 'ImportError')
        names = set(result['names'])
        self.assertTrue(set(['CScopeBodyCache', 'CChangeFinder']) <= names, names)
        self.assertFalse(set(['tallowkit', '_fastaccess', 'symbolinfo',
                              'GetFullNameForScopeDef']) & names, names)


if __name__ == '__main__':
    unittest.main()
