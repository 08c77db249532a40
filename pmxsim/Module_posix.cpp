// Unloading the shared object (dlclose or process exit) stops a callback thread that the
// application left running, so no thread outlives the library. Windows needs no counterpart: there
// the thread keeps the module loaded while it runs, and at process exit it is already gone.
#include "pmxsim/Simulator.h"

namespace {
__attribute__((destructor)) void unloadSimulator()
{
    PmxSim::CSimulator::shutdownAtUnload();
}
} // namespace
