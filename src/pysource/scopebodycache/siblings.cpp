#include "pysource/scopebodycache/siblings.hpp"

#include "common/messages.hpp"
#include "pysource/contracts/accessors.hpp"
#include "pysource/contracts/sibling_types.hpp"
#include "pysource/scopebodycache/fullname.hpp"
#include "pysource/scopebodycache/names.hpp"

#include <cstring>
#include <vector>

namespace sbc {

PyObject* gTimeFunc = nullptr;
PyTypeObject* gDestroyableType = nullptr;
SymbolInfo gSymbolInfo;
PyObject* gModule = nullptr;
PyObject* gModuleDict = nullptr;
PyObject* gWatchedModules = nullptr;
WatchedName gWatchedModule;  // sys.modules[<name>] is gModule

namespace {

constexpr const char* kFastaccess = kFastaccessModule;
constexpr const char* kSymbolinfo = kSymbolinfoModule;
constexpr const char* kDestroyable = kDestroyableModule;

// A type attribute of `module`, checked against the size this module was
// built for; with `vtable`, its native method table must be present too.
py::Ref importType(const char* moduleName, const char* typeName, Py_ssize_t expectedSize,
                   bool vtable) {
    py::Ref module = py::check(PyImport_ImportModule(moduleName));
    py::Ref obj = py::check(PyObject_GetAttrString(module.get(), typeName));
    if (!PyType_Check(obj.get())) {
        PyErr_Format(PyExc_TypeError, "%.200s.%.200s is not a type object", moduleName, typeName);
        py::fail();
    }
    auto* type = reinterpret_cast<PyTypeObject*>(obj.get());
    if (type->tp_basicsize < expectedSize) {
        PyErr_Format(PyExc_ValueError,
                     "%.200s.%.200s size changed, may indicate binary incompatibility. "
                     "Expected %zd from C header, got %zd from PyObject",
                     moduleName, typeName, expectedSize, type->tp_basicsize);
        py::fail();
    }
    if (type->tp_basicsize > expectedSize) {
        char warning[400];
        PyOS_snprintf(warning, sizeof warning,
                      "%s.%s size changed, may indicate binary incompatibility. "
                      "Expected %zd from C header, got %zd from PyObject",
                      moduleName, typeName, expectedSize, type->tp_basicsize);
        py::checkStatus(PyErr_WarnEx(nullptr, warning, 0));
    }
    if (vtable) {
        PyObject* capsule = type->tp_dict
                                ? PyDict_GetItemString(type->tp_dict, contracts::kVtableAttr)
                                : nullptr;
        if (capsule == nullptr || !PyCapsule_CheckExact(capsule) ||
            PyCapsule_GetPointer(capsule, PyCapsule_GetName(capsule)) == nullptr) {
            PyErr_Clear();
            PyErr_SetString(PyExc_RuntimeError, "invalid vtable found for imported type");
            py::fail();
        }
    }
    return obj;
}

// The capsule of entry `name` in the module's table; `what` is "variable" or
// "function" for the messages.
void* entryPoint(const char* moduleName, const char* name, const char* signature, bool isFunction) {
    py::Ref module = py::check(PyImport_ImportModule(moduleName));
    py::Ref table = py::check(PyObject_GetAttrString(module.get(), contracts::kCapiAttr));
    PyObject* capsule = PyDict_Check(table.get()) ? PyDict_GetItemString(table.get(), name) : nullptr;
    if (capsule == nullptr) {
        PyErr_Format(PyExc_ImportError,
                     isFunction ? "%.200s does not export expected C function %.200s"
                                : "%.200s does not export expected C variable %.200s",
                     moduleName, name);
        py::fail();
    }
    const char* declared = PyCapsule_CheckExact(capsule) ? PyCapsule_GetName(capsule) : nullptr;
    if (declared == nullptr || std::strcmp(declared, signature) != 0) {
        PyErr_Clear();
        PyErr_Format(PyExc_TypeError,
                     isFunction ? "C function %.200s.%.200s has wrong signature (expected %.500s, got %.500s)"
                                : "C variable %.200s.%.200s has wrong signature (expected %.500s, got %.500s)",
                     moduleName, name, signature, declared ? declared : "(null)");
        py::fail();
    }
    void* p = PyCapsule_GetPointer(capsule, declared);
    if (p == nullptr) py::fail();
    return p;
}

// An optional entry: its pointer, or nullptr when the table lacks it or
// declares another signature.
void* optionalEntry(PyObject* module, const char* name, const char* signature) {
    py::Ref table = py::Ref::steal(PyObject_GetAttrString(module, contracts::kCapiAttr));
    if (!table || !PyDict_Check(table.get())) {
        PyErr_Clear();
        return nullptr;
    }
    PyObject* capsule = PyDict_GetItemString(table.get(), name);
    if (capsule == nullptr || !PyCapsule_IsValid(capsule, signature)) return nullptr;
    return PyCapsule_GetPointer(capsule, signature);
}

// module.<name> as found in the module's own dict (borrowed, may be null).
PyObject* moduleAttribute(PyObject* module, PyObject* name) {
    if (!PyModule_Check(module)) return nullptr;
    return PyDict_GetItem(PyModule_GetDict(module), name);
}

PyObject* objectVariable(const char* moduleName, const char* name) {
    return *static_cast<PyObject**>(entryPoint(moduleName, name, contracts::sig::kObject, false));
}

char charVariable(const char* moduleName, const char* name) {
    return *static_cast<char*>(entryPoint(moduleName, name, contracts::sig::kChar, false));
}

}  // namespace

void bindDestroyableBase() {
    py::Ref type = importType(kDestroyable, "CDestroyable", sizeof(contracts::DestroyableObject), true);
    gDestroyableType = reinterpret_cast<PyTypeObject*>(type.release());
}

void checkOtherTypes() {
    using contracts::PlainSiblingObject;
    using contracts::VtabSiblingObject;
    importType(compat::kBuiltinsModule, "type", sizeof(PyHeapTypeObject), false);
    importType(kFastaccess, "CLogger", sizeof(PlainSiblingObject), false);
    importType(kFastaccess, "CBytesTokenizer", sizeof(VtabSiblingObject), true);
    importType(kSymbolinfo, "CSingleResolvedInfo", sizeof(VtabSiblingObject), true);
    importType(kSymbolinfo, "CFullyScopedName", sizeof(PlainSiblingObject), false);
    importType(kSymbolinfo, "CDefInfo", sizeof(PlainSiblingObject), false);
    importType(kDestroyable, "_CHandlerRecord", sizeof(PlainSiblingObject), false);
    importType(kDestroyable, "_CEmissionStackItem", sizeof(PlainSiblingObject), false);
}

void bindVariables() {
    using namespace contracts::sig;
    PyObject* logicalType = objectVariable(kFastaccess, "LogicalLineType");
    if (!PyType_Check(logicalType)) {
        PyErr_Format(PyExc_TypeError, "%.200s.%.200s is not a type object", kFastaccess,
                     "LogicalLineType");
        py::fail();
    }
    Py_INCREF(logicalType);
    contracts::gLogicalLineType = reinterpret_cast<PyTypeObject*>(logicalType);
    gTimeFunc = objectVariable(kFastaccess, "__TimeFunc");
    Py_XINCREF(gTimeFunc);

    // Every symbol-info variable is checked; only four are read.
#define SBC_PAIR(stem)                                  \
    objectVariable(kSymbolinfo, "k" #stem "Prefix");    \
    charVariable(kSymbolinfo, "k" #stem "Kind");
    SYMBOLINFO_PREFIX_KIND_STEMS(SBC_PAIR)
    objectVariable(kSymbolinfo, "kClassInstanceSuffix");
    SYMBOLINFO_PREFIX_KIND_STEMS2(SBC_PAIR)
    objectVariable(kSymbolinfo, "kPlainEquivSpec");
    gSymbolInfo.kPlainEquivKind = charVariable(kSymbolinfo, "kPlainEquivKind");
    SYMBOLINFO_PREFIX_KIND_STEMS3(SBC_PAIR)
#undef SBC_PAIR
    gSymbolInfo.kMethodKind = charVariable(kSymbolinfo, "kMethodKind");
    gSymbolInfo.kUnboundMethodKind = charVariable(kSymbolinfo, "kUnboundMethodKind");
    gSymbolInfo.kFunctionKind = charVariable(kSymbolinfo, "kFunctionKind");
    objectVariable(kSymbolinfo, "kIterationSubscript");
    objectVariable(kSymbolinfo, "kTypingModuleSymbolDot");
    objectVariable(kSymbolinfo, "kTypingModuleSymbol");
    entryPoint(kSymbolinfo, "kPrefixLen", kSsize, false);
    objectVariable(kSymbolinfo, "kScopeIndexSep");
    objectVariable(kSymbolinfo, "kModuleScopeName");

    for (const char* name : {"_gEmissionStack", "_gClassSignalHandlers", "_gSignalsForCls",
                             "_kEmptyFrozenset", "_gQObjectClass"}) {
        objectVariable(kDestroyable, name);
    }
    entryPoint(kDestroyable, "_gLogAllEmissions", kInt, false);
    entryPoint(kDestroyable, "_gTriedToImportQObject", kInt, false);
}

void bindFunctions() {
    using namespace contracts;
    gSymbolInfo.joinTwoScopeNames = reinterpret_cast<JoinTwoScopeNamesFn>(
        entryPoint(kSymbolinfo, "JoinTwoScopeNames", sig::kJoinTwo, true));
    gSymbolInfo.splitScopeNameFromSuffixes = reinterpret_cast<SplitScopeNameFromSuffixesFn>(
        entryPoint(kSymbolinfo, "SplitScopeNameFromSuffixes", sig::kSplitOne, true));
    gSymbolInfo.splitScopeNames = reinterpret_cast<SplitScopeNamesFn>(
        entryPoint(kSymbolinfo, "SplitScopeNames", sig::kSplitOne, true));
    gSymbolInfo.appendScopeSuffixes = reinterpret_cast<AppendScopeSuffixesFn>(
        entryPoint(kSymbolinfo, "AppendScopeSuffixes", sig::kAppendSuffixes, true));
}

NativeSiblings gNative;

namespace {
WatchedName gWatched[5];  // _fastaccess, symbolinfo, and their three functions
}  // namespace

void bindNativeSiblings(PyObject* fastaccess, PyObject* symbolinfo) {
    using namespace contracts;
    NativeSiblings n;
    n.indexForLineno = reinterpret_cast<IndexForLinenoFn>(
        optionalEntry(fastaccess, "IndexForLineno", sig::kIndexForLineno));
    n.findIndexOfLogical = reinterpret_cast<FindIndexOfLogicalFn>(
        optionalEntry(fastaccess, "FindIndexOfLogical", sig::kFindIndexOfLogical));
    n.leafScopeNameHasIndex = reinterpret_cast<LeafScopeNameHasIndexFn>(
        optionalEntry(symbolinfo, "LeafScopeNameHasIndex", sig::kLeafScopeNameHasIndex));
    n.scopeNameSuffix = reinterpret_cast<ScopeNameSuffixFn>(
        optionalEntry(symbolinfo, "ScopeNameSuffix", sig::kScopeNameSuffix));
    n.scopeNameParentLength = reinterpret_cast<ScopeNameParentLengthFn>(
        optionalEntry(symbolinfo, "ScopeNameParentLength", sig::kScopeNameParentLength));
    n.fastaccess = py::Ref::own(fastaccess).release();
    n.symbolinfo = py::Ref::own(symbolinfo).release();
    n.indexForLinenoFunction = py::Ref::own(moduleAttribute(fastaccess, gNames.IndexForLineno)).release();
    n.findIndexOfLogicalFunction =
        py::Ref::own(moduleAttribute(fastaccess, gNames.FindIndexOfLogical)).release();
    n.leafScopeNameHasIndexFunction =
        py::Ref::own(moduleAttribute(symbolinfo, gNames.LeafScopeNameHasIndex)).release();
    gNative = n;
    gWatched[0].watch(gModuleDict, gNames.fastaccess, n.fastaccess);
    gWatched[1].watch(gModuleDict, gNames.symbolinfo, n.symbolinfo);
    // A sibling's own dict, taken as the module's: rebinding the global to
    // another object fails the first two watches before these matter.
    if (PyModule_Check(fastaccess) && PyModule_Check(symbolinfo)) {
        gWatched[2].watch(PyModule_GetDict(fastaccess), gNames.IndexForLineno, n.indexForLinenoFunction);
        gWatched[3].watch(PyModule_GetDict(fastaccess), gNames.FindIndexOfLogical,
                          n.findIndexOfLogicalFunction);
        gWatched[4].watch(PyModule_GetDict(symbolinfo), gNames.LeafScopeNameHasIndex,
                          n.leafScopeNameHasIndexFunction);
    }
}

// --- Watching names ----------------------------------------------------------

void WatchedName::watch(PyObject* dict, PyObject* name, PyObject* expected) noexcept {
    dict_ = dict;
    name_ = name;
    expected_ = expected;
    since_.watch(dict);
}

bool WatchedName::holdsAfterLookup() noexcept {
    if (dict_ == nullptr || expected_ == nullptr) return false;
    if (PyDict_GetItem(dict_, name_) != expected_) return false;
    since_.mark(dict_, name_);
    return true;
}

namespace {


// `module.name` is the very function bound at import (borrowed lookups).
bool holdsFunction(PyObject* module, PyObject* name, PyObject* function) {
    return function != nullptr && moduleAttribute(module, name) == function;
}

// The siblings a new namespace binds, when they give the very functions
// bound at import (the same extension's module objects made again), are
// watched in place of the old ones: the native forms still stand for them.
void rewatchSiblings(PyObject* dict) noexcept {
    NativeSiblings& n = gNative;
    PyObject* fastaccess = PyDict_GetItem(dict, gNames.fastaccess);
    PyObject* symbolinfo = PyDict_GetItem(dict, gNames.symbolinfo);
    if (fastaccess != nullptr && fastaccess != n.fastaccess && PyModule_Check(fastaccess) &&
        holdsFunction(fastaccess, gNames.IndexForLineno, n.indexForLinenoFunction) &&
        holdsFunction(fastaccess, gNames.FindIndexOfLogical, n.findIndexOfLogicalFunction)) {
        py::Ref old = py::Ref::steal(n.fastaccess);  // released once nothing reads it
        n.fastaccess = py::Ref::own(fastaccess).release();
        gWatched[2].watch(PyModule_GetDict(fastaccess), gNames.IndexForLineno, n.indexForLinenoFunction);
        gWatched[3].watch(PyModule_GetDict(fastaccess), gNames.FindIndexOfLogical, n.findIndexOfLogicalFunction);
    }
    if (symbolinfo != nullptr && symbolinfo != n.symbolinfo && PyModule_Check(symbolinfo) &&
        holdsFunction(symbolinfo, gNames.LeafScopeNameHasIndex, n.leafScopeNameHasIndexFunction)) {
        py::Ref old = py::Ref::steal(n.symbolinfo);
        n.symbolinfo = py::Ref::own(symbolinfo).release();
        gWatched[4].watch(PyModule_GetDict(symbolinfo), gNames.LeafScopeNameHasIndex,
                          n.leafScopeNameHasIndexFunction);
    }
    gWatched[0].watch(dict, gNames.fastaccess, n.fastaccess);
    gWatched[1].watch(dict, gNames.symbolinfo, n.symbolinfo);
    watchFullNameIn(dict);
}

}  // namespace

void holdModule(PyObject* module) {
    gModule = py::Ref::own(module).release();
    gModuleDict = PyModule_GetDict(module);
    gWatchedModules = nullptr;  // watched at the first use
}

void followCurrentModuleAfterLookup() noexcept {
    if (gModule == nullptr) return;  // during init
    PyObject* modules = compat::modulesDict();
    if (modules == nullptr) return;
    PyObject* current = PyDict_GetItem(modules, gNames.moduleName);
    if (current == gModule) {
        gWatchedModules = modules;
        gWatchedModule.watch(modules, gNames.moduleName, gModule);
        gWatchedModule.holds();  // marks it
        return;
    }
    if (current == nullptr || !PyModule_Check(current)) return;
    // The one in use until now goes last, when every global points at the
    // new one: its release may free it (2.7 then empties its namespace) and
    // run finalizers, as any lookup of a global may.
    py::Ref old = py::Ref::steal(gModule);
    gModule = py::Ref::own(current).release();
    gModuleDict = PyModule_GetDict(current);
    rewatchSiblings(gModuleDict);
    gWatchedModules = modules;
    gWatchedModule.watch(modules, gNames.moduleName, gModule);
    gWatchedModule.holds();
}

bool nativeSiblingsCurrent() noexcept {
    followCurrentModule();
    const NativeSiblings& n = gNative;
    if (!n.indexForLineno || !n.findIndexOfLogical || !n.leafScopeNameHasIndex || !n.scopeNameSuffix) {
        return false;
    }
    for (WatchedName& w : gWatched) {
        if (!w.holds()) return false;
    }
    return true;
}

PyObject* lookupGlobal(PyObject* name) {
    followCurrentModule();
    PyObject* v = PyDict_GetItem(gModuleDict, name);
    if (v == nullptr) v = PyDict_GetItem(PyEval_GetBuiltins(), name);
    if (v == nullptr) {
        PyErr_Format(PyExc_NameError, msg::kNameNotDefined, compat::strText(name));
        py::fail();
    }
    return v;
}

py::Ref joinTwoScopeNames(PyObject* scope, PyObject* name) {
    return py::check(gSymbolInfo.joinTwoScopeNames(scope, name, 0));
}

py::Ref splitScopeNames(PyObject* full) { return py::check(gSymbolInfo.splitScopeNames(full, 0)); }

py::Ref splitScopeNameFromSuffixes(PyObject* name) {
    return py::check(gSymbolInfo.splitScopeNameFromSuffixes(name, 0));
}

py::Ref appendScopeSuffixes(PyObject* name, PyObject* index) {
    return py::check(gSymbolInfo.appendScopeSuffixes(name, index, Py_None, 0));
}

namespace {
// `module_global.attribute`, looked up anew.
py::Ref siblingFunction(PyObject* moduleGlobal, PyObject* attribute) {
    py::Ref module = py::Ref::own(lookupGlobal(moduleGlobal));
    return py::check(PyObject_GetAttr(module.get(), attribute));
}
}  // namespace

Py_ssize_t indexForLineno(PyObject* logicalList, long lineno, bool native) {
    if (native) {
        const Py_ssize_t i = gNative.indexForLineno(logicalList, lineno);
        if (i == -1 && PyErr_Occurred()) py::fail();
        return i;
    }
    py::Ref fn = siblingFunction(gNames.fastaccess, gNames.IndexForLineno);
    py::Ref line = py::check(compat::intFromLong(lineno));
    py::Ref r = py::check(PyObject_CallFunctionObjArgs(fn.get(), logicalList, line.get(), nullptr));
    return py::asIndex(r.get());
}

Py_ssize_t findIndexOfLogical(PyObject* logicalList, PyObject* logical, bool native) {
    if (native) {
        const Py_ssize_t i = gNative.findIndexOfLogical(logicalList, logical);
        if (i == -1 && PyErr_Occurred()) py::fail();
        return i;
    }
    py::Ref fn = siblingFunction(gNames.fastaccess, gNames.FindIndexOfLogical);
    py::Ref r = py::check(PyObject_CallFunctionObjArgs(fn.get(), logicalList, logical, nullptr));
    return py::asIndex(r.get());
}

bool leafScopeNameHasIndex(PyObject* name, bool native) {
    if (native) return gNative.leafScopeNameHasIndex(name) != 0;
    py::Ref fn = siblingFunction(gNames.symbolinfo, gNames.LeafScopeNameHasIndex);
    py::Ref r = py::check(PyObject_CallFunctionObjArgs(fn.get(), name, nullptr));
    return py::truth(r.get());
}

}  // namespace sbc
