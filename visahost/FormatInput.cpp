// viScanf's engine: each conversion of the format reads its text from the input and stores
// it through its argument pointers. Numbers are read as text and converted by the C library.
#include <cctype>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <limits>

#include "visahost/FormatParser.h"
#include "visahost/FormattedIo.h"

namespace LbVisaHost {

namespace {

struct SUserBuf { };
struct SEndOfInput { }; // the message ended before the format was satisfied

class CScanner {
public:
    CScanner(SArgs& sArgs, CScanInput& cIn) : m_sArgs(sArgs), m_cIn(cIn) { }

    void literal(const std::string& strText)
    {
        for (char c : strText) {
            if (std::isspace(static_cast<unsigned char>(c))) {
                skipBlanks();
                continue;
            }
            if (m_cIn.peek() != static_cast<unsigned char>(c))
                throw SEndOfInput();
            m_cIn.next();
        }
    }

    void convert(const SConversion& s)
    {
        char c = s.m_cCode;
        // Room for strings and binary data: a fixed width, or a count the caller passes in and out.
        ViInt32* pnInOut = nullptr;
        size_t nLimit = std::numeric_limits<size_t>::max();
        if (s.m_eWidth == ECount::Fixed)
            nLimit = static_cast<size_t>(s.m_nWidth);
        if (s.m_eWidth == ECount::InOut && !s.m_bSuppress) {
            pnInOut = va_arg(m_sArgs.m_ap, ViInt32*);
            if (!pnInOut || *pnInOut < 0)
                throw SUserBuf();
            nLimit = static_cast<size_t>(*pnInOut);
        }
        if (c == 'b' || c == 'B' || c == 'y')
            return binary(s, nLimit, pnInOut);
        if (s.m_bArray)
            return array(s);
        if (std::strchr("sctT[", c))
            return text(s, nLimit, pnInOut);
        skipBlanks();
        std::string strToken = std::strchr("eEfgG", c) ? realToken(nLimit) : integerToken(c, nLimit);
        if (s.m_bSuppress)
            return;
        void* p = va_arg(m_sArgs.m_ap, void*);
        if (!p)
            throw SUserBuf();
        storeNumber(s, strToken, p, 0);
    }

private:
    void skipBlanks()
    {
        while (m_cIn.peek() >= 0 && std::isspace(m_cIn.peek()))
            m_cIn.next();
    }
    bool take(std::string& str, size_t& nLimit)
    {
        if (nLimit == 0 || m_cIn.peek() < 0)
            return false;
        str += static_cast<char>(m_cIn.peek());
        m_cIn.next();
        --nLimit;
        return true;
    }
    bool peekIs(const char* szChars) const
    {
        int c = m_cIn.peek();
        return c > 0 && std::strchr(szChars, c) != nullptr;
    }

    std::string integerToken(char cCode, size_t nLimit)
    {
        std::string str;
        if (peekIs("+-"))
            take(str, nLimit);
        const char* szDigits = cCode == 'o'  ? "01234567"
            : (cCode == 'x' || cCode == 'X') ? "0123456789abcdefABCDEF"
                                             : "0123456789";
        if ((cCode == 'i' || cCode == 'x' || cCode == 'X') && peekIs("0")) {
            take(str, nLimit);
            if (peekIs("xX")) {
                take(str, nLimit);
                szDigits = "0123456789abcdefABCDEF";
            } else if (cCode == 'i') {
                szDigits = "01234567";
            }
        }
        while (peekIs(szDigits) && take(str, nLimit)) { }
        if (str.empty() || str == "+" || str == "-")
            throw SEndOfInput();
        return str;
    }

    std::string realToken(size_t nLimit)
    {
        std::string str;
        if (peekIs("+-"))
            take(str, nLimit);
        if (peekIs("iInN")) {
            // INF, INFINITY, NAN: strtod knows the spellings.
            while (m_cIn.peek() > 0 && std::isalpha(m_cIn.peek()) && take(str, nLimit)) { }
        } else {
            bool bExponent = false;
            while ((peekIs("0123456789.") || (peekIs("eE") && !bExponent) ||
                    (peekIs("+-") && !str.empty() && (str.back() == 'e' || str.back() == 'E'))) &&
                   take(str, nLimit)) {
                bExponent = bExponent || str.back() == 'e' || str.back() == 'E';
            }
        }
        if (str.empty() || str == "+" || str == "-")
            throw SEndOfInput();
        return str;
    }

