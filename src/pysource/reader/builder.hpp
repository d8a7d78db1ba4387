// Scanner output to Python objects: token strings, LogicalLineType records,
// and the reference's exceptions.
#pragma once

#include <Python.h>

#include <cstddef>
#include <cstdint>
#include <memory>

#include "pysource/reader/scanner.hpp"

namespace reader {

// Makes the str of each token span. Equal short tokens of one read share one
// object (keywords, operators, `self`, ...): most tokens are short and
// repeat, and a lookup costs a fraction of making a str.
template <class Char>
class TokenMaker {
public:
    // `ascii`: the text is known to hold only ASCII (3.x, one-byte kind).
    TokenMaker(const Char* text, size_t length, bool ascii);
    ~TokenMaker();
    TokenMaker(const TokenMaker&) = delete;
    TokenMaker& operator=(const TokenMaker&) = delete;

    // A new reference to the str of text[begin, end); null with an
    // exception set.
    PyObject* make(size_t begin, size_t end);
    // The same, not shared with other tokens (message texts).
    PyObject* makeFresh(size_t begin, size_t end);

    static constexpr size_t kMaxShared = 16;

private:
    struct Entry {
        PyObject* object;
        size_t length;
        Char chars[kMaxShared];
    };
    const Char* text_;
    bool ascii_;
    size_t mask_;
    std::unique_ptr<Entry[]> table_;
};

// What a record is made into: the record type published by
// pysource._fastaccess (filled directly), or any other callable given in its
// place (called with (tokens, lineno, indent, kind) as the reference does).
struct RecordMaker {
    PyObject* type;          // borrowed
    PyTypeObject* native;    // the published type, or null when unknown
};

// One logical object from a record of `scanner`; null with an exception set.
template <class Char>
PyObject* makeLogical(const Scanner<Char>& scanner, const Record& record, TokenMaker<Char>& tokens,
                      const RecordMaker& maker);

// The list of the logicals of a finished scan, or the reference's exception:
// records read before an error are made first (as the reference makes them
// one by one), so an error in making one wins over the scan's error.
template <class Char>
PyObject* makeLogicals(const Scanner<Char>& scanner, TokenMaker<Char>& tokens, const RecordMaker& maker,
                       PyObject* filename);

// Reads the whole text from where `scanner` stands and makes the list of its
// logicals, or sets the reference's exception. Records are made a few
// hundred at a time as the scan goes, while their spans are still in the
// caches, and the scanner's output is dropped after each batch.
template <class Char>
PyObject* readLogicals(Scanner<Char>& scanner, TokenMaker<Char>& tokens, const RecordMaker& maker,
                       PyObject* filename);

// Sets the exception the reference raises for the scan's error.
template <class Char>
void setScanError(const Scanner<Char>& scanner, TokenMaker<Char>& tokens, PyObject* filename);

}  // namespace reader
