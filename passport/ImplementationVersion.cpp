#include "passport/LbPmxInstrSesn.h"

#include <cstdlib>
#include <string>

namespace LbPmxPassport {

namespace {
const char* const MONTHS[12] = {"Jan", "Feb", "Mar", "Apr", "May", "Jun", "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
} // namespace

// Bits 0-3 are ones, 4-19 the low 16 bits of the date code (months since December 1998 and two
// digits of day), 20-23 the minor and 24 up the major file version. From 2053 on the date code
// no longer fits its 16 bits and wraps.
ViUInt32 CLbPmxInstrSesn::implementationVersion(const char* buildDate, unsigned major, unsigned minor)
{
    // "Mmm dd yyyy"; the compiler pads a one-digit day with a blank.
    std::string date(buildDate == nullptr ? "" : buildDate);
    unsigned month = 0;
    for (unsigned i = 0; i < 12 && date.size() >= 3; ++i) {
        if (date.compare(0, 3, MONTHS[i]) == 0) {
            month = i + 1;
        }
    }
    unsigned day = date.size() >= 6 ? static_cast<unsigned>(std::strtoul(date.substr(4, 2).c_str(), nullptr, 10)) : 0;
    unsigned year =
        date.size() >= 11 ? static_cast<unsigned>(std::strtoul(date.substr(7, 4).c_str(), nullptr, 10)) : 1999;
    ViUInt32 datecode = (12u * (year - 1999u) + month) * 100u + day;
    return (((major * 16u) + (minor % 16u)) << 20) | ((datecode << 4) & 0xFFFF0u) | 0xFu;
}

} // namespace LbPmxPassport
