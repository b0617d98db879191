#include "platform/work_server.h"

#include <algorithm>
#include <cmath>

#include "core/message.h"

namespace ox {
namespace {

/// The progress marks of one wait, counted with an integer so that rounding can neither skip
/// nor repeat a line, and the last line always reads 100.
class ProgressMarks {
public:
    explicit ProgressMarks(float step) {
        double s = std::isfinite(step) ? double(step) : 0.1;
        step_ = std::clamp(s > 0.0 ? s : 0.1, 0.001, 1.0);
        count_ = std::max(1, int(std::ceil(1.0 / step_ - 1e-6)));
    }

    /// Logs the marks reached by fraction; all = true logs every remaining mark.
    void report(double fraction, bool all) {
        while (next_ <= count_) {
            bool last = next_ == count_;
            if (!all && (last || fraction + 1e-9 < next_ * step_)) break;
            int percent = last ? 100 : int(std::lround(next_ * step_ * 100.0));
            message(kMsgProgress, 6, "Progress: %d%%", percent);
            ++next_;
        }
    }

private:
    double step_;
    int count_;
    int next_ = 1;
};

}  // namespace

WorkThread::WorkThread(WorkServer &server, int index) : server_(server), index_(index) {}

WorkThread::~WorkThread() {
    requestStop();
    join();
}

void WorkThread::requestStop() {
    // Flag and wake-up happen under the worker's mutex, so the worker cannot test the flag,
    // miss the wake-up and sleep for ever.
    OXScopedLock<StdMutex> lock(mutex_);
    stop_.store(true, std::memory_order_release);
    signal_.broadcast();
}

void WorkThread::assign(Work *work) {
    OXScopedLock<StdMutex> lock(mutex_);
    work_ = work;
    signal_.signal();
}

void WorkThread::run() {
    mutex_.lock();
    for (;;) {
        signal_.wait(mutex_, [this] { return work_ != nullptr || stop_.load(); });
        Work *work = work_;
        if (!work) break;  // stopped with nothing to do
        mutex_.unlock();
        bool ok = true;
        std::string error;
        // An item handed over while the server shut down is dropped unrun.
        if (!stop_.load(std::memory_order_acquire)) {
            ok = work->run(stop_, index_);
            if (!ok) error = work->errorText();
        }
        delete work;
        // Cleared before the server sees the worker idle, so that an item the dispatcher
        // hands over afterwards is not overwritten.
        mutex_.lock();
        work_ = nullptr;
        mutex_.unlock();
        // The worker that just finished is the one the dispatcher would pick next, so it
        // takes the next queued item itself and saves two thread switches per item.
        Work *next = server_.finished(this, ok, error);
        mutex_.lock();
        if (next) work_ = next;  // still on the busy list: the dispatcher cannot assign
    }
    mutex_.unlock();
}

WorkServer::WorkServer(int threadCount, bool threaded)
    : threadCount_(std::max(1, threadCount)), threaded_(threaded) {
    if (!threaded_) return;
    threads_.reserve(size_t(threadCount_));
    for (int i = 0; i < threadCount_; ++i) {
        threads_.push_back(std::make_unique<WorkThread>(*this, i));
        idle_.push_back(threads_.back().get());
    }
    // A worker the system refuses to start is left out; with none at all the items run on
    // the waiting thread instead.
    for (auto &t : threads_) {
        if (!t->start()) idle_.erase(std::find(idle_.begin(), idle_.end(), t.get()));
    }
    if (idle_.empty()) {
        threaded_ = false;
        return;
    }
    dispatcher_ = createMiniThread(this, nullptr, true, "Work Dispatcher");
}

WorkServer::~WorkServer() {
    {
        OXScopedLock<StdMutex> lock(mutex_);
        state_ = kShuttingDown;
        shutdown_ = true;
        dispatchSignal_.broadcast();
    }
    if (dispatcher_) dispatcher_->join();
    // Workers still running an item see the stop flag, finish it and report to the server,
    // which is still whole here.
    for (auto &t : threads_) t->requestStop();
    threads_.clear();
    for (Work *w : queue_) delete w;
    queue_.clear();
}

void WorkServer::addWork(Work *work) {
    if (!work) return;
    OXScopedLock<StdMutex> lock(mutex_);
    queue_.push_back(work);
    ++total_;
    state_ = kRunning;
    dispatchSignal_.signal();
}

bool WorkServer::start() {
    OXScopedLock<StdMutex> lock(mutex_);
    if (started_) return true;
    started_ = true;
    if (!threaded_) return true;
    if (!dispatcher_->start()) threaded_ = false;  // the waiting thread runs the items
    return true;
}

void WorkServer::run() {
    OXScopedLock<StdMutex> lock(mutex_);
    for (;;) {
        dispatchSignal_.wait(mutex_,
                             [this] { return shutdown_ || (!queue_.empty() && !idle_.empty()); });
        if (shutdown_) return;
        while (!queue_.empty() && !idle_.empty()) {
            Work *work = queue_.front();
            queue_.pop_front();
            // The worker that became idle last is taken first: its caches are warmest.
            WorkThread *thread = idle_.back();
            idle_.pop_back();
            busy_.push_back(thread);
            thread->assign(work);  // server mutex before worker mutex, never the reverse
        }
    }
}

Work *WorkServer::finished(WorkThread *thread, bool ok, const std::string &error) {
    OXScopedLock<StdMutex> lock(mutex_);
    if (!ok) {
        if (failures_++ == 0) error_ = error.empty() ? "work item failed" : error;
    }
    if (!queue_.empty() && !shutdown_) {
        Work *next = queue_.front();
        queue_.pop_front();
        return next;  // the worker stays busy
    }
    auto it = std::find(busy_.begin(), busy_.end(), thread);
    if (it != busy_.end()) {
        *it = busy_.back();
        busy_.pop_back();
    }
    idle_.push_back(thread);
    if (allDone()) {
        if (state_ != kShuttingDown) state_ = kFinished;
        doneSignal_.broadcast();
    }
    return nullptr;
}

void WorkServer::runInline(float step) {
    ProgressMarks marks(step);
    std::atomic<bool> stop{false};
    mutex_.lock();
    int64_t total = total_;
    int64_t done = 0;
    while (!queue_.empty()) {
        Work *work = queue_.front();
        queue_.pop_front();
        mutex_.unlock();
        bool ok = work->run(stop, 0);
        std::string error = ok ? std::string() : work->errorText();
        delete work;
        ++done;
        marks.report(double(done) / double(total), false);
        mutex_.lock();
        if (!ok && failures_++ == 0) error_ = error.empty() ? "work item failed" : error;
        total = total_;  // an item may have queued more
    }
    state_ = kFinished;
    total_ = 0;
    mutex_.unlock();
    marks.report(1.0, true);
}

void WorkServer::waitWithProgress(float sleepSeconds, float step) {
    if (!start()) return;
    mutex_.lock();
    if (allDone()) {
        total_ = 0;
        mutex_.unlock();
        message(kMsgProgress, 6, "Progress: 100%%");
        return;
    }
    if (!threaded_) {
        mutex_.unlock();
        runInline(step);
        return;
    }
    ProgressMarks marks(step);
    double wait =
        std::isfinite(sleepSeconds) ? std::clamp(double(sleepSeconds), 0.001, 3600.0) : 0.05;
    for (;;) {
        bool done = doneSignal_.waitFor(mutex_, wait, [this] { return allDone(); });
        int64_t total = total_;
        int64_t left = int64_t(queue_.size() + busy_.size());
        if (done) total_ = 0;  // a later batch counts from zero again
        mutex_.unlock();
        if (done) {
            marks.report(1.0, true);
            return;
        }
        marks.report(total > 0 ? double(total - left) / double(total) : 0.0, false);
        mutex_.lock();
    }
}

bool WorkServer::failed(std::string &message) const {
    OXScopedLock<StdMutex> lock(mutex_);
    if (failures_ == 0) return false;
    message = error_;
    if (failures_ > 1) message += " (and " + std::to_string(failures_ - 1) + " more failures)";
    return true;
}

WorkServer::State WorkServer::state() const {
    OXScopedLock<StdMutex> lock(mutex_);
    return state_;
}

}  // namespace ox
