// The command table of the simulated sensors and the matching of a command against it.
#include "pmxsim/CommandParser.h"

#include "pmxsim/SimSupport.h"

#include <cctype>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <vector>

namespace PmxSim {

namespace {

enum EParameter { PARAM_NONE, PARAM_INTEGER, PARAM_BOOLEAN, PARAM_REAL, PARAM_FUNCTION_CHOICE, PARAM_UNIT_CHOICE };
enum EUse { USE_SET_ONLY, USE_QUERY_ONLY, USE_SET_AND_QUERY };

// One command: its header (keywords in long form, the short form in upper case, optional
// keywords in brackets), what it does, its parameter with the allowed range, and whether it is
// a setting, a query or both.
struct SEntry {
    const char* pattern;
    EAction eAction;
    EParameter eParameter;
    EUse eUse;
    double dLow;
    double dHigh;
};

const SEntry COMMANDS[] = {
    {"*IDN", ACTION_IDN, PARAM_NONE, USE_QUERY_ONLY, 0, 0},
    {"*RST", ACTION_RESET, PARAM_NONE, USE_SET_ONLY, 0, 0},
    {"*CLS", ACTION_CLEAR_STATUS, PARAM_NONE, USE_SET_ONLY, 0, 0},
    {"*OPC", ACTION_OPERATION_COMPLETE, PARAM_NONE, USE_SET_AND_QUERY, 0, 0},
    {"*WAI", ACTION_NONE, PARAM_NONE, USE_SET_ONLY, 0, 0},
    {"*ESR", ACTION_EVENT_STATUS, PARAM_NONE, USE_QUERY_ONLY, 0, 0},
    {"*ESE", ACTION_EVENT_ENABLE, PARAM_INTEGER, USE_SET_AND_QUERY, 0, 255},
    {"*SRE", ACTION_SERVICE_ENABLE, PARAM_INTEGER, USE_SET_AND_QUERY, 0, 255},
    {"*TST", ACTION_SELF_TEST, PARAM_NONE, USE_QUERY_ONLY, 0, 0},
    {"*TRG", ACTION_MEASURE, PARAM_NONE, USE_SET_ONLY, 0, 0},
    {"INITiate [IMMediate]", ACTION_MEASURE, PARAM_NONE, USE_SET_ONLY, 0, 0},
    {"INITiate CONTinuous", ACTION_CONTINUOUS, PARAM_BOOLEAN, USE_SET_AND_QUERY, 0, 0},
    {"ABORt", ACTION_ABORT, PARAM_NONE, USE_SET_ONLY, 0, 0},
    {"READ", ACTION_READ, PARAM_NONE, USE_QUERY_ONLY, 0, 0},
    {"MEASure [POWer]", ACTION_MEASURE_POWER, PARAM_NONE, USE_QUERY_ONLY, 0, 0},
    {"FUNCtion", ACTION_FUNCTION, PARAM_FUNCTION_CHOICE, USE_SET_AND_QUERY, 0, 0},
    {"TRACe POINts", ACTION_TRACE_POINTS, PARAM_INTEGER, USE_SET_AND_QUERY, 1, MAX_TRACE_POINTS},
    {"[SENSe] FREQuency", ACTION_FREQUENCY, PARAM_REAL, USE_SET_AND_QUERY, MIN_FREQUENCY_HZ, MAX_FREQUENCY_HZ},
    {"[SENSe] AVERage COUNt", ACTION_AVERAGE_COUNT, PARAM_INTEGER, USE_SET_AND_QUERY, 1, MAX_AVERAGE_COUNT},
    {"[SENSe] AVERage [STATe]", ACTION_AVERAGING, PARAM_BOOLEAN, USE_SET_AND_QUERY, 0, 0},
    {"[SENSe] CORRection OFFSet", ACTION_OFFSET, PARAM_REAL, USE_SET_AND_QUERY, -MAX_OFFSET_DB, MAX_OFFSET_DB},
    {"UNIT POWer", ACTION_UNIT, PARAM_UNIT_CHOICE, USE_SET_AND_QUERY, 0, 0},
    {"SYSTem VERSion", ACTION_VERSION, PARAM_NONE, USE_QUERY_ONLY, 0, 0},
};

// One keyword of a pattern: its long form, its short form (the upper-case letters), both in
// lower case, and whether it may be left out.
struct SKeyword {
    std::string strLong;
    std::string strShort;
    bool bOptional;
};

std::vector<SKeyword> keywords(const char* pattern)
{
    std::vector<SKeyword> result;
    std::string text(pattern);
    size_t start = 0;
    while (start < text.size()) {
        size_t end = text.find(' ', start);
        std::string word = text.substr(start, end == std::string::npos ? end : end - start);
        start = end == std::string::npos ? text.size() : end + 1;
        SKeyword keyword;
        keyword.bOptional = word.front() == '[';
        if (keyword.bOptional)
            word = word.substr(1, word.size() - 2);
        for (char c : word)
            if (!std::islower(static_cast<unsigned char>(c)))
                keyword.strShort += static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        keyword.strLong = lower(word);
        result.push_back(keyword);
    }
    return result;
}

// The keywords of every command, made once.
const std::vector<std::vector<SKeyword>>& patterns()
{
    static const std::vector<std::vector<SKeyword>> all = [] {
        std::vector<std::vector<SKeyword>> made;
        for (const SEntry& entry : COMMANDS)
            made.push_back(keywords(entry.pattern));
        return made;
    }();
    return all;
}

// The words match the keywords from the given positions on, optional keywords skipped.
bool matches(const std::vector<SKeyword>& pattern, size_t p, const std::vector<std::string>& words, size_t w)
{
    if (p == pattern.size())
        return w == words.size();
    const SKeyword& keyword = pattern[p];
    bool same = w < words.size() && (words[w] == keyword.strLong || words[w] == keyword.strShort);
    if (same && matches(pattern, p + 1, words, w + 1))
        return true;
    return keyword.bOptional && matches(pattern, p + 1, words, w);
}

bool integer(const std::string& text, double low, double high, int32_t* value)
{
    char* rest = nullptr;
    errno = 0;
    long parsed = std::strtol(text.c_str(), &rest, 10);
    if (text.empty() || *rest != '\0' || errno != 0 || parsed < low || parsed > high)
        return false;
    *value = static_cast<int32_t>(parsed);
    return true;
}

// A decimal number, for frequencies optionally with the unit HZ, KHZ, MHZ or GHZ.
bool real(const std::string& text, EAction action, double low, double high, double* value)
{
    char* rest = nullptr;
    errno = 0;
    double parsed = std::strtod(text.c_str(), &rest);
    if (text.empty() || rest == text.c_str() || errno != 0 || !std::isfinite(parsed))
        return false;
    std::string unit = trim(rest);
    if (action == ACTION_FREQUENCY && !unit.empty()) {
        const char* const FREQUENCY_UNITS[] = {"hz", "khz", "mhz", "ghz"};
        double scale = 1.0;
        bool known = false;
        for (const char* name : FREQUENCY_UNITS) {
            known = known || unit == name;
            if (!known)
                scale *= 1e3;
        }
        if (!known)
            return false;
        parsed *= scale;
    } else if (!unit.empty()) {
        return false;
    }
    if (parsed < low || parsed > high)
        return false;
    *value = parsed;
    return true;
}

bool parameter(const SEntry& entry, const std::string& text, SCommand* command)
{
    switch (entry.eParameter) {
    case PARAM_NONE:
        return text.empty();
    case PARAM_INTEGER:
        return integer(text, entry.dLow, entry.dHigh, &command->nValue);
    case PARAM_REAL:
        return real(text, entry.eAction, entry.dLow, entry.dHigh, &command->dValue);
    case PARAM_BOOLEAN:
        command->nValue = text == "on" || text == "1" ? 1 : 0;
        return text == "on" || text == "1" || text == "off" || text == "0";
    case PARAM_FUNCTION_CHOICE:
        command->nValue = text == "pow" || text == "power" ? FUNCTION_POWER : FUNCTION_TRACE;
        return text == "pow" || text == "power" || text == "trac" || text == "trace";
    case PARAM_UNIT_CHOICE:
        command->nValue = text == "dbm" ? UNIT_DBM : UNIT_WATT;
        return text == "dbm" || text == "w";
    }
    return false;
}

} // namespace

SCommand parseCommand(const std::string& text)
{
    SCommand command;
    std::string line = lower(trim(text.substr(0, text.find_first_of("\r\n"))));
    if (line.empty()) {
        command.eAction = ACTION_NONE;
        return command;
    }
    size_t blank = line.find_first_of(" \t");
    std::string header = line.substr(0, blank);
    std::string argument = blank == std::string::npos ? std::string() : trim(line.substr(blank));
    if (argument.size() >= 2 && (argument.front() == '"' || argument.front() == '\'') &&
        argument.back() == argument.front())
        argument = argument.substr(1, argument.size() - 2);
    if (!header.empty() && header[0] == ':')
        header.erase(0, 1);
    command.bQuery = !header.empty() && header.back() == '?';
    if (command.bQuery)
        header.pop_back();
    std::vector<std::string> words;
    size_t start = 0;
    for (;;) {
        size_t colon = header.find(':', start);
        words.push_back(header.substr(start, colon == std::string::npos ? colon : colon - start));
        if (colon == std::string::npos)
            break;
        start = colon + 1;
    }

    for (size_t i = 0; i < sizeof COMMANDS / sizeof COMMANDS[0]; ++i) {
        const SEntry& entry = COMMANDS[i];
        if (!matches(patterns()[i], 0, words, 0))
            continue;
        bool allowed = command.bQuery ? entry.eUse != USE_SET_ONLY : entry.eUse != USE_QUERY_ONLY;
        bool good = command.bQuery ? argument.empty() : parameter(entry, argument, &command);
        if (allowed && good)
            command.eAction = entry.eAction;
        return command;
    }
    return command;
}

} // namespace PmxSim
