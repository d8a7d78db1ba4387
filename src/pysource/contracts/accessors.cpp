#include "pysource/contracts/accessors.hpp"

namespace contracts {

PyTypeObject* gLogicalLineType = nullptr;

PyObject* localScopeDefinedChecked(const Logical* l) {
    PyObject* name = localScopeDefined(l);
    if (name == nullptr || compat::isStrExact(name)) return name;
    msg::raiseExpectedType(compat::kNameTypeName, name);
}

NameBytes::NameBytes(PyObject* name) {
    if (compat::isStr(name)) {
        bytes_ = compat::strText(name);
    } else if (compat::isOtherText(name)) {
        bytes_ = compat::otherTextBytes(name, &encoded_);
    } else if (PyByteArray_Check(name)) {
        bytes_ = PyByteArray_AS_STRING(name);
    } else {
        PyErr_Format(PyExc_TypeError, msg::kExpectedBytes, Py_TYPE(name)->tp_name);
        py::fail();
    }
}

}  // namespace contracts
