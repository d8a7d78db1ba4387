// The logical-line scanner: text to token spans and logical records, by the
// reader's rules (python/pysource/logicals.py is their documentation: 2.7's
// tokenize.generate_tokens, and its _Records). No Python objects here; the
// builder (builder.hpp) turns spans and records into objects.
//
// Rows are physical lines split at '\n' only. The state a row starts in
// (LineState, 8 bytes) is all the reader carries across a line break
// besides the indentation stack:
//
//   string    none, ', ", ''' or """: the row starts inside a triple-quoted
//             string, or inside a one-line string continued by
//             backslash-newline (the prefix does not matter).
//   needcont  2.7's sticky flag: set by a continued one-line string, cleared
//             when such a string ends at its quote, left set when it fails;
//             it then ends the next multi-line string at the first row that
//             does not end in backslash-newline.
//   cont      the row above ended in backslash-newline outside a string.
//   open      a logical has tokens that no NEWLINE ended (inside brackets,
//             after a continuation, after a failed continued string whose
//             error token took the rest of its row).
//   depth     bracket depth; negative after stray closers: each row then
//             ends its statement but is read as a continuation row (no
//             indentation, no blank or comment records), and the text does
//             not read at its end.
//
// Resuming: a scan may start at any row whose entry state is not
// midLogical(), given the row's 1-based number, its offset in the text, its
// entry state and the indentation stack in force there (for a whole text:
// row 1, offset 0, LineState{}, {0}). Each scanRow() reads one row and
// appends its tokens and records; state() is then the entry state of the
// next row, and a caller may stop at any row boundary where that state is
// not midLogical() (no record is pending there). At the end of the text,
// finish() applies the end-of-text rules: the pending logical of a last row
// without a newline, the blank record of a whitespace-only last row, and the
// EOF errors. rowIndentColumn() is the indentation column of the row just
// read when that row ran the indentation check (clean entry state and not a
// blank or comment row), else -1.
#pragma once

#include "common/grow_buffer.hpp"

#include <cstddef>
#include <cstdint>
#include <vector>

namespace reader {

enum StringKind : uint8_t {
    kNoString = 0,
    kSingleQuote = 1,   // '
    kDoubleQuote = 2,   // "
    kTripleSingle = 3,  // '''
    kTripleDouble = 4,  // """
};

struct LineState {
    uint8_t string = kNoString;
    uint8_t needcont = 0;
    uint8_t cont = 0;
    uint8_t open = 0;
    int32_t depth = 0;

    // A row starting in this state continues a logical begun above.
    bool midLogical() const { return string != kNoString || cont || open || depth > 0; }
    friend bool operator==(const LineState& a, const LineState& b) {
        return a.string == b.string && a.needcont == b.needcont && a.cont == b.cont &&
               a.open == b.open && a.depth == b.depth;
    }
    friend bool operator!=(const LineState& a, const LineState& b) { return !(a == b); }
};
static_assert(sizeof(LineState) == 8, "a row's entry state is 8 bytes");

// Record kinds, as ReadLogicals gives them.
enum RecordKind : uint8_t {
    kOtherRecord = 0,
    kClassRecord = 1,
    kDefRecord = 2,
    kCommentRecord = 21,
    kBlankRecord = 22,
};

// A token: the characters text[begin, end). A multi-row string is one span.
struct TokenSpan {
    size_t begin;
    size_t end;
};

// One logical: tokens[firstToken, firstToken + tokenCount).
struct Record {
    size_t firstToken;
    size_t tokenCount;
    int64_t lineno;
    int64_t indent;  // tabs to the next multiple of 8, a form feed resets
    uint8_t kind;
};

enum class ErrorKind : uint8_t {
    kNone,
    kEofInString,     // SyntaxError
    kEofInStatement,  // SyntaxError
    kIndentation,     // IndentationError
};

// The error that stopped a scan, as the reference raises it: line, offset,
// and the text it names (hasText false: None). For the two EOF errors the
// text is the line of that number when the text is split at '\r\n', '\r'
// and '\n'; for an indentation error, the physical row with its newline.
struct ScanError {
    ErrorKind kind = ErrorKind::kNone;
    int64_t lineno = 0;
    int64_t offset = 0;
    bool hasText = false;
    size_t textBegin = 0;
    size_t textEnd = 0;
    // At an end of text the text is line `lineno` of the text scanned, split
    // at '\r\n', '\r' and '\n': found by splitLine when it is wanted (a
    // document finds it in its own way, and a window's lines are not the
    // text's).
    bool lineText = false;

    explicit operator bool() const { return kind != ErrorKind::kNone; }
    const char* message() const;
    bool isIndentation() const { return kind == ErrorKind::kIndentation; }
};

// Char: uint8_t (2.7 bytes, 3.x one-byte str), uint16_t, uint32_t.
// A scanner's working vectors, kept between scans by a caller that scans
// often (a document at each edit), so that a scan need not allocate them.
struct ScanBuffers {
    std::vector<int64_t> indents;
    PodVector<TokenSpan> tokens;
    std::vector<Record> records;
};

template <class Char>
class Scanner {
public:
    Scanner(const Char* text, size_t length) : text_(text), length_(length) { start(1, 0, LineState{}, nullptr, 0); }
    // Scanning into `buffers`' vectors, handed back when the scanner goes;
    // one a read grew past kKeptItems items is freed rather than kept.
    Scanner(const Char* text, size_t length, ScanBuffers& buffers)
        : text_(text), length_(length), lender_(&buffers) {
        borrow(buffers);
        start(1, 0, LineState{}, nullptr, 0);
    }
    ~Scanner() {
        if (lender_ != nullptr) giveBack(*lender_);
    }
    Scanner(const Scanner&) = delete;
    Scanner& operator=(const Scanner&) = delete;
    static constexpr size_t kKeptItems = 4096;

