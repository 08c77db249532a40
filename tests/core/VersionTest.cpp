#include "core/Version.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>

#ifdef _WIN32
#include <windows.h>
#else
#include <dlfcn.h>
#include <unistd.h>
#endif

using LbCore::CVersion;

namespace {

typedef int (*TModuleVersion)(unsigned* parts, char* failure, int size);

// The test modules are built beside the test executable.
std::string besideExecutable(const std::string& name)
{
    char path[4096] = {0};
#ifdef _WIN32
    GetModuleFileNameA(0, path, sizeof(path));
    std::string self(path);
    return self.substr(0, self.find_last_of("\\/") + 1) + name;
#else
    const ssize_t length = readlink("/proc/self/exe", path, sizeof(path) - 1);
    std::string self(path, length > 0 ? static_cast<std::size_t>(length) : 0);
    return self.substr(0, self.find_last_of('/') + 1) + name;
#endif
}

// Asks a module for its own version; "" and the parts on success, else the failure text.
std::string askModule(const std::string& name, unsigned parts[4])
{
    const std::string path = besideExecutable(name);
    char failure[256] = {0};
#ifdef _WIN32
    HMODULE module = LoadLibraryA(path.c_str());
    if (module == 0) {
        return "cannot load " + path;
    }
    TModuleVersion function =
        reinterpret_cast<TModuleVersion>(reinterpret_cast<void*>(GetProcAddress(module, "lbTestModuleVersion")));
#else
    void* module = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (module == nullptr) {
        return "cannot load " + path;
    }
    TModuleVersion function = reinterpret_cast<TModuleVersion>(dlsym(module, "lbTestModuleVersion"));
#endif
    std::string result = "no lbTestModuleVersion";
    if (function != nullptr) {
        result = function(parts, failure, sizeof(failure)) ? "" : failure;
    }
#ifdef _WIN32
    FreeLibrary(module);
#else
    dlclose(module);
#endif
    return result;
}

std::string versionError(const std::string& path)
{
    try {
        CVersion version(path);
    } catch (const CVersion::CVersionException& e) {
        return e.what();
    }
    return "<read>";
}

std::string dotted(unsigned a, unsigned b, unsigned c, unsigned d)
{
    std::ostringstream text;
    text << a << '.' << b << '.' << c << '.' << d;
    return text.str();
}

} // namespace

TEST(Version, StampedModuleReadsBackItsNumbersAndStrings)
{
    const CVersion version(besideExecutable(LB_TEST_STAMPED_MODULE));
    EXPECT_EQ(3, version.getFileMajor());
    EXPECT_EQ(4, version.getFileMinor());
    EXPECT_EQ(5, version.getFileBuild());
    EXPECT_EQ(6, version.getFileRevision());
    EXPECT_EQ("3.4.5.6",
              dotted(version.getProductMajor(), version.getProductMinor(), version.getProductBuild(),
                     version.getProductRevision()));

    EXPECT_EQ("Marlowe&Tenby", version.getCompanyName());
    EXPECT_EQ("3.4.5.6", version.getFileVersion());
    EXPECT_EQ("3.4.5.6", version.getProductVersion());
    EXPECT_EQ("Version test module", version.getFileDescription());
    EXPECT_EQ("version_test_module", version.getInternalName());
    EXPECT_EQ(LB_TEST_STAMPED_MODULE, version.getOriginalFilename());
    EXPECT_FALSE(version.getProductName().empty());
    EXPECT_EQ(version.getCompanyName(), version.getQueryValue("CompanyName"));
}

TEST(Version, MissingKeysAndMissingVersionInformationGiveTheirTexts)
{
    const CVersion version(besideExecutable(LB_TEST_STAMPED_MODULE));
    const std::string missing = "CVersion::getQueryValue() can't get the value for the key:";
    for (const std::string& key : {std::string("NoSuchKey"), std::string(""), std::string(300, 'K'),
                                   std::string("Company"), std::string("CompanyName\\")}) {
        try {
            version.getQueryValue(key);
            ADD_FAILURE() << "found key '" << key << "'";
        } catch (const CVersion::CVersionException& e) {
            EXPECT_EQ(missing + key, e.what());
        }
    }
    try {
        version.getPrivateBuild();
        ADD_FAILURE() << "found PrivateBuild";
    } catch (const std::exception& e) {
        EXPECT_EQ(missing + "PrivateBuild", e.what());
    }

    const std::string text = besideExecutable("version_tests_plain.txt");
    std::ofstream(text.c_str()) << "no version information here\n";
    for (const std::string& path :
         {besideExecutable(LB_TEST_PLAIN_MODULE), text, besideExecutable("no_such_file.dll"), std::string()}) {
        EXPECT_EQ("VersionInfo: can not retrieve version information", versionError(path)) << path;
    }
    std::remove(text.c_str());
}

TEST(Version, EachModuleFindsItsOwnVersion)
{
    const CVersion& own = CVersion::getModuleVersion();
    EXPECT_EQ(LB_TEST_PROJECT_VERSION,
              dotted(own.getFileMajor(), own.getFileMinor(), own.getFileBuild(), own.getFileRevision()));
    EXPECT_EQ(LB_TEST_PROJECT_VERSION, own.getFileVersion());
    EXPECT_EQ(&own, &CVersion::getModuleVersion());

    // The same library code linked into another module answers for that module.
    unsigned parts[4] = {0, 0, 0, 0};
    EXPECT_EQ("", askModule(LB_TEST_STAMPED_MODULE, parts));
    EXPECT_EQ("3.4.5.6", dotted(parts[0], parts[1], parts[2], parts[3]));

    // A module without version information still loads and reports the failure when asked.
    EXPECT_EQ("VersionInfo: can not retrieve version information", askModule(LB_TEST_PLAIN_MODULE, parts));
}
