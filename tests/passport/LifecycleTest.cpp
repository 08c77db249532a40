// Library faults at driver and sensor open and close, discovery with an unreadable sensor, failed
// opens, and processes that end with sessions open, through the VISA C API and PmxSim.
#include "tests/Waiting.h"
#include "tests/passport/PassportFixture.h"

#include <atomic>

#if !defined(_WIN32)
#include <dlfcn.h>

// The passport reaches the runtime's services by name here, so the test program, which exports
// its symbols, stands in front of two of them to make them fail once on demand.
namespace {
std::atomic<int> s_nFailRecord(0);
std::atomic<ViStatus> s_nFailInstall(VI_SUCCESS);

template <class F> F nextService(const char* name)
{
    return reinterpret_cast<F>(dlsym(RTLD_NEXT, name));
}
} // namespace

extern "C" __attribute__((visibility("default"))) ViAddr* viSvc57(ViSession vi)
{
    static auto s_pfNext = nextService<ViAddr* (*)(ViSession)>("viSvc57");
    return s_nFailRecord.exchange(0) != 0 ? nullptr : s_pfNext(vi);
}

extern "C" __attribute__((visibility("default"))) ViStatus viSvc56(ViSession vi, ViAddr table, ViUInt32 reserved,
                                                                   ViSession target, ViUInt32 reserved2)
{
    static auto s_pfNext = nextService<ViStatus (*)(ViSession, ViAddr, ViUInt32, ViSession, ViUInt32)>("viSvc56");
    ViStatus status = s_nFailInstall.exchange(VI_SUCCESS);
    return status != VI_SUCCESS ? status : s_pfNext(vi, table, reserved, target, reserved2);
}
#endif

namespace LbPassportTest {

namespace {
const char* const FIRST_RESOURCE = "LBPMX::0x0003::100000::INSTR";
const char* const SECOND_RESOURCE = "LBPMX::0x009a::100001::INSTR";
const std::int32_t SENSOR_FAULT = static_cast<std::int32_t>(0xD0000042u);

bool driverOpen()
{
    std::int32_t count = 0;
    return PmxGetDeviceListLength(&count) != PMXSIM_E_DRIVER_NOT_OPEN;
}
} // namespace

class Lifecycle : public CPassportTest {
protected:
    // The session hears its sensor: the identification query needs the acknowledgement and the
    // result, both of which arrive through the library's callbacks.
    static void expectWorking(ViSession session)
    {
        ASSERT_EQ(VI_SUCCESS, write(session, "*IDN?"));
        EXPECT_EQ(0u, read(session).find("Marlowe&Tenby,"));
    }
};

TEST_F(Lifecycle, FindSkipsASensorWhoseInformationCannotBeRead)
{
    ASSERT_EQ(0, PmxSimFailNext("PmxGetDeviceInfo", PMXSIM_E_SENSOR_DETACHED));
    ViFindList list = VI_NULL;
    ViUInt32 count = 0;
    ViChar name[VI_FIND_BUFLEN] = {0};
    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "?*::INSTR", &list, &count, name));
    EXPECT_EQ(1u, count);
    EXPECT_STREQ(SECOND_RESOURCE, name);
    viClose(list);
    EXPECT_TRUE(logContains("[WARN ] CPmxSessionDispatcher - LbPmxVisa::CPmxSessionDispatcher::getAvailableDevices - "
                            "Skipping device 0, its information could not be read: Sensor has been detached"));
}

// Each fault leaves the next session working (it hears its sensor).
TEST_F(Lifecycle, LibraryFaultsAtDriverAndSensorOpenAndCloseRecover)
{
    // Without a callback the session would never hear anything: the open fails.
    ViSession session = VI_NULL;
    for (const char* registration : {"PmxSetNotifyCallbackCommandAccepted", "PmxSetNotifyCallbackDataAvailable"}) {
        ASSERT_EQ(0, PmxSimFailNext(registration, SENSOR_FAULT));
        EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viOpen(m_nRm, FIRST_RESOURCE, VI_NULL, 0, &session));
        EXPECT_FALSE(driverOpen());
    }

    // A driver that would not close, at the last close or at the end of a discovery.
    session = open(FIRST_RESOURCE);
    ASSERT_EQ(0, PmxSimFailNext("PmxCloseDriver", SENSOR_FAULT));
    viClose(session);
    session = open(FIRST_RESOURCE);
    expectWorking(session);
    viClose(session);
    ViFindList list = VI_NULL;
    ViUInt32 count = 0;
    ViChar name[VI_FIND_BUFLEN] = {0};
    ASSERT_EQ(0, PmxSimFailNext("PmxCloseDriver", SENSOR_FAULT));
    viFindRsrc(m_nRm, "?*::INSTR", &list, &count, name);
    viClose(list);
    session = open(FIRST_RESOURCE);
    expectWorking(session);

    // A sensor that would not close while another one keeps the driver open.
    ViSession second = open(SECOND_RESOURCE);
    ASSERT_EQ(0, PmxSimFailNext("PmxCloseSensor", SENSOR_FAULT));
    viClose(session);
    session = open(FIRST_RESOURCE);
    expectWorking(session);
    viClose(session);
    viClose(second);
    EXPECT_FALSE(driverOpen());
}

