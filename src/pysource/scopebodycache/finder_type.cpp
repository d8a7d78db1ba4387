// CPython glue of CChangeFinder: the type object, its slots and the method
// table. The rules live in finder_*.cpp; step routing in route.hpp.
#include "pysource/scopebodycache/destroyable_subclass.hpp"
#include "pysource/scopebodycache/dispatch.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/function.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"

namespace sbc {

Py_ssize_t gFinderStateOffset = 0;

namespace {

PyTypeObject FinderType = {PyVarObject_HEAD_INIT(nullptr, 0)};
PyTypeObject* gFinderType = &FinderType;  // the class in use (see Slots::ready)

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

using Slots = DestroyableSubclass<FinderState, &gFinderStateOffset>;

int finder_init(PyObject* self, PyObject* args, PyObject* kwargs) {
    return py::guardedStatus([&] {
        setLogicalList(self, initDestroyableSubclass(self, args, kwargs).get());
        dropDefinitionIndex(self);
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
// A step called directly from Python may store any names: the definition
// index cannot follow, and is rebuilt at the next call that needs it; so
// are those of the list's other finders.

PyObject* none() { return py::Ref::none().release(); }

PyObject* m_destroy_impl(PyObject* self, PyObject* const*) {
    stepCalledDirectly(self);
    finder::DestroyImpl(self);
    return none();
}
PyObject* m_Clear(PyObject* self, PyObject* const*) {
    stepCalledDirectly(self);
    finder::Clear(self);
    return none();
}
PyObject* m_PrepareForFind(PyObject* self, PyObject* const*) {
    stepCalledDirectly(self);
    finder::PrepareForFind(self);
    return none();
}
PyObject* m_FindChanges(PyObject* self, PyObject* const* a) {
    return finder::FindChanges(self, a[0], a[1]).release();
}
PyObject* m_FindChangesEntireListAdded(PyObject* self, PyObject* const*) {
    stepCalledDirectly(self);
    finder::FindChangesEntireListAdded(self);
    return none();
}
PyObject* m_GetLeafScopeWithIndex(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    return finder::GetLeafScopeWithIndex(self, a[0], py::asIndex(a[1])).release();
}
PyObject* m_ProcessRemovedLogicals(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    return finder::ProcessRemovedLogicals(self, a[0]).release();
}
PyObject* m_ProcessAddedLogicals(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    finder::ProcessAddedLogicals(self, a[0], a[1]);
    return none();
}
PyObject* m_ProcessDedentedComments(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    const Py_ssize_t first = py::asIndex(a[0]);
    const Py_ssize_t end = route::builtin<Step::ProcessDedentedComments>(finder::ProcessDedentedComments,
                                                                         self, first);
    return py::check(compat::intFromSsize(end)).release();
}
PyObject* m_LogicalInScopeChanged(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    finder::LogicalInScopeChanged(self, a[0], a[1], a[2] ? a[2] : Py_None, a[3] ? a[3] : Py_None);
    return none();
}
PyObject* m_SetLogicalScopeNames(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    py::Ref scope, local;
    unpackPair(a[2], &scope, &local);
    const bool changed =
        finder::SetLogicalScopeNames(self, a[0], py::asIndex(a[1]), scope.get(), local.get());
    return py::Ref::own(changed ? Py_True : Py_False).release();
}
PyObject* m_UpdateLogicalScopeName(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    return finder::UpdateLogicalScopeName(self, a[0], py::asIndex(a[1]), a[2]).release();
}
PyObject* m_UpdateContainingScope(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    finder::UpdateContainingScope(self, a[0], py::asIndex(a[1]), a[2]);
    return none();
}
PyObject* m_PropagateScopeIndexChangeForward(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    const Py_ssize_t start = py::asIndex(a[2]);
    const Py_ssize_t end = py::asIndex(a[3]);
    finder::PropagateScopeIndexChangeForward(self, a[0], a[1], start, end);
    return none();
}
PyObject* m_FindScopeIndexForLogical(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    const Py_ssize_t i = py::asIndex(a[1]);
    const Py_ssize_t index = route::builtin<Step::FindScopeIndexForLogical>(
        finder::FindScopeIndexForLogical, self, a[0], i);
    return py::check(compat::intFromSsize(index)).release();
}
PyObject* m_FindScopeNameContainingLogical(PyObject* self, PyObject* const* a) {
    stepCalledDirectly(self);
    return finder::FindScopeNameContainingLogical(self, py::asIndex(a[0])).release();
}

constexpr Param kLogical{"logical", ArgCheck::Any};
constexpr Param kIndex{"i", ArgCheck::Any};

// In the order of the class dictionary. The method and parameter names
// (misspelt `indicies_to_check` included) are called by name and by keyword
// by callers and by overriding subclasses: they never change.
const FunctionSpec kMethods[] = {
    {"_destroy_impl", nullptr, m_destroy_impl, 0, 0, {}},
    {"_Clear", " Clear everything but _fLogicalList ", m_Clear, 0, 0, {}},
    {"_PrepareForFind", " Set up to find changes ", m_PrepareForFind, 0, 0, {}},
    {"FindChanges", nullptr, m_FindChanges, 2, 2,
     {{"added_list", ArgCheck::List}, {"removed_list", ArgCheck::List}}},
    {"_FindChangesEntireListAdded", " Find changes when the entire list has been added. ",
     m_FindChangesEntireListAdded, 0, 0, {}},
    {"_GetLeafScopeWithIndex",
     " Get the leaf scope name with the given index.  Returns None if \n"
     "    stack_index is -1 or logical is malformed ",
     m_GetLeafScopeWithIndex, 2, 2, {kLogical, {"scope_index", ArgCheck::Any}}},
    {"_ProcessRemovedLogicals",
     " Find changes from the list of logicals removed and return list of \n"
     "    the indicies of the logical with the first lineno >= lineno removed.\n"
     "    Does not update logical scope names. ",
     m_ProcessRemovedLogicals, 1, 1, {{"removed_list", ArgCheck::List}}},
    {"_ProcessAddedLogicals",
     " Process all added logicals.  The indicies_to_check arg is a list of \n"
     "    logicals that should be scanned for scope changes.  Note: not used\n"
     "    when whole file changes ",
     m_ProcessAddedLogicals, 2, 2,
     {{"added_list", ArgCheck::List}, {"indicies_to_check", ArgCheck::List}}},
    {"_ProcessDedentedComments",
     " Process the added commment.  Returns index of next non-comment\n    logical ",
     m_ProcessDedentedComments, 1, 1, {{"first_comment_i", ArgCheck::Any}}},
    {"_LogicalInScopeChanged",
     " Record that the logical has changed.  The added argument indicates\n"
     "    whether its been added to the list; if it hasn't been added, it has been\n"
     "    removed ",
     m_LogicalInScopeChanged, 2, 4,
     {kLogical, {"scope_name", ArgCheck::Any}, {"old_containing_scope", ArgCheck::Any},
      {"old_leaf_scope", ArgCheck::Any}}},
    {"_SetLogicalScopeNames", kSetNamesDoc, m_SetLogicalScopeNames, 3, 3,
     {kLogical, kIndex, {"scope_name_pair", ArgCheck::Any}}},
    {"_UpdateLogicalScopeName", kSetNamesDoc, m_UpdateLogicalScopeName, 3, 3,
     {kLogical, kIndex, {"scope_name", ArgCheck::Str}}},
    {"_UpdateContainingScope", kSetNamesDoc, m_UpdateContainingScope, 3, 3,
     {kLogical, kIndex, {"scope_name", ArgCheck::Str}}},
    {"_PropagateScopeIndexChangeForward",
     " Propagate change from old scope to new scope.  Only changes logicals\n"
     "    whose containing scope starts with old scope ",
     m_PropagateScopeIndexChangeForward, 4, 4,
     {{"old_scope_name", ArgCheck::Any}, {"new_scope_name", ArgCheck::Any},
      {"start_i", ArgCheck::Any}, {"end_i", ArgCheck::Any}}},
    {"_FindScopeIndexForLogical", " Find the scope index for the given logical ",
     m_FindScopeIndexForLogical, 2, 2, {kLogical, kIndex}},
    {"_FindScopeNameContainingLogical",
     " Get the name of the scope given logical is in. Succeeds if all prior\n"
     "    non whitespace have scope name set.  Returns None if the scope name\n"
     "    can't be found ",
     m_FindScopeNameContainingLogical, 1, 1, {kIndex}},
};

}  // namespace

PyTypeObject* changeFinderType() noexcept { return gFinderType; }

void readyChangeFinderType() {
    FinderType.tp_name = "pysource.scopebodycache.CChangeFinder";
    Slots::fillType(FinderType);
    FinderType.tp_doc = kClassDoc;
    FinderType.tp_init = finder_init;
    FinderType.tp_getset = finder_getset;
    gFinderType = Slots::ready(FinderType);
}

void bindChangeFinderMethods() {
    bindMethods(gFinderType, kMethods, kModuleName);
    registerSteps(gFinderType);
}

}  // namespace sbc
