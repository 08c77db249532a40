#include "core/Queue.h"
#include "core/Thread.h"
#include "tests/core/TestSupport.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#if !defined(_WIN32)
#include <pthread.h>
#endif

using namespace LbCore;

namespace {

const unsigned INFINITE_WAIT_MS = CSemaphore::INFINITE_WAIT;

struct CMessage {
    virtual ~CMessage() { }
};

// Works like the event dispatcher: run() blocks in pop and ends when the pop is interrupted,
// cleanup() interrupts. Behaviour switches let a test steer each hook.
class CWorker : public CIRunnable {
public:
    bool init() override
    {
        ++m_nInits;
        return m_bInitResult;
    }
    bool run() override
    {
        ++m_nRuns;
        m_cInRun.open();
        if (m_bThrow) {
            throw std::runtime_error("run failed");
        }
        if (m_bSpin) {
            return true;
        }
        CMessage* message = nullptr;
        int result = m_cQueue.pop(message, INFINITE_WAIT_MS);
        delete message;
        return result == 0;
    }
    void cleanup() override
    {
        ++m_nCleanups;
        if (m_bInterruptOnCleanup) {
            m_cQueue.interrupt();
        }
    }

    CQueue<CMessage> m_cQueue{2};
    LbTests::CLatch m_cInRun; // open once run() was entered
    std::atomic<int> m_nInits{0};
    std::atomic<int> m_nRuns{0};
    std::atomic<int> m_nCleanups{0};
    bool m_bInitResult = true;
    bool m_bThrow = false;
    bool m_bSpin = false;
    bool m_bInterruptOnCleanup = true;
};

// Records the order in which end-of-thread observers are called.
class CEndObserver : public CThread::CObserver {
public:
    CEndObserver(std::vector<int>& calls, std::mutex& mutex, int id) : m_rcCalls(calls), m_rcMutex(mutex), m_nId(id) { }
    void execute(const CThread& thread) override
    {
        EXPECT_NE(CThread::STATE_IDLE, thread.getState()); // called before the thread turns idle
        std::lock_guard<std::mutex> lock(m_rcMutex);
        m_rcCalls.push_back(m_nId);
    }

private:
    std::vector<int>& m_rcCalls;
    std::mutex& m_rcMutex;
    int m_nId;
};

class CThreadTest : public ::testing::Test {
protected:
    std::vector<int> calls()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_cCalls;
    }
    std::vector<int> m_cCalls;
    std::mutex m_cMutex;
    CEndObserver m_cFirst{m_cCalls, m_cMutex, 1};
    CEndObserver m_cSecond{m_cCalls, m_cMutex, 2};
};

// Polls (yielding) until the thread is idle, without consuming its end signal as join() would.
bool waitIdle(const CThread& thread)
{
    auto deadline = std::chrono::steady_clock::now() + LbTests::DEADLINE;
    while (thread.getState() != CThread::STATE_IDLE) {
        if (std::chrono::steady_clock::now() > deadline) {
            return false;
        }
        std::this_thread::yield();
    }
    return true;
}

} // namespace

TEST_F(CThreadTest, StartStopAndJoinResults)
{
    CWorker worker;
    CThread thread(worker);
    EXPECT_EQ(3, thread.stop());
    EXPECT_EQ(3, thread.stopAndJoin(INFINITE_WAIT_MS));
    EXPECT_EQ(0, thread.join(0)); // an idle thread is joined at once
    EXPECT_TRUE(thread.attach(m_cFirst));

    EXPECT_EQ(0, thread.start());
    EXPECT_EQ(1, worker.m_nInits.load()); // start() returns after init() ran
    EXPECT_EQ(CThread::STATE_RUNNING, thread.getState());
    EXPECT_EQ(1, thread.start());
    EXPECT_EQ(6, thread.join(50));
    EXPECT_EQ(CThread::STATE_RUNNING, thread.getState());

    EXPECT_EQ(0, thread.stopAndJoin(INFINITE_WAIT_MS));
    EXPECT_EQ(CThread::STATE_IDLE, thread.getState());
    EXPECT_EQ(1, worker.m_nInits.load()); // the second start made no thread
    EXPECT_EQ(1, worker.m_nCleanups.load());
    EXPECT_EQ(std::vector<int>{1}, calls());
    EXPECT_EQ(3, thread.stop());
}

TEST_F(CThreadTest, StopWhileStoppingAndStartWhileStoppingReturnTwo)
{
    CWorker worker;
    worker.m_bInterruptOnCleanup = false; // the worker stays blocked until the test lets it go
    CThread thread(worker);
    ASSERT_EQ(0, thread.start());
    ASSERT_TRUE(worker.m_cInRun.waitOpen()); // a stop before the first run() would end it at once
    EXPECT_EQ(0, thread.stop());
    EXPECT_EQ(CThread::STATE_STOPPING, thread.getState());
    EXPECT_EQ(2, thread.stop());
    EXPECT_EQ(2, thread.start());
    EXPECT_EQ(2, thread.stopAndJoin(INFINITE_WAIT_MS));
    worker.m_cQueue.interrupt();
    EXPECT_EQ(0, thread.join(INFINITE_WAIT_MS));
    EXPECT_EQ(CThread::STATE_IDLE, thread.getState());
}

