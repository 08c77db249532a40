// The simulated sensor-control library through its exported C interface, as a client sees it:
// results of every type, callbacks, injected failures, detaching, opening, texts, the device
// list, re-entrant and concurrent use.
#include "tests/pmxsim/PmxSimFixture.h"

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <future>

namespace {

using namespace PmxSimTesting;

TEST_F(PmxSimTest, EveryDataTypeIsDeliveredWithTheQueuedValues)
{
    int64_t handle = open();
    const uint8_t bytes[] = {0, 1, 2, 255};
    const int32_t ints[] = {-7, 8, 1 << 30, 99};
    const float floats[] = {1.5f, -2.25f, 3.0f, 4.0f};
    for (int32_t type = PMXSIM_TYPE_BINARY; type <= PMXSIM_TYPE_LAST; ++type) {
        SCOPED_TRACE(type);
        bool isBytes = type == PMXSIM_TYPE_BINARY || type == PMXSIM_TYPE_TEXT;
        bool isInts = (type >= PMXSIM_TYPE_BITFIELD1 && type <= PMXSIM_TYPE_BITFIELD3) ||
            type == PMXSIM_TYPE_LONG_TRIPLE || type == PMXSIM_TYPE_LONG;
        const void* values = isBytes ? static_cast<const void*>(bytes)
            : isInts                 ? static_cast<const void*>(ints)
                                     : static_cast<const void*>(floats);
        int32_t queued = type == PMXSIM_TYPE_TEXT ? 3 : 4;
        if (type == PMXSIM_TYPE_TEXT)
            values = "abc";
        ASSERT_EQ(0, PmxSimQueueResult("100000", type, values, queued));
        ASSERT_TRUE(m_aRecorder.waitFor([&](const SCall& c) { return c.kind == KIND_DATA && c.value == type; }));

        int32_t reported = -1, count = -1, pending = -1;
        ASSERT_EQ(0, PmxGetData(handle, &reported, &count, &pending));
        EXPECT_EQ(type, reported);
        EXPECT_EQ(queued, count);
        EXPECT_EQ(1, pending);
        if (type == PMXSIM_TYPE_BINARY) {
            uint8_t got[8];
            int32_t n = 0;
            ASSERT_EQ(0, PmxGetBinaryResult(handle, got, sizeof got, &n));
            ASSERT_EQ(4, n);
            EXPECT_EQ(0, std::memcmp(bytes, got, 4));
        } else if (type == PMXSIM_TYPE_TEXT) {
            char got[8];
            ASSERT_EQ(0, PmxGetStringResult(handle, got, sizeof got));
            EXPECT_STREQ("abc", got);
        } else if (isInts) {
            int32_t a = 0, b = 0, c = 0;
            auto getter = type <= PMXSIM_TYPE_BITFIELD3 ? PmxGetBitfieldResult : PmxGetLongResult;
            auto other = type <= PMXSIM_TYPE_BITFIELD3 ? PmxGetLongResult : PmxGetBitfieldResult;
            EXPECT_EQ(PMXSIM_E_TYPE_MISMATCH, other(handle, &a, &b, &c));
            ASSERT_EQ(0, getter(handle, &a, &b, &c));
            EXPECT_EQ(-7, a);
            EXPECT_EQ(8, b);
            EXPECT_EQ(1 << 30, c);
        } else if (type == PMXSIM_TYPE_FLOAT_ARRAY || type == PMXSIM_TYPE_AUX_FLOAT_ARRAY) {
            float a1[4] = {}, a2[4] = {9, 9, 9, 9}, a3[4] = {9, 9, 9, 9};
            int32_t n = 0;
            if (type == PMXSIM_TYPE_FLOAT_ARRAY) {
                EXPECT_EQ(PMXSIM_E_TYPE_MISMATCH, PmxGetAuxFloatArray(handle, a1, a2, a3, 4, &n));
                ASSERT_EQ(0, PmxGetFloatArray(handle, a1, 4, &n));
            } else {
                EXPECT_EQ(PMXSIM_E_TYPE_MISMATCH, PmxGetFloatArray(handle, a1, 4, &n));
                ASSERT_EQ(0, PmxGetAuxFloatArray(handle, a1, a2, a3, 4, &n));
                EXPECT_EQ(0.0f, a2[3]);
                EXPECT_EQ(0.0f, a3[0]);
            }
            ASSERT_EQ(4, n);
            EXPECT_EQ(0, std::memcmp(floats, a1, sizeof a1));
        } else {
            float a = 0, b = 0, c = 0;
            ASSERT_EQ(0, PmxGetFloatResult(handle, &a, &b, &c));
            EXPECT_EQ(1.5f, a);
            EXPECT_EQ(-2.25f, b);
            EXPECT_EQ(3.0f, c);
        }
        EXPECT_EQ(PMX_ERR_NO_MORE_RESULTS, PmxGetData(handle, &reported, &count, &pending));
    }
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxSimQueueResult("100000", 12, floats, 1));
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxSimQueueResult("100000", 6, nullptr, 1));
    EXPECT_EQ(PMXSIM_E_SENSOR_NOT_OPEN, PmxSimQueueResult("100001", 6, floats, 1));
}

