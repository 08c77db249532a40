// Preloaded into lbpmx-lan by the end-to-end check (LD_PRELOAD, LBPMX_LAN_SIMCTL=<folder>): a
// thread reads "detach <serial>" or "attach <type> <serial>" lines from the FIFO <folder>/ctl,
// runs them on the simulated sensor library (the same one the passport loads) and answers
// "<result code>" on the FIFO <folder>/ack, so the check knows when the sensor is gone.
#include <pthread.h>
#include <signal.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "pmxsim/PmxSim.h"

namespace {

// From the environment; never freed, so the thread may outlive static destruction.
const char* s_pFolder = nullptr;

void* control(void*)
{
    // Both FIFOs stay open for reading and writing, so each always has a writer and a reader:
    // a command sent while the last writer is closing is never lost with the pipe's buffer, and
    // a reader of the answer never meets the end of the last answer's writer instead of its own.
    std::FILE* in = std::fopen((std::string(s_pFolder) + "/ctl").c_str(), "r+");
    std::FILE* out = std::fopen((std::string(s_pFolder) + "/ack").c_str(), "r+");
    if (in == nullptr || out == nullptr)
        return nullptr;
    char line[256];
    while (std::fgets(line, sizeof line, in) != nullptr) {
        char type[64];
        char serial[64];
        long rc = -1;
        if (std::sscanf(line, "detach %63s", serial) == 1) {
            rc = PmxSimDetach(serial);
        } else if (std::sscanf(line, "attach %63s %63s", type, serial) == 2) {
            rc = PmxSimAttach(type, serial);
        }
        std::fprintf(out, "%ld\n", rc);
        std::fflush(out);
    }
    std::fclose(out);
    std::fclose(in);
    return nullptr;
}

__attribute__((constructor)) void startControl()
{
    const char* folder = std::getenv("LBPMX_LAN_SIMCTL");
    if (folder == nullptr)
        return;
    s_pFolder = folder;
    // The control thread takes no signals: the gateway waits for SIGTERM in its main thread.
    sigset_t all;
    sigset_t old;
    sigfillset(&all);
    pthread_sigmask(SIG_BLOCK, &all, &old);
    pthread_t thread;
    if (pthread_create(&thread, nullptr, control, nullptr) == 0)
        pthread_detach(thread);
    pthread_sigmask(SIG_SETMASK, &old, nullptr);
}

} // namespace
