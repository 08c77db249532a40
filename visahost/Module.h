// Finding and loading passport modules; one implementation per platform
// (Module_posix.cpp: dlopen, Module_win32.cpp: LoadLibrary and the registry).
#ifndef LBVISAHOST_MODULE_H
#define LBVISAHOST_MODULE_H

#include <string>
#include <vector>

namespace LbVisaHost {
namespace Module {

// Folder of the runtime's libraries, with a trailing separator.
std::string runtimeDirectory();
// Value of an environment variable (empty when unset).
std::string environment(const char* szName);
// Separator of the paths in LBVISA_PASSPORTS.
char pathListSeparator();
// True when the path names a folder (otherwise it is looked up in runtimeDirectory()).
bool hasDirectory(const std::string& strPath);
// Passports configured by the platform (Windows: registry); empty when none.
std::vector<std::string> configuredPassports();
// File name of the passport loaded when nothing is configured.
std::string defaultPassport();
// Loads a module and runs its entry; never unloaded. False (and why) when it could not.
bool load(const std::string& strPath, std::string& strError);

} // namespace Module
} // namespace LbVisaHost

#endif
