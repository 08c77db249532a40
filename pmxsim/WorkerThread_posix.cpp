#include "pmxsim/WorkerThread.h"

#include <pthread.h>

#include <new>

namespace PmxSim {

struct SWorker {
    pthread_t thread;
    void (*fn)(void*);
    void* arg;
};

namespace {
void* trampoline(void* p)
{
    // Copied first: a worker that detaches itself frees the record while it still runs.
    SWorker* worker = static_cast<SWorker*>(p);
    void (*fn)(void*) = worker->fn;
    void* arg = worker->arg;
    fn(arg);
    return nullptr;
}
} // namespace

SWorker* startWorker(void (*fn)(void*), void* arg)
{
    SWorker* worker = new (std::nothrow) SWorker{pthread_t(), fn, arg};
    if (worker == nullptr)
        return nullptr;
    if (pthread_create(&worker->thread, nullptr, trampoline, worker) != 0) {
        delete worker;
        return nullptr;
    }
    return worker;
}

void joinWorker(SWorker* worker)
{
    pthread_join(worker->thread, nullptr);
    delete worker;
}

void detachWorker(SWorker* worker)
{
    pthread_detach(worker->thread);
    delete worker;
}

bool isWorkerThread(const SWorker* worker)
{
    return worker != nullptr && pthread_equal(worker->thread, pthread_self()) != 0;
}

} // namespace PmxSim
