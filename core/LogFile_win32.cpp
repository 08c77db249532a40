#include "core/LogFile.h"

#include <cctype>
#include <cstdio>
#include <windows.h>

namespace LbCore {

namespace {
// How long a line waits for the writers of other processes before it is written anyway.
const DWORD WRITERS_WAIT_MS = 1000;

// One mutex per log file, named after its full path (letter case folded), shared by every
// process that logs to the file. A mutex, unlike a lock on the file, is released when a thread
// holding it ends, as threads do at process exit.
HANDLE writersMutex(const std::string& path)
{
    char full[MAX_PATH];
    DWORD length = GetFullPathNameA(path.c_str(), sizeof full, full, nullptr);
    const char* name = length > 0 && length < sizeof full ? full : path.c_str();
    unsigned long long hash = 14695981039346656037ull; // FNV-1a
    for (const char* c = name; *c != '\0'; ++c) {
        hash = (hash ^ static_cast<unsigned char>(std::tolower(static_cast<unsigned char>(*c)))) * 1099511628211ull;
    }
    char mutexName[64];
    std::snprintf(mutexName, sizeof mutexName, "LbCoreLogFile-%016llx", hash);
    return CreateMutexA(nullptr, FALSE, mutexName);
}
} // namespace

// FILE_APPEND_DATA without FILE_WRITE_DATA makes every write go to the end of the file. A failed
// open gives INVALID_HANDLE_VALUE, which is CLOSED.
CLogFile::CLogFile(const std::string& path)
    : m_nHandle(reinterpret_cast<std::intptr_t>(CreateFileA(path.c_str(), FILE_APPEND_DATA,
                                                            FILE_SHARE_READ | FILE_SHARE_WRITE | FILE_SHARE_DELETE,
                                                            nullptr, OPEN_ALWAYS, FILE_ATTRIBUTE_NORMAL, nullptr))),
      m_pvWriters(isOpen() ? writersMutex(path) : nullptr)
{
}

CLogFile::~CLogFile()
{
    if (m_pvWriters != nullptr) {
        CloseHandle(static_cast<HANDLE>(m_pvWriters));
    }
    if (isOpen()) {
        CloseHandle(reinterpret_cast<HANDLE>(m_nHandle));
    }
}

// Appending handles alone do not keep the lines of several writers apart everywhere (Wine), so
// the writers take turns.
bool CLogFile::appendLine(const std::string& text)
{
    if (!isOpen()) {
        return false;
    }
    m_sLine.assign(text).append("\r\n");
    HANDLE writers = static_cast<HANDLE>(m_pvWriters);
    const DWORD waited = writers != nullptr ? WaitForSingleObject(writers, WRITERS_WAIT_MS) : WAIT_FAILED;
    const bool owned = waited == WAIT_OBJECT_0 || waited == WAIT_ABANDONED;
    DWORD written = 0;
    const bool ok = WriteFile(reinterpret_cast<HANDLE>(m_nHandle), m_sLine.data(), static_cast<DWORD>(m_sLine.size()),
                              &written, nullptr) != 0 &&
                    written == m_sLine.size();
    if (owned) {
        ReleaseMutex(writers);
    }
    return ok;
}

} // namespace LbCore
