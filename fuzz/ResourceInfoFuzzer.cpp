// Resource strings from applications: parsing never fails other than with
// CPmxResourceInfoException, and whatever parses formats back to a string that parses to an
// equal info. The type-text constructor gets the input split at its first line feed.
#include "sensor/PmxResourceInfo.h"

#include <cstdint>
#include <cstdlib>
#include <string>

using LbPmxVisa::CPmxResourceInfo;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string input(reinterpret_cast<const char*>(data), size);
    try {
        const CPmxResourceInfo info(input);
        const std::string visa = LbPmxVisa::g_pcVisaSerializer->serialize(info);
        LbPmxVisa::g_pcPmxSerializer->serialize(info);
        if (!(CPmxResourceInfo(visa) == info)) {
            std::abort();
        }
    } catch (const CPmxResourceInfo::CPmxResourceInfoException&) {
    }

    const std::string::size_type split = input.find('\n');
    try {
        const CPmxResourceInfo info(input.substr(0, split),
                                    split == std::string::npos ? std::string() : input.substr(split + 1));
        if (CPmxResourceInfo::getModelTable().count(input.substr(0, split)) != 1) {
            std::abort();
        }
    } catch (const CPmxResourceInfo::CPmxResourceInfoException&) {
    }
    return 0;
}
