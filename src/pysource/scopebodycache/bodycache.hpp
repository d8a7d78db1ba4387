// CScopeBodyCache: the defining logical and the body of a scope by its full
// dotted name, cached until the owner clears them.
#pragma once

#include "common/pyref.hpp"
#include "pysource/contracts/destroyable_base.hpp"
#include "pysource/scopebodycache/fields.hpp"

namespace sbc {

// The pickled fields after the base class's two, in the order of the state
// tuple (sorted by name). Fixed by stored pickles: never rename, reorder or
// add to them. See fields.hpp.
#define SBC_BODY_CACHE_FIELDS(X)                                            \
    X(Object, logicalList, "_fLogicalList", list)                           \
    X(Object, scopeBodyCache, "_fScopeBodyCache", dict)                     \
    X(Object, scopeDefCache, "_fScopeDefCache", dict)

struct BodyCacheState {
    // logicalList: the list or None; scopeBodyCache: full name -> body
    // list; scopeDefCache: full name -> scope def.
    SBC_BODY_CACHE_FIELDS(SBC_FIELD_MEMBER)

    // Internal, never pickled: for each scope name whose body was searched
    // for a definition, (body list, its length, {defined name: first
    // position}), or null. Dropped with the body's cache entry.
    PyObject* bodyIndexes;

    template <class Visit>
    void forEachObject(Visit&& visit) {
        SBC_BODY_CACHE_FIELDS(SBC_FIELD_VISIT)
    }
    int traverseInternal(visitproc visit, void* arg) const {
        Py_VISIT(bodyIndexes);
        return 0;
    }
    void clearInternal() noexcept { Py_CLEAR(bodyIndexes); }
};

// Forgets what was built for the old state (after __setstate__).
void dropBodyIndexes(PyObject* self) noexcept;

// Our fields follow whatever instance size the base class has at import.
extern Py_ssize_t gBodyCacheStateOffset;

inline BodyCacheState& bodyCacheState(PyObject* self) noexcept {
    return contracts::stateAt<BodyCacheState>(self, gBodyCacheStateOffset);
}

PyTypeObject* scopeBodyCacheType() noexcept;
void readyScopeBodyCacheType();
void bindScopeBodyCacheMethods();

}  // namespace sbc
