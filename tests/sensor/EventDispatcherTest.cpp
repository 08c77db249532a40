// The per-session event dispatcher: ordered delivery off the caller's thread, pushes that never
// block, shutdown with events still queued, removal during delivery, failing subscribers.
#include "sensor/PmxEventDispatcher.h"
#include "tests/sensor/SensorTestSupport.h"

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

using LbPmxVisa::CIPmxEventListener;
using LbPmxVisa::CPmxEvent;
using LbPmxVisa::CPmxEventDispatcher;
using LbTests::CGate;
using LbTests::CLogCapture;

namespace {

// Shared record of deliveries: "<subscriber>:<kind>:<value>".
class CJournal {
public:
    void add(const std::string& entry)
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        m_cEntries.push_back(entry);
        m_cCondition.notify_all();
    }
    bool waitSize(std::size_t size)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, LbTests::SENSOR_DEADLINE, [&] { return m_cEntries.size() >= size; });
    }
    std::vector<std::string> entries()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_cEntries;
    }

private:
    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    std::vector<std::string> m_cEntries;
};

class CRecorder : public CIPmxEventListener {
public:
    CRecorder(const std::string& name, CJournal& journal) : m_sName(name), m_rJournal(journal) { }

    void notifyCommandAcceptedEvent(const CPmxEvent& event) override { record("accepted", event); }
    void notifyDataAvailableEvent(const CPmxEvent& event) override { record("data", event); }
    void notifyErrorOccuredEvent(const CPmxEvent& event) override { record("error", event); }
    void notifyStateChangedEvent(const CPmxEvent& event) override { record("state", event); }
    void notifyDeviceChangedEvent(const CPmxEvent& event) override { record("device", event); }

protected:
    virtual void record(const std::string& kind, const CPmxEvent& event)
    {
        m_rJournal.add(m_sName + ":" + kind + ":" + std::to_string(event.value));
    }

    std::string m_sName;
    CJournal& m_rJournal;
};

// Holds its first delivery until the gate opens; tells when that delivery has begun.
class CBlockingRecorder : public CRecorder {
public:
    using CRecorder::CRecorder;
    CGate entered;
    CGate release;

protected:
    void record(const std::string& kind, const CPmxEvent& event) override
    {
        if (!entered.isOpen()) {
            entered.open();
            release.waitOpen();
        }
        CRecorder::record(kind, event);
    }
};

class CThrowingRecorder : public CRecorder {
public:
    using CRecorder::CRecorder;

protected:
    void record(const std::string& kind, const CPmxEvent& event) override
    {
        CRecorder::record(kind, event);
        if (event.value == 1) {
            throw std::runtime_error("subscriber failed on purpose");
        }
    }
};

CPmxEvent event(std::int32_t value)
{
    CPmxEvent e;
    e.handle = 7;
    e.value = value;
    return e;
}

} // namespace

TEST(EventDispatcher, DeliversInQueueOrderToSubscribersInSubscriptionOrder)
{
    CJournal journal;
    CRecorder first("A", journal);
    CRecorder second("B", journal);
    CPmxEventDispatcher dispatcher(nullptr);
    EXPECT_TRUE(dispatcher.addListener(&first));
    EXPECT_TRUE(dispatcher.addListener(&second));
    EXPECT_FALSE(dispatcher.addListener(&first));

    dispatcher.notifyCommandAcceptedEvent(event(1));
    dispatcher.notifyDataAvailableEvent(event(2));
    dispatcher.notifyErrorOccuredEvent(event(3));
    ASSERT_TRUE(journal.waitSize(6));
    std::vector<std::string> expected = {"A:accepted:1", "B:accepted:1", "A:data:2",
                                         "B:data:2",     "A:error:3",    "B:error:3"};
    EXPECT_EQ(expected, journal.entries());

    EXPECT_TRUE(dispatcher.removeListener(&first));
    EXPECT_FALSE(dispatcher.removeListener(&first));
    dispatcher.notifyStateChangedEvent(event(4));
    dispatcher.notifyDeviceChangedEvent(event(5));
    ASSERT_TRUE(journal.waitSize(8));
    dispatcher.shutdown();
    expected.push_back("B:state:4");
    expected.push_back("B:device:5");
    EXPECT_EQ(expected, journal.entries());
}

TEST(EventDispatcher, NotificationsBeyondTheQueueCapacityNeitherBlockNorDrop)
{
    CJournal journal;
    CBlockingRecorder blocker("A", journal);
    CPmxEventDispatcher dispatcher(nullptr);
    dispatcher.addListener(&blocker);

    dispatcher.notifyDataAvailableEvent(event(1));
    ASSERT_TRUE(blocker.entered.waitOpen());
    // The worker holds event 1; the queue (capacity 2) fills with 2 and 3, and 4 must not wait.
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    dispatcher.notifyDataAvailableEvent(event(2));
    dispatcher.notifyDataAvailableEvent(event(3));
    dispatcher.notifyDataAvailableEvent(event(4));
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(2));

    blocker.release.open();
    ASSERT_TRUE(journal.waitSize(4));
    std::vector<std::string> expected = {"A:data:1", "A:data:2", "A:data:3", "A:data:4"};
    EXPECT_EQ(expected, journal.entries());
}

