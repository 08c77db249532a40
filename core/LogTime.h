#ifndef LBCORE_LOGTIME_H
#define LBCORE_LOGTIME_H
// Internal to core/: the date and time fields of a log line, one implementation per platform.
// A field that does not fit 16 characters is left empty.
#include <string>

namespace LbCore {
namespace LogTime {

void format(std::string& date, std::string& time);

} // namespace LogTime
} // namespace LbCore

#endif
