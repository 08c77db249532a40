#ifndef LBPMXVISA_PMXRESOURCEINFO_H
#define LBPMXVISA_PMXRESOURCEINFO_H
// CPmxResourceInfo: the model code and serial number that name one sensor (a copyable value).
// Built by parsing the VISA form 'LBPMX::<model code>::<serial>[::INSTR]' (any letter case,
// model code decimal or 0X-hexadecimal; the stored serial is upper-cased) or from the type
// text and serial text the sensor library reports (type text looked up in the model table,
// serial kept as given). Every failure throws CPmxResourceInfoException with a fixed text.
// CVisa writes the VISA form LBPMX::0x<hex, 4+ digits>::<serial>::INSTR, CPmx the sensor
// library form USB::0x0c6f::<decimal, 4+ digits>::<serial>; users reach them through
// g_pcVisaSerializer and g_pcPmxSerializer. Model table and serializers are built at module
// load and only read afterwards, so any thread may parse and format at any time.
#include "core/Command.h"

#include <cstdint>
#include <exception>
#include <map>
#include <string>

namespace LbPmxVisa {

class CPmxResourceInfo {
public:
    typedef std::map<std::string, std::uint32_t> TModelTable;
    typedef LbCore::CISerializer<const CPmxResourceInfo&, std::string> CSerializer;

    class CPmxResourceInfoException : public std::exception {
    public:
        explicit CPmxResourceInfoException(const std::string& message) : m_sMessage(message) { }
        const char* what() const noexcept override { return m_sMessage.c_str(); }

    private:
        std::string m_sMessage;
    };

    class CVisa : public CSerializer {
    public:
        std::string serialize(const CPmxResourceInfo& info) const override;
    };

    class CPmx : public CSerializer {
    public:
        std::string serialize(const CPmxResourceInfo& info) const override;
    };

    CPmxResourceInfo();
    explicit CPmxResourceInfo(const std::string& visaResource);
    CPmxResourceInfo(const std::string& typeText, const std::string& serial);

    std::uint32_t getModelCode() const { return m_nModelCode; }
    const std::string& getSerialNumber() const { return m_sSerialNumber; }

    bool operator==(const CPmxResourceInfo& other) const;
    bool operator!=(const CPmxResourceInfo& other) const { return !(*this == other); }

    // The type texts of the sensor models and their model codes.
    static const TModelTable& getModelTable();

private:
    std::uint32_t m_nModelCode;
    std::string m_sSerialNumber;
};

extern const LbCore::CISerializer<const CPmxResourceInfo&, std::string>* const g_pcVisaSerializer;
extern const LbCore::CISerializer<const CPmxResourceInfo&, std::string>* const g_pcPmxSerializer;

} // namespace LbPmxVisa

#endif
