// GetFullNameForScopeDef: the full dotted name of the scope a class/def
// logical opens; None stands for the module scope.
#pragma once

#include "common/pyref.hpp"

namespace sbc {

py::Ref getFullNameForScopeDef(PyObject* scopeDef);

// Calls whatever the module global GetFullNameForScopeDef holds now.
py::Ref callGetFullNameForScopeDef(PyObject* scopeDef);

// Binds GetFullNameForScopeDef in the module namespace.
void bindModuleFunctions(PyObject* moduleDict);

}  // namespace sbc
