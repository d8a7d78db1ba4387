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

// A row keeps the state in 16 bits: the string kind in 3 bits, the three
// flags, and the bracket depth in the other 10. A row at a deeper depth is
// inside brackets (never a place to start or stop a read) and one below
// -512 is in a text that does not read (read to its end at each edit
// anyway), so such a depth is kept as kEscaped, which no read starts from
// and no read converges on.
constexpr uint16_t kEscaped = 7;
constexpr int32_t kDepthLimit = 1 << 9;

RowState pack(const LineState& s) noexcept {
    RowState r;
    if (s.depth >= kDepthLimit || s.depth < -kDepthLimit) {
        r.bits = kEscaped;
        return r;
    }
    r.bits = static_cast<uint16_t>(uint32_t{s.string} | uint32_t{s.needcont} << 3 | uint32_t{s.cont} << 4 |
                                   uint32_t{s.open} << 5 | static_cast<uint32_t>(s.depth) << 6);
    return r;
}

bool escaped(const RowState& r) noexcept { return (r.bits & 7u) == kEscaped; }

LineState unpack(const RowState& r) noexcept {
    LineState s;
    s.string = static_cast<uint8_t>(r.bits & 7u);
    s.needcont = static_cast<uint8_t>(r.bits >> 3 & 1u);
    s.cont = static_cast<uint8_t>(r.bits >> 4 & 1u);
    s.open = static_cast<uint8_t>(r.bits >> 5 & 1u);
    s.depth = static_cast<int16_t>(r.bits) >> 6;
    return s;
}

// A read may start at a row whose state continues no logical.
bool startsClean(const RowState& r) noexcept { return !escaped(r) && !unpack(r).midLogical(); }

// A whole read leaves a copy of the text behind; it goes when the read does.
struct CopyReleased {
    TextStore& text;
    ~CopyReleased() { text.releaseCopy(); }
};

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

// The first index of the list, from `lo` on, whose logical is at or after
// `lineno`.
Py_ssize_t lowerBound(PyObject* list, Py_ssize_t lo, int64_t lineno) {
    Py_ssize_t hi = PyList_GET_SIZE(list);
    while (lo < hi) {
        const Py_ssize_t mid = lo + (hi - lo) / 2;
        if (record(PyList_GET_ITEM(list, mid))->fLineno < lineno) lo = mid + 1;
        else hi = mid;
    }
    return lo;
}

// The same when the index is likely near `lo`: the bounds double from there
// (a group's old logicals are few, and their items are near each other).
Py_ssize_t lowerBoundNear(PyObject* list, Py_ssize_t lo, int64_t lineno) {
    const Py_ssize_t n = PyList_GET_SIZE(list);
    Py_ssize_t step = 1;
    Py_ssize_t hi = lo;
    while (hi < n && record(PyList_GET_ITEM(list, hi))->fLineno < lineno) {
        lo = hi + 1;
        hi += step;
        step *= 2;
    }
    hi = std::min(hi, n);
    while (lo < hi) {
        const Py_ssize_t mid = lo + (hi - lo) / 2;
        if (record(PyList_GET_ITEM(list, mid))->fLineno < lineno) lo = mid + 1;
        else hi = mid;
    }
    return lo;
}

// The indentation stack at the start of row r: the successive least columns
// walking up from it (each row that ran the check left the stack as the
// columns below its own, then its own). Rows from `unchangedAbove` on may
// have changed since the last edit.
std::vector<int64_t> stackAt(Document& d, size_t r, size_t unchangedAbove) {
    std::vector<int64_t> down;
    down.reserve(32);
    int64_t limit = INT64_MAX;
    // The stack kept from the last edit holds while no row above its own
    // has changed since: the damage starts below it.
    const StackCache& cache = d.stackCache;
    const bool cached = cache.valid && cache.row <= r && cache.row <= unchangedAbove;
    const size_t stop = cached ? cache.row : 0;
    for (size_t j = r; limit > 0;) {
        j = d.rows.lastBelow(j, static_cast<int32_t>(std::min<int64_t>(limit, INT16_MAX + 1)));
        if (j == RowTable::kNone || j < stop) break;
        limit = d.rows.column(j);
        down.push_back(limit);
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
    const Char* p = static_cast<const Char*>(d.text.contiguous(bom, d.text.size()));
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

enum class Walk { kAgreed, kStopped, kError };

// Rows [from, until): each column checked against the new `stack` (kept up
// to date) until one is at most `limit`, where the old and the new stacks
// agree again (kAgreed). kStopped when `until` comes first; kError, with the
// document's error set, at a dedent to a column not on the stack.
Walk walkRows(Document& d, std::vector<int64_t>& stack, size_t from, size_t until, int64_t limit) {
    const size_t count = d.rows.count();
    const size_t n = d.text.size();
    for (size_t j = from; j < until; ++j) {
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
                return Walk::kError;
            }
            stack.pop_back();
        }
        if (c <= limit) return Walk::kAgreed;
    }
    return Walk::kStopped;
}

