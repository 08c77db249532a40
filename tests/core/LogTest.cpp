#include "core/Log.h"
#include "tests/core/TestSupport.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <fstream>
#include <new>
#include <regex>
#include <stdexcept>
#include <thread>

using namespace LbCore;

// Every allocation of this test program is counted, so a case can check that an operation
// allocates nothing. All forms are replaced, so that sanitizers see matching pairs.
static std::atomic<unsigned long> s_nAllocations(0);

static void* countedAllocation(std::size_t size) noexcept
{
    ++s_nAllocations;
    return std::malloc(size == 0 ? 1 : size);
}

void* operator new(std::size_t size)
{
    if (void* memory = countedAllocation(size)) {
        return memory;
    }
    throw std::bad_alloc();
}
void* operator new[](std::size_t size)
{
    return operator new(size);
}
void* operator new(std::size_t size, const std::nothrow_t&) noexcept
{
    return countedAllocation(size);
}
void* operator new[](std::size_t size, const std::nothrow_t&) noexcept
{
    return countedAllocation(size);
}
// GCC takes free() after an inlined operator new for a mismatch; here both are malloc's.
#if defined(__GNUC__) && !defined(__clang__)
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wmismatched-new-delete"
#endif
void operator delete(void* memory) noexcept
{
    std::free(memory);
}
void operator delete(void* memory, std::size_t) noexcept
{
    std::free(memory);
}
void operator delete[](void* memory) noexcept
{
    std::free(memory);
}
void operator delete[](void* memory, std::size_t) noexcept
{
    std::free(memory);
}
void operator delete(void* memory, const std::nothrow_t&) noexcept
{
    std::free(memory);
}
void operator delete[](void* memory, const std::nothrow_t&) noexcept
{
    std::free(memory);
}
#if defined(__GNUC__) && !defined(__clang__)
#pragma GCC diagnostic pop
#endif

namespace {

// <date> <H:MM:SS> [LEVEL] logger - text. The date follows the system locale's short form; a
// locale whose time picture has a marker (en-US "h:mm:ss tt") keeps it after the forced
// 24-hour time on Windows, e.g. "19:12:53 PM".
const char* const LOG_LINE_HEAD =
    R"(^[0-9]{1,4}[./-][0-9]{1,2}[./-][0-9]{1,4} ([0-9]{1,2}):[0-5][0-9]:[0-5][0-9](?: [AP]M)? )";

std::string tempPath(const std::string& name)
{
    return ::testing::TempDir() + "lbcore_" + name;
}

std::vector<std::string> readLines(const std::string& path)
{
    std::vector<std::string> lines;
    std::ifstream file(path.c_str());
    for (std::string line; std::getline(file, line);) {
        lines.push_back(line);
    }
    return lines;
}

int localHour()
{
    std::time_t now = std::time(nullptr);
    return std::localtime(&now)->tm_hour;
}

class CSelfWriter : public CLogMessage::CSerializer {
public:
    void serialize(CLogMessage& message) const override { message << "session 0x0003::" << 100000; }
};

class CLogTest : public ::testing::Test {
protected:
    CLogTest() : m_cLogger(CLogManager::getLogger("CTestLogger")) { CLogManager::setLevel(LEVEL_DEBUG); }
    LbTests::CCaptureAppender m_cCapture; // restores the threshold and detaches itself
    CLogger m_cLogger;
};

} // namespace

TEST_F(CLogTest, LineCarriesDateTimeLevelLoggerAndPieces)
{
    int before = localHour();
    m_cLogger.warn("LbCore::CTest::op") << "value " << 42 << ' ' << 7u << ' ' << 18446744073709551615ull;
    int after = localHour();
    std::vector<std::string> lines = m_cCapture.lines();
    ASSERT_EQ(1u, lines.size());
    std::smatch match;
    std::regex line(std::string(LOG_LINE_HEAD) +
                    R"(\[WARN \] CTestLogger - LbCore::CTest::op - value 42 7 18446744073709551615$)");
    ASSERT_TRUE(std::regex_search(lines[0], match, line)) << lines[0];
    int hour = std::stoi(match[1].str()); // a 24-hour clock: the hour is the local tm_hour
    EXPECT_TRUE(hour == before || hour == after) << lines[0];
}

