/* Ends its process with sessions open while results keep arriving: opens both simulated sensors,
   starts continuous measurements, reads one result of each and returns from main. In the
   "reading" mode the second sensor measures nothing, and another thread waits in viRead on it
   while main returns.
   The VISA library is loaded at run time, so that the "unload" mode can unload it first; the
   "atexit" mode closes the resource manager from an exit handler registered before the library
   was loaded, which therefore runs after the passport's detach. */
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "visahost/include/visa.h"

#if defined(_WIN32)
#include <windows.h>
#define startThread(function, argument) CloseHandle(CreateThread(NULL, 0, function, argument, 0, NULL))
#define THREAD_RESULT DWORD WINAPI
#define parkThread() Sleep(INFINITE)
#define LIBRARY "visa64.dll"
#define loadLibrary(name) ((void*)LoadLibraryA(name))
#define symbol(library, name) ((void*)GetProcAddress((HMODULE)(library), name))
#define unloadLibrary(library) FreeLibrary((HMODULE)(library))
#else
#include <dlfcn.h>
#include <pthread.h>
#include <unistd.h>
#define THREAD_RESULT void*
#define parkThread() pause()
static void startThread(void* (*function)(void*), void* argument)
{
    pthread_t thread;
    if (pthread_create(&thread, NULL, function, argument) == 0) {
        pthread_detach(thread);
    }
}
#define LIBRARY "./libvisa.so"
#define loadLibrary(name) dlopen(name, RTLD_NOW | RTLD_LOCAL)
#define symbol(library, name) dlsym(library, name)
#define unloadLibrary(library) dlclose(library)
#endif

typedef ViStatus(_VI_FUNC* TOpenDefaultRM)(ViPSession);
typedef ViStatus(_VI_FUNC* TOpen)(ViSession, ViConstRsrc, ViAccessMode, ViUInt32, ViPSession);
typedef ViStatus(_VI_FUNC* TWrite)(ViSession, ViConstBuf, ViUInt32, ViPUInt32);
typedef ViStatus(_VI_FUNC* TRead)(ViSession, ViPBuf, ViUInt32, ViPUInt32);
typedef ViStatus(_VI_FUNC* TClose)(ViObject);

static TClose s_pfClose;
static ViSession s_nRm = VI_NULL;

static TRead s_pfRead;

/* LeakSanitizer's final check stops every thread, and cannot stop one that holds thread-local
   storage of a module loaded at run time (its tracer crashes). The "reading" mode leaves such a
   thread at exit, so it runs without the leak check; the address checks stay. */
static int s_bReading;
int __lsan_is_turned_off(void)
{
    return s_bReading;
}

/* The thread stays once its read has ended: the process's exit ends it. */
static THREAD_RESULT waitInRead(void* session)
{
    ViByte answer[256];
    ViUInt32 count = 0;
    s_pfRead((ViSession)(size_t)session, answer, sizeof answer, &count);
    for (;;) {
        parkThread();
    }
    return 0;
}

static void closeResourceManager(void)
{
    if (s_nRm != VI_NULL) {
        s_pfClose(s_nRm);
    }
}

int main(int argc, char** argv)
{
    static const char* const RESOURCES[2] = {"LBPMX::0x0003::100000::INSTR", "LBPMX::0x009a::100001::INSTR"};
    const char* mode = argc > 1 ? argv[1] : "exit";
    void* library;
    TOpenDefaultRM pfOpenDefaultRM;
    TOpen pfOpen;
    TWrite pfWrite;
    TRead pfRead;
    int sensors = 2;
    int i;

    if (strcmp(mode, "atexit") == 0) {
        atexit(closeResourceManager);
    }
    library = loadLibrary(LIBRARY);
    if (library == NULL) {
        fprintf(stderr, "cannot load %s\n", LIBRARY);
        return 2;
    }
    pfOpenDefaultRM = (TOpenDefaultRM)symbol(library, "viOpenDefaultRM");
    pfOpen = (TOpen)symbol(library, "viOpen");
    pfWrite = (TWrite)symbol(library, "viWrite");
    pfRead = (TRead)symbol(library, "viRead");
    s_pfClose = (TClose)symbol(library, "viClose");
    if (pfOpenDefaultRM == NULL || pfOpen == NULL || pfWrite == NULL || pfRead == NULL || s_pfClose == NULL ||
        pfOpenDefaultRM(&s_nRm) != VI_SUCCESS) {
        return 3;
    }
    s_pfRead = pfRead;
    s_bReading = strcmp(mode, "reading") == 0;
    if (s_bReading) {
        ViSession session = VI_NULL;
        if (pfOpen(s_nRm, RESOURCES[1], VI_NULL, 0, &session) != VI_SUCCESS) {
            return 6;
        }
        startThread(waitInRead, (void*)(size_t)session);
        sensors = 1;
    }
    for (i = 0; i < sensors; ++i) {
        ViSession session = VI_NULL;
        ViByte answer[256];
        ViUInt32 count = 0;
        if (pfOpen(s_nRm, RESOURCES[i], VI_NULL, 0, &session) != VI_SUCCESS ||
            pfWrite(session, (ViConstBuf) "INIT:CONT ON", 12, VI_NULL) != VI_SUCCESS ||
            pfWrite(session, (ViConstBuf) "FETCh?", 6, VI_NULL) != VI_SUCCESS) {
            return 4;
        }
        /* Waits for the first result (at most the session's time-out). */
        if (pfRead(session, answer, sizeof answer, &count) != VI_SUCCESS) {
            return 5;
        }
    }
    if (strcmp(mode, "unload") == 0) {
        unloadLibrary(library);
    }
    return 0;
}