#if !defined(_WIN32)
TEST_F(Lifecycle, AFailedOpenLeavesNoSensorSessionBehind)
{
    ViSession session = VI_NULL;
    s_nFailInstall = VI_ERROR_INV_SETUP;
    EXPECT_EQ(VI_ERROR_INV_SETUP, viOpen(m_nRm, FIRST_RESOURCE, VI_NULL, 0, &session));
    EXPECT_FALSE(driverOpen()) << "the new sensor session was released and the driver closed";

    // Without its record the session could never be closed: the open fails before anything opens.
    s_nFailRecord = 1;
    EXPECT_EQ(VI_ERROR_SYSTEM_ERROR, viOpen(m_nRm, FIRST_RESOURCE, VI_NULL, 0, &session));
    EXPECT_FALSE(driverOpen());
    EXPECT_TRUE(logContains(
        "[ERROR] CLbPmxInstrSesn - LbPmxPassport::CLbPmxInstrSesn::viOpen - No session record for session "));
}
#endif

// A process that ends (or unloads the VISA library and ends) with sessions open and results
// arriving: no thread of the passport may run on into its destroyed objects, and nothing hangs.
// Sanitizer builds turn any report into a failing exit code.
TEST_F(Lifecycle, ProcessesEndCleanlyWithSessionsOpen)
{
#if defined(_WIN32)
    const int runs = 10;
    const std::string probe = "passport_exit_probe.exe ";
#else
    const int runs = 30;
    const std::string probe = "./passport_exit_probe ";
#endif
    std::string log = temporaryPath("lbpmx-exit");
    setConfiguration("LOG_LEVEL", "DEBUG");
    setConfiguration("LOG_FILE", log.c_str());
    for (const char* mode : {"exit", "atexit", "unload", "reading"}) {
        for (int run = 0; run < runs; ++run) {
            ASSERT_EQ(0, std::system((probe + mode).c_str())) << mode << " run " << run;
        }
    }
    setConfiguration("LOG_LEVEL", nullptr);
    setConfiguration("LOG_FILE", nullptr);
    // The detach closed the sessions before it detached the adapter.
    EXPECT_EQ(std::string::npos,
              readFile(log).find("Commands interface will be detached, when still some sessions are open. "));
    EXPECT_NE(std::string::npos, readFile(log).find("Session closed successfully"));
    std::remove(log.c_str());
}

// A read waits on the sensor session that the VISA session holds. Closing another VISA session
// on the sensor leaves that read alone; closing the reader's own session ends the read, and the
// sensor session goes only once the read has left it.
TEST_F(Lifecycle, ClosingASessionEndsItsOwnWaitingReadOnly)
{
    ViSession reader = open(FIRST_RESOURCE);
    ViSession other = open(FIRST_RESOURCE);
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(reader, VI_ATTR_TMO_VALUE, 60000));
    auto readInThread = [&](ViStatus* status, std::string* answer, std::atomic<long>* id) {
        return std::thread([=] {
            *id = LbTests::currentThreadId();
            *answer = read(reader, 1024, status);
        });
    };
    ViStatus status = VI_SUCCESS;
    std::string answer;
    std::atomic<long> id(-1);
    std::thread first = readInThread(&status, &answer, &id);
    ASSERT_TRUE(eventually([&] { return id != -1; }));
    ASSERT_TRUE(LbTests::waitUntilSleeping(id));
    EXPECT_EQ(VI_SUCCESS, viClose(other));
    const float value = 2.5f;
    ASSERT_EQ(0, PmxSimQueueResult("100000", 6, &value, 1));
    first.join();
    EXPECT_EQ(VI_SUCCESS, status);
    EXPECT_EQ("2.500000e+000", answer);

    id = -1;
    std::thread second = readInThread(&status, &answer, &id);
    ASSERT_TRUE(eventually([&] { return id != -1; }));
    ASSERT_TRUE(LbTests::waitUntilSleeping(id));
    EXPECT_EQ(VI_SUCCESS, viClose(reader));
    second.join();
    EXPECT_EQ(VI_ERROR_INV_OBJECT, status);
    ViSession again = open(FIRST_RESOURCE);
    expectWorking(again);
    EXPECT_EQ(VI_SUCCESS, viClose(again));
}

} // namespace LbPassportTest
