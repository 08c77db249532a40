// Runs every benchmark against the passport of this build: four simulated sensors answering at
// once, logging at its defaults (no log file). One session stays open throughout, so that the
// sensor library's driver is not closed and reopened between benchmarks.
#include "bench/BenchSupport.h"
#include "pmxsim/PmxSim.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>

namespace LbBench {

namespace {
ViSession s_nResourceManager = VI_NULL;
}

ViSession resourceManager()
{
    return s_nResourceManager;
}

std::string sensorName(int index)
{
    return "LBPMX::0x0003::10000" + std::to_string(index) + "::INSTR";
}

} // namespace LbBench

int main(int argc, char** argv)
{
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) {
        return 1;
    }
    unsetenv("LBVIPMX_LOG_LEVEL");
    unsetenv("LBVIPMX_LOG_FILE");
    setenv("PMXSIM_DEVICES", "PMX-M01:100000,PMX-M01:100001,PMX-M01:100002,PMX-M01:100003", 1);
    if (PmxSimReset() != 0 || PmxSimSetDelays(0, 0) != 0 ||
        viOpenDefaultRM(&LbBench::s_nResourceManager) != VI_SUCCESS) {
        std::fprintf(stderr, "lbpmx_bench: the simulated sensors or the VISA runtime could not be set up\n");
        return 1;
    }
    ViSession keeper = VI_NULL;
    if (viOpen(LbBench::s_nResourceManager, LbBench::sensorName(LbBench::SENSOR_COUNT - 1).c_str(), VI_NULL, 0,
               &keeper) != VI_SUCCESS) {
        std::fprintf(stderr, "lbpmx_bench: the passport could not open a simulated sensor\n");
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    viClose(keeper);
    viClose(LbBench::s_nResourceManager);
    return 0;
}