// The logicals are the document's own, but a caller holding one can set its
// line number. Around the re-read ones they must still be in order, or the
// place found for them would be wrong.
void requireInOrder(PyObject* list, Py_ssize_t i0, Py_ssize_t i1) {
    const Py_ssize_t n = PyList_GET_SIZE(list);
    const Py_ssize_t from = i0 > 0 ? i0 - 1 : 0;
    const Py_ssize_t to = std::min(n, i1 + 2);
    for (Py_ssize_t k = from; k + 1 < to; ++k) {
        const int32_t a = record(PyList_GET_ITEM(list, k))->fLineno;
        const int32_t b = record(PyList_GET_ITEM(list, k + 1))->fLineno;
        if (a > b) {
            PyErr_Format(PyExc_RuntimeError,
                         "the document's logicals were changed from outside (line %d before line %d); "
                         "the edit is not made (SelfCheck() describes the difference)",
                         static_cast<int>(a), static_cast<int>(b));
            py::fail();
        }
    }
}

// `items` (a list of its own) at the end of `list`; the first non-empty
// one becomes the list.
void appendTo(py::Ref& list, py::Ref items) {
    if (PyList_GET_SIZE(list.get()) == 0) list = std::move(items);
    else py::checkStatus(PyList_SetSlice(list.get(), PY_SSIZE_T_MAX, PY_SSIZE_T_MAX, items.get()));
}

void shiftLines(PyObject* list, Py_ssize_t from, Py_ssize_t to, long delta) {
    if (delta == 0) return;
    PyObject** items = &PyList_GET_ITEM(list, 0);
    for (Py_ssize_t i = from; i < to; ++i) record(items[i])->fLineno += static_cast<int32_t>(delta);
}

void clearCache(Document& d, PyObject* changes) {
    for (Py_ssize_t k = 0; k < 3; ++k) {
        PyObject* set = PyTuple_GET_ITEM(changes, k);
        if (PySet_GET_SIZE(set) == 0) continue;
        py::check(compat::callMethod(d.cache.get(), gImports.clear, set));
    }
}

// A new finder and cache, and the whole list named again; quietly leaves
// things as they are when that fails too. (Dropping a name set from
// outside may run its destructor; `busy` holds the document meanwhile.)
void renameWhole(Document& d) noexcept {
    // From no names at all: a name set from outside may be what failed.
    PyObject* list = d.list.get();
    for (Py_ssize_t i = 0; i < PyList_GET_SIZE(list); ++i) {
        LogicalLineObject* l = record(PyList_GET_ITEM(list, i));
        py::storeSlot(&l->fScopeName, nullptr);
        py::storeSlot(&l->fLocalScopeName, nullptr);
    }
    PyObject* finder = PyObject_CallFunctionObjArgs(gImports.changeFinder, d.list.get(), nullptr);
    PyObject* none = finder ? PyList_New(0) : nullptr;
    PyObject* named = none ? compat::callMethod(finder, gImports.findChanges, d.list.get(), none) : nullptr;
    PyObject* cache = named ? PyObject_CallFunctionObjArgs(gImports.bodyCache, d.list.get(), nullptr) : nullptr;
    if (cache != nullptr) {
        d.finder = py::Ref::steal(finder);
        d.cache = py::Ref::steal(cache);
        finder = nullptr;
    }
    Py_XDECREF(finder);
    Py_XDECREF(none);
    Py_XDECREF(named);
    PyErr_Clear();
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
    d.stats.logicalsMade += records.size();
    return list;
}

