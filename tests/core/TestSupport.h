#ifndef LBTESTS_CORE_TESTSUPPORT_H
#define LBTESTS_CORE_TESTSUPPORT_H
// Helpers shared by the core tests: a one-shot latch and a log appender that keeps lines.
#include "core/Log.h"

#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

namespace LbTests {

// Generous: a latch that is not opened within this time means the code under test hangs.
const std::chrono::seconds kDeadline(20);

class CLatch {
public:
    void open()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        m_bOpen = true;
        m_cCondition.notify_all();
    }
    bool waitOpen()
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, kDeadline, [this] { return m_bOpen; });
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
        return true;
    }
    std::vector<std::string> lines()
    {
        std::lock_guard<std::mutex> lock(m_cMutex);
        return m_cLines;
    }
    bool contains(const std::string& piece)
    {
        for (const std::string& line : lines()) {
            if (line.find(piece) != std::string::npos) {
                return true;
            }
        }
        return false;
    }

private:
    int m_nSavedLevel;
    std::mutex m_cMutex;
    std::vector<std::string> m_cLines;
};

} // namespace LbTests

#endif
