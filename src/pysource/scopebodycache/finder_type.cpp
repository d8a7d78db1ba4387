// CPython glue of CChangeFinder: the type object, its slots, the method
// table and the routing of overridable steps. The rules live in finder_*.cpp.
#include "pysource/scopebodycache/destroyable_subclass.hpp"
#include "pysource/scopebodycache/dispatch.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/report.hpp"
#include "pysource/scopebodycache/siblings.hpp"

namespace sbc {

Py_ssize_t gFinderStateOffset = 0;

namespace {

PyTypeObject FinderType = {PyVarObject_HEAD_INIT(nullptr, 0)};

const char kClassDoc[] =
    " Finds changes in logical list and updates fScopeName attribute on all\n"
    "  logicals and the fLocalScopeName attribute on start scope logicals.  The\n"
    "  fLocalScopeName attribute is updated with the scope index, which complicates\n"
    "  things substantially.\n"
    "  \n"
    "  Uses an optimized method is the list of added logicals == the _fLogicalList\n"
    "  which is case when the file is first read of the contents are entirely replaced\n"
    "  \n"
    "  If the added logicals != _fLogicalList, approach is to find an ordered list\n"
    "  of indicies that may have changed.  This ordered list contains the indicies\n"
    "  of all added logicals and the indicies of the logical following where each\n"
    "  removed logical.  Once the ordered list is found, each index is visited \n"
    "  in order to see if there are changes and to find scope names.\n"
    "  \n"
    "  Often times there will be a small number of changes that won't change the\n"
    "  scope structure -- think of a char types that translates into one logical\n"
    "  removed and one logical added.  Containing scope is usually found by looking\n"
    "  at prior logicals and finding one with an indent <= the indent of the logical\n"
    "  in question.\n"
    "  \n"
    "  Dedented comments are special cased and are given the scope of the logical\n"
    "  following, if their indent <= the indent of the line above.  Otherwise,\n"
    "  they're given the scope of the line above.\n"
    "  \n"
    "  \n"
    "  \n"
    "  ";

const char kSetNamesDoc[] =
    " Update the fScopeName and the fLocalScopeName (if applicable) for the\n"
    "    logical if possible and return fScopeName if it succeeds.  Returns None\n"
    "    and does not update anything if it fails.  Updates both names even if they\n"
    "    are already set.  The i argument is the index of the logical in the logical\n"
    "    list.  Succeeds if given a scope_name or if all logicals prior to this one\n"
    "    have already been updated ";

using Slots = DestroyableSubclass<FinderState, &gFinderStateOffset, &FinderState::logicalList,
                                  &FinderState::classChanges, &FinderState::functionChanges,
                                  &FinderState::contentsChanges, &FinderState::scopesSeen>;

int finder_init(PyObject* self, PyObject* args, PyObject* kwargs) {
    return py::guardedStatus([&] {
        setLogicalList(self, initDestroyableSubclass(self, args, kwargs));
        route::Clear(self);
        return 0;
    });
}

PyObject* get_logical_list(PyObject* self, void*) {
    return py::Ref::own(finderState(self).logicalList).release();
}

PyGetSetDef finder_getset[] = {
    {const_cast<char*>("_fLogicalList"), get_logical_list, nullptr, nullptr, nullptr},
    {nullptr, nullptr, nullptr, nullptr, nullptr},
};

// --- Python-visible methods -------------------------------------------------

PyObject* none() { return py::Ref::none().release(); }

PyObject* m_destroy_impl(PyObject* self, PyObject* const*) {
    finder::DestroyImpl(self);
    return none();
}
PyObject* m_Clear(PyObject* self, PyObject* const*) {
    finder::Clear(self);
    return none();
}
PyObject* m_PrepareForFind(PyObject* self, PyObject* const*) {
    finder::PrepareForFind(self);
    return none();
}
PyObject* m_FindChanges(PyObject* self, PyObject* const* a) {
    return finder::FindChanges(self, a[0], a[1]).release();
}
PyObject* m_FindChangesEntireListAdded(PyObject* self, PyObject* const*) {
    finder::FindChangesEntireListAdded(self);
    return none();
}
PyObject* m_GetLeafScopeWithIndex(PyObject* self, PyObject* const* a) {
    return finder::GetLeafScopeWithIndex(self, a[0], py::asIndex(a[1])).release();
}
PyObject* m_ProcessRemovedLogicals(PyObject* self, PyObject* const* a) {
    return finder::ProcessRemovedLogicals(self, a[0]).release();
}
PyObject* m_ProcessAddedLogicals(PyObject* self, PyObject* const* a) {
    finder::ProcessAddedLogicals(self, a[0], a[1]);
    return none();
}
PyObject* m_ProcessDedentedComments(PyObject* self, PyObject* const* a) {
    const Py_ssize_t first = py::asIndex(a[0]);
    return py::check(PyInt_FromSsize_t(finder::ProcessDedentedComments(self, first))).release();
}
PyObject* m_LogicalInScopeChanged(PyObject* self, PyObject* const* a) {
    finder::LogicalInScopeChanged(self, a[0], a[1], a[2] ? a[2] : Py_None, a[3] ? a[3] : Py_None);
    return none();
}
PyObject* m_SetLogicalScopeNames(PyObject* self, PyObject* const* a) {
    py::Ref scope, local;
    finder::unpackPair(a[2], &scope, &local);
    const bool changed =
        finder::SetLogicalScopeNames(self, a[0], py::asIndex(a[1]), scope.get(), local.get());
    return py::Ref::own(changed ? Py_True : Py_False).release();
}
PyObject* m_UpdateLogicalScopeName(PyObject* self, PyObject* const* a) {
    return finder::UpdateLogicalScopeName(self, a[0], py::asIndex(a[1]), a[2]).release();
}
PyObject* m_UpdateContainingScope(PyObject* self, PyObject* const* a) {
    finder::UpdateContainingScope(self, a[0], py::asIndex(a[1]), a[2]);
    return none();
}
PyObject* m_PropagateScopeIndexChangeForward(PyObject* self, PyObject* const* a) {
    const Py_ssize_t start = py::asIndex(a[2]);
    const Py_ssize_t end = py::asIndex(a[3]);
    finder::PropagateScopeIndexChangeForward(self, a[0], a[1], start, end);
    return none();
}
PyObject* m_FindScopeIndexForLogical(PyObject* self, PyObject* const* a) {
    const Py_ssize_t i = py::asIndex(a[1]);
    return py::check(PyInt_FromSsize_t(finder::FindScopeIndexForLogical(self, a[0], i))).release();
}
PyObject* m_FindScopeNameContainingLogical(PyObject* self, PyObject* const* a) {
    return finder::FindScopeNameContainingLogical(self, py::asIndex(a[0])).release();
}

constexpr Param kLogical{"logical", ArgCheck::Any};
constexpr Param kIndex{"i", ArgCheck::Any};

struct MethodEntry {
    FunctionSpec spec;
    Step step;  // Step::Count: not an overridable step
};

const MethodEntry kMethods[] = {
    {{"_destroy_impl", nullptr, m_destroy_impl, 0, 0, {}}, Step::Count},
    {{"_Clear", " Clear everything but _fLogicalList ", m_Clear, 0, 0, {}}, Step::Clear},
    {{"_PrepareForFind", " Set up to find changes ", m_PrepareForFind, 0, 0, {}}, Step::PrepareForFind},
    {{"FindChanges", nullptr, m_FindChanges, 2, 2,
      {{"added_list", ArgCheck::List}, {"removed_list", ArgCheck::List}}},
     Step::FindChanges},
    {{"_FindChangesEntireListAdded", " Find changes when the entire list has been added. ",
      m_FindChangesEntireListAdded, 0, 0, {}},
     Step::FindChangesEntireListAdded},
    {{"_GetLeafScopeWithIndex",
      " Get the leaf scope name with the given index.  Returns None if \n"
      "    stack_index is -1 or logical is malformed ",
      m_GetLeafScopeWithIndex, 2, 2, {kLogical, {"scope_index", ArgCheck::Any}}},
     Step::GetLeafScopeWithIndex},
    {{"_ProcessRemovedLogicals",
      " Find changes from the list of logicals removed and return list of \n"
      "    the indicies of the logical with the first lineno >= lineno removed.\n"
      "    Does not update logical scope names. ",
      m_ProcessRemovedLogicals, 1, 1, {{"removed_list", ArgCheck::List}}},
     Step::ProcessRemovedLogicals},
    {{"_ProcessAddedLogicals",
      " Process all added logicals.  The indicies_to_check arg is a list of \n"
      "    logicals that should be scanned for scope changes.  Note: not used\n"
      "    when whole file changes ",
      m_ProcessAddedLogicals, 2, 2,
      {{"added_list", ArgCheck::List}, {"indicies_to_check", ArgCheck::List}}},
     Step::ProcessAddedLogicals},
    {{"_ProcessDedentedComments",
      " Process the added commment.  Returns index of next non-comment\n    logical ",
      m_ProcessDedentedComments, 1, 1, {{"first_comment_i", ArgCheck::Any}}},
     Step::ProcessDedentedComments},
    {{"_LogicalInScopeChanged",
      " Record that the logical has changed.  The added argument indicates\n"
      "    whether its been added to the list; if it hasn't been added, it has been\n"
      "    removed ",
      m_LogicalInScopeChanged, 2, 4,
      {kLogical, {"scope_name", ArgCheck::Any}, {"old_containing_scope", ArgCheck::Any},
       {"old_leaf_scope", ArgCheck::Any}}},
     Step::LogicalInScopeChanged},
    {{"_SetLogicalScopeNames", kSetNamesDoc, m_SetLogicalScopeNames, 3, 3,
      {kLogical, kIndex, {"scope_name_pair", ArgCheck::Any}}},
     Step::SetLogicalScopeNames},
    {{"_UpdateLogicalScopeName", kSetNamesDoc, m_UpdateLogicalScopeName, 3, 3,
      {kLogical, kIndex, {"scope_name", ArgCheck::Str}}},
     Step::UpdateLogicalScopeName},
    {{"_UpdateContainingScope", kSetNamesDoc, m_UpdateContainingScope, 3, 3,
      {kLogical, kIndex, {"scope_name", ArgCheck::Str}}},
     Step::UpdateContainingScope},
    {{"_PropagateScopeIndexChangeForward",
      " Propagate change from old scope to new scope.  Only changes logicals\n"
      "    whose containing scope starts with old scope ",
      m_PropagateScopeIndexChangeForward, 4, 4,
      {{"old_scope_name", ArgCheck::Any}, {"new_scope_name", ArgCheck::Any},
       {"start_i", ArgCheck::Any}, {"end_i", ArgCheck::Any}}},
     Step::PropagateScopeIndexChangeForward},
    {{"_FindScopeIndexForLogical", " Find the scope index for the given logical ",
      m_FindScopeIndexForLogical, 2, 2, {kLogical, kIndex}},
     Step::FindScopeIndexForLogical},
    {{"_FindScopeNameContainingLogical",
      " Get the name of the scope given logical is in. Succeeds if all prior\n"
      "    non whitespace have scope name set.  Returns None if the scope name\n"
      "    can't be found ",
      m_FindScopeNameContainingLogical, 1, 1, {kIndex}},
     Step::FindScopeNameContainingLogical},
};

}  // namespace

PyTypeObject* changeFinderType() noexcept { return &FinderType; }

void readyChangeFinderType() {
    FinderType.tp_name = "pysource.scopebodycache.CChangeFinder";
    Slots::fillType(FinderType);
    FinderType.tp_doc = kClassDoc;
    FinderType.tp_init = finder_init;
    FinderType.tp_getset = finder_getset;
    py::checkStatus(PyType_Ready(&FinderType));
}

void bindChangeFinderMethods() {
    PyObject* dict = FinderType.tp_dict;
    for (const MethodEntry& m : kMethods) {
        py::Ref f = newMethod(m.spec, &FinderType, "pysource.scopebodycache");
        py::checkStatus(PyDict_SetItemString(dict, m.spec.name, f.get()));
        if (m.step != Step::Count) registerStep(m.step, m.spec.name, f.get());
    }
    PyType_Modified(&FinderType);
}

// --- Field stores -----------------------------------------------------------

void setLogicalList(PyObject* self, PyObject* value) {
    if (value != Py_None && !PyList_CheckExact(value)) raiseExpectedType("list", value);
    py::storeSlot(&finderState(self).logicalList, value);
}

void setChangeSet(PyObject** field, PyObject* value) {
    if (value != Py_None && Py_TYPE(value) != &PySet_Type) raiseExpectedType("set", value);
    py::storeSlot(field, value);
}

void setScopesSeen(PyObject* self, PyObject* value) {
    if (value != Py_None && !PyDict_CheckExact(value)) raiseExpectedType("dict", value);
    py::storeSlot(&finderState(self).scopesSeen, value);
}

// --- Routed steps -----------------------------------------------------------

namespace route {

void Clear(PyObject* self) {
    dispatch(self, Step::Clear, [&] {
        finder::Clear(self);
        return py::Ref();
    });
}

void PrepareForFind(PyObject* self) {
    dispatch(self, Step::PrepareForFind, [&] {
        finder::PrepareForFind(self);
        return py::Ref();
    });
}

void FindChangesEntireListAdded(PyObject* self) {
    dispatch(self, Step::FindChangesEntireListAdded, [&] {
        finder::FindChangesEntireListAdded(self);
        return py::Ref();
    });
}

py::Ref GetLeafScopeWithIndex(PyObject* self, PyObject* logical, Py_ssize_t scopeIndex) {
    return dispatch(
        self, Step::GetLeafScopeWithIndex,
        [&] { return finder::GetLeafScopeWithIndex(self, logical, scopeIndex); }, logical, scopeIndex);
}

py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList) {
    return dispatch(
        self, Step::ProcessRemovedLogicals,
        [&] { return finder::ProcessRemovedLogicals(self, removedList); }, removedList);
}

void ProcessAddedLogicals(PyObject* self, PyObject* addedList, PyObject* indices) {
    dispatch(
        self, Step::ProcessAddedLogicals,
        [&] {
            finder::ProcessAddedLogicals(self, addedList, indices);
            return py::Ref();
        },
        addedList, indices);
}

Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) noexcept {
    return neverRaises(
        "pysource.scopebodycache.CChangeFinder._ProcessDedentedComments", Py_ssize_t(0), [&]() -> Py_ssize_t {
            if (py::Ref override = findOverride(self, Step::ProcessDedentedComments)) {
                return py::asIndex(callOverride(override, first).get());
            }
            return finder::ProcessDedentedCommentsBody(self, first);
        });
}

