#ifndef LBBENCH_BENCHSUPPORT_H
#define LBBENCH_BENCHSUPPORT_H
// What the VISA benchmarks share: the resource manager opened by main() and four simulated
// sensors at zero delay.
#include "visahost/include/visa.h"

#include <string>

namespace LbBench {

const int SENSOR_COUNT = 4;

ViSession resourceManager();
// "LBPMX::0x0003::10000<index>::INSTR", index 0 .. SENSOR_COUNT - 1.
std::string sensorName(int index);

} // namespace LbBench

#endif