TEST_F(PmxSimTest, NullCallbackStopsThatCallbackOnly)
{
    int64_t handle = open();
    ASSERT_EQ(0, PmxSetNotifyCallbackCommandAccepted(nullptr, nullptr));
    ASSERT_EQ(0, PmxSendCommand(handle, "*idn?", 0));
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.kind == KIND_DATA; }));
    std::vector<SCall> expected = {{KIND_DATA, handle, 10, {}}};
    EXPECT_EQ(expected, m_aRecorder.calls());
}

TEST_F(PmxSimTest, ControlFunctionsFireTheirCallbacks)
{
    int64_t handle = open();
    ASSERT_EQ(0, PmxSimSetTriggerState("100000", 3));
    ASSERT_EQ(0, PmxSimReportError("100000", 0x1234));
    ASSERT_EQ(0, PmxSimReportError("", PMX_INFO_COMMAND_IGNORED));
    ASSERT_EQ(0, PmxSimAttach("PMX-M33", "200"));
    ASSERT_EQ(0, PmxSimSetDeviceFlag("200", 0));
    ASSERT_TRUE(m_aRecorder.waitCount(5));
    std::vector<SCall> expected = {{KIND_STATE, handle, 3, {}},
                                   {KIND_ERROR, handle, 0x1234, {}},
                                   {KIND_ERROR, 0, PMX_INFO_COMMAND_IGNORED, {}},
                                   {KIND_DEVICE, 0, 0, {}},
                                   {KIND_DEVICE, 0, 0, {}}};
    EXPECT_EQ(expected, m_aRecorder.calls());
    int32_t state = 0;
    ASSERT_EQ(0, PmxGetTriggerState(handle, &state));
    EXPECT_EQ(3, state);

    int32_t count = 0, flag = -1;
    char name[256], type[256], serial[256];
    ASSERT_EQ(0, PmxGetDeviceListLength(&count));
    ASSERT_EQ(3, count);
    ASSERT_EQ(0, PmxGetDeviceInfo(0, name, type, serial, &flag));
    EXPECT_STREQ("USB::0x0c6f::0003::100000", name);
    EXPECT_STREQ("PMX-M01", type);
    EXPECT_STREQ("100000", serial);
    EXPECT_EQ(1, flag);
    ASSERT_EQ(0, PmxGetDeviceInfo(2, name, type, serial, &flag));
    EXPECT_STREQ("PMX-M33", type);
    EXPECT_STREQ("200", serial);
    EXPECT_EQ(0, flag);
    EXPECT_EQ(PMXSIM_E_INDEX_OUT_OF_RANGE, PmxGetDeviceInfo(3, name, type, serial, &flag));
    EXPECT_EQ(PMXSIM_E_ALREADY_ATTACHED, PmxSimAttach("PMX-M01", "200"));
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxSimAttach("PMX-M01", "a:b"));
}

