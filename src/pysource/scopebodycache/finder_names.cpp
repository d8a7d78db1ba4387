// Naming one logical at a time: its containing scope from the logicals
// before it, the local name of a class/def for a scope index, and the
// stores that record what changed.
#include "pysource/scopebodycache/def_index.hpp"
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/fullname.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <string_view>

namespace sbc {

using namespace contracts;

namespace finder {

namespace {

// Whether `name` is the full name of the class/def `def` (its scope joined
// with its local name, as GetFullNameForScopeDef makes it): false when any
// of them is not a str.
bool isFullNameOf(PyObject* name, const Logical* def) noexcept {
    PyObject* scope = def->fScopeName;
    PyObject* local = localScopeDefined(def);
    std::string_view n, s, l;
    if (!compat::isStrExact(name) || !compat::isStrExact(scope) || !compat::isStrExact(local) ||
        !compat::tryStrView(name, &n) || !compat::tryStrView(scope, &s) || !compat::tryStrView(local, &l)) {
        return false;
    }
    if (s.empty()) return n == l;
    return n.size() == s.size() + 1 + l.size() && n.compare(0, s.size(), s) == 0 && n[s.size()] == '.' &&
           n.compare(s.size() + 1, l.size(), l) == 0;
}

}  // namespace

py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i) {
    return findScopeNameContaining(self, i, nullptr);
}

py::Ref findScopeNameContaining(PyObject* self, Py_ssize_t i, PyObject* likely) {
    FinderState& s = finderState(self);
    assertThat(i < s.nextChangeIndex);
    LogicalRef logical = logicalAt(self, i);
    const int indent = logical->fIndent;
    if (i == 0) return py::Ref::own(gNames.empty);
    const bool whitespace = isWhitespace(logical.record());
    if (indent == 0 && !whitespace) return py::Ref::own(gNames.empty);

    // No Python code runs during the walk, so borrowed items are safe.
    PyObject* list = s.logicalList;
    Logical* anchor = nullptr;
    for (Py_ssize_t j = i - 1; j >= 0; --j) {
        Logical* prior = requireLogical(PyList_GET_ITEM(list, j));
        if (isWhitespace(prior)) continue;
        if (prior->fScopeName == nullptr || prior->fScopeName == Py_None) return py::Ref::none();
        if (prior->fIndent <= indent || whitespace) {
            anchor = prior;
            break;
        }
    }
    if (anchor == nullptr) return py::Ref::own(gNames.empty);
    // A class/def line without a name opens no scope: its body stays in
    // the enclosing scope, as the whole-list pass has it.
    if (indent > anchor->fIndent && isScopeStart(anchor) && localScopeDefined(anchor) != nullptr) {
        if (likely != nullptr && nativePass(self) && isFullNameOf(likely, anchor)) return py::Ref::own(likely);
        return callGetFullNameForScopeDef(reinterpret_cast<PyObject*>(anchor), nativePass(self));
    }
    return py::Ref::own(anchor->fScopeName);
}

py::Ref GetLeafScopeWithIndex(PyObject* self, PyObject* logicalObj, Py_ssize_t scopeIndex) {
    if (scopeIndex < 0) return py::Ref::none();
    Logical* logical = requireLogical(logicalObj);
    py::Ref name = py::Ref::own(localScopeDefined(logical));
    if (!name) return py::Ref::none();
    py::Ref index = py::check(compat::intFromSsize(scopeIndex));
    if (nativePass(self)) {
        DefinedName defined;
        readDefinedName(logicalObj, &defined);
        if (defined.index == -1) return appendScopeSuffixes(name.get(), index.get());
        if (defined.index == scopeIndex) return name;
        return appendScopeSuffixes(bareNameOf(logicalObj, defined).get(), index.get());
    }
    if (leafScopeNameHasIndex(name.get())) {
        py::Ref split = splitScopeNameFromSuffixes(name.get());
        py::Ref bare, oldIndex;
        unpackPair(split.get(), &bare, &oldIndex, true);
        if (py::checkStatus(PyObject_RichCompareBool(oldIndex.get(), index.get(), Py_EQ))) {
            return name;
        }
        return appendScopeSuffixes(bare.get(), index.get());
    }
    return appendScopeSuffixes(name.get(), index.get());
}

py::Ref UpdateLogicalScopeName(PyObject* self, PyObject* logicalObj, Py_ssize_t i, PyObject* scopeName) {
    assertThat(scopeName != Py_None);
    assertListItemIs(self, i, logicalObj);
    LogicalRef logical = LogicalRef::own(logicalObj);
    requireStrOrNone(scopeName);
    setScopeName(logical.record(), scopeName);
    if (isScopeStart(logical.record()) && localScopeDefined(logical.record()) != nullptr) {
        const Py_ssize_t index = route::FindScopeIndexForLogical(self, logicalObj, i);
        if (index == -1) {
            setScopeName(logical.record(), Py_None);
            return py::Ref::none();
        }
        py::Ref oldLocal = py::Ref::own(localScopeDefined(logical.record()));
        py::Ref newLocal = route::GetLeafScopeWithIndex(self, logicalObj, index);
        const bool differs = py::checkStatus(PyObject_RichCompareBool(
                                 newLocal.get(), oldLocal ? oldLocal.get() : Py_None, Py_NE)) != 0;
        if (differs) setLocalScopeDefined(logical.record(), newLocal.get());
        // Filed before the nested scan, which counts the definitions of
        // this key after it.
        fileDefinition(self, logicalObj, i);
        // i comes from the caller (from Python, optimised, it is not checked).
        if (differs && i < PY_SSIZE_T_MAX) ScanForwardForChangedScopes(self, i + 1, logical->fIndent);
    }
    return py::Ref::own(scopeName);
}

bool SetLogicalScopeNames(PyObject* self, PyObject* logicalObj, Py_ssize_t i, PyObject* scopeName,
                          PyObject* localName) {
    py::Ref scope = py::Ref::own(scopeName);
    py::Ref local = py::Ref::own(localName);
    assertThat(!scope.isNone());
    assertListItemIs(self, i, logicalObj);
    LogicalRef held = LogicalRef::own(logicalObj);
    Logical* logical = held.record();

    bool changed = false;
    PyObject* old = contracts::scopeName(logical);
    requireStrOrNone(old);
    if (old == Py_None || !strEquals(old, scope.get())) {
        requireStrOrNone(scope.get());
        setScopeName(logical, scope.get());
        changed = true;
    }
    if (isScopeStart(logical)) {
        PyObject* oldLocal = localScopeDefined(logical);
        if (oldLocal != nullptr) requireStrOrNone(oldLocal);
        if (oldLocal == nullptr || !strEquals(oldLocal, local.get())) {
            setLocalScopeDefined(logical, local.get());
            route::LogicalInScopeChanged(self, logicalObj, scope.get());
            return true;
        }
    }
    return changed;
}

void UpdateContainingScope(PyObject* self, PyObject* logicalObj, Py_ssize_t i, PyObject* scopeName) {
    FinderState& s = finderState(self);
    assertThat(scopeName != Py_None);
    assertListItemIs(self, i, logicalObj);
    assertThat(i > s.lastProcessedIndex);
    LogicalRef logical = LogicalRef::own(logicalObj);
    py::Ref old = py::Ref::own(contracts::scopeName(logical.record()));
    requireStrOrNone(old.get());
    if (old.isNone() || !strEquals(old.get(), scopeName)) {
        requireStrOrNone(scopeName);
        setScopeName(logical.record(), scopeName);
        route::LogicalInScopeChanged(self, logicalObj, scopeName, old.get());
    }
}

}  // namespace finder
}  // namespace sbc
