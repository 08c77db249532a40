#ifndef LBTESTS_SENSOR_SENSORTESTSUPPORT_H
#define LBTESTS_SENSOR_SENSORTESTSUPPORT_H
// Helpers of the sensor-layer tests: the core tests' latch and log capture, the capture at DEBUG
// level so that every line of the sensor layer is kept.
#include "tests/core/TestSupport.h"

namespace LbTests {

typedef CLatch CGate;
const std::chrono::seconds SENSOR_DEADLINE = DEADLINE;

// Attaches itself for its lifetime at DEBUG level and restores the threshold it found.
class CLogCapture : public CCaptureAppender {
public:
    CLogCapture() { LbCore::CLogManager::setLevel(LbCore::LEVEL_DEBUG); }
};

} // namespace LbTests

#endif
