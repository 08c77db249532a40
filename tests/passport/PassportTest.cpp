// The passport end to end: VISA C API -> runtime -> passport -> sensor sessions -> simulated
// sensor library, and back through callbacks and VISA events.
#include "tests/passport/PassportFixture.h"

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>

namespace LbPassportTest {

const char* const SENSOR = "LBPMX::0x0003::100000::INSTR";

class Resources : public CPassportTest { };

TEST_F(Resources, FindListsAttachedSensorsInDeviceOrder)
{
    ViFindList list = VI_NULL;
    ViUInt32 count = 0;
    ViChar name[VI_FIND_BUFLEN] = {0};
    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "?*::INSTR", &list, &count, name));
    EXPECT_EQ(2u, count);
    EXPECT_STREQ("LBPMX::0x0003::100000::INSTR", name);
    ASSERT_EQ(VI_SUCCESS, viFindNext(list, name));
    EXPECT_STREQ("LBPMX::0x009a::100001::INSTR", name);
    viClose(list);

    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "LBPMX?*0x009a?*", &list, &count, name));
    EXPECT_EQ(1u, count);
    viClose(list);

    ASSERT_EQ(0, PmxSimDetach("100000"));
    ASSERT_EQ(0, PmxSimDetach("100001"));
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viFindRsrc(m_nRm, "?*::INSTR", &list, &count, name));
}

TEST_F(Resources, ParseAnswersThePassportInterface)
{
    ViUInt16 type = 0;
    ViUInt16 number = 7;
    ViChar resourceClass[256] = {0};
    ViChar expanded[256] = {0};
    ViChar alias[256] = {'x', 0};
    ASSERT_EQ(VI_SUCCESS, viParseRsrcEx(m_nRm, "lbpmx::3::100000", &type, &number, resourceClass, expanded, alias));
    EXPECT_EQ(0x8100, type);
    EXPECT_EQ(0, number);
    EXPECT_STREQ("INSTR", resourceClass);
    EXPECT_STREQ("lbpmx::3::100000", expanded);
    EXPECT_STREQ("", alias);
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viParseRsrc(m_nRm, "LBPMX::3A::1", &type, &number));
}

TEST_F(Resources, OpeningAnUnattachedSensorFailsAndLogs)
{
    ViSession session = VI_NULL;
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viOpen(m_nRm, "LBPMX::0x0003::999999::INSTR", VI_NULL, 0, &session));
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viOpen(m_nRm, "ABC::3::1", VI_NULL, 0, &session));
    EXPECT_TRUE(logContains("[ERROR] CLbPmxInstrSesn - LbPmxPassport::CLbPmxInstrSesn::viOpen - "));
    // The failed opens left nothing behind: the sensor still opens.
    ViSession good = open(SENSOR);
    EXPECT_EQ(VI_SUCCESS, viClose(good));
}

class Sessions : public CPassportTest { };

TEST_F(Sessions, TwoVisaSessionsShareOneSensorSession)
{
    ViSession first = open("LbPmx::3::100000");
    ViSession second = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(first, VI_ATTR_TMO_VALUE, 2000));
    ViUInt32 timeout = 0;
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(second, VI_ATTR_TMO_VALUE, &timeout));
    EXPECT_EQ(2000u, timeout);
    EXPECT_TRUE(logContains("Recycle session for LBPMX::0x0003::100000::INSTR"));

    EXPECT_EQ(VI_SUCCESS, viClose(first));
    ASSERT_EQ(VI_SUCCESS, write(second, "*IDN?"));
    EXPECT_EQ("Marlowe&Tenby,PMX-M01,100000,", read(second).substr(0, 29));
    EXPECT_EQ(VI_SUCCESS, viClose(second));
}

TEST_F(Sessions, WriteReportsTheWholeCountEvenWithAZeroByteInside)
{
    ViSession session = open(SENSOR);
    ViUInt32 count = 0;
    ASSERT_EQ(VI_SUCCESS, write(session, std::string("*RST\0junk", 9), &count));
    EXPECT_EQ(9u, count);
    EXPECT_EQ(VI_SUCCESS, write(session, "*RST", nullptr));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viWrite(session, nullptr, 4, &count));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viRead(session, nullptr, 4, &count));
    ViUInt16 status = 0;
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viReadSTB(session, nullptr));
    EXPECT_EQ(VI_SUCCESS, viReadSTB(session, &status));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viTerminate(session, 0, 0));
}

TEST_F(Sessions, TriggeredMeasurementInAscii)
{
    ViSession session = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, viAssertTrigger(session, VI_TRIG_PROT_DEFAULT));
    ASSERT_EQ(VI_SUCCESS, write(session, "FETCh?"));
    std::string power = read(session);
    EXPECT_NE(std::string::npos, power.find("e+0")) << power;
}

