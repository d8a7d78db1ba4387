// Pickling and copying of CChangeFinder and CScopeBodyCache.
#pragma once

#include "common/pyref.hpp"

namespace sbc {

// Installs __reduce__ and __setstate__ on a class made ready just before;
// RuntimeError "Unable to initialize pickling for <name>" on failure.
void installPickling(PyTypeObject* type);

// Binds __pyx_unpickle_CScopeBodyCache and __pyx_unpickle_CChangeFinder.
void bindUnpickleFunctions(PyObject* moduleDict);

}  // namespace sbc
