#include "core/Log.h"

#include "core/LogTime.h"

namespace LbCore {

namespace {
const char* levelText(ELogLevel level)
{
    switch (level) {
    case LEVEL_DEBUG: return "DEBUG";
    case LEVEL_INFO: return "INFO ";
    case LEVEL_WARN: return "WARN ";
    case LEVEL_ERROR: return "ERROR";
    case LEVEL_FATAL: return "FATAL";
    }
    return "?????";
}
} // namespace

// ---- CLogManager

CLogManager::CLogManager() : m_eLevel(LEVEL_DEBUG), m_cAppenders(&CILogAppender::append, false) {}

CLogManager::~CLogManager() {}

CLogManager& CLogManager::getInstance()
{
    static CLogManager s_cManager;
    return s_cManager;
}

CLogger CLogManager::getLogger(const std::string& name)
{
    return CLogger(&getInstance(), name);
}

void CLogManager::setLevel(int level)
{
    getInstance().m_eLevel = level;
}

int CLogManager::getLevel()
{
    return getInstance().m_eLevel;
}

bool CLogManager::attach(CILogAppender& appender)
{
    CLogManager& manager = getInstance();
    CLock<CCriticalSection> lock(manager.m_cLock);
    return manager.m_cAppenders.attach(appender);
}

bool CLogManager::detach(CILogAppender& appender)
{
    CLogManager& manager = getInstance();
    CLock<CCriticalSection> lock(manager.m_cLock);
    return manager.m_cAppenders.detach(appender);
}

bool CLogManager::append(const CLogMessage& message)
{
    CLock<CCriticalSection> lock(m_cLock);
    return m_cAppenders.notify(message);
}

// ---- CLogFileAppender

CLogFileAppender::CLogFileAppender(const std::string& path) : m_cFile(path.c_str(), std::ios::out | std::ios::app)
{
    if (m_cFile.is_open()) {
        CLogManager::attach(*this);
    }
}

CLogFileAppender::~CLogFileAppender()
{
    if (m_cFile.is_open()) {
        // Detach first: once detached no other thread can be inside append().
        CLogManager::detach(*this);
        m_cFile.close();
    }
}

bool CLogFileAppender::append(const CLogMessage& message)
{
    if (!m_cFile.is_open()) {
        return false;
    }
    m_cFile << message.getText() << '\n';
    m_cFile.flush();
    return m_cFile.good();
}

// ---- CLogger

CLogger::CLogger(CLogManager* manager, const std::string& name) : CParent<CLogManager>(manager), m_sName(name) {}

CLogMessage CLogger::debug() { return CLogMessage(this, LEVEL_DEBUG); }
CLogMessage CLogger::info() { return CLogMessage(this, LEVEL_INFO); }
CLogMessage CLogger::warn() { return CLogMessage(this, LEVEL_WARN); }
CLogMessage CLogger::error() { return CLogMessage(this, LEVEL_ERROR); }
CLogMessage CLogger::fatal() { return CLogMessage(this, LEVEL_FATAL); }

std::string CLogger::getName() const
{
    return m_sName;
}

// ---- CLogMessage

CLogMessage::CLogMessage(CLogger* logger, ELogLevel level)
    : CParent<CLogger>(logger), m_eLevel(level), m_pcText(new std::ostringstream)
{
    if (!isEnabled()) {
        return;
    }
    std::string date;
    std::string time;
    LogTime::format(date, time);
    *m_pcText << date << " " << time << " [" << levelText(m_eLevel) << "] " << getParent()->getName() << " - ";
}

CLogMessage::~CLogMessage()
{
    // Only the last copy emits, so a message handed around by value makes one line. A
    // destructor must not throw: a message without logger or manager is simply dropped.
    if (m_pcText.use_count() != 1) {
        return;
    }
    try {
        if (isEnabled()) {
            getParent()->getParent()->append(*this);
        }
    } catch (...) {
    }
}

bool CLogMessage::isEnabled() const
{
    getParent()->getParent();
    return CLogManager::getLevel() <= m_eLevel;
}

std::string CLogMessage::getText() const
{
    return m_pcText->str();
}

} // namespace LbCore
