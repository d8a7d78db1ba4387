// Naming one logical at a time: its containing scope from the logicals
// before it, the local name of a class/def for a scope index, and the
// stores that record what changed.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/fullname.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/siblings.hpp"

namespace sbc {

using namespace contracts;

// The first two items of a split scope name (bare name, index).
void unpackTwo(PyObject* seq, py::Ref* first, py::Ref* second) {
    py::Ref fast = py::check(PySequence_Fast(seq, "'NoneType' object is not subscriptable"));
    const Py_ssize_t n = PySequence_Fast_GET_SIZE(fast.get());
    if (n < 2) {
        PyErr_Format(PyExc_ValueError, msg::kNeedMoreValues, n, n == 1 ? "" : "s");
        py::fail();
    }
    *first = py::Ref::own(PySequence_Fast_GET_ITEM(fast.get(), 0));
    *second = py::Ref::own(PySequence_Fast_GET_ITEM(fast.get(), 1));
}

namespace {

// Debug-only check that list[i] is that very logical (evaluated only when
// assertions are on, like the assert statement it stands for).
void assertAt(PyObject* self, Py_ssize_t i, PyObject* logical) {
    if (!assertionsOn()) return;
    py::Ref at = logicalAt(self, i);
    assertThat(at.get() == logical);
}

}  // namespace

namespace finder {

py::Ref FindScopeNameContainingLogical(PyObject* self, Py_ssize_t i) {
    FinderState& s = finderState(self);
    assertThat(i < s.nextChangeIndex);
    py::Ref item = logicalAt(self, i);
    Logical* logical = requireLogical(item.get());
    const int indent = logical->fIndent;
    if (i == 0) return py::Ref::own(gNames.empty);
    const bool whitespace = isWhitespace(logical);
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
        return callGetFullNameForScopeDef(reinterpret_cast<PyObject*>(anchor));
    }
    return py::Ref::own(anchor->fScopeName);
}

py::Ref GetLeafScopeWithIndex(PyObject*, PyObject* logicalObj, Py_ssize_t scopeIndex) {
    if (scopeIndex < 0) return py::Ref::none();
    Logical* logical = requireLogical(logicalObj);
    py::Ref name = py::Ref::own(localScopeDefined(logical));
    if (!name) return py::Ref::none();
    py::Ref index = py::check(PyInt_FromSsize_t(scopeIndex));
    if (leafScopeNameHasIndex(name.get())) {
        py::Ref split = splitScopeNameFromSuffixes(name.get());
        py::Ref bare, oldIndex;
        unpackTwo(split.get(), &bare, &oldIndex);
        if (py::checkStatus(PyObject_RichCompareBool(oldIndex.get(), index.get(), Py_EQ))) {
            return name;
        }
        return appendScopeSuffixes(bare.get(), index.get());
    }
    return appendScopeSuffixes(name.get(), index.get());
}

py::Ref UpdateLogicalScopeName(PyObject* self, PyObject* logicalObj, Py_ssize_t i, PyObject* scopeName) {
    assertThat(scopeName != Py_None);
    assertAt(self, i, logicalObj);
    Logical* logical = requireLogical(logicalObj);
    py::Ref keep = py::Ref::own(logicalObj);
    requireStrOrNone(scopeName);
    setScopeName(logical, scopeName);
    if (isScopeStart(logical) && localScopeDefined(logical) != nullptr) {
        const Py_ssize_t index = route::FindScopeIndexForLogical(self, logicalObj, i);
        if (index == -1) {
            setScopeName(logical, Py_None);
            return py::Ref::none();
        }
        py::Ref oldLocal = py::Ref::own(localScopeDefined(logical));
        py::Ref newLocal = route::GetLeafScopeWithIndex(self, logicalObj, index);
        const bool differs = py::checkStatus(PyObject_RichCompareBool(
                                 newLocal.get(), oldLocal ? oldLocal.get() : Py_None, Py_NE)) != 0;
        if (differs) {
            setLocalScopeDefined(logical, newLocal.get());
            ScanForwardForChangedScopes(self, i + 1, logical->fIndent);
        }
    }
    return py::Ref::own(scopeName);
}

namespace {

[[noreturn]] void raiseUnpackCount(Py_ssize_t found) {
    if (found < 2) {
        PyErr_Format(PyExc_ValueError, msg::kNeedMoreValues, found, found == 1 ? "" : "s");
    } else {
        PyErr_Format(PyExc_ValueError, msg::kTooManyValues, Py_ssize_t(2));
    }
    py::fail();
}

}  // namespace

// Tuples and lists directly, anything else by iteration.
void unpackPair(PyObject* pair, py::Ref* first, py::Ref* second) {
    if (PyTuple_CheckExact(pair) || PyList_CheckExact(pair)) {
        const Py_ssize_t n = PySequence_Fast_GET_SIZE(pair);
        if (n != 2) raiseUnpackCount(n);
        *first = py::Ref::own(PySequence_Fast_GET_ITEM(pair, 0));
        *second = py::Ref::own(PySequence_Fast_GET_ITEM(pair, 1));
        return;
    }
    py::Ref iter = py::check(PyObject_GetIter(pair));
    py::Ref items[3];
    Py_ssize_t n = 0;
    for (; n < 3; ++n) {
        items[n] = py::Ref::steal(PyIter_Next(iter.get()));
        if (!items[n]) break;
    }
    if (PyErr_Occurred()) py::fail();
    if (n != 2) raiseUnpackCount(n);
    *first = std::move(items[0]);
    *second = std::move(items[1]);
}

bool SetLogicalScopeNames(PyObject* self, PyObject* logicalObj, Py_ssize_t i, PyObject* scopeName,
                          PyObject* localName) {
    py::Ref scope = py::Ref::own(scopeName);
    py::Ref local = py::Ref::own(localName);
    assertThat(!scope.isNone());
    assertAt(self, i, logicalObj);
    Logical* logical = requireLogical(logicalObj);
    py::Ref keep = py::Ref::own(logicalObj);

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
    assertAt(self, i, logicalObj);
    assertThat(i > s.lastProcessedIndex);
    Logical* logical = requireLogical(logicalObj);
    py::Ref keep = py::Ref::own(logicalObj);
    py::Ref old = py::Ref::own(contracts::scopeName(logical));
    requireStrOrNone(old.get());
    if (old.isNone() || !strEquals(old.get(), scopeName)) {
        requireStrOrNone(scopeName);
        setScopeName(logical, scopeName);
        route::LogicalInScopeChanged(self, logicalObj, scopeName, old.get());
    }
}

}  // namespace finder
}  // namespace sbc
