// CChangeFinder: keeps fScopeName of every logical and fLocalScopeName of
// every class/def logical right while the caller edits the logical list.
//
// What is true between and during calls
// -------------------------------------
// - Between FindChanges calls the finder is idle: change sets and the
//   scopes-seen table are None, _fEndIndexForScopesSeen is 0,
//   _fNextChangeIndex and _fLastProcessedIndex are -1, and every logical
//   carries the names a whole-list pass would give it. FindChanges checks
//   the idle state at entry and exit in debug builds (checkIdle).
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
//
// assertThat() is the `assert` statement of the steps: it raises
// AssertionError (no message) and is skipped when the interpreter runs
// optimised (-O). It guards callers' input, so it never stands in for a
// check the module's own state needs. Checks of the module's own state are
// C-level (assert(), compiled in with NDEBUG off, as in the sanitizer build).
//
// Where Python code can run during a pass
// ---------------------------------------
// Any of these can change the list, the finder, or the arguments:
// 1. an override of a step in a Python subclass, or an instance attribute
//    standing in for one (every route:: call);
// 2. the siblings' Python-level functions, looked up through the module
//    globals `_fastaccess` and `symbolinfo` at each use (IndexForLineno,
//    FindIndexOfLogical, LeafScopeNameHasIndex), which Python may rebind;
// 3. the module global GetFullNameForScopeDef when it is rebound;
// 4. the symbol-info entry points, which may look for a Python-level
//    override of their own;
// 5. rich compares and hashing of names that are not exact str (sets,
//    dicts, ==), and the `startswith` of a name that is not a str;
// 6. the release of an old name in storeSlot (the object may have a
//    finalizer), and any allocation of a container, which may start a
//    garbage collection that runs finalizers;
// 7. after the pass, the release of a spare result tuple whose sets the
//    caller still held or filled (their finalizers), when the finder is
//    idle again.
// After each of them the pass re-checks instead of trusting what it read
// before: list items are read by index against the live length (logicalAt
// raises IndexError past the end) and held as LogicalRef across the call;
// the change sets, the table and the indices are read from the finder
// state afresh at each use (a set emptied to None by _Clear fails as
// Python would, with AttributeError); a nested FindChanges is refused
// while a call is in progress; and whatever ends the call, the finder is
// left idle.
#pragma once

#include "common/messages.hpp"
#include "common/pyref.hpp"
#include "common/small_vector.hpp"
#include "pysource/contracts/accessors.hpp"
#include "pysource/contracts/destroyable_base.hpp"
#include "pysource/scopebodycache/fields.hpp"

#include <vector>

namespace sbc {

// The pickled fields of a finder, after the base class's two, in the order
// of the state tuple (sorted by name). The Python-visible names, this order
// and the checksum that names it are fixed by stored pickles and by the
// callers that read them: never rename, reorder or add to them (a new field
// goes into the internal part of FinderState). See fields.hpp.
#define SBC_FINDER_FIELDS(X)                                                \
    X(Object, classChanges, "_fCurrentClassChanges", set)                   \
    X(Object, contentsChanges, "_fCurrentContentsChanges", set)             \
    X(Object, functionChanges, "_fCurrentFunctionChanges", set)             \
    X(Index, endIndexForScopesSeen, "_fEndIndexForScopesSeen", index)       \
    X(Index, lastProcessedIndex, "_fLastProcessedIndex", index)             \
    X(Object, logicalList, "_fLogicalList", list)                           \
    X(Index, nextChangeIndex, "_fNextChangeIndex", index)                   \
    X(Object, scopesSeen, "_fScopesSeen", dict)

class DefIndex;
struct DefinedName;
struct NativePass;

struct FinderState {
    SBC_FINDER_FIELDS(SBC_FIELD_MEMBER)
    // Internal, never pickled:
    // - the least indent among the logicals a forward scan changed before
    //   _fNextChangeIndex cut it short (kNoScanOwed when none); the next
    //   visit carries that scan on;
    long owedScanIndent;
    // - the native pass of the call in progress (null otherwise);
    NativePass* native;
    // - whether a FindChanges of this very finder is running, on either
    //   path (a state applied to it then is its own business);
    bool inCall;
    // - the definition index, kept between calls while it matches the list;
    DefIndex* defIndex;
    // - the tuple the last native call returned, with its three sets, while
    //   they are small: the next call uses them again once the caller has
    //   let go of all four (null when none is kept).
    PyObject* spareResult;

