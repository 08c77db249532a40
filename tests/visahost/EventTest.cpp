// Events raised by the test passport (a write "EVENT n" raises n service requests) and their
// delivery through the VISA queue and handlers.
#include "tests/Waiting.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>
#include <vector>

#include "tests/visahost/VisaFixture.h"

namespace LbVisaHostTest {

class Events : public CVisaTest {
protected:
    void SetUp() override
    {
        CVisaTest::SetUp();
        m_nVi = open("TEST::1::INSTR");
    }
    ViSession m_nVi = VI_NULL;
};

TEST_F(Events, QueueDeliversInOrderAndTimesOut)
{
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 3"));
    std::vector<ViEvent> vContexts;
    for (ViStatus nExpected : {VI_SUCCESS_QUEUE_NEMPTY, VI_SUCCESS_QUEUE_NEMPTY, VI_SUCCESS}) {
        ViEventType nType = 0;
        ViEvent nContext = 0;
        EXPECT_EQ(nExpected, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, &nType, &nContext));
        EXPECT_EQ(static_cast<ViEventType>(VI_EVENT_SERVICE_REQ), nType);
        vContexts.push_back(nContext);
    }
    EXPECT_LT(vContexts[0], vContexts[1]); // in the order raised
    EXPECT_LT(vContexts[1], vContexts[2]);
    ViEventType nType = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(vContexts[0], VI_ATTR_EVENT_TYPE, &nType));
    EXPECT_EQ(static_cast<ViEventType>(VI_EVENT_SERVICE_REQ), nType);
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viGetAttribute(vContexts[0], VI_ATTR_TMO_VALUE, &nType));
    EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(vContexts[0], VI_ATTR_EVENT_TYPE, 1));
    EXPECT_EQ(VI_SUCCESS, viClose(vContexts[0]));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viClose(vContexts[0]));

    auto tStart = std::chrono::steady_clock::now();
    EXPECT_EQ(VI_ERROR_TMO, viWaitOnEvent(m_nVi, VI_ALL_ENABLED_EVENTS, 100, &nType, VI_NULL));
    EXPECT_GE(std::chrono::steady_clock::now() - tStart, std::chrono::milliseconds(90));
    // Closing the session closes the contexts it delivered.
    EXPECT_EQ(VI_SUCCESS, viClose(m_nVi));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viClose(vContexts[1]));
}

