// The sensor-library adapter against the simulated library: the driver-open flag, installing
// and removing the callbacks, event forwarding and its filter, and the argument orders.
#include "tests/Waiting.h"
#include "pmxsim/PmxSim.h"
#include "sensor/PmxControl.h"
#include "sensor/PmxResourceInfo.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"

#include <gtest/gtest.h>

#include <boost/shared_ptr.hpp>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

using LbPmxVisa::CIPmxEventListener;
using LbPmxVisa::CPmxControl;
using LbPmxVisa::CPmxEvent;
using LbPmxVisa::CPmxResourceInfo;
using LbPmxVisa::CPmxSession;
using LbPmxVisa::CPmxSessionDispatcher;

namespace {

using LbTests::DEADLINE;

struct SNote {
    std::string operation;
    std::int64_t handle;
    std::int32_t value;
    bool operator==(const SNote& other) const
    {
        return operation == other.operation && handle == other.handle && value == other.value;
    }
};

std::ostream& operator<<(std::ostream& out, const SNote& note)
{
    return out << note.operation << "(" << note.handle << "," << note.value << ")";
}

// Records every notification with the thread it arrived on.
class CRecorder : public CIPmxEventListener {
public:
    void notifyCommandAcceptedEvent(const CPmxEvent& event) override { add("accepted", event); }
    void notifyDataAvailableEvent(const CPmxEvent& event) override { add("data", event); }
    void notifyErrorOccuredEvent(const CPmxEvent& event) override { add("error", event); }
    void notifyStateChangedEvent(const CPmxEvent& event) override { add("state", event); }
    void notifyDeviceChangedEvent(const CPmxEvent& event) override { add("device", event); }

    bool waitCount(std::size_t count)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, DEADLINE, [&] { return m_cNotes.size() >= count; });
    }
    std::vector<SNote> notes()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_cNotes;
    }
    std::thread::id thread()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_cThread;
    }

private:
    void add(const char* operation, const CPmxEvent& event)
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        m_cNotes.push_back(SNote{operation, event.handle, event.value});
        m_cThread = std::this_thread::get_id();
        m_cCondition.notify_all();
    }

    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    std::vector<SNote> m_cNotes;
    std::thread::id m_cThread;
};

// A device-changed callback of the test's own, installed directly on the library: events are
// delivered in order, so once it has heard of a later attach, every earlier event is through.
struct SMarker {
    std::mutex mutex;
    std::condition_variable condition;
    int count = 0;
};

void onMarker(void* user)
{
    SMarker* marker = static_cast<SMarker*>(user);
    std::lock_guard<std::mutex> lock(marker->mutex);
    ++marker->count;
    marker->condition.notify_all();
}

// Waits until every event the library produced before this call has been delivered. It takes
// over the device-changed callback.
bool drainEvents(const char* serial)
{
    static SMarker marker;
    int before;
    {
        std::lock_guard<std::mutex> lock(marker.mutex);
        before = marker.count;
    }
    if (PmxSetNotifyCallbackDeviceChanged(onMarker, &marker) != 0 || PmxSimAttach("PMX-M02", serial) != 0) {
        return false;
    }
    std::unique_lock<std::mutex> lock(marker.mutex);
    return marker.condition.wait_for(lock, DEADLINE, [&] { return marker.count > before; });
}

class PmxControlTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_EQ(0, PmxSimReset());
        ASSERT_EQ(0, PmxSimSetDelays(0, 0));
        m_cControl.setEventListener(&m_cRecorder);
    }
    void TearDown() override
    {
        m_pSession.reset();
        CPmxSessionDispatcher::detach(&m_cControl);
        EXPECT_EQ(0, PmxSimReset());
    }

    // A real session on the default sensor, opened through the dispatcher with this adapter;
    // the recorder then takes the adapter's events instead of the dispatcher.
    CPmxSession& openSession()
    {
        CPmxSessionDispatcher::attach(&m_cControl);
        m_pSession = CPmxSessionDispatcher::getInstance().getSession(CPmxResourceInfo("LBPMX::0x0003::100000::INSTR"));
        m_cControl.setEventListener(&m_cRecorder);
        return *m_pSession;
    }

    CPmxControl m_cControl;
    CRecorder m_cRecorder;
    boost::shared_ptr<CPmxSession> m_pSession;
};

TEST_F(PmxControlTest, FailedOpenDriverInstallsNothingAndStaysClosed)
{
    ASSERT_EQ(0, PmxSimFailNext("PmxOpenDriver", 0x1111));
    EXPECT_EQ(0x1111, m_cControl.openDriver());
    EXPECT_FALSE(m_cControl.isDriverOpen());

    ASSERT_EQ(0, PmxOpenDriver());
    ASSERT_EQ(0, PmxSimAttach("PMX-M02", "1"));
    ASSERT_EQ(0, PmxSimReportError(nullptr, 0x2222));
    ASSERT_TRUE(drainEvents("2"));
    EXPECT_TRUE(m_cRecorder.notes().empty());
}

