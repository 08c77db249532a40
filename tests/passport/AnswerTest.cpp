// Answers an application can trust, through the VISA C API: nothing lost to a short read, a
// clear or an unrelated hot-plug, results pending together kept apart, refused commands failing
// at once under load, and sensors that leave and come back.
#include "tests/passport/PassportFixture.h"

#include <cstring>
#include <thread>

namespace LbPassportTest {

namespace {

const char* const SENSOR = "LBPMX::0x0003::100000::INSTR";

class Answers : public CPassportTest {
protected:
    // Opens the sensor with a short time-out, so that a read with nothing to read ends soon.
    ViSession openShort()
    {
        ViSession session = open(SENSOR);
        EXPECT_EQ(VI_SUCCESS, viSetAttribute(session, VI_ATTR_TMO_VALUE, 200));
        return session;
    }

    static ViUInt16 statusByte(ViSession session)
    {
        ViUInt16 status = 0xFFFF;
        EXPECT_EQ(VI_SUCCESS, viReadSTB(session, &status));
        return status;
    }

    // Queues results and waits until the session announces them (status byte bit 4).
    static void queueFloats(ViSession session, std::int32_t type, const std::vector<float>& values)
    {
        ASSERT_EQ(0, PmxSimQueueResult("100000", type, values.data(), static_cast<std::int32_t>(values.size())));
        ASSERT_TRUE(eventually([&] { return (statusByte(session) & 16) != 0; }));
    }

    static void waitEvent(ViSession session, ViEventType type)
    {
        ViEventType got = 0;
        ViEvent context = VI_NULL;
        ASSERT_EQ(VI_SUCCESS, viWaitOnEvent(session, type, 20000, &got, &context));
        viClose(context);
    }

    static void expectTimeout(ViSession session)
    {
        ViStatus status = VI_SUCCESS;
        read(session, 1024, &status);
        EXPECT_EQ(VI_ERROR_TMO, status);
    }
};

} // namespace

TEST_F(Answers, AShortReadKeepsTheWholeAnswerForTheNextReadOnce)
{
    ViSession session = openShort();
    ViStatus status = VI_SUCCESS;
    auto shortThenWhole = [&](std::size_t length) {
        read(session, 4, &status);
        EXPECT_EQ(VI_ERROR_USER_BUF, status);
        EXPECT_EQ(16, statusByte(session) & 16); // the kept answer is waiting
        std::string whole = read(session);
        EXPECT_EQ(length, whole.size());
        return whole;
    };

    queueFloats(session, 6, {-20.5f});
    EXPECT_EQ("-2.050000e+001", shortThenWhole(14));

    ASSERT_EQ(VI_SUCCESS, write(session, "*IDN?"));
    EXPECT_EQ("Marlowe&Tenby,PMX-M01,100000,1.20", shortThenWhole(33));

    ASSERT_EQ(VI_SUCCESS, write(session, "format real,32"));
    queueFloats(session, 4, {1.0f, 0.5f, -2.0f});
    std::string block = shortThenWhole(16);
    EXPECT_EQ("#212", block.substr(0, 4));
    float values[3];
    std::memcpy(values, block.data() + 4, 12);
    EXPECT_EQ(-2.0f, values[2]);

    ASSERT_EQ(0, PmxSimReportError("100000", static_cast<int32_t>(0xD0000089u)));
    ASSERT_TRUE(eventually([&] { return (statusByte(session) & 4) != 0; }));
    ASSERT_EQ(VI_SUCCESS, write(session, "SYST:ERR?"));
    EXPECT_EQ("-805306231, \"Unknown command or invalid parameter\"", shortThenWhole(50));

    // Each answer came once: nothing is left.
    EXPECT_EQ(0, statusByte(session));
    expectTimeout(session);

    // A new query gives up a kept answer.
    queueFloats(session, 6, {1.0f});
    read(session, 4, &status);
    ASSERT_EQ(VI_ERROR_USER_BUF, status);
    ASSERT_EQ(VI_SUCCESS, write(session, "SYST:ERR?"));
    EXPECT_EQ("0, \"No Error\"", read(session));
    EXPECT_EQ(VI_SUCCESS, viClose(session));
}

TEST_F(Answers, ResultsPendingTogetherStayApart)
{
    ViSession session = openShort();
    ASSERT_EQ(0, PmxSimQueueResult("100000", 6, std::vector<float>{1.0f}.data(), 1));
    queueFloats(session, 5, {2.0f, 3.0f, 4.0f});
    EXPECT_EQ("1.000000e+000,2.000000e+000,3.000000e+000,4.000000e+000", read(session));

    // Binary blocks follow each other whole; a text result beside a block gets no separator.
    ASSERT_EQ(VI_SUCCESS, write(session, "format real,32"));
    ASSERT_EQ(0, PmxSimQueueResult("100000", 4, std::vector<float>{1.0f}.data(), 1));
    ASSERT_EQ(0, PmxSimQueueResult("100000", 4, std::vector<float>{2.0f, 3.0f}.data(), 2));
    queueFloats(session, 6, {5.0f});
    std::string reply = read(session);
    ASSERT_EQ(7u + 11u + 13u, reply.size());
    EXPECT_EQ("#14", reply.substr(0, 3));
    EXPECT_EQ("#18", reply.substr(7, 3));
    EXPECT_EQ("5.000000e+000", reply.substr(18));
    EXPECT_EQ(VI_SUCCESS, viClose(session));
}

TEST_F(Answers, AResultArrivingDuringAnErrorQueryIsReadAfterIt)
{
    ViSession session = openShort();
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(session, "SYST:ERR?\r\n"));
    ASSERT_EQ(0, PmxSimQueueResult("100000", 6, std::vector<float>{7.0f}.data(), 1));
    // Events reach the session in order: once the state change is heard, so is the result.
    ASSERT_EQ(0, PmxSimSetTriggerState("100000", 1));
    waitEvent(session, VI_EVENT_SERVICE_REQ);
    EXPECT_EQ("0, \"No Error\"", read(session));
    EXPECT_EQ("7.000000e+000", read(session));
    EXPECT_EQ(VI_SUCCESS, viClose(session));
}

