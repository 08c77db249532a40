// Module entry on POSIX: the construction and destruction of one static object stand for process
// attach and detach. This file is linked after every library of the module, so the object is
// built after all other static objects of the module; being registered after them, it is also
// destroyed before them, whether the module is unloaded or the process exits (exit() destroys
// static objects before it runs plain ELF destructor functions, so those would come too late).
//
// Configuration: the environment variables LBVIPMX_LOG_LEVEL and LBVIPMX_LOG_FILE stand for the
// registry values LOG_LEVEL and LOG_FILE, with the same texts and the same 80-byte limit
// (terminating zero included).
#include "passport/Passport.h"

#include <cstdlib>
#include <cstring>
#include <string>

namespace LbPmxPassport {

bool queryConfigurationValue(const char* name, char (&buffer)[CONFIGURATION_VALUE_SIZE], unsigned& size)
{
    const char* value = std::getenv((std::string("LBVIPMX_") + name).c_str());
    if (value == nullptr) {
        return false;
    }
    std::size_t bytes = std::strlen(value) + 1;
    if (bytes > sizeof buffer) {
        return false;
    }
    std::memcpy(buffer, value, bytes);
    size = static_cast<unsigned>(bytes);
    return true;
}

namespace {
// A failed attach cannot refuse the load here; without a vector table the runtime never routes
// an operation to the passport, so a failed attach leaves it inert.
struct CModuleEntry {
    CModuleEntry() { attachProcess(); }
    ~CModuleEntry() { detachProcess(DETACH_THREADS_RUNNING); }
};

CModuleEntry s_cModuleEntry;
} // namespace

} // namespace LbPmxPassport