TEST_F(PmxSimTest, FailureInjectionReachesTheNamedFunctionOnce)
{
    int64_t handle = open();
    ASSERT_EQ(0, PmxSimQueueResult("100000", 9, nullptr, 0));
    ASSERT_EQ(0, PmxSimFailNext("PmxGetData", 0x7777));
    int32_t type = -1;
    EXPECT_EQ(0x7777, PmxGetData(handle, &type, nullptr, nullptr));
    EXPECT_EQ(-1, type);
    EXPECT_EQ(0, PmxGetData(handle, &type, nullptr, nullptr));
    EXPECT_EQ(9, type);

    ASSERT_EQ(0, PmxSimFailNext("PmxCloseDriver", -5));
    EXPECT_EQ(-5, PmxCloseDriver());
    int32_t count = 0;
    EXPECT_EQ(0, PmxGetDeviceListLength(&count)) << "a failed close leaves the driver open";
    ASSERT_EQ(0, PmxSimFailNext("PmxSetNotifyCallbackCommandAccepted", 42));
    EXPECT_EQ(42, PmxSetNotifyCallbackCommandAccepted(nullptr, nullptr));
    command(handle, "*cls"); // the registration failed, so the acknowledgement still arrives

    ASSERT_EQ(0, PmxSimFailNext("PmxOpenSensor", 1));
    ASSERT_EQ(0, PmxSimFailNext("PmxOpenSensor", 0)); // cancelled
    int64_t second = 0;
    EXPECT_EQ(0, PmxOpenSensor("USB::0x0c6f::0154::100001", &second));
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxSimFailNext("PmxNoSuchFunction", 1));
}

TEST_F(PmxSimTest, DetachMidSessionFailsLaterCallsCleanly)
{
    int64_t handle = open();
    ASSERT_EQ(0, PmxSimQueueResult("100000", 6, nullptr, 0));
    ASSERT_EQ(0, PmxSimDetach("100000"));
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.kind == KIND_DEVICE; }));
    int32_t value = 0;
    float f = 0;
    EXPECT_EQ(PMXSIM_E_SENSOR_DETACHED, PmxSendCommand(handle, "*trg", 0));
    EXPECT_EQ(PMXSIM_E_SENSOR_DETACHED, PmxGetData(handle, &value, &value, &value));
    EXPECT_EQ(PMXSIM_E_SENSOR_DETACHED, PmxGetFloatResult(handle, &f, &f, &f));
    EXPECT_EQ(PMXSIM_E_SENSOR_DETACHED, PmxGetTriggerState(handle, &value));
    EXPECT_EQ(PMXSIM_E_NO_SUCH_SENSOR, PmxSimQueueResult("100000", 6, nullptr, 0));
    ASSERT_EQ(0, PmxGetDeviceListLength(&value));
    EXPECT_EQ(1, value);
    EXPECT_EQ(0, PmxCloseSensor(handle));
    EXPECT_EQ(PMXSIM_E_INVALID_HANDLE, PmxCloseSensor(handle));

    // Attached again, it opens under a new handle.
    ASSERT_EQ(0, PmxSimAttach("PMX-M01", "100000"));
    int64_t again = open();
    EXPECT_NE(handle, again);
    command(again, "*rst");
}