TEST_F(CLogTest, LevelTextIsAlwaysFiveCharacters)
{
    m_cLogger.debug() << "d";
    m_cLogger.info() << "i";
    m_cLogger.warn() << "w";
    m_cLogger.error() << "e";
    m_cLogger.fatal() << "f";
    const char* expected[] = {"[DEBUG] CTestLogger - d", "[INFO ] CTestLogger - i", "[WARN ] CTestLogger - w",
                              "[ERROR] CTestLogger - e", "[FATAL] CTestLogger - f"};
    std::vector<std::string> lines = m_cCapture.lines();
    ASSERT_EQ(5u, lines.size());
    for (int i = 0; i < 5; ++i) {
        EXPECT_TRUE(std::regex_search(lines[i], std::regex(std::string(LOG_LINE_HEAD) + "\\" + expected[i] + "$")))
            << lines[i];
    }
}

TEST_F(CLogTest, ThresholdFiltersMessagesAndInsertions)
{
    CLogManager::setLevel(LEVEL_WARN);
    {
        CLogMessage info = m_cLogger.info();
        info << "ignored" << 1;
        EXPECT_FALSE(info.isEnabled());
        EXPECT_EQ("", info.getText()); // no head, no text
    }
    m_cLogger.warn() << "w";
    m_cLogger.error() << "e";
    m_cLogger.fatal() << "f";
    {
        CLogMessage late = m_cLogger.warn();
        late << "raised before emission";
        CLogManager::setLevel(LEVEL_ERROR); // the threshold is read again at emission
    }
    std::vector<std::string> lines = m_cCapture.lines();
    ASSERT_EQ(3u, lines.size());
    EXPECT_NE(std::string::npos, lines[0].find("[WARN ] CTestLogger - w"));
    EXPECT_NE(std::string::npos, lines[1].find("[ERROR] CTestLogger - e"));
    EXPECT_NE(std::string::npos, lines[2].find("[FATAL] CTestLogger - f"));
}

TEST_F(CLogTest, StreamsExceptionsAndSelfWritingObjects)
{
    CSelfWriter writer;
    m_cLogger.error() << std::runtime_error("boom") << " / " << &writer;
    ASSERT_EQ(1u, m_cCapture.lines().size());
    EXPECT_NE(std::string::npos, m_cCapture.lines()[0].find("CTestLogger - boom / session 0x0003::100000"));
}

TEST_F(CLogTest, AttachRefusesDuplicatesAndEmptyManagerAppendsNothing)
{
    EXPECT_FALSE(CLogManager::attach(m_cCapture));
    EXPECT_TRUE(CLogManager::detach(m_cCapture));
    EXPECT_FALSE(CLogManager::detach(m_cCapture));
    {
        CLogMessage message = m_cLogger.info();
        message << "nobody listens";
        EXPECT_FALSE(CLogManager::getInstance().append(message));
    }
    EXPECT_TRUE(m_cCapture.lines().empty());
    EXPECT_TRUE(CLogManager::attach(m_cCapture));
}

TEST_F(CLogTest, MissingParentsThrow)
{
    CLogger orphan(nullptr, "COrphan");
    EXPECT_THROW(orphan.info(), std::runtime_error);
    try {
        CLogMessage message(nullptr, LEVEL_ERROR);
        FAIL() << "a message without logger was built";
    } catch (const std::runtime_error& e) {
        EXPECT_STREQ("NULL pointer m_pcParent", e.what());
    }
}

TEST_F(CLogTest, FileAppenderAppendsToExistingContent)
{
    const std::string path = tempPath("append.log");
    std::remove(path.c_str());
    {
        std::ofstream earlier(path.c_str());
        earlier << "line of an earlier run\n";
    }
    for (const char* text : {"first", "second"}) {
        CLogFileAppender appender(path);
        EXPECT_TRUE(appender.isOpen());
        m_cLogger.info() << text;
    }
    m_cLogger.info() << "after the appender is gone";
    std::vector<std::string> lines = readLines(path);
    ASSERT_EQ(3u, lines.size());
    EXPECT_EQ("line of an earlier run", lines[0]);
    EXPECT_TRUE(
        std::regex_search(lines[1], std::regex(std::string(LOG_LINE_HEAD) + R"(\[INFO \] CTestLogger - first$)")))
        << lines[1];
    EXPECT_TRUE(
        std::regex_search(lines[2], std::regex(std::string(LOG_LINE_HEAD) + R"(\[INFO \] CTestLogger - second$)")))
        << lines[2];
    std::remove(path.c_str());
}

