// Scope indices: repeated definitions of one name in one scope are numbered
// 0, 1, 2 in list order. The scopes-seen table counts definitions over a
// growing prefix of the list and repairs the ones an edit has shifted.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <cstring>

namespace sbc {

using namespace contracts;

namespace {

// `name` without its index suffix.
py::Ref bareName(PyObject* name) {
    py::Ref split = splitScopeNameFromSuffixes(name);
    return py::check(PySequence_GetItem(split.get(), 0));
}

PyObject* requireTable(PyObject* self) {
    PyObject* table = finderState(self).scopesSeen;
    if (table == Py_None) msg::raise(PyExc_TypeError, msg::kNoneArgumentNotIterable);
    return table;
}

// Whether `name` is the scope `prefix` or a scope nested in it: the prefix
// must end at a separator, so that renaming f#1 leaves f#10 alone.
bool inScope(PyObject* name, PyObject* prefix) {
    if (PyString_CheckExact(name) && PyString_CheckExact(prefix)) {
        const Py_ssize_t n = PyString_GET_SIZE(prefix);
        const Py_ssize_t size = PyString_GET_SIZE(name);
        return size >= n && std::memcmp(PyString_AS_STRING(name), PyString_AS_STRING(prefix), n) == 0 &&
               (size == n || PyString_AS_STRING(name)[n] == '.');
    }
    py::Ref r = py::check(PyObject_CallMethodObjArgs(name, gNames.startswith, prefix, nullptr));
    if (!py::truth(r.get())) return false;
    const Py_ssize_t n = py::checkSize(PyObject_Size(prefix));
    if (py::checkSize(PyObject_Size(name)) == n) return true;
    py::Ref next = py::check(PySequence_GetItem(name, n));
    return py::checkStatus(PyObject_RichCompareBool(next.get(), gNames.dot, Py_EQ)) != 0;
}

// new_prefix + name[len(old_prefix):]
py::Ref replacePrefix(PyObject* name, PyObject* oldPrefix, PyObject* newPrefix) {
    const Py_ssize_t cut = py::checkSize(PyObject_Size(oldPrefix));
    py::Ref rest = py::check(PySequence_GetSlice(name, cut, PY_SSIZE_T_MAX));
    return py::check(PyNumber_Add(newPrefix, rest.get()));
}

}  // namespace

namespace finder {

Py_ssize_t UpdateScopesSeenWithStartScopeLogical(PyObject* self, PyObject* logicalObj,
                                                 PyObject* scopeName, bool nameIsBare) {
    py::Ref name = py::Ref::own(localScopeDefined(requireLogical(logicalObj)));
    // A class/def line without a name defines nothing to count.
    if (!name) return 0;
    if (!nameIsBare) name = bareName(name.get());
    py::Ref key = joinTwoScopeNames(scopeName, name.get());
    PyObject* table = requireTable(self);
    PyObject* seen = PyDict_GetItem(table, key.get());
    const Py_ssize_t index = seen ? py::asIndex(seen) + 1 : 0;
    py::Ref value = py::check(PyInt_FromSsize_t(index));
    py::checkStatus(PyDict_SetItem(requireTable(self), key.get(), value.get()));
    return index;
}

Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logicalObj, Py_ssize_t i) {
    FinderState& s = finderState(self);
    assertThat(i >= s.endIndexForScopesSeen);
    // The table may already reach i: the visiting loop brings it up to an
    // index before naming the logical there.
    if (i > s.endIndexForScopesSeen) UpdateScopesSeen(self, i);
    assertThat(i == s.endIndexForScopesSeen);
    LogicalRef logical = LogicalRef::own(logicalObj);
    py::Ref name = py::Ref::own(localScopeDefined(logical.record()));
    if (!name) return 0;
    if (leafScopeNameHasIndex(name.get())) name = bareName(name.get());
    py::Ref key = joinTwoScopeNames(scopeName(logical.record()), name.get());
    PyObject* seen = PyDict_GetItem(requireTable(self), key.get());
    return seen ? py::asIndex(seen) + 1 : 0;
}

void UpdateScopesSeen(PyObject* self, Py_ssize_t end) {
    FinderState& s = finderState(self);
    if (end == 0) return;
    const Py_ssize_t n = logicalListLength(self);
    if (end > n) end = n;
    if (end <= s.endIndexForScopesSeen) {
        assertThat(false);
        return;
    }
    const Py_ssize_t begin = s.endIndexForScopesSeen;
    for (Py_ssize_t j = begin; j < end; ++j) {
        LogicalRef item = logicalAt(self, j);
        if (!isScopeStart(item.record())) continue;
        py::Ref scope = py::Ref::own(scopeName(item.record()));
        py::Ref local = py::Ref::own(localScopeDefined(item.record()));
        if (!local) continue;  // nothing to number
        py::Ref bare, oldIndex;
        if (leafScopeNameHasIndex(local.get())) {
            py::Ref split = splitScopeNameFromSuffixes(local.get());
            unpackPair(split.get(), &bare, &oldIndex, true);
        } else {
            bare = local.copy();
            oldIndex = py::check(PyInt_FromLong(-1));
        }
        const Py_ssize_t counted =
            route::UpdateScopesSeenWithStartScopeLogical(self, item.get(), scope.get(), false);
        py::Ref newIndex = py::check(PyInt_FromSsize_t(counted));
        if (py::checkStatus(PyObject_RichCompareBool(newIndex.get(), oldIndex.get(), Py_EQ))) continue;

        py::Ref newLocal = appendScopeSuffixes(bare.get(), newIndex.get());
        route::SetLogicalScopeNames(self, item.get(), j, scope.get(), newLocal.get());
        route::LogicalInScopeChanged(self, item.get(), scope.get());
        const bool hadIndex = PyInt_AsLong(oldIndex.get()) != -1 || PyErr_Occurred();
        if (PyErr_Occurred()) py::fail();
        assertThat(hadIndex);
        if (!hadIndex) continue;
        py::Ref oldFull = joinTwoScopeNames(scope.get(), local.get());
        addChange(item->fKind == kClassLogical ? s.classChanges : s.functionChanges, oldFull.get());
        py::Ref newFull = joinTwoScopeNames(scope.get(), newLocal.get());
        // The renamed body may reach past `end`: rename all of it now, or
        // the lines beyond keep the old index (nothing walks this
        // definition again in this call).
        route::PropagateScopeIndexChangeForward(self, oldFull.get(), newFull.get(), j + 1,
                                                logicalListLength(self));
    }
    s.endIndexForScopesSeen = end;
}

void PropagateScopeIndexChangeForward(PyObject* self, PyObject* oldScopeName, PyObject* newScopeName,
                                      Py_ssize_t start, Py_ssize_t end) {
    for (Py_ssize_t j = start; j < end; ++j) {
        LogicalRef item = logicalAt(self, j);
        py::Ref name = py::Ref::own(scopeName(item.record()));
        // A logical added in this call and not yet visited has no name; it
        // is named when visited.
        if (name.isNone()) continue;
        if (!inScope(name.get(), oldScopeName)) {
            // Comments after the body may sit in the parent scope while
            // deeper ones after them are still in the body.
            if (isWhitespace(item.record())) continue;
            break;
        }
        py::Ref renamed = replacePrefix(name.get(), oldScopeName, newScopeName);
        requireStrOrNone(renamed.get());
        setScopeName(item.record(), renamed.get());
        // Old names too: the scopes nested here had other full names before.
        PyObject* leaf = isScopeStart(item.record()) ? localScopeDefined(item.record()) : nullptr;
        py::Ref oldLeaf = py::Ref::own(leaf ? leaf : Py_None);
        route::LogicalInScopeChanged(self, item.get(), renamed.get(), name.get(), oldLeaf.get());
    }
}

}  // namespace finder
}  // namespace sbc
