// The row loop of the scanner. It follows 2.7's tokenize.generate_tokens
// step by step; where a regular expression decides there, the comment next
// to the code says which alternative it stands for. Alternatives are tried
// in the pattern's order (first match wins, not the longest), and the
// patterns' `.` takes any character but '\n'. Character classes are ASCII
// only, as on 2.7's byte strings (and with re.ASCII on 3.x).
#include "pysource/reader/scanner.hpp"

#include <algorithm>
#include <climits>
#include <cstring>

namespace reader {

namespace {

constexpr int64_t kTabSize = 8;
constexpr size_t kNoMatch = static_cast<size_t>(-1);

template <class Char>
inline bool isSpace(Char c) {
    return c == ' ' || c == '\t' || c == '\f';
}
template <class Char>
inline bool isDigit(Char c) {
    return c >= '0' && c <= '9';
}
template <class Char>
inline bool isNameStart(Char c) {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_';
}
template <class Char>
inline bool isNameChar(Char c) {
    return isNameStart(c) || isDigit(c);
}
template <class Char>
inline bool isHexDigit(Char c) {
    return isDigit(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}

template <class Char>
inline size_t skipDigits(const Char* line, size_t i, size_t max) {
    while (i < max && isDigit(line[i])) ++i;
    return i;
}

// [eE][-+]?\d+ at i: its end, or kNoMatch.
template <class Char>
size_t matchExponent(const Char* line, size_t i, size_t max) {
    if (i >= max || (line[i] != 'e' && line[i] != 'E')) return kNoMatch;
    ++i;
    if (i < max && (line[i] == '-' || line[i] == '+')) ++i;
    const size_t digits = skipDigits(line, i, max);
    return digits > i ? digits : kNoMatch;
}

// Floatnumber: (\d+\.\d*|\.\d+)(Exponent)? | \d+Exponent. Backing off a
// greedy part never lets a later part match, so each is taken whole.
template <class Char>
size_t matchFloat(const Char* line, size_t q, size_t max) {
    size_t i = kNoMatch;
    const size_t digits = skipDigits(line, q, max);
    if (digits > q && digits < max && line[digits] == '.') {
        i = skipDigits(line, digits + 1, max);
    } else if (line[q] == '.' && q + 1 < max && isDigit(line[q + 1])) {
        i = skipDigits(line, q + 1, max);
    }
    if (i != kNoMatch) {
        const size_t e = matchExponent(line, i, max);
        return e != kNoMatch ? e : i;
    }
    if (digits > q) return matchExponent(line, digits, max);
    return kNoMatch;
}

template <class Char>
inline size_t optionalLong(const Char* line, size_t i, size_t max) {
    return i < max && (line[i] == 'l' || line[i] == 'L') ? i + 1 : i;
}

// Intnumber: hex, binary, 0o octal (no L), old octal, decimal.
template <class Char>
size_t matchInt(const Char* line, size_t q, size_t max) {
    if (line[q] == '0') {
        const Char x = q + 1 < max ? line[q + 1] : 0;
        const Char y = q + 2 < max ? line[q + 2] : 0;
        if ((x == 'x' || x == 'X') && isHexDigit(y)) {
            size_t i = q + 2;
            while (i < max && isHexDigit(line[i])) ++i;
            return optionalLong(line, i, max);
        }
        if ((x == 'b' || x == 'B') && (y == '0' || y == '1')) {
            size_t i = q + 2;
            while (i < max && (line[i] == '0' || line[i] == '1')) ++i;
            return optionalLong(line, i, max);
        }
        if ((x == 'o' || x == 'O') && y >= '0' && y <= '7') {
            size_t i = q + 2;
            while (i < max && line[i] >= '0' && line[i] <= '7') ++i;
            return i;
        }
        size_t i = q + 1;
        while (i < max && line[i] >= '0' && line[i] <= '7') ++i;
        return optionalLong(line, i, max);
    }
    if (line[q] >= '1' && line[q] <= '9') return optionalLong(line, skipDigits(line, q + 1, max), max);
    return kNoMatch;
}

// Number: \d+[jJ] | Floatnumber[jJ] | Floatnumber | Intnumber.
template <class Char>
size_t matchNumber(const Char* line, size_t q, size_t max) {
    const size_t digits = skipDigits(line, q, max);
    if (digits > q && digits < max && (line[digits] == 'j' || line[digits] == 'J')) return digits + 1;
    const size_t f = matchFloat(line, q, max);
    if (f != kNoMatch) return f < max && (line[f] == 'j' || line[f] == 'J') ? f + 1 : f;
    return matchInt(line, q, max);
}

// Operator, Bracket and the one-character Special tokens at q; kNoMatch for
// none. Newlines are handled by the caller.
template <class Char>
size_t matchOperator(const Char* line, size_t q, size_t max) {
    const Char c = line[q];
    const Char next = q + 1 < max ? line[q + 1] : 0;
    switch (c) {
    case '*':
    case '>':
    case '/':
        // \*\*=?, >>=?, //=?, then [*>/]=?
        if (next == c) return q + 2 < max && line[q + 2] == '=' ? q + 3 : q + 2;
        return next == '=' ? q + 2 : q + 1;
    case '<':
        // <<=?, <>, then <=?
        if (next == '<') return q + 2 < max && line[q + 2] == '=' ? q + 3 : q + 2;
        return next == '>' || next == '=' ? q + 2 : q + 1;
    case '!':
        return next == '=' ? q + 2 : kNoMatch;
    case '+':
    case '-':
    case '%':
    case '&':
    case '|':
    case '^':
    case '=':
        return next == '=' ? q + 2 : q + 1;
    case '~':
    case '(':
    case ')':
    case '[':
    case ']':
    case '{':
    case '}':
    case ':':
    case ';':
    case '.':
    case ',':
    case '`':
    case '@':
        return q + 1;
    default:
        return kNoMatch;
    }
}

// The tail of a string from i, by the quote that opened it: Single, Double,
// Single3, Double3. A backslash escapes any character but '\n', so one
// before a newline (or the end) leaves the tail unmatched.
template <class Char>
size_t matchStringTail(const Char* line, size_t i, size_t max, uint8_t kind) {
    const Char quote = (kind == kSingleQuote || kind == kTripleSingle) ? '\'' : '"';
    const bool triple = kind == kTripleSingle || kind == kTripleDouble;
    while (i < max) {
        const Char c = line[i];
        if (c == '\\') {
            if (i + 1 >= max || line[i + 1] == '\n') return kNoMatch;
            i += 2;
        } else if (c == quote) {
            if (!triple) return i + 1;
            if (i + 2 < max && line[i + 1] == quote && line[i + 2] == quote) return i + 3;
            ++i;
        } else {
            ++i;
        }
    }
    return kNoMatch;
}

enum class OneLine { kNone, kComplete, kContinued };

// ContStr from the quote at i: the string's end, or its continuation by a
// backslash-newline. Only the closing quote or that backslash may end it,
// never a '\n' inside.
template <class Char>
OneLine matchOneLineString(const Char* line, size_t i, size_t max, size_t* end) {
    const Char quote = line[i];
    for (++i; i < max; ++i) {
        const Char c = line[i];
        if (c == quote) {
            *end = i + 1;
            return OneLine::kComplete;
        }
        if (c == '\n') return OneLine::kNone;
        if (c == '\\') {
            if (i + 1 >= max) return OneLine::kNone;
            if (line[i + 1] == '\n') {
                *end = i + 2;
                return OneLine::kContinued;
            }
            // \\. takes the '\r' of a backslash-CRLF, then fails at the '\n';
            // backing off leaves the backslash to \\\r?\n.
            if (line[i + 1] == '\r' && i + 2 < max && line[i + 2] == '\n') {
                *end = i + 3;
                return OneLine::kContinued;
            }
            ++i;
        }
    }
    return OneLine::kNone;
}

template <class Char>
inline bool endsWithBackslashNewline(const Char* line, size_t max) {
    return (max >= 2 && line[max - 1] == '\n' && line[max - 2] == '\\') ||
           (max >= 3 && line[max - 1] == '\n' && line[max - 2] == '\r' && line[max - 3] == '\\');
}

// The length of the row at `line` with its '\n', at most `left`.
template <class Char>
inline size_t rowLength(const Char* line, size_t left) {
    for (size_t i = 0; i < left; ++i)
        if (line[i] == '\n') return i + 1;
    return left;
}

template <>
inline size_t rowLength<uint8_t>(const uint8_t* line, size_t left) {
    const void* newline = std::memchr(line, '\n', left);
    return newline ? static_cast<size_t>(static_cast<const uint8_t*>(newline) - line) + 1 : left;
}

template <class Char>
inline bool isPrefixLetter(Char c) {
    return c == 'u' || c == 'U' || c == 'b' || c == 'B' || c == 'r' || c == 'R';
}

}  // namespace

const char* ScanError::message() const {
    switch (kind) {
    case ErrorKind::kEofInString:
        return "EOF in multi-line string";
    case ErrorKind::kEofInStatement:
        return "EOF in multi-line statement";
    case ErrorKind::kIndentation:
        return "unindent does not match any outer indentation level";
    case ErrorKind::kNone:
        break;
    }
    return "";
}

template <class Char>
int64_t indentWidth(const Char* row, size_t column) {
    int64_t width = 0;
    for (size_t i = 0; i < column; ++i) {
        const Char c = row[i];
        if (c == '\t')
            width = (width / kTabSize + 1) * kTabSize;
        else if (c == '\f')
            width = 0;
        else
            ++width;
    }
    return width;
}

template <class Char>
bool splitLine(const Char* text, size_t length, int64_t lineno, size_t* begin, size_t* end) {
    if (lineno < 1) return false;
    size_t start = 0;
    int64_t line = 1;
    size_t i = 0;
    for (;;) {
        while (i < length && text[i] != '\r' && text[i] != '\n') ++i;
        if (line == lineno) {
            // The piece after the last break is a line only when not empty.
            if (i == length && start == length) return false;
            *begin = start;
            *end = i;
            return true;
        }
        if (i == length) return false;
        i += (text[i] == '\r' && i + 1 < length && text[i + 1] == '\n') ? 2 : 1;
        start = i;
        ++line;
    }
}

template <class Char>
void Scanner<Char>::start(int64_t lineno, size_t offset, LineState entry, const int64_t* indents,
                          size_t indentCount) {
    pos_ = offset;
    lnum_ = lineno - 1;
    depth_ = entry.depth;
    continued_ = entry.cont != 0;
    needcont_ = entry.needcont != 0;
    // A scan starts only where no string, continuation or logical is open.
    string_ = kNoString;
    stopped_ = false;
    rowIndentColumn_ = -1;
    indents_.clear();
    if (indents != nullptr && indentCount > 0)
        indents_.assign(indents, indents + indentCount);
    else
        indents_.push_back(0);
    tokens_.clear();
    records_.clear();
    pendingFirst_ = 0;
    error_ = ScanError{};
}

template <class Char>
void Scanner<Char>::clearOutput() {
    tokens_.clear();
    records_.clear();
    pendingFirst_ = 0;
}

template <class Char>
LineState Scanner<Char>::state() const {
    LineState s;
    s.string = string_;
    s.needcont = needcont_;
    s.cont = continued_;
    s.open = tokens_.size() > pendingFirst_;
    s.depth = static_cast<int32_t>(std::max<int64_t>(INT32_MIN, std::min<int64_t>(INT32_MAX, depth_)));
    return s;
}

template <class Char>
void Scanner<Char>::addToken(size_t begin, size_t end, int64_t lineno, size_t rowStart, size_t column) {
    if (tokens_.size() == pendingFirst_) {
        firstLineno_ = lineno;
        firstRowStart_ = rowStart;
        firstColumn_ = column;
    }
    tokens_.push_back(TokenSpan{begin, end});
}

template <class Char>
bool Scanner<Char>::spanIs(const TokenSpan& span, const char* word, size_t n) const {
    if (span.end - span.begin != n) return false;
    for (size_t i = 0; i < n; ++i)
        if (text_[span.begin + i] != static_cast<unsigned char>(word[i])) return false;
    return true;
}

template <class Char>
uint8_t Scanner<Char>::kindOfPending() const {
    const size_t count = tokens_.size() - pendingFirst_;
    const TokenSpan& first = tokens_[pendingFirst_];
    if (spanIs(first, "def", 3)) return kDefRecord;
    if (spanIs(first, "class", 5)) return kClassRecord;
    if (count > 1 && spanIs(first, "async", 5) && spanIs(tokens_[pendingFirst_ + 1], "def", 3))
        return kDefRecord;
    if (count == 1 && text_[first.begin] == '#') return kCommentRecord;
    return kOtherRecord;
}

template <class Char>
void Scanner<Char>::endStatement() {
    const size_t count = tokens_.size() - pendingFirst_;
    if (count == 0) return;
    records_.push_back(Record{pendingFirst_, count, firstLineno_,
                              indentWidth(text_ + firstRowStart_, firstColumn_), kindOfPending()});
    pendingFirst_ = tokens_.size();
}

template <class Char>
void Scanner<Char>::addBlank(int64_t lineno, const Char* row, size_t column) {
    records_.push_back(Record{tokens_.size(), 0, lineno, indentWidth(row, column), kBlankRecord});
}

template <class Char>
bool Scanner<Char>::scanRow() {
    if (error_ || stopped_ || pos_ >= length_) return false;
    const size_t rowStart = pos_;
    const Char* line = text_ + rowStart;
    const size_t max = rowLength(line, length_ - rowStart);
    pos_ = rowStart + max;
    const int64_t lnum = ++lnum_;
    rowIndentColumn_ = -1;
    size_t p = 0;

    if (string_ != kNoString) {
        const size_t e = matchStringTail(line, 0, max, string_);
        if (e != kNoMatch) {
            addToken(strBegin_, rowStart + e, strLineno_, strRowStart_, strColumn_);
            string_ = kNoString;
            needcont_ = false;
            p = e;
        } else if (needcont_ && !endsWithBackslashNewline(line, max)) {
            // The continued one-line string fails: one error token up to the
            // end of this row, and no NEWLINE. needcont stays set.
            addToken(strBegin_, rowStart + max, strLineno_, strRowStart_, strColumn_);
            string_ = kNoString;
            return true;
        } else {
            return true;
        }
    } else if (depth_ == 0 && !continued_) {
        int64_t column = 0;
        for (; p < max; ++p) {
            const Char c = line[p];
            if (c == ' ')
                ++column;
            else if (c == '\t')
                column = (column / kTabSize + 1) * kTabSize;
            else if (c == '\f')
                column = 0;
            else
                break;
        }
        if (p == max) {
            // A last row of only whitespace ends the text.
            stopped_ = true;
            return false;
        }
        const Char c = line[p];
        if (c == '#') {
            // A comment row keeps a lone '\r' inside; only the row's end is stripped.
            size_t e = max;
            while (e > p && (line[e - 1] == '\r' || line[e - 1] == '\n')) --e;
            addToken(rowStart + p, rowStart + e, lnum, rowStart, p);
            endStatement();
            return true;
        }
        if (c == '\r' || c == '\n') {
            if (tokens_.size() > pendingFirst_)
                endStatement();
            else
                addBlank(lnum, line, p);
            return true;
        }
        rowIndentColumn_ = column;
        if (column > indents_.back()) indents_.push_back(column);
        while (column < indents_.back()) {
            if (std::find(indents_.begin(), indents_.end(), column) == indents_.end()) {
                error_.kind = ErrorKind::kIndentation;
                error_.lineno = lnum;
                error_.offset = static_cast<int64_t>(p);
                error_.hasText = true;
                error_.textBegin = rowStart;
                error_.textEnd = rowStart + max;
                return false;
            }
            indents_.pop_back();
        }
    } else {
        continued_ = false;
    }

    while (p < max) {
        size_t q = p;
        while (q < max && isSpace(line[q])) ++q;
        if (q == max) {  // \Z
            p = max;
            break;
        }
        const Char c = line[q];
        size_t e = kNoMatch;
        if (c == '\\') {
            // \\\r?\n: the row goes on below.
            if (q + 1 < max && line[q + 1] == '\n')
                e = q + 2;
            else if (q + 2 < max && line[q + 1] == '\r' && line[q + 2] == '\n')
                e = q + 3;
            if (e != kNoMatch) {
                continued_ = true;
                p = e;
                continue;
            }
        } else if (c == '#') {
            e = q + 1;
            while (e < max && line[e] != '\r' && line[e] != '\n') ++e;
        } else if (c == '\n' || (c == '\r' && q + 1 < max && line[q + 1] == '\n')) {
            // NL within brackets continues the statement; NEWLINE ends it.
            if (depth_ <= 0) endStatement();
            p = max;
            break;
        } else if (c == '\'' || c == '"' || isPrefixLetter(c)) {
            // Triple, then ContStr, then Name: [uUbB]?[rR]? before the quote.
            size_t i = q;
            if (c == 'u' || c == 'U' || c == 'b' || c == 'B') ++i;
            if (i < max && (line[i] == 'r' || line[i] == 'R')) ++i;
            if (i < max && (line[i] == '\'' || line[i] == '"')) {
                const Char quote = line[i];
                if (i + 2 < max && line[i + 1] == quote && line[i + 2] == quote) {
                    const uint8_t kind = quote == '\'' ? kTripleSingle : kTripleDouble;
                    const size_t tail = matchStringTail(line, i + 3, max, kind);
                    if (tail != kNoMatch) {
                        addToken(rowStart + q, rowStart + tail, lnum, rowStart, q);
                        p = tail;
                        continue;
                    }
                    openString(kind, rowStart, lnum, q);
                    return true;
                }
                const OneLine one = matchOneLineString(line, i, max, &e);
                if (one == OneLine::kContinued) {
                    openString(quote == '\'' ? kSingleQuote : kDoubleQuote, rowStart, lnum, q);
                    needcont_ = true;
                    return true;
                }
                if (one == OneLine::kNone) e = kNoMatch;
            }
            if (e == kNoMatch && isNameStart(c)) {
                e = q + 1;
                while (e < max && isNameChar(line[e])) ++e;
            }
        } else if (isDigit(c) || (c == '.' && q + 1 < max && isDigit(line[q + 1]))) {
            e = matchNumber(line, q, max);
        } else if (isNameStart(c)) {
            e = q + 1;
            while (e < max && isNameChar(line[e])) ++e;
        } else {
            e = matchOperator(line, q, max);
            if (e != kNoMatch) {
                if (c == '(' || c == '[' || c == '{')
                    ++depth_;
                else if (c == ')' || c == ']' || c == '}')
                    --depth_;
            }
        }
        if (e == kNoMatch) {
            // No rule takes the character at p (whitespace before such a
            // character included): one error token each.
            addToken(rowStart + p, rowStart + p + 1, lnum, rowStart, p);
            ++p;
            continue;
        }
        addToken(rowStart + q, rowStart + e, lnum, rowStart, q);
        p = e;
    }
    return true;
}

template <class Char>
void Scanner<Char>::failAtEof(ErrorKind kind, int64_t lineno, int64_t offset) {
    error_.kind = kind;
    error_.lineno = lineno;
    error_.offset = offset;
    error_.lineText = true;
}

template <class Char>
bool Scanner<Char>::finish() {
    if (error_) return false;
    if (!stopped_) {
        if (string_ != kNoString) {
            failAtEof(ErrorKind::kEofInString, strLineno_, static_cast<int64_t>(strColumn_));
            return false;
        }
        if (depth_ != 0 || continued_) {
            failAtEof(ErrorKind::kEofInStatement, lnum_ + 1, 0);
            return false;
        }
    }
    // A last row without a newline ends its logical; one of only whitespace
    // is a blank logical.
    if (tokens_.size() > pendingFirst_) {
        endStatement();
    } else if (length_ > 0 && text_[length_ - 1] != '\n') {
        size_t last = length_;
        while (last > 0 && text_[last - 1] != '\n') --last;
        bool blank = true;
        for (size_t i = last; i < length_ && blank; ++i) blank = isSpace(text_[i]);
        if (blank) addBlank(lnum_, text_ + last, length_ - last);
    }
    return true;
}

template int64_t indentWidth<uint8_t>(const uint8_t*, size_t);
template int64_t indentWidth<uint16_t>(const uint16_t*, size_t);
template int64_t indentWidth<uint32_t>(const uint32_t*, size_t);
template bool splitLine<uint8_t>(const uint8_t*, size_t, int64_t, size_t*, size_t*);
template bool splitLine<uint16_t>(const uint16_t*, size_t, int64_t, size_t*, size_t*);
template bool splitLine<uint32_t>(const uint32_t*, size_t, int64_t, size_t*, size_t*);
template class Scanner<uint8_t>;
template class Scanner<uint16_t>;
template class Scanner<uint32_t>;

}  // namespace reader
