// Glue the three stand-in sibling modules share: publishing typed entry
// points, readying types, and the native method table a type advertises.
#pragma once

#include "common/pyref.hpp"
#include "pysource/contracts/capi.hpp"
#include "pysource/contracts/destroyable_base.hpp"
#include "pysource/contracts/sibling_types.hpp"

namespace siblings {

// The 2.7 tables (PyMemberDef, PyGetSetDef, keyword lists) take char* for
// texts they never write.
inline char* cstr(const char* s) noexcept { return const_cast<char*>(s); }

// Sets a module attribute without PyModule_AddObject, whose reference
// handling on failure differs between its error paths.
inline void setAttr(PyObject* module, const char* name, PyObject* value) {
    if (PyObject_SetAttrString(module, name, value) < 0) py::fail();
}

// Publishes one typed entry point. `signature` must have static storage: the
// capsule keeps the pointer, not a copy.
inline void publish(PyObject* capi, const char* name, void* target, const char* signature) {
    py::Ref capsule = py::check(PyCapsule_New(target, signature, nullptr));
    if (PyDict_SetItemString(capi, name, capsule.get()) < 0) py::fail();
}

// The `_capi` dict, created empty and attached to the module.
inline PyObject* makeCapi(PyObject* module) {
    py::Ref capi = py::check(PyDict_New());
    setAttr(module, contracts::kCapiAttr, capi.get());
    return capi.get();  // the module keeps it alive
}

inline void readyType(PyObject* module, const char* name, PyTypeObject* type) {
    if (PyType_Ready(type) < 0) py::fail();
    setAttr(module, name, reinterpret_cast<PyObject*>(type));
}

// A type with no state of its own: the module only has to offer the name.
inline void readyMinimalType(PyObject* module, const char* name, PyTypeObject* type,
                             const char* qualifiedName,
                             Py_ssize_t size = sizeof(contracts::PlainSiblingObject)) {
    type->tp_name = qualifiedName;
    type->tp_basicsize = size;
    type->tp_flags = Py_TPFLAGS_DEFAULT | Py_TPFLAGS_BASETYPE;
    type->tp_new = PyType_GenericNew;
    readyType(module, name, type);
}

// Advertises a native method table in the type's dict, where native
// subclasses and clients look for it. Call after PyType_Ready.
inline void setVtable(PyTypeObject* type, void* vtable, const char* capsuleName) {
    py::Ref capsule = py::check(PyCapsule_New(vtable, capsuleName, nullptr));
    if (PyDict_SetItemString(type->tp_dict, contracts::kVtableAttr, capsule.get()) < 0) py::fail();
    PyType_Modified(type);
}

}  // namespace siblings
