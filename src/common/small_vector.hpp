// A vector that keeps its first N items inline: the common case (an edit
// visits a handful of indices) allocates nothing.
#pragma once

#include <algorithm>
#include <cstddef>
#include <vector>

template <class T, size_t N>
class SmallVector {
public:
    size_t size() const noexcept { return heap_.empty() ? size_ : heap_.size(); }
    T* begin() noexcept { return heap_.empty() ? inline_ : heap_.data(); }
    T* end() noexcept { return begin() + size(); }
    T& operator[](size_t k) noexcept { return begin()[k]; }
    const T& operator[](size_t k) const noexcept {
        return (heap_.empty() ? inline_ : heap_.data())[k];
    }

    void push_back(const T& value) { insert(size(), value); }

    void insert(size_t at, const T& value) {
        if (heap_.empty() && size_ < N) {
            std::move_backward(inline_ + at, inline_ + size_, inline_ + size_ + 1);
            inline_[at] = value;
            ++size_;
            return;
        }
        if (heap_.empty()) heap_.assign(inline_, inline_ + size_);
        heap_.insert(heap_.begin() + static_cast<std::ptrdiff_t>(at), value);
    }

private:
    T inline_[N];
    size_t size_ = 0;
    std::vector<T> heap_;  // used once the inline part is full
};
