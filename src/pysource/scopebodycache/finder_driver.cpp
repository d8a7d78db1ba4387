// The finder's life cycle and the FindChanges driver.
#include "common/messages.hpp"
#include "pysource/scopebodycache/def_index.hpp"
#include "pysource/scopebodycache/dispatch.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/fullname.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <cassert>

namespace sbc {

using namespace contracts;

void assertThat(bool condition) {
    if (!condition && assertionsOn()) {
        PyErr_SetNone(PyExc_AssertionError);
        py::fail();
    }
}

Py_ssize_t logicalListLength(PyObject* self) {
    PyObject* list = finderState(self).logicalList;
    if (list == Py_None) msg::raise(PyExc_TypeError, msg::kNoneHasNoLen);
    return PyList_GET_SIZE(list);
}

void addChange(PyObject* set, PyObject* name) {
    if (set == Py_None) msg::raiseNoneAttribute("add");
    // Hashing a name that is not a str runs Python code, which may drop
    // the finder's reference to the set.
    py::Ref keep = py::Ref::own(set);
    py::checkStatus(PySet_Add(set, name));
}

void requireRunPlaced(Py_ssize_t end, Py_ssize_t at) {
    if (end > at) return;
    assertThat(false);
    PyErr_Format(PyExc_RuntimeError, msg::kCommentRunStuck, end, at);
    py::fail();
}

void requireScopeFound(PyObject* scope, Py_ssize_t i) {
    if (scope != Py_None) return;
    assertThat(false);
    PyErr_Format(PyExc_RuntimeError, msg::kScopeNotFound, i);
    py::fail();
}

void requireStrOrNone(PyObject* name) {
    if (name != Py_None && !compat::isStrExact(name)) msg::raiseExpectedType("str", name);
}

void unpackPair(PyObject* seq, py::Ref* first, py::Ref* second, bool firstTwo) {
    if (PyTuple_CheckExact(seq) || PyList_CheckExact(seq)) {
        const Py_ssize_t n = PySequence_Fast_GET_SIZE(seq);
        if (n < 2 || (n > 2 && !firstTwo)) msg::raiseUnpackCount(n);
        *first = py::Ref::own(PySequence_Fast_GET_ITEM(seq, 0));
        *second = py::Ref::own(PySequence_Fast_GET_ITEM(seq, 1));
        return;
    }
    if (firstTwo) {
        // seq[:2], as the split of a scope name is taken.
        if (seq == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotSubscriptable);
        py::Ref head = py::check(PySequence_GetSlice(seq, 0, 2));
        py::Ref items = py::check(PySequence_Tuple(head.get()));
        unpackPair(items.get(), first, second);
        return;
    }
    py::Ref iter = py::check(PyObject_GetIter(seq));
    py::Ref items[3];
    Py_ssize_t n = 0;
    for (; n < 3; ++n) {
        items[n] = py::Ref::steal(PyIter_Next(iter.get()));
        if (!items[n]) break;
    }
    if (PyErr_Occurred()) py::fail();
    if (n != 2) msg::raiseUnpackCount(n);
    *first = std::move(items[0]);
    *second = std::move(items[1]);
}

namespace finder {

namespace {

// C-level checks of the driver's own work, compiled in where NDEBUG is off
// (the sanitizer build). An override of _PrepareForFind or _Clear may leave
// any state, and so may __setstate__ before a call: only what the built-in
// steps leave is checked.
[[maybe_unused]] bool isIdle(PyObject* self) noexcept {
    const FinderState& s = finderState(self);
    return s.classChanges == Py_None && s.functionChanges == Py_None &&
           s.contentsChanges == Py_None && s.scopesSeen == Py_None && s.endIndexForScopesSeen == 0 &&
           s.nextChangeIndex == -1 && s.lastProcessedIndex == -1 && s.owedScanIndent == kNoScanOwed;
}

[[maybe_unused]] bool isPrepared(PyObject* self) noexcept {
    const FinderState& s = finderState(self);
    return (Py_TYPE(s.classChanges) == &PySet_Type) && PySet_GET_SIZE(s.classChanges) == 0 &&
           (Py_TYPE(s.functionChanges) == &PySet_Type) && PySet_GET_SIZE(s.functionChanges) == 0 &&
           (Py_TYPE(s.contentsChanges) == &PySet_Type) && PySet_GET_SIZE(s.contentsChanges) == 0 &&
           PyDict_CheckExact(s.scopesSeen) && PyDict_Size(s.scopesSeen) == 0 &&
           s.endIndexForScopesSeen == 0 && s.nextChangeIndex == -1 && s.lastProcessedIndex == -1;
}

}  // namespace

void Clear(PyObject* self) {
    FinderState& s = finderState(self);
    // Each store may free a container whose items run Python code; the
    // fields are consistent after every single store.
    for (PyObject** field : {&s.classChanges, &s.functionChanges, &s.contentsChanges, &s.scopesSeen}) {
        if (*field != Py_None) py::storeSlot(field, Py_None);
    }
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

// Runs _Clear on every way out of FindChanges. On the way out of a failure
// the pending exception is set aside while _Clear runs and raised again
// unless _Clear raised one of its own. An override of _Clear that fails
// would leave the call marked as in progress, refusing every later call:
// the built-in clear then makes the finder idle before its error goes on.
class ClearOnExit {
public:
    explicit ClearOnExit(PyObject* self) noexcept : self_(self) {}
    ClearOnExit(const ClearOnExit&) = delete;
    ClearOnExit& operator=(const ClearOnExit&) = delete;

    // The success path: a failing _Clear fails the call.
    void finish() {
        done_ = true;
        try {
            route::Clear(self_);
        } catch (...) {
            Clear(self_);
            throw;
        }
    }

    ~ClearOnExit() {
        if (done_) return;
        py::SavedError pending;
        try {
            route::Clear(self_);
            assert(mayOverride(self_, Step::Clear) || isIdle(self_));
            pending.restore();
        } catch (...) {
            py::setErrorFromCurrentException();  // replaces the pending one
            Clear(self_);
        }
    }

private:
    PyObject* self_;
    bool done_ = false;
};

// The most names the sets of a spare result may hold between calls.
constexpr Py_ssize_t kSpareMostNames = 16;

py::Ref resultTuple(const FinderState& s) {
    py::Ref result = py::check(PyTuple_New(3));
    PyObject* items[3] = {s.contentsChanges, s.classChanges, s.functionChanges};
    for (int k = 0; k < 3; ++k) {
        Py_INCREF(items[k]);
        PyTuple_SET_ITEM(result.get(), k, items[k]);
    }
    return result;
}

// After a pass whose visits changed a definition: the definitions after it
// that share its key are renumbered to the end of the list.
void renumberToEnd(PyObject* self) {
    FinderState& s = finderState(self);
    auto size = [](PyObject* set) {
        return Py_TYPE(set) == &PySet_Type ? PySet_GET_SIZE(set) : py::checkSize(PyObject_Size(set));
    };
    const bool scopesChanged = size(s.classChanges) != 0 || size(s.functionChanges) != 0;
    if (!scopesChanged) return;
    const Py_ssize_t n = logicalListLength(self);
    s.nextChangeIndex = n;
    // A pass may already have covered the whole list.
    if (n > s.endIndexForScopesSeen || nativePass(self)) UpdateScopesSeen(self, n);
}

py::Ref findChangesGuarded(PyObject* self, PyObject* addedList, PyObject* removedList) {
    FinderState& s = finderState(self);
    if (addedList == Py_None) msg::raise(PyExc_TypeError, msg::kNoneHasNoLen);
    const Py_ssize_t added = PyList_GET_SIZE(addedList);
    const Py_ssize_t total = logicalListLength(self);
    if (added == total) {
        route::ProcessRemovedLogicals(self, removedList);
        route::FindChangesEntireListAdded(self);
    } else {
        py::Ref indices = route::ProcessRemovedLogicals(self, removedList);
        if (!indices.isNone() && !PyList_CheckExact(indices.get())) {
            msg::raiseExpectedType("list", indices.get());
        }
        route::ProcessAddedLogicals(self, addedList, indices.get());
        renumberToEnd(self);
    }
    return resultTuple(s);
}

// --- The native pass ------------------------------------------------------------

bool anyStepOverridden(PyObject* self) noexcept {
    PyTypeObject* type = Py_TYPE(self);
    if (!(type->tp_flags & Py_TPFLAGS_HEAPTYPE) && type->tp_dictoffset == 0) return false;
    for (int k = 0; k < static_cast<int>(Step::Count); ++k) {
        if (mayOverride(self, static_cast<Step>(k))) return true;
    }
    return false;
}

// The native pass's hold on the finder for one call: on every way out it
// ends, and the index it dropped, with the references the index let go
// during the call, are released once nothing uses them.
class NativeCall {
public:
    explicit NativeCall(PyObject* self) noexcept : state_(finderState(self)) { state_.native = &pass_; }
    NativeCall(const NativeCall&) = delete;
    NativeCall& operator=(const NativeCall&) = delete;
    ~NativeCall() {
        state_.native = nullptr;
        delete pass_.dropped;
        if (state_.defIndex != nullptr) state_.defIndex->flushReleases();
    }
    NativePass& pass() noexcept { return pass_; }

private:
    FinderState& state_;
    NativePass pass_;
};

// What the index must show to be used for this call: built for this very
// list, which has since changed by exactly the logicals passed in.
bool indexStillMatches(const FinderState& s, Py_ssize_t added, Py_ssize_t removed) {
    const DefIndex* index = s.defIndex;
    return index != nullptr && index->list() == s.logicalList &&
           index->recordedLength + added - removed == PyList_GET_SIZE(s.logicalList);
}

// Whether a set may be emptied without running Python code and nothing
// watches it: no weak references, and every slot of its table empty or a
// str (on 3.x a removed element's marker is not one: such a set is passed
// over).
bool holdsOnlyStrs(PyObject* set) noexcept {
    auto* so = reinterpret_cast<PySetObject*>(set);
    if (so->weakreflist != nullptr) return false;
    if (so->fill == 0) return true;
    for (Py_ssize_t i = 0; i <= so->mask; ++i) {
        PyObject* key = so->table[i].key;
        if (key != nullptr && !compat::isStrExact(key)) return false;
    }
    return true;
}

// The spare result tuple, if the caller has let go of it and of its sets
// and the sets hold nothing but names (so emptying them runs no Python
// code); emptied. Otherwise null, and `unused` takes the spare, to be
// released when the call is over.
py::Ref takeSpareResult(FinderState& s, py::Ref* unused) {
    py::Ref spare = py::Ref::steal(s.spareResult);
    s.spareResult = nullptr;
    if (!spare) return {};
    bool usable = Py_REFCNT(spare.get()) == 1;
    for (int k = 0; usable && k < 3; ++k) {
        PyObject* set = PyTuple_GET_ITEM(spare.get(), k);
        usable = Py_TYPE(set) == &PySet_Type && Py_REFCNT(set) == 1 && holdsOnlyStrs(set);
    }
    if (!usable) {
        *unused = std::move(spare);
        return {};
    }
    for (int k = 0; k < 3; ++k) {
        PyObject* set = PyTuple_GET_ITEM(spare.get(), k);
        if (PySet_GET_SIZE(set) != 0) PySet_Clear(set);
    }
    return spare;
}

// The result of a native call: the spare tuple when it still holds the
// call's sets; kept as the next spare while its sets are small.
py::Ref nativeResult(FinderState& s, py::Ref spare) {
    py::Ref result;
    if (spare && PyTuple_GET_ITEM(spare.get(), 0) == s.contentsChanges &&
        PyTuple_GET_ITEM(spare.get(), 1) == s.classChanges &&
        PyTuple_GET_ITEM(spare.get(), 2) == s.functionChanges) {
        result = std::move(spare);
    } else {
        result = resultTuple(s);
    }
    Py_ssize_t held = 0;
    for (int k = 0; k < 3; ++k) {
        PyObject* set = PyTuple_GET_ITEM(result.get(), k);
        held += Py_TYPE(set) == &PySet_Type ? PySet_GET_SIZE(set) : kSpareMostNames + 1;
    }
    assert(s.spareResult == nullptr);  // taken at the start; no Python code ran since
    if (held <= kSpareMostNames) s.spareResult = result.copy().release();
    return result;
}

py::Ref findChangesNative(PyObject* self, PyObject* addedList, PyObject* removedList) {
    FinderState& s = finderState(self);
    py::Ref unused;  // released last, when the finder is idle again
    NativeCall call(self);
    NativePass& pass = call.pass();
    // As _PrepareForFind, but for the scopes-seen table, which only the
    // table walk needs (made then).
    py::Ref spare = takeSpareResult(s, &unused);
    if (spare) {
        py::storeSlot(&s.contentsChanges, PyTuple_GET_ITEM(spare.get(), 0));
        py::storeSlot(&s.classChanges, PyTuple_GET_ITEM(spare.get(), 1));
        py::storeSlot(&s.functionChanges, PyTuple_GET_ITEM(spare.get(), 2));
    } else {
        py::storeSlot(&s.classChanges, py::check(PySet_New(nullptr)).get());
        py::storeSlot(&s.functionChanges, py::check(PySet_New(nullptr)).get());
        py::storeSlot(&s.contentsChanges, py::check(PySet_New(nullptr)).get());
    }
    s.endIndexForScopesSeen = 0;
    s.nextChangeIndex = -1;
    s.lastProcessedIndex = -1;
    s.owedScanIndent = kNoScanOwed;

    py::Ref result;
    ClearOnExit clear(self);
    try {
        if (addedList == Py_None) msg::raise(PyExc_TypeError, msg::kNoneHasNoLen);
        const Py_ssize_t added = PyList_GET_SIZE(addedList);
        const Py_ssize_t total = logicalListLength(self);
        if (removedList == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotIterable);
        NativeIndices indices;
        IndexList list(&indices);
        if (added == total) {
            dropDefinitionIndex(self);
            pass.indexUsable = true;
            processRemoved(self, removedList, list);
            // The whole-list pass counts every definition into a new index.
            s.defIndex = new DefIndex(s.logicalList);
            traceDefinitionIndex("built");
            FindChangesEntireListAdded(self);
        } else {
            if (!indexStillMatches(s, added, PyList_GET_SIZE(removedList))) {
                dropDefinitionIndex(self);
                pass.indexUsable = true;  // built afresh when first needed
            }
            if (!ProcessTypedLine(self, addedList, removedList)) {
                NoteReplacedDefinition(self, addedList, removedList);
                processRemoved(self, removedList, list);
                processAdded(self, addedList, list);
            }
            renumberToEnd(self);
        }
        result = nativeResult(s, std::move(spare));
        // Kept for the next call only if it is known to match the list: no
        // repairs left, and no one else wrote names of the list meanwhile.
        if (s.defIndex != nullptr && (s.defIndex->hasCandidates() || !s.defIndex->current())) {
            dropDefinitionIndex(self);
        }
        if (s.defIndex != nullptr) {
            s.defIndex->recordedLength = PyList_GET_SIZE(s.logicalList);
            std::string why;
            if (gCheckDefinitionIndex && !s.defIndex->matchesList(&why)) {
                PyErr_Format(PyExc_SystemError, "definition index out of step: %s", why.c_str());
                py::fail();
            }
        }
    } catch (...) {
        dropDefinitionIndex(self);
        throw;
    }
    clear.finish();
    return result;
}

}  // namespace


namespace {

// Marks the finder as running a call of its own until the call ends.
class InCall {
public:
    explicit InCall(PyObject* self) noexcept : state_(finderState(self)), was_(state_.inCall) { state_.inCall = true; }
    InCall(const InCall&) = delete;
    InCall& operator=(const InCall&) = delete;
    ~InCall() { state_.inCall = was_; }

private:
    FinderState& state_;
    bool was_;
};

}  // namespace

// What a call costs (2-core machine, process CPU time; bench/ reruns it):
// with nothing to do, 0.13 us, most of it the Python call (the result
// tuple and its three sets are those of the last call, once the caller has
// dropped them); typing a character, 0.25 us at any file size, and a
// parameter into a method header 1.2 us whatever the body under it; a
// method header in or out, about 0.9 us; a header that renumbers a later
// namesake and renames its body, about 1.7 us; the whole-list pass, 57-87
// ns per fresh logical and 45-47 ns per named one. On an override's route
// typing costs 1.6-3 us, and a definition edit walks the scopes-seen table
// over the whole list (about 70 ns per logical).
//
// The editor protocol. Between two calls the caller edits the list in place
// and then passes what it inserted (added_list) and what it took out
// (removed_list). A removed logical is mapped to the place it left by its
// line number: IndexForLineno gives the first logical whose fLineno is at
// least that number, and the visit starts there. So every logical in the
// list must carry its current line number, and a removed one the number it
// had just before its own change. In a call that carries several changes
// (an edit in many places, a replace-all) the changes count as applied top
// to bottom, each seeing the line numbers the changes above it left: a
// removed logical below a change that added or removed lines carries its
// number shifted by that change. A number from before the whole batch would
// point above or below the place the logical left; the logical standing
// there is then not visited unless something else leads to it, and lines
// that took their scope from the removed one can keep stale names. A call
// with one change is the same under both readings. Lines that belong to no
// logical taken out with a class/def leave its old body numbered below it:
// the body is found by its names (processRemoved).
py::Ref FindChanges(PyObject* self, PyObject* addedList, PyObject* removedList) {
    if (finderState(self).contentsChanges != Py_None) msg::raise(PyExc_ValueError, msg::kRecursive);
    // The finder must outlive the call, whatever the steps' overrides drop.
    py::Ref keepSelf = py::Ref::own(self);
    InCall inCall(self);
    callStarts(self);
    if (!anyStepOverridden(self) && nativeSiblingsCurrent() && fullNameFunctionCurrent()) {
        return findChangesNative(self, addedList, removedList);
    }
    // Overrides may store any names: the index cannot follow them.
    dropDefinitionIndex(self);
    try {
        route::PrepareForFind(self);
    } catch (...) {
        // _Clear is not called here, but an override that failed after the
        // base step must not leave the finder marked as in a call.
        Clear(self);
        throw;
    }
    assert(mayOverride(self, Step::PrepareForFind) || isPrepared(self));
    py::Ref result;
    {
        ClearOnExit clear(self);
        result = findChangesGuarded(self, addedList, removedList);
        clear.finish();
    }
    assert(mayOverride(self, Step::Clear) || isIdle(self));
    return result;
}

}  // namespace finder
}  // namespace sbc
