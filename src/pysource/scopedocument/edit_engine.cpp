// Edits: the text changes, the logicals follow it, and one FindChanges call
// names what changed.
//
// A batch of edits is applied to the text in order; every edit is checked
// against the text the ones before it left, and a bad one undoes them all.
// The ranges the batch touched (with what the baseline held there) join the
// damage. The damage is then read again (reread.cpp): when the text reads,
// the logicals that differ from the list's replace them (the same objects
// stay for the rest, with their line numbers shifted), FindChanges names
// them and the cache forgets the changed scopes; when it does not, the list
// stays as the baseline and the damage stays for the next edit.
//
// Python code runs here only in the finder and the cache (the project's own,
// on the document's private list), in the self-check and in the destructors
// of the logicals dropped; `busy` refuses a call that comes back into the
// document meanwhile.
#include "common/messages.hpp"
#include "common/pycompat.hpp"
#include "pysource/scopedocument/document.hpp"

#include <algorithm>

namespace sdoc {


bool gCheckEveryEdit = false;

namespace {

// The number of '\n' among characters [start, end).
size_t newlinesIn(const TextStore& t, size_t start, size_t end) {
    size_t n = 0;
    for (size_t at = t.findNewline(start); at < end; at = t.findNewline(at + 1)) ++n;
    return n;
}

// What an edit took out of the row table, to put back when it is undone.
struct DroppedRows {
    std::vector<RowState> states;
    std::vector<int16_t> columns;
};

// Characters [start, end) of the text replaced by the `n` characters at
// `data`, with the rows following; `restore` gives the states and columns
// of the rows it puts in (an undo).
void replaceText(Document& d, size_t start, size_t end, const void* data, int width, size_t n,
                 const DroppedRows* restore, size_t r0 = kUnknownRow) {
    if (r0 == kUnknownRow) r0 = rowOfOffset(d, start) - 1;
    const size_t removed = newlinesIn(d.text, start, end);
    std::vector<size_t> starts;
    for (size_t i = 0; i < n; ++i) {
        if (charOf(data, width, i) == '\n') starts.push_back(start + i + 1);
    }
    const size_t oldSize = d.text.size();
    const size_t newSize = oldSize - (end - start) + n;
    d.rows.replace(r0, removed, starts, newSize, oldSize, restore ? restore->states.data() : nullptr,
                   restore ? restore->columns.data() : nullptr);
    d.text.replace(start, end, data, width, n);
    d.textCache.reset();
}

bool endsWithNewline(const TextStore& t) { return t.size() > 0 && t.at(t.size() - 1) == '\n'; }

// Widens the damage to cover characters [start, end) of the text as it
// stands before an edit that puts `n` characters there: the ranges it
// meets or touches become one.
void extendDamage(Document& d, size_t start, size_t end, size_t n, size_t newlinesRemoved, size_t newlinesAdded,
                  const DroppedRows& dropped, size_t r0) {
    Damage& g = d.damage;
    if (!g.active()) {
        g.baselineRows = d.rows.count();
        g.baselineEndsWithNewline = endsWithNewline(d.text);
    }
    std::vector<DamageRange>& ranges = g.ranges;
    size_t lo = 0;
    while (lo < ranges.size() && ranges[lo].end < start) ++lo;
    size_t hi = lo;
    while (hi < ranges.size() && ranges[hi].start <= end) ++hi;
    DamageRange merged;
    merged.start = lo < hi ? std::min(start, ranges[lo].start) : start;
    const size_t mergedEnd = lo < hi ? std::max(end, ranges[hi - 1].end) : end;
    size_t at = merged.start;
    for (size_t k = lo; k < hi; ++k) {
        // Between ranges the text is the baseline's.
        d.text.copyOut(at, ranges[k].start, merged.baselineMiddle);
        merged.baselineMiddle.insert(merged.baselineMiddle.end(), ranges[k].baselineMiddle.begin(),
                                     ranges[k].baselineMiddle.end());
        merged.lineDelta += ranges[k].lineDelta;
        merged.droppedMinColumn = std::min(merged.droppedMinColumn, ranges[k].droppedMinColumn);
        merged.rowsDropped += ranges[k].rowsDropped;
        at = ranges[k].end;
    }
    d.text.copyOut(at, mergedEnd, merged.baselineMiddle);
    const long shift = static_cast<long>(n) - static_cast<long>(end - start);
    merged.end = static_cast<size_t>(static_cast<long>(mergedEnd) + shift);
    merged.lineDelta += static_cast<long>(newlinesAdded) - static_cast<long>(newlinesRemoved);
    merged.rowsDropped += dropped.columns.size();
    for (int16_t c : dropped.columns) {
        if (c >= 0) merged.droppedMinColumn = std::min<int64_t>(merged.droppedMinColumn, c);
    }
    // The rows of an edit's own range are known; a range it joins is found
    // again by search.
    const long rowShift = static_cast<long>(newlinesAdded) - static_cast<long>(newlinesRemoved);
    if (lo == hi) {
        merged.startRow = r0;
        merged.endRow = r0 + newlinesAdded;
    }
    for (size_t k = hi; k < ranges.size(); ++k) {
        ranges[k].start = static_cast<size_t>(static_cast<long>(ranges[k].start) + shift);
        ranges[k].end = static_cast<size_t>(static_cast<long>(ranges[k].end) + shift);
        if (ranges[k].startRow != kUnknownRow) {
            ranges[k].startRow = static_cast<size_t>(static_cast<long>(ranges[k].startRow) + rowShift);
            ranges[k].endRow = static_cast<size_t>(static_cast<long>(ranges[k].endRow) + rowShift);
        }
    }
    ranges.erase(ranges.begin() + static_cast<std::ptrdiff_t>(lo), ranges.begin() + static_cast<std::ptrdiff_t>(hi));
    ranges.insert(ranges.begin() + static_cast<std::ptrdiff_t>(lo), std::move(merged));
}

struct Undo {
    size_t start;
    size_t length;  // of the text put in
    std::vector<uint32_t> removed;
    DroppedRows rows;
};

void undoAll(Document& d, std::vector<Undo>& undo, const Damage& saved) {
    for (size_t k = undo.size(); k-- > 0;) {
        const Undo& u = undo[k];
        replaceText(d, u.start, u.start + u.length, u.removed.data(), 4, u.removed.size(), &u.rows);
    }
    undo.clear();
    d.damage = saved;
}

// Applies the batch to the text, keeping in `undo` what puts it back; on a
// bad edit restores text, rows and damage and rethrows.
void applyToText(Document& d, EditRequests requests, bool utf16, std::vector<Undo>& undo) {
    const Damage saved = d.damage;
    undo.reserve(requests.size());
    try {
        for (const EditRequest& request : requests) {
            size_t r0 = 0, r1 = 0;
            const size_t start = offsetOf(d, request.startLine, request.startColumn, utf16, "start", &r0);
            const size_t end = offsetOf(d, request.endLine, request.endColumn, utf16, "end", &r1);
            if (end < start) msg::raise(PyExc_ValueError, "the range ends before it starts");
            const compat::CharsView chars = compat::strChars(request.text);
            const size_t n = static_cast<size_t>(chars.length);
            size_t added = 0;
            for (size_t i = 0; i < n; ++i) added += charOf(chars.data, chars.width, i) == '\n';
            Undo u{start, n, {}, {}};
            d.text.copyOut(start, end, u.removed);
            const size_t removedNewlines = r1 - r0;
            for (size_t r = r0 + 1; r <= r0 + removedNewlines; ++r) {
                u.rows.states.push_back(d.rows.state(r));
                u.rows.columns.push_back(d.rows.column(r));
            }
            extendDamage(d, start, end, n, removedNewlines, added, u.rows, r0);
            replaceText(d, start, end, chars.data, chars.width, n, nullptr, r0);
            undo.push_back(std::move(u));
        }
    } catch (...) {
        undoAll(d, undo, saved);
        throw;
    }
}

// The source as the document keeps it: the interpreter's str.
py::Ref sourceText(PyObject* source, PyObject* filename) {
    if (compat::kPython3) {
        if (compat::isStr(source)) return py::Ref::own(source);
        if (PyBytes_Check(source) || PyByteArray_Check(source)) {
            py::Ref decoded = py::check(
                PyObject_CallFunctionObjArgs(gImports.decodeSource, source, filename, nullptr));
            // The decoding drops a UTF-8 BOM; the document keeps it, as
            // it keeps one in a str.
            const char* bytes = PyBytes_Check(source) ? PyBytes_AS_STRING(source) : PyByteArray_AS_STRING(source);
            const Py_ssize_t size = PyBytes_Check(source) ? PyBytes_GET_SIZE(source) : PyByteArray_GET_SIZE(source);
            if (size >= 3 && std::memcmp(bytes, "\xef\xbb\xbf", 3) == 0) {
                py::Ref bom = py::check(compat::strFromText("\xef\xbb\xbf"));
                return py::check(PyNumber_Add(bom.get(), decoded.get()));
            }
            return decoded;
        }
        PyErr_Format(PyExc_TypeError, "source must be str or bytes, not %.200s", Py_TYPE(source)->tp_name);
        py::fail();
    }
    if (compat::isStr(source)) return py::Ref::own(source);
    if (compat::isOtherText(source)) return py::check(PyUnicode_AsUTF8String(source));
    PyErr_Format(PyExc_TypeError, "source must be str or unicode, not %.200s", Py_TYPE(source)->tp_name);
    py::fail();
}

py::Ref finishEdit(Document& d, EditOutcome& out) {
    ++d.version;
    py::Ref result = makeEditResult(d, out);
    if (gCheckEveryEdit) selfCheck(d);
    return result;
}


}  // namespace

PyObject* wholeText(Document& d) {
    if (!d.textCache) d.textCache = py::Ref::steal(d.text.slice(0, d.text.size()));
    return d.textCache.get();
}

void openDocument(Document& d, PyObject* source, PyObject* filename) {
    BusyGuard busy(d);
    py::Ref text = sourceText(source, filename);
    const compat::CharsView chars = compat::strChars(text.get());
    d.text.assign(chars.data, chars.width, static_cast<size_t>(chars.length));
    d.rows.assign(d.text);
    d.textCache.reset();
    d.filename = py::Ref::own(filename);
    d.list = py::check(PyList_New(0));
    d.error.reset();
    d.damage.reset();
    d.stats = EditStats();
    d.version = 0;
    py::Ref fresh = readWhole(d, chars.width == d.text.width() ? chars.data : nullptr);
    if (fresh) {
        py::checkStatus(PyList_SetSlice(d.list.get(), 0, 0, fresh.get()));
        d.readable = true;
    } else {
        // The baseline is the empty text.
        DamageRange all;
        all.start = 0;
        all.end = d.text.size();
        all.lineDelta = static_cast<long>(d.rows.count()) - 1;
        d.damage.ranges.push_back(std::move(all));
        d.damage.baselineRows = 1;
        d.damage.baselineEndsWithNewline = false;
    }
    d.finder = py::check(PyObject_CallFunctionObjArgs(gImports.changeFinder, d.list.get(), nullptr));
    py::Ref none = py::check(PyList_New(0));
    py::Ref whole = py::check(compat::callMethod(d.finder.get(), gImports.findChanges, d.list.get(), none.get()));
    d.stats.findChangesCalled = true;
    d.cache = py::check(PyObject_CallFunctionObjArgs(gImports.bodyCache, d.list.get(), nullptr));
}

py::Ref applyEdits(Document& d, EditRequests requests, bool utf16) {
    BusyGuard busy(d);
    const EditStats before = d.stats;
    d.stats = EditStats();
    d.stats.edits = requests.size();
    const Damage saved = d.damage;
    std::vector<Undo> undo;
    try {
        applyToText(d, requests, utf16, undo);
    } catch (...) {
        d.stats = before;
        throw;
    }
    EditOutcome out;
    if (!undo.empty()) {
        try {
            // Anything the reader raises but its SyntaxErrors (a record
            // out of the record type's range, no memory) puts the text back.
            reread(d, out);
        } catch (...) {
            if (d.list && !out.added) {
                py::SavedError pending;
                undoAll(d, undo, saved);
                d.stats = before;
                pending.restore();
            }
            throw;
        }
    }
    if (!out.added) out.added = py::check(PyList_New(0));
    if (!out.removed) out.removed = py::check(PyList_New(0));
    return finishEdit(d, out);
}

py::Ref setText(Document& d, PyObject* source) {
    requireEditText(source);
    const compat::CharsView chars = compat::strChars(source);
    const size_t n = static_cast<size_t>(chars.length);
    const size_t old = d.text.size();
    const size_t head = d.text.commonPrefix(chars.data, chars.width, n);
    const size_t tail = d.text.commonSuffix(chars.data, chars.width, n, head);
    // The one edit, in lines and columns of the current text.
    const size_t startRow = rowOfOffset(d, head) - 1;
    const size_t endRow = rowOfOffset(d, old - tail) - 1;
    py::Ref middle = py::check(compat::strFromWidth(
        static_cast<const uint8_t*>(chars.data) + head * chars.width, chars.width, n - tail - head));
    py::Ref sl = py::check(compat::intFromSsize(startRow + 1));
    py::Ref sc = py::check(compat::intFromSsize(head - d.rows.start(startRow, old)));
    py::Ref el = py::check(compat::intFromSsize(endRow + 1));
    py::Ref ec = py::check(compat::intFromSsize(old - tail - d.rows.start(endRow, old)));
    std::vector<EditRequest> requests{{sl.get(), sc.get(), el.get(), ec.get(), middle.get()}};
    if (head == old && head == n) requests.clear();
    return applyEdits(d, requests, false);
}

}  // namespace sdoc
