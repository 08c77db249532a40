// Test support: points the runtime at the test passport (beside the test executable) before
// the first resource manager opens, and gives each test a resource manager of its own.
#ifndef LBTESTS_VISAHOST_VISAFIXTURE_H
#define LBTESTS_VISAHOST_VISAFIXTURE_H

#include <gtest/gtest.h>

#include <cstdlib>
#include <string>

#include "visahost/include/visa.h"

namespace LbVisaHostTest {

inline void usePassport()
{
#if defined(_WIN32)
    _putenv_s("LBVISA_PASSPORTS", "lbtestpassport.dll");
#else
    setenv("LBVISA_PASSPORTS", "lbtestpassport.so", 1);
#endif
}

class CVisaTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        usePassport();
        ASSERT_EQ(VI_SUCCESS, viOpenDefaultRM(&m_nRm));
    }
    void TearDown() override { viClose(m_nRm); }

    ViSession open(const char* szName)
    {
        ViSession nVi = VI_NULL;
        EXPECT_EQ(VI_SUCCESS, viOpen(m_nRm, szName, VI_NULL, 0, &nVi));
        return nVi;
    }
    ViStatus write(ViSession nVi, const std::string& str)
    {
        ViUInt32 nRet = 0;
        return viWrite(nVi, reinterpret_cast<ViConstBuf>(str.data()), static_cast<ViUInt32>(str.size()), &nRet);
    }

    ViSession m_nRm = VI_NULL;
};

} // namespace LbVisaHostTest

#endif
