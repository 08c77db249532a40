#ifndef LBTESTS_SENSOR_SIMSESSIONFIXTURE_H
#define LBTESTS_SENSOR_SIMSESSIONFIXTURE_H
// A real sensor session on the simulated library: the adapter attached to the session
// dispatcher, one open session on the default sensor "100000" per test (or, for tests of the
// dispatcher, none until the test calls open()), a listener that counts data and error
// notifications (it subscribes after the session, so when it hears one the session has already
// changed its state), and helpers to queue results, read replies and the status byte.
#include "pmxsim/PmxSim.h"
#include "sensor/PmxControl.h"
#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"
#include "sensor/PmxSessionState.h"
#include "tests/sensor/SensorTestSupport.h"

#include <gtest/gtest.h>

#include <boost/shared_ptr.hpp>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <string>
#include <vector>

namespace LbTests {

const char* const SENSOR_RESOURCE = "LBPMX::0x0003::100000::INSTR";
const char* const SENSOR_SERIAL = "100000";

class CDataListener : public LbPmxVisa::CIPmxEventListener {
public:
    void notifyCommandAcceptedEvent(const LbPmxVisa::CPmxEvent&) override { }
    void notifyDataAvailableEvent(const LbPmxVisa::CPmxEvent&) override
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        ++m_nData;
        m_cCondition.notify_all();
    }
    void notifyErrorOccuredEvent(const LbPmxVisa::CPmxEvent&) override
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        ++m_nErrors;
        m_cCondition.notify_all();
    }
    void notifyStateChangedEvent(const LbPmxVisa::CPmxEvent&) override { }
    void notifyDeviceChangedEvent(const LbPmxVisa::CPmxEvent&) override { }

    // True once `count` data notifications have been delivered (generous deadline).
    bool waitData(int count) { return waitFor(m_nData, count); }
    bool waitErrors(int count) { return waitFor(m_nErrors, count); }

private:
    bool waitFor(const int& counter, int count)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, SENSOR_DEADLINE, [&] { return counter >= count; });
    }

    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    int m_nData = 0;
    int m_nErrors = 0;
};

class CSimSession : public ::testing::Test {
protected:
    static LbPmxVisa::CPmxControl& control()
    {
        static LbPmxVisa::CPmxControl control;
        return control;
    }
    static LbPmxVisa::CPmxSessionDispatcher& dispatcher() { return LbPmxVisa::CPmxSessionDispatcher::getInstance(); }
    static void SetUpTestSuite() { LbPmxVisa::CPmxSessionDispatcher::attach(&control()); }
    static void TearDownTestSuite() { LbPmxVisa::CPmxSessionDispatcher::detach(&control()); }

    void SetUp() override
    {
        ASSERT_EQ(0, PmxSimReset());
        if (m_bOpenInSetUp) {
            open();
        }
    }

    // Opens the session on the default sensor and subscribes the listener.
    LbPmxVisa::CPmxSession& open()
    {
        m_pSession = dispatcher().getSession(LbPmxVisa::CPmxResourceInfo(SENSOR_RESOURCE));
        EXPECT_TRUE(m_pSession->getEventDispatcher().addListener(&m_cListener));
        return *m_pSession;
    }

    void TearDown() override
    {
        if (m_pSession) {
            m_pSession->getEventDispatcher().removeListener(&m_cListener);
            m_pSession.reset();
        }
    }

    LbPmxVisa::CPmxSession& session() { return *m_pSession; }

    void binary() { session().write("format real,32"); }

    // Queues one result and waits until the session has heard of it.
    void queue(std::int32_t type, const void* values, std::int32_t count)
    {
        ASSERT_EQ(0, PmxSimQueueResult(SENSOR_SERIAL, type, values, count));
        ASSERT_TRUE(m_cListener.waitData(++m_nQueued));
    }
    void queueFloats(std::int32_t type, const std::vector<float>& values)
    {
        queue(type, values.data(), static_cast<std::int32_t>(values.size()));
    }
    void queueInts(std::int32_t type, const std::vector<std::int32_t>& values)
    {
        queue(type, values.data(), static_cast<std::int32_t>(values.size()));
    }
    void queueText(std::int32_t type, const std::string& text)
    {
        queue(type, text.data(), static_cast<std::int32_t>(text.size()));
    }

    // One read through the session into a buffer of `capacity` bytes; the reply as counted.
    std::string read(std::size_t capacity = 8192, const LbPmxVisa::CIPmxCaller* caller = nullptr)
    {
        std::vector<char> storage(capacity + 1, '\x7f');
        std::uint32_t count = 0;
        LbPmxVisa::CPmxDataBuffer buffer(session(), storage.data(), capacity, &count);
        session().read(buffer, caller);
        return std::string(storage.data(), count);
    }

    std::uint16_t statusByte()
    {
        std::uint16_t status = 0xFFFF;
        session().readSTB(&status);
        return status;
    }

    static std::int32_t codeOf(std::uint32_t code) { return static_cast<std::int32_t>(code); }

    // Little-endian IEEE 754 single precision bytes of one float.
    static std::string bytesOf(float value)
    {
        std::uint32_t bits;
        std::memcpy(&bits, &value, 4);
        std::string bytes;
        for (int i = 0; i < 4; ++i) {
            bytes += static_cast<char>((bits >> (8 * i)) & 0xFF);
        }
        return bytes;
    }

    bool m_bOpenInSetUp = true;
    boost::shared_ptr<LbPmxVisa::CPmxSession> m_pSession;
    CDataListener m_cListener;
    int m_nQueued = 0;
};

} // namespace LbTests

#endif
