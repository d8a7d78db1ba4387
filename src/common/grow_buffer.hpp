// Memory for long reads that grows without moving what it holds when it can:
// a small block through realloc, a large one mapped apart from the heap and
// grown by remapping its pages. A large heap block would be copied at every
// doubling, and once freed would teach the allocator to hand back (and fault
// in again) the large blocks of the next long read.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <new>
#include <type_traits>
#include <utility>

#ifdef __linux__
#include <sys/mman.h>
#endif

class GrowBuffer {
public:
    GrowBuffer() = default;
    ~GrowBuffer() { release(); }
    GrowBuffer(const GrowBuffer&) = delete;
    GrowBuffer& operator=(const GrowBuffer&) = delete;

    uint8_t* data() const noexcept { return data_; }
    size_t capacity() const noexcept { return capacity_; }

    // Room for at least `n` bytes, the ones held kept.
    uint8_t* reserve(size_t n) {
        if (n <= capacity_) return data_;
#ifdef __linux__
        if (n >= kMapFrom) {
            const size_t bytes = (n + n / 8 + kPage - 1) / kPage * kPage;
            void* p = mapped_ ? mremap(data_, capacity_, bytes, MREMAP_MAYMOVE)
                              : mmap(nullptr, bytes, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
            if (p == MAP_FAILED) throw std::bad_alloc();
            // Faulted in 2 MB at a time where the system allows it.
            madvise(p, bytes, MADV_HUGEPAGE);
            if (!mapped_) {
                if (data_ != nullptr) std::memcpy(p, data_, capacity_);
                std::free(data_);
            }
            data_ = static_cast<uint8_t*>(p);
            capacity_ = bytes;
            mapped_ = true;
            return data_;
        }
#endif
        void* p = std::realloc(data_, n);
        if (p == nullptr) throw std::bad_alloc();
        data_ = static_cast<uint8_t*>(p);
        capacity_ = n;
        return data_;
    }

    void release() noexcept {
#ifdef __linux__
        if (mapped_) munmap(data_, capacity_);
        else std::free(data_);
#else
        std::free(data_);
#endif
        data_ = nullptr;
        capacity_ = 0;
        mapped_ = false;
    }

    void swap(GrowBuffer& other) noexcept {
        std::swap(data_, other.data_);
        std::swap(capacity_, other.capacity_);
        std::swap(mapped_, other.mapped_);
    }

private:
    static constexpr size_t kMapFrom = size_t{1} << 20;
    static constexpr size_t kPage = 4096;

    uint8_t* data_ = nullptr;
    size_t capacity_ = 0;
    bool mapped_ = false;
};

// The few vector operations a scanner's token list needs, over a GrowBuffer.
template <class T>
class PodVector {
    static_assert(std::is_trivially_copyable<T>::value, "items are moved as bytes");

public:
    size_t size() const noexcept { return size_; }
    bool empty() const noexcept { return size_ == 0; }
    size_t capacity() const noexcept { return bytes_.capacity() / sizeof(T); }
    T* data() noexcept { return reinterpret_cast<T*>(bytes_.data()); }
    const T* data() const noexcept { return reinterpret_cast<const T*>(bytes_.data()); }
    T& operator[](size_t k) noexcept { return data()[k]; }
    const T& operator[](size_t k) const noexcept { return data()[k]; }
    const T& front() const noexcept { return data()[0]; }
    const T& back() const noexcept { return data()[size_ - 1]; }

    void push_back(const T& value) {
        if (size_ == capacity()) bytes_.reserve(sizeof(T) * (size_ < 32 ? 64 : size_ * 2));
        data()[size_++] = value;
    }
    void clear() noexcept { size_ = 0; }
    // Lets the memory go.
    void release() noexcept {
        bytes_.release();
        size_ = 0;
    }
    void swap(PodVector& other) noexcept {
        bytes_.swap(other.bytes_);
        std::swap(size_, other.size_);
    }

private:
    GrowBuffer bytes_;
    size_t size_ = 0;
};
