// Scenario files: the parser takes any bytes without crashing, hanging or leaking; a file it
// accepts holds only sensors that can be listed (valid, distinct serials) and known functions,
// and a file it refuses leaves the scenario untouched with a reason. The sensor commands are
// parsed too, since scenario answers sit beside them.
#include "pmxsim/CommandParser.h"
#include "pmxsim/Scenario.h"

#include <cstdint>
#include <cstdlib>
#include <set>
#include <string>

namespace {

void check(bool condition)
{
    if (!condition)
        std::abort();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string input(reinterpret_cast<const char*>(data), size);
    PmxSim::SScenario scenario;
    scenario.nAckMs = -1; // a marker: a refused file must not touch the scenario
    int line = -1;
    std::string reason;
    if (PmxSim::parseScenario(input, &scenario, &line, &reason)) {
        std::set<std::string> serials;
        for (const PmxSim::SSensorModel& sensor : scenario.sensors) {
            check(PmxSim::validText(sensor.strType.c_str()));
            check(PmxSim::validText(sensor.strSerial.c_str()));
            check(serials.insert(PmxSim::lower(sensor.strSerial)).second);
            check(sensor.power.eKind != PmxSim::SPowerModel::POWER_MODEL_SEQUENCE || !sensor.power.levels.empty());
            for (const PmxSim::SAnswer& answer : sensor.answers)
                PmxSim::matchesPattern(answer.strPattern.c_str(), input.c_str());
        }
        for (const PmxSim::SFault& fault : scenario.faults)
            check(fault.nFunction >= 0 && fault.nFunction < PmxSim::FUNCTION_COUNT && fault.nCall >= 1 &&
                  fault.nCode != 0);
        check(scenario.nAckMs >= 0 && scenario.nMeasureMs >= 0);
    } else {
        check(scenario.nAckMs == -1 && !reason.empty() && line >= 0);
    }
    PmxSim::parseCommand(input);
    return 0;
}
