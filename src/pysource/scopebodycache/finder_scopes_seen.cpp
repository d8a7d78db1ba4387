// Scope indices: repeated definitions of one name in one scope are numbered
// 0, 1, 2 in list order. The scopes-seen table counts definitions over a
// growing prefix of the list and repairs the ones an edit has shifted.
#include "pysource/scopebodycache/def_index.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <cstring>

namespace sbc {

using namespace contracts;

// Whether `name` is the scope `prefix` or a scope nested in it: the prefix
// must end at a separator, so that renaming f#1 leaves f#10 alone.
bool inScope(PyObject* name, PyObject* prefix) {
    if (compat::isStrExact(name) && compat::isStrExact(prefix)) {
        const std::string_view whole = compat::strView(name);
        const std::string_view head = compat::strView(prefix);
        const size_t n = head.size();
        return whole.size() >= n && std::memcmp(whole.data(), head.data(), n) == 0 &&
               (whole.size() == n || whole[n] == '.');
    }
    py::Ref r = py::check(PyObject_CallMethodObjArgs(name, gNames.startswith, prefix, nullptr));
    if (!py::truth(r.get())) return false;
    const Py_ssize_t n = py::checkSize(PyObject_Size(prefix));
    if (py::checkSize(PyObject_Size(name)) == n) return true;
    py::Ref next = py::check(PySequence_GetItem(name, n));
    return py::checkStatus(PyObject_RichCompareBool(next.get(), gNames.dot, Py_EQ)) != 0;
}

namespace {

// `name` without its index suffix.
py::Ref bareName(PyObject* name) {
    py::Ref split = splitScopeNameFromSuffixes(name);
    return py::check(PySequence_GetItem(split.get(), 0));
}

PyObject* requireTable(PyObject* self) {
    FinderState& s = finderState(self);
    // The native pass makes the table only when the index cannot serve.
    if (s.scopesSeen == Py_None && s.native != nullptr) {
        py::storeSlot(&s.scopesSeen, py::check(PyDict_New()).get());
        s.endIndexForScopesSeen = 0;
    }
    if (s.scopesSeen == Py_None) msg::raise(PyExc_TypeError, msg::kNoneArgumentNotIterable);
    return s.scopesSeen;
}

// new_prefix + name[len(old_prefix):], where name starts with old_prefix
// (inScope). Strs are joined from their bytes: 3.x would make a slice
// object per name, a third of the cost of renaming a body.
py::Ref replacePrefix(PyObject* name, PyObject* oldPrefix, PyObject* newPrefix) {
    if (compat::isStrExact(name) && compat::isStrExact(oldPrefix) && compat::isStrExact(newPrefix)) {
        const std::string_view whole = compat::strView(name);
        const std::string_view head = compat::strView(oldPrefix);
        if (whole.size() == head.size()) return py::Ref::own(newPrefix);  // as `+ ""` gives it
        const std::string_view parts[] = {compat::strView(newPrefix), whole.substr(head.size())};
        return py::check(compat::strConcat(parts));
    }
    const Py_ssize_t cut = py::checkSize(PyObject_Size(oldPrefix));
    py::Ref rest = py::check(PySequence_GetSlice(name, cut, PY_SSIZE_T_MAX));
    return py::check(PyNumber_Add(newPrefix, rest.get()));
}

}  // namespace

namespace finder {

namespace {

// A definition at j whose stored index is not its count: it gets the
// counted index, and the scopes nested in it are renamed with it. Shared by
// the table walk and the definition index. hadIndex: 1 when the stored
// name carried an index, 0 when not, -1 when it carried one too large to
// read.
void repairDefinition(PyObject* self, const LogicalRef& item, Py_ssize_t j, PyObject* scope,
                      PyObject* local, PyObject* bare, int hadIndex, Py_ssize_t counted) {
    FinderState& s = finderState(self);
    py::Ref newIndex = py::check(compat::intFromSsize(counted));
    py::Ref newLocal = appendScopeSuffixes(bare, newIndex.get());
    route::SetLogicalScopeNames(self, item.get(), j, scope, newLocal.get());
    route::LogicalInScopeChanged(self, item.get(), scope);
    if (hadIndex < 0) {
        PyErr_SetString(PyExc_OverflowError, "Python int too large to convert to C long");
        py::fail();
    }
    assertThat(hadIndex != 0);
    if (hadIndex == 0) return;
    py::Ref oldFull = joinTwoScopeNames(scope, local);
    addChange(item->fKind == kClassLogical ? s.classChanges : s.functionChanges, oldFull.get());
    py::Ref newFull = joinTwoScopeNames(scope, newLocal.get());
    // The renamed body may reach past the end asked for: rename all of it
    // now, or the lines beyond keep the old index (nothing comes back to
    // this definition in this call).
    route::PropagateScopeIndexChangeForward(self, oldFull.get(), newFull.get(), j + 1,
                                            logicalListLength(self));
}

// The definition index's form of extending the table to `end`: the queued
// definitions below it, in list order, are checked and repaired.
void repairQueuedBefore(PyObject* self, Py_ssize_t end) {
    DefIndex::Candidate candidate;
    // A repair may drop the index (a name it cannot file): fetched afresh.
    while (DefIndex* index = definitionIndex(self)) {
        if (!index->popCandidate(end, &candidate)) return;
        const Py_ssize_t position = index->positionOf(candidate.def.get(), candidate.at);
        if (position < 0) continue;  // no longer filed
        DefinedName name;
        readDefinedName(candidate.def.get(), &name);
        if (name.index == position) continue;
        LogicalRef item = LogicalRef::own(candidate.def.get());
        py::Ref scope = py::Ref::own(scopeName(item.record()));
        py::Ref local = py::Ref::own(name.name);
        py::Ref bare = bareNameOf(item.get(), name);
        const int hadIndex = name.index == kSuffixTooLarge ? -1 : name.index != -1;
        repairDefinition(self, item, candidate.at, scope.get(), local.get(), bare.get(), hadIndex, position);
    }
}

// Counting one definition into the index, as the whole-list pass does; the
// definition's place is `at`. -1 when the index cannot take it.
Py_ssize_t countIntoIndex(DefIndex* index, PyObject* logical, Py_ssize_t at, PyObject* scopeName,
                          const DefinedName* known) {
    DefinedName name;
    if (known != nullptr) {
        name = *known;
    } else if (!readDefinedName(logical, &name)) {
        return 0;
    }
    if (!compat::isStrExact(scopeName) || !compat::isStrExact(name.name)) return -1;
    return index->append(logical, at, scopeName, name);
}

}  // namespace

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
    py::Ref value = py::check(compat::intFromSsize(index));
    py::checkStatus(PyDict_SetItem(requireTable(self), key.get(), value.get()));
    return index;
}

Py_ssize_t CountDefinition(PyObject* self, PyObject* logical, Py_ssize_t at, PyObject* scopeName,
                           const DefinedName* name) {
    if (DefIndex* index = definitionIndex(self)) {
        const Py_ssize_t counted = neverRaises(
            unraisableContext(Step::UpdateScopesSeenWithStartScopeLogical), Py_ssize_t(0),
            [&] { return countIntoIndex(index, logical, at, scopeName, name); });
        if (counted >= 0) return counted;
        dropDefinitionIndex(self);
    }
    return route::UpdateScopesSeenWithStartScopeLogical(self, logical, scopeName, false);
}

Py_ssize_t FindScopeIndexForLogical(PyObject* self, PyObject* logicalObj, Py_ssize_t i) {
    FinderState& s = finderState(self);
    if (definitionIndex(self) != nullptr) {
        repairQueuedBefore(self, i);
        LogicalRef logical = LogicalRef::own(logicalObj);
        DefinedName name;
        if (!readDefinedName(logical.get(), &name)) return 0;
        if (DefIndex* index = definitionIndex(self)) {
            const Py_ssize_t count = index->countBefore(scopeName(logical.record()), name, i);
            if (count >= 0) return count;
            dropDefinitionIndex(self);
        }
    }
    assertThat(i >= s.endIndexForScopesSeen);
    // The table may already reach i: the visiting loop brings it up to an
    // index before naming the logical there.
    if (i > s.endIndexForScopesSeen) UpdateScopesSeen(self, i);
    assertThat(i == s.endIndexForScopesSeen);
    LogicalRef logical = LogicalRef::own(logicalObj);
    py::Ref name = py::Ref::own(localScopeDefined(logical.record()));
    if (!name) return 0;
    if (leafScopeNameHasIndex(name.get(), nativePass(self))) name = bareName(name.get());
    py::Ref key = joinTwoScopeNames(scopeName(logical.record()), name.get());
    PyObject* seen = PyDict_GetItem(requireTable(self), key.get());
    return seen ? py::asIndex(seen) + 1 : 0;
}

void UpdateScopesSeen(PyObject* self, Py_ssize_t end) {
    FinderState& s = finderState(self);
    if (end == 0) return;
    const Py_ssize_t n = logicalListLength(self);
    if (end > n) end = n;
    if (definitionIndex(self) != nullptr) {
        repairQueuedBefore(self, end);
        if (definitionIndex(self) != nullptr) return;
    }
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
        if (leafScopeNameHasIndex(local.get(), nativePass(self))) {
            py::Ref split = splitScopeNameFromSuffixes(local.get());
            unpackPair(split.get(), &bare, &oldIndex, true);
        } else {
            bare = local.copy();
            oldIndex = py::check(compat::intFromLong(-1));
        }
        const Py_ssize_t counted =
            route::UpdateScopesSeenWithStartScopeLogical(self, item.get(), scope.get(), false);
        py::Ref newIndex = py::check(compat::intFromSsize(counted));
        if (py::checkStatus(PyObject_RichCompareBool(newIndex.get(), oldIndex.get(), Py_EQ))) continue;
        const long old = compat::intAsLong(oldIndex.get());
        const int hadIndex = old == -1 && PyErr_Occurred() ? (PyErr_Clear(), -1) : old != -1;
        repairDefinition(self, item, j, scope.get(), local.get(), bare.get(), hadIndex, counted);
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
        if (leaf != nullptr) fileDefinition(self, item.get(), j);
        route::LogicalInScopeChanged(self, item.get(), renamed.get(), name.get(), oldLeaf.get());
    }
}

}  // namespace finder
}  // namespace sbc
