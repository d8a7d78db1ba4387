// Overridable steps: when the module calls a step on an instance of a Python
// subclass (or of a class whose instances have a dictionary), a step found
// by attribute lookup that is not our own built-in method runs instead.
#pragma once

#include "common/pyref.hpp"

namespace sbc {

enum class Step : int {
    Clear,
    PrepareForFind,
    FindChanges,
    FindChangesEntireListAdded,
    GetLeafScopeWithIndex,
    ProcessRemovedLogicals,
    ProcessAddedLogicals,
    ProcessDedentedComments,
    LogicalInScopeChanged,
    SetLogicalScopeNames,
    UpdateLogicalScopeName,
    UpdateContainingScope,
    PropagateScopeIndexChangeForward,
    FindScopeIndexForLogical,
    FindScopeNameContainingLogical,
    Count,
};

// Registers our own function object for a step (from the class dict).
void registerStep(Step step, const char* name, PyObject* function);

// The override to call instead of the built-in step, or an empty handle.
py::Ref findOverride(PyObject* self, Step step);

inline py::Ref toPython(PyObject* o) { return py::Ref::own(o ? o : Py_None); }
inline py::Ref toPython(Py_ssize_t v) { return py::check(PyInt_FromSsize_t(v)); }

template <class... Args>
py::Ref callOverride(const py::Ref& override, Args... args) {
    py::Ref converted[] = {toPython(args)..., py::Ref()};
    constexpr Py_ssize_t n = sizeof...(Args);
    py::Ref tuple = py::check(PyTuple_New(n));
    for (Py_ssize_t i = 0; i < n; ++i) {
        PyTuple_SET_ITEM(tuple.get(), i, converted[i].release());
    }
    return py::check(PyObject_Call(override.get(), tuple.get(), nullptr));
}

// Runs the override if there is one, else `builtin()`; both give a py::Ref.
template <class Builtin, class... Args>
py::Ref dispatch(PyObject* self, Step step, Builtin&& builtin, Args... args) {
    if (py::Ref override = findOverride(self, step)) return callOverride(override, args...);
    return builtin();
}

}  // namespace sbc
