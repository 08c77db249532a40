// viPrintf's engine: each conversion of the format takes its arguments and appends its text.
#include <cstdio>
#include <cstring>
#include <vector>

#include "visahost/FormatParser.h"
#include "visahost/FormattedIo.h"

namespace LbVisaHost {

size_t binaryElementSize(const std::string& strModifier)
{
    if (strModifier == "h")
        return 2;
    if (strModifier == "l" || strModifier == "z")
        return 4;
    if (strModifier == "ll" || strModifier == "L" || strModifier == "Z")
        return 8;
    return 1;
}

bool swapsBytes(bool bLittleEndianData, size_t nSize)
{
    const unsigned n = 1;
    unsigned char c;
    std::memcpy(&c, &n, 1);
    const bool bLittleEndianHost = c == 1;
    return bLittleEndianData != bLittleEndianHost && nSize > 1;
}

namespace {

// snprintf of one value into strOut; the C library does every number conversion.
template <typename T> void appendFormatted(std::string& strOut, const std::string& strSpec, T value)
{
    char acSmall[128];
    int n = std::snprintf(acSmall, sizeof acSmall, strSpec.c_str(), value);
    if (n < 0)
        throw CFormatError("conversion failed");
    if (static_cast<size_t>(n) < sizeof acSmall) {
        strOut.append(acSmall, static_cast<size_t>(n));
        return;
    }
    std::vector<char> v(static_cast<size_t>(n) + 1);
    std::snprintf(v.data(), v.size(), strSpec.c_str(), value);
    strOut.append(v.data(), static_cast<size_t>(n));
}

class CFormatter {
public:
    CFormatter(SArgs& sArgs, std::string& strOut) : m_sArgs(sArgs), m_strOut(strOut) { }

    void convert(const SConversion& s)
    {
        int nWidth = s.m_eWidth == ECount::Fixed ? s.m_nWidth : -1;
        int nPrecision = s.m_ePrecision == ECount::Fixed ? s.m_nPrecision : -1;
        bool bBinary = s.m_cCode == 'b' || s.m_cCode == 'B' || s.m_cCode == 'y';
        if (s.m_eWidth == ECount::Argument || (s.m_eWidth == ECount::InOut && bBinary))
            nWidth = va_arg(m_sArgs.m_ap, int);
        if (s.m_ePrecision == ECount::Argument)
            nPrecision = va_arg(m_sArgs.m_ap, int);
        if (bBinary)
            return binary(s, nWidth);
        // The C library's own conversion for one element: flags, width, precision, code.
        std::string strSpec = "%" + s.m_strFlags;
        if (nWidth >= 0)
            strSpec += std::to_string(nWidth);
        if (nPrecision >= 0)
            strSpec += "." + std::to_string(nPrecision);
        char c = s.m_cCode;
        if (c == 's') {
            const char* sz = va_arg(m_sArgs.m_ap, const char*);
            if (!sz)
                throw SUserBuf();
            appendFormatted(m_strOut, strSpec + "s", sz);
        } else if (c == 'c') {
            appendFormatted(m_strOut, strSpec + "c", va_arg(m_sArgs.m_ap, int));
        } else if (s.m_bArray) {
            array(s, strSpec);
        } else if (std::strchr("eEfgG", c)) {
            double d = s.m_strModifier == "L" ? static_cast<double>(va_arg(m_sArgs.m_ap, long double))
                                              : va_arg(m_sArgs.m_ap, double);
            appendFormatted(m_strOut, strSpec + c, d);
        } else {
            integer(s, strSpec, fetchInteger(s.m_strModifier));
        }
    }

    struct SUserBuf { };

private:
    long long fetchInteger(const std::string& strModifier)
    {
        if (strModifier == "ll" || strModifier == "L")
            return va_arg(m_sArgs.m_ap, ViInt64);
        if (strModifier == "l")
            return va_arg(m_sArgs.m_ap, ViInt32);
        if (strModifier == "h")
            return static_cast<short>(va_arg(m_sArgs.m_ap, int));
        return va_arg(m_sArgs.m_ap, int);
    }

