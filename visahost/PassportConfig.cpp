#include "visahost/PassportConfig.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <system_error>

#include "visahost/Module.h"

#ifndef LBVISA_INSTALL_LIBDIR
#define LBVISA_INSTALL_LIBDIR "lib"
#endif

namespace LbVisaHost {
namespace PassportConfig {

namespace {
const char g_szConfigFolder[] = "etc/lbvisa/passports.d/";
const char g_szConfigSuffix[] = ".conf";
const char g_szBlanks[] = " \t\r";
} // namespace

SPassports passports()
{
    SPassports sResult;
    sResult.m_bConfigured = true;
    sResult.m_vPaths = splitList(Module::environment("LBVISA_PASSPORTS"), Module::pathListSeparator());
#ifdef _WIN32
    if (sResult.m_vPaths.empty())
        sResult.m_vPaths = Module::configuredPassports();
#else
    if (sResult.m_vPaths.empty()) {
        const std::string strRuntimeDir = Module::runtimeDirectory();
        const std::string strDir = configDirectory(strRuntimeDir, LBVISA_INSTALL_LIBDIR);
        if (!strDir.empty())
            sResult.m_vPaths = readConfigDirectory(strDir, strRuntimeDir);
    }
#endif
    if (sResult.m_vPaths.empty()) {
        sResult.m_vPaths.push_back(Module::defaultPassport());
        sResult.m_bConfigured = false;
    }
    return sResult;
}

std::vector<std::string> splitList(const std::string& strList, char cSeparator)
{
    std::vector<std::string> vEntries;
    size_t nStart = 0;
    while (nStart < strList.size()) {
        size_t nEnd = strList.find(cSeparator, nStart);
        if (nEnd == std::string::npos)
            nEnd = strList.size();
        if (nEnd > nStart)
            vEntries.push_back(strList.substr(nStart, nEnd - nStart));
        nStart = nEnd + 1;
    }
    return vEntries;
}

std::string configDirectory(const std::string& strRuntimeDir, const std::string& strLibDir)
{
    // "<prefix>/<libdir>/" -> "<prefix>"; the runtime's folder may be given through a link
    // (/lib -> usr/lib), which only changes the prefix between "/usr" and "".
    const std::string strTail = "/" + strLibDir + "/";
    if (strLibDir.empty() || strRuntimeDir.size() < strTail.size() ||
        strRuntimeDir.compare(strRuntimeDir.size() - strTail.size(), strTail.size(), strTail) != 0)
        return "";
    std::string strPrefix = strRuntimeDir.substr(0, strRuntimeDir.size() - strTail.size());
    // The system's own prefixes keep their configuration in /etc, as GNU install folders do.
    if (strPrefix == "/usr")
        strPrefix.clear();
    return strPrefix + "/" + g_szConfigFolder;
}

std::vector<std::string> readConfigDirectory(const std::string& strDir, const std::string& strRuntimeDir)
{
    namespace fs = std::filesystem;
    std::vector<std::string> vFiles;
    std::error_code aError;
    for (fs::directory_iterator it(strDir, aError), itEnd; !aError && it != itEnd; it.increment(aError)) {
        const std::string strName = it->path().filename().string();
        const size_t nSuffix = sizeof g_szConfigSuffix - 1;
        if (strName.size() > nSuffix && strName.compare(strName.size() - nSuffix, nSuffix, g_szConfigSuffix) == 0 &&
            it->is_regular_file(aError))
            vFiles.push_back(it->path().string());
    }
    std::sort(vFiles.begin(), vFiles.end());

    std::vector<std::string> vPaths;
    for (const std::string& strFile : vFiles) {
        std::ifstream aIn(strFile);
        std::string strLine;
        while (std::getline(aIn, strLine)) {
            const size_t nFirst = strLine.find_first_not_of(g_szBlanks);
            if (nFirst == std::string::npos || strLine[nFirst] == '#')
                continue;
            const size_t nLast = strLine.find_last_not_of(g_szBlanks);
            const std::string strPath = strLine.substr(nFirst, nLast - nFirst + 1);
            vPaths.push_back(fs::path(strPath).is_absolute() ? strPath : strRuntimeDir + strPath);
        }
    }
    return vPaths;
}

} // namespace PassportConfig
} // namespace LbVisaHost
