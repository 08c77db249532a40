// CFormatParser: the format strings of formatted I/O (viPrintf / viScanf families), split into
// literal text and conversions. A conversion is
//   % [flags] [,array-size] [width] [.precision] [!ob|!ol] [modifier] code
// flags "-+ 0#" (printf; '*' suppresses the assignment in scanf), array-size a number, '*' or
// '#' (the size comes from the argument list), width a number, '*' or '#' (for %b / %B / %y a
// count of elements from the argument list), modifiers h l ll L z Z, codes d i o u x X e E f
// g G s c b B y t T [ %. "%[set]" / "%[^set]" carry their character set. Bad syntax throws
// CFormatError; parsing is linear in the length of the format.
#ifndef LBVISAHOST_FORMATPARSER_H
#define LBVISAHOST_FORMATPARSER_H

#include <stdexcept>
#include <string>
#include <vector>

namespace LbVisaHost {

class CFormatError : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

// Where a count (array size, width, precision) comes from.
enum class ECount { None, Fixed, Argument, InOut };

struct SConversion {
    char m_cCode = 0;
    std::string m_strFlags;   // printf flags, in order
    bool m_bSuppress = false; // scanf "%*d"
    bool m_bArray = false;
    ECount m_eArray = ECount::None;
    int m_nArray = 0;
    ECount m_eWidth = ECount::None;
    int m_nWidth = 0;
    ECount m_ePrecision = ECount::None;
    int m_nPrecision = 0;
    std::string m_strModifier;    // "", "h", "l", "ll", "L", "z", "Z"
    bool m_bLittleEndian = false; // !ol
    std::string m_strSet;         // %[...] without the brackets and the '^'
    bool m_bSetNegated = false;
};

struct SFormatItem {
    bool m_bLiteral = true;
    std::string m_strText; // literal text
    SConversion m_sConv;
};

// Largest width, precision or array size written in a format.
const int g_nMaxFormatCount = 1 << 24;

std::vector<SFormatItem> parseFormat(const std::string& strFormat, bool bScan);

} // namespace LbVisaHost

#endif
