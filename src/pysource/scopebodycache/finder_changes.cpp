// Removed logicals and the recording of changes into the three change sets.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <algorithm>
#include <string_view>

namespace sbc::finder {

using namespace contracts;

py::Ref ProcessRemovedLogicals(PyObject* self, PyObject* removedList) {
    if (removedList == Py_None) msg::raise(PyExc_TypeError, msg::kNoneNotIterable);
    py::Ref result = py::check(PyList_New(0));
    IndexList indices(result.get());
    processRemoved(self, removedList, indices);
    return result;
}

namespace {

// Whether `logical` stands among the logicals of its own line number from
// `index` on.
bool standsAt(PyObject* self, PyObject* logical, Py_ssize_t index) {
    PyObject* list = finderState(self).logicalList;
    const int32_t lineno = asLogical(logical)->fLineno;
    for (Py_ssize_t j = std::max<Py_ssize_t>(index, 0); j < PyList_GET_SIZE(list); ++j) {
        PyObject* item = PyList_GET_ITEM(list, j);
        if (item == logical) return true;
        if (!logicalCheck(item) || asLogical(item)->fLineno != lineno) return false;
    }
    return false;
}

// Whether `name` is the scope the class/def `def` opens or one nested in it.
// Names that are strs are read as full names are made (the scope, a dot,
// the local name), which costs no new name; others are joined and asked.
bool namedInside(PyObject* name, const Logical* def, py::Ref* full) {
    PyObject* scope = def->fScopeName;
    PyObject* local = localScopeDefined(def);
    std::string_view n, sc, l;
    if (compat::isStrExact(name) && compat::isStrExact(scope) && compat::isStrExact(local) &&
        compat::tryStrView(name, &n) && compat::tryStrView(scope, &sc) && compat::tryStrView(local, &l)) {
        size_t at = 0;
        if (!sc.empty()) {
            if (n.size() <= sc.size() || n.compare(0, sc.size(), sc) != 0 || n[sc.size()] != '.') return false;
            at = sc.size() + 1;
        }
        return n.size() >= at + l.size() && n.compare(at, l.size(), l) == 0 &&
               (n.size() == at + l.size() || n[at + l.size()] == '.');
    }
    if (!*full) *full = joinTwoScopeNames(scope, local);
    return inScope(name, full->get());
}

// A removed class/def is mapped to the first logical at or after its line
// number. Lines that belonged to no logical (blank lines after a stray
// closing bracket) taken out in the same change leave its old body numbered
// below that: the body then stands just before the index its own number
// gives, or just before the one the first removed logical of its change
// mapped to (`runStart`). The logicals there still named inside its scope
// stood after it; the first of them is where the visit must start (-1 when
// there is none). Without such lines the logical before the index is never
// named inside it, and one look settles it.
Py_ssize_t oldBodyStart(PyObject* self, const LogicalRef& removed, Py_ssize_t index, Py_ssize_t runStart) {
    if (!isScopeStart(removed.record()) || removed->fScopeName == nullptr ||
        removed->fScopeName == Py_None || localScopeDefined(removed.record()) == nullptr) {
        return -1;
    }
    PyObject* list = finderState(self).logicalList;
    py::Ref full;
    auto inside = [&](Py_ssize_t k) {
        // Read afresh: a name compared through Python may change the list.
        if (k < 0 || k >= PyList_GET_SIZE(list)) return false;
        PyObject* at = PyList_GET_ITEM(list, k);
        if (!logicalCheck(at) || scopeName(asLogical(at)) == Py_None) return false;
        // Held only where the comparison may run Python code.
        if (compat::isStrExact(scopeName(asLogical(at)))) {
            return namedInside(scopeName(asLogical(at)), removed.record(), &full);
        }
        LogicalRef item = LogicalRef::own(at);
        py::Ref name = py::Ref::own(scopeName(item.record()));
        return namedInside(name.get(), removed.record(), &full);
    };
    Py_ssize_t first = -1;
    for (int pass = 0; pass < 2; ++pass) {
        const Py_ssize_t start = pass == 0 ? index : runStart;
        if (start <= 0 || (pass == 1 && runStart == index)) continue;
        if (first >= 0 && start > first) continue;
        Py_ssize_t k = start;
        while (k > 0 && inside(k - 1)) --k;
        if (k < start) first = k;
    }
    return first;
}

}  // namespace

void processRemoved(PyObject* self, PyObject* removedList, IndexList& result) {
    const bool native = nativePass(self);
    Py_ssize_t lastIndex = -1;
    // One change's removed logicals come in line order: a number not above
    // the last one's starts another change.
    Py_ssize_t runStart = -1;
    long runLine = 0;
    for (Py_ssize_t k = 0; k < PyList_GET_SIZE(removedList); ++k) {
        LogicalRef logical = LogicalRef::own(PyList_GET_ITEM(removedList, k));
        py::Ref scope = py::Ref::own(scopeName(logical.record()));
        if (scope.isNone()) continue;
        route::LogicalInScopeChanged(self, logical.get(), scope.get());
        Py_ssize_t index = indexForLineno(finderState(self).logicalList, logical->fLineno, native);
        // One still in the list (a caller's mistake) keeps its place in the
        // definition index, as the table walk would still count it. Where
        // its line number leads is where it would be.
        if (native && isScopeStart(logical.record()) && !standsAt(self, logical.get(), index)) {
            unfileDefinition(self, logical.get());
        }
        Py_ssize_t n = logicalListLength(self);
        const Py_ssize_t at = std::min(std::max<Py_ssize_t>(index, 0), n);
        if (runStart < 0 || logical->fLineno <= runLine) runStart = at;
        runStart = std::min(runStart, at);
        runLine = logical->fLineno;
        // A class/def replaced where it stood (typing in a header) has its
        // body after the one that replaced it.
        const NativePass* pass = finderState(self).native;
        const bool replacedInPlace = pass != nullptr && pass->replacedDefinition.get() == logical.get() &&
                                     at < PyList_GET_SIZE(finderState(self).logicalList) &&
                                     PyList_GET_ITEM(finderState(self).logicalList, at) ==
                                         pass->replacingDefinition.get();
        const Py_ssize_t body = replacedInPlace ? -1 : oldBodyStart(self, logical, at, runStart);
        n = logicalListLength(self);
        if (body >= 0 && body < n && body != lastIndex) {
            result.append(body);
            lastIndex = body;
        }
        // A logical removed from the end of the list still moves the comment
        // and blank lines before it (they took their scope from it): the last
        // logical stands in its place.
        if (index >= n && n > 0) index = n - 1;
        if (index != lastIndex && index >= 0 && index < n) result.append(index);
        lastIndex = index;
    }
}
void LogicalInScopeChanged(PyObject* self, PyObject* logicalObj, PyObject* scopeName,
                           PyObject* oldContainingScope, PyObject* oldLeafScope) {
    FinderState& s = finderState(self);
    addChange(s.contentsChanges, scopeName);
    if (oldContainingScope != Py_None) addChange(s.contentsChanges, oldContainingScope);
    LogicalRef logical = LogicalRef::own(logicalObj);
    if (!isScopeStart(logical.record())) return;
    const bool isClass = logical->fKind == kClassLogical;
    py::Ref defined = py::Ref::own(localScopeDefinedChecked(logical.record()));
    if (defined) {
        py::Ref full = joinTwoScopeNames(scopeName, defined.get());
        addChange(isClass ? s.classChanges : s.functionChanges, full.get());
    }
    if (oldContainingScope != Py_None && oldLeafScope != Py_None) {
        py::Ref full = joinTwoScopeNames(oldContainingScope, oldLeafScope);
        addChange(isClass ? s.classChanges : s.functionChanges, full.get());
    }
}

}  // namespace sbc::finder
