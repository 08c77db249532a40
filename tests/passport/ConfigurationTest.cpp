// LOG_LEVEL and LOG_FILE: each case configures the passport and starts a fresh process that
// loads it, since the passport reads its configuration once, when it is loaded.
#include "tests/passport/PassportFixture.h"

namespace LbPassportTest {

class Configuration : public ::testing::Test {
protected:
    void SetUp() override
    {
        usePassport();
        m_sLog = temporaryPath("lbpmx-config");
        std::remove(m_sLog.c_str());
    }

    void TearDown() override
    {
        std::remove(m_sLog.c_str());
        setConfiguration("LOG_LEVEL", nullptr);
        setConfiguration("LOG_FILE", nullptr);
    }

    // Runs the probe with the given configuration; returns the log file's text ("" if none).
    std::string runProbe(const char* level, const std::string& file)
    {
        setConfiguration("LOG_LEVEL", level);
        setConfiguration("LOG_FILE", file.c_str());
#if defined(_WIN32)
        EXPECT_EQ(0, std::system("passport_config_probe.exe"));
#else
        EXPECT_EQ(0, std::system("./passport_config_probe"));
#endif
        return fileExists(file) ? readFile(file) : std::string("<no file>");
    }

    std::string m_sLog;
};

TEST_F(Configuration, DebugWritesEveryLevelToTheFile)
{
    std::string log = runProbe("DEBUG", m_sLog);
    EXPECT_NE(std::string::npos, log.find("[DEBUG] CPmxSessionDispatcher - LbPmxVisa::CPmxSessionDispatcher::"));
    EXPECT_NE(std::string::npos, log.find("[ERROR] CLbPmxInstrSesn - LbPmxPassport::CLbPmxInstrSesn::viOpen - "));
}

TEST_F(Configuration, ErrorLevelFiltersDebugLines)
{
    std::string log = runProbe("ERROR", m_sLog);
    EXPECT_EQ(std::string::npos, log.find("[DEBUG]"));
    EXPECT_NE(std::string::npos, log.find("[ERROR] CLbPmxInstrSesn"));
}

TEST_F(Configuration, LevelTextsAreExact)
{
    EXPECT_EQ("<no file>", runProbe("debug", m_sLog));
    EXPECT_EQ("<no file>", runProbe("DEBUG ", m_sLog));
    EXPECT_EQ("<no file>", runProbe("NONE", m_sLog));
    EXPECT_EQ("<no file>", runProbe(nullptr, m_sLog));
}

TEST_F(Configuration, LogFilePathsLongerThan79CharactersAreIgnored)
{
    std::string stem = m_sLog.substr(0, m_sLog.size() - 4);
    std::string longest = stem + std::string(79 - m_sLog.size(), 'x') + ".log";
    ASSERT_EQ(79u, longest.size());
    std::string tooLong = stem + std::string(80 - m_sLog.size(), 'x') + ".log";
    EXPECT_EQ("<no file>", runProbe("DEBUG", tooLong));
    EXPECT_NE("<no file>", runProbe("DEBUG", longest));
    std::remove(longest.c_str());
}

TEST_F(Configuration, TheFileIsAppendedTo)
{
    std::string first = runProbe("INFO", m_sLog);
    std::string second = runProbe("INFO", m_sLog);
    EXPECT_EQ(0u, second.find(first));
    EXPECT_GT(second.size(), first.size());
}

} // namespace LbPassportTest
