// Format strings of formatted VISA I/O from applications: parsing as a printf or a scanf format
// fails only with CFormatError, and what parses is sound: literal text is never empty,
// conversions have a known code, fixed counts stay within g_nMaxFormatCount, and the literal
// text of a format without '%' is the format itself.
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "visahost/FormatParser.h"

using LbVisaHost::CFormatError;
using LbVisaHost::ECount;
using LbVisaHost::SFormatItem;

namespace {

void check(const std::string& strFormat, bool bScan)
{
    try {
        for (const SFormatItem& s : LbVisaHost::parseFormat(strFormat, bScan)) {
            if (s.m_bLiteral) {
                if (s.m_strText.empty())
                    std::abort();
                continue;
            }
            const auto& c = s.m_sConv;
            if (!std::strchr(bScan ? "diouxXeEfgGscbByTt[" : "diouxXeEfgGscbBy", c.m_cCode) || c.m_cCode == '\0')
                std::abort();
            for (int n : {c.m_nArray, c.m_nWidth, c.m_nPrecision})
                if (n < 0 || n > LbVisaHost::g_nMaxFormatCount)
                    std::abort();
            if (c.m_bArray && c.m_eArray == ECount::None)
                std::abort();
        }
        if (strFormat.find('%') == std::string::npos) {
            auto v = LbVisaHost::parseFormat(strFormat, bScan);
            if (strFormat.empty() ? !v.empty() : (v.size() != 1 || v[0].m_strText != strFormat))
                std::abort();
        }
    } catch (const CFormatError&) {
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string strInput(reinterpret_cast<const char*>(data), size);
    check(strInput, false);
    check(strInput, true);
    return 0;
}