TEST_F(Events, FullQueueDropsNewEvents)
{
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(m_nVi, VI_ATTR_MAX_QUEUE_LENGTH, 2));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    // Once an event is enabled the queue length is fixed.
    EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(m_nVi, VI_ATTR_MAX_QUEUE_LENGTH, 1));
    ViUInt32 nLength = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nVi, VI_ATTR_MAX_QUEUE_LENGTH, &nLength));
    EXPECT_EQ(2u, nLength);
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 5"));
    ViEvent nFirst = 0, nSecond = 0;
    // The first wait after a drop warns, with the event; the warning is given once.
    EXPECT_EQ(VI_WARN_QUEUE_OVERFLOW, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, &nFirst));
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, &nSecond));
    EXPECT_EQ(nFirst + 1, nSecond); // the first two were kept
    EXPECT_EQ(VI_ERROR_TMO, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 2"));
    EXPECT_EQ(VI_SUCCESS_QUEUE_NEMPTY, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 3")); // one dropped again
    EXPECT_EQ(VI_SUCCESS, viDiscardEvents(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS_QUEUE_EMPTY, viDiscardEvents(m_nVi, VI_ALL_ENABLED_EVENTS, VI_ALL_MECH));
    EXPECT_EQ(VI_ERROR_TMO, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1")); // the discard took the drop's warning along
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
}

TEST_F(Events, WaiterInAnotherThreadIsWoken)
{
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ViStatus nStatus = VI_ERROR_SYSTEM_ERROR;
    ViEventType nType = 0;
    std::thread cWaiter([&] { nStatus = viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 30000, &nType, VI_NULL); });
    EXPECT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    cWaiter.join();
    EXPECT_EQ(VI_SUCCESS, nStatus);
    EXPECT_EQ(static_cast<ViEventType>(VI_EVENT_SERVICE_REQ), nType);
}

TEST_F(Events, ClosingTheSessionEndsAWait)
{
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ViStatus nStatus = VI_SUCCESS;
    std::atomic<long> nWaiterId(-1);
    std::thread cWaiter([&] {
        nWaiterId = LbTests::currentThreadId();
        nStatus = viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_TMO_INFINITE, VI_NULL, VI_NULL);
    });
    while (nWaiterId.load() == -1)
        std::this_thread::yield();
    ASSERT_TRUE(LbTests::waitUntilSleeping(nWaiterId.load())); // the close meets a real wait
    EXPECT_EQ(VI_SUCCESS, viClose(m_nVi));
    cWaiter.join();
    EXPECT_EQ(VI_ERROR_INV_OBJECT, nStatus);
}

// What the handlers saw; they run on the runtime's handler thread, so the test waits for them.
struct SCalls {
    std::mutex m_aMutex;
    std::condition_variable m_cvCalled;
    std::vector<int> m_vOrder;
    ViSession m_nVi = 0;
    ViEventType m_nType = 0;
    ViEvent m_nContext = 0;
    ViStatus m_nContextStatus = VI_ERROR_SYSTEM_ERROR;

    void called(int nHandler)
    {
        std::lock_guard<std::mutex> aGuard(m_aMutex);
        m_vOrder.push_back(nHandler);
        m_cvCalled.notify_all();
    }
    // The calls once there are nCount of them (or what there is after a generous deadline).
    std::vector<int> order(size_t nCount)
    {
        std::unique_lock<std::mutex> aLock(m_aMutex);
        m_cvCalled.wait_for(aLock, std::chrono::seconds(30), [&] { return m_vOrder.size() >= nCount; });
        std::vector<int> v = m_vOrder;
        m_vOrder.clear();
        return v;
    }
};

ViStatus _VI_FUNCH firstHandler(ViSession vi, ViEventType type, ViEvent context, ViAddr user)
{
    auto* ps = static_cast<SCalls*>(user);
    ViEventType nType = 0;
    ViStatus nStatus = viGetAttribute(context, VI_ATTR_EVENT_TYPE, &nType);
    {
        std::lock_guard<std::mutex> aGuard(ps->m_aMutex);
        ps->m_nVi = vi;
        ps->m_nType = type;
        ps->m_nContext = context;
        ps->m_nContextStatus = nStatus;
    }
    ps->called(1);
    return VI_SUCCESS;
}

ViStatus _VI_FUNCH secondHandler(ViSession, ViEventType, ViEvent, ViAddr user)
{
    static_cast<SCalls*>(user)->called(2);
    return VI_SUCCESS;
}

ViStatus _VI_FUNCH stopHandler(ViSession, ViEventType, ViEvent, ViAddr user)
{
    static_cast<SCalls*>(user)->called(3);
    return VI_SUCCESS_NCHAIN;
}

// Closes the session it is called for: allowed, since handlers do not run on the thread that
// raised the event.
ViStatus _VI_FUNCH closingHandler(ViSession vi, ViEventType, ViEvent, ViAddr user)
{
    auto* ps = static_cast<SCalls*>(user);
    ps->m_nContextStatus = viClose(vi);
    ps->called(4);
    return VI_SUCCESS;
}

TEST_F(Events, HandlersAreCalledNewestFirst)
{
    SCalls sCalls;
    EXPECT_EQ(VI_ERROR_HNDLR_NINSTALLED, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, firstHandler, &sCalls));
    ASSERT_EQ(VI_SUCCESS, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, secondHandler, &sCalls));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ((std::vector<int>{2, 1}), sCalls.order(2));
    EXPECT_EQ(m_nVi, sCalls.m_nVi);
    EXPECT_EQ(static_cast<ViEventType>(VI_EVENT_SERVICE_REQ), sCalls.m_nType);
    EXPECT_EQ(VI_SUCCESS, sCalls.m_nContextStatus); // valid while the handler runs
    // Nothing went to the queue, which was not enabled.
    EXPECT_EQ(VI_ERROR_NENABLED, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));

    ASSERT_EQ(VI_SUCCESS, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, stopHandler, &sCalls));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ((std::vector<int>{3}), sCalls.order(1));
    // The context of an event delivered to handlers only ends with them.
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ((std::vector<int>{3}), sCalls.order(1));

    EXPECT_EQ(VI_SUCCESS, viUninstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, stopHandler, &sCalls));
    EXPECT_EQ(VI_ERROR_INV_HNDLR_REF, viUninstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, stopHandler, &sCalls));
    EXPECT_EQ(VI_ERROR_INV_HNDLR_REF, viUninstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, firstHandler, nullptr));
    EXPECT_EQ(VI_SUCCESS, viUninstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, VI_ANY_HNDLR, nullptr));
    EXPECT_EQ(VI_ERROR_INV_HNDLR_REF, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, nullptr, nullptr));
}

TEST_F(Events, QueueAndHandlerTogether)
{
    SCalls sCalls;
    ASSERT_EQ(VI_SUCCESS, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, secondHandler, &sCalls));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ((std::vector<int>{2}), sCalls.order(1));
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
}

TEST_F(Events, AHandlerMayCloseItsOwnSession)
{
    SCalls sCalls;
    ASSERT_EQ(VI_SUCCESS, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, closingHandler, &sCalls));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ((std::vector<int>{4}), sCalls.order(1));
    EXPECT_EQ(VI_SUCCESS, sCalls.m_nContextStatus);
    EXPECT_EQ(VI_ERROR_INV_OBJECT, write(m_nVi, "EVENT 1"));
}

