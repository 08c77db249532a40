#include "core/LogTime.h"

#include <clocale>
#include <ctime>
#include <locale.h>

namespace LbCore {
namespace LogTime {

namespace {
// The environment's locale (LANG / LC_TIME / LC_ALL) decides the short date, as the system
// default locale does on Windows; the time is always written in 24-hour form.
locale_t environmentLocale()
{
    static locale_t s_aLocale = [] {
        locale_t locale = newlocale(LC_TIME_MASK, "", (locale_t) nullptr);
        return locale != (locale_t) nullptr ? locale : newlocale(LC_TIME_MASK, "C", (locale_t) nullptr);
    }();
    return s_aLocale;
}
} // namespace

void format(std::string& date, std::string& time)
{
    std::time_t now = std::time(nullptr);
    struct tm local;
    localtime_r(&now, &local);
    char buffer[16];
    date = strftime_l(buffer, sizeof buffer, "%x", &local, environmentLocale()) > 0 ? buffer : "";
    time = strftime_l(buffer, sizeof buffer, "%H:%M:%S", &local, environmentLocale()) > 0 ? buffer : "";
}

} // namespace LogTime
} // namespace LbCore