    // Stores a number token as element nIndex of the argument's type.
    void storeNumber(const SConversion& s, const std::string& strToken, void* p, size_t nIndex)
    {
        const std::string& m = s.m_strModifier;
        if (std::strchr("eEfgG", s.m_cCode)) {
            double d = std::strtod(strToken.c_str(), nullptr);
            // Single values are doubles unless "h"... arrays are ViReal32 without a modifier.
            if ((s.m_bArray && m.empty()) || m == "h")
                static_cast<ViReal32*>(p)[nIndex] = static_cast<ViReal32>(d);
            else if (m == "L" && !s.m_bArray)
                static_cast<long double*>(p)[nIndex] = d;
            else
                static_cast<ViReal64*>(p)[nIndex] = d;
            return;
        }
        int nBase = s.m_cCode == 'o' ? 8 : (s.m_cCode == 'x' || s.m_cCode == 'X') ? 16 : s.m_cCode == 'i' ? 0 : 10;
        errno = 0;
        long long n = strToken[0] == '-' ? std::strtoll(strToken.c_str(), nullptr, nBase)
                                         : static_cast<long long>(std::strtoull(strToken.c_str(), nullptr, nBase));
        if (m == "h")
            static_cast<ViInt16*>(p)[nIndex] = static_cast<ViInt16>(n);
        else if (m == "ll" || m == "L")
            static_cast<ViInt64*>(p)[nIndex] = n;
        else
            static_cast<ViInt32*>(p)[nIndex] = static_cast<ViInt32>(n);
    }

    void array(const SConversion& s)
    {
        ViInt32* pnCount = nullptr;
        size_t nMax = static_cast<size_t>(s.m_nArray);
        if (s.m_eArray != ECount::Fixed) {
            pnCount = va_arg(m_sArgs.m_ap, ViInt32*);
            if (!pnCount || *pnCount < 0)
                throw SUserBuf();
            nMax = static_cast<size_t>(*pnCount);
        }
        void* p = s.m_bSuppress ? nullptr : va_arg(m_sArgs.m_ap, void*);
        if (!p && !s.m_bSuppress)
            throw SUserBuf();
        bool bReal = std::strchr("eEfgG", s.m_cCode) != nullptr;
        size_t nRead = 0;
        for (; nRead < nMax; ++nRead) {
            if (nRead > 0) {
                skipBlanks();
                if (!peekIs(","))
                    break;
                m_cIn.next();
            }
            skipBlanks();
            size_t nNoLimit = std::numeric_limits<size_t>::max();
            std::string strToken;
            try {
                strToken = bReal ? realToken(nNoLimit) : integerToken(s.m_cCode, nNoLimit);
            } catch (const SEndOfInput&) {
                if (nRead == 0)
                    throw;
                break;
            }
            if (p)
                storeNumber(s, strToken, p, nRead);
        }
        if (pnCount)
            *pnCount = static_cast<ViInt32>(nRead);
    }

    // Members of "%[...]": characters and ranges "a-z" ('-' first or last is itself).
    static bool inSet(const SConversion& s, int c)
    {
        const std::string& str = s.m_strSet;
        bool bIn = false;
        for (size_t i = 0; i < str.size() && !bIn; ++i) {
            auto cFirst = static_cast<unsigned char>(str[i]);
            if (i + 2 < str.size() && str[i + 1] == '-') {
                bIn = c >= cFirst && c <= static_cast<unsigned char>(str[i + 2]);
                i += 2;
            } else {
                bIn = c == cFirst;
            }
        }
        return s.m_bSetNegated ? !bIn : bIn;
    }