    // Each object field, for the slots (allocation, gc, deallocation).
    template <class Visit>
    void forEachObject(Visit&& visit) {
        SBC_FINDER_FIELDS(SBC_FIELD_VISIT)
    }
    // The references internal state holds, for the garbage collector.
    int traverseInternal(visitproc visit, void* arg) const;
    void clearInternal() noexcept;
};

// The native pass: the mode a FindChanges call runs in when no step is
// overridden and every sibling function the module looks up by name is
// still the one bound at import. It runs the same steps, but calls them
// directly, calls the siblings' native forms, keeps the index list in a
// vector and takes scope indices from the definition index instead of the
// scopes-seen table (which stays None; nothing can look at it during the
// call). Where the index cannot be used, the table walk takes over.
struct NativePass {
    // False once the index was dropped in this call: the table walk then.
    // While true, a finder without an index builds one at its first use.
    bool indexUsable = true;
    DefIndex* dropped = nullptr;  // dropped during the call; freed at its end
    // A call that replaces one class/def line by another where it stood
    // (typing in a header): the two.
    py::Ref replacedDefinition;
    py::Ref replacingDefinition;
};

inline constexpr long kNoScanOwed = 1L << 20;

// Our fields follow whatever instance size the base class has at import.
extern Py_ssize_t gFinderStateOffset;

inline FinderState& finderState(PyObject* self) noexcept {
    return contracts::stateAt<FinderState>(self, gFinderStateOffset);
}

inline bool nativePass(PyObject* self) noexcept { return finderState(self).native != nullptr; }

PyTypeObject* changeFinderType() noexcept;
void readyChangeFinderType();
void bindChangeFinderMethods();

inline void setLogicalList(PyObject* self, PyObject* value) {
    storeTyped(&finderState(self).logicalList, value, &PyList_Type, "list");
}

// The definition index of the native pass, built from the list at its
// first use in a call; null when the call takes scope indices from the
// table walk.
DefIndex* definitionIndex(PyObject* self);
// Drops the finder's definition index: it cannot be shown to match the
// list (a direct call of a step, an exception, new state, a name it cannot
// file). The call in progress goes on with the table walk.
void dropDefinitionIndex(PyObject* self) noexcept;
// A step called directly from Python: the finder's index goes, and those of
// the other finders of its list go stale.
void stepCalledDirectly(PyObject* self) noexcept;
// At the start of every FindChanges, on either path: the index goes if
// someone else wrote names of the list since its last call, and the other
// finders' indexes of the list go stale.
void callStarts(PyObject* self) noexcept;
// When set, every native call ends by comparing the definition index with
// the list (SystemError when they differ): the self-check of the replay,
// turned on by SBC_CHECK_INDEX=1 in the environment at import.
extern bool gCheckDefinitionIndex;
// When set (SBC_TRACE_INDEX=1), the index's life is written to stderr, a
// line per event ("definition index built", "... rebuilt", "... dropped"),
// for the tests of that life.
extern bool gTraceDefinitionIndex;
void traceDefinitionIndex(const char* event) noexcept;
// The native pass keeps the index in step with the names it stores: a
// class/def logical at `i` filed under its stored names, or taken out.
void fileDefinition(PyObject* self, PyObject* logical, Py_ssize_t i);
void unfileDefinition(PyObject* self, PyObject* logical);

// The index list of the incremental pass: the Python list callers and
// overrides see, or, in the native pass, a vector.
using NativeIndices = SmallVector<Py_ssize_t, 16>;

class IndexList {
public:
    explicit IndexList(PyObject* list) noexcept : list_(list) {}
    explicit IndexList(NativeIndices* vector) noexcept : vector_(vector) {}
    Py_ssize_t size() const;
    Py_ssize_t at(Py_ssize_t k) const;
    void append(Py_ssize_t value);
    void sort();
    void insert(Py_ssize_t k, Py_ssize_t value);

private:
    PyObject* list_ = nullptr;  // borrowed; None gives the AttributeErrors of None
    NativeIndices* vector_ = nullptr;
};

// Shared helpers of the passes.
inline bool assertionsOn() noexcept { return !compat::optimized(); }
void assertThat(bool condition);  // the assert statement: see above
Py_ssize_t logicalListLength(PyObject* self);
// list[i] with ordinary list indexing, checked to be a logical and owned:
// Python code may shrink the list while it is in use.
// list[i] with ordinary list indexing (borrowed), or the interpreter's error.
inline PyObject* listItemBorrowed(PyObject* self, Py_ssize_t i) {
    PyObject* list = finderState(self).logicalList;
    if (list == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotSubscriptable);
    const Py_ssize_t n = PyList_GET_SIZE(list);
    const Py_ssize_t at = i < 0 ? i + n : i;
    if (at < 0 || at >= n) msg::raise(PyExc_IndexError, msg::kListIndexOutOfRange);
    return PyList_GET_ITEM(list, at);
}
inline contracts::LogicalRef logicalAt(PyObject* self, Py_ssize_t i) {
    return contracts::LogicalRef::own(listItemBorrowed(self, i));
}
// `assert self._fLogicalList[i] is logical`, evaluated only when assertions
// are on, like the statement it stands for.
inline void assertListItemIs(PyObject* self, Py_ssize_t i, PyObject* logical) {
    if (assertionsOn()) assertThat(listItemBorrowed(self, i) == logical);
}
void addChange(PyObject* set, PyObject* name);
// The comment step answered `end` for a run at `at`: an answer that does not
// advance means it could not place the run (it reported why). That is an
// AssertionError where the steps assert; optimised, going on would loop or
// return with the run unnamed, so it is a RuntimeError.
void requireRunPlaced(Py_ssize_t end, Py_ssize_t at);
// The scope found for the logical at `i` by looking back: None means a
// logical before it has no name yet, which only a logical inserted without
// being passed as added can cause. AssertionError where the steps assert;
// optimised, naming on would store None, so it is a RuntimeError.
void requireScopeFound(PyObject* scope, Py_ssize_t i);
// Whether `name` is the scope `prefix` or one nested in it (the prefix ends
// at a separator). A name that is not a str is asked through Python.
bool inScope(PyObject* name, PyObject* prefix);
// A scope name about to be stored or used: str or None, else TypeError.
void requireStrOrNone(PyObject* name);
// `a, b = seq` (exactly two items) or, with firstTwo, `a, b = seq[:2]`.
void unpackPair(PyObject* seq, py::Ref* first, py::Ref* second, bool firstTwo = false);

// The built-in steps. Python-visible ones are overridable: the passes call
// them through route:: (route.hpp), which reaches a subclass override.
// Steps that never raise are written here as raising bodies; route:: adds
// the report through the unraisable hook.
namespace finder {
void Clear(PyObject* self);
void PrepareForFind(PyObject* self);
void DestroyImpl(PyObject* self);
py::Ref FindChanges(PyObject* self, PyObject* addedList, PyObject* removedList);
void FindChangesEntireListAdded(PyObject* self);
py::Ref GetLeafScopeWithIndex(PyObject* self, PyObject* logical, Py_ssize_t scopeIndex);
py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList);
void ProcessAddedLogicals(PyObject* self, PyObject* addedList, PyObject* indices);
// The bodies of the two, on either kind of index list.
void processRemoved(PyObject* self, PyObject* removedList, IndexList& indices);
void processAdded(PyObject* self, PyObject* addedList, IndexList& indices);
Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first);
void LogicalInScopeChanged(PyObject* self, PyObject* logical, PyObject* scopeName,
                           PyObject* oldContainingScope, PyObject* oldLeafScope);
