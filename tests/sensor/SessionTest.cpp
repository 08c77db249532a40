// Sensor sessions and the session dispatcher against the simulated sensor library: commands
// and acknowledgements, sensor errors, the busy rule, the status byte, the error queue, session
// recycling, enumeration, event routing and the driver's lifetime.
#include "tests/Waiting.h"
#include "tests/sensor/SimSessionFixture.h"

#include <gtest/gtest.h>

#include <boost/shared_ptr.hpp>
#include <chrono>
#include <cstdint>
#include <future>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

using LbPmxVisa::CIPmxSessionState;
using LbPmxVisa::CPmxDataBuffer;
using LbPmxVisa::CPmxEvent;
using LbPmxVisa::CPmxResourceInfo;
using LbPmxVisa::CPmxSession;
using LbPmxVisa::CPmxSessionDispatcher;
using LbTests::CLogCapture;
using LbTests::SENSOR_RESOURCE;
using LbTests::SENSOR_SERIAL;

namespace {

// The shared fixture without a session at the start: these tests open it themselves, after
// their log capture, or test the dispatcher with none open. Every test leaves no session
// behind and the driver closed.
class SessionTest : public LbTests::CSimSession {
protected:
    SessionTest() { m_bOpenInSetUp = false; }

    void TearDown() override
    {
        CSimSession::TearDown();
        EXPECT_EQ(0u, dispatcher().getActiveSessionCount());
        EXPECT_FALSE(control().isDriverOpen());
    }
};

// ---- writing and acknowledgements

TEST_F(SessionTest, WriteWaitsForTheAcknowledgement)
{
    CLogCapture capture;
    CPmxSession& session = open();
    session.write("*RST");
    EXPECT_EQ(1u, session.getCommandCount());
    EXPECT_EQ(1u, session.getMessageCount());
    EXPECT_EQ(1u, capture.count("Execute PmxSendCommand(...) [*rst] for session [Id: "));
    EXPECT_EQ(1u, capture.count("Message arrived 0 / 1 for session "));
    EXPECT_EQ(0u, capture.count("No message arrived"));
}

TEST_F(SessionTest, CommandStringsAreSplitLowerCasedAndClassified)
{
    CLogCapture capture;
    CPmxSession& session = open();
    session.write("");
    session.write(";;");
    EXPECT_EQ(0u, session.getCommandCount());

    // Two tokens: '*idn?' goes to the sensor, 'fetch?' sends nothing.
    session.write("*IDN?;;FETCh?");
    EXPECT_EQ(1u, session.getCommandCount());
    EXPECT_EQ(1u, capture.count("Execute PmxSendCommand(...) [*idn?]"));
    EXPECT_EQ(1u, capture.count(" - fetch command executed [Id: "));
    ASSERT_TRUE(m_cListener.waitData(1));
    EXPECT_EQ(0u, read().find("Marlowe&Tenby,"));

    for (const char* fetch : {"FETCh?", "fetch?\n", "FETC?", ":FETCH?"}) {
        session.write(fetch);
    }
    EXPECT_EQ(1u, session.getCommandCount());
    EXPECT_EQ(5u, capture.count("fetch command executed"));

    // A blank after the question mark is no FETCh? any more: the sensor gets it and refuses it.
    try {
        session.write("FETCh? ");
        FAIL() << "the sensor accepted 'fetch? '";
    } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
        EXPECT_EQ(LbPmxVisa::PMX_UNKNOWN_COMMAND, e.getErrorCode());
        EXPECT_STREQ("Unknown command or invalid parameter", e.what());
    }
    EXPECT_EQ(1u, capture.count("Execute PmxSendCommand(...) [fetch? ]"));

    // ':SYST:ERR?' is the error query: answered here, nothing sent.
    std::uint64_t sent = session.getCommandCount();
    session.write(":SYST:ERR?");
    EXPECT_EQ(sent, session.getCommandCount());
    EXPECT_EQ(session.getState(), CIPmxSessionState::errorQueueToNoData());
}

