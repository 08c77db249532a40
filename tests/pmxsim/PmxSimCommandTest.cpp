// The commands of the simulated sensors through the exported C interface: measurements, the
// identification, refused and ignored commands, the power-meter settings and the trace.
#include "tests/pmxsim/PmxSimFixture.h"

#include <cmath>

namespace {

using namespace PmxSimTesting;

TEST_F(PmxSimTest, MeasurementReportsStatesThenResultOnOneLibraryThreadInOrder)
{
    int64_t handle = open();
    ASSERT_GT(handle, int64_t(0xFFFFFFFF)) << "handles need all 64 bits";
    ASSERT_EQ(0, PmxSendCommand(handle, "*TRG", 0));
    ASSERT_TRUE(m_aRecorder.waitFor([&](const SCall& c) { return c.kind == KIND_STATE && c.value == 0; }));

    std::vector<SCall> calls = m_aRecorder.calls();
    std::vector<SCall> expected = {{KIND_ACCEPTED, handle, 1, {}},
                                   {KIND_STATE, handle, 2, {}},
                                   {KIND_STATE, handle, 3, {}},
                                   {KIND_DATA, handle, 6, {}},
                                   {KIND_STATE, handle, 0, {}}};
    EXPECT_EQ(expected, calls);
    for (const SCall& call : calls) {
        EXPECT_NE(std::this_thread::get_id(), call.thread);
        EXPECT_EQ(calls.front().thread, call.thread);
    }

    int32_t type = -1, count = -1, pending = -1;
    ASSERT_EQ(0, PmxGetData(handle, &type, &count, &pending));
    EXPECT_EQ(PMXSIM_TYPE_FLOAT, type);
    EXPECT_EQ(1, count);
    EXPECT_EQ(1, pending);
    float dbm = 0, second = 1, third = 1;
    ASSERT_EQ(0, PmxGetFloatResult(handle, &dbm, &second, &third));
    EXPECT_GT(dbm, -21.0f);
    EXPECT_LT(dbm, -19.0f);
    EXPECT_EQ(0.0f, second);
    EXPECT_EQ(0.0f, third);
    EXPECT_EQ(PMX_ERR_NO_MORE_RESULTS, PmxGetData(handle, &type, &count, &pending));
    EXPECT_EQ(0, PmxEmptyAllBuffers(handle));
}

TEST_F(PmxSimTest, IdentificationIsATextResultAfterTheAcknowledgement)
{
    int64_t handle = open("usb::0X0C6F::0154::100001");
    ASSERT_EQ(0, PmxSendCommand(handle, "*idn?\n", 0));
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.kind == KIND_DATA; }));
    std::vector<SCall> expected = {{KIND_ACCEPTED, handle, 1, {}}, {KIND_DATA, handle, 10, {}}};
    EXPECT_EQ(expected, m_aRecorder.calls());
    char text[64];
    EXPECT_EQ(PMXSIM_E_TYPE_MISMATCH, PmxGetFloatResult(handle, nullptr, nullptr, nullptr));
    EXPECT_EQ(PMXSIM_E_BUFFER_TOO_SMALL, PmxGetStringResult(handle, text, 33));
    ASSERT_EQ(0, PmxGetStringResult(handle, text, 34));
    EXPECT_STREQ("Marlowe&Tenby,PMX-M10,100001,1.20", text);
    EXPECT_EQ(PMX_ERR_NO_MORE_RESULTS, PmxGetStringResult(handle, text, sizeof text));

    int32_t timeout = -1;
    ASSERT_EQ(0, PmxSimGetLastCommand("100001", text, sizeof text, &timeout));
    EXPECT_STREQ("*idn?\n", text);
    EXPECT_EQ(0, timeout);
    ASSERT_EQ(0, PmxSendCommand(handle, "*cls", 77));
    ASSERT_EQ(0, PmxSimGetLastCommand("100001", text, sizeof text, &timeout));
    EXPECT_STREQ("*cls", text);
    EXPECT_EQ(77, timeout);
    EXPECT_EQ(PMXSIM_E_BUFFER_TOO_SMALL, PmxSimGetLastCommand("100001", text, 4, &timeout));
}

