#pragma once

#include <sys/mman.h>

#include <cstddef>
#include <cstdlib>
#include <new>

namespace ox {

/// Allocator for the large arrays the grid walk reads at random: blocks of 2 MiB and more are
/// aligned to 2 MiB and offered to the kernel as huge pages, so that random reads over hundreds
/// of megabytes do not miss the address translation cache on almost every access.
template <class T>
struct LargeArrayAllocator {
    using value_type = T;
    static constexpr size_t kHugePage = size_t(2) << 20;
    /// Smaller blocks start on a cache line, so that fixed-size records never straddle one more
    /// line than they must.
    static constexpr std::align_val_t kSmallAlign{alignof(T) < 64 ? 64 : alignof(T)};

    LargeArrayAllocator() = default;
    template <class U>
    LargeArrayAllocator(const LargeArrayAllocator<U> &) {}

    /// Storage for n values.
    T *allocate(size_t n) {
        if (n > (size_t(-1) - kHugePage) / sizeof(T)) throw std::bad_alloc();
        size_t bytes = n * sizeof(T);
        if (bytes < kHugePage) {
            return static_cast<T *>(::operator new(bytes, kSmallAlign));
        }
        size_t rounded = (bytes + kHugePage - 1) / kHugePage * kHugePage;
        void *p = std::aligned_alloc(kHugePage, rounded);
        if (!p) throw std::bad_alloc();
        madvise(p, rounded, MADV_HUGEPAGE);  // only advice: failure leaves ordinary pages
        return static_cast<T *>(p);
    }
    /// Releases storage from allocate(n).
    void deallocate(T *p, size_t n) {
        size_t bytes = n * sizeof(T);
        if (bytes < kHugePage)
            ::operator delete(p, kSmallAlign);
        else
            std::free(p);
    }
    template <class U>
    bool operator==(const LargeArrayAllocator<U> &) const {
        return true;
    }
};

}  // namespace ox
