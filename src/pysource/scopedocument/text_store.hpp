// The document's text and its rows.
//
// The text is a list of chunks of a few thousand characters of one width
// (1, 2 or 4 bytes; the widest a character of the text has needed so far).
// An edit rewrites the chunks it touches and shifts the start of the
// chunks after it, so an edit costs what it holds plus a pass over the
// chunk starts, wherever it is and wherever the one before it was (a
// single gap for the whole text had to travel between them). Each chunk
// keeps its own spare room where it was last edited. The reader wants the
// characters it scans one after the other: a range that one chunk holds on
// one side of its room is read in place, any other is copied out first.
//
// Rows are the physical lines (split at '\n' only): row k (0-based) starts
// after the k-th '\n'. The row table keeps, per row, where it starts and
// what the reader left for it (its entry state and indentation column), in
// chunks of rows: a row's start is a 16-bit offset from its chunk's base,
// so an edit shifts the rows after it in its own chunk and the bases of the
// chunks after, and a row costs 6 bytes.
#pragma once

#include <Python.h>

#include "common/grow_buffer.hpp"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <vector>

namespace sdoc {

// Character `i` of `data`, characters of `width` bytes.
inline uint32_t charOf(const void* data, int width, size_t i) noexcept {
    switch (width) {
    case 1: return static_cast<const uint8_t*>(data)[i];
    case 2: return static_cast<const uint16_t*>(data)[i];
    default: return static_cast<const uint32_t*>(data)[i];
    }
}

class TextStore {
public:
    TextStore();

    size_t size() const noexcept { return size_; }
    int width() const noexcept { return width_; }

    uint32_t at(size_t i) const noexcept {
        const size_t c = chunkOf(i);
        const size_t k = i - starts_[c];
        return charAt(base(chunks_[c], k), k);
    }

    // The whole text becomes `n` characters of `width` bytes at `data`.
    void assign(const void* data, int width, size_t n);
    // Characters [start, end) become the `n` characters at `data`.
    void replace(size_t start, size_t end, const void* data, int width, size_t n);
    // Characters [start, end) one after the other at the returned address
    // (width() bytes each): in place when one chunk holds them, else a copy
    // that lasts until the next call or edit. A call from the same start
    // with a later end (a read that outgrew its window) copies only what
    // the last copy did not hold.
    const void* contiguous(size_t start, size_t end);
    // Lets a large copy go once its reader is done with it.
    void releaseCopy() noexcept;
    // Characters [start, end) as 32-bit values (appended to `out`).
    void copyOut(size_t start, size_t end, std::vector<uint32_t>& out) const;
    // A new str of characters [start, end); throws on failure.
    PyObject* slice(size_t start, size_t end);
    // Where the next '\n' at or after `from` is; size() when there is none.
    size_t findNewline(size_t from) const noexcept;
    // How many characters the text and the `n` at `data` share at the
    // start; at the end, not counting the first `skip` of either.
    size_t commonPrefix(const void* data, int width, size_t n) noexcept;
    size_t commonSuffix(const void* data, int width, size_t n, size_t skip) noexcept;
    size_t bytesHeld() const noexcept;
    // How many '\r' the text holds: without any, its lines split at
    // '\r\n', '\r' and '\n' are its rows.
    size_t carriageReturns() const noexcept { return carriageReturns_; }

private:
    using Bytes = std::vector<uint8_t>;
    // A chunk keeps `room` unused characters after its first `gap`: an edit
    // moves the room to its place, and the next edit there (a keystroke
    // after a keystroke, a place typed at again) moves nothing.
    struct Chunk {
        Bytes bytes;
        size_t gap = 0;
        size_t room = 0;
    };

    uint32_t charAt(const uint8_t* p, size_t k) const noexcept { return charOf(p, width_, k); }
    size_t chars(const Chunk& c) const noexcept { return c.bytes.size() / static_cast<size_t>(width_) - c.room; }
    // Where character k of the chunk is: at base(c, k) + k * width().
    const uint8_t* base(const Chunk& c, size_t k) const noexcept {
        return c.bytes.data() + (k < c.gap ? 0 : c.room * static_cast<size_t>(width_));
    }
    void moveGap(Chunk& c, size_t k) noexcept;
    // Characters [start, end) where chunk c holds them one after the other,
    // or null (they cross its room or its end).
    const uint8_t* inPlace(size_t c, size_t start, size_t end) const noexcept;
    void closeGap(Chunk& c) noexcept;
    // The chunk holding character `i`; the last one for i == size().
    size_t chunkOf(size_t i) const noexcept {
        if (i >= starts_[hint_] && i < starts_[hint_ + 1]) return hint_;
        return hint_ = find(i);
    }
    size_t find(size_t i) const noexcept;
    // f(p, from, to) for each piece of characters [start, end) that lies
    // in one place: characters [from, to) of a chunk, character k at
    // p + k * width().
    template <class F>
    void eachPiece(size_t start, size_t end, F f) const {
        for (size_t c = chunkOf(start), i = start; i < end; ++c) {
            const Chunk& chunk = chunks_[c];
            const size_t from = i - starts_[c];
            const size_t to = std::min(end, starts_[c + 1]) - starts_[c];
            if (from < chunk.gap) f(chunk.bytes.data(), from, std::min(to, chunk.gap));
            if (to > chunk.gap) f(base(chunk, chunk.gap), std::max(from, chunk.gap), to);
            i = starts_[c + 1];
        }
    }
    // Characters [start, end) written one after the other at `out`.
    void copyChars(size_t start, size_t end, uint8_t* out) const noexcept;
    void widen(int width);
    // Chunks [first, last] become the characters of `joined`, cut in pieces.
    void rechunk(size_t first, size_t last, const Bytes& joined);
    void restart(size_t from) noexcept;  // starts_ from chunk `from` on
    void mergeIfSmall(size_t c);

