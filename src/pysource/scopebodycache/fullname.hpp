// GetFullNameForScopeDef: the full dotted name of the scope a class/def
// logical opens; None stands for the module scope.
#pragma once

#include "common/pyref.hpp"

namespace sbc {

py::Ref getFullNameForScopeDef(PyObject* scopeDef);

// Calls whatever the module global GetFullNameForScopeDef holds now; with
// `native` (the caller has checked fullNameFunctionCurrent), our own.
py::Ref callGetFullNameForScopeDef(PyObject* scopeDef, bool native = false);

// Whether the module global GetFullNameForScopeDef is still our own function.
bool fullNameFunctionCurrent() noexcept;  // after nativeSiblingsCurrent

// Binds GetFullNameForScopeDef in the module namespace.
void bindModuleFunctions(PyObject* moduleDict);

// Watches the global in another namespace of the module (see
// followCurrentModule).
void watchFullNameIn(PyObject* moduleDict) noexcept;

}  // namespace sbc