TEST_F(PmxSimTest, UnknownAndIgnoredCommandsReportErrorsBeforeTheAcknowledgement)
{
    int64_t handle = open();
    command(handle, "bogus:command");
    command(handle, "init:cont off");
    command(handle, "func sideways");
    std::vector<SCall> expected = {{KIND_ERROR, handle, PMX_ERR_UNKNOWN_COMMAND, {}},  {KIND_ACCEPTED, handle, 1, {}},
                                   {KIND_ERROR, handle, PMX_INFO_COMMAND_IGNORED, {}}, {KIND_ACCEPTED, handle, 2, {}},
                                   {KIND_ERROR, handle, PMX_ERR_UNKNOWN_COMMAND, {}},  {KIND_ACCEPTED, handle, 3, {}}};
    EXPECT_EQ(expected, m_aRecorder.calls());
    int32_t state = -1;
    EXPECT_EQ(0, PmxGetTriggerState(handle, &state));
    EXPECT_EQ(0, state);

    // A line end ends a program message: every line runs, the text is accepted once.
    m_aRecorder.clear();
    command(handle, "bogus\r\ntrac:poin 16\nfunc trace\n\n");
    expected = {{KIND_ERROR, handle, PMX_ERR_UNKNOWN_COMMAND, {}}, {KIND_ACCEPTED, handle, 4, {}}};
    EXPECT_EQ(expected, m_aRecorder.calls());
    EXPECT_EQ("16", ask(handle, "trac:poin?"));
    EXPECT_EQ("TRACE", ask(handle, "func?"));
}

TEST_F(PmxSimTest, PowerMeterSettingsAnswerTheirQueriesAndRefuseBadParameters)
{
    int64_t handle = open();
    const char* const DEFAULT_ANSWERS[][2] = {{"freq?", "1e+09"},    {"aver?", "0"},       {"sens:aver:coun?", "1"},
                                              {"corr:offs?", "0"},   {"unit:pow?", "DBM"}, {"func?", "POWER"},
                                              {"trac:poin?", "100"}, {"init:cont?", "0"},  {"*ese?", "0"},
                                              {"*opc?", "1"},        {"*tst?", "0"},       {"syst:vers?", "1999.0"}};
    for (const auto& pair : DEFAULT_ANSWERS)
        EXPECT_EQ(pair[1], ask(handle, pair[0]));
    command(handle, "SENSe:FREQuency 2.5 GHz");
    command(handle, ":sens:aver:stat on");
    command(handle, "aver:coun 16");
    command(handle, "CORR:OFFS -3.25");
    command(handle, "unit:pow w");
    command(handle, "*ese 36");
    const char* const CHANGED_ANSWERS[][2] = {{"sens:freq?", "2.5e+09"}, {"aver:stat?", "1"}, {"aver:coun?", "16"},
                                              {"corr:offs?", "-3.25"},   {"unit:pow?", "W"},  {"*ese?", "36"}};
    for (const auto& pair : CHANGED_ANSWERS)
        EXPECT_EQ(pair[1], ask(handle, pair[0]));
    command(handle, "*rst");
    EXPECT_EQ("1e+09", ask(handle, "freq?"));
    EXPECT_EQ("36", ask(handle, "*ese?")) << "*RST keeps the status enables";

    m_aRecorder.clear();
    const char* const BAD_COMMANDS[] = {"freq 5",        "freq 1 thz",   "aver:coun 0", "aver maybe",
                                        "corr:offs 101", "unit:pow dbw", "*ese 256",    "freq? 1",
                                        "read",          "*idn",         "meas:volt?",  "trac:poin 1025"};
    for (const char* bad : BAD_COMMANDS)
        command(handle, bad);
    size_t refused = 0;
    for (const SCall& c : m_aRecorder.calls())
        refused += c.kind == KIND_ERROR && c.value == PMX_ERR_UNKNOWN_COMMAND ? 1 : 0;
    EXPECT_EQ(sizeof BAD_COMMANDS / sizeof BAD_COMMANDS[0], refused);
    // A refused command sets the command-error bit; reading the register clears it.
    EXPECT_EQ("32", ask(handle, "*esr?"));
    command(handle, "*opc");
    EXPECT_EQ("1", ask(handle, "*esr?"));
    command(handle, "*cls");
    EXPECT_EQ("0", ask(handle, "*esr?"));
}

