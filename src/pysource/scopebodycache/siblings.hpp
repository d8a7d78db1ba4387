// What the module takes from its sibling modules at import: the typed entry
// points, bound once, and the module globals looked up at each use.
#pragma once

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/capi.hpp"
#include "pysource/contracts/destroyable_base.hpp"

namespace sbc {

struct SymbolInfo {
    contracts::JoinTwoScopeNamesFn joinTwoScopeNames = nullptr;
    contracts::SplitScopeNameFromSuffixesFn splitScopeNameFromSuffixes = nullptr;
    contracts::SplitScopeNamesFn splitScopeNames = nullptr;
    contracts::AppendScopeSuffixesFn appendScopeSuffixes = nullptr;
    char kFunctionKind = 0;
    char kMethodKind = 0;
    char kUnboundMethodKind = 0;
    char kPlainEquivKind = 0;
};

extern PyObject* gTimeFunc;         // __TimeFunc
extern PyTypeObject* gDestroyableType;
extern SymbolInfo gSymbolInfo;
// The namespace the module looks its globals up in: that of the module
// object callers now see. The module holds the module object it looks
// names up in, so it is not freed (2.7 empties a module's namespace when it
// frees it) while a finder may still use it.
extern PyObject* gModule;      // owned
extern PyObject* gModuleDict;  // its namespace, for by-name lookups
// At the end of a successful init: the module object made there.
void holdModule(PyObject* module);
// The module found under this module's name in sys.modules, when it is not
// the one names are looked up in, becomes that one: a second import (taken
// out of sys.modules and imported again; on 3.12 on, also the first import
// in the main interpreter after a subinterpreter's) makes a new module
// object whose globals callers rebind. One absent from sys.modules (a
// plugin reloader drops it) leaves the last one in use. Cheap when nothing
// changed; may release nothing and runs no Python code.
void followCurrentModuleAfterLookup() noexcept;

// Import-time binding, in the order the init sequence needs it.
void bindDestroyableBase();
void checkOtherTypes();
void bindVariables();
void bindFunctions();

// A module global looked up at the moment of use: the module namespace,
// then the built-ins; NameError when neither has it. Borrowed.
PyObject* lookupGlobal(PyObject* name);

// Thin wrappers over the symbol-info entry points (new references; throw).
py::Ref joinTwoScopeNames(PyObject* scope, PyObject* name);
py::Ref splitScopeNames(PyObject* full);
py::Ref splitScopeNameFromSuffixes(PyObject* name);
py::Ref appendScopeSuffixes(PyObject* name, PyObject* index);

// The native forms of the siblings' Python-level functions, when the
// siblings publish them, and what the module globals held at import.
struct NativeSiblings {
    contracts::IndexForLinenoFn indexForLineno = nullptr;
    contracts::FindIndexOfLogicalFn findIndexOfLogical = nullptr;
    contracts::LeafScopeNameHasIndexFn leafScopeNameHasIndex = nullptr;
    contracts::ScopeNameSuffixFn scopeNameSuffix = nullptr;
    contracts::ScopeNameParentLengthFn scopeNameParentLength = nullptr;  // like SplitScopeNames, bound for good
    PyObject* fastaccess = nullptr;  // the modules bound as globals at import
    PyObject* symbolinfo = nullptr;
    PyObject* indexForLinenoFunction = nullptr;  // their functions then
    PyObject* findIndexOfLogicalFunction = nullptr;
    PyObject* leafScopeNameHasIndexFunction = nullptr;
};

extern NativeSiblings gNative;

// Takes the native forms and notes the modules and functions they stand
// for; once, when the module body has bound its globals.
void bindNativeSiblings(PyObject* fastaccess, PyObject* symbolinfo);

// Whether each by-name lookup of a sibling function would find what was
// bound at import, and its native form exists: calling the native form is
// then the same as the lookup and call. Runs no Python code.
bool nativeSiblingsCurrent() noexcept;

// One name of a dict, watched for still holding an expected object. Asked at
// every FindChanges call, so it looks the name up again only when the dict
// may have changed since the last lookup (compat::DictWatch says).
class WatchedName {
public:
    WatchedName() noexcept = default;
    void watch(PyObject* dict, PyObject* name, PyObject* expected) noexcept;
    // Asked at every call: the unchanged case inline.
    bool holds() noexcept {
        if (dict_ != nullptr && expected_ != nullptr && since_.unchanged(dict_, name_, expected_)) return true;
        return holdsAfterLookup();
    }

private:
    bool holdsAfterLookup() noexcept;
    PyObject* dict_ = nullptr;      // borrowed: module dicts live as long as the process here
    PyObject* name_ = nullptr;      // an interned str
    PyObject* expected_ = nullptr;  // borrowed from what keeps it (the import-time snapshot)
    compat::DictWatch since_;       // marked at the last lookup that found expected_
};

// sys.modules still maps this module's name to the module in use: the
// cheap part of followCurrentModule, asked at every call.
extern PyObject* gWatchedModules;  // the sys.modules watched (compared only)
extern WatchedName gWatchedModule;

inline void followCurrentModule() noexcept {
    if (gWatchedModules != nullptr && compat::modulesDict() == gWatchedModules && gWatchedModule.holds()) return;
    followCurrentModuleAfterLookup();
}

// Calls of the siblings' Python-level functions, looked up by name through
// the module globals `_fastaccess` and `symbolinfo` at each call; with
// `native` (the caller has checked nativeSiblingsCurrent), their native
// forms.
Py_ssize_t indexForLineno(PyObject* logicalList, long lineno, bool native = false);
Py_ssize_t findIndexOfLogical(PyObject* logicalList, PyObject* logical, bool native = false);
bool leafScopeNameHasIndex(PyObject* name, bool native = false);

}  // namespace sbc
