#include "platform/mutex.h"

#if defined(__x86_64__) || defined(__i386__)
#include <immintrin.h>
#endif

namespace ox {
namespace {

inline void cpuRelax() {
#if defined(__x86_64__) || defined(__i386__)
    _mm_pause();
#endif
}

/// Adapts an OXMutex to the lock()/unlock() spelling the standard condition variable expects.
struct MutexRef {
    OXMutex &m;
    void lock() { m.lock(); }
    void unlock() { m.unlock(); }
};

}  // namespace

bool StdMutex::lock() {
    if (spin_) {
        for (int i = 0; i < kMutexSpinCount; ++i) {
            if (mutex_.try_lock()) return true;
            cpuRelax();
        }
    }
    mutex_.lock();
    return true;
}

std::unique_ptr<OXMutex> createMutex(bool spin, bool threaded) {
    if (!threaded) return std::make_unique<DummyMutex>();
    return std::make_unique<StdMutex>(spin);
}

std::unique_ptr<OXRWLock> createRWLock(bool threaded) {
    if (!threaded) return std::make_unique<OXRWLockDummy>();
    return std::make_unique<StdRWLock>();
}

void OXSignal::wait(OXMutex &mutex) {
    MutexRef ref{mutex};
    cv_.wait(ref);
}

bool OXSignal::waitUntil(OXMutex &mutex, std::chrono::steady_clock::time_point deadline) {
    MutexRef ref{mutex};
    return cv_.wait_until(ref, deadline) == std::cv_status::no_timeout;
}

std::unique_ptr<OXSignal> createSignal() { return std::make_unique<OXSignal>(); }

}  // namespace ox
