// SelfCheck: the document against a fresh read of its text and a whole-file
// pass (pysource._documentcheck), and its rows against the text.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

#include <string>

namespace sdoc {

namespace {

void addProblem(std::string& out, const std::string& text) {
    out += "\n  ";
    out += text;
}

void checkRows(Document& d, std::string& problems) {
    const size_t n = d.text.size();
    size_t row = 0;
    if (d.rows.count() == 0 || d.rows.start(0, n) != 0) {
        addProblem(problems, "row 1 does not start the text");
        return;
    }
    for (size_t at = d.text.findNewline(0); at < n; at = d.text.findNewline(at + 1)) {
        ++row;
        if (row >= d.rows.count() || d.rows.start(row, n) != at + 1) {
            addProblem(problems, "row " + std::to_string(row + 1) + " does not start after the '\\n' at " +
                                     std::to_string(at));
            return;
        }
    }
    if (row + 1 != d.rows.count()) {
        addProblem(problems, std::to_string(d.rows.count()) + " rows for " + std::to_string(row + 1) + " lines");
    }
}

void collect(PyObject* found, std::string& problems) {
    const Py_ssize_t n = PyList_GET_SIZE(found);
    for (Py_ssize_t i = 0; i < n; ++i) {
        addProblem(problems, std::string(compat::strView(PyList_GET_ITEM(found, i))));
    }
}

py::Ref call(const char* function, PyObject* a, PyObject* b, PyObject* c) {
    py::Ref module = py::check(PyImport_ImportModule("pysource._documentcheck"));
    py::Ref f = py::check(PyObject_GetAttrString(module.get(), function));
    py::Ref result = py::check(PyObject_CallFunctionObjArgs(f.get(), a, b, c, nullptr));
    if (!PyList_Check(result.get())) msg::raise(PyExc_SystemError, "the document's check did not answer a list");
    return result;
}

}  // namespace

void selfCheck(Document& d) {
    std::string problems;
    checkRows(d, problems);
    py::Ref held = py::Ref::own(wholeText(d));
    PyObject* text = held.get();
    py::Ref logicals = logicalsCopy(d);
    if (d.readable) {
        const std::string rows = checkRowStates(d);
        if (!rows.empty()) addProblem(problems, rows);
        collect(call("CompareLogicals", text, d.filename.get(), logicals.get()).get(), problems);
        if (problems.empty()) collect(call("CompareCache", d.cache.get(), logicals.get(), nullptr).get(), problems);
    } else {
        PyObject* error = d.error ? d.error.get() : Py_None;
        collect(call("CompareError", text, d.filename.get(), error).get(), problems);
        // The logicals and names kept are those of the last text that read.
        py::Ref baseline = baselineText(d);
        std::string kept;
        collect(call("CompareLogicals", baseline.get(), d.filename.get(), logicals.get()).get(), kept);
        if (!kept.empty()) problems += "\n  the logicals kept differ from the last text that read:" + kept;
        const std::string states = checkBaselineRows(d, baseline.get());
        if (!states.empty()) addProblem(problems, states);
        const long rows = static_cast<long>(d.rows.count()) - d.damage.lineDelta();
        if (rows != static_cast<long>(d.damage.baselineRows)) {
            addProblem(problems, "the last text that read had " + std::to_string(d.damage.baselineRows) +
                                     " lines, the damage makes it " + std::to_string(rows));
        }
    }
    if (problems.empty()) return;
    std::string message = "the document differs from a fresh read of its text:" + problems;
    py::Ref text2 = py::check(compat::strFromBytes(message.data(), static_cast<Py_ssize_t>(message.size())));
    PyErr_SetObject(PyExc_AssertionError, text2.get());
    py::fail();
}

}  // namespace sdoc
