// Strings interned once at import: attribute names looked up at each call
// and the fixed names the passes store or compare. Message texts live in
// common/messages.hpp.
#pragma once

#include <Python.h>

namespace sbc {

// The dotted names of this module and of the siblings it binds.
inline constexpr const char* kModuleName = "pysource.scopebodycache";
inline constexpr const char* kFastaccessModule = "pysource._fastaccess";
inline constexpr const char* kSymbolinfoModule = "pysource.symbolinfo";
inline constexpr const char* kDestroyableModule = "tallowkit.destroyable";

struct Names {
    PyObject* empty;  // "", the module scope
    PyObject* star;   // "*"
    PyObject* dot;    // "."
    PyObject* join;
    PyObject* moduleName;  // this module's dotted name, its key in sys.modules
    PyObject* fastaccess;
    PyObject* symbolinfo;
    PyObject* GetFullNameForScopeDef;
    PyObject* IndexForLineno;
    PyObject* FindIndexOfLogical;
    PyObject* LeafScopeNameHasIndex;
    PyObject* dict;
    PyObject* update;
    PyObject* startswith;
    PyObject* unpickleChangeFinder;
    PyObject* unpickleScopeBodyCache;
    PyObject* GetBodyOfScope;
    PyObject* GetScopeDef;
    PyObject* FindScopeDef;
    PyObject* FindBodyOfScopeDef;
};

extern Names gNames;

void internNames();

}  // namespace sbc
