#include "pysource/scopebodycache/dispatch.hpp"

#include "common/messages.hpp"
#include "pysource/scopebodycache/function.hpp"

#include <string>

namespace sbc {
namespace {

struct StepEntry {
    PyObject* name = nullptr;      // interned
    PyObject* function = nullptr;  // our function object in the class dict
    std::string context;           // the unraisable report's context
};

StepEntry gSteps[static_cast<int>(Step::Count)];

}  // namespace

void internStepNames() {
    for (int k = 0; k < static_cast<int>(Step::Count); ++k) {
        gSteps[k].name = py::check(compat::internStr(kSteps[k].name)).release();
        gSteps[k].context = std::string("pysource.scopebodycache.CChangeFinder.") + kSteps[k].name;
    }
}

void registerSteps(PyTypeObject* type) {
    for (int k = 0; k < static_cast<int>(Step::Count); ++k) {
        if (!kSteps[k].overridable) continue;
        PyObject* function = PyDict_GetItem(type->tp_dict, gSteps[k].name);
        if (function == nullptr) msg::raise(PyExc_RuntimeError, "a step has no method");
        Py_INCREF(function);
        gSteps[k].function = function;
    }
}

const char* unraisableContext(Step step) noexcept { return gSteps[static_cast<int>(step)].context.c_str(); }

py::Ref findOverride(PyObject* self, Step step) {
    if (!stepInfo(step).overridable) return {};
    PyTypeObject* type = Py_TYPE(self);
    if (!(type->tp_flags & Py_TPFLAGS_HEAPTYPE) && type->tp_dictoffset == 0) return {};
    const StepEntry& e = gSteps[static_cast<int>(step)];
    py::Ref found = py::check(PyObject_GetAttr(self, e.name));
    if (isBoundFormOf(found.get(), e.function)) return {};
    return found;
}

bool mayOverride(PyObject* self, Step step) noexcept {
    if (!stepInfo(step).overridable) return false;
    PyTypeObject* type = Py_TYPE(self);
    if (!(type->tp_flags & Py_TPFLAGS_HEAPTYPE) && type->tp_dictoffset == 0) return false;
    if (type->tp_getattro != PyObject_GenericGetAttr) return true;
    const StepEntry& e = gSteps[static_cast<int>(step)];
    if (_PyType_Lookup(type, e.name) != e.function) return true;
    PyObject** dictPtr = _PyObject_GetDictPtr(self);
    return dictPtr != nullptr && *dictPtr != nullptr && PyDict_GetItem(*dictPtr, e.name) != nullptr;
}

}  // namespace sbc
