#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

/// A large memory block: plain memory up to kMemoryLimit bytes (from 2 MiB on a mapping of its
/// own offered as huge pages), above that a mapped temporary file, so that huge frame and
/// texture buffers do not fail for lack of memory.
namespace ox {

/// The huge page size that allocateHugeBlock aligns and rounds to (2 MiB).
constexpr uint64_t kHugePage = uint64_t(2) << 20;

/// Memory of at least `bytes` bytes in an anonymous mapping of its own, aligned to kHugePage
/// and offered to the kernel as huge pages: a large block then faults in and zero-fills in
/// 2 MiB steps instead of 4 KiB ones, and walks over it miss the TLB far less. A block given
/// back before is reused when one of the same rounded size is kept (see releaseHugeBlock);
/// otherwise kept blocks at least as large as the new one are unmapped first.
/// Zero-filled when `zeroed`, else of undefined contents. Null when it cannot be had. Give it
/// back with releaseHugeBlock and the same size.
void *allocateHugeBlock(uint64_t bytes, bool zeroed = true);
/// Gives back a block from allocateHugeBlock (null is ignored). It is kept for reuse while
/// the blocks kept stay within kKeptHugeBytes (the oldest are unmapped first), its pages left
/// for the kernel to take back under memory pressure.
void releaseHugeBlock(void *block, uint64_t bytes);
/// The most bytes of given-back huge blocks kept for reuse (1 GiB).
constexpr uint64_t kKeptHugeBytes = uint64_t(1) << 30;
/// The bytes of given-back huge blocks kept now.
uint64_t keptHugeBytes();

class MemoryMappedFile {
public:
    /// Blocks up to this size (256 MiB) live in plain memory.
    static constexpr uint64_t kMemoryLimit = 268435456;
    /// Name prefix of the temporary files.
    static constexpr const char *kFilePrefix = "OXR";

    /// A zero-filled block of `size` bytes; blocks above memoryLimit go to a temporary file
    /// in the temporary directory ($TMPDIR, else /tmp). The file is removed from the directory
    /// right after it is made, so nothing is left behind even when the process dies. On
    /// failure one error message is logged and ok() is false.
    explicit MemoryMappedFile(uint64_t size, uint64_t memoryLimit = kMemoryLimit);
    ~MemoryMappedFile();
    MemoryMappedFile(const MemoryMappedFile &) = delete;
    MemoryMappedFile &operator=(const MemoryMappedFile &) = delete;

    /// True when the block is usable.
    bool ok() const { return base_ != nullptr || (size_ == 0 && !failed_); }
    /// The size in bytes.
    uint64_t size() const { return size_; }
    /// True when the block lives in a temporary file.
    bool isFileBacked() const { return fd_ >= 0; }

    /// A pointer to bytes [offset, offset + size) of the block, valid until the block is
    /// destroyed; null when the range is outside the block.
    void *map(uint64_t offset, uint64_t size);
    /// Ends the use of a pointer from map (the whole block stays mapped; nothing to do).
    void unmap() {}
    /// The granularity of mapping offsets (the page size).
    static uint64_t allocationGranularity();

    /// Copies bytes out of the block; false when the range is outside it.
    bool read(uint64_t offset, void *destination, uint64_t size) const;
    /// Copies bytes into the block; false when the range is outside it.
    bool write(uint64_t offset, const void *source, uint64_t size);

private:
    bool inRange(uint64_t offset, uint64_t size) const {
        return offset <= size_ && size <= size_ - offset;
    }
    void fail(const char *what, int error);

    uint64_t size_ = 0;
    unsigned char *base_ = nullptr;
    bool huge_ = false;  // a plain block from allocateHugeBlock (else from calloc)
    int fd_ = -1;
    bool failed_ = false;
};

}  // namespace ox
