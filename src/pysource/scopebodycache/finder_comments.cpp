// Placement of comment and blank lines. Each member of a run gets the scope
// of the code line that follows the run, unless it is indented deeper than
// that line; then it gets the scope its own look-back finds.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/report.hpp"

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

}  // namespace

Py_ssize_t ProcessDedentedCommentsBody(PyObject* self, Py_ssize_t first) {
    if (assertionsOn()) {
        py::Ref at = logicalAt(self, first);
        assertThat(isWhitespace(requireLogical(at.get())));
    }
    const Py_ssize_t n = logicalListLength(self);
    // The following logical: the first code line after the run. A run that
    // reaches the end of the list has none and is placed as if a
    // module-level line followed it.
    Py_ssize_t end = n;
    for (Py_ssize_t k = first + 1; k < n; ++k) {
        py::Ref at = logicalAt(self, k);
        if (!isWhitespace(requireLogical(at.get()))) {
            end = k;
            break;
        }
    }
    NextChangeIndexOverride bound(self, end + 1);
    int referenceIndent = 0;
    py::Ref baseScope = py::Ref::own(gNames.empty);
    if (end < n) {
        py::Ref following = logicalAt(self, end);
        referenceIndent = requireLogical(following.get())->fIndent;
        baseScope = route::FindScopeNameContainingLogical(self, end);
    }
    for (Py_ssize_t j = first; j < end; ++j) {
        py::Ref member = logicalAt(self, j);
        Logical* logical = requireLogical(member.get());
        py::Ref scope = logical->fIndent > referenceIndent
                            ? route::FindScopeNameContainingLogical(self, j)
                            : baseScope.copy();
        requireStrOrNone(scope.get());
        route::UpdateContainingScope(self, member.get(), j, scope.get());
    }
    return end;
}

Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) noexcept {
    return neverRaises("pysource.scopebodycache.CChangeFinder._ProcessDedentedComments",
                       Py_ssize_t(0), [&] { return ProcessDedentedCommentsBody(self, first); });
}

}  // namespace sbc::finder
