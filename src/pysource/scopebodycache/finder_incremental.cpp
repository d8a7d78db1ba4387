// The incremental pass: visit, in ascending order, only the indices that may
// have changed, and carry changes forward until they stop.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <algorithm>
#include <vector>

namespace sbc::finder {

using namespace contracts;

namespace {

bool nonEmptySet(PyObject* set) { return PyAnySet_Check(set) && PySet_GET_SIZE(set) > 0; }

// Once a definition was added, removed or renamed, the indices of later
// same-named definitions may be stale; repair them before anything at
// `index` is named from the logicals above it. Without such a change the
// table is left alone, so ordinary typing never walks the list.
void bringScopesSeenUpTo(PyObject* self, Py_ssize_t index) {
    FinderState& s = finderState(self);
    if (index > s.endIndexForScopesSeen &&
        (nonEmptySet(s.classChanges) || nonEmptySet(s.functionChanges))) {
        UpdateScopesSeen(self, index);
    }
}

// The first index of the run of comment/blank lines just before `i` that
// this pass has not processed yet (i itself when there is none).
Py_ssize_t startOfUnprocessedWhitespace(PyObject* self, Py_ssize_t i) {
    const FinderState& s = finderState(self);
    Py_ssize_t b = i;
    while (b - 1 > s.lastProcessedIndex && b - 1 >= 0) {
        if (!isWhitespace(logicalAt(self, b - 1).record())) break;
        --b;
    }
    return b;
}

// Whether list[i] is `logical` (no wrap-around for a negative i).
bool isItemAt(PyObject* self, Py_ssize_t i, PyObject* logical) {
    PyObject* list = finderState(self).logicalList;
    return list != Py_None && i >= 0 && i < PyList_GET_SIZE(list) && PyList_GET_ITEM(list, i) == logical;
}

Py_ssize_t indexByIdentity(PyObject* self, PyObject* logical) {
    PyObject* list = finderState(self).logicalList;
    if (list == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotIterable);
    for (Py_ssize_t j = 0; j < PyList_GET_SIZE(list); ++j) {
        if (PyList_GET_ITEM(list, j) == logical) return j;
    }
    return -1;
}

// The names taken off added logicals before they are visited, kept until the
// visiting starts so that a failure before it can put them back.
class NamesTakenOff {
public:
    NamesTakenOff() = default;
    NamesTakenOff(const NamesTakenOff&) = delete;
    NamesTakenOff& operator=(const NamesTakenOff&) = delete;

