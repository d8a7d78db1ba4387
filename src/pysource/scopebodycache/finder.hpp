// CChangeFinder: keeps fScopeName of every logical and fLocalScopeName of
// every class/def logical right while the caller edits the logical list.
//
// Invariants the passes keep (checked by debug-only assertions where cheap):
// - Between FindChanges calls the finder is idle: change sets and the
//   scopes-seen table are None, _fEndIndexForScopesSeen is 0,
//   _fNextChangeIndex and _fLastProcessedIndex are -1.
// - While the incremental pass visits index i, every logical before i
//   carries the names a whole-list pass would give it, _fNextChangeIndex is
//   the next index that will be visited (forward scans stop there) and
//   _fLastProcessedIndex < i.
// - _fScopesSeen maps "<containing scope>.<bare name>" to the index of the
//   last definition of that key before _fEndIndexForScopesSeen; the end only
//   moves forward within one call.
// - A forward scan stops at an unchanged code line only when that line is
//   indented no deeper than every line the scan changed: a shallower line
//   further down looks back past deeper unchanged ones to the changed lines.
// - A comment or blank line gets the scope of the next code line when it is
//   indented no deeper than that line, else the scope its own look-back
//   finds; a trailing run with no code after it is placed as if a
//   module-level line followed.
#pragma once

#include "common/pyref.hpp"
#include "pysource/contracts/accessors.hpp"

namespace sbc {

struct FinderState {
    PyObject* logicalList;           // list or None
    PyObject* classChanges;          // set or None
    PyObject* functionChanges;       // set or None
    PyObject* contentsChanges;       // set or None; not None marks a call in progress
    PyObject* scopesSeen;            // dict or None
    Py_ssize_t endIndexForScopesSeen;
    Py_ssize_t nextChangeIndex;
    Py_ssize_t lastProcessedIndex;
    // Not a Python-visible field: the least indent among the logicals a
    // forward scan changed before _fNextChangeIndex cut it short (kNoScanOwed
    // when none). The next visit carries that scan on.
    long owedScanIndent;
};

inline constexpr long kNoScanOwed = 1L << 20;

// Our fields follow whatever instance size the base class has at import.
extern Py_ssize_t gFinderStateOffset;

inline FinderState& finderState(PyObject* self) noexcept {
    return *reinterpret_cast<FinderState*>(reinterpret_cast<char*>(self) + gFinderStateOffset);
}

PyTypeObject* changeFinderType() noexcept;
void readyChangeFinderType();
void bindChangeFinderMethods();

// Field stores with the type rules of the fields.
void setLogicalList(PyObject* self, PyObject* value);
void setChangeSet(PyObject** field, PyObject* value);
void setScopesSeen(PyObject* self, PyObject* value);

// Shared helpers of the passes.
bool assertionsOn() noexcept;
void assertThat(bool condition);  // AssertionError without a message
Py_ssize_t logicalListLength(PyObject* self);
// list[i] with ordinary list indexing, owned: Python code may shrink the list.
py::Ref logicalAt(PyObject* self, Py_ssize_t i);
void addChange(PyObject* set, PyObject* name);
// A scope name about to be stored or used: str or None, else TypeError.
void requireStrOrNone(PyObject* name);
// The first two items of a split scope name (bare name, index).
void unpackTwo(PyObject* seq, py::Ref* first, py::Ref* second);

// The steps. Python-visible ones are overridable: route:: calls reach a
// subclass override, finder:: runs the built-in step.
namespace finder {
void Clear(PyObject* self);
void PrepareForFind(PyObject* self);
void DestroyImpl(PyObject* self);
py::Ref FindChanges(PyObject* self, PyObject* addedList, PyObject* removedList);
void FindChangesEntireListAdded(PyObject* self);
py::Ref GetLeafScopeWithIndex(PyObject* self, PyObject* logical, Py_ssize_t scopeIndex);
py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList);
void ProcessAddedLogicals(PyObject* self, PyObject* addedList, PyObject* indices);
Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) noexcept;
Py_ssize_t ProcessDedentedCommentsBody(PyObject* self, Py_ssize_t first);
void LogicalInScopeChanged(PyObject* self, PyObject* logical, PyObject* scopeName,
                           PyObject* oldContainingScope, PyObject* oldLeafScope);
bool SetLogicalScopeNames(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName,
                          PyObject* localName);
// `a, b = pair` as the interpreter does it.
void unpackPair(PyObject* pair, py::Ref* first, py::Ref* second);
py::Ref UpdateLogicalScopeName(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName);
void UpdateContainingScope(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName);
void PropagateScopeIndexChangeForward(PyObject* self, PyObject* oldScopeName,
                                      PyObject* newScopeName, Py_ssize_t start, Py_ssize_t end);
Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logical, Py_ssize_t i) noexcept;
Py_ssize_t FindScopeIndexForLogicalBody(PyObject* self, PyObject* logical, Py_ssize_t i);
py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i);

// Internal steps, not visible to Python.
void ProcessNonDedentedComment(PyObject* self, PyObject* logical, Py_ssize_t i);
void ScanForwardForChangedScopes(PyObject* self, Py_ssize_t start, long changedIndent);
void UpdateScopesSeen(PyObject* self, Py_ssize_t end);
Py_ssize_t UpdateScopesSeenWithStartScopeLogical(PyObject* self, PyObject* logical,
                                                 PyObject* scopeName, bool nameIsBare) noexcept;
}  // namespace finder

namespace route {
void Clear(PyObject* self);
void PrepareForFind(PyObject* self);
void FindChangesEntireListAdded(PyObject* self);
py::Ref GetLeafScopeWithIndex(PyObject* self, PyObject* logical, Py_ssize_t scopeIndex);
py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList);
void ProcessAddedLogicals(PyObject* self, PyObject* addedList, PyObject* indices);
Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) noexcept;
void LogicalInScopeChanged(PyObject* self, PyObject* logical, PyObject* scopeName,
                           PyObject* oldContainingScope = Py_None, PyObject* oldLeafScope = Py_None);
// An override gets the names as one pair.
void SetLogicalScopeNames(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName,
                          PyObject* localName);
void UpdateLogicalScopeName(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName);
void UpdateContainingScope(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName);
void PropagateScopeIndexChangeForward(PyObject* self, PyObject* oldScopeName,
                                      PyObject* newScopeName, Py_ssize_t start, Py_ssize_t end);
Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logical, Py_ssize_t i) noexcept;
py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i);
}  // namespace route

}  // namespace sbc