    // Unsigned codes see the value in the width of its type.
    void integer(const SConversion& s, const std::string& strSpec, long long nValue)
    {
        if (s.m_cCode == 'd' || s.m_cCode == 'i') {
            appendFormatted(m_strOut, strSpec + "ll" + s.m_cCode, nValue);
            return;
        }
        unsigned long long nBits = static_cast<unsigned long long>(nValue);
        if (s.m_strModifier == "h")
            nBits &= 0xFFFFull;
        else if (s.m_strModifier != "ll" && s.m_strModifier != "L")
            nBits &= 0xFFFFFFFFull;
        appendFormatted(m_strOut, strSpec + "ll" + s.m_cCode, nBits);
    }

    void array(const SConversion& s, const std::string& strSpec)
    {
        int nCount = s.m_eArray == ECount::Fixed ? s.m_nArray : va_arg(m_sArgs.m_ap, int);
        const void* p = va_arg(m_sArgs.m_ap, const void*);
        if (!p || nCount < 0)
            throw SUserBuf();
        bool bFloat = std::strchr("eEfgG", s.m_cCode) != nullptr;
        const std::string& m = s.m_strModifier;
        for (int i = 0; i < nCount; ++i) {
            if (i > 0)
                m_strOut += ',';
            if (bFloat) {
                double d = m.empty() ? static_cast<const ViReal32*>(p)[i] : static_cast<const ViReal64*>(p)[i];
                appendFormatted(m_strOut, strSpec + s.m_cCode, d);
            } else if (m == "h") {
                integer(s, strSpec, static_cast<const ViInt16*>(p)[i]);
            } else if (m == "ll" || m == "L") {
                integer(s, strSpec, static_cast<const ViInt64*>(p)[i]);
            } else {
                integer(s, strSpec, static_cast<const ViInt32*>(p)[i]);
            }
        }
    }

    void binary(const SConversion& s, int nCount)
    {
        if (nCount < 0)
            throw CFormatError("binary data needs a count");
        const auto* p = va_arg(m_sArgs.m_ap, const unsigned char*);
        if (!p && nCount > 0)
            throw SUserBuf();
        size_t nSize = binaryElementSize(s.m_strModifier);
        size_t nBytes = static_cast<size_t>(nCount) * nSize;
        if (s.m_cCode == 'b') {
            std::string strLength = std::to_string(nBytes);
            m_strOut += '#';
            m_strOut += static_cast<char>('0' + strLength.size());
            m_strOut += strLength;
        } else if (s.m_cCode == 'B') {
            m_strOut += "#0";
        }
        // Elements go out big-endian ("!ob", the default) or little-endian ("!ol").
        bool bSwap = swapsBytes(s.m_bLittleEndian, nSize);
        for (size_t i = 0; i < nBytes; i += nSize)
            for (size_t j = 0; j < nSize; ++j)
                m_strOut += static_cast<char>(p[i + (bSwap ? nSize - 1 - j : j)]);
    }

    SArgs& m_sArgs;
    std::string& m_strOut;
};

} // namespace

ViStatus formatOutput(ViConstString szFormat, SArgs& sArgs, std::string& strOut)
{
    if (!szFormat)
        return VI_ERROR_USER_BUF;
    try {
        CFormatter cFormatter(sArgs, strOut);
        for (const SFormatItem& s : parseFormat(szFormat, false)) {
            if (s.m_bLiteral)
                strOut += s.m_strText;
            else
                cFormatter.convert(s.m_sConv);
        }
        return VI_SUCCESS;
    } catch (const CFormatError&) {
        return VI_ERROR_INV_FMT;
    } catch (const CFormatter::SUserBuf&) {
        return VI_ERROR_USER_BUF;
    }
}

} // namespace LbVisaHost
