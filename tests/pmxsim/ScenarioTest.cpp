// Scenario files through PMXSIM_CONFIG and PmxSimReset: what a good file configures, that a
// malformed one leaves no sensor and one line on stderr, and that a reload replaces the scenario.
#include "tests/pmxsim/PmxSimFixture.h"

#include <gmock/gmock.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>

namespace {

using namespace PmxSimTesting;

void setConfig(const char* path)
{
#ifdef _WIN32
    _putenv((std::string("PMXSIM_CONFIG=") + path).c_str());
#else
    if (*path == '\0')
        unsetenv("PMXSIM_CONFIG");
    else
        setenv("PMXSIM_CONFIG", path, 1);
#endif
}

class ScenarioTest : public PmxSimTest {
protected:
    void TearDown() override
    {
        setConfig("");
        PmxSimTest::TearDown();
    }
    // Writes the scenario, loads it with the driver open again; answers what went to stderr.
    std::string load(const std::string& text)
    {
        std::string path = testing::TempDir() + "pmxsim_scenario.yaml";
        std::ofstream(path, std::ios::binary) << text;
        std::string complaint = loadFrom(path);
        std::remove(path.c_str());
        return complaint;
    }
    std::string loadFrom(const std::string& path)
    {
        setConfig(path.c_str());
        testing::internal::CaptureStderr();
        EXPECT_EQ(0, PmxSimReset());
        std::string complaint = testing::internal::GetCapturedStderr();
        EXPECT_EQ(0, PmxSimSetDelays(0, 0));
        registerAll(&m_aRecorder);
        EXPECT_EQ(0, PmxOpenDriver());
        return complaint;
    }
    int32_t sensors()
    {
        int32_t count = -1;
        EXPECT_EQ(0, PmxGetDeviceListLength(&count));
        return count;
    }
    std::vector<float> readings(int64_t handle, int n)
    {
        std::vector<float> values;
        for (int i = 0; i < n; ++i)
            values.push_back(measure(handle));
        return values;
    }
};

#ifdef PMXSIM_HAVE_YAML

const char* const SCENARIO_TEXT = R"(
sensors:
  - {type: PMX-M01, serial: "100000", power: [-10, -11.5]}
  - type: PMX-M02
    serial: ab7
    flag: 0
    power: {level: -30, noise: 0.5, seed: 9}
    trace:
      pulse: {duration: 8, delay: 2, rise: 2, width: 4, fall: 0, low: -50, high: -10}
    answers:
      - {pattern: "cal*?", answer: "CALIBRATED"}
      - {pattern: "diag", error: 0x12345}
    detach_after: 2
faults:
  - {function: PmxGetTriggerState, call: 2, code: -7}
)";

TEST_F(ScenarioTest, FileDescribesSensorsMeasurementsAnswersAndFaults)
{
    ASSERT_EQ("", load(SCENARIO_TEXT));
    ASSERT_EQ(2, sensors());
    char name[256], type[256], serial[256];
    int32_t flag = -1;
    ASSERT_EQ(0, PmxGetDeviceInfo(1, name, type, serial, &flag));
    EXPECT_STREQ("USB::0x0c6f::0004::ab7", name);
    EXPECT_EQ(0, flag);

    int64_t first = open();
    EXPECT_EQ((std::vector<float>{-10.0f, -11.5f, -10.0f}), readings(first, 3));
    int32_t state = 0;
    EXPECT_EQ(0, PmxGetTriggerState(first, &state));
    EXPECT_EQ(-7, PmxGetTriggerState(first, &state)) << "the second call fails";
    EXPECT_EQ(0, PmxGetTriggerState(first, &state));

    int64_t second = open("USB::0x0c6f::0004::AB7");
    EXPECT_EQ("CALIBRATED", ask(second, "CAL:ZERO?"));
    command(second, "diag");
    EXPECT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.value == 0x12345; }));
    command(second, "func trace");
    command(second, "trac:poin 8");
    awaitResult(second, "read?");
    float trace[8];
    int32_t count = 0;
    ASSERT_EQ(0, PmxGetFloatArray(second, trace, 8, &count));
    EXPECT_EQ((std::vector<float>{-50, -50, -50, -30, -10, -10, -50, -50}), std::vector<float>(trace, trace + count));
    // The second measurement was the last: the third detaches the sensor instead.
    float noisy = measure(second, "meas?");
    EXPECT_NEAR(-30.0f, noisy, 3.0f);
    m_aRecorder.clear();
    ASSERT_EQ(0, PmxSendCommand(second, "meas?", 0));
    ASSERT_TRUE(m_aRecorder.waitFor([](const SCall& c) { return c.kind == KIND_DEVICE; }));
    EXPECT_EQ(PMXSIM_E_SENSOR_DETACHED, PmxGetData(second, nullptr, nullptr, nullptr));
    EXPECT_EQ(1, sensors());

    // A reload starts the same way again: the noise repeats with its seed.
    load(SCENARIO_TEXT);
    second = open("USB::0x0c6f::0004::ab7");
    EXPECT_EQ(noisy, measure(second, "meas?"));
}

