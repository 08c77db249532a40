// Splits the byte stream of a raw SCPI socket into command lines: a line ends at a line feed,
// a carriage return before it is dropped. A line longer than the limit or holding a zero byte
// is malformed, and the connection is closed after an error line.
#ifndef LBPMX_LAN_LINEREADER_H
#define LBPMX_LAN_LINEREADER_H

#include <cstddef>
#include <string>

namespace LbPmxLan {

constexpr std::size_t MAX_LINE = 65536;

class CLineReader {
public:
    enum EResult { RESULT_LINE, RESULT_NEED_MORE, RESULT_MALFORMED };
    // Adds received bytes.
    void feed(const char* data, std::size_t size) { m_strBuffer.append(data, size); }
    // Takes the next complete line out of what was fed.
    EResult next(std::string& line);

private:
    std::string m_strBuffer;
};

// True when a command line asks for an answer: a '?' outside quoted strings.
bool isQuery(const std::string& line);

} // namespace LbPmxLan

#endif
