// Overridable steps: when the module calls a step on an instance of a Python
// subclass (or of a class whose instances have a dictionary), a step found
// by attribute lookup that is not our own built-in method runs instead.
#pragma once

#include "common/pycompat.hpp"
#include "common/pyref.hpp"

namespace sbc {

enum class Step : int {
    Clear,
    PrepareForFind,
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
    // Internal: not visible to Python, never overridden.
    UpdateScopesSeenWithStartScopeLogical,
    Count,
};

struct StepInfo {
    const char* name;    // the Python-visible method name
    bool overridable;
    // Steps that never raise report through the unraisable hook under
    // "pysource.scopebodycache.CChangeFinder.<name>" and answer 0.
    bool neverRaises;
};

inline constexpr StepInfo kSteps[] = {
    {"_Clear", true, false},
    {"_PrepareForFind", true, false},
    {"_FindChangesEntireListAdded", true, false},
    {"_GetLeafScopeWithIndex", true, false},
    {"_ProcessRemovedLogicals", true, false},
    {"_ProcessAddedLogicals", true, false},
    {"_ProcessDedentedComments", true, true},
    {"_LogicalInScopeChanged", true, false},
    {"_SetLogicalScopeNames", true, false},
    {"_UpdateLogicalScopeName", true, false},
    {"_UpdateContainingScope", true, false},
    {"_PropagateScopeIndexChangeForward", true, false},
    {"_FindScopeIndexForLogical", true, true},
    {"_FindScopeNameContainingLogical", true, false},
    {"_UpdateScopesSeenWithStartScopeLogical", false, true},
};
static_assert(sizeof(kSteps) / sizeof(kSteps[0]) == static_cast<int>(Step::Count),
              "one entry per step");

constexpr const StepInfo& stepInfo(Step step) { return kSteps[static_cast<int>(step)]; }

// Interns the step names and their report contexts; once, at import.
void internStepNames();

// Takes our own function object of each overridable step from the class
// dictionary of `type`, once its methods are bound.
void registerSteps(PyTypeObject* type);

// The report context of a step that never raises.
const char* unraisableContext(Step step) noexcept;

// The override to call instead of the built-in step, or an empty handle.
py::Ref findOverride(PyObject* self, Step step);

// Whether an override of the step may exist, without running any Python
// code: true unless the class's attribute is our own method and the
// instance dictionary (if any) does not hold the name. Conservative: a class
// with its own attribute hooks always counts as overriding.
bool mayOverride(PyObject* self, Step step) noexcept;

inline py::Ref toPython(PyObject* o) { return py::Ref::own(o ? o : Py_None); }
inline py::Ref toPython(Py_ssize_t v) { return py::check(compat::intFromSsize(v)); }

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

}  // namespace sbc
