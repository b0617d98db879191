#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>

/// Threads of the system: the thread object, the platform thread under it (threaded or a
/// dummy that runs inline), the thread-local slot, sleep and atomic counters.
namespace ox {

/// Something a thread runs.
class Runnable {
public:
    virtual ~Runnable() = default;
    /// The body of the thread.
    virtual void run() = 0;
};

class OXThread;

/// A platform thread that runs one Runnable.
class MiniThread {
public:
    virtual ~MiniThread() = default;
    /// Starts the thread; does nothing while it is running. False when it could not start.
    virtual bool start() = 0;
    /// Waits for the end of the thread (no time-out) and clears the running flag.
    virtual void join() = 0;
    /// True from start until the Runnable's run returns.
    virtual bool isRunning() const = 0;
    /// Stores the owning thread object in the calling thread's thread-local slot.
    virtual void bindThreadLocal() = 0;
};

/// A platform thread over std::thread. The destructor joins a thread still running.
class StdThread final : public MiniThread {
public:
    /// runnable is run on the new thread; owner (may be null) goes into its thread-local slot.
    StdThread(Runnable *runnable, OXThread *owner, std::string name = {});
    ~StdThread() override;
    bool start() override;
    void join() override;
    bool isRunning() const override { return running_.load(std::memory_order_acquire); }
    void bindThreadLocal() override;

private:
    void entry();

    Runnable *runnable_;
    OXThread *owner_;
    std::string name_;
    std::thread thread_;
    std::atomic<bool> running_{false};
};

/// The non-threaded thread: start runs the Runnable to its end on the calling thread.
class DummyThread final : public MiniThread {
public:
    /// runnable runs inline at start; owner (may be null) is the thread-local object meanwhile.
    DummyThread(Runnable *runnable, OXThread *owner) : runnable_(runnable), owner_(owner) {}
    bool start() override;
    void join() override {}
    bool isRunning() const override { return running_; }
    void bindThreadLocal() override;

private:
    Runnable *runnable_;
    OXThread *owner_;
    bool running_ = false;
};

/// Makes a platform thread for runnable: threaded = false gives a DummyThread. The name
/// (cut to 15 characters) shows in debuggers and process listings.
std::unique_ptr<MiniThread> createMiniThread(Runnable *runnable, OXThread *owner, bool threaded,
                                             const std::string &name = {});

/// The base of every thread of the system: subclass, implement run, then start and join.
class OXThread : public Runnable {
public:
    /// threaded = false runs the body inline at start.
    explicit OXThread(bool threaded = true) : threaded_(threaded) {}
    ~OXThread() override;
    OXThread(const OXThread &) = delete;
    OXThread &operator=(const OXThread &) = delete;

    /// The thread's name for diagnostics.
    virtual std::string name() const { return "OXThread"; }

    /// Starts the thread (nothing while it runs); false when the platform refused.
    bool start();
    /// Waits for the thread to end.
    void join();
    /// True while the body runs.
    bool isRunning() const { return thread_ && thread_->isRunning(); }

    /// The thread object of the calling thread, or null on a thread this system did not start.
    static OXThread *current();

private:
    friend class StdThread;
    friend class DummyThread;
    static void setCurrent(OXThread *thread);

    bool threaded_;
    std::unique_ptr<MiniThread> thread_;
};

/// Sleeps for seconds × 1000 milliseconds, rounded towards zero (nothing for 0 or less).
void sleep(float seconds);

/// Adds 1 and returns the new value.
inline int32_t atomicIncrement(std::atomic<int32_t> &counter) {
    return counter.fetch_add(1, std::memory_order_acq_rel) + 1;
}
/// Subtracts 1 and returns the new value.
inline int32_t atomicDecrement(std::atomic<int32_t> &counter) {
    return counter.fetch_sub(1, std::memory_order_acq_rel) - 1;
}

}  // namespace ox
