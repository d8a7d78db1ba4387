#include "pysource/contracts/accessors.hpp"

namespace contracts {

PyTypeObject* gLogicalLineType = nullptr;

Logical* requireLogical(PyObject* o) {
    if (!logicalCheck(o)) {
        PyErr_SetString(PyExc_TypeError, "Argument must be a logical");
        py::fail();
    }
    return asLogical(o);
}

PyObject* localScopeDefinedChecked(const Logical* l) {
    PyObject* name = localScopeDefined(l);
    if (name == nullptr || PyString_CheckExact(name)) return name;
    PyErr_Format(PyExc_TypeError, "Expected %.16s, got %.200s", "bytes", Py_TYPE(name)->tp_name);
    py::fail();
}

NameBytes::NameBytes(PyObject* name) {
    if (PyString_Check(name)) {
        bytes_ = PyString_AS_STRING(name);
    } else if (PyUnicode_Check(name)) {
        encoded_ = py::check(PyUnicode_AsEncodedString(name, nullptr, nullptr));
        bytes_ = PyString_AS_STRING(encoded_.get());
    } else if (PyByteArray_Check(name)) {
        bytes_ = PyByteArray_AS_STRING(name);
    } else {
        PyErr_Format(PyExc_TypeError, "expected bytes, %.200s found", Py_TYPE(name)->tp_name);
        py::fail();
    }
}

}  // namespace contracts
