#ifndef LBCORE_LOGFILE_H
#define LBCORE_LOGFILE_H
// Internal to core/: the file behind CLogFileAppender, one implementation per platform. Opened
// for appending (created if missing, content kept) and shared with other processes. Each line,
// with the platform's line end, reaches the end of the file in one system write, and on Windows
// the processes writing to one file take turns, so their lines never overlap (std::ofstream's
// append mode seeks and writes in two steps on Windows).
#include <cstdint>
#include <string>

namespace LbCore {

class CLogFile {
public:
    explicit CLogFile(const std::string& path);
    ~CLogFile();
    CLogFile(const CLogFile&) = delete;
    CLogFile& operator=(const CLogFile&) = delete;

    bool isOpen() const { return m_nHandle != CLOSED; }
    // Appends the text and a line end; false when the file is not open or the write failed.
    bool appendLine(const std::string& text);

private:
    static constexpr std::intptr_t CLOSED = -1;
    std::intptr_t m_nHandle; // a file descriptor, or a Windows HANDLE
#if defined(_WIN32)
    void* m_pvWriters; // the mutex the processes writing to the file take turns with
#endif
    std::string m_sLine; // the line being written, kept to reuse its storage
};

} // namespace LbCore

#endif