    void takeOff(const LogicalRef& item) {
        Logical* l = item.record();
        if (l->fScopeName == nullptr && l->fLocalScopeName == nullptr) return;
        kept_.push_back({LogicalRef::own(item.get()), py::Ref::own(l->fScopeName), py::Ref::own(l->fLocalScopeName)});
        setScopeName(l, nullptr);
        setLocalScopeDefined(l, nullptr);
    }
    // On the way out of a failure: the pending error waits while the old
    // names go back (the releases can run Python code).
    void putBack() noexcept {
        py::SavedError pending;
        for (Kept& k : kept_) {
            Logical* l = k.item.record();
            py::storeSlot(&l->fScopeName, k.scope.get());
            py::storeSlot(&l->fLocalScopeName, k.local.get());
        }
        kept_.clear();
        pending.restore();
    }

private:
    struct Kept {
        LogicalRef item;
        py::Ref scope;
        py::Ref local;
    };
    std::vector<Kept> kept_;
};

}  // namespace

void ProcessAddedLogicals(PyObject* self, PyObject* addedList, PyObject* indices) {
    IndexList list(indices);
    processAdded(self, addedList, list);
}

void processAdded(PyObject* self, PyObject* addedList, IndexList& indices) {
    FinderState& s = finderState(self);
    const bool native = nativePass(self);
    s.lastProcessedIndex = -1;
    if (addedList == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotIterable);
    {
        // A call that fails on its arguments (an item that is not a logical,
        // one not in the list) leaves every logical as it found it: the names
        // taken off the items before are put back.
        NamesTakenOff takenOff;
        try {
            for (Py_ssize_t k = 0; k < PyList_GET_SIZE(addedList); ++k) {
                LogicalRef item = LogicalRef::own(PyList_GET_ITEM(addedList, k));
                Py_ssize_t i = findIndexOfLogical(s.logicalList, item.get(), native);
                assertListItemIs(self, i, item.get());
                // Optimised, nothing above caught an answer that is not where
                // the logical stands: look for it, and skip one that is not in
                // the list rather than name whatever stands at the answer.
                if (!isItemAt(self, i, item.get())) i = indexByIdentity(self, item.get());
                if (i < 0) continue;
                // An added logical is new whatever it carries (an undo may put
                // back the very objects it removed, with their old names): it
                // is named afresh, so the scan it starts is not cut short by
                // stale names.
                if (isScopeStart(item.record())) unfileDefinition(self, item.get());
                takenOff.takeOff(item);
                indices.append(i);
            }
            indices.sort();
        } catch (...) {
            takenOff.putBack();
            throw;
        }
    }

    Py_ssize_t resume = -1;
    Py_ssize_t position = 0;
    while (position < indices.size()) {
        const Py_ssize_t i = indices.at(position);
        ++position;
        LogicalRef item = logicalAt(self, i);
        if (resume != -1) {
            if (i < resume) continue;
            resume = -1;
        }
        s.nextChangeIndex = position < indices.size() ? indices.at(position) : logicalListLength(self);
        if (s.nextChangeIndex == i) continue;

        // Comment and blank lines take their scope from the code line after
        // them, so the whole unprocessed run around i is placed together.
        const Py_ssize_t first = startOfUnprocessedWhitespace(self, i);
        const bool whitespace = isWhitespace(item.record());
        if (whitespace || first < i) {
            bringScopesSeenUpTo(self, first);
            const Py_ssize_t r = route::ProcessDedentedComments(self, first);
            requireRunPlaced(r, whitespace ? i : first);
            if (whitespace) {
                s.lastProcessedIndex = r - 1;
                resume = r;
                // A run that reaches the end of the list leaves nothing to visit.
                if (r < logicalListLength(self)) {
                    Py_ssize_t at = position;
                    while (at < indices.size() && indices.at(at) < r) ++at;
                    if (at == indices.size() || indices.at(at) != r) indices.insert(at, r);
                }
                continue;
            }
            s.lastProcessedIndex = i - 1;
        }
        bringScopesSeenUpTo(self, i);
        ProcessNonDedentedComment(self, item.get(), i);
        s.lastProcessedIndex = i;
    }
}

bool ProcessTypedLine(PyObject* self, PyObject* addedList, PyObject* removedList) {
    if (PyList_GET_SIZE(addedList) != 1 || PyList_GET_SIZE(removedList) != 1) return false;
    PyObject* added = PyList_GET_ITEM(addedList, 0);
    PyObject* removed = PyList_GET_ITEM(removedList, 0);
    if (!logicalCheck(added) || !logicalCheck(removed)) return false;
    Logical* a = asLogical(added);
    Logical* r = asLogical(removed);
    if (isScopeStart(a) || isWhitespace(a) || isScopeStart(r)) return false;
    PyObject* removedScope = scopeName(r);
    if (!compat::isStrExact(removedScope)) return false;
    // The removed line maps to where the added one stands, with no comment
    // run before it to place: otherwise the general steps take the edit.
    FinderState& s = finderState(self);
    PyObject* list = s.logicalList;
    const Py_ssize_t n = PyList_GET_SIZE(list);
    const Py_ssize_t i = gNative.indexForLineno(list, r->fLineno);
    if (i < 0 || i >= n || PyList_GET_ITEM(list, i) != added ||
        gNative.findIndexOfLogical(list, added) != i) {
        PyErr_Clear();
        return false;
    }
    if (i > 0) {
        PyObject* before = PyList_GET_ITEM(list, i - 1);
        if (!logicalCheck(before) || isWhitespace(asLogical(before))) return false;
    }
    // From here, what the steps do for this edit, in their order.
    LogicalRef held = LogicalRef::own(added);
    LogicalRef heldRemoved = LogicalRef::own(removed);
    addChange(s.contentsChanges, removedScope);  // the removed line's scope
    setScopeName(a, nullptr);                    // an added line is named afresh
    setLocalScopeDefined(a, nullptr);
    s.lastProcessedIndex = -1;
    s.nextChangeIndex = n;
    py::Ref scope = findScopeNameContaining(self, i, removedScope);
    requireScopeFound(scope.get(), i);
    requireStrOrNone(scope.get());
    setScopeName(a, scope.get());
    s.owedScanIndent = kNoScanOwed;
    LogicalInScopeChanged(self, added, scope.get(), Py_None, Py_None);
    // A code line that reads as the one it replaced (same indent, same
    // scope; neither opens a scope) leaves every later line's look-back
    // where it was: the scan would walk a block header's whole body to find
    // nothing changed.
    const bool sameReading = !isWhitespace(r) && a->fIndent == r->fIndent && compat::isStrExact(scope.get()) &&
                             compat::strEqual(scope.get(), removedScope);
    if (!sameReading) ScanForwardForChangedScopes(self, i + 1, a->fIndent);
    s.lastProcessedIndex = i;
    return true;
}

void NoteReplacedDefinition(PyObject* self, PyObject* addedList, PyObject* removedList) {
    NativePass* pass = finderState(self).native;
    if (pass == nullptr || PyList_GET_SIZE(addedList) != 1 || PyList_GET_SIZE(removedList) != 1) return;
    PyObject* added = PyList_GET_ITEM(addedList, 0);
    PyObject* removed = PyList_GET_ITEM(removedList, 0);
    if (!logicalCheck(added) || !logicalCheck(removed)) return;
    Logical* a = asLogical(added);
    Logical* r = asLogical(removed);
    if (!isScopeStart(a) || !isScopeStart(r) || a->fIndent != r->fIndent) return;
    PyObject* list = finderState(self).logicalList;
    const Py_ssize_t i = gNative.indexForLineno(list, r->fLineno);
    if (i < 0 || i >= PyList_GET_SIZE(list) || PyList_GET_ITEM(list, i) != added) {
        PyErr_Clear();
        return;
    }
    pass->replacedDefinition = py::Ref::own(removed);
    pass->replacingDefinition = py::Ref::own(added);
}

namespace {

// Whether `logical`, just named, is the noted replacing class/def and
// carries the names the replaced one had.
bool readsAsReplacedDefinition(PyObject* self, PyObject* logicalObj) {
    const NativePass* pass = finderState(self).native;
    if (pass == nullptr || pass->replacingDefinition.get() != logicalObj) return false;
    const Logical* a = asLogical(logicalObj);
    const Logical* r = asLogical(pass->replacedDefinition.get());
    auto same = [](PyObject* x, PyObject* y) {
        return x != nullptr && y != nullptr && compat::isStrExact(x) && compat::isStrExact(y) &&
               compat::strEqual(x, y);
    };
    return a->fIndent == r->fIndent && same(a->fScopeName, r->fScopeName) &&
           same(a->fLocalScopeName, r->fLocalScopeName);
}

}  // namespace

void ProcessNonDedentedComment(PyObject* self, PyObject* logicalObj, Py_ssize_t i) {
    py::Ref scope = route::FindScopeNameContainingLogical(self, i);
    requireScopeFound(scope.get(), i);
    requireStrOrNone(scope.get());
    LogicalRef held = LogicalRef::own(logicalObj);
    Logical* logical = held.record();
    py::Ref previous = py::Ref::own(scopeName(logical));
    bool changed = false;
    if (previous.isNone() || !strEquals(previous.get(), scope.get())) {
        setScopeName(logical, scope.get());
        changed = true;
    }
    py::Ref previousLocal = py::Ref::none();
    // A kept class/def whose containing scope is unchanged keeps its index
    // as long as no definition was added, removed or renamed so far in this
    // call; skipping the count spares a walk of the list from the top.
    const bool indexUnchanged = !changed && logical->fLocalScopeName != nullptr &&
                                !nonEmptySet(finderState(self).classChanges) &&
                                !nonEmptySet(finderState(self).functionChanges);
    if (isScopeStart(logical) && localScopeDefined(logical) != nullptr && !indexUnchanged) {
        const Py_ssize_t index = route::FindScopeIndexForLogical(self, logicalObj, i);
        py::Ref newLocal = route::GetLeafScopeWithIndex(self, logicalObj, index);
        previousLocal = py::Ref::own(localScopeDefined(logical));
        assertThat(bool(previousLocal));
        if (!previousLocal) previousLocal = py::Ref::none();
        if (previousLocal.isNone() || !strEquals(newLocal.get(), previousLocal.get())) {
            setLocalScopeDefined(logical, newLocal.get());
            changed = true;
        }
    }
    if (changed && isScopeStart(logical)) fileDefinition(self, logicalObj, i);
    // A scan cut short before this index is carried on from here.
    FinderState& s = finderState(self);
    const long owed = s.owedScanIndent;
    s.owedScanIndent = kNoScanOwed;
    if (!changed) {
        if (owed < logical->fIndent) ScanForwardForChangedScopes(self, i + 1, owed);
        return;
    }
    if (!previousLocal.isNone() && !leafScopeNameHasIndex(previousLocal.get(), nativePass(self))) {
        previousLocal = py::Ref::none();
    }
    route::LogicalInScopeChanged(self, logicalObj, scope.get(), previous.get(), previousLocal.get());
    if (owed == kNoScanOwed && readsAsReplacedDefinition(self, logicalObj)) return;
    ScanForwardForChangedScopes(self, i + 1, std::min<long>(owed, logical->fIndent));
}

void ScanForwardForChangedScopes(PyObject* self, Py_ssize_t start, long changedIndent) {
    FinderState& s = finderState(self);
    assertThat(s.nextChangeIndex != -1);
    Py_ssize_t k = start;
    while (k < s.nextChangeIndex) {
        LogicalRef item = logicalAt(self, k);
        py::Ref previous = py::Ref::own(scopeName(item.record()));
        if (previous.isNone()) break;
        if (isWhitespace(item.record())) {
            // Placed with the rest of its run; an unchanged comment says
            // nothing about the code after it, so the scan goes on.
            const Py_ssize_t r = route::ProcessDedentedComments(self, k);
            requireRunPlaced(r, k);
            k = r;
            continue;
        }
        py::Ref scope = route::FindScopeNameContainingLogical(self, k);
        requireScopeFound(scope.get(), k);
        if (py::checkStatus(PyObject_RichCompareBool(scope.get(), previous.get(), Py_EQ))) {
            if (item->fIndent <= changedIndent) return;
            ++k;
            continue;
        }
        if (!compat::isStrExact(scope.get())) msg::raiseExpectedType("str", scope.get());
        // Recorded before the update, while a class/def still carries its
        // old local name, so that its old full name is in the change sets.
        route::LogicalInScopeChanged(self, item.get(), previous.get());
        route::UpdateLogicalScopeName(self, item.get(), k, scope.get());
        route::LogicalInScopeChanged(self, item.get(), scope.get());
        if (item->fIndent < changedIndent) changedIndent = item->fIndent;
        ++k;
    }
    // Cut short by the next index to visit (or by a logical not named yet):
    // that visit carries the scan on.
    if (changedIndent < s.owedScanIndent) s.owedScanIndent = changedIndent;
}

}  // namespace sbc::finder
