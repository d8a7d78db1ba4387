// Removed logicals and the recording of changes into the three change sets.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

namespace sbc::finder {

using namespace contracts;

py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList) {
    if (removedList == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotIterable);
    py::Ref result = py::check(PyList_New(0));
    IndexList indices(result.get());
    processRemoved(self, removedList, indices);
    return result;
}

void processRemoved(PyObject* self, PyObject* removedList, IndexList& result) {
    const bool native = nativePass(self);
    Py_ssize_t lastIndex = -1;
    for (Py_ssize_t k = 0; k < PyList_GET_SIZE(removedList); ++k) {
        LogicalRef logical = LogicalRef::own(PyList_GET_ITEM(removedList, k));
        py::Ref scope = py::Ref::own(scopeName(logical.record()));
        if (scope.isNone()) continue;
        // One still in the list (a caller's mistake) keeps its place in the
        // definition index, as the table walk would still count it.
        if (native && isScopeStart(logical.record()) &&
            findIndexOfLogical(finderState(self).logicalList, logical.get(), true) < 0) {
            unfileDefinition(self, logical.get());
        }
        route::LogicalInScopeChanged(self, logical.get(), scope.get());
        Py_ssize_t index = indexForLineno(finderState(self).logicalList, logical->fLineno, native);
        // A logical removed from the end of the list still moves the comment
        // and blank lines before it (they took their scope from it): the last
        // logical stands in its place.
        const Py_ssize_t n = logicalListLength(self);
        if (index >= n && n > 0) index = n - 1;
        if (index != lastIndex && index >= 0 && index < n) result.append(index);
        lastIndex = index;
    }
}

void LogicalInScopeChanged(PyObject* self, PyObject* logicalObj, PyObject* scopeName,
                           PyObject* oldContainingScope, PyObject* oldLeafScope) {
    FinderState& s = finderState(self);
    addChange(s.contentsChanges, scopeName);
    if (oldContainingScope != Py_None) addChange(s.contentsChanges, oldContainingScope);
    LogicalRef logical = LogicalRef::own(logicalObj);
    if (!isScopeStart(logical.record())) return;
    const bool isClass = logical->fKind == kClassLogical;
    py::Ref defined = py::Ref::own(localScopeDefinedChecked(logical.record()));
    if (defined) {
        py::Ref full = joinTwoScopeNames(scopeName, defined.get());
        addChange(isClass ? s.classChanges : s.functionChanges, full.get());
    }
    if (oldContainingScope != Py_None && oldLeafScope != Py_None) {
        py::Ref full = joinTwoScopeNames(oldContainingScope, oldLeafScope);
        addChange(isClass ? s.classChanges : s.functionChanges, full.get());
    }
}

}  // namespace sbc::finder
