#include "pysource/scopedocument/text_store.hpp"

#include "common/pycompat.hpp"

#include <algorithm>
#include <limits>
#include <new>

namespace sdoc {

namespace {

// Chunks are cut near gChunkChars; one that grows past gMaxChunkChars is
// cut again, one that shrinks below gMinChunkChars joins a neighbour. An
// edit inside a chunk moves at most gMaxChunkChars characters, and at 100k
// lines there are a few hundred chunk starts to shift. Rows likewise. Tests
// make the chunks tiny, so that every edit meets their edges.
size_t gChunkChars = 8192;
size_t gMaxChunkChars = 16384;
size_t gMinChunkChars = 1024;
size_t gChunkRows = 512;
size_t gMaxChunkRows = 1024;
size_t gMinChunkRows = 64;

// A chunk's rows start within 64K characters of its base.
constexpr size_t kMaxOffset = std::numeric_limits<uint16_t>::max();

inline void storeChar(uint8_t* p, int width, size_t i, uint32_t c) noexcept {
    switch (width) {
    case 1: p[i] = static_cast<uint8_t>(c); break;
    case 2: reinterpret_cast<uint16_t*>(p)[i] = static_cast<uint16_t>(c); break;
    default: reinterpret_cast<uint32_t*>(p)[i] = c; break;
    }
}

// `n` characters of width `from` at `src` written at `dst` in width `to`.
void put(uint8_t* dst, int to, const void* src, int from, size_t n) noexcept {
    if (to == from) {
        if (n) std::memcpy(dst, src, n * static_cast<size_t>(to));
        return;
    }
    for (size_t i = 0; i < n; ++i) storeChar(dst, to, i, charOf(src, from, i));
}

// The width a character needs.
inline int widthOf(uint32_t c) noexcept { return c < 0x100 ? 1 : c < 0x10000 ? 2 : 4; }

int widestIn(const void* data, int width, size_t n, int least) noexcept {
    int need = least;
    for (size_t i = 0; i < n && need < width; ++i) need = std::max(need, widthOf(charOf(data, width, i)));
    return need;
}

// Offsets are kept in 32 bits elsewhere (the scanner's spans, the damage);
// a text must fit them.
void requireFits(size_t chars) {
    if (chars >= std::numeric_limits<uint32_t>::max()) {
        PyErr_SetString(PyExc_OverflowError, "a document holds fewer than 2**32 - 1 characters");
        throw py::Error{};
    }
}

// The one pass over the chunks after an edit: vectorised, it costs a few
// hundred cycles at 100k lines. Modular steps: every result is in range.
[[gnu::noinline, gnu::optimize("tree-vectorize")]] void addToEach(size_t* p, size_t n, size_t step) noexcept {
    for (size_t i = 0; i < n; ++i) p[i] += step;
}

[[gnu::noinline, gnu::optimize("tree-vectorize")]] void addToEach(uint16_t* p, size_t n, uint16_t step) noexcept {
    for (size_t i = 0; i < n; ++i) p[i] = static_cast<uint16_t>(p[i] + step);
}

// Room for `extra` more items with a sixteenth to spare, so that memory
// stays close to what is held and typing does not reallocate each time.
template <class V>
void roomFor(V& v, size_t extra) {
    const size_t want = v.size() + extra;
    if (want > v.capacity()) v.reserve(want + want / 16 + 8);
}

}  // namespace

void setChunkSizes(size_t chars, size_t rows) noexcept {
    gChunkChars = std::max<size_t>(chars, 1);
    gMaxChunkChars = 2 * gChunkChars;
    gMinChunkChars = std::max<size_t>(gChunkChars / 8, 1);
    gChunkRows = std::max<size_t>(rows, 1);
    gMaxChunkRows = 2 * gChunkRows;
    gMinChunkRows = gChunkRows / 8;
}

// --- TextStore -----------------------------------------------------------------

TextStore::TextStore() : chunks_(1), starts_(2, 0) {}

size_t TextStore::find(size_t i) const noexcept {
    if (i >= size_) return chunks_.size() - 1;
    return static_cast<size_t>(std::upper_bound(starts_.begin() + 1, starts_.end(), i) - starts_.begin()) - 1;
}

void TextStore::restart(size_t from) noexcept {
    starts_.resize(chunks_.size() + 1);
    starts_[0] = 0;
    for (size_t c = from; c < chunks_.size(); ++c) starts_[c + 1] = starts_[c] + chars(chunks_[c]);
    size_ = starts_.back();
    hint_ = 0;
}

void TextStore::assign(const void* data, int width, size_t n) {
    copyStart_ = copyEnd_ = 0;
    requireFits(n);
    const int need = widestIn(data, width, n, 1);
    size_t crs = 0;
    for (size_t i = 0; i < n; ++i) crs += charOf(data, width, i) == '\r';
    std::vector<Chunk> fresh;
    fresh.reserve(n / gChunkChars + 1);
    const size_t w = static_cast<size_t>(need);
    for (size_t at = 0; at < n || fresh.empty(); at += gChunkChars) {
        const size_t k = std::min(gChunkChars, n - at);
        Chunk chunk;
        chunk.bytes.resize(k * w);
        chunk.gap = k;
        put(chunk.bytes.data(), need, static_cast<const uint8_t*>(data) + at * static_cast<size_t>(width), width, k);
        fresh.push_back(std::move(chunk));
    }
    chunks_.swap(fresh);
    width_ = need;
    carriageReturns_ = crs;
    restart(0);
}

void TextStore::moveGap(Chunk& c, size_t k) noexcept {
    const size_t w = static_cast<size_t>(width_);
    uint8_t* p = c.bytes.data();
    if (k < c.gap) std::memmove(p + (k + c.room) * w, p + k * w, (c.gap - k) * w);
    else if (k > c.gap) std::memmove(p + c.gap * w, p + (c.gap + c.room) * w, (k - c.gap) * w);
    c.gap = k;
}

void TextStore::closeGap(Chunk& c) noexcept {
    moveGap(c, chars(c));
    c.bytes.resize(c.gap * static_cast<size_t>(width_));
    c.room = 0;
}

void TextStore::widen(int width) {
    for (Chunk& chunk : chunks_) {
        closeGap(chunk);
        const size_t k = chars(chunk);
        Bytes wide(k * static_cast<size_t>(width));
        put(wide.data(), width, chunk.bytes.data(), width_, k);
        chunk.bytes.swap(wide);
    }
    width_ = width;
}

void TextStore::rechunk(size_t first, size_t last, const Bytes& joined) {
    const size_t w = static_cast<size_t>(width_);
    const size_t m = joined.size() / w;
    std::vector<Chunk> pieces;
    if (m > 0) {
        const size_t count = (m + gChunkChars - 1) / gChunkChars;
        const size_t each = (m + count - 1) / count;
        for (size_t at = 0; at < m; at += each) {
            const size_t k = std::min(each, m - at);
            Chunk piece;
            piece.bytes.assign(joined.begin() + static_cast<std::ptrdiff_t>(at * w),
                               joined.begin() + static_cast<std::ptrdiff_t>((at + k) * w));
            piece.gap = k;
            pieces.push_back(std::move(piece));
        }
    }
    chunks_.erase(chunks_.begin() + static_cast<std::ptrdiff_t>(first),
                  chunks_.begin() + static_cast<std::ptrdiff_t>(last + 1));
    chunks_.insert(chunks_.begin() + static_cast<std::ptrdiff_t>(first), std::make_move_iterator(pieces.begin()),
                   std::make_move_iterator(pieces.end()));
    if (chunks_.empty()) chunks_.emplace_back();
    restart(std::min(first, chunks_.size() - 1));
    if (first < chunks_.size()) mergeIfSmall(first);
}

void TextStore::mergeIfSmall(size_t c) {
    if (chunks_.size() < 2 || chars(chunks_[c]) >= gMinChunkChars) return;
    // The smaller neighbour takes it in, if the two fit in one chunk.
    size_t other = c + 1 < chunks_.size() ? c + 1 : c - 1;
    if (c > 0 && c + 1 < chunks_.size() && chars(chunks_[c - 1]) < chars(chunks_[c + 1])) other = c - 1;
    const size_t lo = std::min(c, other), hi = std::max(c, other);
    if (chars(chunks_[lo]) + chars(chunks_[hi]) > gMaxChunkChars) {
        if (chars(chunks_[c]) > 0) return;
        chunks_.erase(chunks_.begin() + static_cast<std::ptrdiff_t>(c));
        restart(c > 0 ? c - 1 : 0);
        return;
    }
    closeGap(chunks_[lo]);
    closeGap(chunks_[hi]);
    Bytes& into = chunks_[lo].bytes;
    roomFor(into, chunks_[hi].bytes.size());
    into.insert(into.end(), chunks_[hi].bytes.begin(), chunks_[hi].bytes.end());
    chunks_[lo].gap = chars(chunks_[lo]);
    chunks_.erase(chunks_.begin() + static_cast<std::ptrdiff_t>(hi));
    restart(lo);
}

void TextStore::replace(size_t start, size_t end, const void* data, int width, size_t n) {
    copyStart_ = copyEnd_ = 0;
    requireFits(size_ - (end - start) + n);
    if (width > width_) {
        const int need = widestIn(data, width, n, width_);
        if (need > width_) widen(need);
    }
    const size_t w = static_cast<size_t>(width_);
    const size_t c0 = chunkOf(start);
    const size_t c1 = end > start ? chunkOf(end - 1) : c0;
    eachPiece(start, end, [&](const uint8_t* p, size_t from, size_t to) {
        for (size_t k = from; k < to; ++k) carriageReturns_ -= charAt(p, k) == '\r';
    });
    for (size_t i = 0; i < n; ++i) carriageReturns_ += charOf(data, width, i) == '\r';

    const size_t k0 = start - starts_[c0];
    const size_t k1 = end - starts_[c1];
    if (c0 == c1 && chars(chunks_[c0]) - (end - start) + n <= gMaxChunkChars) {
        // Within one chunk: its room moves to the edit (nothing moves when
        // it is there already), the chunks after start later.
        Chunk& chunk = chunks_[c0];
        moveGap(chunk, k0);
        chunk.room += k1 - k0;
        if (chunk.room < n) {
            // Room for this and the next few, a sixteenth of the chunk.
            // The new bytes go at the end (only they are zeroed), then the
            // characters after the room move up to them.
            const size_t kept = chars(chunk);
            const size_t room = n + 16 + kept / 16;
            const size_t held = chunk.bytes.size();
            const size_t tail = (kept - chunk.gap) * w;
            chunk.bytes.reserve((kept + room) * w);
            chunk.bytes.resize((kept + room) * w);
            uint8_t* p = chunk.bytes.data();
            if (tail > 0) std::memmove(p + (chunk.gap + room) * w, p + held - tail, tail);
            chunk.room = room;
        }
        put(chunk.bytes.data() + chunk.gap * w, width_, data, width, n);
        chunk.gap += n;
        chunk.room -= n;
        addToEach(starts_.data() + c0 + 1, starts_.size() - c0 - 1, n - (end - start));
        size_ = starts_.back();
        if (chars(chunk) < gMinChunkChars) mergeIfSmall(c0);
        return;
    }
    closeGap(chunks_[c0]);
    closeGap(chunks_[c1]);
    const Bytes& head = chunks_[c0].bytes;
    const Bytes& tail = chunks_[c1].bytes;
    const size_t off0 = k0 * w;
    const size_t off1 = k1 * w;
    Bytes joined;
    joined.reserve(off0 + n * w + (tail.size() - off1));
    joined.insert(joined.end(), head.begin(), head.begin() + static_cast<std::ptrdiff_t>(off0));
    joined.resize(off0 + n * w);
    put(joined.data() + off0, width_, data, width, n);
    joined.insert(joined.end(), tail.begin() + static_cast<std::ptrdiff_t>(off1), tail.end());
    rechunk(c0, c1, joined);
}

const void* TextStore::contiguous(size_t start, size_t end) {
    const size_t w = static_cast<size_t>(width_);
    const size_t c0 = chunkOf(start);
    if (const uint8_t* p = inPlace(c0, start, end)) return p;
    const bool extends = copyEnd_ > copyStart_ && copyStart_ == start && copyEnd_ <= end;
    const size_t from = extends ? copyEnd_ : start;
    uint8_t* out = copy_.reserve((end - start) * w);
    copyChars(from, end, out + (from - start) * w);
    copyStart_ = start;
    copyEnd_ = end;
    return out;
}

const uint8_t* TextStore::inPlace(size_t c, size_t start, size_t end) const noexcept {
    const Chunk& chunk = chunks_[c];
    const size_t k0 = start - starts_[c];
    const size_t k1 = end - starts_[c];
    if (start == end) return chunk.bytes.data();
    if (end > starts_[c + 1] || (k0 < chunk.gap && k1 > chunk.gap)) return nullptr;
    return base(chunk, k0) + k0 * static_cast<size_t>(width_);
}

void TextStore::copyChars(size_t start, size_t end, uint8_t* out) const noexcept {
    const size_t w = static_cast<size_t>(width_);
    eachPiece(start, end, [&](const uint8_t* p, size_t from, size_t to) {
        std::memcpy(out, p + from * w, (to - from) * w);
        out += (to - from) * w;
    });
}

void TextStore::releaseCopy() noexcept {
    // A typing edit's few rows may keep theirs; a document at rest holds
    // no more than that.
    copyStart_ = copyEnd_ = 0;
    if (copy_.capacity() > 2048) copy_.release();
}

void TextStore::copyOut(size_t start, size_t end, std::vector<uint32_t>& out) const {
    out.reserve(out.size() + (end - start));
    eachPiece(start, end, [&](const uint8_t* p, size_t from, size_t to) {
        for (size_t k = from; k < to; ++k) out.push_back(charAt(p, k));
    });
}

PyObject* TextStore::slice(size_t start, size_t end) {
    const size_t w = static_cast<size_t>(width_);
    const size_t c0 = chunkOf(start);
    if (const uint8_t* p = inPlace(c0, start, end)) {
        return py::check(compat::strFromWidth(p, width_, end - start)).release();
    }
    // Not through the copy: a reader may still be using it.
    std::vector<uint8_t> joined((end - start) * w);
    copyChars(start, end, joined.data());
    return py::check(compat::strFromWidth(joined.data(), width_, end - start)).release();
}

size_t TextStore::findNewline(size_t from) const noexcept {
    if (from >= size_) return size_;
    // Characters [k0, k1) of chunk c, at p + k * width: the index of the
    // first '\n', or k1.
    const auto search = [&](const uint8_t* p, size_t k0, size_t k1) {
        if (width_ == 1) {
            const void* hit = k0 < k1 ? std::memchr(p + k0, '\n', k1 - k0) : nullptr;
            return hit ? static_cast<size_t>(static_cast<const uint8_t*>(hit) - p) : k1;
        }
        for (size_t k = k0; k < k1; ++k) {
            if (charAt(p, k) == '\n') return k;
        }
        return k1;
    };
    for (size_t c = chunkOf(from); c < chunks_.size(); ++c) {
        const Chunk& chunk = chunks_[c];
        const size_t k0 = from > starts_[c] ? from - starts_[c] : 0;
        const size_t k1 = chars(chunk);
        if (k0 < chunk.gap) {
            const size_t k = search(chunk.bytes.data(), k0, std::min(k1, chunk.gap));
            if (k < std::min(k1, chunk.gap)) return starts_[c] + k;
        }
        const size_t k = search(base(chunk, chunk.gap), std::max(k0, chunk.gap), k1);
        if (k < k1) return starts_[c] + k;
    }
    return size_;
}

size_t TextStore::commonPrefix(const void* data, int width, size_t n) noexcept {
    for (Chunk& chunk : chunks_) closeGap(chunk);  // a whole text compared: the rooms go
    const size_t limit = std::min(size_, n);
    const size_t w = static_cast<size_t>(width_);
    size_t i = 0;
    for (size_t c = 0; c < chunks_.size() && i < limit; ++c) {
        const uint8_t* p = chunks_[c].bytes.data();
        const size_t len = std::min(chars(chunks_[c]), limit - i);
        size_t k = 0;
        if (width == width_) {
            const uint8_t* q = static_cast<const uint8_t*>(data) + i * w;
            while (k + 64 <= len && std::memcmp(p + k * w, q + k * w, 64 * w) == 0) k += 64;
        }
        while (k < len && charAt(p, k) == charOf(data, width, i + k)) ++k;
        i += k;
        if (k < len) break;
    }
    return i;
}

size_t TextStore::commonSuffix(const void* data, int width, size_t n, size_t skip) noexcept {
    for (Chunk& chunk : chunks_) closeGap(chunk);
    const size_t limit = std::min(size_, n) - std::min(skip, std::min(size_, n));
    const size_t w = static_cast<size_t>(width_);
    size_t t = 0;  // characters matched from the end
    for (size_t c = chunks_.size(); c-- > 0 && t < limit;) {
        const uint8_t* p = chunks_[c].bytes.data();
        const size_t have = chars(chunks_[c]);
        const size_t len = std::min(have, limit - t);
        // Compares p[have-1-k] with data[n-1-t-k] for k < len.
        size_t k = 0;
        if (width == width_) {
            while (k + 64 <= len &&
                   std::memcmp(p + (have - k - 64) * w,
                               static_cast<const uint8_t*>(data) + (n - t - k - 64) * w, 64 * w) == 0) {
                k += 64;
            }
        }
        while (k < len && charAt(p, have - 1 - k) == charOf(data, width, n - 1 - t - k)) ++k;
        t += k;
        if (k < len) break;
    }
    return t;
}

size_t TextStore::bytesHeld() const noexcept {
    size_t held = chunks_.capacity() * sizeof(Chunk) + starts_.capacity() * sizeof(size_t) + copy_.capacity();
    for (const Chunk& c : chunks_) held += c.bytes.capacity();
    return held;
}

// --- RowTable ------------------------------------------------------------------

RowTable::RowTable() : chunks_(1), bases_(1, 0), firstRows_{0, 1} {
    chunks_[0].offsets.push_back(0);
    chunks_[0].states.push_back(RowState());
    chunks_[0].columns.push_back(kNoIndentCheck);
}

size_t RowTable::find(size_t r) const noexcept {
    if (r >= count()) return chunks_.size() - 1;
    return static_cast<size_t>(std::upper_bound(firstRows_.begin() + 1, firstRows_.end(), r) - firstRows_.begin()) -
           1;
}

size_t RowTable::rowAt(size_t at) const noexcept {
    // A chunk's first row starts at its base.
    const size_t c =
        static_cast<size_t>(std::upper_bound(bases_.begin() + 1, bases_.end(), at) - bases_.begin()) - 1;
    const std::vector<uint16_t>& offsets = chunks_[c].offsets;
    const size_t rel = at - bases_[c];
    const size_t k = rel > kMaxOffset ? offsets.size()
                                      : static_cast<size_t>(std::upper_bound(offsets.begin(), offsets.end(),
                                                                             static_cast<uint16_t>(rel)) -
                                                            offsets.begin());
    return firstRows_[c] + k - 1;
}

int16_t RowTable::Chunk::leastColumn() const noexcept {
    if (!leastKnown) {
        // As unsigned, a row with no column (negative) is above any column.
        uint16_t m = UINT16_MAX;
        for (const int16_t c : columns) m = std::min(m, static_cast<uint16_t>(c));
        least = m > INT16_MAX ? INT16_MAX : static_cast<int16_t>(m);
        leastKnown = true;
    }
    return least;
}

// Whether any of the 16 columns at `p` is at least 0 and below `limit`: as
// unsigned, a row with no column (negative) is above any limit.
[[gnu::optimize("tree-vectorize")]] static bool anyBelow16(const int16_t* p, int32_t limit) noexcept {
    uint16_t m = UINT16_MAX;
    for (size_t k = 0; k < 16; ++k) m = std::min(m, static_cast<uint16_t>(p[k]));
    return m < limit;
}

size_t RowTable::lastBelow(size_t r, int32_t limit) const noexcept {
    if (r == 0) return kNone;
    size_t c = chunkOf(r - 1);
    size_t i = r - firstRows_[c];  // rows [0, i) of chunk c are above r
    for (;;) {
        const Chunk& chunk = chunks_[c];
        if (i < chunk.size() || chunk.leastColumn() < limit) {
            const int16_t* columns = chunk.columns.data();
            while (i >= 16 && !anyBelow16(columns + i - 16, limit)) i -= 16;
            while (i > 0) {
                const int16_t v = columns[--i];
                if (v >= 0 && v < limit) return firstRows_[c] + i;
            }
        }
        if (c == 0) return kNone;
        i = chunks_[--c].size();
    }
}

void RowTable::renumber(size_t from) noexcept {
    firstRows_.resize(chunks_.size() + 1);
    firstRows_[0] = 0;
    for (size_t c = from; c < chunks_.size(); ++c) firstRows_[c + 1] = firstRows_[c] + chunks_[c].size();
    hint_ = 0;
}

void RowTable::shiftBases(size_t from, long delta) noexcept {
    if (from < bases_.size()) addToEach(bases_.data() + from, bases_.size() - from, static_cast<size_t>(delta));
}

void RowTable::flatten(size_t c, size_t from, size_t to, long shift, Flat& out) const {
    const Chunk& chunk = chunks_[c];
    for (size_t i = from; i < to; ++i) {
        out.starts.push_back(static_cast<size_t>(static_cast<long>(bases_[c] + chunk.offsets[i]) + shift));
        out.states.push_back(chunk.states[i]);
        out.columns.push_back(chunk.columns[i]);
    }
}

void RowTable::rechunk(size_t first, size_t last, const Flat& flat) {
    const size_t m = flat.starts.size();
    std::vector<Chunk> pieces;
    std::vector<size_t> bases;
    const size_t count = std::max<size_t>(1, (m + gChunkRows - 1) / gChunkRows);
    const size_t each = (m + count - 1) / count;
    for (size_t i = 0; i < m;) {
        // Up to `each` rows, fewer when their starts would not fit.
        const size_t base = flat.starts[i];
        size_t j = i + 1;
        while (j < m && j - i < each && flat.starts[j] - base <= kMaxOffset) ++j;
        Chunk piece;
        piece.offsets.reserve(j - i);
        for (size_t k = i; k < j; ++k) piece.offsets.push_back(static_cast<uint16_t>(flat.starts[k] - base));
        piece.states.assign(flat.states.begin() + static_cast<std::ptrdiff_t>(i),
                            flat.states.begin() + static_cast<std::ptrdiff_t>(j));
        piece.columns.assign(flat.columns.begin() + static_cast<std::ptrdiff_t>(i),
                             flat.columns.begin() + static_cast<std::ptrdiff_t>(j));
        pieces.push_back(std::move(piece));
        bases.push_back(base);
        i = j;
    }
    const auto at = [](size_t k) { return static_cast<std::ptrdiff_t>(k); };
    chunks_.erase(chunks_.begin() + at(first), chunks_.begin() + at(last + 1));
    bases_.erase(bases_.begin() + at(first), bases_.begin() + at(last + 1));
    chunks_.insert(chunks_.begin() + at(first), std::make_move_iterator(pieces.begin()),
                   std::make_move_iterator(pieces.end()));
    bases_.insert(bases_.begin() + at(first), bases.begin(), bases.end());
    renumber(first);
}

void RowTable::assign(const TextStore& text) {
    Flat flat;
    flat.starts.push_back(0);
    const size_t n = text.size();
    for (size_t at = text.findNewline(0); at < n; at = text.findNewline(at + 1)) flat.starts.push_back(at + 1);
    flat.states.assign(flat.starts.size(), RowState());
    flat.columns.assign(flat.starts.size(), kNoIndentCheck);
    rechunk(0, chunks_.size() - 1, flat);
}

void RowTable::replace(size_t first, size_t removed, const std::vector<size_t>& newStarts, size_t newTextSize,
                       size_t oldTextSize, const RowState* states, const int16_t* columns) {
    requireFits(newTextSize);
    const long delta = static_cast<long>(newTextSize) - static_cast<long>(oldTextSize);
    const size_t c = chunkOf(first);
    const size_t k = first - firstRows_[c];
    const size_t lastRemoved = first + removed;
    const size_t added = newStarts.size();
    Chunk& chunk = chunks_[c];
    chunk.leastKnown = false;
    if (lastRemoved < firstRows_[c + 1]) {
        const size_t rows = chunk.size() - removed + added;
        const size_t after = chunk.size() - (k + 1 + removed);  // rows of the chunk below the edit
        size_t lastOffset = 0;
        if (after > 0) lastOffset = static_cast<size_t>(static_cast<long>(chunk.offsets.back()) + delta);
        else if (added > 0) lastOffset = newStarts.back() - bases_[c];
        if (rows <= gMaxChunkRows && lastOffset <= kMaxOffset) {
            const auto at = [&](size_t i) { return static_cast<std::ptrdiff_t>(i); };
            if (removed > 0) {
                chunk.offsets.erase(chunk.offsets.begin() + at(k + 1), chunk.offsets.begin() + at(k + 1 + removed));
                chunk.states.erase(chunk.states.begin() + at(k + 1), chunk.states.begin() + at(k + 1 + removed));
                chunk.columns.erase(chunk.columns.begin() + at(k + 1), chunk.columns.begin() + at(k + 1 + removed));
            }
            if (added > 0) {
                roomFor(chunk.offsets, added);
                roomFor(chunk.states, added);
                roomFor(chunk.columns, added);
                std::vector<uint16_t> offsets(added);
                for (size_t i = 0; i < added; ++i) offsets[i] = static_cast<uint16_t>(newStarts[i] - bases_[c]);
                chunk.offsets.insert(chunk.offsets.begin() + at(k + 1), offsets.begin(), offsets.end());
                if (states) {
                    chunk.states.insert(chunk.states.begin() + at(k + 1), states, states + added);
                } else {
                    chunk.states.insert(chunk.states.begin() + at(k + 1), added, RowState());
                }
                if (columns) {
                    chunk.columns.insert(chunk.columns.begin() + at(k + 1), columns, columns + added);
                } else {
                    chunk.columns.insert(chunk.columns.begin() + at(k + 1), added, kNoIndentCheck);
                }
            }
            if (delta != 0) {
                const size_t from = k + 1 + added;
                addToEach(chunk.offsets.data() + from, chunk.offsets.size() - from, static_cast<uint16_t>(delta));
                shiftBases(c + 1, delta);
            }
            if (added != removed) renumber(c);
            if (rows < gMinChunkRows && chunks_.size() > 1) {
                // Joined with a neighbour, cut again.
                const size_t lo = c > 0 ? c - 1 : c;
                Flat flat;
                flatten(lo, 0, chunks_[lo].size(), 0, flat);
                flatten(lo + 1, 0, chunks_[lo + 1].size(), 0, flat);
                rechunk(lo, lo + 1, flat);
            }
            return;
        }
    }
    // Across chunks, or a chunk that outgrows itself: the chunks from the
    // edit's row to the last row it removes are laid out flat and cut again.
    const size_t c1 = chunkOf(lastRemoved);
    Flat flat;
    flatten(c, 0, k + 1, 0, flat);
    for (size_t i = 0; i < added; ++i) {
        flat.starts.push_back(newStarts[i]);
        flat.states.push_back(states ? states[i] : RowState());
        flat.columns.push_back(columns ? columns[i] : kNoIndentCheck);
    }
    flatten(c1, lastRemoved + 1 - firstRows_[c1], chunks_[c1].size(), delta, flat);
    shiftBases(c1 + 1, delta);
    rechunk(c, c1, flat);
}

size_t RowTable::bytesHeld() const noexcept {
    size_t held = chunks_.capacity() * sizeof(Chunk) + (bases_.capacity() + firstRows_.capacity()) * sizeof(size_t);
    for (const Chunk& c : chunks_) {
        held += c.offsets.capacity() * sizeof(uint16_t) + c.states.capacity() * sizeof(RowState) +
                c.columns.capacity() * sizeof(int16_t);
    }
    return held;
}

}  // namespace sdoc