TEST_F(Sessions, ASecondCommandWhileOneWaitsIsRefusedAtOnce)
{
    ViSession session = open(SENSOR);
    ViSession other = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(session, VI_ATTR_TMO_VALUE, 20000));
    ASSERT_EQ(0, PmxSimSetAutoAck(0));
    std::size_t sent = logCount("Execute PmxSendCommand(...) [init:cont off]");
    std::thread writer([&] { EXPECT_EQ(VI_ERROR_SYSTEM_ERROR, write(session, "INIT:CONT OFF")); });
    ASSERT_TRUE(eventually([&] { return logCount("Execute PmxSendCommand(...) [init:cont off]") > sent; }));
    ViStatus status = VI_SUCCESS;
    read(other, 1024, &status);
    EXPECT_EQ(VI_ERROR_RSRC_BUSY, status);
    EXPECT_EQ(VI_ERROR_RSRC_BUSY, write(other, "*RST"));
    ViUInt16 stb = 0xFFFF;
    EXPECT_EQ(VI_SUCCESS, viReadSTB(other, &stb));
    // The format commands do not need the session.
    EXPECT_EQ(VI_SUCCESS, write(other, "FORMAT ASCII"));
    // A sensor error ends the waiting write with that error, once the write has waited (here
    // briefly) for the refused command's acknowledgement, which does not come.
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(other, VI_ATTR_TMO_VALUE, 100));
    ASSERT_EQ(0, PmxSimReportError("100000", 0x12345));
    writer.join();
    ASSERT_EQ(0, PmxSimSetAutoAck(1));
    std::size_t purged = logCount("Asynchronous Message detected! Will be deleted to ensure stable further working!");
    std::size_t missed = logCount("No message arrived for session");
    EXPECT_EQ(VI_SUCCESS, write(other, "*RST"));
    EXPECT_EQ(purged + 1, logCount("Asynchronous Message detected! Will be deleted to ensure stable further working!"));
    // The purge of the failed command's answer does not swallow this command's acknowledgement.
    EXPECT_EQ(missed, logCount("No message arrived for session"));
}

TEST_F(Sessions, AtMost128SensorSessions)
{
    for (int i = 0; i < 129; ++i) {
        ASSERT_EQ(0, PmxSimAttach("PMX-M01", std::to_string(200000 + i).c_str()));
    }
    std::vector<ViSession> sessions;
    for (int i = 0; i < 128; ++i) {
        sessions.push_back(open("LBPMX::3::" + std::to_string(200000 + i)));
    }
    ViSession refused = VI_NULL;
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viOpen(m_nRm, "LBPMX::3::200128", VI_NULL, 0, &refused));
    EXPECT_TRUE(logContains(
        "[WARN ] CLbPmxInstrSesn - LbPmxPassport::CLbPmxInstrSesn::viOpen - There are already 127 active devices..."));
    // The limit is checked before the sensor session is looked for: with 128 open, even one
    // more VISA session on an open resource is refused.
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viOpen(m_nRm, "LBPMX::3::200000", VI_NULL, 0, &refused));
    EXPECT_EQ(VI_SUCCESS, viClose(sessions.back()));
    ViSession now = open("LBPMX::3::200128");
    EXPECT_EQ(VI_SUCCESS, viClose(now));
}

class Attributes : public CPassportTest { };

TEST_F(Attributes, ReadableWritableAndReadOnly)
{
    ViSession session = open("lbpmx::0x3::100000");
    ViChar text[256] = {0};
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_RSRC_NAME, text));
    EXPECT_STREQ("LBPMX::0x0003::100000::INSTR", text);
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_RSRC_CLASS, text));
    EXPECT_STREQ("INSTR", text);
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_MANF_NAME, text));
    EXPECT_STREQ("Marlowe&Tenby", text);
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_USB_SERIAL_NUM, text));
    EXPECT_STREQ("100000", text);
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_INTF_INST_NAME, text));
    EXPECT_STREQ("pmx0", text);
    ViUInt16 id = 0;
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_MANF_ID, &id));
    EXPECT_EQ(3891, id);
    ViUInt32 version = 0;
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_RSRC_SPEC_VERSION, &version));
    EXPECT_EQ(0x00400000u, version);
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_RSRC_IMPL_VERSION, &version));
    EXPECT_EQ(0x0Fu, version & 0x0Fu);
    EXPECT_EQ(0x24u, version >> 20); // file version 2.4

    ASSERT_EQ(VI_SUCCESS, viSetAttribute(session, VI_ATTR_TERMCHAR, 0x10A));
    ViUInt8 termChar = 0;
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_TERMCHAR, &termChar));
    EXPECT_EQ(0x0A, termChar);
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(session, VI_ATTR_SEND_END_EN, 2));
    ViUInt16 flag = 0;
    ASSERT_EQ(VI_SUCCESS, viGetAttribute(session, VI_ATTR_SEND_END_EN, &flag));
    EXPECT_EQ(1, flag);

    EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(session, VI_ATTR_RSRC_NAME, 0));
    EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(session, VI_ATTR_RSRC_IMPL_VERSION, 0));
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viSetAttribute(session, VI_ATTR_RSRC_CLASS, 0));
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viSetAttribute(session, VI_ATTR_MANF_ID, 0));
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viGetAttribute(session, 0x3FFF0199u, &version));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viGetAttribute(session, VI_ATTR_TMO_VALUE, nullptr));
}

