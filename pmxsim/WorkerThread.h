// Contract: the callback thread of the simulated library. startWorker runs fn(arg) on a new
// thread; while that thread runs, the library module stays loaded (on Windows the thread holds a
// reference to the module and releases it as its very last step), so unloading the library can
// never pull the code from under it. joinWorker waits for the end and frees the record (never
// call it from the thread itself); detachWorker lets the thread end on its own and frees the
// record (only from the thread itself). isWorkerThread tells whether the caller runs on that
// thread.
#ifndef PMXSIM_WORKERTHREAD_H
#define PMXSIM_WORKERTHREAD_H

namespace PmxSim {

struct SWorker;

SWorker* startWorker(void (*fn)(void*), void* arg); // null when no thread could be created
void joinWorker(SWorker* worker);
void detachWorker(SWorker* worker);
bool isWorkerThread(const SWorker* worker);

} // namespace PmxSim

#endif
