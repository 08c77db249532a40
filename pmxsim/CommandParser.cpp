#include "pmxsim/CommandParser.h"

#include "pmxsim/SimSupport.h"

#include <cerrno>
#include <cstdlib>
#include <vector>

namespace PmxSim {

namespace {

    // One keyword of a command header in its short or long form.
    bool keyword(const std::string& word, const char* shortForm, const char* longForm)
    {
        return word == shortForm || word == longForm;
    }

    // The parts of a command: its header split at the colons, and its parameter.
    struct SParts {
        bool bEmpty = true;
        std::string strHeader;
        std::vector<std::string> words;
        std::string strParameter;
    };

    SParts split(const std::string& text)
    {
        SParts parts;
        std::string command = lower(trim(text.substr(0, text.find_first_of("\r\n"))));
        parts.bEmpty = command.empty();
        size_t blank = command.find_first_of(" \t");
        parts.strHeader = command.substr(0, blank);
        if (blank != std::string::npos)
            parts.strParameter = trim(command.substr(blank));
        if (!parts.strHeader.empty() && parts.strHeader[0] == ':')
            parts.strHeader.erase(0, 1);
        size_t start = 0;
        for (;;) {
            size_t colon = parts.strHeader.find(':', start);
            parts.words.push_back(parts.strHeader.substr(
                start, colon == std::string::npos ? colon : colon - start));
            if (colon == std::string::npos)
                break;
            start = colon + 1;
        }
        std::string& parameter = parts.strParameter;
        if (parameter.size() >= 2 && (parameter.front() == '"' || parameter.front() == '\'')
            && parameter.back() == parameter.front())
            parameter = parameter.substr(1, parameter.size() - 2);
        return parts;
    }

    // A whole decimal number within [low, high].
    bool number(const std::string& text, long low, long high, int32_t* value)
    {
        char* rest = nullptr;
        errno = 0;
        long parsed = std::strtol(text.c_str(), &rest, 10);
        if (text.empty() || *rest != '\0' || errno != 0 || parsed < low || parsed > high)
            return false;
        *value = static_cast<int32_t>(parsed);
        return true;
    }

    // Commands of one word without a parameter.
    EAction simple(const std::string& header)
    {
        if (header == "*idn?")
            return eIdn;
        if (header == "*rst")
            return eReset;
        if (header == "*cls")
            return eNone;
        if (header == "*trg")
            return eMeasure;
        if (keyword(header, "abor", "abort"))
            return eAbort;
        if (keyword(header, "func?", "function?"))
            return eFunctionQuery;
        return eUnknown;
    }

} // namespace

SCommand parseCommand(const std::string& text)
{
    SParts parts = split(text);
    const std::vector<std::string>& words = parts.words;
    const std::string& parameter = parts.strParameter;
    SCommand command;
    if (parts.bEmpty) {
        command.eAction = eNone;
    } else if (words.size() == 1 && parameter.empty() && simple(words[0]) != eUnknown) {
        command.eAction = simple(words[0]);
    } else if (keyword(words[0], "init", "initiate")) {
        if (words.size() == 1 && parameter.empty())
            command.eAction = eMeasure;
        if (words.size() == 2 && parameter.empty() && keyword(words[1], "imm", "immediate"))
            command.eAction = eMeasure;
        if (words.size() == 2 && keyword(words[1], "cont", "continuous")) {
            if (parameter == "on" || parameter == "1")
                command.eAction = eContinuousOn;
            if (parameter == "off" || parameter == "0")
                command.eAction = eContinuousOff;
        }
    } else if (words.size() == 1 && keyword(words[0], "func", "function")) {
        if (parameter == "pow" || parameter == "power")
            command.eAction = ePower;
        if (parameter == "trac" || parameter == "trace")
            command.eAction = eTrace;
    } else if (words.size() == 2 && keyword(words[0], "trac", "trace")
        && keyword(words[1], "poin", "points")) {
        if (number(parameter, 1, kMaxTracePoints, &command.nValue))
            command.eAction = eTracePoints;
    }
    return command;
}

} // namespace PmxSim
