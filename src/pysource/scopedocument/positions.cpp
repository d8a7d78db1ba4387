// Places in the text as callers give them (a 1-based line and a column) and
// as the document keeps them (character offsets), and the checks that a
// place is in the text.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

namespace sdoc {

namespace {

// A line or column argument: an int (bool too, as Python takes it).
Py_ssize_t intArgument(PyObject* value, const char* which, const char* what) {
    if (!PyIndex_Check(value)) {
        PyErr_Format(PyExc_TypeError, "%.40s %.10s must be an int, not %.200s", which, what,
                     Py_TYPE(value)->tp_name);
        py::fail();
    }
    const Py_ssize_t v = PyNumber_AsSsize_t(value, nullptr);
    if (v == -1 && PyErr_Occurred()) py::fail();
    return v;
}

// The UTF-16 units of the character at `i` of a 2.7 text taken as UTF-8,
// and how many bytes it takes. A byte that starts no whole sequence counts
// as one unit on its own (as a decoder's replacement would).
size_t utf8Step(const TextStore& t, size_t i, size_t end, int* units) {
    const uint32_t b = t.at(i);
    size_t len = 1;
    *units = 1;
    if (b >= 0xC0 && b < 0xE0) len = 2;
    else if (b >= 0xE0 && b < 0xF0) len = 3;
    else if (b >= 0xF0 && b < 0xF8) len = 4;
    if (len == 1 || i + len > end) return 1;
    for (size_t k = 1; k < len; ++k) {
        if ((t.at(i + k) & 0xC0) != 0x80) return 1;
    }
    if (len == 4) *units = 2;
    return len;
}

}  // namespace

size_t rowLength(const Document& d, size_t r) {
    const size_t n = d.text.size();
    const size_t start = d.rows.start(r, n);
    const size_t next = r + 1 < d.rows.count() ? d.rows.start(r + 1, n) - 1 : n;
    return next - start;
}

size_t rowOfOffset(const Document& d, size_t at) { return d.rows.rowAt(at) + 1; }

size_t offsetOf(Document& d, PyObject* linenoArg, PyObject* columnArg, bool utf16, const char* which, size_t* row) {
    const Py_ssize_t lineno = intArgument(linenoArg, which, "line");
    const Py_ssize_t column = intArgument(columnArg, which, "column");
    const Py_ssize_t count = static_cast<Py_ssize_t>(d.rows.count());
    if (lineno < 1 || lineno > count) {
        PyErr_Format(PyExc_ValueError, "%s line %zd is outside the text (lines 1 to %zd)", which, lineno, count);
        py::fail();
    }
    const size_t r = static_cast<size_t>(lineno - 1);
    *row = r;
    const size_t start = d.rows.start(r, d.text.size());
    const size_t length = rowLength(d, r);
    if (column < 0) {
        PyErr_Format(PyExc_ValueError, "%s column %zd of line %zd is negative", which, column, lineno);
        py::fail();
    }
    if (!utf16) {
        if (static_cast<size_t>(column) > length) {
            PyErr_Format(PyExc_ValueError, "%s column %zd is past the end of line %zd (%zu %s long)", which,
                         column, lineno, length, compat::kColumnUnit);
            py::fail();
        }
        return start + static_cast<size_t>(column);
    }
    // UTF-16 units: walked from the start of the line.
    const size_t end = start + length;
    size_t at = start;
    Py_ssize_t units = 0;
    while (units < column && at < end) {
        int step = 1;
        if (compat::kPython3) {
            step = d.text.at(at) >= 0x10000 ? 2 : 1;
            ++at;
        } else {
            at += utf8Step(d.text, at, end, &step);
        }
        units += step;
    }
    if (units < column) {
        PyErr_Format(PyExc_ValueError, "%s column %zd is past the end of line %zd (%zd UTF-16 units long)", which,
                     column, lineno, units);
        py::fail();
    }
    if (units > column) {
        PyErr_Format(PyExc_ValueError, "%s column %zd of line %zd falls inside a character (a surrogate pair)",
                     which, column, lineno);
        py::fail();
    }
    return at;
}

BusyGuard::BusyGuard(Document& d) : d_(d) {
    if (d.busy) msg::raise(PyExc_RuntimeError, "the document is being edited (a call came back into it)");
    d.busy = true;
}

void requireEditText(PyObject* text) {
    if (compat::isStr(text)) return;
    PyErr_Format(PyExc_TypeError, "the new text must be %s, not %.200s", compat::kPython3 ? "str" : "str (bytes)",
                 Py_TYPE(text)->tp_name);
    py::fail();
}

}  // namespace sdoc