TEST_F(SessionTest, SensorErrorFailsTheWaitingWriteAfterItsAcknowledgementAndIsQueued)
{
    CLogCapture capture;
    CPmxSession& session = open();
    session.setTimeout(20000);
    ASSERT_EQ(0, PmxSimSetAutoAck(0));
    const std::int32_t code = codeOf(PMXSIM_E_INVALID_ARGUMENT);
    auto writeAndFail = [&](const char* command, std::int32_t& failure) {
        return std::thread([&session, &failure, command] {
            try {
                session.write(command);
            } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
                failure = e.getErrorCode();
            }
        });
    };

    // The refused command waits for its own acknowledgement before it fails, so nothing of it
    // is left for the next command.
    std::int32_t failure = 0;
    std::thread writer = writeAndFail("*RST", failure);
    ASSERT_TRUE(capture.waitFor("Execute PmxSendCommand(...) [*rst]"));
    ASSERT_EQ(0, PmxSimReportError(SENSOR_SERIAL, code));
    ASSERT_TRUE(m_cListener.waitErrors(1));
    CPmxEvent accepted = {session.getHandle(), 1};
    dispatcher().notifyCommandAcceptedEvent(accepted);
    writer.join();
    EXPECT_EQ(code, failure);
    EXPECT_EQ(1u, session.getMessageCount());
    EXPECT_EQ(1u, capture.count("An Pmx-Error has been occurred on session [Id: "));
    EXPECT_EQ(1u, capture.count("[Error: Invalid argument]"));

    // Without an acknowledgement within the time-out the write fails all the same, and the next
    // write accounts for the missing answer once.
    std::int32_t second = 0;
    writer = writeAndFail("*CLS", second);
    ASSERT_TRUE(capture.waitFor("Execute PmxSendCommand(...) [*cls]"));
    session.setTimeout(50);
    ASSERT_EQ(0, PmxSimReportError(SENSOR_SERIAL, code));
    writer.join();
    EXPECT_EQ(code, second);
    EXPECT_EQ(2u, session.getCommandCount());
    EXPECT_EQ(1u, session.getMessageCount());
    ASSERT_EQ(0, PmxSimSetAutoAck(1));
    session.setTimeout(20000);
    session.write("*CLS");
    EXPECT_EQ(1u, capture.count("Asynchronous Message detected! Will be deleted to ensure stable further working!"));
    EXPECT_EQ(3u, session.getMessageCount());

    session.write("SYSTem:ERRor?");
    EXPECT_EQ(std::to_string(code) + ", \"Invalid argument\"", read());
}

TEST_F(SessionTest, MissingAcknowledgementEndsTheWriteAfterTheTimeout)
{
    CLogCapture capture;
    CPmxSession& session = open();
    EXPECT_EQ(5000u, session.getTimeout());
    session.setTimeout(50);
    ASSERT_EQ(0, PmxSimSetAutoAck(0));
    std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
    session.write("*RST");
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(40));
    EXPECT_EQ(1u, session.getCommandCount());
    EXPECT_EQ(1u, session.getMessageCount());
    EXPECT_EQ(1u, capture.count("No message arrived for session [Id: "));

    ASSERT_EQ(0, PmxSimSetAutoAck(1));
    session.setTimeout(20000);
    session.write("*CLS");
    EXPECT_EQ(0u, capture.count("Asynchronous Message detected!"));
    EXPECT_EQ(2u, session.getMessageCount());
}

// ---- the busy rule

