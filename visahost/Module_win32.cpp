#include <windows.h>

#include <string>

#include "visahost/Module.h"

namespace LbVisaHost {
namespace Module {

namespace {
const char g_szIoLibraries[] = "SOFTWARE\\National Instruments\\NI-VISA for Windows 95/NT\\CurrentVersion\\IoLibraries";
}

std::string runtimeDirectory()
{
    HMODULE hModule = nullptr;
    if (!GetModuleHandleExA(GET_MODULE_HANDLE_EX_FLAG_FROM_ADDRESS | GET_MODULE_HANDLE_EX_FLAG_UNCHANGED_REFCOUNT,
                            reinterpret_cast<LPCSTR>(&runtimeDirectory), &hModule))
        return "";
    char szPath[MAX_PATH + 1] = {};
    DWORD nLen = GetModuleFileNameA(hModule, szPath, MAX_PATH);
    if (nLen == 0 || nLen >= MAX_PATH)
        return "";
    std::string strPath(szPath, nLen);
    size_t nSlash = strPath.find_last_of("\\/");
    return nSlash == std::string::npos ? "" : strPath.substr(0, nSlash + 1);
}

std::string environment(const char* szName)
{
    char szValue[4096] = {};
    DWORD nLen = GetEnvironmentVariableA(szName, szValue, sizeof szValue);
    return nLen > 0 && nLen < sizeof szValue ? std::string(szValue, nLen) : std::string();
}

char pathListSeparator()
{
    return ';';
}

bool hasDirectory(const std::string& strPath)
{
    return strPath.find_first_of("\\/:") != std::string::npos;
}

// Every subkey of the I/O libraries key whose value "Path" names a module is one passport. The
// value is a string (REG_SZ) or a string with environment variables (REG_EXPAND_SZ), as
// installers write it; an expanded path that does not fit MAX_PATH is skipped.
std::vector<std::string> configuredPassports()
{
    std::vector<std::string> vPaths;
    HKEY hKey = nullptr;
    if (RegOpenKeyExA(HKEY_LOCAL_MACHINE, g_szIoLibraries, 0, KEY_READ, &hKey) != ERROR_SUCCESS)
        return vPaths;
    for (DWORD nIndex = 0;; ++nIndex) {
        char szName[256] = {};
        DWORD nNameLen = sizeof szName;
        if (RegEnumKeyExA(hKey, nIndex, szName, &nNameLen, nullptr, nullptr, nullptr, nullptr) != ERROR_SUCCESS)
            break;
        char szPath[MAX_PATH + 1] = {};
        DWORD nSize = MAX_PATH; // one byte spare keeps the text terminated
        DWORD nType = 0;
        HKEY hSub = nullptr;
        if (RegOpenKeyExA(hKey, szName, 0, KEY_QUERY_VALUE, &hSub) != ERROR_SUCCESS)
            continue;
        if (RegQueryValueExA(hSub, "Path", nullptr, &nType, reinterpret_cast<BYTE*>(szPath), &nSize) == ERROR_SUCCESS &&
            szPath[0] != '\0') {
            char szExpanded[MAX_PATH + 1] = {};
            DWORD nExpanded = 0;
            if (nType == REG_SZ)
                vPaths.push_back(szPath);
            else if (nType == REG_EXPAND_SZ &&
                     (nExpanded = ExpandEnvironmentStringsA(szPath, szExpanded, sizeof szExpanded)) > 0 &&
                     nExpanded <= sizeof szExpanded)
                vPaths.push_back(szExpanded);
        }
        RegCloseKey(hSub);
    }
    RegCloseKey(hKey);
    return vPaths;
}

std::string defaultPassport()
{
    return "LbViPmx64.dll";
}

// A passport given with its folder finds the modules it needs (the sensor library) in that
// folder too, not only beside the application and on PATH.
bool load(const std::string& strPath, std::string& strError)
{
    const DWORD nFlags = hasDirectory(strPath) ? LOAD_WITH_ALTERED_SEARCH_PATH : 0;
    if (LoadLibraryExA(strPath.c_str(), nullptr, nFlags))
        return true;
    strError = "error " + std::to_string(GetLastError());
    return false;
}

} // namespace Module
} // namespace LbVisaHost