TEST_F(PmxSimTest, OpeningChecksDescriptorDriverAndUse)
{
    int64_t handle = 0;
    EXPECT_EQ(PMXSIM_E_BAD_DESCRIPTOR, PmxOpenSensor("USB::0x0c6f::3::100000", &handle));
    EXPECT_EQ(PMXSIM_E_BAD_DESCRIPTOR, PmxOpenSensor("USB::0x0c70::0003::100000", &handle));
    EXPECT_EQ(PMXSIM_E_BAD_DESCRIPTOR, PmxOpenSensor("USB::0x0c6f::0003::", &handle));
    EXPECT_EQ(PMXSIM_E_BAD_DESCRIPTOR, PmxOpenSensor("USB::0x0c6f::00a3::100000", &handle));
    EXPECT_EQ(PMXSIM_E_BAD_DESCRIPTOR, PmxOpenSensor("USB::0x0c6f::0003::100000::INSTR", &handle));
    EXPECT_EQ(PMXSIM_E_BAD_DESCRIPTOR, PmxOpenSensor("", &handle));
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxOpenSensor(nullptr, &handle));
    EXPECT_EQ(PMXSIM_E_NO_SUCH_SENSOR, PmxOpenSensor("USB::0x0c6f::0154::100000", &handle));
    EXPECT_EQ(PMXSIM_E_NO_SUCH_SENSOR, PmxOpenSensor("USB::0x0c6f::0003::999", &handle));
    EXPECT_EQ(0, handle);
    handle = open();
    int64_t second = 0;
    EXPECT_EQ(PMXSIM_E_SENSOR_IN_USE, PmxOpenSensor("USB::0x0c6f::0003::100000", &second));
    EXPECT_EQ(PMXSIM_E_INVALID_HANDLE, PmxSendCommand(handle + 1, "*trg", 0));

    ASSERT_EQ(0, PmxCloseDriver());
    EXPECT_EQ(PMXSIM_E_DRIVER_NOT_OPEN, PmxCloseDriver());
    EXPECT_EQ(PMXSIM_E_DRIVER_NOT_OPEN, PmxSendCommand(handle, "*trg", 0));
    int32_t count = 0;
    EXPECT_EQ(PMXSIM_E_DRIVER_NOT_OPEN, PmxGetDeviceListLength(&count));
    ASSERT_EQ(0, PmxOpenDriver());
    EXPECT_EQ(PMXSIM_E_INVALID_HANDLE, PmxSendCommand(handle, "*trg", 0)) << "closing the driver closes its sensors";
}

TEST_F(PmxSimTest, EveryCodeHasItsText)
{
    EXPECT_EQ("No further result available", errorText(PMX_ERR_NO_MORE_RESULTS));
    EXPECT_EQ("Unknown command or invalid parameter", errorText(PMX_ERR_UNKNOWN_COMMAND));
    EXPECT_EQ("Sensor has been detached", errorText(PMXSIM_E_SENSOR_DETACHED));
    EXPECT_EQ("Unknown error code 0x00001234", errorText(0x1234));
    const int32_t codes[] = {PMX_SUCCESS,
                             PMX_INFO_COMMAND_IGNORED,
                             PMXSIM_E_DRIVER_NOT_OPEN,
                             PMXSIM_E_INVALID_ARGUMENT,
                             PMXSIM_E_INVALID_HANDLE,
                             PMXSIM_E_BAD_DESCRIPTOR,
                             PMXSIM_E_NO_SUCH_SENSOR,
                             PMXSIM_E_SENSOR_IN_USE,
                             PMXSIM_E_INDEX_OUT_OF_RANGE,
                             PMXSIM_E_TYPE_MISMATCH,
                             PMXSIM_E_BUFFER_TOO_SMALL,
                             PMXSIM_E_SENSOR_NOT_OPEN,
                             PMXSIM_E_ALREADY_ATTACHED,
                             PMXSIM_E_OUT_OF_RESOURCES};
    for (int32_t code : codes)
        EXPECT_EQ(std::string::npos, errorText(code).find("Unknown error")) << std::hex << code;
    char small[5];
    ASSERT_EQ(0, PmxGetErrorText(PMXSIM_E_DRIVER_NOT_OPEN, small, sizeof small));
    EXPECT_STREQ("Driv", small);
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxGetErrorText(0, small, 0));
    ASSERT_EQ(0, PmxCloseDriver());
    EXPECT_EQ("Driver not open", errorText(PMXSIM_E_DRIVER_NOT_OPEN)) << "texts need no open driver";
}