    // Starts (again) at a row; indents null means the stack {0}. Output
    // vectors are cleared.
    void start(int64_t lineno, size_t offset, LineState entry, const int64_t* indents, size_t indentCount);

    // The text a following start() reads from (a longer copy of it, say).
    void retarget(const Char* text, size_t length) {
        text_ = text;
        length_ = length;
    }

    // Reads one row. False when no row is left, when a whitespace-only last
    // row ended the text, or when an error stopped the scan (error()).
    bool scanRow();
    // The end-of-text rules, once every row is read. False on error.
    bool finish();
    // Every row from where the scan stands, then finish().
    bool scanAll() {
        while (scanRow()) {
        }
        return !error_ && finish();
    }

    LineState state() const;
    bool atEnd() const { return stopped_ || pos_ >= length_; }
    int64_t nextLineno() const { return lnum_ + 1; }
    size_t nextOffset() const { return pos_; }
    int64_t rowIndentColumn() const { return rowIndentColumn_; }
    const std::vector<int64_t>& indents() const { return indents_; }

    const PodVector<TokenSpan>& tokens() const { return tokens_; }
    const std::vector<Record>& records() const { return records_; }
    const ScanError& error() const { return error_; }
    const Char* text() const { return text_; }
    size_t length() const { return length_; }
    // Drops the tokens and records made so far; only where no logical is
    // pending (state() not midLogical()).
    void clearOutput();

private:
    void borrow(ScanBuffers& b) noexcept {
        indents_.swap(b.indents);
        tokens_.swap(b.tokens);
        records_.swap(b.records);
    }
    void giveBack(ScanBuffers& b) noexcept {
        borrow(b);
        trim(b.indents, kKeptItems);
        trim(b.tokens, kKeptItems);
        trim(b.records, kKeptItems);
    }
    template <class T>
    static void trim(std::vector<T>& v, size_t keep) noexcept {
        if (v.capacity() > keep) std::vector<T>().swap(v);
        v.clear();
    }
    template <class T>
    static void trim(PodVector<T>& v, size_t keep) noexcept {
        if (v.capacity() > keep) v.release();
        v.clear();
    }
    void addToken(size_t begin, size_t end, int64_t lineno, size_t rowStart, size_t column);
    void endStatement();
    void addBlank(int64_t lineno, const Char* row, size_t column);
    void failAtEof(ErrorKind kind, int64_t lineno, int64_t offset);
    // A string that runs past its row, from column `column` of row `lineno`.
    void openString(uint8_t kind, size_t rowStart, int64_t lineno, size_t column) {
        string_ = kind;
        strBegin_ = rowStart + column;
        strRowStart_ = rowStart;
        strLineno_ = lineno;
        strColumn_ = column;
    }
    uint8_t kindOfPending() const;
    bool spanIs(const TokenSpan& span, const char* word, size_t n) const;

    const Char* text_;
    size_t length_;
    size_t pos_ = 0;           // offset of the next row
    int64_t lnum_ = 0;         // number of the row last read
    int64_t depth_ = 0;
    bool continued_ = false;
    bool needcont_ = false;
    bool stopped_ = false;     // a whitespace-only last row ended the text
    uint8_t string_ = kNoString;
    // The string being continued: its first character, where it starts.
    size_t strBegin_ = 0;
    size_t strRowStart_ = 0;
    int64_t strLineno_ = 0;
    size_t strColumn_ = 0;
    // The pending logical: tokens_[pendingFirst_, end), where its first
    // token starts.
    size_t pendingFirst_ = 0;
    int64_t firstLineno_ = 0;
    size_t firstRowStart_ = 0;
    size_t firstColumn_ = 0;
    int64_t rowIndentColumn_ = -1;
    std::vector<int64_t> indents_;
    PodVector<TokenSpan> tokens_;  // a long read's many: grown in place
    std::vector<Record> records_;
    ScanError error_;
    ScanBuffers* lender_ = nullptr;  // whose vectors these are, when borrowed
};

// The width of row[0, column) as an indentation: tabs to the next multiple
// of 8, a form feed resets to 0.
template <class Char>
int64_t indentWidth(const Char* row, size_t column);

// Where line `lineno` of the text split at '\r\n', '\r' and '\n' lies (a
// last empty piece is no line). False when there is no such line.
template <class Char>
bool splitLine(const Char* text, size_t length, int64_t lineno, size_t* begin, size_t* end);

extern template class Scanner<uint8_t>;
extern template class Scanner<uint16_t>;
extern template class Scanner<uint32_t>;

}  // namespace reader
