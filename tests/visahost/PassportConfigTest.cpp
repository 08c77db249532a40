// Where an installed runtime finds its passports: the environment list, the configuration
// folder of its install prefix and the default beside it (visahost/PassportConfig.h).
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "visahost/PassportConfig.h"

namespace LbVisaHostTest {

using namespace LbVisaHost::PassportConfig;
using VStrings = std::vector<std::string>;
namespace fs = std::filesystem;

TEST(PassportConfig, FolderFollowsTheInstallPrefixOfTheRuntime)
{
    const std::string strMulti = "lib/x86_64-linux-gnu";
    EXPECT_EQ("/etc/lbvisa/passports.d/", configDirectory("/usr/lib/x86_64-linux-gnu/", strMulti));
    // Found through the /lib link of a merged /usr.
    EXPECT_EQ("/etc/lbvisa/passports.d/", configDirectory("/lib/x86_64-linux-gnu/", strMulti));
    EXPECT_EQ("/usr/local/etc/lbvisa/passports.d/", configDirectory("/usr/local/lib/", "lib"));
    EXPECT_EQ("/opt/lb/etc/lbvisa/passports.d/", configDirectory("/opt/lb/lib/", "lib"));
    // A build tree, or a folder merely ending like the library folder, has no configuration.
    EXPECT_EQ("", configDirectory("/src/build/dev/bin/", "lib"));
    EXPECT_EQ("", configDirectory("/opt/mylib/", "lib"));
    EXPECT_EQ("", configDirectory("", "lib"));
}

class PassportConfigFolder : public ::testing::Test {
protected:
    void SetUp() override
    {
        char szTemplate[] = "/tmp/lbvisa-config-XXXXXX";
        ASSERT_NE(nullptr, mkdtemp(szTemplate));
        m_strDir = std::string(szTemplate) + "/";
    }
    void TearDown() override { fs::remove_all(m_strDir); }
    void write(const std::string& strName, const std::string& strText)
    {
        std::ofstream(m_strDir + strName, std::ios::binary) << strText;
    }
    std::string m_strDir;
};

TEST_F(PassportConfigFolder, ListsTheConfFilesInNameOrder)
{
    write("20-second.conf", "# comment\r\n\t/opt/x/Second.so \r\n\nsub/Third.so");
    write("10-first.conf", "  # indented comment\nFirst.so\n");
    write("README", "Ignored.so\n");
    write("30-old.conf.dpkg-old", "Ignored.so\n");
    fs::create_directory(m_strDir + "40-folder.conf");
    EXPECT_EQ((VStrings{"/rt/First.so", "/opt/x/Second.so", "/rt/sub/Third.so"}),
              readConfigDirectory(m_strDir, "/rt/"));
    EXPECT_EQ(VStrings{}, readConfigDirectory(m_strDir + "missing/", "/rt/"));
}

TEST(PassportConfig, EnvironmentListComesBeforeTheDefault)
{
    EXPECT_EQ((VStrings{"a.so", "/b/c.so"}), splitList("::a.so::/b/c.so:", ':'));
    EXPECT_EQ(VStrings{}, splitList("", ':'));

    ASSERT_EQ(0, setenv("LBVISA_PASSPORTS", "One.so::/x/Two.so", 1));
    SPassports sConfigured = passports();
    EXPECT_TRUE(sConfigured.m_bConfigured);
    EXPECT_EQ((VStrings{"One.so", "/x/Two.so"}), sConfigured.m_vPaths);

    // This test program lives in a build tree: no configuration folder, the default passport.
    ASSERT_EQ(0, unsetenv("LBVISA_PASSPORTS"));
    SPassports sDefault = passports();
    EXPECT_FALSE(sDefault.m_bConfigured);
    EXPECT_EQ(VStrings{"LbViPmx64.so"}, sDefault.m_vPaths);
}

} // namespace LbVisaHostTest
