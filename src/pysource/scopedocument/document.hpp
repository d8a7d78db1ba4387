// CScopeDocument: a text, the logicals it reads into, and their scope names,
// kept up to date edit by edit.
//
// What holds between calls:
// - `text` is the current text; `rows` has one row per physical line of it.
// - When `readable`, `list` holds the logicals of `text` in order, each
//   carrying its current line number and the names a whole-file pass
//   gives; `finder` and `cache` work on that list.
// - When not, `list` is the baseline: the logicals of the last text that
//   read, in that text's line numbers, with their names. `damage` tells
//   where the current text differs from the baseline's.
// - `list` never leaves the document: callers get copies, so the only
//   way it changes is an edit here (`version` counts them).
#pragma once

#include "common/pyref.hpp"
#include "pysource/reader/scanner.hpp"
#include "pysource/scopedocument/text_store.hpp"

#include <climits>
#include <cstdint>
#include <string>
#include <vector>

namespace sdoc {

constexpr size_t kUnknownRow = static_cast<size_t>(-1);

// A part of the current text that differs from the baseline's: current
// characters [start, end) stand where the baseline had `baselineMiddle`.
struct DamageRange {
    size_t start = 0;
    size_t end = 0;
    std::vector<uint32_t> baselineMiddle;
    long lineDelta = 0;  // rows it added (negative: took out)
    // The least indentation column among the baseline's rows that edits
    // took out of the row table (INT64_MAX: none), and how many rows they took.
    int64_t droppedMinColumn = INT64_MAX;
    size_t rowsDropped = 0;
    // The rows holding `start` and `end`, kept while they are known (an
    // edit's own), else kUnknownRow: found again by search.
    size_t startRow = kUnknownRow;
    size_t endRow = kUnknownRow;
};

// Where the current text differs from the baseline's: ranges in text order,
// apart from each other. Between them the text is the baseline's.
struct Damage {
    std::vector<DamageRange> ranges;
    size_t baselineRows = 0;  // rows of the baseline text
    bool baselineEndsWithNewline = false;

