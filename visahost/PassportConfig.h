// Which passport modules the runtime loads, in order of precedence:
//  1. the environment variable LBVISA_PASSPORTS, a list of module paths separated by
//     Module::pathListSeparator();
//  2. the system's registration: on Windows the registry (Module::configuredPassports()),
//     elsewhere the files "*.conf" in the folder etc/lbvisa/passports.d of the install prefix
//     the runtime lives in (/etc for the prefixes /usr and /);
//  3. nothing configured: the default passport beside the runtime's libraries.
// A path without a folder is looked up beside the runtime's libraries (Runtime.cpp does that).
#ifndef LBVISAHOST_PASSPORTCONFIG_H
#define LBVISAHOST_PASSPORTCONFIG_H

#include <string>
#include <vector>

namespace LbVisaHost {
namespace PassportConfig {

struct SPassports {
    std::vector<std::string> m_vPaths;
    bool m_bConfigured = false; // false: only the default passport, whose absence is no error
};

// The passports of this process, read from the environment and the system configuration.
SPassports passports();

// The non-empty entries of a list, in order.
std::vector<std::string> splitList(const std::string& strList, char cSeparator);

// Folder of passport configuration files (with a trailing '/') for a runtime whose libraries
// are in strRuntimeDir (with a trailing separator), when that folder is <prefix>/<strLibDir>;
// empty when the runtime is not installed that way (a build tree).
std::string configDirectory(const std::string& strRuntimeDir, const std::string& strLibDir);

// Module paths listed by the files "*.conf" in strDir, files in name order and lines in file
// order. A line holds one path; blanks around it, empty lines and lines starting with '#' are
// ignored; a relative path is taken from strRuntimeDir. A missing folder lists nothing.
std::vector<std::string> readConfigDirectory(const std::string& strDir, const std::string& strRuntimeDir);

} // namespace PassportConfig
} // namespace LbVisaHost

#endif
