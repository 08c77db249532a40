#ifndef LBTESTS_SENSOR_SENSORTESTSUPPORT_H
#define LBTESTS_SENSOR_SENSORTESTSUPPORT_H
// Helpers of the sensor-layer tests: a one-shot gate and a log appender that keeps the lines
// and lets a test wait for one to appear.
#include "core/Log.h"

#include <algorithm>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <string>
#include <vector>

namespace LbTests {

// Generous: a gate that is not opened within this time means the code under test hangs.
const std::chrono::seconds kSensorDeadline(20);

class CGate {
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
        return m_cCondition.wait_for(lock, kSensorDeadline, [this] { return m_bOpen; });
    }
    // For checks that something has NOT happened yet: a short, bounded look.
    bool waitOpenFor(std::chrono::milliseconds wait)
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

// Attaches itself for its lifetime at DEBUG level and restores the threshold it found.
class CLogCapture : public LbCore::CILogAppender {
public:
    CLogCapture() : m_nSavedLevel(LbCore::CLogManager::getLevel())
    {
        LbCore::CLogManager::setLevel(LbCore::LEVEL_DEBUG);
        LbCore::CLogManager::attach(*this);
    }
    ~CLogCapture() override
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
    std::size_t count(const std::string& piece) { return matching(piece).size(); }
    bool waitFor(const std::string& piece)
    {
        std::unique_lock<std::mutex> lock(m_cMutex);
        return m_cCondition.wait_for(lock, kSensorDeadline, [&] {
            return std::any_of(m_cLines.begin(), m_cLines.end(),
                               [&](const std::string& line) { return line.find(piece) != std::string::npos; });
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
