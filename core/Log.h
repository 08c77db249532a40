#ifndef LBCORE_LOG_H
#define LBCORE_LOG_H
// Logging. A class takes a CLogMessage of a level from its file-level CLogger, streams the
// fully qualified operation name, " - " and the text into it; the line is handed to every
// attached appender when the last copy of the message is destroyed. Line format:
//   <short date> <24-hour time> [<LEVEL>] <logger name> - <what the caller streamed>
// Messages below the manager's threshold cost one comparison per insertion and are dropped.
// CLogManager is the composite appender fanning lines out, one at a time, to the appenders.
#include "core/Command.h"
#include "core/Lock.h"
#include "core/Parent.h"
#include "core/Subject.h"

#include <atomic>
#include <boost/noncopyable.hpp>
#include <boost/shared_ptr.hpp>
#include <exception>
#include <fstream>
#include <sstream>
#include <string>
#include <type_traits>

namespace LbCore {

// Log levels; the enumerators carry a prefix because Windows headers define ERROR as a macro.
enum ELogLevel {
    LEVEL_DEBUG = 0,
    LEVEL_INFO = 1,
    LEVEL_WARN = 2,
    LEVEL_ERROR = 3,
    LEVEL_FATAL = 4
};

class CLogMessage;
class CLogger;

class CILogAppender {
public:
    virtual ~CILogAppender() {}
    // True when the line was written.
    virtual bool append(const CLogMessage& message) = 0;
};

class CLogManager : private CILogAppender {
public:
    static CLogManager& getInstance();
    static CLogger getLogger(const std::string& name);
    static void setLevel(int level);
    static int getLevel();
    static bool attach(CILogAppender& appender);
    static bool detach(CILogAppender& appender);

    // Fans the line out to the attached appenders; true when at least one wrote it.
    bool append(const CLogMessage& message) override;

private:
    CLogManager();
    ~CLogManager() override;

    std::atomic<int> m_eLevel;
    CSubject<CILogAppender, bool(const CLogMessage&)> m_cAppenders;
    CCriticalSection m_cLock;
};

// Appends each line to a file (opened in append mode, shared with other processes) and
// flushes it. A file that cannot be opened leaves the appender detached and silent.
class CLogFileAppender : public CILogAppender, private boost::noncopyable {
public:
    explicit CLogFileAppender(const std::string& path);
    ~CLogFileAppender() override;
    bool append(const CLogMessage& message) override;
    bool isOpen() const { return m_cFile.is_open(); }

private:
    std::ofstream m_cFile;
};

class CLogger : public CParent<CLogManager> {
public:
    CLogger(CLogManager* manager, const std::string& name);

    CLogMessage debug();
    CLogMessage info();
    CLogMessage warn();
    CLogMessage error();
    CLogMessage fatal();
    std::string getName() const;

private:
    std::string m_sName;
};

class CLogMessage : public CParent<CLogger> {
public:
    typedef CISerializer<CLogMessage&, void> CSerializer;

    CLogMessage(CLogger* logger, ELogLevel level);
    // Copies share the text stream; the line is emitted once, by the last copy destroyed.
    CLogMessage(const CLogMessage& other) = default;
    CLogMessage& operator=(const CLogMessage& other) = delete;
    ~CLogMessage() override;

    bool isEnabled() const;
    ELogLevel getLevel() const { return m_eLevel; }
    std::string getText() const;

    // Streams a value with the stream's default formatting; an exception streams its what()
    // text and an object that serializes itself into log messages writes itself.
    template <class T>
    CLogMessage& operator<<(const T& value)
    {
        if (!isEnabled()) {
            return *this;
        }
        if constexpr (std::is_base_of<std::exception, T>::value) {
            *m_pcText << value.what();
        } else if constexpr (std::is_convertible<const T&, const CSerializer*>::value) {
            const CSerializer* serializer = value;
            serializer->serialize(*this);
        } else {
            *m_pcText << value;
        }
        return *this;
    }

private:
    ELogLevel m_eLevel;
    boost::shared_ptr<std::ostringstream> m_pcText;
};

} // namespace LbCore

#endif