    std::vector<Chunk> chunks_;   // never empty; an empty chunk only alone
    std::vector<size_t> starts_;  // starts_[c]: chunk c's first character; then size()
    mutable size_t hint_ = 0;
    int width_ = 1;
    size_t size_ = 0;
    size_t carriageReturns_ = 0;
    GrowBuffer copy_;
    size_t copyStart_ = 0, copyEnd_ = 0;  // what copy_ holds, until an edit
};

// Chunks of about `chars` characters and `rows` rows from now on (tests
// make them tiny); documents made before keep working.
void setChunkSizes(size_t chars, size_t rows) noexcept;

// What the reader leaves at the break before a row, packed in 16 bits.
// Opaque here: the engine packs, compares and stores it.
struct RowState {
    uint16_t bits = 0;
    bool operator==(const RowState& o) const noexcept { return bits == o.bits; }
    bool operator!=(const RowState& o) const noexcept { return bits != o.bits; }
};

// A row's indentation column when it ran the indentation check, else this.
constexpr int16_t kNoIndentCheck = -1;

class RowTable {
public:
    RowTable();

    size_t count() const noexcept { return firstRows_.back(); }

    // Where row `r` starts (the text's size is no longer needed; kept so
    // that a call reads the same in every file).
    size_t start(size_t r, size_t /*textSize*/) const noexcept {
        const size_t c = chunkOf(r);
        return bases_[c] + chunks_[c].offsets[r - firstRows_[c]];
    }
    RowState& state(size_t r) noexcept {
        const size_t c = chunkOf(r);
        return chunks_[c].states[r - firstRows_[c]];
    }
    const RowState& state(size_t r) const noexcept {
        const size_t c = chunkOf(r);
        return chunks_[c].states[r - firstRows_[c]];
    }
    void setColumn(size_t r, int16_t column) noexcept {
        const size_t c = chunkOf(r);
        chunks_[c].columns[r - firstRows_[c]] = column;
        chunks_[c].leastKnown = false;
    }
    int16_t column(size_t r) const noexcept {
        const size_t c = chunkOf(r);
        return chunks_[c].columns[r - firstRows_[c]];
    }
    // The last row above row `r` whose column is at least 0 and below
    // `limit`, or kNone: the indentation stack at a row, found without
    // visiting every row of a long block above it.
    static constexpr size_t kNone = static_cast<size_t>(-1);
    size_t lastBelow(size_t r, int32_t limit) const noexcept;
    // The last row starting at or before character `at` (0-based).
    size_t rowAt(size_t at) const noexcept;

    // Rows of a fresh text: one per '\n', plus the row after the last.
    void assign(const TextStore& text);
    // Rows first+1 .. first+removed (0-based) are taken out and rows
    // starting at `newStarts` (offsets in the text after the edit, whose
    // size is `newTextSize`) put in their place; the rows after shift by
    // the change in size. States and columns of the new rows are unset.
    // With `states` and `columns` (one per new row) the new rows take
    // them; an edit undone puts back what it took out.
    void replace(size_t first, size_t removed, const std::vector<size_t>& newStarts, size_t newTextSize,
                 size_t oldTextSize, const RowState* states = nullptr, const int16_t* columns = nullptr);
    size_t bytesHeld() const noexcept;

private:
    struct Chunk {
        std::vector<uint16_t> offsets;  // from the chunk's base
        std::vector<RowState> states;
        std::vector<int16_t> columns;
        // The least column at least 0 (INT16_MAX for none), while known.
        mutable int16_t least = 0;
        mutable bool leastKnown = false;
        size_t size() const noexcept { return offsets.size(); }
        int16_t leastColumn() const noexcept;
    };
    // Rows laid out flat while chunks are cut again.
    struct Flat {
        std::vector<size_t> starts;
        std::vector<RowState> states;
        std::vector<int16_t> columns;
    };

    size_t chunkOf(size_t r) const noexcept {
        if (r >= firstRows_[hint_] && r < firstRows_[hint_ + 1]) return hint_;
        return hint_ = find(r);
    }
    size_t find(size_t r) const noexcept;
    void flatten(size_t c, size_t from, size_t to, long shift, Flat& out) const;
    // Chunks [first, last] become the rows of `flat`, cut in pieces.
    void rechunk(size_t first, size_t last, const Flat& flat);
    void renumber(size_t from) noexcept;  // firstRows_ from chunk `from` on
    void shiftBases(size_t from, long delta) noexcept;

    std::vector<Chunk> chunks_;       // never empty, nor any chunk in it
    std::vector<size_t> bases_;       // per chunk
    std::vector<size_t> firstRows_;   // firstRows_[c]: chunk c's first row; then count()
    mutable size_t hint_ = 0;
};

}  // namespace sdoc
