// One log call writes one line: commands with line ends or zero bytes reach the sensor as they
// are, while the log file shows them escaped and stays a text file.
#include "tests/passport/PassportFixture.h"

#include <cctype>

namespace LbPassportTest {

class LogLines : public CPassportTest { };

TEST_F(LogLines, ACommandCannotForgeALineOrMakeTheLogBinary)
{
    const std::string forged = "FUNC POWER\n01/01/99 00:00:00 [ERROR] forged";
    ViSession session = open("LBPMX::0x0003::100000::INSTR");
    ASSERT_EQ(VI_ERROR_NSUP_OPER, write(session, forged)); // the sensor runs both lines, and refuses the second
    char sent[128] = {0};
    std::int32_t timeout = 0;
    ASSERT_EQ(0, PmxSimGetLastCommand("100000", sent, sizeof sent, &timeout));
    EXPECT_EQ("func power\n01/01/99 00:00:00 [error] forged", std::string(sent));
    ASSERT_EQ(VI_SUCCESS, write(session, std::string("*CLS\0zero byte", 14)));

    std::string log = readFile(logPath());
    EXPECT_EQ(std::string::npos, log.find('\0'));
    std::istringstream lines(log);
    std::size_t forgedLines = 0;
    std::size_t zeroLines = 0;
    for (std::string line; std::getline(lines, line);) {
        EXPECT_NE(0u, line.find("01/01/99")) << line;
        for (char& c : line) {
            c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
        }
        if (line.find("forged") != std::string::npos) {
            ++forgedLines;
            EXPECT_NE(std::string::npos, line.find("func power\\n01/01/99 00:00:00 [error] forged")) << line;
        }
        zeroLines += line.find("*cls\\x00zero byte") != std::string::npos ? 1 : 0;
    }
    EXPECT_LE(1u, forgedLines);
    EXPECT_LE(1u, zeroLines);
}

} // namespace LbPassportTest
