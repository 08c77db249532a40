#include "sensor/PmxResourceInfo.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

using LbPmxVisa::CPmxResourceInfo;

namespace {

std::string parseError(const std::string& resource)
{
    try {
        CPmxResourceInfo info(resource);
    } catch (const CPmxResourceInfo::CPmxResourceInfoException& e) {
        return e.what();
    }
    return "<parsed>";
}

} // namespace

TEST(ResourceInfoParse, RejectsEachMalformedResourceWithItsMessage)
{
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"", "VISA Resource can't be empty "},
        {"LBPMX", "VISA Resource isn't well formatted "},
        {"LBPMX:", "VISA Resource isn't well formatted "},
        {"ABC::3::1", "VISA Resource isn't well formatted. A resource starts with LBPMX "},
        {"::3::1", "VISA Resource isn't well formatted. A resource starts with LBPMX "},
        {"LBPMX::3", "VISA Resource isn't well formatted "},
        {"LBPMX::3A::1", "VISA Resource isn't well formatted. Model Code can only be numeric "},
        {"LBPMX::0X3G::1", "VISA Resource isn't well formatted. Model Code can only be numeric "},
        {"LBPMX::-3::1", "VISA Resource isn't well formatted. Model Code can only be numeric "},
        {"LBPMX::3:1", "VISA Resource isn't well formatted"},
        {"LBPMX::3::1::SOCKET", "VISA Resource isn't well formatted. Optional Parameter is invalid."},
        {"LBPMX::3::1::INSTR::X", "VISA Resource isn't well formatted. Optional Parameter is invalid."},
        {"LBPMX::3::1:INSTR", "VISA Resource isn't well formatted. Optional Parameter is invalid."},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(c.second, parseError(c.first)) << "resource '" << c.first << "'";
    }
}

TEST(ResourceInfoParse, AcceptsBothNumberFormsAndTheOptionalSuffixInAnyCase)
{
    struct Case {
        const char* resource;
        std::uint32_t modelCode;
        const char* serial;
    };
    const Case cases[] = {
        {"LbPmx::3::100000", 3, "100000"},
        {"lbpmx::0x9A::abc::instr", 154, "ABC"},
        {"LBPMX::0x0003::100000::INSTR", 3, "100000"},
        {"LBPMX::0X9a::1::Instr", 154, "1"},
        {"LBPMX::3::", 3, ""},
        {"LBPMX::::7", 0, "7"},
        {"LBPMX::0x::7", 0, "7"},
        {"LBPMX::0x12345::7::INSTR", 0x12345, "7"},
        {"LBPMX::4294967295::7", 4294967295u, "7"},
        {"LBPMX::0xFFFFFFFF::7", 4294967295u, "7"},
        {"LBPMX::0x000000000001::7", 1, "7"},
        // Beyond 32 bits the model code stays 0; the sensor library then refuses to open it.
        {"LBPMX::4294967296::7", 0, "7"},
        {"LBPMX::0x100000000::7", 0, "7"},
        {"LBPMX::99999999999999999999999999::7", 0, "7"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.resource);
        const CPmxResourceInfo info(std::string(c.resource));
        EXPECT_EQ(c.modelCode, info.getModelCode());
        EXPECT_EQ(c.serial, info.getSerialNumber());
    }
}

TEST(ResourceInfoFormat, WritesTheVisaAndTheLibraryForm)
{
    const CPmxResourceInfo m10("PMX-M10", "100000");
    EXPECT_EQ(154u, m10.getModelCode());
    EXPECT_EQ("LBPMX::0x009a::100000::INSTR", LbPmxVisa::g_pcVisaSerializer->serialize(m10));
    EXPECT_EQ("USB::0x0c6f::0154::100000", LbPmxVisa::g_pcPmxSerializer->serialize(m10));

    const CPmxResourceInfo wide("LBPMX::0x12345::ab");
    EXPECT_EQ("LBPMX::0x12345::AB::INSTR", LbPmxVisa::g_pcVisaSerializer->serialize(wide));
    EXPECT_EQ("USB::0x0c6f::74565::AB", LbPmxVisa::g_pcPmxSerializer->serialize(wide));

    const CPmxResourceInfo empty;
    EXPECT_EQ("LBPMX::0x0000::::INSTR", LbPmxVisa::g_pcVisaSerializer->serialize(empty));
}

TEST(ResourceInfoFormat, VisaFormParsesBackToAnEqualInfo)
{
    for (const auto& row : CPmxResourceInfo::getModelTable()) {
        const CPmxResourceInfo info(row.first, "SN-" + row.first);
        const CPmxResourceInfo parsed(LbPmxVisa::g_pcVisaSerializer->serialize(info));
        EXPECT_TRUE(parsed == info) << row.first;
    }
    const CPmxResourceInfo big("LBPMX::4294967295::X");
    EXPECT_EQ(big, CPmxResourceInfo(LbPmxVisa::g_pcVisaSerializer->serialize(big)));
    EXPECT_NE(CPmxResourceInfo("LBPMX::3::A"), CPmxResourceInfo("LBPMX::4::A"));
    EXPECT_NE(CPmxResourceInfo("LBPMX::3::A"), CPmxResourceInfo("LBPMX::3::B"));
}

TEST(ResourceInfoModelTable, LooksUpTypeTextsExactly)
{
    const CPmxResourceInfo info("PMX", "abc");
    EXPECT_EQ(2u, info.getModelCode());
    EXPECT_EQ("abc", info.getSerialNumber()); // kept as reported, no case change

    for (const char* unknown : {"PMX-M34", "pmx-m10", "", "PMX-M10 "}) {
        try {
            CPmxResourceInfo rejected(unknown, "1");
            ADD_FAILURE() << "accepted '" << unknown << "'";
        } catch (const CPmxResourceInfo::CPmxResourceInfoException& e) {
            EXPECT_EQ(std::string("VISA Resource isn't well formatted. The type parameter ") + unknown + " is unknown",
                      e.what());
        }
    }
}
