#pragma once

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <shared_mutex>

/// Locks of the system: mutexes, reader/writer locks and condition signals, each with a
/// factory; the non-threaded variants do nothing.
namespace ox {

/// Spins before a contended lock blocks.
constexpr int kMutexSpinCount = 400;

/// A mutual-exclusion lock.
class OXMutex {
public:
    /// Takes the lock, blocking; always returns true.
    virtual bool lock() = 0;
    /// Takes the lock if it is free; true when taken.
    virtual bool tryLock() = 0;
    /// Releases the lock.
    virtual void unlock() = 0;
    virtual ~OXMutex() = default;
};

/// A mutex that does nothing, for objects used by one thread only.
class DummyMutex final : public OXMutex {
public:
    bool lock() override { return true; }
    bool tryLock() override { return true; }
    void unlock() override {}
};

/// The threaded mutex: optionally spins kMutexSpinCount times before it blocks.
class StdMutex final : public OXMutex {
public:
    /// spin = true tries kMutexSpinCount times before blocking.
    explicit StdMutex(bool spin = true) : spin_(spin) {}
    bool lock() override;
    bool tryLock() override { return mutex_.try_lock(); }
    void unlock() override { mutex_.unlock(); }

private:
    std::mutex mutex_;
    bool spin_;
};

/// Makes a mutex: threaded = false gives a DummyMutex.
std::unique_ptr<OXMutex> createMutex(bool spin, bool threaded);

/// A mutex that can be a static or global object (constant-initialised, never destroyed
/// before its users), for process-wide locks.
class OXStaticMutex {
public:
    constexpr OXStaticMutex() = default;
    /// Takes the lock.
    void lock() { mutex_.lock(); }
    /// Releases the lock.
    void unlock() { mutex_.unlock(); }
    /// Takes the lock if it is free.
    bool tryLock() { return mutex_.try_lock(); }

private:
    std::mutex mutex_;
};

/// Holds an OXMutex (or OXStaticMutex) for a scope.
template <typename M>
class OXScopedLock {
public:
    /// Locks m until the end of the scope.
    explicit OXScopedLock(M &m) : m_(m) { m_.lock(); }
    ~OXScopedLock() { m_.unlock(); }
    OXScopedLock(const OXScopedLock &) = delete;
    OXScopedLock &operator=(const OXScopedLock &) = delete;

private:
    M &m_;
};

/// A reader/writer lock: many readers or one writer.
class OXRWLock {
public:
    virtual ~OXRWLock() = default;
    /// Takes the lock for reading (shared).
    virtual void lockRead() = 0;
    /// Takes the lock for writing (exclusive).
    virtual void lockWrite() = 0;
    /// Releases a read lock.
    virtual void unlockRead() = 0;
    /// Releases the write lock.
    virtual void unlockWrite() = 0;
};

/// The reader/writer lock that does nothing.
class OXRWLockDummy final : public OXRWLock {
public:
    void lockRead() override {}
    void lockWrite() override {}
    void unlockRead() override {}
    void unlockWrite() override {}
};

/// The threaded reader/writer lock over the platform's shared mutex.
class StdRWLock final : public OXRWLock {
public:
    void lockRead() override { mutex_.lock_shared(); }
    void lockWrite() override { mutex_.lock(); }
    void unlockRead() override { mutex_.unlock_shared(); }
    void unlockWrite() override { mutex_.unlock(); }

private:
    std::shared_mutex mutex_;
};

/// Makes a reader/writer lock: threaded = false gives an OXRWLockDummy.
std::unique_ptr<OXRWLock> createRWLock(bool threaded);

/// A condition signal over the platform's condition variable. A wake-up says only "look
/// again": callers test their condition in a loop, which the predicate forms of wait do.
class OXSignal final {
public:
    /// Releases mutex, sleeps until signalled (or a spurious wake-up), then retakes mutex.
    /// The caller must hold mutex, and it must be a threaded one.
    void wait(OXMutex &mutex);
    /// Wakes one waiter.
    void signal() { cv_.notify_one(); }
    /// Wakes all waiters.
    void broadcast() { cv_.notify_all(); }

    /// Waits until ready() holds; ready() is evaluated with mutex held.
    template <typename Pred>
    void wait(OXMutex &mutex, Pred ready) {
        while (!ready()) wait(mutex);
    }

    /// Waits until ready() holds or `seconds` have passed; returns ready().
    template <typename Pred>
    bool waitFor(OXMutex &mutex, double seconds, Pred ready) {
        auto deadline = std::chrono::steady_clock::now() +
                        std::chrono::duration_cast<std::chrono::steady_clock::duration>(
                            std::chrono::duration<double>(seconds > 0.0 ? seconds : 0.0));
        while (!ready()) {
            if (!waitUntil(mutex, deadline)) return ready();
        }
        return true;
    }

private:
    /// One wait bounded by deadline; false when the deadline passed.
    bool waitUntil(OXMutex &mutex, std::chrono::steady_clock::time_point deadline);

    std::condition_variable_any cv_;
};

/// Makes a condition signal.
std::unique_ptr<OXSignal> createSignal();

}  // namespace ox
