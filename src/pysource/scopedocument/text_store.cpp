#include "pysource/scopedocument/text_store.hpp"

#include "common/pycompat.hpp"

#include <algorithm>
#include <limits>
#include <new>

namespace sdoc {

namespace {

inline uint32_t charAt(const void* data, int width, size_t i) noexcept {
    switch (width) {
    case 1: return static_cast<const uint8_t*>(data)[i];
    case 2: return static_cast<const uint16_t*>(data)[i];
    default: return static_cast<const uint32_t*>(data)[i];
    }
}

// The width a character needs.
inline int widthOf(uint32_t c) noexcept { return c < 0x100 ? 1 : c < 0x10000 ? 2 : 4; }

// Offsets are kept in 32 bits; a text must fit them.
void requireFits(size_t chars) {
    if (chars >= std::numeric_limits<uint32_t>::max()) {
        PyErr_SetString(PyExc_OverflowError, "a document holds fewer than 2**32 - 1 characters");
        throw py::Error{};
    }
}

}  // namespace

// --- TextStore -----------------------------------------------------------------

void TextStore::assign(const void* data, int width, size_t n) {
    requireFits(n);
    int need = 1;
    if (width > 1) {
        for (size_t i = 0; i < n && need < width; ++i) need = std::max(need, widthOf(charAt(data, width, i)));
    }
    carriageReturns_ = 0;
    for (size_t i = 0; i < n; ++i) carriageReturns_ += charAt(data, width, i) == '\r';
    std::vector<uint8_t> fresh((n + 64) * need);
    buf_.swap(fresh);
    width_ = need;
    capacity_ = n + 64;
    size_ = n;
    gapStart_ = n;
    gapEnd_ = capacity_;
    if (width == need) {
        if (n) std::memcpy(buf_.data(), data, n * width);
    } else {
        for (size_t i = 0; i < n; ++i) store(i, charAt(data, width, i));
    }
}

void TextStore::moveGap(size_t pos) noexcept {
    if (pos == gapStart_) return;
    const size_t gap = gapEnd_ - gapStart_;
    uint8_t* b = buf_.data();
    const size_t w = static_cast<size_t>(width_);
    if (pos < gapStart_) {
        // Characters pos..gapStart_ go to the far side of the gap.
        std::memmove(b + (pos + gap) * w, b + pos * w, (gapStart_ - pos) * w);
    } else {
        std::memmove(b + gapStart_ * w, b + gapEnd_ * w, (pos - gapStart_) * w);
    }
    gapStart_ = pos;
    gapEnd_ = pos + gap;
}

void TextStore::reserveGap(size_t chars) {
    if (gapEnd_ - gapStart_ >= chars) return;
    requireFits(size_ + chars);
    const size_t capacity = size_ + chars + std::max<size_t>(64, size_ / 8);
    std::vector<uint8_t> fresh(capacity * width_);
    const size_t w = static_cast<size_t>(width_);
    const size_t tail = capacity_ - gapEnd_;
    if (gapStart_) std::memcpy(fresh.data(), buf_.data(), gapStart_ * w);
    if (tail) std::memcpy(fresh.data() + (capacity - tail) * w, buf_.data() + gapEnd_ * w, tail * w);
    buf_.swap(fresh);
    gapEnd_ = capacity - tail;
    capacity_ = capacity;
}

void TextStore::widen(int width) {
    std::vector<uint8_t> fresh(capacity_ * width);
    const int old = width_;
    std::vector<uint8_t> oldBuf;
    oldBuf.swap(buf_);
    buf_.swap(fresh);
    width_ = width;
    for (size_t k = 0; k < gapStart_; ++k) store(k, charAt(oldBuf.data(), old, k));
    for (size_t k = gapEnd_; k < capacity_; ++k) store(k, charAt(oldBuf.data(), old, k));
}

void TextStore::replace(size_t start, size_t end, const void* data, int width, size_t n) {
    int need = width_;
    if (width > width_) {
        for (size_t i = 0; i < n && need < width; ++i) need = std::max(need, widthOf(charAt(data, width, i)));
    }
    if (need > width_) widen(need);
    for (size_t i = start; i < end; ++i) carriageReturns_ -= at(i) == '\r';
    for (size_t i = 0; i < n; ++i) carriageReturns_ += charAt(data, width, i) == '\r';
    moveGap(end);
    // The removed characters join the gap.
    gapStart_ = start;
    size_ -= end - start;
    reserveGap(n);
    if (width == width_) {
        if (n) std::memcpy(buf_.data() + gapStart_ * width_, data, n * width_);
    } else {
        for (size_t i = 0; i < n; ++i) store(gapStart_ + i, charAt(data, width, i));
    }
    gapStart_ += n;
    size_ += n;
}

const void* TextStore::contiguousFrom(size_t pos) {
    moveGap(pos);
    return buf_.data() + gapEnd_ * width_;
}

void TextStore::copyOut(size_t start, size_t end, std::vector<uint32_t>& out) const {
    out.reserve(out.size() + (end - start));
    for (size_t i = start; i < end; ++i) out.push_back(at(i));
}

PyObject* TextStore::slice(size_t start, size_t end) {
    const size_t w = static_cast<size_t>(width_);
    const uint8_t* b = buf_.data();
    if (end <= gapStart_) return py::check(compat::strFromWidth(b + start * w, width_, end - start)).release();
    if (start >= gapStart_) {
        const size_t gap = gapEnd_ - gapStart_;
        return py::check(compat::strFromWidth(b + (start + gap) * w, width_, end - start)).release();
    }
    // Across the gap: moved so that the slice is contiguous.
    moveGap(end);
    return py::check(compat::strFromWidth(b + start * w, width_, end - start)).release();
}

size_t TextStore::findNewline(size_t from) const noexcept {
    const size_t gap = gapEnd_ - gapStart_;
    auto scan = [&](size_t lo, size_t hi, size_t shift) -> size_t {
        // [lo, hi) in text positions, stored at + shift.
        if (width_ == 1) {
            const void* p = lo < hi ? std::memchr(buf_.data() + lo + shift, '\n', hi - lo) : nullptr;
            return p ? static_cast<const uint8_t*>(p) - buf_.data() - shift : hi + 1;
        }
        for (size_t i = lo; i < hi; ++i) {
            if (charAt(buf_.data(), width_, i + shift) == '\n') return i;
        }
        return hi + 1;
    };
    if (from < gapStart_) {
        const size_t found = scan(from, gapStart_, 0);
        if (found < gapStart_) return found;
        from = gapStart_;
    }
    const size_t found = scan(from, size_, gap);
    return found < size_ ? found : size_;
}

// --- RowTable ------------------------------------------------------------------

void RowTable::assign(const TextStore& text) {
    std::vector<uint32_t> starts;
    starts.push_back(0);
    const size_t n = text.size();
    for (size_t at = text.findNewline(0); at < n; at = text.findNewline(at + 1)) {
        starts.push_back(static_cast<uint32_t>(at + 1));
    }
    const size_t rows = starts.size();
    const size_t capacity = rows + 16;
    // Exactly that: pushing left up to twice the room.
    starts_.assign(capacity, 0);
    std::copy(starts.begin(), starts.end(), starts_.begin());
    states_.assign(capacity, RowState());
    columns_.assign(capacity, kNoIndentCheck);
    gapStart_ = rows;
    gapEnd_ = capacity;
}

void RowTable::moveGap(size_t pos, size_t textSize) noexcept {
    if (pos == gapStart_) return;
    // The rows that cross the gap move as blocks; their starts change from
    // offsets from the start to offsets from the end, or back.
    size_t from, to, k;
    if (pos < gapStart_) {
        k = gapStart_ - pos;
        from = pos;
        to = gapEnd_ - k;
        gapStart_ = pos;
        gapEnd_ = to;
    } else {
        k = pos - gapStart_;
        from = gapEnd_;
        to = gapStart_;
        gapStart_ += k;
        gapEnd_ += k;
    }
    std::memmove(&starts_[to], &starts_[from], k * sizeof(uint32_t));
    std::memmove(&states_[to], &states_[from], k * sizeof(RowState));
    std::memmove(&columns_[to], &columns_[from], k * sizeof(int16_t));
    const uint32_t size = static_cast<uint32_t>(textSize);
    uint32_t* starts = &starts_[to];
    for (size_t i = 0; i < k; ++i) starts[i] = size - starts[i];
}

void RowTable::reserveGap(size_t rows, size_t textSize) {
    if (gap() >= rows) return;
    (void)textSize;
    const size_t used = count();
    // A thirty-second spare: a line count that changes often reuses it,
    // and the rows stay near 14 bytes each.
    const size_t capacity = used + rows + std::max<size_t>(16, used / 32);
    const size_t tail = starts_.size() - gapEnd_;
    auto grow = [&](auto& v, auto fill) {
        using V = std::decay_t<decltype(v)>;
        V fresh(capacity, fill);
        std::copy(v.begin(), v.begin() + gapStart_, fresh.begin());
        std::copy(v.begin() + gapEnd_, v.end(), fresh.end() - tail);
        v.swap(fresh);
    };
    grow(starts_, uint32_t(0));
    grow(states_, RowState());
    grow(columns_, kNoIndentCheck);
    gapEnd_ = capacity - tail;
}

void RowTable::replace(size_t first, size_t removed, const std::vector<size_t>& newStarts, size_t newTextSize,
                       size_t oldTextSize, const RowState* states, const int16_t* columns) {
    requireFits(newTextSize);
    // The rows after first+removed keep their offsets from the end; those
    // up to `first` keep theirs from the start.
    moveGap(first + 1 + removed, oldTextSize);
    gapStart_ = first + 1;
    reserveGap(newStarts.size(), newTextSize);
    for (size_t k = 0; k < newStarts.size(); ++k) {
        starts_[gapStart_] = static_cast<uint32_t>(newStarts[k]);
        states_[gapStart_] = states ? states[k] : RowState();
        columns_[gapStart_] = columns ? columns[k] : kNoIndentCheck;
        ++gapStart_;
    }
}

}  // namespace sdoc
