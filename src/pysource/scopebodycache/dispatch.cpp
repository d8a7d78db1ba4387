#include "pysource/scopebodycache/dispatch.hpp"

#include "pysource/scopebodycache/function.hpp"

namespace sbc {
namespace {

struct StepEntry {
    PyObject* name = nullptr;      // interned
    PyObject* function = nullptr;  // our function object in the class dict
};

StepEntry gSteps[static_cast<int>(Step::Count)];

}  // namespace

void registerStep(Step step, const char* name, PyObject* function) {
    StepEntry& e = gSteps[static_cast<int>(step)];
    e.name = py::check(PyString_InternFromString(name)).release();
    Py_INCREF(function);
    e.function = function;
}

py::Ref findOverride(PyObject* self, Step step) {
    PyTypeObject* type = Py_TYPE(self);
    if (!(type->tp_flags & Py_TPFLAGS_HEAPTYPE) && type->tp_dictoffset == 0) return {};
    const StepEntry& e = gSteps[static_cast<int>(step)];
    py::Ref found = py::check(PyObject_GetAttr(self, e.name));
    if (isBoundFormOf(found.get(), e.function)) return {};
    return found;
}

}  // namespace sbc
