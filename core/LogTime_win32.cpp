#include "core/LogTime.h"

#include <windows.h>

namespace LbCore {
namespace LogTime {

void format(std::string& date, std::string& time)
{
    SYSTEMTIME local;
    GetLocalTime(&local);
    char buffer[16];
    date = GetDateFormatA(LOCALE_SYSTEM_DEFAULT, DATE_SHORTDATE, &local, 0, buffer, sizeof buffer) > 0 ? buffer : "";
    time = GetTimeFormatA(LOCALE_SYSTEM_DEFAULT, TIME_FORCE24HOURFORMAT, &local, 0, buffer, sizeof buffer) > 0 ? buffer
                                                                                                               : "";
}

} // namespace LogTime
} // namespace LbCore