TEST_F(Answers, AfterAClearNothingIsPending)
{
    ViSession session = openShort();
    queueFloats(session, 6, {1.0f});
    ASSERT_EQ(VI_SUCCESS, write(session, "STAT:OPER:COND?"));
    ViStatus status = VI_SUCCESS;
    read(session, 1, &status);
    ASSERT_EQ(VI_ERROR_USER_BUF, status);
    ASSERT_EQ(VI_SUCCESS, viClear(session));
    EXPECT_EQ(0, statusByte(session));
    expectTimeout(session);
    EXPECT_EQ(VI_SUCCESS, viClose(session));
}

TEST_F(Answers, RefusedCommandsFailAtOnceUnderContention)
{
    const char* const serials[] = {"100000", "200001", "200002", "200003"};
    const std::size_t purged = logCount("Asynchronous Message detected!");
    for (int i = 1; i < 4; ++i) {
        ASSERT_EQ(0, PmxSimAttach("PMX-M01", serials[i]));
    }
    for (int ackMs : {0, 3}) {
        ASSERT_EQ(0, PmxSimSetDelays(ackMs, 1));
        std::vector<std::thread> threads;
        for (const char* serial : serials) {
            threads.emplace_back([this, serial] {
                ViSession session = open(std::string("LBPMX::3::") + serial);
                for (int i = 0; i < 25; ++i) {
                    ASSERT_EQ(VI_ERROR_NSUP_OPER, write(session, "SYST:BOGUS?\r\n")) << serial << " #" << i;
                    ASSERT_EQ(VI_SUCCESS, write(session, "*IDN?\r\n"));
                    EXPECT_EQ(std::string("Marlowe&Tenby,PMX-M01,") + serial + ",1.20", read(session));
                }
                viClose(session);
            });
        }
        for (std::thread& thread : threads) {
            thread.join();
        }
    }
    // No refused command left an answer for the next one to purge.
    EXPECT_EQ(purged, logCount("Asynchronous Message detected!"));
}

