#include "pysource/scopebodycache/bodycache.hpp"

#include "pysource/scopebodycache/siblings.hpp"

namespace sbc {

Py_ssize_t gBodyCacheStateOffset = 0;

namespace {
PyTypeObject BodyCacheType = {PyVarObject_HEAD_INIT(nullptr, 0)};
}

PyTypeObject* scopeBodyCacheType() noexcept { return &BodyCacheType; }

void readyScopeBodyCacheType() {
    gBodyCacheStateOffset = gDestroyableType->tp_basicsize;
    BodyCacheType.tp_name = "pysource.scopebodycache.CScopeBodyCache";
    BodyCacheType.tp_basicsize = gBodyCacheStateOffset + sizeof(BodyCacheState);
    BodyCacheType.tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE;
    BodyCacheType.tp_base = gDestroyableType;
    py::checkStatus(PyType_Ready(&BodyCacheType));
}

void bindScopeBodyCacheMethods() {}

}  // namespace sbc
