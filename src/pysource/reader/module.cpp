// pysource._reader: the module frame of the native reader. The rules are in
// scanner.cpp; pysource.logicals checks and decodes the source and calls
// Read.
#include <Python.h>

#include <cstring>
#include <vector>

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/capi.hpp"
#include "pysource/reader/builder.hpp"
#include "pysource/reader/scanner.hpp"

namespace {

using reader::LineState;
using reader::Scanner;

// The record type pysource._fastaccess publishes, looked up at the first
// read; null when it cannot be found (records are then made by calling).
PyTypeObject* gNativeType = nullptr;
bool gLookedUp = false;

PyTypeObject* nativeType() {
    if (gLookedUp) return gNativeType;
    gLookedUp = true;
    py::SavedError saved;
    PyObject* module = PyImport_ImportModule("pysource._fastaccess");
    PyObject* table = module ? PyObject_GetAttrString(module, contracts::kCapiAttr) : nullptr;
    PyObject* capsule = table && PyDict_Check(table) ? PyDict_GetItemString(table, "LogicalLineType") : nullptr;
    if (capsule != nullptr && PyCapsule_IsValid(capsule, contracts::sig::kObject)) {
        auto* variable = static_cast<PyObject**>(PyCapsule_GetPointer(capsule, contracts::sig::kObject));
        if (variable != nullptr && *variable != nullptr && PyType_Check(*variable)) {
            Py_INCREF(*variable);
            gNativeType = reinterpret_cast<PyTypeObject*>(*variable);
        }
    }
    Py_XDECREF(table);
    Py_XDECREF(module);
    PyErr_Clear();
    saved.restore();
    return gNativeType;
}

// The text argument as characters; throws TypeError for anything but an
// exact str.
compat::TextChars textOf(PyObject* text) {
    if (!compat::isStrExact(text)) {
        PyErr_Format(PyExc_TypeError, "text must be %s, not %.200s", compat::kPython3 ? "str" : "bytes",
                     Py_TYPE(text)->tp_name);
        py::fail();
    }
    compat::TextChars chars;
    if (!compat::textChars(text, &chars)) py::fail();
    return chars;
}

// Calls body(const Char* text, size_t length, bool ascii) with the
// character type of the text.
template <class Body>
PyObject* withChars(const compat::TextChars& chars, Body&& body) {
    const size_t n = static_cast<size_t>(chars.length);
    // 2.7's text is bytes: the wider kinds are not even made there.
    if constexpr (compat::kPython3) {
        if (chars.kind == 2) return body(static_cast<const uint16_t*>(chars.data), n, false);
        if (chars.kind == 4) return body(static_cast<const uint32_t*>(chars.data), n, false);
    }
    return body(static_cast<const uint8_t*>(chars.data), n, chars.ascii);
}

PyObject* Read(PyObject*, PyObject* args) {
    return py::guarded([&]() -> PyObject* {
        PyObject *text, *filename, *type;
        if (!PyArg_ParseTuple(args, "OOO:Read", &text, &filename, &type)) py::fail();
        const compat::TextChars chars = textOf(text);
        const reader::RecordMaker maker{type, nativeType()};
        return withChars(chars, [&](auto* data, size_t n, bool ascii) -> PyObject* {
            using Char = std::remove_const_t<std::remove_pointer_t<decltype(data)>>;
            Scanner<Char> scanner(data, n);
            reader::TokenMaker<Char> tokens(data, n, ascii);
            return reader::readLogicals(scanner, tokens, maker, filename);
        });
    });
}

// The scan alone, no objects made: what the benchmark takes off a read to
// tell the cost of making the token strings and records.
PyObject* Scan(PyObject*, PyObject* arg) {
    return py::guarded([&]() -> PyObject* {
        const compat::TextChars chars = textOf(arg);
        return withChars(chars, [&](auto* data, size_t n, bool) -> PyObject* {
            using Char = std::remove_const_t<std::remove_pointer_t<decltype(data)>>;
            Scanner<Char> scanner(data, n);
            const bool read = scanner.scanAll();
            return Py_BuildValue("(nnnO)", static_cast<Py_ssize_t>(scanner.nextLineno() - 1),
                                 static_cast<Py_ssize_t>(scanner.tokens().size()),
                                 static_cast<Py_ssize_t>(scanner.records().size()), read ? Py_True : Py_False);
        });
    });
}

PyObject* stateTuple(const LineState& s, int64_t indentColumn) {
    return Py_BuildValue("(iiiiiL)", s.string, s.needcont, s.cont, s.open, s.depth,
                         static_cast<long long>(indentColumn));
}

PyObject* RowStates(PyObject*, PyObject* arg) {
    return py::guarded([&]() -> PyObject* {
        const compat::TextChars chars = textOf(arg);
        return withChars(chars, [&](auto* data, size_t n, bool) -> PyObject* {
            using Char = std::remove_const_t<std::remove_pointer_t<decltype(data)>>;
            Scanner<Char> scanner(data, n);
            py::Ref list = py::check(PyList_New(0));
            LineState entry = scanner.state();
            while (scanner.scanRow()) {
                py::Ref item = py::check(stateTuple(entry, scanner.rowIndentColumn()));
                py::checkStatus(PyList_Append(list.get(), item.get()));
                entry = scanner.state();
            }
            py::Ref item = py::check(stateTuple(entry, scanner.error() ? -2 : -1));
            py::checkStatus(PyList_Append(list.get(), item.get()));
            return list.release();
        });
    });
}

// Where a whole scan stood at a row boundary.
struct Boundary {
    int64_t lineno;
    size_t offset;
    LineState state;
    std::vector<int64_t> indents;
    size_t records;
    size_t tokens;
};

bool sameRecord(const reader::Record& a, size_t aBase, const reader::Record& b, size_t bBase) {
    return a.firstToken - aBase == b.firstToken - bBase && a.tokenCount == b.tokenCount && a.lineno == b.lineno &&
           a.indent == b.indent && a.kind == b.kind;
}

template <class Char>
void checkResumeAt(const Scanner<Char>& whole, const Boundary& at, const Char* data, size_t n) {
    Scanner<Char> part(data, n);
    part.start(at.lineno, at.offset, at.state, at.indents.data(), at.indents.size());
    part.scanAll();
    const auto& wr = whole.records();
    const auto& pr = part.records();
    bool same = pr.size() == wr.size() - at.records && part.tokens().size() == whole.tokens().size() - at.tokens;
    for (size_t i = 0; same && i < pr.size(); ++i) same = sameRecord(pr[i], 0, wr[at.records + i], at.tokens);
    for (size_t i = 0; same && i < part.tokens().size(); ++i) {
        same = part.tokens()[i].begin == whole.tokens()[at.tokens + i].begin &&
               part.tokens()[i].end == whole.tokens()[at.tokens + i].end;
    }
    const reader::ScanError& we = whole.error();
    const reader::ScanError& pe = part.error();
    same = same && we.kind == pe.kind && we.lineno == pe.lineno && we.offset == pe.offset &&
           we.hasText == pe.hasText && we.textBegin == pe.textBegin && we.textEnd == pe.textEnd &&
           we.lineText == pe.lineText;
    if (!same) {
        PyErr_Format(PyExc_AssertionError, "a scan resumed at row %lld reads otherwise than the whole scan",
                     static_cast<long long>(at.lineno));
        py::fail();
    }
}

PyObject* CheckResume(PyObject*, PyObject* args) {
    return py::guarded([&]() -> PyObject* {
        PyObject* text;
        Py_ssize_t step = 1;
        if (!PyArg_ParseTuple(args, "O|n:CheckResume", &text, &step)) py::fail();
        if (step < 1) step = 1;
        const compat::TextChars chars = textOf(text);
        return withChars(chars, [&](auto* data, size_t n, bool) -> PyObject* {
            using Char = std::remove_const_t<std::remove_pointer_t<decltype(data)>>;
            Scanner<Char> whole(data, n);
            std::vector<Boundary> boundaries;
            for (;;) {
                const LineState s = whole.state();
                if (!s.midLogical() && !whole.atEnd() && !whole.error()) {
                    boundaries.push_back(Boundary{whole.nextLineno(), whole.nextOffset(), s, whole.indents(),
                                                  whole.records().size(), whole.tokens().size()});
                }
                if (!whole.scanRow()) break;
            }
            if (!whole.error()) whole.finish();
            Py_ssize_t checked = 0;
            for (size_t i = 0; i < boundaries.size(); i += static_cast<size_t>(step)) {
                checkResumeAt(whole, boundaries[i], data, n);
                ++checked;
            }
            return compat::intFromSsize(checked);
        });
    });
}

PyMethodDef gMethods[] = {
    {"Read", Read, METH_VARARGS,
     "Read(text, filename, record_type): the list of logicals of text, made with record_type."},
    {"Scan", Scan, METH_O,
     "Scan(text): (rows, tokens, records, whether it reads) of a scan that makes no objects."},
    {"RowStates", RowStates, METH_O,
     "RowStates(text): (string, needcont, cont, open, depth, indent column) of the state each row starts in, "
     "then of the end; the column is -1 where the row runs no indentation check (-2 at the end: an error)."},
    {"CheckResume", CheckResume, METH_VARARGS,
     "CheckResume(text, step=1): scans resumed at every step-th row where no logical is open read as the "
     "whole scan does from there; the number of rows checked. AssertionError otherwise."},
    {nullptr, nullptr, 0, nullptr},
};

compat::ModuleDef gModuleDef =
    SBC_MODULE_DEF("pysource._reader", "The native reader of pysource.logicals.", gMethods);

}  // namespace

SBC_MODULE_INIT(_reader) {
    PyObject* module = py::guarded([] {
        py::Ref owner;
        PyObject* m = compat::createModule(gModuleDef, owner);
        compat::setPackage(PyModule_GetDict(m), "pysource");
        return owner.release();
    });
    return compat::initResult(module);
}