TEST(EventDispatcher, DestructionWithQueuedEventsLogsAndDeliversNoneOfThem)
{
    CLogCapture capture;
    CJournal journal;
    CBlockingRecorder blocker("A", journal);
    std::unique_ptr<CPmxEventDispatcher> dispatcher(new CPmxEventDispatcher(nullptr));
    dispatcher->addListener(&blocker);

    dispatcher->notifyErrorOccuredEvent(event(1));
    ASSERT_TRUE(blocker.entered.waitOpen());
    dispatcher->notifyErrorOccuredEvent(event(2));
    dispatcher->notifyErrorOccuredEvent(event(3));
    dispatcher->notifyErrorOccuredEvent(event(4));

    std::thread destroyer([&] { dispatcher.reset(); });
    ASSERT_TRUE(capture.waitFor("Queue interrupt(...) "));
    blocker.release.open();
    destroyer.join();

    std::vector<std::string> lines = capture.matching("LbPmxVisa::CPmxEventDispatcher::");
    std::vector<std::string> texts;
    for (const std::string& line : lines) {
        for (const char* text : {"stopAndJoin(...)", "Queue interrupt(...) ", "Shutdown CPmxEventDispatcher ",
                                 "Thread has been stopped. Destruction continues..."}) {
            if (line.find(std::string(" - ") + text) != std::string::npos) {
                texts.push_back(text);
            }
        }
    }
    std::vector<std::string> expected = {"stopAndJoin(...)",
                                         "Queue interrupt(...) ",
                                         "Shutdown CPmxEventDispatcher ",
                                         "Shutdown CPmxEventDispatcher ",
                                         "Shutdown CPmxEventDispatcher ",
                                         "Thread has been stopped. Destruction continues..."};
    EXPECT_EQ(expected, texts);
    EXPECT_EQ(std::vector<std::string>{"A:error:1"}, journal.entries());
}

TEST(EventDispatcher, EventsAfterShutdownAreNeverDelivered)
{
    CJournal journal;
    CRecorder recorder("A", journal);
    {
        CPmxEventDispatcher dispatcher(nullptr);
        dispatcher.addListener(&recorder);
        dispatcher.shutdown();
        dispatcher.notifyCommandAcceptedEvent(event(1));
        dispatcher.notifyCommandAcceptedEvent(event(2));
        dispatcher.notifyCommandAcceptedEvent(event(3));
    }
    EXPECT_TRUE(journal.entries().empty());
}

TEST(EventDispatcher, RemovalDuringDeliveryWaitsForTheRunningCall)
{
    CJournal journal;
    CJournal others;
    CBlockingRecorder blocker("A", journal);
    CRecorder witness("B", others);
    CPmxEventDispatcher dispatcher(nullptr);
    dispatcher.addListener(&blocker);
    dispatcher.addListener(&witness);
    dispatcher.notifyStateChangedEvent(event(1));
    ASSERT_TRUE(blocker.entered.waitOpen());

    CGate calling;
    CGate removed;
    bool result = false;
    std::thread remover([&] {
        calling.open();
        result = dispatcher.removeListener(&blocker);
        journal.add("removed");
        removed.open();
    });
    ASSERT_TRUE(calling.waitOpen());
    EXPECT_FALSE(removed.waitOpenFor(std::chrono::milliseconds(100)));
    blocker.release.open();
    ASSERT_TRUE(removed.waitOpen());
    remover.join();
    EXPECT_TRUE(result);
    EXPECT_EQ((std::vector<std::string>{"A:state:1", "removed"}), journal.entries());

    // Later events reach the remaining subscriber only.
    dispatcher.notifyStateChangedEvent(event(2));
    ASSERT_TRUE(others.waitSize(2));
    EXPECT_EQ((std::vector<std::string>{"B:state:1", "B:state:2"}), others.entries());
    EXPECT_EQ(2u, journal.entries().size());
}

TEST(EventDispatcher, ThrowingSubscriberDoesNotStopLaterDeliveries)
{
    CLogCapture capture;
    CJournal journal;
    CThrowingRecorder thrower("A", journal);
    CPmxEventDispatcher dispatcher(nullptr);
    dispatcher.addListener(&thrower);
    dispatcher.notifyErrorOccuredEvent(event(1));
    dispatcher.notifyErrorOccuredEvent(event(2));
    ASSERT_TRUE(journal.waitSize(2));
    EXPECT_EQ((std::vector<std::string>{"A:error:1", "A:error:2"}), journal.entries());
    std::vector<std::string> errors = capture.matching("subscriber failed on purpose");
    ASSERT_EQ(1u, errors.size());
    EXPECT_NE(std::string::npos, errors[0].find("[ERROR]"));
}