TEST_F(CThreadTest, InitFalseSkipsTheLoopButNotifiesObserversOnce)
{
    CWorker worker;
    worker.m_bInitResult = false;
    CThread thread(worker);
    thread.attach(m_cFirst);
    EXPECT_EQ(0, thread.start());
    EXPECT_EQ(0, thread.join(INFINITE_WAIT_MS));
    EXPECT_EQ(CThread::STATE_IDLE, thread.getState());
    EXPECT_EQ(0, worker.m_nRuns.load());
    EXPECT_EQ(std::vector<int>{1}, calls());
}

TEST_F(CThreadTest, ObserversRunInAttachmentOrderWhenRunEnds)
{
    CWorker worker;
    CThread thread(worker);
    EXPECT_TRUE(thread.attach(m_cSecond));
    EXPECT_TRUE(thread.attach(m_cFirst));
    EXPECT_FALSE(thread.attach(m_cSecond));
    ASSERT_EQ(0, thread.start());
    worker.m_cQueue.interrupt(); // run() returns false
    ASSERT_TRUE(waitIdle(thread));
    EXPECT_EQ(0, thread.join(INFINITE_WAIT_MS)); // idle: returns at once, the end signal stays unused
    EXPECT_EQ(1, worker.m_nRuns.load());
    EXPECT_EQ((std::vector<int>{2, 1}), calls());

    EXPECT_TRUE(thread.detach(m_cSecond));
    EXPECT_FALSE(thread.detach(m_cSecond));
    ASSERT_EQ(0, thread.start());  // a thread can be started again after its end
    EXPECT_EQ(6, thread.join(30)); // the end of the first run must not satisfy this join
    EXPECT_EQ(0, thread.stopAndJoin(INFINITE_WAIT_MS));
    EXPECT_EQ((std::vector<int>{2, 1, 1}), calls());
}

TEST_F(CThreadTest, ThreadWithItsOwnHooksEndsAtOnce)
{
    CThread thread;
    thread.attach(m_cFirst);
    EXPECT_EQ(0, thread.start());
    EXPECT_EQ(0, thread.join(INFINITE_WAIT_MS));
    EXPECT_EQ(std::vector<int>{1}, calls());
}

// A worker has room for real work on its stack, without reserving the 8 MiB a POSIX thread
// gets by default.
TEST_F(CThreadTest, WorkerStackIsSmallButRoomy)
{
    class CStackProbe : public CIRunnable {
    public:
        bool init() override
        {
            volatile char buffer[96 * 1024];
            buffer[0] = 1;
            buffer[sizeof buffer - 1] = 1;
#if !defined(_WIN32)
            pthread_attr_t attributes;
            if (pthread_getattr_np(pthread_self(), &attributes) == 0) {
                pthread_attr_getstacksize(&attributes, &m_nStackSize);
                pthread_attr_destroy(&attributes);
            }
#endif
            return buffer[0] + buffer[sizeof buffer - 1] != 2;
        }
        bool run() override
        {
            return false;
        }
        void cleanup() override { }
        std::size_t m_nStackSize = 0;
    };
    CStackProbe probe;
    CThread thread(probe);
    ASSERT_EQ(0, thread.start());
    EXPECT_EQ(0, thread.join(INFINITE_WAIT_MS));
#if !defined(_WIN32)
    EXPECT_LT(probe.m_nStackSize, 1024u * 1024u);
    EXPECT_GT(probe.m_nStackSize, 128u * 1024u);
#endif
}

TEST_F(CThreadTest, SpinningRunIsStoppedBetweenCalls)
{
    CWorker worker;
    worker.m_bSpin = true;
    CThread thread(worker);
    ASSERT_EQ(0, thread.start());
    EXPECT_EQ(6, thread.join(100));
    EXPECT_EQ(CThread::STATE_RUNNING, thread.getState());
    EXPECT_EQ(0, thread.stopAndJoin(INFINITE_WAIT_MS));
    EXPECT_EQ(CThread::STATE_IDLE, thread.getState());
}

TEST_F(CThreadTest, ExceptionFromRunEndsTheThreadAndIsLogged)
{
    LbTests::CCaptureAppender capture;
    CWorker worker;
    worker.m_bThrow = true;
    CThread thread(worker);
    thread.attach(m_cFirst);
    ASSERT_EQ(0, thread.start());
    EXPECT_EQ(0, thread.join(INFINITE_WAIT_MS));
    EXPECT_EQ(std::vector<int>{1}, calls());
    EXPECT_TRUE(capture.contains("[ERROR] CThread - LbCore::CThread::work - "));
    EXPECT_TRUE(capture.contains("run failed"));
}

TEST_F(CThreadTest, DestroyingARunningThreadWarnsAndEndsIt)
{
    LbTests::CCaptureAppender capture;
    CWorker worker;
    {
        CThread thread(worker);
        ASSERT_EQ(0, thread.start());
        // Blocked in pop, holding no lock: a forced end elsewhere could leave a lock taken.
        ASSERT_TRUE(worker.m_cInRun.waitOpen());
    }
    EXPECT_TRUE(capture.contains("[WARN ] CThread - LbCore::CThread::~CThread - Thread has been not stopped safely"));
}
