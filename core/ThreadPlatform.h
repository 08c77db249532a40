#ifndef LBCORE_THREADPLATFORM_H
#define LBCORE_THREADPLATFORM_H
// Internal to core/: creation, forced end and release of an OS thread, one file per platform.
#include <cstdint>

namespace LbCore {
namespace ThreadPlatform {

// Starts entry(argument) on a new thread; false when no thread could be created.
bool create(unsigned (*entry)(void*), void* argument, void*& handle, std::uint32_t& id);
// Ends the thread by force where the platform can; false when it could not.
bool terminate(void* handle);
// Waits for the thread to end (unless it is the calling thread) and releases its handle.
bool close(void* handle);

} // namespace ThreadPlatform
} // namespace LbCore

#endif
