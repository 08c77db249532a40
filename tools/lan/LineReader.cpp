#include "tools/lan/LineReader.h"

#include <cstring>

namespace LbPmxLan {

CLineReader::EResult CLineReader::next(std::string& line)
{
    std::size_t end = m_strBuffer.find('\n');
    std::size_t length = end == std::string::npos ? m_strBuffer.size() : end;
    if (std::memchr(m_strBuffer.data(), '\0', length) != nullptr || length > MAX_LINE) {
        m_strBuffer.clear();
        return RESULT_MALFORMED;
    }
    if (end == std::string::npos) {
        return RESULT_NEED_MORE;
    }
    line.assign(m_strBuffer, 0, end);
    m_strBuffer.erase(0, end + 1);
    if (!line.empty() && line.back() == '\r') {
        line.pop_back();
    }
    return RESULT_LINE;
}

bool isQuery(const std::string& line)
{
    char quote = 0;
    for (char c : line) {
        if (quote != 0) {
            if (c == quote)
                quote = 0;
        } else if (c == '"' || c == '\'') {
            quote = c;
        } else if (c == '?') {
            return true;
        }
    }
    return false;
}

} // namespace LbPmxLan
