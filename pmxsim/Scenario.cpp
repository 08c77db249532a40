// Where the scenario comes from: the file named by PMXSIM_CONFIG, the PMXSIM_DEVICES list or the
// two default sensors; and the pattern match of extra answers. The file format itself is parsed
// in ScenarioYaml.cpp (left out of builds without a YAML parser).
#include "pmxsim/Scenario.h"

#include <cstdio>
#include <cstdlib>

namespace PmxSim {

namespace {

const char* const DEFAULT_DEVICES = "PMX-M01:100000,PMX-M10:100001";
const size_t MAX_SCENARIO_BYTES = 1 << 20;

void complain(const std::string& text)
{
    std::fprintf(stderr, "pmxsim: %s\n", text.c_str());
    std::fflush(stderr);
}

// Reads at most one byte beyond the limit, so an endless source (/dev/zero) ends the read too.
bool readFile(const std::string& path, std::string* text)
{
    std::FILE* file = std::fopen(path.c_str(), "rb");
    if (file == nullptr)
        return false;
    text->resize(MAX_SCENARIO_BYTES + 1);
    size_t size = 0;
    while (size < text->size()) {
        size_t got = std::fread(&(*text)[size], 1, text->size() - size, file);
        if (got == 0)
            break;
        size += got;
    }
    // A directory opens on POSIX systems, but reading it fails (EISDIR): ferror tells.
    bool failed = std::ferror(file) != 0;
    std::fclose(file);
    text->resize(size);
    return !failed && size <= MAX_SCENARIO_BYTES;
}

SScenario fileScenario(const std::string& path)
{
    SScenario scenario;
    std::string text;
    if (!readFile(path, &text)) {
        complain(path + ": cannot be read (or is larger than 1 MiB); no sensors attached");
        return SScenario();
    }
    int line = 0;
    std::string reason;
    if (!parseScenario(text, &scenario, &line, &reason)) {
        if (line > 0)
            complain(path + ":" + std::to_string(line) + ": " + reason + "; no sensors attached");
        else
            complain(path + ": " + reason + "; no sensors attached");
        return SScenario();
    }
    return scenario;
}

} // namespace

SScenario configuredScenario()
{
    const char* config = std::getenv("PMXSIM_CONFIG");
    if (config != nullptr && *config != '\0')
        return fileScenario(config);
    const char* devices = std::getenv("PMXSIM_DEVICES");
    std::vector<std::string> complaints;
    SScenario scenario = devicesScenario(devices != nullptr ? devices : DEFAULT_DEVICES, &complaints);
    for (const std::string& complaint : complaints)
        complain("PMXSIM_DEVICES: " + complaint);
    return scenario;
}

SScenario devicesScenario(const std::string& configured, std::vector<std::string>* complaints)
{
    SScenario scenario;
    std::string list = configured;
    // "none" spells the empty list where an empty variable cannot be set (Windows deletes it).
    if (lower(trim(list)) == "none" || trim(list).empty())
        return scenario;
    size_t start = 0;
    while (start <= list.size()) {
        size_t end = list.find(',', start);
        if (end == std::string::npos)
            end = list.size();
        std::string entry = trim(list.substr(start, end - start));
        start = end + 1;
        if (entry.empty())
            continue;
        std::string skipped = "entry \"" + entry + "\" skipped: ";
        size_t colon = entry.find(':');
        if (colon == std::string::npos) {
            complaints->push_back(skipped + "not type:serial[:flag]");
            continue;
        }
        SSensorModel sensor;
        sensor.strType = trim(entry.substr(0, colon));
        sensor.strSerial = trim(entry.substr(colon + 1));
        size_t flagColon = sensor.strSerial.find(':');
        if (flagColon != std::string::npos) {
            std::string flagText = trim(sensor.strSerial.substr(flagColon + 1));
            sensor.strSerial = trim(sensor.strSerial.substr(0, flagColon));
            char* rest = nullptr;
            long value = std::strtol(flagText.c_str(), &rest, 10);
            if (flagText.empty() || *rest != '\0') {
                complaints->push_back(skipped + "the flag is not a whole number");
                continue;
            }
            sensor.nFlag = static_cast<int32_t>(value);
        }
        if (!validText(sensor.strType.c_str()) || !validText(sensor.strSerial.c_str())) {
            complaints->push_back(skipped + "empty or too long type or serial number");
            continue;
        }
        bool repeated = false;
        for (const SSensorModel& other : scenario.sensors)
            repeated = repeated || sameSerial(other.strSerial, sensor.strSerial.c_str());
        if (repeated) {
            complaints->push_back(skipped + "serial number already attached");
            continue;
        }
        scenario.sensors.push_back(sensor);
    }
    return scenario;
}

bool matchesPattern(const char* pattern, const char* text)
{
    // Iterative glob: the last "*" seen may absorb more characters on a later mismatch.
    const char* star = nullptr;
    const char* resume = nullptr;
    while (*text != '\0') {
        if (*pattern == '*') {
            star = pattern++;
            resume = text;
        } else if (*pattern == *text) {
            ++pattern;
            ++text;
        } else if (star != nullptr) {
            pattern = star + 1;
            text = ++resume;
        } else {
            return false;
        }
    }
    while (*pattern == '*')
        ++pattern;
    return *pattern == '\0';
}

#ifndef PMXSIM_HAVE_YAML
bool parseScenario(const std::string&, SScenario*, int* line, std::string* reason)
{
    *line = 0;
    *reason = "scenario files are not supported in this build";
    return false;
}
#endif

} // namespace PmxSim