TEST_F(PmxControlTest, OpenDriverInstallsCallbacksThatForwardOnTheLibraryThread)
{
    ASSERT_EQ(0, m_cControl.openDriver());
    EXPECT_TRUE(m_cControl.isDriverOpen());
    ASSERT_EQ(0, PmxSimAttach("PMX-M02", "1"));
    ASSERT_EQ(0, PmxSimReportError("", PMX_INFO_COMMAND_IGNORED));
    ASSERT_EQ(0, PmxSimReportError("", 0x2222));
    ASSERT_TRUE(m_cRecorder.waitCount(2));
    std::vector<SNote> expected = {{"device", 0, 0}, {"error", 0, 0x2222}};
    EXPECT_EQ(expected, m_cRecorder.notes()) << "device changed is 0, 0; the benign code reaches no listener";
    EXPECT_NE(std::this_thread::get_id(), m_cRecorder.thread());

    // Without a listener the events are dropped; with one set again they arrive.
    m_cControl.setEventListener(nullptr);
    ASSERT_EQ(0, PmxSimReportError("", 0x3333));
    ASSERT_TRUE(drainEvents("2"));
    m_cControl.setEventListener(&m_cRecorder);
    ASSERT_EQ(0, PmxSimReportError("", 0x4444));
    ASSERT_TRUE(m_cRecorder.waitCount(3));
    EXPECT_EQ((SNote{"error", 0, 0x4444}), m_cRecorder.notes().back());

    ASSERT_EQ(0, m_cControl.closeDriver());
    EXPECT_FALSE(m_cControl.isDriverOpen());
}

// A listener that fails on the library's thread must not take the library (and the process)
// down: the adapter keeps the exception out of the callback and the next event still arrives.
TEST_F(PmxControlTest, ListenerFailureStaysOutOfTheLibraryThread)
{
    class CThrowing : public CRecorder {
    public:
        void notifyErrorOccuredEvent(const CPmxEvent& event) override
        {
            if (event.value == 0x2222) {
                throw std::runtime_error("listener failed");
            }
            CRecorder::notifyErrorOccuredEvent(event);
        }
    } throwing;
    m_cControl.setEventListener(&throwing);
    ASSERT_EQ(0, m_cControl.openDriver());
    ASSERT_EQ(0, PmxSimReportError("", 0x2222));
    ASSERT_EQ(0, PmxSimReportError("", 0x3333));
    ASSERT_TRUE(throwing.waitCount(1));
    std::vector<SNote> expected = {{"error", 0, 0x3333}};
    EXPECT_EQ(expected, throwing.notes());
    ASSERT_EQ(0, m_cControl.closeDriver());
}

// Callbacks are installed exactly while the driver is open.
TEST_F(PmxControlTest, FailedCloseDriverStaysOpenAndKeepsReporting)
{
    ASSERT_EQ(0, m_cControl.openDriver());
    ASSERT_EQ(0, PmxSimFailNext("PmxCloseDriver", 0x5555));
    EXPECT_EQ(0x5555, m_cControl.closeDriver());
    EXPECT_TRUE(m_cControl.isDriverOpen());
    ASSERT_EQ(0, PmxSimReportError(nullptr, 0x2222));
    ASSERT_TRUE(m_cRecorder.waitCount(1));
    EXPECT_EQ((SNote{"error", 0, 0x2222}), m_cRecorder.notes().back());

    ASSERT_EQ(0, m_cControl.closeDriver());
    EXPECT_FALSE(m_cControl.isDriverOpen());
    // Any failed close counts as "still open", also the library's own "not open".
    EXPECT_EQ(PMXSIM_E_DRIVER_NOT_OPEN, m_cControl.closeDriver());
    EXPECT_TRUE(m_cControl.isDriverOpen());
}

