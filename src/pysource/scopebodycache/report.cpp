#include "pysource/scopebodycache/report.hpp"

#include "common/pycompat.hpp"

namespace sbc {

void reportUnraisable(const char* context) noexcept {
    PyObject* type;
    PyObject* value;
    PyObject* tb;
    PyErr_Fetch(&type, &value, &tb);
    PyErr_NormalizeException(&type, &value, &tb);
    // 2.7's report is one line without the traceback: the traceback goes
    // first (PyErr_Display rather than PyErr_Print: a SystemExit raised by
    // an override must not end the process from inside a step that never
    // raises). 3.x's hook prints the traceback itself, in the form its
    // users expect, once.
    if (!compat::kUnraisableHookPrintsTraceback && type != nullptr) PyErr_Display(type, value, tb);
    PyObject* ctx = compat::strFromText(context);
    PyErr_Restore(type, value, tb);
    PyErr_WriteUnraisable(ctx ? ctx : Py_None);
    Py_XDECREF(ctx);
    PyErr_Clear();
}

}  // namespace sbc
