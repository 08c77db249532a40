#include "sensor/PmxResourceInfo.h"

#include <cstdio>

namespace LbPmxVisa {

namespace {

const char* const c_szPrefix = "LBPMX";
const char* const c_szSeparator = "::";
const char* const c_szSuffix = "::INSTR";
const char* const c_szHexMarker = "0X";
const char* const c_szInterface = "USB";
const char* const c_szVendor = "0x0c6f";
const char* const c_szHexPrefix = "0x";

const char* const c_szEmpty = "VISA Resource can't be empty ";
const char* const c_szNotWellFormatted = "VISA Resource isn't well formatted ";
const char* const c_szNoPrefix = "VISA Resource isn't well formatted. A resource starts with LBPMX ";
const char* const c_szNotNumeric = "VISA Resource isn't well formatted. Model Code can only be numeric ";
const char* const c_szNoSeparator = "VISA Resource isn't well formatted";
const char* const c_szBadOption = "VISA Resource isn't well formatted. Optional Parameter is invalid.";

// Upper-cases with the C-locale rule only, whatever locale the application has set.
std::string toUpper(const std::string& text)
{
    std::string result(text);
    for (std::string::size_type i = 0; i < result.size(); ++i) {
        if (result[i] >= 'a' && result[i] <= 'z') {
            result[i] = static_cast<char>(result[i] - 'a' + 'A');
        }
    }
    return result;
}

int digitValue(char c, unsigned base)
{
    if (c >= '0' && c <= '9') {
        return c - '0';
    }
    if (base == 16 && c >= 'A' && c <= 'F') {
        return c - 'A' + 10;
    }
    return -1;
}

// Reads the digits of an upper-cased model field. Throws when a character is not a digit of
// the base; an empty number or one beyond 32 bits gives 0, which no sensor model uses.
std::uint32_t parseModelCode(const std::string& field)
{
    unsigned base = 10;
    std::string::size_type first = 0;
    if (field.find(c_szHexMarker) != std::string::npos) {
        base = 16;
        first = 2;
    }
    std::uint64_t value = 0;
    bool overflow = false;
    for (std::string::size_type i = first; i < field.size(); ++i) {
        const int digit = digitValue(field[i], base);
        if (digit < 0) {
            throw CPmxResourceInfo::CPmxResourceInfoException(c_szNotNumeric);
        }
        value = value * base + static_cast<unsigned>(digit);
        if (value > 0xFFFFFFFFull) {
            overflow = true;
            value = 0; // keeps scanning the rest for non-digits without wrapping
        }
    }
    return overflow ? 0 : static_cast<std::uint32_t>(value);
}

CPmxResourceInfo::TModelTable buildModelTable()
{
    static const struct {
        const char* text;
        std::uint32_t code;
    } rows[] = {
        {"PMX", 2},       {"PMX-M01", 3},   {"PMX-M02", 4},   {"PMX-M03", 11},  {"PMX-M04", 12},  {"PMX-M05", 19},
        {"PMX-M06", 20},  {"PMX-M07", 21},  {"PMX-M08", 81},  {"PMX-M09", 44},  {"PMX-M10", 154}, {"PMX-M11", 150},
        {"PMX-M12", 151}, {"PMX-M13", 152}, {"PMX-M14", 26},  {"PMX-M15", 33},  {"PMX-M16", 98},  {"PMX-M17", 46},
        {"PMX-M18", 82},  {"PMX-M19", 166}, {"PMX-M20", 167}, {"PMX-M21", 35},  {"PMX-M22", 131}, {"PMX-M23", 149},
        {"PMX-M24", 47},  {"PMX-M25", 45},  {"PMX-M26", 22},  {"PMX-M27", 23},  {"PMX-M28", 24},  {"PMX-M29", 25},
        {"PMX-M30", 112}, {"PMX-M31", 168}, {"PMX-M32", 143}, {"PMX-M33", 144},
    };
    CPmxResourceInfo::TModelTable table;
    for (const auto& row : rows) {
        table.insert(table.end(), CPmxResourceInfo::TModelTable::value_type(row.text, row.code));
    }
    return table;
}

const CPmxResourceInfo::CVisa& visaSerializer()
{
    static const CPmxResourceInfo::CVisa s_cVisa;
    return s_cVisa;
}

const CPmxResourceInfo::CPmx& pmxSerializer()
{
    static const CPmxResourceInfo::CPmx s_cPmx;
    return s_cPmx;
}

// Built while the module loads; the accessors also serve static objects built before these.
const CPmxResourceInfo::TModelTable& s_rcModelTable = CPmxResourceInfo::getModelTable();

} // namespace

const LbCore::CISerializer<const CPmxResourceInfo&, std::string>* const g_pcVisaSerializer = &visaSerializer();
const LbCore::CISerializer<const CPmxResourceInfo&, std::string>* const g_pcPmxSerializer = &pmxSerializer();

const CPmxResourceInfo::TModelTable& CPmxResourceInfo::getModelTable()
{
    static const TModelTable s_cTable = buildModelTable();
    return s_cTable;
}

CPmxResourceInfo::CPmxResourceInfo() : m_nModelCode(0) { }

CPmxResourceInfo::CPmxResourceInfo(const std::string& visaResource) : m_nModelCode(0)
{
    if (visaResource.empty()) {
        throw CPmxResourceInfoException(c_szEmpty);
    }
    const std::string text = toUpper(visaResource);

    const std::string::size_type colon = text.find(':');
    if (colon == std::string::npos) {
        throw CPmxResourceInfoException(c_szNotWellFormatted);
    }
    if (text.compare(0, colon, c_szPrefix) != 0) {
        throw CPmxResourceInfoException(c_szNoPrefix);
    }
    // The character after the first colon is taken as the second colon without a look.
    const std::string::size_type modelBegin = colon + 2;
    if (modelBegin > text.size()) {
        throw CPmxResourceInfoException(c_szNotWellFormatted);
    }
    const std::string::size_type modelEnd = text.find(':', modelBegin);
    if (modelEnd == std::string::npos) {
        throw CPmxResourceInfoException(c_szNotWellFormatted);
    }
    const std::uint32_t modelCode = parseModelCode(text.substr(modelBegin, modelEnd - modelBegin));
    if (text.compare(modelEnd, 2, c_szSeparator) != 0) {
        throw CPmxResourceInfoException(c_szNoSeparator);
    }
    std::string serial = text.substr(modelEnd + 2);
    const std::string::size_type optionBegin = serial.find(':');
    if (optionBegin != std::string::npos) {
        if (serial.compare(optionBegin, std::string::npos, c_szSuffix) != 0) {
            throw CPmxResourceInfoException(c_szBadOption);
        }
        serial.erase(optionBegin);
    }
    m_nModelCode = modelCode;
    m_sSerialNumber = serial;
}

CPmxResourceInfo::CPmxResourceInfo(const std::string& typeText, const std::string& serial)
    : m_nModelCode(0), m_sSerialNumber(serial)
{
    const TModelTable& table = getModelTable();
    const TModelTable::const_iterator row = table.find(typeText);
    if (row == table.end()) {
        throw CPmxResourceInfoException("VISA Resource isn't well formatted. The type parameter " + typeText +
                                        " is unknown");
    }
    m_nModelCode = row->second;
}

bool CPmxResourceInfo::operator==(const CPmxResourceInfo& other) const
{
    return m_nModelCode == other.m_nModelCode && m_sSerialNumber == other.m_sSerialNumber;
}

std::string CPmxResourceInfo::CVisa::serialize(const CPmxResourceInfo& info) const
{
    char code[16];
    std::snprintf(code, sizeof(code), "%04lx", static_cast<unsigned long>(info.getModelCode()));
    return std::string(c_szPrefix) + c_szSeparator + c_szHexPrefix + code + c_szSeparator + info.getSerialNumber() +
        c_szSuffix;
}

std::string CPmxResourceInfo::CPmx::serialize(const CPmxResourceInfo& info) const
{
    char code[16];
    std::snprintf(code, sizeof(code), "%04lu", static_cast<unsigned long>(info.getModelCode()));
    return std::string(c_szInterface) + c_szSeparator + c_szVendor + c_szSeparator + code + c_szSeparator +
        info.getSerialNumber();
}

} // namespace LbPmxVisa
