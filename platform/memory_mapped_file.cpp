#include "platform/memory_mapped_file.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <mutex>
#include <string>
#include <vector>

#include "core/message.h"

namespace ox {
namespace {

std::string tempDirectory() {
    const char *dir = std::getenv("TMPDIR");
    std::string d = (dir && *dir) ? dir : "/tmp";
    if (d.back() != '/') d += '/';
    return d;
}

}  // namespace

namespace {

/// Huge blocks given back and kept for the next request of their size (a new frame's layers
/// and tables then reuse the pages of the last one instead of faulting in and zero-filling
/// fresh ones), up to kKeptHugeBytes in all, the oldest going first. They are marked as
/// lazily freeable: under memory pressure the kernel takes their pages back (a reuse then
/// faults in zero pages like a fresh block).
struct HugeBlockCache {
    std::mutex mutex;
    struct Kept {
        void *data;
        uint64_t size;
    };
    std::vector<Kept> kept;  // oldest first
    uint64_t total = 0;
};

HugeBlockCache &hugeBlockCache() {
    static HugeBlockCache *cache = new HugeBlockCache;  // never destroyed: used up to the exit
    return *cache;
}

uint64_t hugeRounded(uint64_t bytes) { return (bytes + kHugePage - 1) & ~(kHugePage - 1); }

}  // namespace

void *allocateHugeBlock(uint64_t bytes, bool zeroed) {
    if (bytes == 0 || bytes > SIZE_MAX - 2 * kHugePage) return nullptr;
    const uint64_t size = hugeRounded(bytes);
    std::vector<HugeBlockCache::Kept> drop;
    {
        HugeBlockCache &cache = hugeBlockCache();
        std::unique_lock<std::mutex> lock(cache.mutex);
        // The newest first: its pages are the likeliest to be still there.
        for (auto it = cache.kept.rbegin(); it != cache.kept.rend(); ++it) {
            if (it->size != size) continue;
            void *p = it->data;
            cache.total -= size;
            cache.kept.erase(std::next(it).base());
            lock.unlock();
            if (zeroed) std::memset(p, 0, size_t(bytes));
            return p;
        }
        // A new block: as much kept memory goes, the oldest first, so that keeping blocks
        // never makes the process larger than it would be without.
        uint64_t freed = 0;
        while (freed < size && !cache.kept.empty()) {
            drop.push_back(cache.kept.front());
            freed += cache.kept.front().size;
            cache.total -= cache.kept.front().size;
            cache.kept.erase(cache.kept.begin());
        }
    }
    for (const auto &k : drop) munmap(k.data, size_t(k.size));
    const size_t span = size_t(size + kHugePage);
    void *p = mmap(nullptr, span, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
    if (p == MAP_FAILED) return nullptr;
    const uintptr_t start = reinterpret_cast<uintptr_t>(p);
    const uintptr_t aligned = (start + kHugePage - 1) & ~uintptr_t(kHugePage - 1);
    // The slack before and after the aligned range goes back at once.
    if (aligned > start) munmap(p, aligned - start);
    const size_t tail = span - (aligned - start) - size_t(size);
    if (tail > 0) munmap(reinterpret_cast<void *>(aligned + size_t(size)), tail);
    madvise(reinterpret_cast<void *>(aligned), size_t(size), MADV_HUGEPAGE);  // advice only
    return reinterpret_cast<void *>(aligned);
}

void releaseHugeBlock(void *block, uint64_t bytes) {
    if (!block) return;
    const uint64_t size = hugeRounded(bytes);
    if (size > kKeptHugeBytes) {
        munmap(block, size_t(size));
        return;
    }
#ifdef MADV_FREE
    madvise(block, size_t(size), MADV_FREE);
#endif
    std::vector<HugeBlockCache::Kept> drop;
    {
        HugeBlockCache &cache = hugeBlockCache();
        std::lock_guard<std::mutex> lock(cache.mutex);
        cache.kept.push_back({block, size});
        cache.total += size;
        while (cache.total > kKeptHugeBytes) {
            drop.push_back(cache.kept.front());
            cache.total -= cache.kept.front().size;
            cache.kept.erase(cache.kept.begin());
        }
    }
    for (const auto &k : drop) munmap(k.data, size_t(k.size));
}

uint64_t keptHugeBytes() {
    HugeBlockCache &cache = hugeBlockCache();
    std::lock_guard<std::mutex> lock(cache.mutex);
    return cache.total;
}

MemoryMappedFile::MemoryMappedFile(uint64_t size, uint64_t memoryLimit) : size_(size) {
    if (size == 0) return;
    if (size <= memoryLimit) {
        if (size > SIZE_MAX) {
            fail("Cannot allocate memory block", ENOMEM);
            return;
        }
        if (size >= kHugePage) {
            base_ = static_cast<unsigned char *>(allocateHugeBlock(size));
            huge_ = base_ != nullptr;
        }
        if (!base_) base_ = static_cast<unsigned char *>(std::calloc(size_t(size), 1));
        if (!base_) fail("Cannot allocate memory block", ENOMEM);
        return;
    }
    message(kMsgInfo, 6, "Mapping memory to file");
    std::string path = tempDirectory() + kFilePrefix + "XXXXXX";
    fd_ = mkostemp(path.data(), O_CLOEXEC);
    if (fd_ < 0) {
        fail("Cannot create temporary file", errno);
        return;
    }
    // The name goes at once: the open descriptor keeps the data, and the file disappears
    // with the last descriptor, whether the block is released or the process dies.
    unlink(path.c_str());
    // Reserving the blocks now turns a full disk into a clean failure here instead of a
    // fault at the first write through the mapping.
    int err = posix_fallocate(fd_, 0, off_t(size));
    if (err == EOPNOTSUPP || err == EINVAL) err = ftruncate(fd_, off_t(size)) == 0 ? 0 : errno;
    if (err != 0) {
        fail("Cannot size temporary file", err);
        return;
    }
    void *p = mmap(nullptr, size_t(size), PROT_READ | PROT_WRITE, MAP_SHARED, fd_, 0);
    if (p == MAP_FAILED) {
        fail("Cannot map temporary file", errno);
        return;
    }
    base_ = static_cast<unsigned char *>(p);
}

MemoryMappedFile::~MemoryMappedFile() {
    if (fd_ >= 0) {
        if (base_) munmap(base_, size_t(size_));
        close(fd_);
    } else if (huge_) {
        releaseHugeBlock(base_, size_);
    } else {
        std::free(base_);
    }
}

void MemoryMappedFile::fail(const char *what, int error) {
    // One line: the system's text is cut at its first line break.
    std::string text = std::strerror(error);
    text = text.substr(0, text.find_first_of("\r\n"));
    message(kMsgError, 6, "%s (%llu bytes): %s", what, (unsigned long long)size_, text.c_str());
    if (fd_ >= 0) {
        close(fd_);
        fd_ = -1;
    }
    base_ = nullptr;  // every failure happens before the block exists
    failed_ = true;
}

void *MemoryMappedFile::map(uint64_t offset, uint64_t size) {
    if (!base_ || !inRange(offset, size)) return nullptr;
    return base_ + offset;
}

uint64_t MemoryMappedFile::allocationGranularity() {
    long page = sysconf(_SC_PAGESIZE);
    return page > 0 ? uint64_t(page) : 4096;
}

bool MemoryMappedFile::read(uint64_t offset, void *destination, uint64_t size) const {
    if (size == 0) return inRange(offset, 0);
    if (!base_ || !inRange(offset, size)) return false;
    std::memcpy(destination, base_ + offset, size_t(size));
    return true;
}

bool MemoryMappedFile::write(uint64_t offset, const void *source, uint64_t size) {
    if (size == 0) return inRange(offset, 0);
    if (!base_ || !inRange(offset, size)) return false;
    std::memcpy(base_ + offset, source, size_t(size));
    return true;
}

}  // namespace ox
