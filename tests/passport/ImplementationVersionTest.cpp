#include "passport/LbPmxInstrSesn.h"

#include <gtest/gtest.h>

namespace LbPassportTest {

using LbPmxPassport::CLbPmxInstrSesn;

TEST(ImplementationVersion, PacksVersionAndBuildDate)
{
    EXPECT_EQ(0x0244404Fu, CLbPmxInstrSesn::implementationVersion("Jun 12 2013", 2, 4));
    // A one-digit day comes padded with a blank; December 1998 is month zero.
    EXPECT_EQ(((1u * 16u + 0u) << 20) | (((12u * 28u + 1u) * 100u + 2u) << 4 & 0xFFFF0u) | 0xFu,
              CLbPmxInstrSesn::implementationVersion("Jan  2 2027", 1, 0));
    // Only four bits of the minor version fit.
    EXPECT_EQ(CLbPmxInstrSesn::implementationVersion("Jun 12 2013", 2, 4),
              CLbPmxInstrSesn::implementationVersion("Jun 12 2013", 2, 20));
}

} // namespace LbPassportTest
