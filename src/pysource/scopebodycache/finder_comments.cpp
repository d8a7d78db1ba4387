// Placement of comment and blank lines. Each member of a run gets the scope
// of the code line that follows the run, unless it is indented deeper than
// that line; then it gets the scope its own look-back finds.
#include "pysource/scopebodycache/finder.hpp"
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

}  // namespace

Py_ssize_t ProcessDedentedComments(PyObject* self, Py_ssize_t first) {
    if (assertionsOn()) assertThat(isWhitespace(logicalAt(self, first).record()));
    const Py_ssize_t n = logicalListLength(self);
    // The following logical: the first code line after the run. A run that
    // reaches the end of the list has none and is placed as if a
    // module-level line followed it.
    Py_ssize_t end = n;
    for (Py_ssize_t k = first + 1; k < n; ++k) {
        if (!isWhitespace(logicalAt(self, k).record())) {
            end = k;
            break;
        }
    }
    NextChangeIndexOverride bound(self, end + 1);
    int referenceIndent = 0;
    py::Ref baseScope = py::Ref::own(gNames.empty);
    if (end < n) {
        referenceIndent = logicalAt(self, end)->fIndent;
        baseScope = route::FindScopeNameContainingLogical(self, end);
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
