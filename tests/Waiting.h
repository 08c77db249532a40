#ifndef LBTESTS_WAITING_H
#define LBTESTS_WAITING_H
// How long tests wait, and how a test wakes a waiter that is really waiting: a thread's kernel id
// and a bounded wait until that thread sleeps in the kernel (Linux; elsewhere both do nothing and
// the test runs without that guarantee).
#include <chrono>
#include <fstream>
#include <string>
#include <thread>

#if defined(__linux__)
#include <sys/syscall.h>
#include <unistd.h>
#endif

namespace LbTests {

// Generous: what has not happened within this time means the code under test hangs.
const std::chrono::seconds DEADLINE(20);

// The calling thread's kernel id where the system has one (Linux), else 0.
inline long currentThreadId()
{
#if defined(__linux__)
    return static_cast<long>(::syscall(SYS_gettid));
#else
    return 0;
#endif
}

// Waits (at most DEADLINE) until the thread with that kernel id sleeps in the kernel, so a
// test can wake a waiter that is really waiting. Where thread states cannot be read (id 0, or
// not Linux) it returns at once: the test then still runs, only without that guarantee.
inline bool waitUntilSleeping(long threadId)
{
#if defined(__linux__)
    if (threadId == 0) {
        return true;
    }
    const std::string path = "/proc/self/task/" + std::to_string(threadId) + "/stat";
    const auto end = std::chrono::steady_clock::now() + DEADLINE;
    while (std::chrono::steady_clock::now() < end) {
        std::ifstream stat(path);
        std::string line;
        std::getline(stat, line);
        const std::size_t close = line.rfind(')'); // the name in parentheses may hold blanks
        if (close != std::string::npos && close + 2 < line.size() && line[close + 2] == 'S') {
            return true;
        }
        std::this_thread::yield();
    }
    return false;
#else
    (void)threadId;
    return true;
#endif
}

} // namespace LbTests

#endif
