#include "pmxsim/WorkerThread.h"

#include <windows.h>

#include <new>

namespace PmxSim {

struct SWorker {
    HANDLE thread;
    DWORD id;
    HMODULE module;
    void (*fn)(void*);
    void* arg;
};

namespace {
DWORD WINAPI trampoline(LPVOID p)
{
    SWorker* worker = static_cast<SWorker*>(p);
    void (*fn)(void*) = worker->fn;
    void* arg = worker->arg;
    HMODULE module = worker->module;
    fn(arg);
    // Releases the module reference and ends the thread without returning into the module.
    FreeLibraryAndExitThread(module, 0);
    return 0;
}
} // namespace

SWorker* startWorker(void (*fn)(void*), void* arg)
{
    SWorker* worker = new (std::nothrow) SWorker{nullptr, 0, nullptr, fn, arg};
    if (worker == nullptr)
        return nullptr;
    // The thread keeps this module loaded until it has left it (see the header).
    if (!GetModuleHandleExW(GET_MODULE_HANDLE_EX_FLAG_FROM_ADDRESS, reinterpret_cast<LPCWSTR>(&trampoline),
                            &worker->module)) {
        delete worker;
        return nullptr;
    }
    worker->thread = CreateThread(nullptr, 0, trampoline, worker, 0, &worker->id);
    if (worker->thread == nullptr) {
        FreeLibrary(worker->module);
        delete worker;
        return nullptr;
    }
    return worker;
}

void joinWorker(SWorker* worker)
{
    WaitForSingleObject(worker->thread, INFINITE);
    CloseHandle(worker->thread);
    delete worker;
}

// The trampoline copied what it needs before running, so the record can go at once.
void detachWorker(SWorker* worker)
{
    CloseHandle(worker->thread);
    delete worker;
}

bool isWorkerThread(const SWorker* worker)
{
    return worker != nullptr && worker->id == GetCurrentThreadId();
}

} // namespace PmxSim