TEST_F(PmxSimTest, AcknowledgementsFollowDelayAndSwitch)
{
    int64_t handle = open();
    ASSERT_EQ(0, PmxSimSetDelays(100, 0));
    auto start = std::chrono::steady_clock::now();
    command(handle, "*cls");
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(100));

    ASSERT_EQ(0, PmxSimSetDelays(0, 0));
    ASSERT_EQ(0, PmxSimSetAutoAck(0));
    ASSERT_EQ(0, PmxSendCommand(handle, "*cls", 0));
    ASSERT_EQ(0, PmxSendCommand(handle, "bogus", 0));
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.kind == KIND_ERROR; }));
    size_t accepted = 0;
    for (const SCall& c : m_aRecorder.calls())
        accepted += c.kind == KIND_ACCEPTED;
    EXPECT_EQ(1u, accepted) << "only the first command was acknowledged";
    EXPECT_EQ(PMXSIM_E_INVALID_ARGUMENT, PmxSimSetDelays(-1, 0));
}

TEST_F(PmxSimTest, DeviceListComesFromTheEnvironment)
{
    int32_t count = 0;
    char name[256], type[256], serial[256];
    int32_t flag = 0;
    ASSERT_EQ(0, PmxGetDeviceListLength(&count));
    ASSERT_EQ(2, count);
    ASSERT_EQ(0, PmxGetDeviceInfo(1, name, type, serial, &flag));
    EXPECT_STREQ("USB::0x0c6f::0154::100001", name);
    EXPECT_STREQ("PMX-M10", type);

    auto setList = [](const char* list) {
#ifdef _WIN32
        std::string assignment = std::string("PMXSIM_DEVICES=") + list;
        _putenv(assignment.c_str());
#else
        setenv("PMXSIM_DEVICES", list, 1);
#endif
    };
    setList(" PMX-M05:42:0 , BOGUS:7,broken,PMX:42");
    testing::internal::CaptureStderr();
    ASSERT_EQ(0, PmxSimReset());
    EXPECT_EQ("pmxsim: PMXSIM_DEVICES: entry \"broken\" skipped: not type:serial[:flag]\n"
              "pmxsim: PMXSIM_DEVICES: entry \"PMX:42\" skipped: serial number already attached\n",
              testing::internal::GetCapturedStderr());
    ASSERT_EQ(0, PmxOpenDriver());
    ASSERT_EQ(0, PmxGetDeviceListLength(&count));
    ASSERT_EQ(2, count) << "malformed and duplicate entries are skipped";
    ASSERT_EQ(0, PmxGetDeviceInfo(0, name, type, serial, &flag));
    EXPECT_STREQ("PMX-M05", type);
    EXPECT_STREQ("42", serial);
    EXPECT_EQ(0, flag);
    ASSERT_EQ(0, PmxGetDeviceInfo(1, name, type, serial, &flag));
    EXPECT_STREQ("BOGUS 7", name);
    int64_t handle = 0;
    EXPECT_EQ(PMXSIM_E_NO_SUCH_SENSOR, PmxOpenSensor("USB::0x0c6f::0000::7", &handle));

    std::vector<const char*> empty = {"None"};
#ifndef _WIN32
    empty.push_back(""); // Windows deletes a variable set to nothing
#endif
    for (const char* list : empty) {
        setList(list);
        ASSERT_EQ(0, PmxSimReset());
        ASSERT_EQ(0, PmxOpenDriver());
        ASSERT_EQ(0, PmxGetDeviceListLength(&count));
        EXPECT_EQ(0, count) << list;
    }
#ifdef _WIN32
    _putenv("PMXSIM_DEVICES=");
#else
    unsetenv("PMXSIM_DEVICES");
#endif
}

