// The native pass's own state: the definition index's life from one call
// to the next, and the index list as the passes see it.
#include "common/messages.hpp"
#include "pysource/scopebodycache/def_index.hpp"
#include "pysource/scopebodycache/finder.hpp"

#include <algorithm>
#include <memory>

namespace sbc {

bool gCheckDefinitionIndex = false;
bool gTraceDefinitionIndex = false;

void traceDefinitionIndex(const char* event) noexcept {
    if (gTraceDefinitionIndex) PySys_WriteStderr("definition index %s\n", event);
}

int FinderState::traverseInternal(visitproc visit, void* arg) const {
    Py_VISIT(spareResult);
    return defIndex != nullptr ? defIndex->traverse(visit, arg) : 0;
}

void FinderState::clearInternal() noexcept {
    DefIndex* index = defIndex;
    defIndex = nullptr;
    delete index;
    Py_CLEAR(spareResult);
}

void dropDefinitionIndex(PyObject* self) noexcept {
    FinderState& s = finderState(self);
    if (s.defIndex == nullptr) return;
    traceDefinitionIndex("dropped");
    if (s.native != nullptr) {
        // The pass may be inside a step that holds it: it goes when the
        // call ends, and the call goes on with the table walk.
        s.native->indexUsable = false;
        delete s.native->dropped;
        s.native->dropped = s.defIndex;
        s.defIndex = nullptr;
        return;
    }
    DefIndex* index = s.defIndex;
    s.defIndex = nullptr;
    delete index;
}

void stepCalledDirectly(PyObject* self) noexcept {
    dropDefinitionIndex(self);
    noteNamesWritten(finderState(self).logicalList);
}

void callStarts(PyObject* self) noexcept {
    FinderState& s = finderState(self);
    if (s.defIndex != nullptr && (s.defIndex->list() != s.logicalList || !s.defIndex->current())) {
        dropDefinitionIndex(self);
    }
    if (s.defIndex != nullptr) {
        s.defIndex->noteOwnWrites();
    } else {
        noteNamesWritten(s.logicalList);
    }
}

DefIndex* definitionIndex(PyObject* self) {
    FinderState& s = finderState(self);
    NativePass* pass = s.native;
    if (pass == nullptr || !pass->indexUsable) return nullptr;
    if (s.defIndex == nullptr) {
        auto index = std::make_unique<DefIndex>(s.logicalList);
        if (!index->rebuild()) {
            pass->indexUsable = false;  // never usable: nothing to drop
            return nullptr;
        }
        s.defIndex = index.release();
        traceDefinitionIndex("rebuilt");
    }
    return s.defIndex;
}

void fileDefinition(PyObject* self, PyObject* logical, Py_ssize_t i) {
    if (!nativePass(self)) return;
    if (DefIndex* index = definitionIndex(self)) {
        if (!index->place(logical, i)) dropDefinitionIndex(self);
    }
}

void unfileDefinition(PyObject* self, PyObject* logical) {
    FinderState& s = finderState(self);
    // Before the first use the index is rebuilt from the list anyway.
    if (s.native == nullptr || !s.native->indexUsable || s.defIndex == nullptr) return;
    s.defIndex->remove(logical);
}

// --- The index list -----------------------------------------------------------

namespace {

PyObject* requireIndexList(PyObject* list, const char* method) {
    if (list == Py_None) msg::raiseNoneAttribute(method);
    return list;
}

}  // namespace

Py_ssize_t IndexList::size() const {
    if (vector_ != nullptr) return static_cast<Py_ssize_t>(vector_->size());
    return PyList_GET_SIZE(requireIndexList(list_, "__len__"));
}

Py_ssize_t IndexList::at(Py_ssize_t k) const {
    if (vector_ != nullptr) return (*vector_)[static_cast<size_t>(k)];
    return py::asIndex(PyList_GET_ITEM(list_, k));
}

void IndexList::append(Py_ssize_t value) {
    if (vector_ != nullptr) {
        vector_->push_back(value);
        return;
    }
    py::Ref v = py::check(compat::intFromSsize(value));
    py::checkStatus(PyList_Append(requireIndexList(list_, "append"), v.get()));
}

void IndexList::sort() {
    if (vector_ != nullptr) {
        // Typing gives one index, or the same one twice.
        if (!std::is_sorted(vector_->begin(), vector_->end())) std::sort(vector_->begin(), vector_->end());
        return;
    }
    py::checkStatus(PyList_Sort(requireIndexList(list_, "sort")));
}

void IndexList::insert(Py_ssize_t k, Py_ssize_t value) {
    if (vector_ != nullptr) {
        vector_->insert(static_cast<size_t>(k), value);
        return;
    }
    py::Ref v = py::check(compat::intFromSsize(value));
    py::checkStatus(PyList_Insert(list_, k, v.get()));
}

}  // namespace sbc