// A caller that closes ends its own waiting read, never another caller's, and starts nothing new.
TEST_F(SessionTest, AbandonEndsOnlyItsCallersWaitAndAClosingCallerStartsNothing)
{
    class CCaller : public LbPmxVisa::CIPmxCaller {
    public:
        bool isClosing() const override { return m_bClosing; }
        std::atomic<bool> m_bClosing{false};
    };
    CPmxSession& session = open();
    session.setTimeout(60000);
    CCaller reading;
    CCaller other;
    std::promise<long> started;
    std::thread reader([&] {
        started.set_value(LbTests::currentThreadId());
        EXPECT_THROW(read(8192, &reading), CPmxSession::CPmxAbandonedException);
    });
    const long id = started.get_future().get();
    ASSERT_TRUE(LbTests::waitUntilSleeping(id));
    other.m_bClosing = true;
    session.abandon(&other); // not the reader's caller: it sleeps on
    ASSERT_TRUE(LbTests::waitUntilSleeping(id));
    reading.m_bClosing = true;
    session.abandon(&reading);
    reader.join();

    EXPECT_THROW(session.write("*RST", &reading), CPmxSession::CPmxAbandonedException);
    EXPECT_EQ(0u, session.getCommandCount());
    session.write("*RST");
    EXPECT_EQ(1u, session.getCommandCount());
}

TEST_F(SessionTest, SecondCommandIsRefusedAtOnceWhileStatusAndFormatStillWork)
{
    CLogCapture capture;
    CPmxSession& session = open();
    session.setTimeout(20000);
    ASSERT_EQ(0, PmxSimSetAutoAck(0));
    std::thread writer([&] { session.write("*CLS"); });
    ASSERT_TRUE(capture.waitFor("Execute PmxSendCommand(...) [*cls]"));

    std::vector<char> storage(64);
    std::uint32_t count = 0;
    CPmxDataBuffer buffer(session, storage.data(), storage.size(), &count);
    EXPECT_THROW(session.read(buffer), CPmxSession::CPmxSessionIsBusyException);
    EXPECT_THROW(session.clear(), CPmxSession::CPmxSessionIsBusyException);
    EXPECT_THROW(session.write("*CLS"), CPmxSession::CPmxSessionIsBusyException);
    try {
        session.write("SYST:ERR?");
        FAIL() << "the error query ran beside the write";
    } catch (const CPmxSession::CPmxSessionIsBusyException& e) {
        EXPECT_STREQ("The PMX session is currently busy with another command", e.what());
    }
    std::uint16_t status = 0xFFFF;
    EXPECT_NO_THROW(session.readSTB(&status));
    EXPECT_NE(0xFFFF, status);

    session.write("FORMAT REAL,32");
    EXPECT_EQ(1u, session.getDataFormat());
    session.write("format ascii");
    EXPECT_EQ(0u, session.getDataFormat());

    // Acknowledge the waiting command the way the library's callback would.
    CPmxEvent accepted = {session.getHandle(), 1};
    dispatcher().notifyCommandAcceptedEvent(accepted);
    writer.join();
    EXPECT_EQ(1u, session.getMessageCount());
    EXPECT_NO_THROW(session.clear());
}

// ---- status byte and error queue

TEST_F(SessionTest, StatusByteCombinesErrorQueueResultAndTriggerState)
{
    CPmxSession& session = open();
    EXPECT_EQ(0, statusByte());

    ASSERT_EQ(0, PmxSimReportError(SENSOR_SERIAL, codeOf(PMXSIM_E_INVALID_HANDLE)));
    ASSERT_TRUE(m_cListener.waitErrors(1));
    EXPECT_EQ(4, statusByte());

    float value = -20.0f;
    ASSERT_EQ(0, PmxSimQueueResult(SENSOR_SERIAL, 6, &value, 1));
    ASSERT_TRUE(m_cListener.waitData(1));
    EXPECT_EQ(4 + 16, statusByte());

    ASSERT_EQ(0, PmxSimSetTriggerState(SENSOR_SERIAL, 3));
    EXPECT_EQ(148, statusByte());
    ASSERT_EQ(0, PmxSimSetTriggerState(SENSOR_SERIAL, 2));
    EXPECT_EQ(148, statusByte());
    ASSERT_EQ(0, PmxSimSetTriggerState(SENSOR_SERIAL, 1));
    EXPECT_EQ(20, statusByte());

    // A device clear leaves the error queue as it is.
    session.clear();
    EXPECT_EQ(4, statusByte() & 4);

    ASSERT_EQ(0, PmxSimFailNext("PmxGetTriggerState", codeOf(PMXSIM_E_SENSOR_DETACHED)));
    std::uint16_t status = 0x1234;
    EXPECT_THROW(session.readSTB(&status), CPmxSessionDispatcher::CPmxCommandException);
    EXPECT_EQ(0x1234, status);
}

