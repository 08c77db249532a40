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

enum EParameter { eNoParameter, eInteger, eBoolean, eReal, eFunctionChoice, eUnitChoice };
enum EUse { eSetOnly, eQueryOnly, eSetAndQuery };

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
    {"*IDN", eIdn, eNoParameter, eQueryOnly, 0, 0},
    {"*RST", eReset, eNoParameter, eSetOnly, 0, 0},
    {"*CLS", eClearStatus, eNoParameter, eSetOnly, 0, 0},
    {"*OPC", eOperationComplete, eNoParameter, eSetAndQuery, 0, 0},
    {"*WAI", eNone, eNoParameter, eSetOnly, 0, 0},
    {"*ESR", eEventStatus, eNoParameter, eQueryOnly, 0, 0},
    {"*ESE", eEventEnable, eInteger, eSetAndQuery, 0, 255},
    {"*SRE", eServiceEnable, eInteger, eSetAndQuery, 0, 255},
    {"*TST", eSelfTest, eNoParameter, eQueryOnly, 0, 0},
    {"*TRG", eMeasure, eNoParameter, eSetOnly, 0, 0},
    {"INITiate [IMMediate]", eMeasure, eNoParameter, eSetOnly, 0, 0},
    {"INITiate CONTinuous", eContinuous, eBoolean, eSetAndQuery, 0, 0},
    {"ABORt", eAbort, eNoParameter, eSetOnly, 0, 0},
    {"READ", eRead, eNoParameter, eQueryOnly, 0, 0},
    {"MEASure [POWer]", eMeasurePower, eNoParameter, eQueryOnly, 0, 0},
    {"FUNCtion", eFunction, eFunctionChoice, eSetAndQuery, 0, 0},
    {"TRACe POINts", eTracePoints, eInteger, eSetAndQuery, 1, MAX_TRACE_POINTS},
    {"[SENSe] FREQuency", eFrequency, eReal, eSetAndQuery, MIN_FREQUENCY_HZ, MAX_FREQUENCY_HZ},
    {"[SENSe] AVERage COUNt", eAverageCount, eInteger, eSetAndQuery, 1, MAX_AVERAGE_COUNT},
    {"[SENSe] AVERage [STATe]", eAveraging, eBoolean, eSetAndQuery, 0, 0},
    {"[SENSe] CORRection OFFSet", eOffset, eReal, eSetAndQuery, -MAX_OFFSET_DB, MAX_OFFSET_DB},
    {"UNIT POWer", eUnit, eUnitChoice, eSetAndQuery, 0, 0},
    {"SYSTem VERSion", eVersion, eNoParameter, eQueryOnly, 0, 0},
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
    if (action == eFrequency && !unit.empty()) {
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
    case eNoParameter:
        return text.empty();
    case eInteger:
        return integer(text, entry.dLow, entry.dHigh, &command->nValue);
    case eReal:
        return real(text, entry.eAction, entry.dLow, entry.dHigh, &command->dValue);
    case eBoolean:
        command->nValue = text == "on" || text == "1" ? 1 : 0;
        return text == "on" || text == "1" || text == "off" || text == "0";
    case eFunctionChoice:
        command->nValue = text == "pow" || text == "power" ? FUNCTION_POWER : FUNCTION_TRACE;
        return text == "pow" || text == "power" || text == "trac" || text == "trace";
    case eUnitChoice:
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
        command.eAction = eNone;
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
        bool allowed = command.bQuery ? entry.eUse != eSetOnly : entry.eUse != eQueryOnly;
        bool good = command.bQuery ? argument.empty() : parameter(entry, argument, &command);
        if (allowed && good)
            command.eAction = entry.eAction;
        return command;
    }
    return command;
}

} // namespace PmxSim
