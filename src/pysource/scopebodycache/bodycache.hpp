// CScopeBodyCache: the defining logical and the body of a scope by its full
// dotted name, cached until the owner clears them.
#pragma once

#include "common/pyref.hpp"

namespace sbc {

struct BodyCacheState {
    PyObject* logicalList;     // list or None
    PyObject* scopeBodyCache;  // dict or None: full name -> body list
    PyObject* scopeDefCache;   // dict or None: full name -> scope def
};

// Our fields follow whatever instance size the base class has at import.
extern Py_ssize_t gBodyCacheStateOffset;

inline BodyCacheState& bodyCacheState(PyObject* self) noexcept {
    return *reinterpret_cast<BodyCacheState*>(reinterpret_cast<char*>(self) + gBodyCacheStateOffset);
}

PyTypeObject* scopeBodyCacheType() noexcept;
void readyScopeBodyCacheType();
void bindScopeBodyCacheMethods();

// Field stores with the type rules of the fields ("Expected list, got X").
void setBodyCacheLogicalList(PyObject* self, PyObject* value);
void setBodyCacheDict(PyObject** field, PyObject* value);  // exact dict or None

}  // namespace sbc