template <class Char>
py::Ref readWholeAs(Document& d, const void* source) {
    const size_t bom = bomLength(d);
    const size_t length = d.text.size() - bom;
    const Char* p = source ? static_cast<const Char*>(source) + bom
                           : static_cast<const Char*>(d.text.contiguous(bom, d.text.size()));
    Scanner<Char> scanner(p, length);
    const size_t count = d.rows.count();
    size_t row = 0;
    d.rows.state(0) = pack(scanner.state());
    while (scanner.scanRow()) {
        d.rows.setColumn(row, columnOf(scanner.rowIndentColumn()));
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
    return makeLogicals(scanner, p, d);
}

// The rows read again for one or more damage ranges (a read that runs into
// the next range takes it in), and what they read into.
struct GroupRead {
    size_t first = 0;
    size_t end = 0;  // rows [first, end) read: to the row it converged at, or all
    bool converged = false;
    bool stopped = false;  // a last row of only whitespace ended the text
    long lineDelta = 0;    // rows its ranges added
    std::vector<RowState> states;
    std::vector<int16_t> columns;
    std::vector<int64_t> stack;  // in force at `first`
    py::Ref fresh;               // its logicals
    Py_ssize_t i0 = 0;           // its old logicals in the list: [i0, i1)
    Py_ssize_t i1 = 0;
};

// Reads the groups of damage ranges in text order. Nothing of the document
// changes until every group reads; the text stops at the first that does
// not. Then each group's logicals replace its old ones, top to bottom: a
// removed logical carries the line number the groups above it left, as the
// editing protocol has it, and one FindChanges call takes them all.
template <class Char>
void rereadAs(Document& d, EditOutcome& out) {
    Damage& g = d.damage;
    const size_t n = d.text.size();
    const size_t count = d.rows.count();
    const std::vector<DamageRange>& ranges = g.ranges;
    const size_t rangeCount = ranges.size();
    // Where each range starts, and the first row after it (from there the
    // rows are the baseline's, shifted).
    std::vector<size_t>& startRow = d.scratch.startRow;
    std::vector<size_t>& afterRow = d.scratch.afterRow;
    startRow.resize(rangeCount);
    afterRow.resize(rangeCount);
    for (size_t k = 0; k < rangeCount; ++k) {
        const bool known = ranges[k].startRow != kUnknownRow;
        startRow[k] = known ? ranges[k].startRow : rowOfOffset(d, ranges[k].start) - 1;
        afterRow[k] = (known ? ranges[k].endRow : rowOfOffset(d, ranges[k].end) - 1) + 1;
    }
    auto cleanAbove = [&](size_t r) {
        while (r > 0 && !startsClean(d.rows.state(r))) --r;
        return r;
    };
    auto region = [&](const std::vector<GroupRead>& groups) {
        long delta = 0;
        for (const GroupRead& G : groups) delta += G.lineDelta;
        const GroupRead& last = groups.back();
        out.regionFirstLine = groups.front().first + 1;
        out.regionNewLines = last.end - groups.front().first;
        out.regionOldLines = static_cast<size_t>(static_cast<long>(out.regionNewLines) - delta);
    };

    std::vector<GroupRead> groups;
    // The stacks below the rows read may differ until a row's column is at
    // most `pending`; a walk cut short by the next group hands its stack on.
    int64_t pending = INT64_MAX;
    bool carry = false;
    std::vector<int64_t> carried;
    for (size_t j = 0; j < rangeCount;) {
        groups.emplace_back();
        GroupRead& G = groups.back();
        G.first = cleanAbove(startRow[j]);
        G.stack = carry ? std::move(carried) : stackAt(d, G.first, startRow[0]);
        carry = false;
        size_t last = j;
        size_t comparable = afterRow[j];
        bool sameRows = true;
        int64_t droppedLeast = INT64_MAX;
        auto takeIn = [&](size_t k) {
            G.lineDelta += ranges[k].lineDelta;
            sameRows = sameRows && ranges[k].lineDelta == 0 && ranges[k].rowsDropped == 0;
            droppedLeast = std::min(droppedLeast, ranges[k].droppedMinColumn);
        };
        const size_t base = d.rows.start(G.first, n) + (G.first == 0 ? bomLength(d) : 0);
        // The scanner reads a window of whole rows, in place when one chunk
        // of the text holds it. The rows in a window read as they do in the
        // whole text, but its end is no end: a read that runs out of its
        // window goes on in one eight times as large, from the same base, so
        // that what it has read stays valid.
        size_t windowRows = 16 + 2 * (afterRow[j] - G.first);
        auto windowEnd = [&] { return G.first + windowRows >= count ? n : d.rows.start(G.first + windowRows, n); };
        size_t end = windowEnd();
        const Char* p = static_cast<const Char*>(d.text.contiguous(base, end));
        // Into the document's buffers: what an edit reads is small, so they
        // are kept for the next one unless a read made them large.
        Scanner<Char> scanner(p, end - base, d.scratch.scan);
        scanner.start(static_cast<int64_t>(G.first) + 1, 0, unpack(d.rows.state(G.first)), G.stack.data(),
                      G.stack.size());
        takeIn(j);
        size_t row = G.first;
        for (;;) {
            while (scanner.scanRow()) {
                G.columns.push_back(columnOf(scanner.rowIndentColumn()));
                ++row;
                const LineState s = scanner.state();
                G.states.push_back(pack(s));
                // A range that starts in a row read joins this read.
                while (last + 1 < rangeCount && row > startRow[last + 1]) {
                    takeIn(++last);
                    comparable = afterRow[last];
                }
                if (row >= comparable && row < count && !s.midLogical() && pack(s) == d.rows.state(row) &&
                    !escaped(d.rows.state(row))) {
                    G.converged = true;
                    break;
                }
                // So does one that starts in the next row, unless the read
                // stops above it.
                while (last + 1 < rangeCount && row >= startRow[last + 1]) {
                    takeIn(++last);
                    comparable = afterRow[last];
                }
            }
            if (G.converged || scanner.error() || end == n) break;
            windowRows *= 8;
            end = windowEnd();
            p = static_cast<const Char*>(d.text.contiguous(base, end));
            scanner.retarget(p, end - base);
        }
        G.stopped = !G.converged && !scanner.error() && scanner.atEnd() && row < count && d.rows.start(row, n) < n;
        d.stats.rowsScanned += row - G.first + (G.stopped ? 1 : 0);
        if (!G.converged) {
            while (last + 1 < rangeCount) takeIn(++last);
            if (!scanner.error()) scanner.finish();
        }
        G.end = G.converged ? row : count;
        if (scanner.error()) {
            region(groups);
            setUnreadable(d, scanError(d, scanner, base));
            return;
        }
        if (G.converged) {
            // Typing that keeps every row's column leaves the stacks alone.
            bool sameColumns = sameRows;
            int64_t least = INT64_MAX;
            int64_t leastOld = droppedLeast;
            for (size_t r = G.first; r < row; ++r) {
                const int16_t mine = G.columns[r - G.first];
                const int16_t old = d.rows.column(r);
                sameColumns = sameColumns && mine == old;
                if (mine >= 0) least = std::min<int64_t>(least, mine);
                if (old >= 0) leastOld = std::min<int64_t>(leastOld, old);
            }
            if (!sameColumns) pending = std::min(pending, std::min(least, leastOld));
        }
        // Made now: the next group's read may reuse the copy.
        G.fresh = makeLogicals(scanner, p, d);
        j = last + 1;
        if (G.converged && pending != INT64_MAX) {
            const size_t until = j < rangeCount ? cleanAbove(startRow[j]) : count;
            std::vector<int64_t> stack = scanner.indents();
            const Walk walk = walkRows(d, stack, row, until, pending);
            if (walk == Walk::kError) {
                region(groups);
                return;
            }
            if (walk == Walk::kAgreed || j == rangeCount) {
                pending = INT64_MAX;
            } else {
                carry = true;
                carried = std::move(stack);
            }
        }
    }

    // The text reads. Each group's old logicals, in the baseline's line
    // numbers, found before anything moves.
    PyObject* list = d.list.get();
    long delta = 0;
    Py_ssize_t from = 0;
    for (GroupRead& G : groups) {
        G.i0 = lowerBound(list, from, static_cast<int64_t>(G.first) - delta + 1);
        G.i1 = G.converged ? lowerBoundNear(list, G.i0, static_cast<int64_t>(G.end) - delta - G.lineDelta + 1)
                           : PyList_GET_SIZE(list);
        requireInOrder(list, G.i0, G.i1);
        from = G.i1;
        delta += G.lineDelta;
    }
    region(groups);

    out.added = py::check(PyList_New(0));
    out.removed = py::check(PyList_New(0));
    delta = 0;
    Py_ssize_t offset = 0;   // how far the splices above moved the list's items
    Py_ssize_t current = 0;  // items before this carry current line numbers
    for (GroupRead& G : groups) {
        PyObject* fresh = G.fresh.get();
        const Py_ssize_t a0 = G.i0 + offset;
        const Py_ssize_t a1 = G.i1 + offset;
        const Py_ssize_t m = PyList_GET_SIZE(fresh);
        Py_ssize_t head = 0;
        while (head < m && a0 + head < a1) {
            PyObject* a = PyList_GET_ITEM(list, a0 + head);
            PyObject* b = PyList_GET_ITEM(fresh, head);
            if (record(a)->fLineno + delta != record(b)->fLineno || !sameSignature(a, b)) break;
            ++head;
        }
        Py_ssize_t tail = 0;
        while (tail < m - head && tail < a1 - a0 - head &&
               sameSignature(PyList_GET_ITEM(list, a1 - 1 - tail), PyList_GET_ITEM(fresh, m - 1 - tail))) {
            ++tail;
        }
        shiftLines(list, current, a0 + head, delta);
        for (Py_ssize_t k = 1; k <= tail; ++k) {
            record(PyList_GET_ITEM(list, a1 - k))->fLineno = record(PyList_GET_ITEM(fresh, m - k))->fLineno;
        }
        py::Ref removed = py::check(PyList_GetSlice(list, a0 + head, a1 - tail));
        shiftLines(removed.get(), 0, PyList_GET_SIZE(removed.get()), delta);
        py::Ref added = py::check(PyList_GetSlice(fresh, head, m - tail));
        py::checkStatus(PyList_SetSlice(list, a0 + head, a1 - tail, added.get()));
        appendTo(out.removed, std::move(removed));
        appendTo(out.added, std::move(added));
        current = a0 + m;
        offset += m - (a1 - a0);
        delta += G.lineDelta;
    }
    shiftLines(list, current, PyList_GET_SIZE(list), delta);
    d.stats.logicalsRemoved = static_cast<size_t>(PyList_GET_SIZE(out.removed.get()));
    d.stats.logicalsShifted = static_cast<size_t>(PyList_GET_SIZE(list) - current);

    // The rows read take their new states and columns.
    for (const GroupRead& G : groups) {
        // A row the scanner never reached (the empty one after a last '\n')
        // runs no check.
        for (size_t r = G.first; r < G.end; ++r) {
            d.rows.setColumn(r, r - G.first < G.columns.size() ? G.columns[r - G.first] : kNoIndentCheck);
        }
        for (size_t r = G.first + 1; r < G.end && r - G.first - 1 < G.states.size(); ++r) {
            d.rows.state(r) = G.states[r - G.first - 1];
        }
        if (G.stopped) d.rows.setColumn(G.end - 1, kNoIndentCheck);
    }
    d.stackCache.valid = true;
    d.stackCache.row = groups.front().first;
    d.stackCache.stack = std::move(groups.front().stack);
    d.readable = true;
    d.error.reset();
    d.damage.reset();

    py::Ref result =
        py::Ref::steal(compat::callMethod(d.finder.get(), gImports.findChanges, out.added.get(), out.removed.get()));
    if (!result || !PyTuple_Check(result.get()) || PyTuple_GET_SIZE(result.get()) != 3) {
        // The list has moved on: rather than names of no text, the names of
        // a whole pass (a new finder and cache), and the error raised.
        if (result) PyErr_SetString(PyExc_SystemError, "FindChanges did not answer three sets");
        py::SavedError raised;
        renameWhole(d);
        raised.restore();
        py::fail();
    }
    out.changes = std::move(result);
    d.stats.findChangesCalled = true;
    clearCache(d, out.changes.get());
}

template <class Char>
std::string checkRowsAs(Document& d) {
    const size_t bom = bomLength(d);
    const Char* p = static_cast<const Char*>(d.text.contiguous(bom, d.text.size()));
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
    for (; row < count; ++row) {
        if (d.rows.column(row) != kNoIndentCheck) return describe("indentation column", row);
    }
    return std::string();
}

// The rows outside the damage against a whole scan of the last text that
// read: they must hold its states and columns, shifted by the rows the
// damage above them added.
template <class Char>
std::string checkBaselineRowsAs(Document& d, const Char* text, size_t length) {
    const size_t bom = compat::kPython3 ? (length >= 1 && text[0] == 0xFEFF ? 1 : 0)
                                        : (length >= 3 && text[0] == 0xEF && text[1] == 0xBB && text[2] == 0xBF ? 3 : 0);
    Scanner<Char> scanner(text + bom, length - bom);
    std::vector<RowState> states{pack(scanner.state())};
    std::vector<int16_t> columns;
    while (scanner.scanRow()) {
        columns.push_back(columnOf(scanner.rowIndentColumn()));
        states.push_back(pack(scanner.state()));
    }
    const size_t baselineRows = d.damage.baselineRows;
    columns.resize(baselineRows, kNoIndentCheck);
    states.resize(baselineRows, RowState());
    const size_t count = d.rows.count();
    long delta = 0;
    size_t r = 0;
    auto compare = [&](size_t until, bool stateToo) -> std::string {
        for (; r < until && r < count; ++r) {
            const long b = static_cast<long>(r) - delta;
            if (b < 0 || static_cast<size_t>(b) >= baselineRows) return "row " + std::to_string(r + 1) + " has no row in the last text that read";
            if (stateToo && d.rows.state(r) != states[b]) {
                return "row " + std::to_string(r + 1) + ": its entry state is not the last readable text's";
            }
            if (d.rows.column(r) != columns[b]) {
                return "row " + std::to_string(r + 1) + ": its indentation column is not the last readable text's";
            }
            stateToo = true;
        }
        return std::string();
    };
    for (const DamageRange& range : d.damage.ranges) {
        const size_t startRow = rowOfOffset(d, range.start) - 1;
        const size_t afterRow = rowOfOffset(d, range.end);
        std::string problem = compare(startRow, true);
        if (!problem.empty()) return problem;
        // The first damaged row starts as it did; what it holds has changed.
        if (r == startRow && r < count && d.rows.state(r) != states[static_cast<size_t>(static_cast<long>(r) - delta)]) {
            return "row " + std::to_string(r + 1) + ": its entry state is not the last readable text's";
        }
        r = std::max(r, afterRow);
        delta += range.lineDelta;
    }
    return compare(count, true);
}

}  // namespace

