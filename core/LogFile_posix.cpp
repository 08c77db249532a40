#include "core/LogFile.h"

#include <cerrno>
#include <fcntl.h>
#include <unistd.h>

namespace LbCore {

CLogFile::CLogFile(const std::string& path)
    : m_nHandle(::open(path.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC, 0666))
{
}

CLogFile::~CLogFile()
{
    if (isOpen()) {
        ::close(static_cast<int>(m_nHandle));
    }
}

bool CLogFile::appendLine(const std::string& text)
{
    if (!isOpen()) {
        return false;
    }
    m_sLine.assign(text).push_back('\n');
    const char* data = m_sLine.data();
    std::size_t left = m_sLine.size();
    while (left > 0) { // a regular file takes the line in one write; a signal may cut it short
        ssize_t written = ::write(static_cast<int>(m_nHandle), data, left);
        if (written < 0) {
            if (errno == EINTR) {
                continue;
            }
            return false;
        }
        data += written;
        left -= static_cast<std::size_t>(written);
    }
    return true;
}

} // namespace LbCore
