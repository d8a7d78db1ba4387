#include "pysource/contracts/accessors.hpp"

namespace contracts {

PyTypeObject* gLogicalLineType = nullptr;

PyObject* localScopeDefinedChecked(const Logical* l) {
    PyObject* name = localScopeDefined(l);
    if (name == nullptr || PyString_CheckExact(name)) return name;
    msg::raiseExpectedType("bytes", name);
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
        PyErr_Format(PyExc_TypeError, msg::kExpectedBytes, Py_TYPE(name)->tp_name);
        py::fail();
    }
}

}  // namespace contracts
