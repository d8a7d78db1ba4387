// Reading the text again where an edit needs it, with the native scanner.
//
// Every row of the text has its entry state (what the reader carries across
// the line break above it) and, when it ran the indentation check, its
// column. A re-read starts at the first row of the logical holding the
// damage (the nearest row above whose entry state continues no logical) with
// the indentation stack in force there, and stops at the first row after
// the damage whose new entry state is the one it had before and continues
// no logical: from there the reader sees the same state and the same text,
// so every logical below is the same but for its line number.
//
// The indentation stack is not part of the state. It decides only whether a
// dedent is to a column on the stack. Below the re-read rows the new and the
// old stacks agree again at the first row whose column is at most the least
// column of both versions of the re-read rows; the rows down to it are
// checked against the new stack. Typing that keeps every row's column needs
// none of that.
//
// Invariants between edits (the rows outside the damage):
// - rows.state(r) is the entry state of row r, rows.column(r) its column;
// - while the text does not read, these are the baseline's (shifted by the
//   rows the damage added), and the list holds the baseline's logicals.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/contracts/logical_record.hpp"
#include "pysource/reader/builder.hpp"
#include "pysource/reader/scanner.hpp"
#include "pysource/scopedocument/document.hpp"

#include <algorithm>
#include <climits>
#include <cstring>
#include <string>