TEST_F(CLogTest, FileAppenderInAMissingDirectoryStaysSilent)
{
    const std::string path = tempPath("no_such_dir/sub/x.log");
    CLogFileAppender appender(path);
    EXPECT_FALSE(appender.isOpen());
    EXPECT_FALSE(CLogManager::detach(appender)); // it never attached
    m_cLogger.error() << "still fine";
    EXPECT_EQ(1u, m_cCapture.lines().size());
    EXPECT_FALSE(std::ifstream(path.c_str()).is_open());
}

TEST_F(CLogTest, TwoThreadsWriteWholeLines)
{
    const std::string path = tempPath("threads.log");
    std::remove(path.c_str());
    const int LINES = 200;
    {
        CLogFileAppender appender(path);
        ASSERT_TRUE(appender.isOpen());
        auto writer = [](const char* name) {
            CLogger logger = CLogManager::getLogger(name);
            for (int i = 0; i < LINES; ++i) {
                logger.info("LbCore::CTest::write") << "line " << i << " of " << name;
            }
        };
        std::thread a(writer, "CWriterA");
        std::thread b(writer, "CWriterB");
        a.join();
        b.join();
    }
    std::vector<std::string> lines = readLines(path);
    ASSERT_EQ(2u * LINES, lines.size());
    std::regex whole(std::string(LOG_LINE_HEAD) +
                     R"(\[INFO \] (CWriter[AB]) - LbCore::CTest::write - line [0-9]+ of (CWriter[AB])$)");
    for (const std::string& line : lines) {
        std::smatch match;
        ASSERT_TRUE(std::regex_search(line, match, whole)) << line;
        EXPECT_EQ(match[2].str(), match[3].str()) << line;
    }
    std::remove(path.c_str());
}

// Two handles on one file, as two processes logging to it have, appending at the same time
// (driven directly, without the manager's lock): no line is lost or written over.
TEST_F(CLogTest, TwoAppendersOnOneFileKeepEveryLineWhole)
{
    const std::string path = tempPath("shared.log");
    std::remove(path.c_str());
    const int LINES = 2000;
    {
        CLogFileAppender first(path);
        CLogFileAppender second(path);
        ASSERT_TRUE(first.isOpen() && second.isOpen());
        CLogManager::detach(first);
        CLogManager::detach(second);
        auto writer = [&](CLogFileAppender* appender, const char* name) {
            for (int i = 0; i < LINES; ++i) {
                CLogMessage message = m_cLogger.info();
                message << name << " line " << i;
                appender->append(message);
            }
        };
        std::thread a(writer, &first, "first");
        std::thread b(writer, &second, "second");
        a.join();
        b.join();
    }
    std::vector<std::string> lines = readLines(path);
    ASSERT_EQ(2u * LINES, lines.size());
    std::regex whole(std::string(LOG_LINE_HEAD) + R"(\[INFO \] CTestLogger - (first|second) line [0-9]+$)");
    for (const std::string& line : lines) {
        ASSERT_TRUE(std::regex_search(line, whole)) << line;
    }
    std::remove(path.c_str());
}

TEST_F(CLogTest, ControlCharactersAreWrittenEscapedOnOneLine)
{
    const std::string forged("FUNC POWER\n01/01/99 00:00:00 [ERROR] forged");
    m_cLogger.info() << "cmd " << forged << " | " << std::string("a\0b", 3) << '\r' << "\t\x1b\x7f\\x" << -5 << " | "
                     << std::runtime_error("two\nlines");
    std::vector<std::string> lines = m_cCapture.lines();
    ASSERT_EQ(1u, lines.size());
    const std::string tail =
        "CTestLogger - cmd FUNC POWER\\n01/01/99 00:00:00 [ERROR] forged | a\\x00b\\r\\t\\x1b\\x7f\\x-5"
        " | two\\nlines";
    ASSERT_GE(lines[0].size(), tail.size());
    EXPECT_EQ(tail, lines[0].substr(lines[0].size() - tail.size()));
}

