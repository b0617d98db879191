#pragma once

#include <cstdint>
#include <cstring>
#include <memory>

#include "platform/memory_mapped_file.h"

/// The storage block under every frame layer.
namespace ox {

/// A zero-filled block of `count` elements of T, in plain memory up to the spill limit and in
/// a mapped temporary file above it. The mapping is fixed once the block exists, so copies into
/// or out of disjoint element ranges may run from any number of threads without a lock; the
/// owner orders copies that touch the same range.
template <typename T>
class LargeMemory {
public:
    /// A block of count elements; memoryLimit is the spill limit in bytes (for tests). The
    /// byte size is computed in 64 bits: a count whose size cannot be represented, or a block
    /// that cannot be obtained, leaves ok() false (the block logs its own reason).
    explicit LargeMemory(uint64_t count, uint64_t memoryLimit = MemoryMappedFile::kMemoryLimit)
        : count_(count) {
        uint64_t bytes = 0;
        if (__builtin_mul_overflow(count, uint64_t(sizeof(T)), &bytes)) return;
        file_ = std::make_unique<MemoryMappedFile>(bytes, memoryLimit);
        if (!file_->ok() || bytes == 0) return;
        data_ = static_cast<T *>(file_->map(0, bytes));
    }
    LargeMemory(const LargeMemory &) = delete;
    LargeMemory &operator=(const LargeMemory &) = delete;

    /// True when the block is usable.
    bool ok() const { return data_ != nullptr || (count_ == 0 && file_ && file_->ok()); }
    /// The number of elements.
    uint64_t count() const { return count_; }
    /// True when the block lives in a temporary file.
    bool isFileBacked() const { return file_ && file_->isFileBacked(); }
    /// The first element (null when the block is empty or failed).
    T *data() { return data_; }

    /// Copies n elements from source to elements [index, index + n).
    void copyIn(uint64_t index, const T *source, uint64_t n) {
        std::memcpy(data_ + index, source, n * sizeof(T));
    }
    /// Copies elements [index, index + n) to destination.
    void copyOut(uint64_t index, T *destination, uint64_t n) {
        std::memcpy(destination, data_ + index, n * sizeof(T));
    }

private:
    uint64_t count_;
    std::unique_ptr<MemoryMappedFile> file_;
    T *data_ = nullptr;
};

}  // namespace ox
