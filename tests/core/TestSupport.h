#ifndef LBTESTS_CORE_TESTSUPPORT_H
#define LBTESTS_CORE_TESTSUPPORT_H
// Helpers shared by the core tests: a one-shot latch and a log appender that keeps lines.
#include "core/Log.h"
#include "tests/Waiting.h"

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

namespace LbTests {

class CLatch {
public:
    void open()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        m_bOpen = true;
        m_cCondition.notify_all();
    }
    bool waitOpen() { return waitOpenFor(DEADLINE); }
    // For checks that something has NOT happened yet: a short, bounded look.
    template <class Duration> bool waitOpenFor(Duration wait)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, wait, [this] { return m_bOpen; });
    }
    bool isOpen()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_bOpen;
    }

private:
    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    bool m_bOpen = false;
};

// Attaches itself for its lifetime and restores the log threshold it found.
class CCaptureAppender : public LbCore::CILogAppender {
public:
    CCaptureAppender() : m_nSavedLevel(LbCore::CLogManager::getLevel()) { LbCore::CLogManager::attach(*this); }
    ~CCaptureAppender() override
    {
        LbCore::CLogManager::detach(*this);
        LbCore::CLogManager::setLevel(m_nSavedLevel);
    }
    bool append(const LbCore::CLogMessage& message) override
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        m_cLines.push_back(message.getText());
        m_cCondition.notify_all();
        return true;
    }
    std::vector<std::string> lines()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_cLines;
    }
    // Lines that contain the piece, in order.
    std::vector<std::string> matching(const std::string& piece)
    {
        std::vector<std::string> found;
        for (const std::string& line : lines()) {
            if (line.find(piece) != std::string::npos) {
                found.push_back(line);
            }
        }
        return found;
    }
    bool contains(const std::string& piece) { return !matching(piece).empty(); }
    std::size_t count(const std::string& piece) { return matching(piece).size(); }
    // Waits (generously) until a line with the piece has been written.
    bool waitFor(const std::string& piece)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, DEADLINE, [&] {
            for (const std::string& line : m_cLines) {
                if (line.find(piece) != std::string::npos) {
                    return true;
                }
            }
            return false;
        });
    }

private:
    int m_nSavedLevel;
    std::mutex m_cMutex;
    std::condition_variable m_cCondition;
    std::vector<std::string> m_cLines;
};

} // namespace LbTests

#endif
