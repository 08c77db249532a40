#ifndef LBCORE_LOG_H
#define LBCORE_LOG_H
// Logging. A class takes a CLogMessage of a level and an operation from its file-level CLogger,
// which writes the fully qualified operation name and " - ", and streams the text into it; the
// line is handed to every attached appender when the last copy of the message is destroyed.
// Line format:
//   <short date> <24-hour time> [<LEVEL>] <logger name> - <what the caller streamed>
// A message below the manager's threshold, or made while no appender is attached, builds
// nothing and allocates nothing: it costs one comparison per insertion and is dropped.
// Control characters in what is streamed are written escaped ("\n", "\x00"), so one message
// is always one printable line. CLogManager is the composite appender fanning lines out, one
// at a time, to the appenders.
#include "core/Command.h"
#include "core/Lock.h"
#include "core/LogFile.h"
#include "core/Parent.h"
#include "core/Subject.h"

#include <atomic>
#include <boost/noncopyable.hpp>
#include <boost/shared_ptr.hpp>
#include <exception>
#include <ostream>
#include <sstream>
#include <streambuf>
#include <string>
#include <type_traits>

namespace LbCore {

// Log levels; the enumerators carry a prefix because Windows headers define ERROR as a macro.
enum ELogLevel { LEVEL_DEBUG = 0, LEVEL_INFO = 1, LEVEL_WARN = 2, LEVEL_ERROR = 3, LEVEL_FATAL = 4 };

class CLogMessage;
class CLogger;

class CILogAppender {
public:
    virtual ~CILogAppender() { }
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
    // True while at least one appender is attached: without one, no line needs building.
    static bool hasAppenders();

    // Fans the line out to the attached appenders; true when at least one wrote it.
    bool append(const CLogMessage& message) override;

private:
    CLogManager();
    ~CLogManager() override;

    std::atomic<int> m_eLevel;
    std::atomic<int> m_nAppenders;
    CSubject<CILogAppender, bool(const CLogMessage&)> m_cAppenders;
    CCriticalSection m_cLock;
};

// Appends each line to a file (opened in append mode, shared with other processes), each line
// written whole at the end of the file at once. A file that cannot be opened leaves the appender
// detached and silent.
class CLogFileAppender : public CILogAppender, private boost::noncopyable {
public:
    explicit CLogFileAppender(const std::string& path);
    ~CLogFileAppender() override;
    bool append(const CLogMessage& message) override;
    bool isOpen() const { return m_cFile.isOpen(); }

private:
    CLogFile m_cFile;
};

class CLogger : public CParent<CLogManager> {
public:
    CLogger(CLogManager* manager, const std::string& name);

    CLogMessage debug();
    CLogMessage info();
    CLogMessage warn();
    CLogMessage error();
    CLogMessage fatal();
    // The same, with the line's operation prefix already written: "<operation> - ".
    CLogMessage debug(const char* operation);
    CLogMessage info(const char* operation);
    CLogMessage warn(const char* operation);
    CLogMessage error(const char* operation);
    CLogMessage fatal(const char* operation);
    std::string getName() const;

private:
    CLogMessage begin(ELogLevel level, const char* operation);

    std::string m_sName;
};

// The text of one line: a stream that appends to a string and writes every control character
// (below 0x20, and 0x7F) escaped: "\n", "\r", "\t", otherwise "\x" and two hex digits. Other
// bytes, the backslash included, are written as they are.
class CLogText : private std::streambuf, public std::ostream {
public:
    CLogText() : std::ostream(static_cast<std::streambuf*>(this)) { }
    const std::string& str() const { return m_sText; }

private:
    std::streambuf::int_type overflow(std::streambuf::int_type character) override;
    std::streamsize xsputn(const char* text, std::streamsize count) override;

    std::string m_sText;
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
    template <class T> CLogMessage& operator<<(const T& value)
    {
        if (!isEnabled() || !m_pcText) {
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
    // Shared by the copies of a message; null when the message was not built.
    boost::shared_ptr<CLogText> m_pcText;
};

} // namespace LbCore

#endif