void LogicalInScopeChanged(PyObject* self, PyObject* logical, PyObject* scopeName,
                           PyObject* oldContainingScope, PyObject* oldLeafScope) {
    dispatch(
        self, Step::LogicalInScopeChanged,
        [&] {
            finder::LogicalInScopeChanged(self, logical, scopeName, oldContainingScope, oldLeafScope);
            return py::Ref();
        },
        logical, scopeName, oldContainingScope, oldLeafScope);
}

void SetLogicalScopeNames(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName,
                          PyObject* localName) {
    if (py::Ref override = findOverride(self, Step::SetLogicalScopeNames)) {
        py::Ref pair = py::check(PyTuple_Pack(2, scopeName, localName));
        callOverride(override, logical, i, pair.get());
        return;
    }
    finder::SetLogicalScopeNames(self, logical, i, scopeName, localName);
}

void UpdateLogicalScopeName(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName) {
    dispatch(
        self, Step::UpdateLogicalScopeName,
        [&] { return finder::UpdateLogicalScopeName(self, logical, i, scopeName); }, logical, i,
        scopeName);
}

void UpdateContainingScope(PyObject* self, PyObject* logical, Py_ssize_t i, PyObject* scopeName) {
    dispatch(
        self, Step::UpdateContainingScope,
        [&] {
            finder::UpdateContainingScope(self, logical, i, scopeName);
            return py::Ref();
        },
        logical, i, scopeName);
}

void PropagateScopeIndexChangeForward(PyObject* self, PyObject* oldScopeName, PyObject* newScopeName,
                                      Py_ssize_t start, Py_ssize_t end) {
    dispatch(
        self, Step::PropagateScopeIndexChangeForward,
        [&] {
            finder::PropagateScopeIndexChangeForward(self, oldScopeName, newScopeName, start, end);
            return py::Ref();
        },
        oldScopeName, newScopeName, start, end);
}

Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logical, Py_ssize_t i) noexcept {
    return neverRaises(
        "pysource.scopebodycache.CChangeFinder._FindScopeIndexForLogical", Py_ssize_t(0), [&]() -> Py_ssize_t {
            if (py::Ref override = findOverride(self, Step::FindScopeIndexForLogical)) {
                return py::asIndex(callOverride(override, logical, i).get());
            }
            return finder::FindScopeIndexForLogicalBody(self, logical, i);
        });
}

py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i) {
    return dispatch(
        self, Step::FindScopeNameContainingLogical,
        [&] { return finder::FindScopeNameContainingLogical(self, i); }, i);
}

}  // namespace route
}  // namespace sbc