std::string checkBaselineRows(Document& d, PyObject* baseline) {
    compat::TextChars chars;
    if (!compat::textChars(baseline, &chars)) py::fail();
    const size_t n = static_cast<size_t>(chars.length);
    switch (chars.kind) {
    case 1: return checkBaselineRowsAs(d, static_cast<const uint8_t*>(chars.data), n);
    case 2: if constexpr (compat::kPython3) return checkBaselineRowsAs(d, static_cast<const uint16_t*>(chars.data), n); break;
    default: if constexpr (compat::kPython3) return checkBaselineRowsAs(d, static_cast<const uint32_t*>(chars.data), n); break;
    }
    return "a 2.7 text holds bytes only";
}

std::string checkRowStates(Document& d) {
    CopyReleased release{d.text};
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

py::Ref readWhole(Document& d, const void* source) {
    CopyReleased release{d.text};
    switch (d.text.width()) {
    case 1: return readWholeAs<uint8_t>(d, source);
    case 2: if constexpr (compat::kPython3) return readWholeAs<uint16_t>(d, source); break;
    default: if constexpr (compat::kPython3) return readWholeAs<uint32_t>(d, source); break;
    }
    msg::raise(PyExc_SystemError, "a 2.7 text holds bytes only");
}

void reread(Document& d, EditOutcome& out) {
    CopyReleased release{d.text};
    switch (d.text.width()) {
    case 1: return rereadAs<uint8_t>(d, out);
    case 2: if constexpr (compat::kPython3) return rereadAs<uint16_t>(d, out); break;
    default: if constexpr (compat::kPython3) return rereadAs<uint32_t>(d, out); break;
    }
    msg::raise(PyExc_SystemError, "a 2.7 text holds bytes only");
}

}  // namespace sdoc
