#include "platform/thread.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "platform/mutex.h"

namespace {

// More threads than the machine has cores, so that locks are contended and threads are
// preempted while holding them.
constexpr int kThreads = 8;

TEST(MutexTest, FactoryAndExclusion) {
    EXPECT_NE(dynamic_cast<ox::DummyMutex *>(ox::createMutex(true, false).get()), nullptr);
    for (bool spin : {true, false}) {
        auto m = ox::createMutex(spin, true);
        ASSERT_TRUE(m->lock());
        std::thread other([&] { EXPECT_FALSE(m->tryLock()); });
        other.join();
        m->unlock();
        int64_t counter = 0;  // deliberately not atomic: the mutex alone protects it
        std::vector<std::thread> threads;
        for (int t = 0; t < kThreads; ++t)
            threads.emplace_back([&] {
                for (int i = 0; i < 20000; ++i) {
                    ox::OXScopedLock<ox::OXMutex> lock(*m);
                    ++counter;
                }
            });
        for (auto &t : threads) t.join();
        EXPECT_EQ(counter, kThreads * 20000);
    }
    static ox::OXStaticMutex staticMutex;
    ox::OXScopedLock<ox::OXStaticMutex> lock(staticMutex);
    EXPECT_FALSE(staticMutex.tryLock());
}

TEST(MutexTest, ReaderWriterLockExcludesWriters) {
    auto rw = ox::createRWLock(true);
    std::atomic<int> readers{0}, writers{0}, violations{0};
    int shared = 0;
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < 3000; ++i) {
                if ((i + t) % 4 == 0) {
                    rw->lockWrite();
                    if (writers.fetch_add(1) != 0 || readers.load() != 0) ++violations;
                    ++shared;
                    writers.fetch_sub(1);
                    rw->unlockWrite();
                } else {
                    rw->lockRead();
                    readers.fetch_add(1);
                    if (writers.load() != 0) ++violations;
                    volatile int seen = shared;
                    (void)seen;
                    readers.fetch_sub(1);
                    rw->unlockRead();
                }
            }
        });
    for (auto &t : threads) t.join();
    EXPECT_EQ(violations.load(), 0);
    EXPECT_EQ(shared, kThreads * 3000 / 4);
    auto dummy = ox::createRWLock(false);
    dummy->lockWrite();
    dummy->lockRead();  // the dummy never blocks
    dummy->unlockRead();
    dummy->unlockWrite();
}

TEST(SignalTest, ProducerConsumerLosesNoWakeUp) {
    ox::StdMutex mutex;
    ox::OXSignal signal;
    int produced = 0, consumed = 0;
    constexpr int kItems = 20000;
    std::vector<std::thread> consumers;
    for (int t = 0; t < kThreads; ++t)
        consumers.emplace_back([&] {
            for (;;) {
                ox::OXScopedLock<ox::OXMutex> lock(mutex);
                signal.wait(mutex, [&] { return produced > consumed || produced == -1; });
                if (produced == -1) return;
                ++consumed;
                if (consumed == kItems) signal.broadcast();  // the producer waits for this
            }
        });
    for (int i = 0; i < kItems; ++i) {
        ox::OXScopedLock<ox::OXMutex> lock(mutex);
        ++produced;
        signal.signal();
    }
    {
        ox::OXScopedLock<ox::OXMutex> lock(mutex);
        signal.wait(mutex, [&] { return consumed == kItems; });
        produced = -1;
        signal.broadcast();
    }
    for (auto &t : consumers) t.join();
    EXPECT_EQ(consumed, kItems);

    // A timed wait on a condition that never holds returns false.
    ox::OXScopedLock<ox::OXMutex> lock(mutex);
    EXPECT_FALSE(signal.waitFor(mutex, 0.01, [] { return false; }));
    EXPECT_TRUE(signal.waitFor(mutex, 0.0, [] { return true; }));
}

class CountingThread : public ox::OXThread {
public:
    explicit CountingThread(bool threaded, std::atomic<bool> *gate = nullptr)
        : ox::OXThread(threaded), gate_(gate) {}
    ~CountingThread() override { join(); }
    std::atomic<int> runs{0};
    std::atomic<ox::OXThread *> seenCurrent{nullptr};
    std::thread::id runId;

private:
    void run() override {
        seenCurrent = ox::OXThread::current();
        runId = std::this_thread::get_id();
        ++runs;
        while (gate_ && !gate_->load()) std::this_thread::yield();
    }
    std::atomic<bool> *gate_;
};

TEST(ThreadTest, StartJoinAndThreadLocalSlot) {
    EXPECT_EQ(ox::OXThread::current(), nullptr);
    std::atomic<bool> gate{false};
    CountingThread t(true, &gate);
    ASSERT_TRUE(t.start());
    EXPECT_TRUE(t.isRunning());
    EXPECT_TRUE(t.start());  // a second start while running does nothing
    gate = true;
    t.join();
    EXPECT_FALSE(t.isRunning());
    EXPECT_EQ(t.runs.load(), 1);
    EXPECT_EQ(t.seenCurrent.load(), &t);
    EXPECT_NE(t.runId, std::this_thread::get_id());
    ASSERT_TRUE(t.start());  // a finished thread can run again
    t.join();
    EXPECT_EQ(t.runs.load(), 2);

    // The non-threaded form runs inline and restores the caller's slot.
    CountingThread inlineThread(false);
    ASSERT_TRUE(inlineThread.start());
    EXPECT_EQ(inlineThread.runs.load(), 1);
    EXPECT_EQ(inlineThread.runId, std::this_thread::get_id());
    EXPECT_EQ(inlineThread.seenCurrent.load(), &inlineThread);
    EXPECT_EQ(ox::OXThread::current(), nullptr);
}

TEST(ThreadTest, AtomicCountersReturnTheNewValue) {
    std::atomic<int32_t> counter{0};
    std::atomic<int> outOfRange{0};
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t)
        threads.emplace_back([&] {
            for (int i = 0; i < 5000; ++i) {
                const int32_t x = ox::atomicIncrement(counter);
                if (x < 1 || x > kThreads * 5000) ++outOfRange;
            }
        });
    for (auto &t : threads) t.join();
    EXPECT_EQ(outOfRange.load(), 0);
    EXPECT_EQ(ox::atomicDecrement(counter), kThreads * 5000 - 1);
    ox::sleep(0.0f);  // zero and negative durations return at once
    ox::sleep(-1.0f);
}

}  // namespace
