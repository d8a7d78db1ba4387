// Placement of comment and blank lines. Each member of a run gets the scope
// of the code line that follows the run, unless it is indented deeper than
// that line; then it gets the scope its own look-back finds.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/fullname.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"

namespace sbc::finder {

using namespace contracts;

namespace {

// Restores _fNextChangeIndex on every way out of the placement.
class NextChangeIndexOverride {
public:
    NextChangeIndexOverride(PyObject* self, Py_ssize_t value)
        : state_(finderState(self)), saved_(state_.nextChangeIndex) {
        state_.nextChangeIndex = value;
    }
    ~NextChangeIndexOverride() { state_.nextChangeIndex = saved_; }
    NextChangeIndexOverride(const NextChangeIndexOverride&) = delete;
    NextChangeIndexOverride& operator=(const NextChangeIndexOverride&) = delete;

private:
    FinderState& state_;
    Py_ssize_t saved_;
};

// What _FindScopeNameContainingLogical gives a comment or blank line of the
// run that is indented deeper than the following logical. The look-back of
// such a line passes over the run (whitespace) to the first code line
// before it, whatever its indent, so all members share that anchor; they
// differ only in being deeper than it or not. The native pass works it out
// once per run. Empty when the anchor has no name yet: the step is asked
// then, as the general steps do.
class RunAnchor {
public:
    RunAnchor(PyObject* self, Py_ssize_t first) {
        PyObject* list = finderState(self).logicalList;
        for (Py_ssize_t j = first - 1; j >= 0; --j) {
            Logical* prior = requireLogical(PyList_GET_ITEM(list, j));
            if (isWhitespace(prior)) continue;
            anchor_ = LogicalRef::own(reinterpret_cast<PyObject*>(prior));
            break;
        }
        known_ = !anchor_ || (anchor_->fScopeName != nullptr && anchor_->fScopeName != Py_None);
    }

    bool known() const noexcept { return known_; }

    py::Ref scopeFor(int indent) {
        if (!anchor_) return py::Ref::own(gNames.empty);
        Logical* a = anchor_.record();
        if (indent > a->fIndent && isScopeStart(a) && localScopeDefined(a) != nullptr) {
            if (!inside_) inside_ = callGetFullNameForScopeDef(anchor_.get(), true);
            return inside_.copy();
        }
        return py::Ref::own(a->fScopeName);
    }

private:
    LogicalRef anchor_;
    bool known_ = true;
    py::Ref inside_;  // the anchor's own full name, once asked for
};

// UpdateContainingScope's work for one member, in the native pass.
// `recorded`: the scope is in the contents set already (the whole-list pass
// records every scope when it opens), so adding it again is skipped.
void placeMember(PyObject* self, const LogicalRef& member, PyObject* scope, bool recorded) {
    FinderState& s = finderState(self);
    PyObject* old = scopeName(member.record());
    requireStrOrNone(old);
    if (old != Py_None && strEquals(old, scope)) return;
    py::Ref previous = py::Ref::own(old);
    requireStrOrNone(scope);
    setScopeName(member.record(), scope);
    if (!recorded) addChange(s.contentsChanges, scope);
    if (!previous.isNone()) addChange(s.contentsChanges, previous.get());
}

}  // namespace

Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) {
    if (assertionsOn()) assertThat(isWhitespace(logicalAt(self, first).record()));
    const Py_ssize_t end = CommentRunEnd(self, first);
    return PlaceCommentRun(self, first, end, nullptr);
}

Py_ssize_t CommentRunEnd(PyObject* self, Py_ssize_t first) {
    const Py_ssize_t n = logicalListLength(self);
    // Optimised, a first index past the end is not refused by an assert.
    if (first >= n) return n;
    for (Py_ssize_t k = first + 1; k < n; ++k) {
        if (!isWhitespace(logicalAt(self, k).record())) return k;
    }
    return n;
}

Py_ssize_t PlaceCommentRun(PyObject* self, Py_ssize_t first, Py_ssize_t end, const py::Ref* knownBase) {
    const Py_ssize_t n = logicalListLength(self);
    NextChangeIndexOverride bound(self, end + 1);
    int referenceIndent = 0;
    py::Ref baseScope = py::Ref::own(gNames.empty);
    if (end < n) {
        referenceIndent = logicalAt(self, end)->fIndent;
        baseScope = knownBase != nullptr ? knownBase->copy() : route::FindScopeNameContainingLogical(self, end);
    }
    if (nativePass(self) && compat::isStrExact(baseScope.get())) {
        RunAnchor anchor(self, first);
        if (anchor.known()) {
            for (Py_ssize_t j = first; j < end; ++j) {
                LogicalRef member = logicalAt(self, j);
                py::Ref scope = member->fIndent > referenceIndent ? anchor.scopeFor(member->fIndent)
                                                                  : baseScope.copy();
                requireStrOrNone(scope.get());
                placeMember(self, member, scope.get(), knownBase != nullptr);
            }
            return end;
        }
    }
    for (Py_ssize_t j = first; j < end; ++j) {
        LogicalRef member = logicalAt(self, j);
        py::Ref scope = member->fIndent > referenceIndent
                            ? route::FindScopeNameContainingLogical(self, j)
                            : baseScope.copy();
        requireStrOrNone(scope.get());
        route::UpdateContainingScope(self, member.get(), j, scope.get());
    }
    return end;
}

}  // namespace sbc::finder
