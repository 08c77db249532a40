#include "core/Log.h"

#include "core/LogTime.h"

#include <boost/make_shared.hpp>

namespace LbCore {

namespace {
const char* levelText(ELogLevel level)
{
    switch (level) {
    case LEVEL_DEBUG:
        return "DEBUG";
    case LEVEL_INFO:
        return "INFO ";
    case LEVEL_WARN:
        return "WARN ";
    case LEVEL_ERROR:
        return "ERROR";
    case LEVEL_FATAL:
        return "FATAL";
    }
    return "?????";
}

bool isControl(char character)
{
    unsigned char byte = static_cast<unsigned char>(character);
    return byte < 0x20 || byte == 0x7F;
}

void appendEscaped(std::string& line, char character)
{
    switch (character) {
    case '\n':
        line += "\\n";
        return;
    case '\r':
        line += "\\r";
        return;
    case '\t':
        line += "\\t";
        return;
    }
    static const char s_acDigits[] = "0123456789abcdef";
    unsigned char byte = static_cast<unsigned char>(character);
    const char escaped[4] = {'\\', 'x', s_acDigits[byte >> 4], s_acDigits[byte & 0xF]};
    line.append(escaped, sizeof escaped);
}
} // namespace

// ---- CLogText

std::streambuf::int_type CLogText::overflow(std::streambuf::int_type character)
{
    typedef std::streambuf::traits_type CTraits;
    if (!CTraits::eq_int_type(character, CTraits::eof())) {
        char text = CTraits::to_char_type(character);
        xsputn(&text, 1);
    }
    return CTraits::not_eof(character);
}

std::streamsize CLogText::xsputn(const char* text, std::streamsize count)
{
    const char* end = text + count;
    while (text != end) {
        const char* plain = text;
        while (plain != end && !isControl(*plain)) {
            ++plain;
        }
        m_sText.append(text, plain);
        if (plain == end) {
            break;
        }
        appendEscaped(m_sText, *plain);
        text = plain + 1;
    }
    return count;
}

// ---- CLogManager

CLogManager::CLogManager() : m_eLevel(LEVEL_DEBUG), m_nAppenders(0), m_cAppenders(&CILogAppender::append, false) { }

CLogManager::~CLogManager() { }

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
    if (!manager.m_cAppenders.attach(appender)) {
        return false;
    }
    ++manager.m_nAppenders;
    return true;
}

bool CLogManager::detach(CILogAppender& appender)
{
    CLogManager& manager = getInstance();
    CLock<CCriticalSection> lock(manager.m_cLock);
    if (!manager.m_cAppenders.detach(appender)) {
        return false;
    }
    --manager.m_nAppenders;
    return true;
}

bool CLogManager::hasAppenders()
{
    return getInstance().m_nAppenders.load(std::memory_order_relaxed) > 0;
}

bool CLogManager::append(const CLogMessage& message)
{
    CLock<CCriticalSection> lock(m_cLock);
    return m_cAppenders.notify(message);
}

// ---- CLogFileAppender

CLogFileAppender::CLogFileAppender(const std::string& path) : m_cFile(path)
{
    if (m_cFile.isOpen()) {
        CLogManager::attach(*this);
    }
}

CLogFileAppender::~CLogFileAppender()
{
    if (m_cFile.isOpen()) {
        // Detach first: once detached no other thread can be inside append().
        CLogManager::detach(*this);
    }
}

bool CLogFileAppender::append(const CLogMessage& message)
{
    return m_cFile.appendLine(message.getText());
}

// ---- CLogger

CLogger::CLogger(CLogManager* manager, const std::string& name) : CParent<CLogManager>(manager), m_sName(name) { }

CLogMessage CLogger::debug()
{
    return CLogMessage(this, LEVEL_DEBUG);
}
CLogMessage CLogger::info()
{
    return CLogMessage(this, LEVEL_INFO);
}
CLogMessage CLogger::warn()
{
    return CLogMessage(this, LEVEL_WARN);
}
CLogMessage CLogger::error()
{
    return CLogMessage(this, LEVEL_ERROR);
}
CLogMessage CLogger::fatal()
{
    return CLogMessage(this, LEVEL_FATAL);
}

CLogMessage CLogger::debug(const char* operation)
{
    return begin(LEVEL_DEBUG, operation);
}
CLogMessage CLogger::info(const char* operation)
{
    return begin(LEVEL_INFO, operation);
}
CLogMessage CLogger::warn(const char* operation)
{
    return begin(LEVEL_WARN, operation);
}
CLogMessage CLogger::error(const char* operation)
{
    return begin(LEVEL_ERROR, operation);
}
CLogMessage CLogger::fatal(const char* operation)
{
    return begin(LEVEL_FATAL, operation);
}

CLogMessage CLogger::begin(ELogLevel level, const char* operation)
{
    CLogMessage message(this, level);
    message << operation << " - ";
    return message;
}

std::string CLogger::getName() const
{
    return m_sName;
}

// ---- CLogMessage

CLogMessage::CLogMessage(CLogger* logger, ELogLevel level) : CParent<CLogger>(logger), m_eLevel(level)
{
    // Whether the line is wanted is decided here, once: a message that starts unwanted stays
    // empty and silent even if the threshold falls or an appender arrives before it ends, as
    // a line without its head would be no use.
    if (!isEnabled() || !CLogManager::hasAppenders()) {
        return;
    }
    m_pcText = boost::make_shared<CLogText>();
    std::string date;
    std::string time;
    LogTime::format(date, time);
    *m_pcText << date << " " << time << " [" << levelText(m_eLevel) << "] " << getParent()->getName() << " - ";
}

CLogMessage::~CLogMessage()
{
    // Only the last copy emits, so a message handed around by value makes one line. A
    // destructor must not throw: a message without logger or manager is simply dropped.
    if (!m_pcText || m_pcText.use_count() != 1) {
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
    return m_pcText ? m_pcText->str() : std::string();
}

} // namespace LbCore
