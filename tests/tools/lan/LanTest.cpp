// The gateway's settings and the line splitting of its raw sockets, without sockets or sensors.
#include <gtest/gtest.h>

#include <cstdio>
#include <fstream>

#include "tools/lan/Config.h"
#include "tools/lan/LineReader.h"
#include "tools/lan/Socket.h"

using namespace LbPmxLan;

namespace {

std::uint32_t ip(const char* text)
{
    std::uint32_t address = 0;
    EXPECT_TRUE(parseIpv4(text, address)) << text;
    return address;
}

TEST(LanConfig, FlagsOverrideTheFileAndBadValuesAreRefused)
{
    char path[] = "lan_test.conf"; // in the test's working folder
    std::ofstream(path) << "# gateway\nbind = 0.0.0.0\nmax-links = 3  # per sensor\nallow = 10.0.0.0/8\n";
    const char* argv[] = {"lbpmx-lan", "--max-links", "5", "--config", path, "--no-register"};
    CLanConfig config;
    std::string error;
    bool help = true;
    ASSERT_TRUE(parseConfig(6, const_cast<char**>(argv), config, error, help)) << error;
    std::remove(path);
    EXPECT_FALSE(help);
    EXPECT_EQ("0.0.0.0", config.m_strBind);
    EXPECT_EQ(5u, config.m_nMaxLinks);
    EXPECT_FALSE(config.m_bRegister);
    EXPECT_TRUE(config.m_bVxi11);
    EXPECT_EQ(5025u, config.m_nSocketPort);
    EXPECT_TRUE(config.m_cAllow.allows(ip("10.200.0.1")));
    EXPECT_FALSE(config.m_cAllow.allows(ip("127.0.0.1")));

    const char* bogus[] = {"lbpmx-lan", "--bogus"};
    EXPECT_FALSE(parseConfig(2, const_cast<char**>(bogus), config, error, help));
    EXPECT_EQ("unknown option --bogus", error);
    const char* missing[] = {"lbpmx-lan", "--log"};
    EXPECT_FALSE(parseConfig(2, const_cast<char**>(missing), config, error, help));
    EXPECT_EQ("--log needs a value", error);

    for (const char* line : {"bind = localhost", "max-links = 0", "idle-timeout = -1", "socket-port = 70000",
                             "allow = 10.0.0.0/33", "allow = 10.0.0", "colour = red", "bind", "list = 1"}) {
        CLanConfig c;
        EXPECT_FALSE(applyConfigLine(line, c, error)) << line;
    }
}

TEST(LanConfig, AllowListMatchesNetworks)
{
    CAllowList list;
    EXPECT_TRUE(list.allows(ip("192.0.2.1"))); // empty: everyone
    ASSERT_TRUE(list.add("192.168.1.0/24, 10.0.0.7"));
    EXPECT_TRUE(list.allows(ip("192.168.1.255")));
    EXPECT_FALSE(list.allows(ip("192.168.2.1")));
    EXPECT_TRUE(list.allows(ip("10.0.0.7")));
    EXPECT_FALSE(list.allows(ip("10.0.0.8")));
    CAllowList all;
    ASSERT_TRUE(all.add("0.0.0.0/0"));
    EXPECT_TRUE(all.allows(ip("203.0.113.9")));
}

TEST(LanLines, SplitsLinesAndRefusesMalformedInput)
{
    CLineReader reader;
    std::string line;
    reader.feed("*IDN?\r\nFUNC PO", 14);
    ASSERT_EQ(CLineReader::RESULT_LINE, reader.next(line));
    EXPECT_EQ("*IDN?", line);
    EXPECT_EQ(CLineReader::RESULT_NEED_MORE, reader.next(line));
    reader.feed("WER\n", 4);
    ASSERT_EQ(CLineReader::RESULT_LINE, reader.next(line));
    EXPECT_EQ("FUNC POWER", line);

    reader.feed("a\0b\n", 4);
    EXPECT_EQ(CLineReader::RESULT_MALFORMED, reader.next(line));
    CLineReader longLine;
    std::string big(MAX_LINE + 1, 'x');
    longLine.feed(big.data(), big.size());
    EXPECT_EQ(CLineReader::RESULT_MALFORMED, longLine.next(line));

    EXPECT_TRUE(isQuery("SYST:ERR?"));
    EXPECT_FALSE(isQuery("DISP:TEXT \"why?\""));
    EXPECT_TRUE(isQuery("DISP:TEXT 'x';*OPC?"));
}

} // namespace
