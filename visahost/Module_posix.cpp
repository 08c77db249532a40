#include <dlfcn.h>

#include <cstdlib>
#include <string>

#include "visahost/Module.h"

namespace LbVisaHost {
namespace Module {

std::string runtimeDirectory()
{
    Dl_info sInfo{};
    if (dladdr(reinterpret_cast<void*>(&runtimeDirectory), &sInfo) == 0 || !sInfo.dli_fname)
        return "";
    std::string strPath = sInfo.dli_fname;
    size_t nSlash = strPath.rfind('/');
    return nSlash == std::string::npos ? "" : strPath.substr(0, nSlash + 1);
}

std::string environment(const char* szName)
{
    const char* szValue = std::getenv(szName);
    return szValue ? szValue : "";
}

char pathListSeparator()
{
    return ':';
}

bool hasDirectory(const std::string& strPath)
{
    return strPath.find('/') != std::string::npos;
}

std::vector<std::string> configuredPassports()
{
    return {};
}

std::string defaultPassport()
{
    return "LbViPmx64.so";
}

bool load(const std::string& strPath, std::string& strError)
{
    if (dlopen(strPath.c_str(), RTLD_NOW | RTLD_LOCAL))
        return true;
    const char* szError = dlerror();
    strError = szError ? szError : "unknown error";
    return false;
}

} // namespace Module
} // namespace LbVisaHost