// VI_ALL_ENABLED_EVENTS adds the mechanism to every type that is enabled, and to no other.
TEST_F(Events, EnablingAllEnabledEventsAddsTheMechanismToEach)
{
    EXPECT_EQ(VI_SUCCESS_EVENT_EN, viEnableEvent(m_nVi, VI_ALL_ENABLED_EVENTS, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ(VI_ERROR_NENABLED, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    SCalls sCalls;
    ASSERT_EQ(VI_SUCCESS, viInstallHandler(m_nVi, VI_EVENT_SERVICE_REQ, secondHandler, &sCalls));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL));
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_ALL_ENABLED_EVENTS, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS_EVENT_EN, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_MECH, viEnableEvent(m_nVi, VI_ALL_ENABLED_EVENTS, 0x40, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    EXPECT_EQ(std::vector<int>({2}), sCalls.order(1)); // the handler too
}

TEST_F(Events, RepeatedEnableAndDisableAreAnsweredByTheRuntime)
{
    // The test passport refuses a second enable and a disable of what is not enabled: the
    // runtime answers these itself, with the success codes, and never asks it.
    EXPECT_EQ(VI_SUCCESS_EVENT_DIS, viDisableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS_EVENT_EN, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS, viDisableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS_EVENT_DIS, viDisableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS_EVENT_DIS, viDisableEvent(m_nVi, VI_ALL_ENABLED_EVENTS, VI_ALL_MECH));
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS, viDisableEvent(m_nVi, VI_ALL_ENABLED_EVENTS, VI_ALL_MECH));
    // Disabled events are not created, so nothing is queued.
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ(VI_ERROR_NENABLED, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
}

TEST_F(Events, DisablingAMechanismThatIsNotEnabledKeepsTheOthers)
{
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS_EVENT_DIS, viDisableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_HNDLR));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "EVENT 1"));
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    // The passport still counts the type as enabled: only the disable that ends it reaches it.
    EXPECT_EQ(VI_SUCCESS, viDisableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
}

TEST_F(Events, FailedOperationsRaiseExceptionsThatNameThem)
{
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_EXCEPTION, VI_QUEUE, VI_NULL));
    ViUInt32 nRet = 0;
    ASSERT_EQ(VI_ERROR_INV_PARAMETER, viRead(m_nVi, nullptr, 4, &nRet)); // the passport's answer
    ViEvent nContext = 0;
    ASSERT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_EXCEPTION, 0, VI_NULL, &nContext));
    ViStatus nStatus = VI_SUCCESS;
    ViChar szOper[VI_FIND_BUFLEN] = {};
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_STATUS, &nStatus));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_OPER_NAME, szOper));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, nStatus);
    EXPECT_STREQ("viRead", szOper);
}

TEST_F(Events, ClosingEndsAReadThatWaitsWithoutLimit)
{
    // The passport's read raises a service request once it waits, and ends when it closes.
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "HANG"));
    ViStatus nRead = VI_SUCCESS;
    std::thread cReader([&] { // a formatted read, which holds the session's buffers meanwhile
        ViChar acBuf[8];
        nRead = viScanf(m_nVi, "%7s", acBuf);
    });
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 30000, VI_NULL, VI_NULL));
    EXPECT_EQ(VI_SUCCESS, viClose(m_nVi));
    cReader.join();
    EXPECT_EQ(VI_ERROR_ABORT, nRead);
}

TEST_F(Events, WrongTypesAndMechanisms)
{
    EXPECT_EQ(VI_ERROR_INV_EVENT, viEnableEvent(m_nVi, VI_EVENT_TRIG, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_EVENT, viEnableEvent(m_nRm, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_MECH, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_MECH, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, 8, VI_NULL));
    EXPECT_EQ(VI_ERROR_NSUP_MECH, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_SUSPEND_HNDLR, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_CONTEXT, viEnableEvent(m_nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, 1));
    EXPECT_EQ(VI_ERROR_INV_EVENT, viDisableEvent(m_nVi, VI_EVENT_TRIG, VI_QUEUE));
    EXPECT_EQ(VI_ERROR_INV_MECH, viDisableEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0));
    EXPECT_EQ(VI_ERROR_INV_EVENT, viWaitOnEvent(m_nVi, VI_EVENT_TRIG, 0, VI_NULL, VI_NULL));
    EXPECT_EQ(VI_ERROR_NENABLED, viWaitOnEvent(m_nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_EVENT, viInstallHandler(m_nVi, VI_EVENT_TRIG, secondHandler, nullptr));
    // VI_EVENT_IO_COMPLETION is always accepted, though the passport never raises it.
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_IO_COMPLETION, VI_QUEUE, VI_NULL));
}

} // namespace LbVisaHostTest