TEST_F(ScenarioTest, MalformedFileLeavesNoSensorAndNamesLineAndReason)
{
    const char* const BAD_SCENARIOS[][2] = {
        {"sensors: [", "pmxsim_scenario.yaml:1: end of sequence flow not found"},
        {"sensors:\n  - {type: PMX, serial: 1, colour: red}", ":2: unknown key \"colour\" in a sensor"},
        {"sensors:\n  - {type: PMX}", ":2: a sensor needs a type and a serial"},
        {"sensors:\n  - {type: 'A:B', serial: 1}", ":2: the type must be"},
        {"sensors:\n  - {type: PMX, serial: 1}\n  - {type: PMX, serial: 1}", ":3: serial number 1 appears twice"},
        {"sensors:\n  - {type: PMX, serial: 1, power: loud}", ":2: power must be a number"},
        {"sensors:\n  - {type: PMX, serial: 1, power: []}", ":2: the power sequence must hold"},
        {"sensors:\n  - {type: PMX, serial: 1, power: {noise: 1}}", ":2: power needs a level"},
        {"sensors:\n  - {type: PMX, serial: 1, power: [-20, [1]]}", ":2: a power level must be a number;"},
        {"sensors:\n  - {type: PMX, serial: 1, power: {level: -1, noise: -1}}",
         ":2: the power noise must be within 0 and 100;"},
        {"sensors:\n  - type: PMX\n    serial: 1\n    trace: {pulse: {duration: 0}}",
         ":4: the pulse duration must be within 1e-06 and 1e+09;"},
        {"delays: {measurement: [1]}", ":1: the measurement time must be a whole number;"},
        {"sensors:\n  - type: PMX\n    serial: 1\n    answers: [{pattern: x}]",
         ":4: an answer needs a pattern and either"},
        {"sensors:\n  - {type: PMX, serial: 1, detach_after: 0}", ":2: detach_after must be within 1"},
        {"delays: {acknowledge: 010x}", ":1: the acknowledgement delay must be a whole number"},
        {"faults:\n  - {function: PmxFly, code: 1}", ":2: unknown library function \"PmxFly\""},
        {"faults:\n  - {function: PmxGetData, code: 0}", ":2: the fault code must not be 0"},
        {"- just a list", ":1: the scenario must be a mapping"},
        {"sensors: []\ndelays: {}\nsensors:\n  - {type: PMX, serial: 1}", ":3: repeated key \"sensors\" in the scenario"},
        {"sensors:\n  - type: PMX\n    serial: 1\n    serial: 2", ":4: repeated key \"serial\" in a sensor"},
        {"delays: {acknowledge: 5, acknowledge: 6}", ":1: repeated key \"acknowledge\" in delays"},
        {"sensors:\n  - {type: PMX, serial: 1}\n---\nsensors: []", ":3: more than one document"},
    };
    for (const auto& bad : BAD_SCENARIOS) {
        SCOPED_TRACE(bad[0]);
        std::string complaint = load(bad[0]);
        EXPECT_NE(std::string::npos, complaint.find(bad[1])) << complaint;
        EXPECT_NE(std::string::npos, complaint.find("; no sensors attached\n")) << complaint;
        EXPECT_EQ(1, std::count(complaint.begin(), complaint.end(), '\n')) << complaint;
        EXPECT_EQ(0, sensors());
    }
    // A good file after a bad one, and the documented example, load completely.
    EXPECT_EQ("", load("sensors:\n  - {type: PMX-M01, serial: \"100000\"}"));
    EXPECT_EQ(1, sensors());
    std::ifstream example(PMXSIM_EXAMPLE_SCENARIO);
    std::string text((std::istreambuf_iterator<char>(example)), std::istreambuf_iterator<char>());
    ASSERT_FALSE(text.empty());
    EXPECT_EQ("", load(text));
    EXPECT_EQ(3, sensors());
}

TEST_F(ScenarioTest, UnreadableOrEndlessFileLeavesNoSensor)
{
    // /dev/zero never ends: only the first bytes beyond the limit are read. A directory opens
    // but cannot be read.
    for (std::string path : {std::string("/dev/zero"), testing::TempDir()}) {
        SCOPED_TRACE(path);
        EXPECT_EQ("pmxsim: " + path + ": cannot be read (or is larger than 1 MiB); no sensors attached\n",
                  loadFrom(path));
        EXPECT_EQ(0, sensors());
    }
}

// The first call into the library reads the file; when that call is PmxSimReset, the file is
// read once, not once for the new simulator and again for the reset. Only a fresh process shows
// it: the statement runs in a new run of this program.
TEST(ScenarioFirstCall, ResetAsFirstCallComplainsOnce)
{
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    std::string path = testing::TempDir() + "pmxsim_first_call.yaml";
    std::ofstream(path, std::ios::binary) << "sensors: [";
    auto once = [](const std::string& err) {
        size_t first = err.find("no sensors attached\n");
        return first != std::string::npos && err.find("no sensors attached", first + 1) == std::string::npos;
    };
    EXPECT_EXIT(
        {
            setConfig(path.c_str());
            std::exit(PmxSimReset());
        },
        testing::ExitedWithCode(0), testing::Truly(once));
    std::remove(path.c_str());
}

#else

TEST_F(ScenarioTest, ThisBuildRefusesScenarioFiles)
{
    std::string complaint = load("sensors:\n  - {type: PMX-M01, serial: \"100000\"}");
    EXPECT_NE(std::string::npos,
              complaint.find("pmxsim_scenario.yaml: scenario files are not supported in this build; no "
                             "sensors attached"))
        << complaint;
    EXPECT_EQ(0, sensors());
}

#endif

} // namespace
