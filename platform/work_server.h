#pragma once

#include <atomic>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <vector>

#include "platform/mutex.h"
#include "platform/thread.h"

/// A pool of worker threads that run queued work items (scene loading, point-cloud tools).
namespace ox {

/// One item of work. The server owns it from addWork on and deletes it after it ran.
class Work {
public:
    virtual ~Work() = default;
    /// Does the work on a worker thread. stop turns true when the server shuts down; long
    /// items should look at it. Returns false on failure (after setError).
    virtual bool run(const std::atomic<bool> &stop, int threadIndex) = 0;
    /// The text of the failure, if any.
    const std::string &errorText() const { return error_; }

protected:
    /// Keeps the text that the server reports for a failed item.
    void setError(std::string text) { error_ = std::move(text); }

private:
    std::string error_;
};

class WorkServer;

/// A worker of the server: waits for an item, runs it, reports it finished.
class WorkThread final : public OXThread {
public:
    /// A worker with its index (from 0); starts waiting at once.
    WorkThread(WorkServer &server, int index);
    ~WorkThread() override;
    std::string name() const override { return "Work Thread"; }
    /// The worker's index, from 0.
    int index() const { return index_; }

private:
    friend class WorkServer;
    void run() override;
    /// Hands an item to the idle worker (called by the dispatcher).
    void assign(Work *work);
    /// Sets the stop flag and wakes the worker, both under its mutex.
    void requestStop();

    WorkServer &server_;
    int index_;
    StdMutex mutex_{true};
    OXSignal signal_;
    Work *work_ = nullptr;  // guarded by mutex_
    std::atomic<bool> stop_{false};
};

/// The pool: addWork, start, waitWithProgress, then failed.
class WorkServer final : public Runnable {
public:
    /// Server states.
    enum State : int { kIdle = 0, kRunning = 1, kFinished = 2, kShuttingDown = 3 };

    /// threadCount workers (at least 1). threaded = false makes no threads: the items then
    /// run in order on the thread that calls waitWithProgress.
    explicit WorkServer(int threadCount, bool threaded = true);
    /// Shuts down: items still queued are deleted without running, running items see their
    /// stop flag and are waited for.
    ~WorkServer() override;
    WorkServer(const WorkServer &) = delete;
    WorkServer &operator=(const WorkServer &) = delete;

    /// Queues an item (null is ignored); the server owns it.
    void addWork(Work *work);
    /// Queues an item.
    void addWork(std::unique_ptr<Work> work) { addWork(work.release()); }
    /// Starts handing out the queued items; work added later is handed out at once.
    bool start();
    /// Waits until no item is queued or running, logging "Progress: %d%%" at each multiple of
    /// step (0.001 to 1) of the items done, polling every sleepSeconds; the last line always
    /// reads 100. Starts the server when that was not done.
    void waitWithProgress(float sleepSeconds, float step);
    /// True when an item failed since construction; message gets the first failure's text
    /// (with the count of further failures).
    bool failed(std::string &message) const;

    /// The current state.
    State state() const;
    /// The number of workers.
    int threadCount() const { return threadCount_; }

private:
    friend class WorkThread;
    /// The dispatcher: pairs queued items with idle workers.
    void run() override;
    /// Called by a worker after its item ran and was deleted; returns the next queued item
    /// for that worker (which then stays busy), or null when it went idle.
    Work *finished(WorkThread *thread, bool ok, const std::string &error);
    bool allDone() const { return queue_.empty() && busy_.empty(); }
    void runInline(float step);

    int threadCount_;
    bool threaded_;
    mutable StdMutex mutex_{true};  // guards everything below
    OXSignal doneSignal_;           // wakes waitWithProgress when all work is done
    OXSignal dispatchSignal_;       // wakes the dispatcher: work added or a worker idle
    std::deque<Work *> queue_;
    std::vector<WorkThread *> busy_;
    std::vector<WorkThread *> idle_;
    int64_t total_ = 0;
    State state_ = kIdle;
    bool shutdown_ = false;
    bool started_ = false;
    int failures_ = 0;
    std::string error_;
    std::vector<std::unique_ptr<WorkThread>> threads_;
    std::unique_ptr<MiniThread> dispatcher_;
};

}  // namespace ox
