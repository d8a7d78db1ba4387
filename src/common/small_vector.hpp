// A vector that keeps its first N items inline: the common case (an edit
// visits a handful of indices, a name is defined once in a scope) allocates
// nothing.
#pragma once

#include <algorithm>
#include <cstddef>
#include <vector>

template <class T, size_t N>
class SmallVector {
public:
    SmallVector() = default;
    // Unset inline slots must not be copied.
    SmallVector(const SmallVector&) = delete;
    SmallVector& operator=(const SmallVector&) = delete;

    size_t size() const noexcept { return onHeap_ ? heap_.size() : size_; }
    bool empty() const noexcept { return size() == 0; }
    T* begin() noexcept { return onHeap_ ? heap_.data() : inline_; }
    T* end() noexcept { return begin() + size(); }
    const T* begin() const noexcept { return onHeap_ ? heap_.data() : inline_; }
    const T* end() const noexcept { return begin() + size(); }
    T& operator[](size_t k) noexcept { return begin()[k]; }
    const T& operator[](size_t k) const noexcept { return begin()[k]; }

    void push_back(const T& value) { insert(size(), value); }

    void insert(size_t at, const T& value) {
        if (!onHeap_ && size_ < N) {
            std::move_backward(inline_ + at, inline_ + size_, inline_ + size_ + 1);
            inline_[at] = value;
            ++size_;
            return;
        }
        if (!onHeap_) {
            heap_.assign(inline_, inline_ + size_);
            onHeap_ = true;
        }
        heap_.insert(heap_.begin() + static_cast<std::ptrdiff_t>(at), value);
    }

    void erase(size_t at) {
        if (onHeap_) {
            heap_.erase(heap_.begin() + static_cast<std::ptrdiff_t>(at));
            return;
        }
        std::move(inline_ + at + 1, inline_ + size_, inline_ + at);
        --size_;
    }

    void clear() noexcept {
        heap_.clear();
        onHeap_ = false;
        size_ = 0;
    }

private:
    T inline_[N];  // items past size_ are never read: left as they come
    size_t size_ = 0;
    bool onHeap_ = false;
    std::vector<T> heap_;
};