    void text(const SConversion& s, size_t nLimit, ViInt32* pnInOut)
    {
        char c = s.m_cCode;
        if (c == 's')
            skipBlanks();
        if (c == 'c' && s.m_eWidth == ECount::None)
            nLimit = 1;
        // Strings keep room for their terminating zero.
        size_t nRoom = pnInOut && c != 'c' ? (nLimit > 0 ? nLimit - 1 : 0) : nLimit;
        std::string str;
        for (;;) {
            int n = m_cIn.peek();
            if (n < 0)
                break;
            if (c == 's' && std::isspace(n))
                break;
            if (c == '[' && !inSet(s, n))
                break;
            if (str.size() >= nRoom) {
                if (c != 't' && c != 'T')
                    break;
                m_cIn.next(); // "%t" / "%T" read the whole message or line; what does not fit is lost
            } else {
                str += static_cast<char>(n);
                m_cIn.next();
            }
            if (c == 'T' && n == '\n')
                break;
        }
        if (str.empty() && c != 't' && c != 'T')
            throw SEndOfInput();
        if (s.m_bSuppress)
            return;
        char* pc = va_arg(m_sArgs.m_ap, char*);
        if (!pc)
            throw SUserBuf();
        std::memcpy(pc, str.data(), str.size());
        if (c != 'c' && (!pnInOut || nLimit > 0))
            pc[str.size()] = '\0';
        if (pnInOut)
            *pnInOut = static_cast<ViInt32>(str.size());
    }

    // IEEE 488.2 blocks ("#<n><length><data>" or "#0<data up to the end>") or raw data ("%y").
    void binary(const SConversion& s, size_t nMaxElements, ViInt32* pnInOut)
    {
        size_t nSize = binaryElementSize(s.m_strModifier);
        size_t nBytes = std::numeric_limits<size_t>::max(); // up to the end of the message
        if (s.m_cCode == 'y') {
            if (nMaxElements == std::numeric_limits<size_t>::max())
                throw CFormatError("%y needs a count");
            nBytes = nMaxElements * nSize;
        } else {
            skipBlanks();
            if (m_cIn.peek() != '#')
                throw SEndOfInput();
            m_cIn.next();
            int nDigits = m_cIn.peek() - '0';
            if (nDigits < 0 || nDigits > 9)
                throw SEndOfInput();
            m_cIn.next();
            if (nDigits > 0) {
                nBytes = 0;
                for (int i = 0; i < nDigits; ++i) {
                    int d = m_cIn.peek() - '0';
                    if (d < 0 || d > 9)
                        throw SEndOfInput();
                    nBytes = nBytes * 10 + static_cast<size_t>(d);
                    m_cIn.next();
                }
            }
        }
        unsigned char* p = s.m_bSuppress ? nullptr : va_arg(m_sArgs.m_ap, unsigned char*);
        if (!p && !s.m_bSuppress)
            throw SUserBuf();
        bool bSwap = swapsBytes(s.m_bLittleEndian, nSize);
        size_t nStored = 0, nElement = 0;
        unsigned char acElement[8];
        for (size_t i = 0; i < nBytes && m_cIn.peek() >= 0; ++i) {
            acElement[nElement++] = static_cast<unsigned char>(m_cIn.peek());
            m_cIn.next();
            if (nElement < nSize)
                continue;
            nElement = 0;
            // Elements beyond the caller's room are read and dropped: the block is consumed whole.
            if (p && nStored < nMaxElements) {
                for (size_t j = 0; j < nSize; ++j)
                    p[nStored * nSize + j] = acElement[bSwap ? nSize - 1 - j : j];
            }
            ++nStored;
        }
        if (pnInOut)
            *pnInOut = static_cast<ViInt32>(nStored < nMaxElements ? nStored : nMaxElements);
    }

    SArgs& m_sArgs;
    CScanInput& m_cIn;
};

} // namespace

ViStatus scanInput(ViConstString szFormat, SArgs& sArgs, CScanInput& cInput)
{
    if (!szFormat)
        return VI_ERROR_USER_BUF;
    std::vector<SFormatItem> vItems;
    try {
        vItems = parseFormat(szFormat, true);
    } catch (const CFormatError&) {
        return VI_ERROR_INV_FMT;
    }
    CScanner cScanner(sArgs, cInput);
    try {
        for (const SFormatItem& s : vItems) {
            if (s.m_bLiteral)
                cScanner.literal(s.m_strText);
            else
                cScanner.convert(s.m_sConv);
        }
    } catch (const SEndOfInput&) {
    } catch (const SUserBuf&) {
        return VI_ERROR_USER_BUF;
    } catch (const CFormatError&) {
        return VI_ERROR_INV_FMT;
    }
    return cInput.status();
}

} // namespace LbVisaHost
