// Written commands from applications: the parser classifies any bytes without failing, only
// the text before the first line feed counts, normalising agrees with the plain step-by-step
// rules and is idempotent, and scpiCompare takes any pair of headers (the input split at its
// first NUL byte), answers -1, 0 or 1 and finds every header a form of itself.
#include "sensor/PmxScpiCommandParser.h"

#include <cstdint>
#include <cstdlib>
#include <string>

using LbPmxVisa::CPmxScpiCommandParser;

namespace {

std::string normalizeStepByStep(const std::string& text)
{
    const char* const trimmed = " \r\n\t";
    const std::string::size_type first = text.find_first_not_of(trimmed);
    if (first == std::string::npos) {
        return std::string();
    }
    std::string result = text.substr(first, text.find_last_not_of(trimmed) - first + 1);
    for (std::string::size_type at; (at = result.find("  ")) != std::string::npos;) {
        result.erase(at, 1);
    }
    for (std::string::size_type at; (at = result.find(" ,")) != std::string::npos;) {
        result.erase(at, 1);
    }
    for (std::string::size_type at; (at = result.find(", ")) != std::string::npos;) {
        result.erase(at + 1, 1);
    }
    return result;
}

void check(bool condition)
{
    if (!condition) {
        std::abort();
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string input(reinterpret_cast<const char*>(data), size);
    const CPmxScpiCommandParser& parser = CPmxScpiCommandParser::getInstance();

    const CPmxScpiCommandParser::ECommandType kind = parser.parse(input);
    check(kind >= CPmxScpiCommandParser::COMMAND_OTHER && kind <= CPmxScpiCommandParser::COMMAND_FORMAT_REAL32);
    check(kind == parser.parse(input.substr(0, input.find('\n'))));

    const std::string normalized = parser.normalize(input);
    check(normalized == normalizeStepByStep(input));
    check(normalized == parser.normalize(normalized));

    // Both halves end at a NUL: the second one at the end of the input copy.
    const std::string::size_type split = input.find('\0');
    const std::string pattern = input.substr(0, split);
    const std::string header = split == std::string::npos ? std::string() : input.substr(split + 1);
    const int forward = LbPmxVisa::scpiCompare(pattern.c_str(), header.c_str());
    LbPmxVisa::scpiCompare(header.c_str(), pattern.c_str());
    const std::string same(pattern);
    check(LbPmxVisa::scpiCompare(pattern.c_str(), same.c_str()) == 0);
    check(forward >= -1 && forward <= 1);
    LbPmxVisa::scpiCompare("FETCh?", header.c_str());
    return 0;
}
