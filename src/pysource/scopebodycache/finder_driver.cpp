// The finder's life cycle and the FindChanges driver.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/names.hpp"

namespace sbc {

bool assertionsOn() noexcept { return Py_OptimizeFlag == 0; }

void assertThat(bool condition) {
    if (!condition && assertionsOn()) {
        PyErr_SetNone(PyExc_AssertionError);
        py::fail();
    }
}

Py_ssize_t logicalListLength(PyObject* self) {
    PyObject* list = finderState(self).logicalList;
    if (list == Py_None) raise(PyExc_TypeError, msg::kNoneHasNoLen);
    return PyList_GET_SIZE(list);
}

py::Ref logicalAt(PyObject* self, Py_ssize_t i) {
    PyObject* list = finderState(self).logicalList;
    if (list == Py_None) raise(PyExc_TypeError, msg::kNoneNotSubscriptable);
    const Py_ssize_t n = PyList_GET_SIZE(list);
    const Py_ssize_t at = i < 0 ? i + n : i;
    if (at < 0 || at >= n) raise(PyExc_IndexError, "list index out of range");
    return py::Ref::own(PyList_GET_ITEM(list, at));
}

void addChange(PyObject* set, PyObject* name) {
    if (set == Py_None) raiseNoneAttribute("add");
    py::checkStatus(PySet_Add(set, name));
}

void requireStrOrNone(PyObject* name) {
    if (name != Py_None && !PyString_CheckExact(name)) raiseExpectedType("str", name);
}

namespace finder {

void Clear(PyObject* self) {
    FinderState& s = finderState(self);
    // Each store may free a container whose items run Python code; the
    // fields are consistent after every single store.
    py::storeSlot(&s.classChanges, Py_None);
    py::storeSlot(&s.functionChanges, Py_None);
    py::storeSlot(&s.contentsChanges, Py_None);
    py::storeSlot(&s.scopesSeen, Py_None);
    s.endIndexForScopesSeen = 0;
    s.nextChangeIndex = -1;
    s.lastProcessedIndex = -1;
    s.owedScanIndent = kNoScanOwed;
}

void PrepareForFind(PyObject* self) {
    FinderState& s = finderState(self);
    py::storeSlot(&s.classChanges, py::check(PySet_New(nullptr)).get());
    py::storeSlot(&s.functionChanges, py::check(PySet_New(nullptr)).get());
    py::storeSlot(&s.contentsChanges, py::check(PySet_New(nullptr)).get());
    py::storeSlot(&s.scopesSeen, py::check(PyDict_New()).get());
    s.endIndexForScopesSeen = 0;
    s.nextChangeIndex = -1;
    s.lastProcessedIndex = -1;
    s.owedScanIndent = kNoScanOwed;
}

void DestroyImpl(PyObject* self) {
    setLogicalList(self, Py_None);
    route::Clear(self);
}

namespace {

Py_ssize_t lengthOf(PyObject* list) {
    if (list == Py_None) raise(PyExc_TypeError, msg::kNoneHasNoLen);
    return PyList_GET_SIZE(list);
}

py::Ref findChangesGuarded(PyObject* self, PyObject* addedList, PyObject* removedList) {
    FinderState& s = finderState(self);
    const Py_ssize_t added = lengthOf(addedList);
    const Py_ssize_t total = logicalListLength(self);
    if (added == total) {
        route::ProcessRemovedLogicals(self, removedList);
        route::FindChangesEntireListAdded(self);
    } else {
        py::Ref indices = route::ProcessRemovedLogicals(self, removedList);
        if (!indices.isNone() && !PyList_CheckExact(indices.get())) {
            raiseExpectedType("list", indices.get());
        }
        route::ProcessAddedLogicals(self, addedList, indices.get());
        PyObject* classes = s.classChanges;
        const bool scopesChanged =
            py::checkSize(PyObject_Size(classes)) != 0 ||
            py::checkSize(PyObject_Size(s.functionChanges)) != 0;
        if (scopesChanged) {
            const Py_ssize_t n = logicalListLength(self);
            s.nextChangeIndex = n;
            // A pass may already have covered the whole list.
            if (n > s.endIndexForScopesSeen) UpdateScopesSeen(self, n);
        }
    }
    py::Ref result = py::check(PyTuple_New(3));
    PyObject* items[3] = {s.contentsChanges, s.classChanges, s.functionChanges};
    for (int k = 0; k < 3; ++k) {
        Py_INCREF(items[k]);
        PyTuple_SET_ITEM(result.get(), k, items[k]);
    }
    return result;
}

}  // namespace

py::Ref FindChanges(PyObject* self, PyObject* addedList, PyObject* removedList) {
    if (finderState(self).contentsChanges != Py_None) raise(PyExc_ValueError, msg::kRecursive);
    route::PrepareForFind(self);
    // The finder's reference must not outlive the call, whatever happens.
    py::Ref keepAlive = py::Ref::own(self);
    py::Ref result;
    try {
        result = findChangesGuarded(self, addedList, removedList);
    } catch (const py::Error&) {
        py::SavedError pending;
        route::Clear(self);  // its own error replaces the pending one
        pending.restore();
        throw;
    } catch (const std::bad_alloc&) {
        PyErr_NoMemory();
        py::SavedError pending;
        route::Clear(self);
        pending.restore();
        throw py::Error{};
    }
    route::Clear(self);
    return result;
}

}  // namespace finder
}  // namespace sbc