bool SetLogicalScopeNames(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName,
                          PyObject* localName);
py::Ref UpdateLogicalScopeName(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName);
void UpdateContainingScope(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName);
void PropagateScopeIndexChangeForward(PyObject* self, PyObject* oldScopeName,
                                      PyObject* newScopeName, Py_ssize_t start, Py_ssize_t end);
Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logical, Py_ssize_t i);
py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i);
// The same; in the native pass `likely`, when it is the name found, is
// answered without building that name again (a line's old scope, say).
py::Ref findScopeNameContaining(PyObject* self, Py_ssize_t i, PyObject* likely);

// Internal steps, not visible to Python.
// _ProcessDedentedComments in two halves: where the run from `first` ends
// (the following logical: the first code line after it, or the list's
// length when none), and the placement of its members. A run with no code
// after it is placed as if a module-level line followed. `knownBase`, when
// given, is the following logical's containing scope as the caller already
// knows it (the whole-list pass, from its stack).
Py_ssize_t CommentRunEnd(PyObject* self, Py_ssize_t first);
Py_ssize_t PlaceCommentRun(PyObject* self, Py_ssize_t first, Py_ssize_t end, const py::Ref* knownBase);
// The native pass's way with the commonest edit, a code line replaced by
// another at the same place (typing): the steps' own work for it, without
// their general machinery, and without the forward scan when the new line
// reads as the old one did (the removed logical is trusted to be what
// stood there, as the editor protocol has it). False, having done
// nothing, for any other edit.
bool ProcessTypedLine(PyObject* self, PyObject* addedList, PyObject* removedList);
// Notes, for the native pass, a class/def line replaced by another where it
// stood at the same indent: when the new one gets the old one's names, its
// visit skips the forward scan (nothing a later line reads has changed).
void NoteReplacedDefinition(PyObject* self, PyObject* addedList, PyObject* removedList);
void ProcessNonDedentedComment(PyObject* self, PyObject* logical, Py_ssize_t i);
void ScanForwardForChangedScopes(PyObject* self, Py_ssize_t start, long changedIndent);
void UpdateScopesSeen(PyObject* self, Py_ssize_t end);
// The whole-list pass's count of the definition at `at`: the definition
// index when the pass has one, else UpdateScopesSeenWithStartScopeLogical.
// `name`, when given, is the logical's defined name as already read.
Py_ssize_t CountDefinition(PyObject* self, PyObject* logical, Py_ssize_t at, PyObject* scopeName,
                           const DefinedName* name = nullptr);
Py_ssize_t UpdateScopesSeenWithStartScopeLogical(PyObject* self, PyObject* logical,
                                                 PyObject* scopeName, bool nameIsBare);
}  // namespace finder

}  // namespace sbc
