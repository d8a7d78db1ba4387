// The document's text and its rows.
//
// The text is a gap buffer of characters of one width (1, 2 or 4 bytes; the
// widest a character of the text has needed so far). An edit moves the gap
// to its place, so typing costs what the edit holds, not what the text
// holds; the gap can be put before any character so that everything from
// there to the end is one contiguous array for the reader.
//
// Rows are the physical lines (split at '\n' only): row k (0-based) starts
// after the k-th '\n'. The row table keeps, per row, where it starts and
// what the reader left for it (its entry state and indentation column).
// It has a gap of its own: starts before the gap are offsets from the start
// of the text, starts after it offsets from the end, so an edit shifts no
// start but those it moves the gap across.
#pragma once

#include <Python.h>

#include <cstdint>
#include <cstring>
#include <vector>

namespace sdoc {

class TextStore {
public:
    size_t size() const noexcept { return size_; }
    int width() const noexcept { return width_; }

    uint32_t at(size_t i) const noexcept {
        const size_t k = i < gapStart_ ? i : i + (gapEnd_ - gapStart_);
        switch (width_) {
        case 1: return buf_[k];
        case 2: return reinterpret_cast<const uint16_t*>(buf_.data())[k];
        default: return reinterpret_cast<const uint32_t*>(buf_.data())[k];
        }
    }

    // The whole text becomes `n` characters of `width` bytes at `data`.
    void assign(const void* data, int width, size_t n);
    // Characters [start, end) become the `n` characters at `data`.
    void replace(size_t start, size_t end, const void* data, int width, size_t n);
    // Moves the gap before character `pos`; characters pos..size() then
    // follow each other at the returned address (the width is width()).
    const void* contiguousFrom(size_t pos);
    // Characters [start, end) as 32-bit values (appended to `out`).
    void copyOut(size_t start, size_t end, std::vector<uint32_t>& out) const;
    // A new str of characters [start, end); throws on failure.
    PyObject* slice(size_t start, size_t end);
    // Where the next '\n' at or after `from` is; size() when there is none.
    size_t findNewline(size_t from) const noexcept;
    size_t bytesHeld() const noexcept { return buf_.capacity(); }
    // How many '\r' the text holds: without any, its lines split at
    // '\r\n', '\r' and '\n' are its rows.
    size_t carriageReturns() const noexcept { return carriageReturns_; }

private:
    void moveGap(size_t pos) noexcept;
    void reserveGap(size_t chars);
    void widen(int width);
    void store(size_t k, uint32_t c) noexcept {
        switch (width_) {
        case 1: buf_[k] = static_cast<uint8_t>(c); break;
        case 2: reinterpret_cast<uint16_t*>(buf_.data())[k] = static_cast<uint16_t>(c); break;
        default: reinterpret_cast<uint32_t*>(buf_.data())[k] = c; break;
        }
    }

    std::vector<uint8_t> buf_;  // capacity() characters of width_ bytes
    int width_ = 1;
    size_t size_ = 0;           // characters of text
    size_t gapStart_ = 0;       // characters
    size_t gapEnd_ = 0;
    size_t capacity_ = 0;       // characters
    size_t carriageReturns_ = 0;
};

// What the reader leaves at the break before a row. Opaque here: the
// engine compares and stores it.
struct RowState {
    uint64_t bits = 0;
    bool operator==(const RowState& o) const noexcept { return bits == o.bits; }
    bool operator!=(const RowState& o) const noexcept { return bits != o.bits; }
};

// A row's indentation column when it ran the indentation check, else this.
constexpr int16_t kNoIndentCheck = -1;

class RowTable {
public:
    size_t count() const noexcept { return starts_.size() - gap(); }

    // Where row `r` starts, for a text of `textSize` characters.
    size_t start(size_t r, size_t textSize) const noexcept {
        return r < gapStart_ ? starts_[r] : textSize - starts_[r + gap()];
    }
    RowState& state(size_t r) noexcept { return states_[slot(r)]; }
    const RowState& state(size_t r) const noexcept { return states_[slot(r)]; }
    int16_t& column(size_t r) noexcept { return columns_[slot(r)]; }
    int16_t column(size_t r) const noexcept { return columns_[slot(r)]; }

    // Rows of a fresh text: one per '\n', plus the row after the last.
    void assign(const TextStore& text);
    // Rows first+1 .. first+removed (0-based) are taken out and rows
    // starting at `newStarts` (offsets in the text after the edit, whose
    // size is `newTextSize`) put in their place; the rows after shift by
    // `delta` characters. States and columns of the new rows are unset.
    // With `states` and `columns` (one per new row) the new rows take
    // them; an edit undone puts back what it took out.
    void replace(size_t first, size_t removed, const std::vector<size_t>& newStarts, size_t newTextSize,
                 size_t oldTextSize, const RowState* states = nullptr, const int16_t* columns = nullptr);
    size_t bytesHeld() const noexcept {
        return starts_.capacity() * sizeof(uint32_t) + states_.capacity() * sizeof(RowState) +
               columns_.capacity() * sizeof(int16_t);
    }

private:
    size_t gap() const noexcept { return gapEnd_ - gapStart_; }
    size_t slot(size_t r) const noexcept { return r < gapStart_ ? r : r + gap(); }
    void moveGap(size_t pos, size_t textSize) noexcept;
    void reserveGap(size_t rows, size_t textSize);

    std::vector<uint32_t> starts_;
    std::vector<RowState> states_;
    std::vector<int16_t> columns_;
    size_t gapStart_ = 0;
    size_t gapEnd_ = 0;
};

}  // namespace sdoc
