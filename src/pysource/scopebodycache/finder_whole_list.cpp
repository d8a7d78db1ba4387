// The whole-list pass: one forward walk with a stack of open scopes, taken
// when a file was just read or its contents were replaced.
#include "pysource/scopebodycache/finder.hpp"
#include "pysource/scopebodycache/names.hpp"
#include "pysource/scopebodycache/route.hpp"
#include "pysource/scopebodycache/siblings.hpp"

#include <vector>

namespace sbc::finder {

using namespace contracts;

namespace {
struct OpenScope {
    py::Ref name;
    int indent;
};
}  // namespace

void FindChangesEntireListAdded(PyObject* self) {
    FinderState& s = finderState(self);
    addChange(s.contentsChanges, gNames.empty);
    std::vector<OpenScope> stack;
    stack.push_back({py::Ref::own(gNames.empty), -1});
    Py_ssize_t i = 0;
    while (i < logicalListLength(self)) {
        LogicalRef logical = logicalAt(self, i);
        const int indent = logical->fIndent;
        if (isWhitespace(logical.record()) && indent <= stack.back().indent) {
            const Py_ssize_t next = route::ProcessDedentedComments(self, i);
            requireRunPlaced(next, i);
            i = next;
            continue;
        }
        while (indent <= stack.back().indent) {
            assertThat(stack.size() >= 2);
            stack.pop_back();
            if (stack.empty()) msg::raise(PyExc_IndexError, msg::kListIndexOutOfRange);
        }
        PyObject* topName = stack.back().name.get();
        py::Ref local = py::Ref::none();
        const bool scopeStart = isScopeStart(logical.record());
        if (scopeStart) {
            // Counted by bare name: a list read before carries indexed
            // names, which must not count as names of their own.
            const Py_ssize_t index = CountDefinition(self, logical.get(), i, topName);
            local = route::GetLeafScopeWithIndex(self, logical.get(), index);
        }
        py::Ref top = stack.back().name.copy();
        route::SetLogicalScopeNames(self, logical.get(), i, top.get(), local.get());
        if (scopeStart && !local.isNone()) {
            py::Ref full = joinTwoScopeNames(top.get(), local.get());
            addChange(logical->fKind == kClassLogical ? s.classChanges : s.functionChanges, full.get());
            addChange(s.contentsChanges, full.get());
            stack.push_back({std::move(full), indent});
        }
        ++i;
    }
}

}  // namespace sbc::finder