TEST_F(PmxControlTest, PerSensorOperationsUseTheSessionHandle)
{
    CPmxSession& session = openSession();
    std::int64_t handle = session.getHandle();
    ASSERT_GT(handle, std::int64_t(0xFFFFFFFF)) << "the simulated library hands out 64-bit handles";

    ASSERT_EQ(0, m_cControl.sendCommand(session, "*idn?\n"));
    char text[64] = "";
    std::int32_t timeout = -1;
    ASSERT_EQ(0, PmxSimGetLastCommand("100000", text, sizeof text, &timeout));
    EXPECT_STREQ("*idn?\n", text);
    EXPECT_EQ(0, timeout);
    ASSERT_TRUE(m_cRecorder.waitCount(2));
    std::vector<SNote> expected = {{"accepted", handle, 1}, {"data", handle, 10}};
    EXPECT_EQ(expected, m_cRecorder.notes());

    std::int32_t type = -1, count = -1, pending = -1;
    ASSERT_EQ(0, m_cControl.getData(session, &type, &count, &pending));
    EXPECT_EQ(10, type);
    char answer[1024] = "";
    ASSERT_EQ(0, m_cControl.getStringResult(session, answer, sizeof answer));
    EXPECT_STREQ("Marlowe&Tenby,PMX-M01,100000,1.20", answer);
    EXPECT_EQ(PMX_ERR_NO_MORE_RESULTS, m_cControl.getData(session, &type, &count, &pending));

    const float floats[] = {1.0f, 2.0f, 3.0f};
    float a = 0, b = 0, c = 0;
    ASSERT_EQ(0, PmxSimQueueResult("100000", 5, floats, 3));
    ASSERT_EQ(0, m_cControl.getFloatResult(session, &a, &b, &c));
    EXPECT_EQ(3.0f, c);
    float array[4] = {}, aux2[4], aux3[4];
    std::int32_t n = 0;
    ASSERT_EQ(0, PmxSimQueueResult("100000", 4, floats, 3));
    ASSERT_EQ(0, m_cControl.getFloatArray(session, array, 4, &n));
    EXPECT_EQ(3, n);
    ASSERT_EQ(0, PmxSimQueueResult("100000", 11, floats, 2));
    ASSERT_EQ(0, m_cControl.getAuxFloatArray(session, array, aux2, aux3, 4, &n));
    EXPECT_EQ(2, n);
    const std::int32_t ints[] = {7, 8, 9};
    std::int32_t i1 = 0, i2 = 0, i3 = 0;
    ASSERT_EQ(0, PmxSimQueueResult("100000", 2, ints, 3));
    ASSERT_EQ(0, m_cControl.getBitfieldResult(session, &i1, &i2, &i3));
    EXPECT_EQ(9, i3);
    ASSERT_EQ(0, PmxSimQueueResult("100000", 8, ints, 3));
    ASSERT_EQ(0, m_cControl.getLongResult(session, &i1, &i2, &i3));
    EXPECT_EQ(7, i1);
    unsigned char bytes[8];
    ASSERT_EQ(0, PmxSimQueueResult("100000", 0, "xyz", 3));
    ASSERT_EQ(0, m_cControl.getBinaryResult(session, bytes, sizeof bytes, &n));
    EXPECT_EQ(3, n);
    ASSERT_EQ(0, PmxSimQueueResult("100000", 6, floats, 1));
    ASSERT_EQ(0, m_cControl.emptyAllBuffers(session));
    EXPECT_EQ(PMX_ERR_NO_MORE_RESULTS, m_cControl.getData(session, &type, &count, &pending));

    ASSERT_EQ(0, PmxSimSetTriggerState("100000", 3));
    std::int32_t state = 0;
    ASSERT_EQ(0, m_cControl.getTriggerState(session, &state));
    EXPECT_EQ(3, state);
    EXPECT_EQ(0, m_cControl.clearDevice(session));
    ASSERT_EQ(0, PmxSimFailNext("PmxGetTriggerState", 0x6666));
    EXPECT_EQ(0x6666, m_cControl.getTriggerState(session, &state));

    char message[1024] = "";
    ASSERT_EQ(0, m_cControl.getErrorText(PMX_ERR_UNKNOWN_COMMAND, message, sizeof message));
    EXPECT_STREQ("Unknown command or invalid parameter", message);

    // Closing the session closes the sensor through the adapter; the dispatcher, idle now,
    // closes the driver.
    m_pSession.reset();
    EXPECT_FALSE(m_cControl.isDriverOpen());
}

TEST_F(PmxControlTest, DeviceInfoTextsArriveInArgumentOrder)
{
    ASSERT_EQ(0, m_cControl.openDriver());
    std::int32_t count = 0;
    ASSERT_EQ(0, m_cControl.getDeviceListLength(&count));
    ASSERT_EQ(2, count);
    std::string name, type, serial;
    std::int32_t flag = 0;
    ASSERT_EQ(0, m_cControl.getDeviceInfo(1, name, type, serial, &flag));
    EXPECT_EQ("USB::0x0c6f::0154::100001", name);
    EXPECT_EQ("PMX-M10", type);
    EXPECT_EQ("100001", serial);
    EXPECT_EQ(1, flag);

    // A failing call leaves the buffers unwritten: the texts come back empty, not stale.
    EXPECT_EQ(PMXSIM_E_INDEX_OUT_OF_RANGE, m_cControl.getDeviceInfo(2, name, type, serial, &flag));
    EXPECT_EQ("", name);
    EXPECT_EQ("", type);
    EXPECT_EQ("", serial);
    ASSERT_EQ(0, m_cControl.closeDriver());
}

TEST_F(PmxControlTest, OpenSensorUsesTheLibraryFormOfTheResource)
{
    ASSERT_EQ(0, m_cControl.openDriver());
    std::int64_t handle = 0;
    ASSERT_EQ(0, m_cControl.openSensor(CPmxResourceInfo("LBPMX::0x009a::100001::INSTR"), &handle));
    EXPECT_NE(0, handle);
    std::int64_t other = 0;
    EXPECT_EQ(PMXSIM_E_NO_SUCH_SENSOR, m_cControl.openSensor(CPmxResourceInfo("LBPMX::0x0003::100001"), &other));
    EXPECT_EQ(0, other);
    EXPECT_EQ(0, PmxCloseSensor(handle));
    ASSERT_EQ(0, m_cControl.closeDriver());
}

} // namespace
