#include "platform/thread.h"

#include <pthread.h>

#include <chrono>
#include <system_error>

#include "core/message.h"
#include "platform/system.h"

namespace ox {
namespace {

// The thread-local slot: each thread started here stores its own thread object.
thread_local OXThread *tlsCurrent = nullptr;

}  // namespace

OXThread *OXThread::current() { return tlsCurrent; }
void OXThread::setCurrent(OXThread *thread) { tlsCurrent = thread; }

StdThread::StdThread(Runnable *runnable, OXThread *owner, std::string name)
    : runnable_(runnable), owner_(owner), name_(std::move(name)) {}

StdThread::~StdThread() {
    if (thread_.joinable()) thread_.join();
}

bool StdThread::start() {
    if (running_.load(std::memory_order_acquire)) return true;
    // A thread that ended but was never joined is reaped before the next start.
    if (thread_.joinable()) thread_.join();
    running_.store(true, std::memory_order_release);
    try {
        thread_ = std::thread([this] { entry(); });
    } catch (const std::system_error &e) {
        running_.store(false, std::memory_order_release);
        message(kMsgError, 6, "Cannot start thread %s: %s", name_.c_str(), e.what());
        return false;
    }
    return true;
}

void StdThread::join() {
    if (thread_.joinable()) thread_.join();
    running_.store(false, std::memory_order_release);
}

void StdThread::bindThreadLocal() { OXThread::setCurrent(owner_); }

void StdThread::entry() {
    if (!name_.empty()) pthread_setname_np(pthread_self(), name_.substr(0, 15).c_str());
    // The floating-point modes are per thread; every thread computes like the main thread.
    setFlushDenormalsToZero();
    bindThreadLocal();
    runnable_->run();
    running_.store(false, std::memory_order_release);
}

bool DummyThread::start() {
    if (running_) return true;  // a body that starts its own thread again does nothing
    running_ = true;
    OXThread *previous = OXThread::current();
    bindThreadLocal();
    runnable_->run();
    OXThread::setCurrent(previous);
    running_ = false;
    return true;
}

void DummyThread::bindThreadLocal() { OXThread::setCurrent(owner_); }

std::unique_ptr<MiniThread> createMiniThread(Runnable *runnable, OXThread *owner, bool threaded,
                                             const std::string &name) {
    if (!threaded) return std::make_unique<DummyThread>(runnable, owner);
    return std::make_unique<StdThread>(runnable, owner, name);
}

OXThread::~OXThread() {
    // The platform thread is joined here at the latest; a subclass that owns what run uses
    // must join in its own destructor.
    thread_.reset();
}

bool OXThread::start() {
    if (!thread_) thread_ = createMiniThread(this, this, threaded_, name());
    return thread_->start();
}

void OXThread::join() {
    if (thread_) thread_->join();
}

void sleep(float seconds) {
    if (!(seconds > 0.0f)) return;
    auto ms = int64_t(double(seconds) * 1000.0);
    std::this_thread::sleep_for(std::chrono::milliseconds(ms));
}

}  // namespace ox