namespace sdoc {

using contracts::LogicalLineObject;
using reader::ErrorKind;
using reader::LineState;
using reader::Scanner;

namespace {

static_assert(sizeof(LineState) == sizeof(RowState), "a row keeps the scanner's state as it is");

RowState pack(const LineState& s) noexcept {
    RowState r;
    std::memcpy(&r.bits, &s, sizeof s);
    return r;
}

LineState unpack(const RowState& r) noexcept {
    LineState s;
    std::memcpy(static_cast<void*>(&s), &r.bits, sizeof s);
    return s;
}

int16_t columnOf(int64_t c) noexcept {
    if (c < 0) return kNoIndentCheck;
    return c > INT16_MAX ? INT16_MAX : static_cast<int16_t>(c);
}

LogicalLineObject* record(PyObject* o) noexcept { return reinterpret_cast<LogicalLineObject*>(o); }

bool sameSignature(PyObject* a, PyObject* b) noexcept {
    const LogicalLineObject* x = record(a);
    const LogicalLineObject* y = record(b);
    if (x->fKind != y->fKind || x->fIndent != y->fIndent || x->fTokenCount != y->fTokenCount) return false;
    for (Py_ssize_t i = 0; i < x->fTokenCount; ++i) {
        if (!compat::strEqual(x->fTokens[i], y->fTokens[i])) return false;
    }
    return true;
}

// The first index of the list whose logical is at or after `lineno`.
Py_ssize_t lowerBound(PyObject* list, int64_t lineno) {
    Py_ssize_t lo = 0, hi = PyList_GET_SIZE(list);
    while (lo < hi) {
        const Py_ssize_t mid = lo + (hi - lo) / 2;
        if (record(PyList_GET_ITEM(list, mid))->fLineno < lineno) lo = mid + 1;
        else hi = mid;
    }
    return lo;
}

// The indentation stack at the start of row r: the successive least columns
// walking up from it (each row that ran the check left the stack as the
// columns below its own, then its own).
std::vector<int64_t> stackAt(Document& d, size_t r) {
    std::vector<int64_t> down;
    int64_t limit = INT64_MAX;
    const StackCache& cache = d.stackCache;
    const bool cached = cache.valid && cache.row <= r;
    const size_t stop = cached ? cache.row : 0;
    for (size_t j = r; j > stop && limit > 0;) {
        --j;
        const int16_t c = d.rows.column(j);
        if (c >= 0 && c < limit) {
            down.push_back(c);
            limit = c;
        }
    }
    if (limit > 0 && cached) {
        for (auto it = cache.stack.rbegin(); it != cache.stack.rend(); ++it) {
            if (*it < limit) {
                down.push_back(*it);
                limit = *it;
            }
        }
    }
    if (limit > 0) down.push_back(0);
    std::reverse(down.begin(), down.end());
    return down;
}

py::Ref makeError(Document& d, ErrorKind kind, int64_t lineno, int64_t offset, py::Ref text) {
    reader::ScanError e;
    e.kind = kind;
    PyObject* type = kind == ErrorKind::kIndentation ? PyExc_IndentationError : PyExc_SyntaxError;
    py::Ref args = py::check(Py_BuildValue("(s(OnnO))", e.message(), d.filename.get(), static_cast<Py_ssize_t>(lineno),
                                           static_cast<Py_ssize_t>(offset), text ? text.get() : Py_None));
    return py::check(PyObject_Call(type, args.get(), nullptr));
}

// The reader's error for an end of text inside a string or statement: the
// text it names is the line of that number when the text (without its BOM)
// is split at '\r\n', '\r' and '\n'.
template <class Char>
py::Ref eofError(Document& d, const reader::ScanError& error) {
    const size_t bom = bomLength(d);
    if (d.text.carriageReturns() == 0) {
        // Its lines are its rows (a last empty row is no line).
        const size_t count = d.rows.count();
        const size_t n = d.text.size();
        const int64_t lineno = error.lineno;
        py::Ref text;
        if (lineno >= 1 && static_cast<size_t>(lineno) <= count) {
            const size_t r = static_cast<size_t>(lineno - 1);
            const size_t start = d.rows.start(r, n) + (r == 0 ? bom : 0);
            if (r + 1 < count || start < n) {
                text = py::Ref::steal(d.text.slice(start, d.rows.start(r, n) + rowLength(d, r)));
            }
        }
        return makeError(d, error.kind, error.lineno, error.offset, std::move(text));
    }
    const Char* p = static_cast<const Char*>(d.text.contiguousFrom(bom));
    size_t begin = 0, end = 0;
    py::Ref text;
    if (reader::splitLine(p, d.text.size() - bom, error.lineno, &begin, &end)) {
        text = py::Ref::steal(d.text.slice(bom + begin, bom + end));
    }
    return makeError(d, error.kind, error.lineno, error.offset, std::move(text));
}

// The error that stopped `scanner` (reading from offset `base` of the text).
template <class Char>
py::Ref scanError(Document& d, const Scanner<Char>& scanner, size_t base) {
    const reader::ScanError& error = scanner.error();
    if (!error.isIndentation()) return eofError<Char>(d, error);
    py::Ref text = py::Ref::steal(d.text.slice(base + error.textBegin, base + error.textEnd));
    return makeError(d, error.kind, error.lineno, error.offset, std::move(text));
}

void setUnreadable(Document& d, py::Ref error) {
    d.error = std::move(error);
    d.readable = false;
}

// Rows from `from` down: each column checked against `stack` until one is
// at most `limit` (both versions then have the same stack). False, with
// the document's error set, at a dedent to a column not on the stack.
bool checkRowsBelow(Document& d, std::vector<int64_t> stack, size_t from, int64_t limit) {
    const size_t count = d.rows.count();
    const size_t n = d.text.size();
    for (size_t j = from; j < count; ++j) {
        const int64_t c = d.rows.column(j);
        if (c < 0) continue;
        if (c > stack.back()) stack.push_back(c);
        while (c < stack.back()) {
            if (std::find(stack.begin(), stack.end(), c) == stack.end()) {
                const size_t start = d.rows.start(j, n);
                const size_t end = j + 1 < count ? d.rows.start(j + 1, n) : n;
                size_t pos = start;
                while (pos < end) {
                    const uint32_t ch = d.text.at(pos);
                    if (ch != ' ' && ch != '\t' && ch != '\f') break;
                    ++pos;
                }
                py::Ref text = py::Ref::steal(d.text.slice(start, end));
                setUnreadable(d, makeError(d, ErrorKind::kIndentation, static_cast<int64_t>(j) + 1,
                                           static_cast<int64_t>(pos - start), std::move(text)));
                return false;
            }
            stack.pop_back();
        }
        if (c <= limit) return true;
    }
    return true;
}

void shiftBelow(PyObject* list, Py_ssize_t from, long delta) {
    if (delta == 0) return;
    const Py_ssize_t n = PyList_GET_SIZE(list);
    PyObject** items = &PyList_GET_ITEM(list, 0);
    for (Py_ssize_t i = from; i < n; ++i) record(items[i])->fLineno += static_cast<int32_t>(delta);
}

void clearCache(Document& d, PyObject* changes) {
    for (Py_ssize_t k = 0; k < 3; ++k) {
        PyObject* set = PyTuple_GET_ITEM(changes, k);
        if (PySet_GET_SIZE(set) == 0) continue;
        py::check(PyObject_CallMethod(d.cache.get(), const_cast<char*>("Clear"), const_cast<char*>("(O)"), set));
    }
}

template <class Char>
py::Ref makeLogicals(const Scanner<Char>& scanner, const Char* text, Document& d) {
    const auto& records = scanner.records();
    py::Ref list = py::check(PyList_New(static_cast<Py_ssize_t>(records.size())));
    if (records.empty()) return list;
    // The table of shared tokens is sized by the text it serves: the
    // characters the records span, not the text to its end.
    const auto& spans = scanner.tokens();
    const size_t spanned = spans.empty() ? 0 : spans.back().end - spans.front().begin;
    reader::TokenMaker<Char> tokens(text, spanned, false);
    const reader::RecordMaker maker{reinterpret_cast<PyObject*>(gImports.logicalType), gImports.logicalType};
    for (size_t i = 0; i < records.size(); ++i) {
        PyObject* logical = reader::makeLogical(scanner, records[i], tokens, maker);
        if (logical == nullptr) py::fail();
        PyList_SET_ITEM(list.get(), static_cast<Py_ssize_t>(i), logical);
    }
    d.stats.logicalsMade = records.size();
    return list;
}

template <class Char>
py::Ref readWholeAs(Document& d) {
    const size_t bom = bomLength(d);
    const size_t length = d.text.size() - bom;
    const Char* p = static_cast<const Char*>(d.text.contiguousFrom(bom));
    Scanner<Char> scanner(p, length);
    const size_t count = d.rows.count();
    size_t row = 0;
    d.rows.state(0) = pack(scanner.state());
    while (scanner.scanRow()) {
        d.rows.column(row) = columnOf(scanner.rowIndentColumn());
        ++row;
        if (row < count) d.rows.state(row) = pack(scanner.state());
    }
    d.stats.rowsScanned = std::min(count, row + 1);
    d.stats.wholeRead = true;
    if (!scanner.error()) scanner.finish();
    if (scanner.error()) {
        setUnreadable(d, scanError(d, scanner, bom));
        return py::Ref();
    }
    // The text may have moved: the scanner's spans are offsets from `bom`.
    p = static_cast<const Char*>(d.text.contiguousFrom(bom));
    return makeLogicals(scanner, p, d);
}

template <class Char>
void rereadAs(Document& d, EditOutcome& out) {
    Damage& g = d.damage;
    const size_t n = d.text.size();
    const size_t count = d.rows.count();
    size_t first = rowOfOffset(d, g.start) - 1;
    while (first > 0 && unpack(d.rows.state(first)).midLogical()) --first;
    // Rows from `comparable` on are the baseline's rows, shifted.
    const size_t comparable = rowOfOffset(d, g.end);
    std::vector<int64_t> stack = stackAt(d, first);
    const size_t base = d.rows.start(first, n) + (first == 0 ? bomLength(d) : 0);
    const Char* p = static_cast<const Char*>(d.text.contiguousFrom(base));
    Scanner<Char> scanner(p, n - base);
    scanner.start(static_cast<int64_t>(first) + 1, 0, unpack(d.rows.state(first)), stack.data(), stack.size());

    std::vector<RowState> states;
    std::vector<int16_t> columns;
    size_t row = first;
    bool converged = false;
    while (scanner.scanRow()) {
        columns.push_back(columnOf(scanner.rowIndentColumn()));
        ++row;
        const LineState s = scanner.state();
        states.push_back(pack(s));
        if (row >= comparable && row < count && !s.midLogical() && pack(s) == d.rows.state(row)) {
            converged = true;
            break;
        }
    }
    const bool stopped = !converged && !scanner.error() && scanner.atEnd() && row < count &&
                         d.rows.start(row, n) < n;
    d.stats.rowsScanned = row - first + (stopped ? 1 : 0);
    if (!converged && !scanner.error()) scanner.finish();
    const size_t endRow = converged ? row : count;
    const size_t baseEnd = converged ? static_cast<size_t>(static_cast<long>(row) - g.lineDelta) : g.baselineRows;
    out.regionFirstLine = first + 1;
    out.regionOldLines = baseEnd - first;
    out.regionNewLines = endRow - first;
    if (scanner.error()) {
        setUnreadable(d, scanError(d, scanner, base));
        return;
    }

    if (converged) {
        const bool sameRows = g.lineDelta == 0 && g.rowsDropped == 0;
        bool sameColumns = sameRows;
        int64_t least = INT64_MAX;
        int64_t leastOld = g.droppedMinColumn;
        for (size_t r = first; r < row; ++r) {
            const int16_t mine = columns[r - first];
            const int16_t old = d.rows.column(r);
            sameColumns = sameColumns && mine == old;
            if (mine >= 0) least = std::min<int64_t>(least, mine);
            if (old >= 0) leastOld = std::min<int64_t>(leastOld, old);
        }
        const int64_t limit = std::min(least, leastOld);
        if (!sameColumns && limit != INT64_MAX && !checkRowsBelow(d, scanner.indents(), row, limit)) return;
    }

    // The text reads: make the new logicals before anything changes.
    p = static_cast<const Char*>(d.text.contiguousFrom(base));
    py::Ref fresh = makeLogicals(scanner, p, d);
    PyObject* list = d.list.get();
    const Py_ssize_t i0 = lowerBound(list, static_cast<int64_t>(first) + 1);
    const Py_ssize_t i1 = converged ? lowerBound(list, static_cast<int64_t>(baseEnd) + 1) : PyList_GET_SIZE(list);
    const Py_ssize_t m = PyList_GET_SIZE(fresh.get());
    Py_ssize_t head = 0;
    while (head < m && i0 + head < i1) {
        PyObject* a = PyList_GET_ITEM(list, i0 + head);
        PyObject* b = PyList_GET_ITEM(fresh.get(), head);
        if (record(a)->fLineno != record(b)->fLineno || !sameSignature(a, b)) break;
        ++head;
    }
    Py_ssize_t tail = 0;
    while (tail < m - head && tail < i1 - i0 - head &&
           sameSignature(PyList_GET_ITEM(list, i1 - 1 - tail), PyList_GET_ITEM(fresh.get(), m - 1 - tail))) {
        ++tail;
    }
    out.removed = py::check(PyList_GetSlice(list, i0 + head, i1 - tail));
    out.added = py::check(PyList_GetSlice(fresh.get(), head, m - tail));
    for (Py_ssize_t k = 1; k <= tail; ++k) {
        record(PyList_GET_ITEM(list, i1 - k))->fLineno = record(PyList_GET_ITEM(fresh.get(), m - k))->fLineno;
    }
    py::checkStatus(PyList_SetSlice(list, i0 + head, i1 - tail, out.added.get()));
    const Py_ssize_t below = i1 + (m - (i1 - i0));
    shiftBelow(list, below, g.lineDelta);
    d.stats.logicalsRemoved = static_cast<size_t>(PyList_GET_SIZE(out.removed.get()));
    d.stats.logicalsShifted = static_cast<size_t>(PyList_GET_SIZE(list) - below);

    // The rows read take their new states and columns.
    for (size_t r = first; r < endRow && r - first < columns.size(); ++r) d.rows.column(r) = columns[r - first];
    for (size_t r = first + 1; r < endRow && r - first - 1 < states.size(); ++r) {
        d.rows.state(r) = states[r - first - 1];
    }
    if (stopped) d.rows.column(row) = kNoIndentCheck;
    d.stackCache.valid = true;
    d.stackCache.row = first;
    d.stackCache.stack = std::move(stack);
    d.readable = true;
    d.error.reset();
    d.damage = Damage();

    py::Ref result = py::check(PyObject_CallMethod(d.finder.get(), const_cast<char*>("FindChanges"),
                                                   const_cast<char*>("(OO)"), out.added.get(), out.removed.get()));
    if (!PyTuple_Check(result.get()) || PyTuple_GET_SIZE(result.get()) != 3) {
        msg::raise(PyExc_SystemError, "FindChanges did not answer three sets");
    }
    out.changes = std::move(result);
    d.stats.findChangesCalled = true;
    clearCache(d, out.changes.get());
}

template <class Char>
std::string checkRowsAs(Document& d) {
    const size_t bom = bomLength(d);
    const Char* p = static_cast<const Char*>(d.text.contiguousFrom(bom));
    Scanner<Char> scanner(p, d.text.size() - bom);
    const size_t count = d.rows.count();
    size_t row = 0;
    auto describe = [](const char* what, size_t r) {
        return std::string("row ") + std::to_string(r + 1) + ": its " + what + " differs from a whole scan's";
    };
    if (d.rows.state(0) != pack(scanner.state())) return describe("entry state", 0);
    while (scanner.scanRow()) {
        if (d.rows.column(row) != columnOf(scanner.rowIndentColumn())) return describe("indentation column", row);
        ++row;
        if (row < count && d.rows.state(row) != pack(scanner.state())) return describe("entry state", row);
    }
    return std::string();
}

}  // namespace

std::string checkRowStates(Document& d) {
    switch (d.text.width()) {
    case 1: return checkRowsAs<uint8_t>(d);
    case 2: if constexpr (compat::kPython3) return checkRowsAs<uint16_t>(d); break;
    default: if constexpr (compat::kPython3) return checkRowsAs<uint32_t>(d); break;
    }
    return "a 2.7 text holds bytes only";
}

size_t bomLength(const Document& d) {
    const TextStore& t = d.text;
    if (compat::kPython3) return t.size() >= 1 && t.at(0) == 0xFEFF ? 1 : 0;
    return t.size() >= 3 && t.at(0) == 0xEF && t.at(1) == 0xBB && t.at(2) == 0xBF ? 3 : 0;
}

py::Ref readWhole(Document& d) {
    switch (d.text.width()) {
    case 1: return readWholeAs<uint8_t>(d);
    case 2: if constexpr (compat::kPython3) return readWholeAs<uint16_t>(d); break;
    default: if constexpr (compat::kPython3) return readWholeAs<uint32_t>(d); break;
    }
    msg::raise(PyExc_SystemError, "a 2.7 text holds bytes only");
}

void reread(Document& d, EditOutcome& out) {
    switch (d.text.width()) {
    case 1: return rereadAs<uint8_t>(d, out);
    case 2: if constexpr (compat::kPython3) return rereadAs<uint16_t>(d, out); break;
    default: if constexpr (compat::kPython3) return rereadAs<uint32_t>(d, out); break;
    }
    msg::raise(PyExc_SystemError, "a 2.7 text holds bytes only");
}

}  // namespace sdoc
