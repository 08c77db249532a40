#include "sensor/PmxScpiCommandParser.h"

#include <vector>

namespace LbPmxVisa {

namespace {

char toLower(char c)
{
    return (c >= 'A' && c <= 'Z') ? static_cast<char>(c - 'A' + 'a') : c;
}

int compareIgnoringCase(const std::string& left, const std::string& right)
{
    const std::string::size_type length = left.size() < right.size() ? left.size() : right.size();
    for (std::string::size_type i = 0; i < length; ++i) {
        const unsigned char l = static_cast<unsigned char>(toLower(left[i]));
        const unsigned char r = static_cast<unsigned char>(toLower(right[i]));
        if (l != r) {
            return l < r ? -1 : 1;
        }
    }
    if (left.size() == right.size()) {
        return 0;
    }
    return left.size() < right.size() ? -1 : 1;
}

// Drops enclosing double quotes and one trailing "?", then splits at ":". A ":" at the start,
// at the end or beside another yields an empty mnemonic (so "fetch:?" is not "FETCh?");
// an empty header has no mnemonics at all.
std::vector<std::string> splitHeader(const std::string& header)
{
    std::string text(header);
    if (text.size() >= 2 && text[0] == '"' && text[text.size() - 1] == '"') {
        text = text.substr(1, text.size() - 2);
    }
    if (!text.empty() && text[text.size() - 1] == '?') {
        text.erase(text.size() - 1);
    }
    std::vector<std::string> mnemonics;
    if (text.empty()) {
        return mnemonics;
    }
    std::string::size_type begin = 0;
    for (;;) {
        const std::string::size_type colon = text.find(':', begin);
        mnemonics.push_back(text.substr(begin, colon == std::string::npos ? std::string::npos : colon - begin));
        if (colon == std::string::npos) {
            return mnemonics;
        }
        begin = colon + 1;
    }
}

std::string shortForm(const std::string& mnemonic)
{
    std::string result;
    for (char c : mnemonic) {
        if (c >= 'A' && c <= 'Z') {
            result += c;
        }
    }
    return result;
}

bool endsWithQuery(const std::string& text)
{
    return !text.empty() && text[text.size() - 1] == '?';
}

// scpiCompare on whole strings, so that a NUL byte written by an application is a character
// like any other instead of the end of the command.
int compareHeader(const std::string& pattern, const std::string& input)
{
    if (endsWithQuery(pattern) && !endsWithQuery(input)) {
        return 1;
    }
    const std::vector<std::string> patternMnemonics = splitHeader(pattern);
    const std::vector<std::string> inputMnemonics = splitHeader(input);
    std::vector<std::string>::size_type i = 0;
    for (; i < patternMnemonics.size() && i < inputMnemonics.size(); ++i) {
        if (compareIgnoringCase(patternMnemonics[i], inputMnemonics[i]) != 0) {
            const int result = compareIgnoringCase(shortForm(patternMnemonics[i]), inputMnemonics[i]);
            if (result != 0) {
                return result;
            }
        }
    }
    if (i < patternMnemonics.size()) {
        return 1;
    }
    if (i < inputMnemonics.size()) {
        return -1;
    }
    return 0;
}

const char* const c_szSystemErrorQuery = "SYSTem:ERRor?";
const char* const c_szOperationConditionQuery = "STATus:OPERation:CONDition?";
const char* const c_szFormatAscii = "format ascii";
const char* const c_szFormatReal32 = "format real,32";

} // namespace

int scpiCompare(const char* pattern, const char* input)
{
    if (pattern == input) {
        return 0;
    }
    if (pattern == nullptr) {
        return -1;
    }
    if (input == nullptr) {
        return 1;
    }
    return compareHeader(pattern, input);
}

CPmxScpiCommandParser& CPmxScpiCommandParser::getInstance()
{
    static CPmxScpiCommandParser s_cParser;
    return s_cParser;
}

CPmxScpiCommandParser::ECommandType CPmxScpiCommandParser::parse(const std::string& command) const
{
    // Trailing line ends and blanks do not change what a command is: clients end commands with
    // "\r\n" as readily as with "\n", and the format tests ignore them already.
    std::string text = command.substr(0, command.find('\n'));
    text.erase(text.find_last_not_of(" \r\t") + 1);
    if (isSystemErrorQuery(text)) {
        return COMMAND_SYSTEM_ERROR_QUERY;
    }
    if (isOperationConditionQuery(text)) {
        return COMMAND_OPERATION_CONDITION_QUERY;
    }
    if (isFormatAscii(text)) {
        return COMMAND_FORMAT_ASCII;
    }
    if (isFormatReal32(text)) {
        return COMMAND_FORMAT_REAL32;
    }
    return COMMAND_OTHER;
}

bool CPmxScpiCommandParser::isSystemErrorQuery(const std::string& text) const
{
    return !text.empty() && compareHeader(c_szSystemErrorQuery, text) == 0;
}

bool CPmxScpiCommandParser::isOperationConditionQuery(const std::string& text) const
{
    return !text.empty() && compareHeader(c_szOperationConditionQuery, text) == 0;
}

bool CPmxScpiCommandParser::isFormatAscii(const std::string& text) const
{
    return !text.empty() && normalize(text) == c_szFormatAscii;
}

bool CPmxScpiCommandParser::isFormatReal32(const std::string& text) const
{
    return !text.empty() && normalize(text) == c_szFormatReal32;
}

std::string CPmxScpiCommandParser::normalize(const std::string& text) const
{
    static const char* const trimmed = " \r\n\t";
    const std::string::size_type first = text.find_first_not_of(trimmed);
    if (first == std::string::npos) {
        return std::string();
    }
    const std::string::size_type last = text.find_last_not_of(trimmed);

    // One pass per rule; each pass leaves nothing the same rule would match again.
    std::string single;
    for (std::string::size_type i = first; i <= last; ++i) {
        if (text[i] != ' ' || single.empty() || single[single.size() - 1] != ' ') {
            single += text[i];
        }
    }
    std::string noBlankBeforeComma;
    for (std::string::size_type i = 0; i < single.size(); ++i) {
        if (!(single[i] == ' ' && i + 1 < single.size() && single[i + 1] == ',')) {
            noBlankBeforeComma += single[i];
        }
    }
    std::string result;
    for (char c : noBlankBeforeComma) {
        if (!(c == ' ' && !result.empty() && result[result.size() - 1] == ',')) {
            result += c;
        }
    }
    return result;
}

} // namespace LbPmxVisa
