// How the passes call a step: through a subclass override when there is
// one, else the built-in step of finder.hpp; steps that never raise report
// their failure through the unraisable hook and answer 0. Every step call of
// the passes goes through call<Step>() here, so this is the one place that
// knows the routing.
#pragma once

#include "pysource/scopebodycache/dispatch.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/report.hpp"

#include <type_traits>

namespace sbc::route {

// An override's result as the pass uses it: ignored, kept, or an index.
template <class R>
R fromOverride(py::Ref result) {
    if constexpr (std::is_void_v<R>) {
        (void)result;
    } else if constexpr (std::is_same_v<R, Py_ssize_t>) {
        return py::asIndex(result.get());
    } else {
        return result;
    }
}

// The arguments an override gets: those of the built-in step, except that
// _SetLogicalScopeNames takes the two names as one pair.
template <Step S, class... Args>
py::Ref callStepOverride(const py::Ref& override, Args... args) {
    if constexpr (S == Step::SetLogicalScopeNames) {
        return [&](PyObject* logical, Py_ssize_t i, PyObject* scope, PyObject* local) {
            py::Ref pair = py::check(PyTuple_Pack(2, scope ? scope : Py_None, local ? local : Py_None));
            return callOverride(override, logical, i, pair.get());
        }(args...);
    } else {
        return callOverride(override, args...);
    }
}

// Runs the built-in step S; one that never raises reports and answers 0.
// This is also what the Python-visible built-in method runs.
template <Step S, class B, class... Params, class... Args>
auto builtin(B (*step)(PyObject*, Params...), PyObject* self, Args... args) {
    if constexpr (stepInfo(S).neverRaises) {
        return neverRaises(unraisableContext(S), B(0), [&] { return step(self, args...); });
    } else {
        return step(self, args...);
    }
}

// Calls step S on `self`: the override when there is one, else the
// built-in. R is what the pass uses of the result. The native pass runs
// only where nothing is overridden, so it calls the built-in directly.
template <Step S, class R, class B, class... Params, class... Args>
R call(B (*step)(PyObject*, Params...), PyObject* self, Args... args) {
    auto run = [&]() -> R {
        if (nativePass(self)) {
            if constexpr (std::is_void_v<R>) {
                step(self, args...);
                return;
            } else {
                return step(self, args...);
            }
        }
        if (py::Ref override = findOverride(self, S)) {
            return fromOverride<R>(callStepOverride<S>(override, args...));
        }
        if constexpr (std::is_void_v<R>) {
            step(self, args...);
        } else {
            return step(self, args...);
        }
    };
    if constexpr (stepInfo(S).neverRaises) {
        return neverRaises(unraisableContext(S), R(0), run);
    } else {
        return run();
    }
}

inline void Clear(PyObject* self) { call<Step::Clear, void>(finder::Clear, self); }

inline void PrepareForFind(PyObject* self) {
    call<Step::PrepareForFind, void>(finder::PrepareForFind, self);
}

inline void FindChangesEntireListAdded(PyObject* self) {
    call<Step::FindChangesEntireListAdded, void>(finder::FindChangesEntireListAdded, self);
}

inline py::Ref GetLeafScopeWithIndex(PyObject* self, PyObject* logical, Py_ssize_t scopeIndex) {
    return call<Step::GetLeafScopeWithIndex, py::Ref>(finder::GetLeafScopeWithIndex, self, logical,
                                                      scopeIndex);
}

inline py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList) {
    return call<Step::ProcessRemovedLogicals, py::Ref>(finder::ProcessRemovedLogicals, self,
                                                       removedList);
}

inline void ProcessAddedLogicals(PyObject* self, PyObject* addedList, PyObject* indices) {
    call<Step::ProcessAddedLogicals, void>(finder::ProcessAddedLogicals, self, addedList, indices);
}

inline Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) noexcept {
    return call<Step::ProcessDedentedComments, Py_ssize_t>(finder::ProcessDedentedComments, self,
                                                           first);
}

inline void LogicalInScopeChanged(PyObject* self, PyObject* logical, PyObject* scopeName,
                                  PyObject* oldContainingScope = Py_None,
                                  PyObject* oldLeafScope = Py_None) {
    call<Step::LogicalInScopeChanged, void>(finder::LogicalInScopeChanged, self, logical, scopeName,
                                            oldContainingScope, oldLeafScope);
}

inline void SetLogicalScopeNames(PyObject* self, PyObject* logical, Py_ssize_t i,
                                 PyObject* scopeName, PyObject* localName) {
    call<Step::SetLogicalScopeNames, void>(finder::SetLogicalScopeNames, self, logical, i,
                                           scopeName, localName);
}

inline void UpdateLogicalScopeName(PyObject* self, PyObject* logical, Py_ssize_t i,
                                   PyObject* scopeName) {
    call<Step::UpdateLogicalScopeName, void>(finder::UpdateLogicalScopeName, self, logical, i,
                                             scopeName);
}

inline void UpdateContainingScope(PyObject* self, PyObject* logical, Py_ssize_t i,
                                  PyObject* scopeName) {
    call<Step::UpdateContainingScope, void>(finder::UpdateContainingScope, self, logical, i,
                                            scopeName);
}

inline void PropagateScopeIndexChangeForward(PyObject* self, PyObject* oldScopeName,
                                             PyObject* newScopeName, Py_ssize_t start,
                                             Py_ssize_t end) {
    call<Step::PropagateScopeIndexChangeForward, void>(finder::PropagateScopeIndexChangeForward,
                                                       self, oldScopeName, newScopeName, start, end);
}

inline Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logical, Py_ssize_t i) noexcept {
    return call<Step::FindScopeIndexForLogical, Py_ssize_t>(finder::FindScopeIndexForLogical, self,
                                                            logical, i);
}

inline py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i) {
    return call<Step::FindScopeNameContainingLogical, py::Ref>(
        finder::FindScopeNameContainingLogical, self, i);
}

inline Py_ssize_t UpdateScopesSeenWithStartScopeLogical(PyObject* self, PyObject* logical,
                                                        PyObject* scopeName, bool nameIsBare) noexcept {
    return builtin<Step::UpdateScopesSeenWithStartScopeLogical>(
        finder::UpdateScopesSeenWithStartScopeLogical, self, logical, scopeName, nameIsBare);
}

}  // namespace sbc::route