    bool active() const noexcept { return !ranges.empty(); }
    void reset() noexcept {  // keeps the vector's room for the next edit
        ranges.clear();
        baselineRows = 0;
        baselineEndsWithNewline = false;
    }
    long lineDelta() const noexcept {
        long delta = 0;
        for (const DamageRange& r : ranges) delta += r.lineDelta;
        return delta;
    }
};

struct EditStats {
    size_t rowsScanned = 0;
    size_t logicalsMade = 0;
    size_t logicalsRemoved = 0;
    size_t logicalsShifted = 0;
    size_t edits = 0;
    bool findChangesCalled = false;
    bool wholeRead = false;
};

// The indentation stack in force at the start of a row, kept from the last
// edit: the next one near it starts from there instead of walking up.
struct StackCache {
    bool valid = false;
    size_t row = 0;
    std::vector<int64_t> stack;
};

// Working vectors an edit reuses from the last one, not allocated anew.
struct Scratch {
    reader::ScanBuffers scan;
    std::vector<size_t> startRow, afterRow;
};

struct Document {
    TextStore text;
    RowTable rows;
    py::Ref filename;
    py::Ref list;
    py::Ref finder;
    py::Ref cache;
    py::Ref error;      // the reader's exception when the text does not read
    py::Ref textCache;  // the whole text as a str, until the next edit
    bool readable = false;
    bool busy = false;
    uint64_t version = 0;
    Damage damage;
    EditStats stats;
    StackCache stackCache;
    Scratch scratch;
};

struct DocumentObject {
    PyObject_HEAD
    Document* doc;
    PyObject* weakrefs;
};

inline Document& documentOf(PyObject* self) noexcept {
    return *reinterpret_cast<DocumentObject*>(self)->doc;
}

// What one edit call did, for its CEditResult.
struct EditOutcome {
    py::Ref added, removed;
    py::Ref changes;  // FindChanges' (contents, class, function), or null
    size_t regionFirstLine = 1, regionOldLines = 0, regionNewLines = 0;
};

// Refuses a call that comes back into the document while it is being
// changed or checked (Python code run meanwhile).
class BusyGuard {
public:
    explicit BusyGuard(Document& d);
    ~BusyGuard() { d_.busy = false; }
    BusyGuard(const BusyGuard&) = delete;
    BusyGuard& operator=(const BusyGuard&) = delete;

private:
    Document& d_;
};

// --- document_type.cpp -----------------------------------------------------------
PyTypeObject* documentType() noexcept;
void readyDocumentType();

// --- positions.cpp -----------------------------------------------------------------
// The character offset of (lineno, column) in the current text, and its
// 0-based row; ValueError for a place outside it. `utf16`: the column
// counts UTF-16 code units.
size_t offsetOf(Document& d, PyObject* lineno, PyObject* column, bool utf16, const char* which, size_t* row);
// The 1-based row holding offset `at`.
size_t rowOfOffset(const Document& d, size_t at);
// Characters of row r (0-based) without its '\n'.
size_t rowLength(const Document& d, size_t r);
// The text an edit puts in: the interpreter's str; TypeError otherwise.
void requireEditText(PyObject* text);

// --- edit_engine.cpp -----------------------------------------------------------------
// Reads `source` into a fresh document state (text, rows, logicals, names).
void openDocument(Document& d, PyObject* source, PyObject* filename);
// One edit as the caller gave it (borrowed; the caller holds them).
struct EditRequest {
    PyObject* startLine;
    PyObject* startColumn;
    PyObject* endLine;
    PyObject* endColumn;
    PyObject* text;
};
// Edits in a row, from a vector or a single one, without a copy.
struct EditRequests {
    const EditRequest* first;
    size_t count;
    EditRequests(const std::vector<EditRequest>& v) noexcept : first(v.data()), count(v.size()) {}
    EditRequests(const EditRequest& one) noexcept : first(&one), count(1) {}
    const EditRequest* begin() const noexcept { return first; }
    const EditRequest* end() const noexcept { return first + count; }
    size_t size() const noexcept { return count; }
};
// Applies the edits in order, each in the coordinates the ones before it
// left, as one change; returns the CEditResult. A bad edit changes nothing.
py::Ref applyEdits(Document& d, EditRequests requests, bool utf16);
// A whole new text as one edit.
py::Ref setText(Document& d, PyObject* source);
// The current text as a str (cached until the next edit).
PyObject* wholeText(Document& d);
// Whether SBC_CHECK_DOCUMENT asks for a self-check after every edit.
extern bool gCheckEveryEdit;

// --- reread.cpp ------------------------------------------------------------------------
// Reads a fresh text whole: rows' states, the logicals (or the error).
// Returns the list of logicals, or null with the document's error set.
// `source`, when given, is the text's characters in the store's width: read
// in place of a copy of the store's.
py::Ref readWhole(Document& d, const void* source = nullptr);
// Reads the damaged part again and, when the text reads, brings the list,
// the names and the cache to it.
void reread(Document& d, EditOutcome& out);
// How the rows' states and columns differ from a whole scan of the text
// (empty when they agree). Only for a text that reads.
std::string checkRowStates(Document& d);
// The same for a text that does not read: the rows outside the damage
// against a whole scan of `baseline`, the last text that read.
std::string checkBaselineRows(Document& d, PyObject* baseline);
// The length of a leading BOM of the text (0 without one).
size_t bomLength(const Document& d);

// --- queries.cpp -----------------------------------------------------------------------
py::Ref getLine(Document& d, PyObject* lineno);
py::Ref scopeAtLine(Document& d, PyObject* lineno);
py::Ref outline(Document& d);
py::Ref logicalsCopy(Document& d);

// --- pickling.cpp ------------------------------------------------------------------------
py::Ref reduceDocument(PyObject* self, Document& d);
// The text of the last readable text (the current one with the damage put
// back).
py::Ref baselineText(Document& d);
void restoreDocument(PyObject* self, PyObject* state);

// --- self_check.cpp ---------------------------------------------------------------------
void selfCheck(Document& d);

// --- edit_result.cpp ---------------------------------------------------------------------
PyTypeObject* editResultType() noexcept;
void readyEditResultType();
py::Ref makeEditResult(Document& d, EditOutcome& outcome);

// --- imports.cpp -------------------------------------------------------------------------
// What the document uses of the other modules, bound at import.
struct Imports {
    PyObject* decodeSource;     // pysource.logicals._SourceText (3.x bytes)
    PyObject* changeFinder;     // pysource.scopebodycache.CChangeFinder
    PyObject* bodyCache;        // pysource.scopebodycache.CScopeBodyCache
    PyObject* fullName;         // pysource.scopebodycache.GetFullNameForScopeDef
    PyTypeObject* logicalType;  // pysource._fastaccess.LogicalLineType
    PyObject* emptyName;        // ""
    PyObject* syntaxError;      // SyntaxError
    PyObject* findChanges;      // method names, interned
    PyObject* clear;
    PyObject* getBodyOfScope;
    PyObject* getScopeDef;
};
extern Imports gImports;
void bindImports();

}  // namespace sdoc