TEST_F(PmxSimTest, CallbacksMayCallBackIntoTheLibraryAndCloseIt)
{
    int64_t handle = open();
    std::promise<std::pair<int32_t, int32_t>> results; // fetch, close
    CRecorder hooked;
    hooked.m_fnHook = [&](EKind kind, int64_t h, int32_t) {
        if (kind == KIND_DATA) {
            float value = 0;
            int32_t fetched = PmxGetFloatResult(h, &value, nullptr, nullptr);
            PmxSetNotifyCallbackDataAvailable(nullptr, nullptr);
            results.set_value(std::make_pair(fetched, PmxCloseDriver()));
        }
    };
    registerAll(&hooked);
    ASSERT_EQ(0, PmxSendCommand(handle, "init:imm", 0));
    std::future<std::pair<int32_t, int32_t>> done = results.get_future();
    ASSERT_EQ(std::future_status::ready, done.wait_for(DEADLINE));
    EXPECT_EQ(std::make_pair(0, 0), done.get());
    // Replacing the callbacks waits until the hooked one has returned.
    registerAll(&m_aRecorder);
    int32_t count = 0;
    EXPECT_EQ(PMXSIM_E_DRIVER_NOT_OPEN, PmxGetDeviceListLength(&count));
    ASSERT_EQ(0, PmxOpenDriver());
    EXPECT_EQ(0, PmxGetDeviceListLength(&count));
}

TEST_F(PmxSimTest, ConcurrentUseFromSeveralThreads)
{
    const int ROUNDS = 30;
    int64_t a = open();
    int64_t b = open("USB::0x0c6f::0154::100001");
    ASSERT_EQ(0, PmxSimSetDelays(0, 1));
    std::atomic<int> failures(0);
    auto measure = [&](int64_t handle) {
        for (int i = 0; i < ROUNDS; ++i) {
            if (PmxSendCommand(handle, i % 2 ? "*trg" : "*idn?", 0) != 0)
                ++failures;
            int32_t type = 0;
            while (PmxGetData(handle, &type, nullptr, nullptr) == 0) {
                float f[3];
                char text[128];
                int32_t rc = type == PMXSIM_TYPE_FLOAT ? PmxGetFloatResult(handle, &f[0], &f[1], &f[2])
                                                       : PmxGetStringResult(handle, text, sizeof text);
                if (rc != 0 && rc != PMX_ERR_NO_MORE_RESULTS)
                    ++failures;
            }
        }
    };
    auto churn = [&] {
        CRecorder other;
        for (int i = 0; i < ROUNDS; ++i) {
            if (PmxSimAttach("PMX-M02", "777") != 0 || PmxSimDetach("777") != 0)
                ++failures;
            PmxSetNotifyCallbackErrorOccurred(i % 2 ? onError : nullptr, &other);
            int32_t count = 0, flag = 0;
            char name[256], type[256], serial[256];
            if (PmxGetDeviceListLength(&count) != 0)
                ++failures;
            for (int32_t n = 0; n < count; ++n)
                PmxGetDeviceInfo(n, name, type, serial, &flag);
            PmxSetNotifyCallbackErrorOccurred(onError, &m_aRecorder);
        }
    };
    std::thread t1(measure, a), t2(measure, b), t3(churn);
    t1.join();
    t2.join();
    t3.join();
    EXPECT_EQ(0, failures.load());
    // Every command of both sensors is acknowledged exactly once, in order per sensor.
    ASSERT_TRUE(m_aRecorder.waitFor(isAccepted, 2 * ROUNDS));
    int32_t lastA = 0, lastB = 0;
    for (const SCall& c : m_aRecorder.calls()) {
        if (c.kind != KIND_ACCEPTED)
            continue;
        int32_t& last = c.handle == a ? lastA : lastB;
        EXPECT_EQ(last + 1, c.value);
        last = c.value;
    }
    EXPECT_EQ(ROUNDS, lastA);
    EXPECT_EQ(ROUNDS, lastB);
}

} // namespace
