// A module that reports its own version as it sees it, for the version tests.
#include "core/Version.h"

#include <cstdio>

#ifdef _WIN32
#define LB_TEST_EXPORT extern "C" __declspec(dllexport)
#else
#define LB_TEST_EXPORT extern "C" __attribute__((visibility("default")))
#endif

// Fills parts with the file version and returns 1, or writes the failure text and returns 0.
LB_TEST_EXPORT int lbTestModuleVersion(unsigned* parts, char* failure, int size)
{
    try {
        const LbCore::CVersion& version = LbCore::CVersion::getModuleVersion();
        parts[0] = version.getFileMajor();
        parts[1] = version.getFileMinor();
        parts[2] = version.getFileBuild();
        parts[3] = version.getFileRevision();
        return 1;
    } catch (const std::exception& e) {
        std::snprintf(failure, static_cast<std::size_t>(size), "%s", e.what());
        return 0;
    }
}
