// What the document answers about its text and its logicals. When the text
// does not read, the logicals are the baseline's, in its line numbers.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/contracts/logical_record.hpp"
#include "pysource/scopedocument/document.hpp"

#include <string_view>
#include <vector>

namespace sdoc {

using contracts::LogicalLineObject;

namespace {

LogicalLineObject* record(PyObject* o) noexcept { return reinterpret_cast<LogicalLineObject*>(o); }

Py_ssize_t linenoArgument(PyObject* value) {
    if (!PyIndex_Check(value)) {
        PyErr_Format(PyExc_TypeError, "lineno must be an int, not %.200s", Py_TYPE(value)->tp_name);
        py::fail();
    }
    const Py_ssize_t v = PyNumber_AsSsize_t(value, nullptr);  // clipped: a line past the end is past the end
    if (v == -1 && PyErr_Occurred()) py::fail();
    return v;
}

bool isWhitespace(const LogicalLineObject* l) noexcept {
    return l->fKind == contracts::kCommentLogical || l->fKind == contracts::kBlankLogical;
}

// Whether `name` is `scope` or a name inside it.
bool within(std::string_view name, std::string_view scope) noexcept {
    if (name.size() < scope.size() || name.compare(0, scope.size(), scope) != 0) return false;
    return name.size() == scope.size() || name[scope.size()] == '.';
}

std::string_view nameOf(PyObject* name) {
    if (name == nullptr || !compat::isStr(name)) return std::string_view();
    return compat::strView(name);
}

}  // namespace

py::Ref getLine(Document& d, PyObject* linenoArg) {
    const Py_ssize_t lineno = linenoArgument(linenoArg);
    const Py_ssize_t count = static_cast<Py_ssize_t>(d.rows.count());
    if (lineno < 1 || lineno > count) {
        PyErr_Format(PyExc_ValueError, "line %zd is outside the text (lines 1 to %zd)", lineno, count);
        py::fail();
    }
    const size_t r = static_cast<size_t>(lineno - 1);
    const size_t start = d.rows.start(r, d.text.size());
    return py::Ref::steal(d.text.slice(start, start + rowLength(d, r)));
}

py::Ref scopeAtLine(Document& d, PyObject* linenoArg) {
    const Py_ssize_t lineno = linenoArgument(linenoArg);
    PyObject* list = d.list.get();
    // The last logical at or before the line.
    Py_ssize_t lo = 0, hi = PyList_GET_SIZE(list);
    while (lo < hi) {
        const Py_ssize_t mid = lo + (hi - lo) / 2;
        if (record(PyList_GET_ITEM(list, mid))->fLineno <= lineno) lo = mid + 1;
        else hi = mid;
    }
    if (lo == 0) return py::Ref::own(gImports.emptyName);
    PyObject* name = record(PyList_GET_ITEM(list, lo - 1))->fScopeName;
    return py::Ref::own(name != nullptr ? name : gImports.emptyName);
}

py::Ref outline(Document& d) {
    py::Ref list = py::Ref::own(d.list.get());
    const Py_ssize_t n = PyList_GET_SIZE(list.get());
    // The text's last line that holds a character, the end of whatever
    // runs to the last logical.
    size_t lastLine;
    if (d.readable) {
        lastLine = d.rows.count() - (d.text.size() > 0 && d.text.at(d.text.size() - 1) == '\n' ? 1 : 0);
    } else {
        lastLine = d.damage.baselineRows - (d.damage.baselineEndsWithNewline ? 1 : 0);
    }
    struct Open {
        py::Ref entry;  // the outline tuple without its end line: (name, kind, line)
        py::Ref name;
        Py_ssize_t slot;
    };
    py::Ref result = py::check(PyList_New(0));
    std::vector<Open> open;
    // The end line of a scope whose last logical is at `last`.
    auto endAfter = [&](Py_ssize_t last) -> Py_ssize_t {
        if (last + 1 < n) return record(PyList_GET_ITEM(list.get(), last + 1))->fLineno - 1;
        return static_cast<Py_ssize_t>(lastLine);
    };
    auto close = [&](Open& o, Py_ssize_t last) {
        py::Ref end = py::check(compat::intFromSsize(endAfter(last)));
        PyObject* entry = o.entry.get();
        py::Ref full = py::check(PyTuple_Pack(4, PyTuple_GET_ITEM(entry, 0), PyTuple_GET_ITEM(entry, 1),
                                              PyTuple_GET_ITEM(entry, 2), end.get()));
        py::checkStatus(PyList_SetItem(result.get(), o.slot, full.release()));
    };
    Py_ssize_t lastCode = -1;  // the last logical that is not blank or comment
    for (Py_ssize_t i = 0; i < n; ++i) {
        PyObject* item = PyList_GET_ITEM(list.get(), i);
        const LogicalLineObject* l = record(item);
        if (isWhitespace(l)) continue;
        // Scopes that do not hold this logical ended at the last one.
        const std::string_view name = nameOf(l->fScopeName);
        while (!open.empty() && !within(name, nameOf(open.back().name.get()))) {
            close(open.back(), lastCode);
            open.pop_back();
        }
        lastCode = i;
        const bool header = (l->fKind == contracts::kClassLogical || l->fKind == contracts::kDefLogical) &&
                            l->fLocalScopeName != nullptr && l->fLocalScopeName != Py_None;
        if (!header) continue;
        py::Ref full = py::check(PyObject_CallFunctionObjArgs(gImports.fullName, item, nullptr));
        py::Ref kind = py::check(compat::intFromLong(l->fKind));
        py::Ref line = py::check(compat::intFromLong(l->fLineno));
        Open o;
        o.entry = py::check(PyTuple_Pack(3, full.get(), kind.get(), line.get()));
        o.name = std::move(full);
        o.slot = PyList_GET_SIZE(result.get());
        py::checkStatus(PyList_Append(result.get(), Py_None));
        open.push_back(std::move(o));
    }
    while (!open.empty()) {
        close(open.back(), lastCode);
        open.pop_back();
    }
    return result;
}

py::Ref logicalsCopy(Document& d) {
    return py::check(PyList_GetSlice(d.list.get(), 0, PyList_GET_SIZE(d.list.get())));
}

}  // namespace sdoc