TEST_F(SessionTest, ErrorQueueAnswersLastRecordedFirstThenNoError)
{
    CPmxSession& session = open();
    session.write("SYST:ERR?");
    EXPECT_EQ("0, \"No Error\"", read());
    EXPECT_EQ(session.getState(), CIPmxSessionState::noData());

    ASSERT_EQ(0, PmxSimReportError(SENSOR_SERIAL, codeOf(PMXSIM_E_NO_SUCH_SENSOR)));
    ASSERT_EQ(0, PmxSimReportError(SENSOR_SERIAL, LbPmxVisa::PMX_NO_FURTHER_RESULT));
    ASSERT_TRUE(m_cListener.waitErrors(2));
    EXPECT_EQ(4, statusByte());

    session.write("SYSTem:ERRor?");
    EXPECT_EQ("-1073741814, \"No further result available\"", read());
    session.write(":syst:err?");
    EXPECT_EQ("-805306363, \"No such sensor attached\"", read());
    EXPECT_EQ(0, statusByte());
    session.write("SYST:ERR?");
    EXPECT_EQ("0, \"No Error\"", read());

    // A reply that does not fit is kept whole for the next read, once; the status byte
    // announces it as an answer waiting.
    ASSERT_EQ(0, PmxSimReportError(SENSOR_SERIAL, codeOf(PMXSIM_E_NO_SUCH_SENSOR)));
    ASSERT_TRUE(m_cListener.waitErrors(3));
    session.write("SYST:ERR?");
    EXPECT_THROW(read(10), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    EXPECT_THROW(read(37), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    EXPECT_EQ(16, statusByte());
    EXPECT_EQ("-805306363, \"No such sensor attached\"", read(38));
    EXPECT_EQ(0, statusByte());
    session.write("SYST:ERR?");
    EXPECT_EQ("0, \"No Error\"", read());
}

// ---- the session dispatcher

TEST_F(SessionTest, TwoSpellingsOfOneResourceShareOneSession)
{
    CLogCapture capture;
    EXPECT_FALSE(control().isDriverOpen());
    boost::shared_ptr<CPmxSession> first = dispatcher().getSession(CPmxResourceInfo("LbPmx::3::100000"));
    EXPECT_TRUE(control().isDriverOpen());
    boost::shared_ptr<CPmxSession> second = dispatcher().getSession(CPmxResourceInfo(SENSOR_RESOURCE));
    EXPECT_EQ(first.get(), second.get());
    EXPECT_EQ(1u, dispatcher().getActiveSessionCount());
    EXPECT_EQ(1u, capture.count(" - Open session"));
    EXPECT_EQ(1u,
              capture.count("[INFO ] CPmxSessionDispatcher - LbPmxVisa::CPmxSessionDispatcher::getSession - "
                            "Recycle session for LBPMX::0x0003::100000::INSTR"));
    EXPECT_EQ(1u, capture.count("Session opened successfully: [Id: "));

    first.reset();
    EXPECT_TRUE(control().isDriverOpen());
    second.reset();
    EXPECT_EQ(0u, dispatcher().getActiveSessionCount());
    EXPECT_FALSE(control().isDriverOpen());
    EXPECT_EQ(1u, capture.count(" - Session closed successfully"));

    // After the last reference has gone, the resource gets a new session.
    boost::shared_ptr<CPmxSession> third = dispatcher().getSession(CPmxResourceInfo(SENSOR_RESOURCE));
    EXPECT_EQ(2u, capture.count(" - Open session"));
}

TEST_F(SessionTest, FailedOpenStoresNothingAndClosesTheDriver)
{
    CLogCapture capture;
    try {
        dispatcher().getSession(CPmxResourceInfo("LBPMX::0x0003::999999::INSTR"));
        FAIL() << "a session on a missing sensor";
    } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
        EXPECT_EQ(codeOf(PMXSIM_E_NO_SUCH_SENSOR), e.getErrorCode());
        EXPECT_STREQ("No such sensor attached", e.what());
    }
    EXPECT_EQ(0u, capture.count("Closing session"));
}

TEST_F(SessionTest, ClosingFailureIsLoggedAndTheSessionStillLeaves)
{
    CLogCapture capture;
    open();
    ASSERT_EQ(0, PmxSimFailNext("PmxCloseSensor", codeOf(PMXSIM_E_INVALID_HANDLE)));
    EXPECT_NO_THROW(m_pSession.reset());
    std::vector<std::string> errors = capture.matching("[ERROR] CPmxSession - LbPmxVisa::CPmxSession::~CPmxSession - ");
    ASSERT_EQ(1u, errors.size());
    EXPECT_NE(std::string::npos, errors[0].find("Unknown sensor handle"));
    EXPECT_EQ(0u, capture.count("Session closed successfully"));
}

TEST_F(SessionTest, EnumerationSkipsUnknownTypesAndClearedFlags)
{
    CLogCapture capture;
    ASSERT_EQ(0, PmxSimAttach("NO-SUCH-TYPE", "200000"));
    ASSERT_EQ(0, PmxSimSetDeviceFlag("100001", 0));
    std::vector<CPmxResourceInfo> devices = dispatcher().getAvailableDevices();
    ASSERT_EQ(1u, devices.size());
    EXPECT_EQ(CPmxResourceInfo(SENSOR_RESOURCE), devices[0]);
    EXPECT_EQ(1u, capture.count("Found 3 device(s)..."));
    EXPECT_EQ(1u, capture.count("Adding device PMX-M10;100001"));
    EXPECT_EQ(1u, capture.count("Adding device NO-SUCH-TYPE;200000"));
    EXPECT_EQ(1u,
              capture.count("[ERROR] CPmxSessionDispatcher - LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices - "
                            "Exception during adding to the resource info: "));
    EXPECT_FALSE(control().isDriverOpen());

    // With a session open the enumeration leaves the driver open.
    open();
    EXPECT_EQ(1u, dispatcher().getAvailableDevices().size());
    EXPECT_TRUE(control().isDriverOpen());
}

TEST_F(SessionTest, EventsForUnknownHandlesAreLoggedAndDropped)
{
    CLogCapture capture;
    open();
    ASSERT_EQ(0, PmxSimReportError("", codeOf(PMXSIM_E_INVALID_ARGUMENT)));
    ASSERT_TRUE(capture.waitFor("Could not find a event listener for session 0"));
    CPmxEvent stray = {12345, 6};
    dispatcher().notifyDataAvailableEvent(stray);
    EXPECT_EQ(1u,
              capture.count("[ERROR] CPmxSessionDispatcher - LbPmxVisa::CPmxSessionDispatcher::findAndNotify - "
                            "Could not find a event listener for session 12345"));
    EXPECT_EQ(m_pSession->getState(), CIPmxSessionState::noData());
}

TEST_F(SessionTest, WithoutCommandsInterfaceNothingReachesTheLibrary)
{
    CLogCapture capture;
    CPmxSessionDispatcher::detach(&control());
    CPmxSessionDispatcher::CPmxCommandException failure(LbPmxVisa::PMX_UNKNOWN_COMMAND);
    EXPECT_STREQ("", failure.what());
    try {
        dispatcher().getSession(CPmxResourceInfo(SENSOR_RESOURCE));
        FAIL() << "a session without commands interface";
    } catch (const std::runtime_error& e) {
        EXPECT_STREQ("No configuration has been set. Use method attach(...) for set a configuration", e.what());
    }
    CPmxSessionDispatcher::attach(&control());
    CPmxSessionDispatcher::attach(nullptr);
    EXPECT_EQ(1u, capture.count("m_pcCommand has not been set..."));
    CPmxSessionDispatcher::attach(&control());
    EXPECT_STREQ("Unknown command or invalid parameter",
                 CPmxSessionDispatcher::CPmxCommandException(LbPmxVisa::PMX_UNKNOWN_COMMAND).what());
}

} // namespace
