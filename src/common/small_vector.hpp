// A vector that keeps its first N items inline: the common case (an edit
// visits a handful of indices, a name is defined once in a scope) allocates
// nothing. The inline items and the heap's pointer share their bytes, so
// that one is no larger than it must be (the definition index holds one per
// defined name).
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>
#include <type_traits>

template <class T, size_t N>
class SmallVector {
    static_assert(std::is_trivially_copyable<T>::value, "items are moved as bytes");

public:
    SmallVector() noexcept {}
    ~SmallVector() { release(); }
    // Unset inline slots must not be copied.
    SmallVector(const SmallVector&) = delete;
    SmallVector& operator=(const SmallVector&) = delete;

    size_t size() const noexcept { return size_; }
    bool empty() const noexcept { return size_ == 0; }
    T* begin() noexcept { return onHeap_ ? heap_.data : inline_; }
    T* end() noexcept { return begin() + size_; }
    const T* begin() const noexcept { return onHeap_ ? heap_.data : inline_; }
    const T* end() const noexcept { return begin() + size_; }
    T& operator[](size_t k) noexcept { return begin()[k]; }
    const T& operator[](size_t k) const noexcept { return begin()[k]; }

    void push_back(const T& value) { insert(size_, value); }

    void insert(size_t at, const T& value) {
        if (size_ == capacity()) grow();
        T* items = begin();
        std::memmove(static_cast<void*>(items + at + 1), items + at, (size_ - at) * sizeof(T));
        items[at] = value;
        ++size_;
    }

    void erase(size_t at) noexcept {
        T* items = begin();
        std::memmove(static_cast<void*>(items + at), items + at + 1, (size_ - at - 1) * sizeof(T));
        --size_;
    }

    void clear() noexcept {
        release();
        size_ = 0;
    }

private:
    size_t capacity() const noexcept { return onHeap_ ? heap_.capacity : N; }

    void grow() {
        const size_t more = capacity() * 2;
        if (more > UINT32_MAX) throw std::bad_alloc();
        T* items = static_cast<T*>(::operator new(more * sizeof(T)));
        std::memcpy(static_cast<void*>(items), begin(), size_ * sizeof(T));
        release();
        heap_.data = items;
        heap_.capacity = static_cast<uint32_t>(more);
        onHeap_ = true;
    }

    void release() noexcept {
        if (onHeap_) ::operator delete(heap_.data);
        onHeap_ = false;
    }

    union {
        T inline_[N];  // items past size_ are never read: left as they come
        struct {
            T* data;
            uint32_t capacity;
        } heap_;
    };
    uint32_t size_ = 0;
    bool onHeap_ = false;
};