TEST_F(PmxSimTest, SettingsShapeTheMeasuredValue)
{
    int64_t handle = open();
    EXPECT_NEAR(-20.0f, measure(handle), 0.06f);
    EXPECT_NEAR(-20.0f, measure(handle, "read?"), 0.06f);
    command(handle, "corr:offs 10");
    EXPECT_NEAR(-10.0f, measure(handle), 0.06f);
    command(handle, "freq 11e9");
    EXPECT_NEAR(-12.0f, measure(handle), 0.06f) << "-0.2 dB per GHz above 1 GHz";
    command(handle, "unit:pow w");
    EXPECT_NEAR(1e-4 * std::pow(10.0, -0.2), measure(handle), 1e-6);
    command(handle, "*rst");
    command(handle, "aver:coun 1024");
    command(handle, "aver on");
    for (int i = 0; i < 5; ++i)
        EXPECT_NEAR(-20.0f, measure(handle), 0.002f) << "averaging lowers the noise";
    // MEAS? measures power also when the function is the trace; READ? follows the function.
    command(handle, "func trace");
    EXPECT_NEAR(-20.0f, measure(handle, "meas:pow?"), 0.01f);
    awaitResult(handle, "read?");
    int32_t type = -1;
    ASSERT_EQ(0, PmxGetData(handle, &type, nullptr, nullptr));
    EXPECT_EQ(PMXSIM_TYPE_FLOAT_ARRAY, type);
}

TEST_F(PmxSimTest, TraceFunctionAndContinuousMeasurement)
{
    int64_t handle = open();
    command(handle, ":FUNCtion \"TRACe\"");
    command(handle, "trac:poin 8");
    command(handle, "INITiate:CONTinuous ON");
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.kind == KIND_DATA; }, 3));
    // A second start while running is ignored with the benign notice.
    command(handle, "init");
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.value == PMX_INFO_COMMAND_IGNORED; }));
    command(handle, "init:cont 0");
    ASSERT_TRUE(m_aRecorder.waitFor(
        [&](const SCall& c) { return c.kind == KIND_STATE && c.value == 0 && c.handle == handle; }));

    int32_t type = -1, count = -1, pending = -1;
    ASSERT_EQ(0, PmxGetData(handle, &type, &count, &pending));
    EXPECT_EQ(PMXSIM_TYPE_FLOAT_ARRAY, type);
    EXPECT_EQ(8, count);
    EXPECT_GE(pending, 3);
    float trace[8];
    int32_t got = 0;
    EXPECT_EQ(PMXSIM_E_BUFFER_TOO_SMALL, PmxGetFloatArray(handle, trace, 7, &got));
    ASSERT_EQ(0, PmxGetFloatArray(handle, trace, 8, &got));
    ASSERT_EQ(8, got);
    EXPECT_LT(trace[0], -50.0f);
    EXPECT_GT(trace[4], -25.0f);
    EXPECT_EQ(0, PmxEmptyAllBuffers(handle));
    EXPECT_EQ(PMX_ERR_NO_MORE_RESULTS, PmxGetData(handle, &type, &count, &pending));
}

} // namespace
