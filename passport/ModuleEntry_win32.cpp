// Module entry on Windows: DllMain process attach/detach, and the configuration read from the
// passport's registry key.
#include "passport/Passport.h"

#include <windows.h>

namespace LbPmxPassport {

bool queryConfigurationValue(const char* name, char (&buffer)[CONFIGURATION_VALUE_SIZE], unsigned& size)
{
    HKEY key = 0;
    if (RegOpenKeyExA(
            HKEY_LOCAL_MACHINE,
            "SOFTWARE\\National Instruments\\NI-VISA for Windows 95/NT\\CurrentVersion\\IoLibraries\\LbViPmx.dll", 0,
            KEY_QUERY_VALUE, &key) != ERROR_SUCCESS) {
        return false;
    }
    DWORD bytes = sizeof buffer;
    LONG result = RegQueryValueExA(key, name, 0, 0, reinterpret_cast<LPBYTE>(buffer), &bytes);
    RegCloseKey(key);
    size = bytes;
    return result == ERROR_SUCCESS;
}

} // namespace LbPmxPassport

// A non-null reserved argument at detach means the process ends: the system has already stopped
// every other thread.
extern "C" BOOL WINAPI DllMain(HINSTANCE, DWORD reason, LPVOID reserved)
{
    switch (reason) {
    case DLL_PROCESS_ATTACH:
        return LbPmxPassport::attachProcess() ? TRUE : FALSE;
    case DLL_PROCESS_DETACH:
        LbPmxPassport::detachProcess(reserved != 0 ? LbPmxPassport::DETACH_THREADS_STOPPED
                                                   : LbPmxPassport::DETACH_UNDER_LOADER_LOCK);
        return TRUE;
    default:
        return TRUE;
    }
}
