#include "pysource/scopebodycache/report.hpp"

#include "common/pycompat.hpp"

namespace sbc {

void reportUnraisable(const char* context) noexcept {
    PyObject* type;
    PyObject* value;
    PyObject* tb;
    PyErr_Fetch(&type, &value, &tb);
    PyErr_NormalizeException(&type, &value, &tb);
    // PyErr_Display rather than PyErr_Print: a SystemExit raised by an
    // override must not end the process from inside a step that never raises.
    if (type != nullptr) PyErr_Display(type, value, tb);
    PyObject* ctx = compat::strFromText(context);
    PyErr_Restore(type, value, tb);
    PyErr_WriteUnraisable(ctx ? ctx : Py_None);
    Py_XDECREF(ctx);
    PyErr_Clear();
}

}  // namespace sbc
