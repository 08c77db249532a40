// The scenario file: YAML read with yaml-cpp, every key and value checked, the first fault
// reported with its line. Nothing is kept from a malformed file.
#include "pmxsim/Scenario.h"

#include <yaml-cpp/eventhandler.h>
#include <yaml-cpp/yaml.h>

#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <set>
#include <sstream>
#include <vector>

namespace PmxSim {

namespace {

const int32_t MAX_DELAY_MS = 60000;
const size_t MAX_SEQUENCE = 100000;
const size_t MAX_ANSWERS = 1000;

// A fault in the file: where and why.
struct SBad {
    int nLine;
    std::string strReason;
};

[[noreturn]] void fail(const YAML::Mark& mark, const std::string& reason)
{
    throw SBad{mark.is_null() ? 0 : mark.line + 1, reason};
}

[[noreturn]] void fail(const YAML::Node& node, const std::string& reason)
{
    fail(node.Mark(), reason);
}

// Notes where the second document of a text starts, building nothing. (YAML::LoadAll cannot
// serve: on some malformed texts it never returns.)
class CDocumentCounter : public YAML::EventHandler {
public:
    int m_nDocuments = 0;
    YAML::Mark m_cSecond = YAML::Mark::null_mark();

    void OnDocumentStart(const YAML::Mark& mark) override
    {
        if (++m_nDocuments == 2)
            m_cSecond = mark;
    }
    void OnDocumentEnd() override { }
    void OnNull(const YAML::Mark&, YAML::anchor_t) override { }
    void OnAlias(const YAML::Mark&, YAML::anchor_t) override { }
    void OnScalar(const YAML::Mark&, const std::string&, YAML::anchor_t, const std::string&) override { }
    void OnSequenceStart(const YAML::Mark&, const std::string&, YAML::anchor_t, YAML::EmitterStyle::value) override { }
    void OnSequenceEnd() override { }
    void OnMapStart(const YAML::Mark&, const std::string&, YAML::anchor_t, YAML::EmitterStyle::value) override { }
    void OnMapEnd() override { }
};

// A scenario is one document: a second one is refused, not ignored, at the line where it starts
// (its "---").
void expectOneDocument(const std::string& input)
{
    std::istringstream stream(input);
    YAML::Parser parser(stream);
    CDocumentCounter counter;
    if (parser.HandleNextDocument(counter) && parser.HandleNextDocument(counter))
        fail(counter.m_cSecond, "more than one document");
}

// The keys of a mapping must come from the allowed set, each at most once (the parser keeps a
// repeated key, and a lookup would silently find its first value).
void expectMap(const YAML::Node& node, const std::string& what, std::initializer_list<const char*> allowed)
{
    if (!node.IsMap())
        fail(node, what + " must be a mapping");
    std::set<std::string> seen;
    for (const auto& item : node) {
        std::string key = item.first.IsScalar() ? item.first.Scalar() : std::string();
        bool known = false;
        for (const char* name : allowed)
            known = known || key == name;
        if (!known)
            fail(item.first, "unknown key \"" + key + "\" in " + what);
        if (!seen.insert(key).second)
            fail(item.first, "repeated key \"" + key + "\" in " + what);
    }
}

std::string text(const YAML::Node& node, const std::string& what)
{
    if (!node.IsScalar())
        fail(node, what + " must be a text");
    return node.Scalar();
}

// A bound in a complaint, in its shortest form ("0", "100", "1e-06").
std::string bound(double value)
{
    char buffer[32];
    std::snprintf(buffer, sizeof buffer, "%g", value);
    return buffer;
}

double real(const YAML::Node& node, const std::string& what, double low, double high)
{
    if (!node.IsScalar())
        fail(node, what + " must be a number");
    std::string value = node.Scalar();
    char* rest = nullptr;
    errno = 0;
    double parsed = std::strtod(value.c_str(), &rest);
    if (value.empty() || *rest != '\0' || errno != 0 || !std::isfinite(parsed))
        fail(node, what + " must be a number");
    if (parsed < low || parsed > high)
        fail(node, what + " must be within " + bound(low) + " and " + bound(high));
    return parsed;
}

// A whole number, decimal or hexadecimal (0x...), within [low, high].
int64_t whole(const YAML::Node& node, const std::string& what, int64_t low, int64_t high)
{
    if (!node.IsScalar())
        fail(node, what + " must be a whole number");
    std::string value = node.Scalar();
    bool hex = value.size() > 2 && value[0] == '0' && (value[1] == 'x' || value[1] == 'X');
    char* rest = nullptr;
    errno = 0;
    long long parsed = std::strtoll(value.c_str() + (hex ? 2 : 0), &rest, hex ? 16 : 10);
    if (value.empty() || *rest != '\0' || errno != 0 || (!hex && value[0] == '+'))
        fail(node, what + " must be a whole number");
    if (parsed < low || parsed > high)
        fail(node, what + " must be within " + std::to_string(low) + " and " + std::to_string(high));
    return parsed;
}

// A result code: any 32-bit value but 0, written signed or unsigned (0xD0000089).
int32_t code(const YAML::Node& node, const std::string& what)
{
    int64_t value = whole(node, what, INT32_MIN, UINT32_MAX);
    if (value == 0)
        fail(node, what + " must not be 0");
    return static_cast<int32_t>(static_cast<uint32_t>(value));
}

// power: a number (constant), a list of numbers (sequence) or {level, noise}.
void readPower(const YAML::Node& node, SSensorModel* sensor)
{
    SPowerModel& power = sensor->power;
    if (node.IsScalar()) {
        power.eKind = SPowerModel::POWER_MODEL_CONSTANT;
        power.dLevelDbm = real(node, "power", -200, 100);
    } else if (node.IsSequence()) {
        power.eKind = SPowerModel::POWER_MODEL_SEQUENCE;
        if (node.size() == 0 || node.size() > MAX_SEQUENCE)
            fail(node, "the power sequence must hold 1 to 100000 levels");
        for (const auto& level : node)
            power.levels.push_back(real(level, "a power level", -200, 100));
    } else {
        expectMap(node, "power", {"level", "noise", "seed"});
        if (!node["level"])
            fail(node, "power needs a level");
        power.eKind = SPowerModel::POWER_MODEL_NOISY;
        power.dLevelDbm = real(node["level"], "the power level", -200, 100);
        if (node["noise"])
            power.dNoiseDb = real(node["noise"], "the power noise", 0, 100);
        if (node["seed"])
            sensor->nSeed = static_cast<uint32_t>(whole(node["seed"], "the seed", 0, UINT32_MAX));
    }
}

void readTrace(const YAML::Node& node, STraceModel* trace)
{
    expectMap(node, "trace", {"pulse", "noise"});
    trace->bBuiltIn = false;
    if (node["noise"])
        trace->dNoiseDb = real(node["noise"], "the trace noise", 0, 100);
    if (!node["pulse"])
        return;
    const YAML::Node pulse = node["pulse"];
    expectMap(pulse, "pulse", {"duration", "delay", "rise", "width", "fall", "low", "high"});
    struct SField {
        const char* name;
        double* value;
        double low;
        double high;
    } fields[] = {{"duration", &trace->dDurationUs, 1e-6, 1e9},
                  {"delay", &trace->dDelayUs, 0, 1e9},
                  {"rise", &trace->dRiseUs, 0, 1e9},
                  {"width", &trace->dWidthUs, 0, 1e9},
                  {"fall", &trace->dFallUs, 0, 1e9},
                  {"low", &trace->dLowDbm, -200, 100},
                  {"high", &trace->dHighDbm, -200, 100}};
    for (const SField& field : fields)
        if (pulse[field.name])
            *field.value = real(pulse[field.name], std::string("the pulse ") + field.name, field.low, field.high);
}

void readAnswers(const YAML::Node& node, SSensorModel* sensor)
{
    if (!node.IsSequence() || node.size() > MAX_ANSWERS)
        fail(node, "answers must be a list of at most 1000 entries");
    for (const auto& item : node) {
        expectMap(item, "an answer", {"pattern", "answer", "error"});
        if (!item["pattern"] || (item["answer"] ? 1 : 0) + (item["error"] ? 1 : 0) != 1)
            fail(item, "an answer needs a pattern and either an answer or an error");
        SAnswer answer;
        answer.strPattern = lower(trim(text(item["pattern"], "the pattern")));
        if (answer.strPattern.empty())
            fail(item["pattern"], "the pattern must not be empty");
        if (item["answer"]) {
            answer.strAnswer = text(item["answer"], "the answer");
            if (answer.strAnswer.size() > 1023 || answer.strAnswer.find('\0') != std::string::npos)
                fail(item["answer"], "the answer must be a text of at most 1023 bytes");
        } else {
            answer.bError = true;
            answer.nCode = code(item["error"], "the error code");
        }
        sensor->answers.push_back(answer);
    }
}

SSensorModel readSensor(const YAML::Node& node)
{
    expectMap(node, "a sensor", {"type", "serial", "flag", "power", "trace", "answers", "detach_after"});
    SSensorModel sensor;
    if (!node["type"] || !node["serial"])
        fail(node, "a sensor needs a type and a serial");
    sensor.strType = text(node["type"], "the type");
    sensor.strSerial = text(node["serial"], "the serial");
    if (!validText(sensor.strType.c_str()))
        fail(node["type"], "the type must be 1 to 255 characters without ':' or ','");
    if (!validText(sensor.strSerial.c_str()))
        fail(node["serial"], "the serial must be 1 to 255 characters without ':' or ','");
    if (node["flag"])
        sensor.nFlag = static_cast<int32_t>(whole(node["flag"], "the flag", INT32_MIN, INT32_MAX));
    if (node["power"])
        readPower(node["power"], &sensor);
    if (node["trace"])
        readTrace(node["trace"], &sensor.trace);
    if (node["answers"])
        readAnswers(node["answers"], &sensor);
    if (node["detach_after"])
        sensor.nDetachAfter = static_cast<int32_t>(whole(node["detach_after"], "detach_after", 1, INT32_MAX));
    return sensor;
}

SFault readFault(const YAML::Node& node)
{
    expectMap(node, "a fault", {"function", "call", "code"});
    if (!node["function"] || !node["code"])
        fail(node, "a fault needs a function and a code");
    SFault fault;
    std::string name = text(node["function"], "the function");
    fault.nFunction = -1;
    for (int fn = 0; fn < FUNCTION_COUNT; ++fn)
        if (name == functionName(fn))
            fault.nFunction = fn;
    if (fault.nFunction < 0)
        fail(node["function"], "unknown library function \"" + name + "\"");
    if (node["call"])
        fault.nCall = static_cast<int32_t>(whole(node["call"], "the call", 1, INT32_MAX));
    fault.nCode = code(node["code"], "the fault code");
    return fault;
}

void readScenario(const YAML::Node& root, SScenario* scenario)
{
    if (root.IsNull())
        return; // an empty file: no sensor
    expectMap(root, "the scenario", {"delays", "sensors", "faults"});
    if (root["delays"]) {
        const YAML::Node delays = root["delays"];
        expectMap(delays, "delays", {"acknowledge", "measurement"});
        if (delays["acknowledge"])
            scenario->nAckMs =
                static_cast<int32_t>(whole(delays["acknowledge"], "the acknowledgement delay", 0, MAX_DELAY_MS));
        if (delays["measurement"])
            scenario->nMeasureMs =
                static_cast<int32_t>(whole(delays["measurement"], "the measurement time", 0, MAX_DELAY_MS));
    }
    if (root["sensors"]) {
        const YAML::Node sensors = root["sensors"];
        if (!sensors.IsSequence())
            fail(sensors, "sensors must be a list");
        std::set<std::string> serials;
        for (const auto& item : sensors) {
            SSensorModel sensor = readSensor(item);
            if (!serials.insert(lower(sensor.strSerial)).second)
                fail(item["serial"], "serial number " + sensor.strSerial + " appears twice");
            scenario->sensors.push_back(sensor);
        }
    }
    if (root["faults"]) {
        const YAML::Node faults = root["faults"];
        if (!faults.IsSequence())
            fail(faults, "faults must be a list");
        for (const auto& item : faults)
            scenario->faults.push_back(readFault(item));
    }
}

} // namespace

bool parseScenario(const std::string& input, SScenario* scenario, int* line, std::string* reason)
{
    SScenario parsed;
    try {
        expectOneDocument(input);
        readScenario(YAML::Load(input), &parsed);
    } catch (const SBad& bad) {
        *line = bad.nLine;
        *reason = bad.strReason;
        return false;
    } catch (const YAML::Exception& e) {
        *line = e.mark.is_null() ? 0 : e.mark.line + 1;
        *reason = e.msg;
        return false;
    } catch (const std::exception& e) {
        *line = 0;
        *reason = e.what();
        return false;
    }
    *scenario = std::move(parsed);
    return true;
}

} // namespace PmxSim
