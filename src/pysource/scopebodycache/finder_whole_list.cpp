// The whole-list pass: one forward walk with a stack of open scopes, taken
// when a file was just read or its contents were replaced.
#include "pysource/scopebodycache/def_index.hpp"
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

// The native pass's naming of one class/def line: what the routed steps
// (the count, _GetLeafScopeWithIndex, _SetLogicalScopeNames and the
// recording it does) give, reading the defined name once and building the
// full name once for the stack, the change sets and the record. False when
// the line is not the plain case (a nameless or non-str name), left to the
// routed steps.
bool nameDefinitionNative(PyObject* self, const LogicalRef& logical, Py_ssize_t i, PyObject* top,
                          py::Ref* full) {
    DefinedName name;
    if (!readDefinedName(logical.get(), &name) || !compat::isStrExact(name.name) ||
        !compat::isStrExact(top)) {
        return false;
    }
    const Py_ssize_t index = CountDefinition(self, logical.get(), i, top, &name);
    py::Ref local;
    if (name.index == index) {
        local = py::Ref::own(name.name);
    } else {
        py::Ref number = py::check(compat::intFromSsize(index));
        local = appendScopeSuffixes(bareNameOf(logical.get(), name).get(), number.get());
    }
    *full = joinTwoScopeNames(top, local.get());
    FinderState& s = finderState(self);
    Logical* l = logical.record();
    PyObject* old = scopeName(l);
    requireStrOrNone(old);
    if (old == Py_None || !strEquals(old, top)) setScopeName(l, top);
    // _SetLogicalScopeNames records a new local name (the enclosing scope
    // and this full name), and the pass then records this scope itself;
    // the enclosing scope is in the set already, since it was recorded
    // when it opened, so each name is added once.
    if (!strEquals(name.name, local.get())) setLocalScopeDefined(l, local.get());
    addChange(l->fKind == kClassLogical ? s.classChanges : s.functionChanges, full->get());
    addChange(s.contentsChanges, full->get());
    return true;
}

// The native pass over a stretch of plain lines (the bulk of a file): the
// loop's own work and _SetLogicalScopeNames, on borrowed records, since
// nothing here runs Python code but the release of an old name a store
// replaces (after which the list is read afresh). Stops at a class/def
// line or a comment run to place, and returns where it stopped.
Py_ssize_t NamePlainLinesNative(PyObject* self, Py_ssize_t i, std::vector<OpenScope>& stack) {
    FinderState& s = finderState(self);
    while (s.logicalList != Py_None && i < PyList_GET_SIZE(s.logicalList)) {
        Logical* l = requireLogical(PyList_GET_ITEM(s.logicalList, i));
        const int indent = l->fIndent;
        if (isScopeStart(l) || (isWhitespace(l) && indent <= stack.back().indent)) return i;
        while (indent <= stack.back().indent) {
            if (stack.size() < 2) return i;  // the general loop reports it
            stack.pop_back();
        }
        PyObject* top = stack.back().name.get();
        PyObject* old = scopeName(l);
        if (old != top) {
            requireStrOrNone(old);
            if (old == Py_None || !strEquals(old, top)) {
                requireStrOrNone(top);
                setScopeName(l, top);
            } else if (compat::isStrExact(old) && compat::isStrExact(top) && compat::strEqual(old, top)) {
                // Over a named list the rest of this body then compares
                // by identity.
                stack.back().name = py::Ref::own(old);
            }
        }
        ++i;
    }
    return i;
}

}  // namespace

void FindChangesEntireListAdded(PyObject* self) {
    FinderState& s = finderState(self);
    addChange(s.contentsChanges, gNames.empty);
    std::vector<OpenScope> stack;
    stack.push_back({py::Ref::own(gNames.empty), -1});
    Py_ssize_t i = 0;
    const bool native = nativePass(self);
    while (i < logicalListLength(self)) {
        if (native) i = NamePlainLinesNative(self, i, stack);
        if (i >= logicalListLength(self)) break;
        LogicalRef logical = logicalAt(self, i);
        const int indent = logical->fIndent;
        if (isWhitespace(logical.record()) && indent <= stack.back().indent) {
            if (nativePass(self)) {
                // The step's own work, except that the following logical's
                // scope is what this pass will give it: the stack's
                // innermost scope opened by a line less indented than it
                // (the look-back finds the same).
                const Py_ssize_t next = neverRaises(
                    unraisableContext(Step::ProcessDedentedComments), Py_ssize_t(0), [&]() -> Py_ssize_t {
                        const Py_ssize_t end = CommentRunEnd(self, i);
                        const py::Ref* known = nullptr;
                        if (end < logicalListLength(self)) {
                            const int following = logicalAt(self, end)->fIndent;
                            size_t top = stack.size() - 1;
                            while (top > 0 && following <= stack[top].indent) --top;
                            if (following >= 0) known = &stack[top].name;
                        }
                        return PlaceCommentRun(self, i, end, known);
                    });
                requireRunPlaced(next, i);
                i = next;
                continue;
            }
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
        if (nativePass(self)) {
            if (!isScopeStart(logical.record())) {
                // _SetLogicalScopeNames of a line that opens nothing.
                PyObject* old = scopeName(logical.record());
                requireStrOrNone(old);
                if (old == Py_None || !strEquals(old, topName)) {
                    requireStrOrNone(topName);
                    setScopeName(logical.record(), topName);
                }
                ++i;
                continue;
            }
            py::Ref full;
            if (nameDefinitionNative(self, logical, i, topName, &full)) {
                stack.push_back({std::move(full), indent});
                ++i;
                continue;
            }
        }
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