TEST_F(CLogTest, UnwrittenMessagesBuildAndAllocateNothing)
{
    int value = 7;
    auto logAll = [&] {
        m_cLogger.debug("LbCore::CTest::op") << "value " << value << ' ' << 3u << ' ' << &value;
        m_cLogger.info("LbCore::CTest::op") << "info";
    };
    CLogManager::setLevel(LEVEL_WARN); // below the threshold, an appender attached
    unsigned long before = s_nAllocations;
    logAll();
    EXPECT_EQ(before, s_nAllocations.load());

    CLogManager::setLevel(LEVEL_DEBUG); // enabled, but nobody to write to
    ASSERT_TRUE(CLogManager::detach(m_cCapture));
    before = s_nAllocations;
    logAll();
    {
        CLogMessage message = m_cLogger.error();
        message << "dropped";
        EXPECT_EQ("", message.getText());
        ASSERT_TRUE(CLogManager::attach(m_cCapture)); // too late for this message
    }
    EXPECT_EQ(before, s_nAllocations.load());
    EXPECT_TRUE(m_cCapture.lines().empty());
}

// What reaches a log file at each threshold is exactly what any other appender receives, and
// the same lines come whether or not a file is attached.
TEST_F(CLogTest, OutputIsTheSameAtEveryLevelWithAndWithoutAFile)
{
    CSelfWriter writer;
    auto logAll = [&](CLogger& logger) {
        logger.debug("LbCore::CTest::op") << "d " << 1 << ' ' << &writer;
        logger.info("LbCore::CTest::op") << "i " << 2u;
        logger.warn("LbCore::CTest::op") << "w " << 18446744073709551615ull;
        logger.error("LbCore::CTest::op") << std::runtime_error("e");
        logger.fatal("LbCore::CTest::op") << "f";
    };
    const std::string tails[] = {"[DEBUG] CTestLogger - LbCore::CTest::op - d 1 session 0x0003::100000",
                                 "[INFO ] CTestLogger - LbCore::CTest::op - i 2",
                                 "[WARN ] CTestLogger - LbCore::CTest::op - w 18446744073709551615",
                                 "[ERROR] CTestLogger - LbCore::CTest::op - e",
                                 "[FATAL] CTestLogger - LbCore::CTest::op - f"};
    const std::string path = tempPath("levels.log");
    for (int level = LEVEL_DEBUG; level <= LEVEL_FATAL; ++level) {
        CLogManager::setLevel(level);
        std::vector<std::string> withoutFile;
        std::vector<std::string> withFile;
        {
            LbTests::CCaptureAppender capture;
            logAll(m_cLogger);
            withoutFile = capture.lines();
        }
        std::remove(path.c_str());
        {
            LbTests::CCaptureAppender capture;
            CLogFileAppender file(path);
            ASSERT_TRUE(file.isOpen());
            logAll(m_cLogger);
            withFile = capture.lines();
        }
        ASSERT_EQ(static_cast<std::size_t>(5 - level), withoutFile.size()) << "level " << level;
        ASSERT_EQ(withoutFile.size(), withFile.size());
        std::string expectedFile;
        for (std::size_t i = 0; i < withFile.size(); ++i) {
            std::regex line(std::string(LOG_LINE_HEAD) + "\\" + tails[level + i] + "$");
            EXPECT_TRUE(std::regex_search(withoutFile[i], line)) << withoutFile[i];
            EXPECT_TRUE(std::regex_search(withFile[i], line)) << withFile[i];
            expectedFile += withFile[i] + "\n";
        }
        std::ifstream file(path.c_str()); // text mode: a Windows line end reads as "\n"
        std::string written((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
        EXPECT_EQ(expectedFile, written) << "level " << level;
    }
    std::remove(path.c_str());
}
