#include "pysource/reader/builder.hpp"

#include <cstring>
#include <limits>
#include <vector>

#include "common/pycompat.hpp"
#include "common/pyref.hpp"
#include "pysource/contracts/logical_record.hpp"

namespace reader {

namespace {

// The record type's own range checks, with its messages.
bool fieldInRange(int64_t value, int64_t lo, int64_t hi, const char* field) {
    if (value >= lo && value <= hi) return true;
    PyErr_Format(PyExc_OverflowError, "%s out of range [%lld, %lld]", field, static_cast<long long>(lo),
                 static_cast<long long>(hi));
    return false;
}

// The tokens of a record as an owned array (null for none).
struct TokenArray {
    PyObject** items = nullptr;
    Py_ssize_t count = 0;
    ~TokenArray() {
        for (Py_ssize_t i = 0; i < count; ++i) Py_DECREF(items[i]);
        PyMem_Free(items);
    }
};

template <class Char>
void makeTokens(const Scanner<Char>& scanner, const Record& record, TokenMaker<Char>& tokens,
                TokenArray* out) {
    if (record.tokenCount == 0) return;
    out->items = PyMem_New(PyObject*, record.tokenCount);
    if (out->items == nullptr) {
        PyErr_NoMemory();
        py::fail();
    }
    const TokenSpan* spans = scanner.tokens().data() + record.firstToken;
    for (size_t i = 0; i < record.tokenCount; ++i) {
        PyObject* token = tokens.make(spans[i].begin, spans[i].end);
        if (token == nullptr) py::fail();
        out->items[out->count++] = token;
    }
}

}  // namespace

template <class Char>
TokenMaker<Char>::TokenMaker(const Char* text, size_t length, bool ascii) : text_(text), ascii_(ascii) {
    // About one distinct short token per 16 characters of text, at least 16
    // and at most 4096 slots: a direct-mapped table that small stays in the
    // caches, and one for a line or two costs little to make and clear.
    size_t slots = 16;
    while (slots < 4096 && slots * 16 < length) slots *= 2;
    mask_ = slots - 1;
    table_.reset(new Entry[slots]);
    for (size_t i = 0; i < slots; ++i) {
        table_[i].object = nullptr;
        table_[i].length = 0;
    }
}

template <class Char>
TokenMaker<Char>::~TokenMaker() {
    for (size_t i = 0; i <= mask_; ++i) Py_XDECREF(table_[i].object);
}

template <class Char>
PyObject* TokenMaker<Char>::makeFresh(size_t begin, size_t end) {
    return compat::strFromChars(text_ + begin, static_cast<Py_ssize_t>(end - begin), ascii_);
}

template <class Char>
PyObject* TokenMaker<Char>::make(size_t begin, size_t end) {
    const size_t n = end - begin;
    if (n > kMaxShared) return makeFresh(begin, end);
    const Char* chars = text_ + begin;
    uint32_t hash = 2166136261u;
    for (size_t i = 0; i < n; ++i) hash = (hash ^ static_cast<uint32_t>(chars[i])) * 16777619u;
    hash ^= hash >> 15;
    Entry& entry = table_[hash & mask_];
    if (entry.object != nullptr && entry.length == n && std::memcmp(entry.chars, chars, n * sizeof(Char)) == 0) {
        Py_INCREF(entry.object);
        return entry.object;
    }
    PyObject* made = makeFresh(begin, end);
    if (made == nullptr) return nullptr;
    PyObject* old = entry.object;
    Py_INCREF(made);
    entry.object = made;
    entry.length = n;
    std::memcpy(entry.chars, chars, n * sizeof(Char));
    Py_XDECREF(old);  // a str: no code runs
    return made;
}

template <class Char>
PyObject* makeLogical(const Scanner<Char>& scanner, const Record& record, TokenMaker<Char>& tokens,
                      const RecordMaker& maker) {
    return py::guarded([&]() -> PyObject* {
        TokenArray array;
        makeTokens(scanner, record, tokens, &array);
        if (maker.native != nullptr && maker.type == reinterpret_cast<PyObject*>(maker.native)) {
            if (!fieldInRange(record.lineno, std::numeric_limits<int32_t>::min(),
                              std::numeric_limits<int32_t>::max(), "lineno") ||
                !fieldInRange(record.indent, std::numeric_limits<int16_t>::min(),
                              std::numeric_limits<int16_t>::max(), "indent"))
                py::fail();
            PyObject* object = maker.native->tp_alloc(maker.native, 0);
            if (object == nullptr) py::fail();
            auto* logical = reinterpret_cast<contracts::LogicalLineObject*>(object);
            logical->fLineno = static_cast<int32_t>(record.lineno);
            logical->fIndent = static_cast<int16_t>(record.indent);
            logical->fKind = record.kind;
            logical->fTokens = array.items;
            logical->fTokenCount = array.count;
            array.items = nullptr;
            array.count = 0;
            return object;
        }
        py::Ref tuple = py::check(PyTuple_New(array.count));
        for (Py_ssize_t i = 0; i < array.count; ++i) PyTuple_SET_ITEM(tuple.get(), i, array.items[i]);
        array.count = 0;
        py::Ref lineno = py::check(compat::intFromLong(static_cast<long>(record.lineno)));
        py::Ref indent = py::check(compat::intFromLong(static_cast<long>(record.indent)));
        py::Ref kind = py::check(compat::intFromLong(record.kind));
        return PyObject_CallFunctionObjArgs(maker.type, tuple.get(), lineno.get(), indent.get(), kind.get(),
                                            nullptr);
    });
}

template <class Char>
void setScanError(const Scanner<Char>& scanner, TokenMaker<Char>& tokens, PyObject* filename) {
    const ScanError& error = scanner.error();
    py::guarded([&]() -> PyObject* {
        size_t begin = error.textBegin, end = error.textEnd;
        const bool hasText = error.lineText ? splitLine(scanner.text(), scanner.length(), error.lineno, &begin, &end)
                                            : error.hasText;
        py::Ref text = hasText ? py::check(tokens.makeFresh(begin, end)) : py::Ref::none();
        PyObject* type = error.isIndentation() ? PyExc_IndentationError : PyExc_SyntaxError;
        py::Ref args = py::check(Py_BuildValue("(s(OnnO))", error.message(), filename,
                                               static_cast<Py_ssize_t>(error.lineno),
                                               static_cast<Py_ssize_t>(error.offset), text.get()));
        py::Ref exc = py::check(PyObject_Call(type, args.get(), nullptr));
        PyErr_SetObject(type, exc.get());
        return nullptr;
    });
}

template <class Char>
PyObject* makeLogicals(const Scanner<Char>& scanner, TokenMaker<Char>& tokens, const RecordMaker& maker,
                       PyObject* filename) {
    const std::vector<Record>& records = scanner.records();
    py::Ref list = py::Ref::steal(PyList_New(static_cast<Py_ssize_t>(records.size())));
    if (!list) return nullptr;
    for (size_t i = 0; i < records.size(); ++i) {
        PyObject* logical = makeLogical(scanner, records[i], tokens, maker);
        if (logical == nullptr) return nullptr;
        PyList_SET_ITEM(list.get(), static_cast<Py_ssize_t>(i), logical);
    }
    if (scanner.error()) {
        setScanError(scanner, tokens, filename);
        return nullptr;
    }
    return list.release();
}

namespace {

// The objects made so far, released unless handed to a list.
struct Made {
    std::vector<PyObject*> objects;
    ~Made() {
        for (PyObject* o : objects) Py_DECREF(o);
    }
};

template <class Char>
void makeBatch(const Scanner<Char>& scanner, TokenMaker<Char>& tokens, const RecordMaker& maker, Made* made) {
    for (const Record& record : scanner.records()) {
        PyObject* logical = makeLogical(scanner, record, tokens, maker);
        if (logical == nullptr) py::fail();
        made->objects.push_back(logical);
    }
}

// Batches of about this many records keep a batch's spans and records in
// the first-level caches.
constexpr size_t kBatchRecords = 256;
// Texts this long make enough objects for the collector's runs to show.
constexpr size_t kPauseGcAt = 16384;

}  // namespace

template <class Char>
PyObject* readLogicals(Scanner<Char>& scanner, TokenMaker<Char>& tokens, const RecordMaker& maker,
                       PyObject* filename) {
    return py::guarded([&]() -> PyObject* {
        // Only the record type's own slots run while records are made; a
        // callable given in its place runs with the collector as it is.
        const bool pause = scanner.length() >= kPauseGcAt && maker.native != nullptr &&
                           maker.type == reinterpret_cast<PyObject*>(maker.native);
        std::unique_ptr<compat::GcPause> paused(pause ? new compat::GcPause : nullptr);
        Made made;
        made.objects.reserve(scanner.length() / 40 + 16);
        while (scanner.scanRow()) {
            if (scanner.records().size() >= kBatchRecords && !scanner.state().midLogical()) {
                makeBatch(scanner, tokens, maker, &made);
                scanner.clearOutput();
            }
        }
        if (!scanner.error()) scanner.finish();
        makeBatch(scanner, tokens, maker, &made);
        if (scanner.error()) {
            setScanError(scanner, tokens, filename);
            py::fail();
        }
        py::Ref list = py::check(PyList_New(static_cast<Py_ssize_t>(made.objects.size())));
        for (size_t i = 0; i < made.objects.size(); ++i)
            PyList_SET_ITEM(list.get(), static_cast<Py_ssize_t>(i), made.objects[i]);
        made.objects.clear();
        return list.release();
    });
}

template class TokenMaker<uint8_t>;
template PyObject* makeLogical(const Scanner<uint8_t>&, const Record&, TokenMaker<uint8_t>&, const RecordMaker&);
template PyObject* makeLogicals(const Scanner<uint8_t>&, TokenMaker<uint8_t>&, const RecordMaker&, PyObject*);
template PyObject* readLogicals(Scanner<uint8_t>&, TokenMaker<uint8_t>&, const RecordMaker&, PyObject*);
template void setScanError(const Scanner<uint8_t>&, TokenMaker<uint8_t>&, PyObject*);
#if PY_MAJOR_VERSION >= 3
template class TokenMaker<uint16_t>;
template class TokenMaker<uint32_t>;
template PyObject* makeLogical(const Scanner<uint16_t>&, const Record&, TokenMaker<uint16_t>&, const RecordMaker&);
template PyObject* makeLogical(const Scanner<uint32_t>&, const Record&, TokenMaker<uint32_t>&, const RecordMaker&);
template PyObject* makeLogicals(const Scanner<uint16_t>&, TokenMaker<uint16_t>&, const RecordMaker&, PyObject*);
template PyObject* makeLogicals(const Scanner<uint32_t>&, TokenMaker<uint32_t>&, const RecordMaker&, PyObject*);
template void setScanError(const Scanner<uint16_t>&, TokenMaker<uint16_t>&, PyObject*);
template PyObject* readLogicals(Scanner<uint16_t>&, TokenMaker<uint16_t>&, const RecordMaker&, PyObject*);
template PyObject* readLogicals(Scanner<uint32_t>&, TokenMaker<uint32_t>&, const RecordMaker&, PyObject*);
template void setScanError(const Scanner<uint32_t>&, TokenMaker<uint32_t>&, PyObject*);
#endif

}  // namespace reader