class Recovery : public Answers { };

TEST_F(Recovery, AnUnrelatedHotPlugKeepsAPendingResult)
{
    ViSession session = openShort();
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(session, VI_EVENT_USB_INTR, VI_QUEUE, VI_NULL));
    queueFloats(session, 6, {3.0f});
    ASSERT_EQ(0, PmxSimAttach("PMX-M02", "300000"));
    waitEvent(session, VI_EVENT_USB_INTR);
    ASSERT_EQ(0, PmxSimDetach("100001"));
    waitEvent(session, VI_EVENT_USB_INTR);
    EXPECT_EQ("3.000000e+000", read(session));
    EXPECT_EQ(VI_SUCCESS, viClose(session));
}

TEST_F(Recovery, AWriteThatLosesItsSensorFailsAtOnce)
{
    ViSession session = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(session, VI_ATTR_TMO_VALUE, 600000));
    ASSERT_EQ(0, PmxSimSetAutoAck(0));
    std::size_t sent = logCount("Execute PmxSendCommand(...) [*rst]");
    std::thread writer([&] { EXPECT_EQ(VI_ERROR_SYSTEM_ERROR, write(session, "*RST")); });
    ASSERT_TRUE(eventually([&] { return logCount("Execute PmxSendCommand(...) [*rst]") > sent; }));
    ASSERT_EQ(0, PmxSimDetach("100000"));
    writer.join();
    EXPECT_EQ(VI_SUCCESS, viClose(session));
}

TEST_F(Recovery, AReattachedSensorWorksBesideADeadOldSession)
{
    ViSession old = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(old, VI_EVENT_USB_INTR, VI_QUEUE, VI_NULL));
    ASSERT_EQ(0, PmxSimDetach("100000"));
    waitEvent(old, VI_EVENT_USB_INTR);
    ASSERT_EQ(0, PmxSimAttach("PMX-M01", "100000"));
    waitEvent(old, VI_EVENT_USB_INTR);

    ViSession fresh = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, write(fresh, "*IDN?"));
    EXPECT_EQ("Marlowe&Tenby,PMX-M01,100000,1.20", read(fresh));
    EXPECT_EQ(VI_ERROR_SYSTEM_ERROR, write(old, "*IDN?"));
    EXPECT_TRUE(logContains("[WARN ] CPmxSession - LbPmxVisa::CPmxSession::notifyDeviceChangedEvent - "
                            "Device has been changed for session [Id: "));
    EXPECT_EQ(VI_SUCCESS, viClose(old));
    ASSERT_EQ(VI_SUCCESS, write(fresh, "*IDN?"));
    EXPECT_EQ("Marlowe&Tenby,PMX-M01,100000,1.20", read(fresh));
    EXPECT_EQ(VI_SUCCESS, viClose(fresh));
    EXPECT_FALSE(logContains("Session-Map and the Resource-Map are inconsistent!"));
}

// Plugged back at once, the sensor is listed again before (or while) the session hears of
// the unplug; whenever the device changes arrive, a new open gets a working session.
TEST_F(Recovery, ASensorPluggedBackAtOnceIsOpenedAfresh)
{
    ViSession old = open(SENSOR);
    ASSERT_EQ(0, PmxSimDetach("100000"));
    ASSERT_EQ(0, PmxSimAttach("PMX-M01", "100000"));
    ViSession fresh = open(SENSOR);
    ASSERT_EQ(VI_SUCCESS, write(fresh, "*IDN?"));
    EXPECT_EQ("Marlowe&Tenby,PMX-M01,100000,1.20", read(fresh));
    EXPECT_EQ(VI_ERROR_SYSTEM_ERROR, write(old, "*IDN?"));
    EXPECT_EQ(VI_SUCCESS, viClose(old));
    EXPECT_EQ(VI_SUCCESS, viClose(fresh));
    EXPECT_FALSE(logContains("Session-Map and the Resource-Map are inconsistent!"));
}

} // namespace LbPassportTest