class Events : public CPassportTest { };

TEST_F(Events, EnableTwiceDisableTwiceAndUnknownTypes)
{
    ViSession session = open(SENSOR);
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS_EVENT_EN, viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS, viDisableEvent(session, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS_EVENT_DIS, viDisableEvent(session, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_IO_COMPLETION, VI_QUEUE, VI_NULL));
}

TEST_F(Events, RaisedOnTheSessionsThatEnabledThemOnly)
{
    ViSession listening = open(SENSOR);
    ViSession deaf = open(SENSOR);
    ViSession closing = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(listening, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(listening, VI_EVENT_EXCEPTION, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(closing, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, viClose(closing));

    ASSERT_EQ(0, PmxSimSetTriggerState("100000", 2));
    ViEventType type = 0;
    ViEvent context = VI_NULL;
    ASSERT_EQ(VI_SUCCESS, viWaitOnEvent(listening, VI_EVENT_SERVICE_REQ, 20000, &type, &context));
    EXPECT_EQ(VI_EVENT_SERVICE_REQ, type);
    viClose(context);
    ViUInt16 stb = 0;
    ASSERT_EQ(VI_SUCCESS, viReadSTB(deaf, &stb));
    EXPECT_EQ(128, stb);
    EXPECT_NE(VI_SUCCESS, viWaitOnEvent(deaf, VI_EVENT_SERVICE_REQ, 0, &type, &context));

    ASSERT_EQ(0, PmxSimReportError("100000", static_cast<int32_t>(0xD0000089u)));
    ASSERT_EQ(VI_SUCCESS, viWaitOnEvent(listening, VI_EVENT_EXCEPTION, 20000, &type, &context));
    EXPECT_EQ(VI_EVENT_EXCEPTION, type);
    viClose(context);
    ASSERT_EQ(VI_SUCCESS, viReadSTB(deaf, &stb));
    EXPECT_EQ(128 + 4, stb);
}

TEST_F(Events, SessionsCloseWhileTheirListenersAreBeingCalled)
{
    // One session keeps the sensor session alive; others enable events and close while the
    // event worker delivers to them. A listener must never be called while it is being destroyed.
    ViSession keeper = open(SENSOR);
    ASSERT_EQ(0, PmxSimSetDelays(0, 1));
    ASSERT_EQ(VI_SUCCESS, write(keeper, "init:cont on"));
    for (int i = 0; i < 100; ++i) {
        ViSession session = open(SENSOR);
        ASSERT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
        ASSERT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_EXCEPTION, VI_QUEUE, VI_NULL));
        ASSERT_EQ(0, PmxSimReportError("100000", 0x55));
        ASSERT_EQ(VI_SUCCESS, viClose(session));
    }
}

namespace {
struct CClosingHandler {
    std::mutex mutex;
    std::condition_variable done;
    bool called = false;
    ViStatus status = VI_ERROR_SYSTEM_ERROR;
};

ViStatus _VI_FUNCH closeFromHandler(ViSession session, ViEventType, ViEvent, ViAddr user)
{
    CClosingHandler* handler = static_cast<CClosingHandler*>(user);
    ViStatus status = viClose(session);
    std::lock_guard<std::mutex> lock(handler->mutex);
    handler->status = status;
    handler->called = true;
    handler->done.notify_all();
    return VI_SUCCESS;
}
} // namespace

TEST_F(Events, AHandlerMayCloseTheLastSessionOfItsSensor)
{
    ViSession session = open(SENSOR);
    CClosingHandler handler;
    ASSERT_EQ(VI_SUCCESS, viInstallHandler(session, VI_EVENT_SERVICE_REQ, closeFromHandler, &handler));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_HNDLR, VI_NULL));
    ASSERT_EQ(0, PmxSimSetTriggerState("100000", 3));
    {
        std::unique_lock<std::mutex> lock(handler.mutex);
        ASSERT_TRUE(handler.done.wait_for(lock, std::chrono::seconds(30), [&] { return handler.called; }));
    }
    EXPECT_EQ(VI_SUCCESS, handler.status);
    // The sensor session went with its last VISA session; the sensor opens again.
    ViSession again = open(SENSOR);
    EXPECT_EQ(VI_SUCCESS, viClose(again));
}

} // namespace LbPassportTest
