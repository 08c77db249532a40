// Splits a format string into literals and conversions (see FormatParser.h).
#include "visahost/FormatParser.h"

#include <cctype>
#include <cstring>

namespace LbVisaHost {

namespace {

const char g_szPrintCodes[] = "diouxXeEfgGscbBy";
const char g_szScanCodes[] = "diouxXeEfgGscbByTt[";

class CParser {
public:
    CParser(const std::string& strFormat, bool bScan) : m_str(strFormat), m_bScan(bScan) { }

    std::vector<SFormatItem> parse()
    {
        std::vector<SFormatItem> v;
        std::string strLiteral;
        while (m_nPos < m_str.size()) {
            char c = m_str[m_nPos++];
            if (c != '%') {
                strLiteral += c;
                continue;
            }
            if (peek() == '%') {
                ++m_nPos;
                strLiteral += '%';
                continue;
            }
            if (!strLiteral.empty()) {
                v.push_back(SFormatItem{true, strLiteral, SConversion()});
                strLiteral.clear();
            }
            SFormatItem s;
            s.m_bLiteral = false;
            s.m_sConv = conversion();
            v.push_back(s);
        }
        if (!strLiteral.empty())
            v.push_back(SFormatItem{true, strLiteral, SConversion()});
        return v;
    }

private:
    [[noreturn]] static void fail(const char* szWhy) { throw CFormatError(szWhy); }
    char peek() const { return m_nPos < m_str.size() ? m_str[m_nPos] : '\0'; }

    // A count: digits, '*' (argument) or '#' (argument, in and out for scanf).
    ECount count(int& nValue, bool bHashAllowed)
    {
        if (peek() == '*') {
            ++m_nPos;
            return ECount::Argument;
        }
        if (peek() == '#' && bHashAllowed) {
            ++m_nPos;
            return ECount::InOut;
        }
        if (!std::isdigit(static_cast<unsigned char>(peek())))
            return ECount::None;
        long nNumber = 0;
        while (std::isdigit(static_cast<unsigned char>(peek()))) {
            nNumber = nNumber * 10 + (m_str[m_nPos++] - '0');
            if (nNumber > g_nMaxFormatCount)
                fail("count too large");
        }
        nValue = static_cast<int>(nNumber);
        return ECount::Fixed;
    }

    SConversion conversion()
    {
        SConversion s;
        if (m_bScan && peek() == '*') {
            ++m_nPos;
            s.m_bSuppress = true;
        }
        while (!m_bScan && std::strchr("-+ 0#", peek()) && peek() != '\0')
            s.m_strFlags += m_str[m_nPos++];
        if (peek() == ',') {
            ++m_nPos;
            s.m_bArray = true;
            s.m_eArray = count(s.m_nArray, true);
            if (s.m_eArray == ECount::None)
                fail("array without size");
        }
        s.m_eWidth = count(s.m_nWidth, true);
        if (peek() == '.') {
            ++m_nPos;
            s.m_ePrecision = count(s.m_nPrecision, false);
            if (s.m_ePrecision == ECount::None)
                s.m_ePrecision = ECount::Fixed; // "%.f": zero
        }
        if (peek() == '!') {
            if (m_str.compare(m_nPos, 3, "!ob") == 0)
                s.m_bLittleEndian = false;
            else if (m_str.compare(m_nPos, 3, "!ol") == 0)
                s.m_bLittleEndian = true;
            else
                fail("unknown byte order");
            m_nPos += 3;
        }
        if (m_str.compare(m_nPos, 2, "ll") == 0) {
            s.m_strModifier = "ll";
            m_nPos += 2;
        } else if (std::strchr("hlLzZ", peek()) && peek() != '\0') {
            s.m_strModifier = m_str[m_nPos++];
        }
        char c = peek();
        if (c == '\0' || !std::strchr(m_bScan ? g_szScanCodes : g_szPrintCodes, c))
            fail("unknown conversion");
        ++m_nPos;
        s.m_cCode = c;
        if (c == '[')
            scanSet(s);
        bool bBinary = c == 'b' || c == 'B' || c == 'y';
        size_t nHash = s.m_strFlags.find('#');
        if (bBinary && nHash != std::string::npos) {
            // "%#b": the count of elements comes from the argument list.
            s.m_strFlags.erase(nHash, 1);
            if (s.m_eWidth != ECount::None)
                fail("two counts");
            s.m_eWidth = ECount::InOut;
        }
        if (!bBinary && (s.m_strModifier == "z" || s.m_strModifier == "Z"))
            fail("z and Z are for binary data");
        if (!bBinary && s.m_bLittleEndian)
            fail("byte order is for binary data");
        if (s.m_eWidth == ECount::InOut && !bBinary && !(m_bScan && (c == 's' || c == '[' || c == 't' || c == 'T')))
            fail("'#' width is for binary data and scanned strings");
        if (s.m_bArray && (bBinary || std::strchr("sct[T", c)))
            fail("arrays are of numbers");
        return s;
    }

    void scanSet(SConversion& s)
    {
        if (peek() == '^') {
            ++m_nPos;
            s.m_bSetNegated = true;
        }
        // A ']' right after the opening is a member.
        if (peek() == ']')
            s.m_strSet += m_str[m_nPos++];
        while (peek() != ']') {
            if (m_nPos >= m_str.size())
                fail("unterminated set");
            s.m_strSet += m_str[m_nPos++];
        }
        ++m_nPos;
    }

    const std::string& m_str;
    bool m_bScan;
    size_t m_nPos = 0;
};

} // namespace

std::vector<SFormatItem> parseFormat(const std::string& strFormat, bool bScan)
{
    return CParser(strFormat, bScan).parse();
}

} // namespace LbVisaHost
