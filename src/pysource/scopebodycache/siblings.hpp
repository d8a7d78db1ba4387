// What the module takes from its sibling modules at import: the typed entry
// points, bound once, and the module globals looked up at each use.
#pragma once

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
extern PyObject* gModuleDict;  // this module's namespace, for by-name lookups

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

// Calls of the siblings' Python-level functions, looked up by name through
// the module globals `_fastaccess` and `symbolinfo` at each call.
Py_ssize_t indexForLineno(PyObject* logicalList, long lineno);
Py_ssize_t findIndexOfLogical(PyObject* logicalList, PyObject* logical);
bool leafScopeNameHasIndex(PyObject* name);

}  // namespace sbc
