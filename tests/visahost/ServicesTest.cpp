// The services as a passport sees them, called through the passport's wrapper.
#include <atomic>
#include <condition_variable>
#include <mutex>
#include <thread>

#include "passport/NiViSv.h"
#include "tests/visahost/VisaFixture.h"

using LbPmxPassport::CNiViSv;

namespace LbVisaHostTest {

TEST(ServiceLock, CountsWithoutOwnerOrRecursion)
{
    CNiViSv::THandle hLock = nullptr, hAgain = nullptr;
    ASSERT_EQ(VI_SUCCESS, CNiViSv::createLock("contention lock", 1, 1, &hLock));
    ASSERT_EQ(VI_SUCCESS, CNiViSv::createLock("contention lock", 2, 2, &hAgain));
    EXPECT_EQ(hLock, hAgain); // one lock per name, with its first counts
    ASSERT_EQ(VI_SUCCESS, CNiViSv::acquireLock(hLock, 0xFFFFFFFF, 0));
    // Not recursive: the holder's second acquire waits like anybody's, as on other runtimes.
    EXPECT_EQ(VI_ERROR_TMO, CNiViSv::acquireLock(hLock, 20, 0));
    std::atomic<bool> bReleased{false}, bAcquiredBeforeRelease{false};
    std::thread cOther([&] {
        EXPECT_EQ(VI_SUCCESS, CNiViSv::acquireLock(hLock, 0xFFFFFFFF, 0));
        bAcquiredBeforeRelease = !bReleased;
        EXPECT_EQ(VI_SUCCESS, CNiViSv::releaseLock(hLock, 0));
    });
    bReleased = true;
    EXPECT_EQ(VI_SUCCESS, CNiViSv::releaseLock(hLock, 0));
    cOther.join();
    EXPECT_FALSE(bAcquiredBeforeRelease);
    EXPECT_EQ(VI_ERROR_SESN_NLOCKED, CNiViSv::releaseLock(hLock, 0)); // beyond the maximum

    ASSERT_EQ(VI_SUCCESS, CNiViSv::createLock("two holders", 2, 2, &hLock));
    EXPECT_EQ(VI_SUCCESS, CNiViSv::acquireLock(hLock, 0, 0));
    EXPECT_EQ(VI_SUCCESS, CNiViSv::acquireLock(hLock, 0, 0));
    EXPECT_EQ(VI_ERROR_TMO, CNiViSv::acquireLock(hLock, 0, 0));
}

TEST(ServiceLock, BadArguments)
{
    int nNotALock = 0;
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::acquireLock(&nNotALock, 0, 0));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::releaseLock(&nNotALock, 0));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::createLock(nullptr, 1, 1, nullptr));
    CNiViSv::THandle hLock = nullptr;
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::createLock("more than the maximum", 2, 1, &hLock));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::createLock("no maximum", 0, 0, &hLock));
}

TEST(ServiceTable, BadArguments)
{
    CNiViSv::THandle hTable = nullptr;
    int nNotATable = 0;
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::createTable("t", 0x00400000, 0, nullptr));
    ASSERT_EQ(VI_SUCCESS, CNiViSv::createTable("empty table", 0x00400000, 0, &hTable));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::addOperation(hTable, "viRead", nullptr));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::addOperation(&nNotATable, "viRead", nullptr));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::installTable(0xDEAD, hTable, 0, 0xDEAD, 0));
    EXPECT_EQ(nullptr, CNiViSv::sessionRecord(0xDEAD));
    EXPECT_EQ(VI_SUCCESS, CNiViSv::detach());
}

class ServiceMatch : public CVisaTest {
protected:
    ViStatus match(const char* szExpr, const char* szRsrc, ViUInt16* pnFlag = nullptr)
    {
        ViUInt16 nFlag = 7;
        ViStatus st = CNiViSv::matchRsrc(m_nRm, szExpr, szRsrc, &nFlag);
        if (pnFlag)
            *pnFlag = nFlag;
        return st;
    }
};

TEST_F(ServiceMatch, VisaRegularExpressions)
{
    struct {
        const char* m_szExpr;
        const char* m_szRsrc;
        bool m_bMatch;
    } asCases[] = {
        {"?*::INSTR", "LBPMX::0x0003::100000::INSTR", true},
        {"?*::INSTR", "LBPMX::0x0003::100000", false},
        {"LBPMX?*", "lbpmx::0x0003::100000::instr", true},
        {"LBPMX?*", "USB::1::INSTR", false},
        {"TEST::?::INSTR", "TEST::1::INSTR", true},
        {"TEST::?::INSTR", "TEST::12::INSTR", false},
        {"TEST::1*::INSTR", "TEST::::INSTR", true},
        {"TEST::1+::INSTR", "TEST::::INSTR", false},
        {"TEST::1+::INSTR", "TEST::111::INSTR", true},
        {"TEST::[12]::INSTR", "TEST::2::INSTR", true},
        {"TEST::[^12]::INSTR", "TEST::2::INSTR", false},
        {"TEST::[^12]::INSTR", "TEST::3::INSTR", true},
        {"TEST::[0-9]*::INSTR", "TEST::42::INSTR", true},
        {"(GPIB|TEST)::1::INSTR", "TEST::1::INSTR", true},
        {"GPIB?*|TEST::2?*", "TEST::1::INSTR", false},
        {"TEST.1", "TESTx1", false},
        {"TEST\\?", "TEST?", true},
        {"TEST\\?", "TESTX", false},
        {"(?*)*X", "TEST::1::INSTR", false},
        {"((T|X)E(S|Y)T::)+[1-2]?*", "test::2::INSTR", true},
        {"TEST::[]1]::INSTR", "TEST::]::INSTR", true},
        {"TEST::1::INSTR|", "", true},
    };
    for (const auto& s : asCases) {
        ViUInt16 nFlag = 0;
        EXPECT_EQ(s.m_bMatch ? VI_SUCCESS : VI_ERROR_RSRC_NFOUND, match(s.m_szExpr, s.m_szRsrc, &nFlag))
            << s.m_szExpr << " on " << s.m_szRsrc;
        EXPECT_EQ(0, nFlag);
    }
    // Matching time grows with the product of both lengths, never exponentially.
    std::string strExpr;
    for (int i = 0; i < 40; ++i)
        strExpr += "?*";
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, match((strExpr + "X").c_str(), std::string(200, 'a').c_str()));
    ViUInt16 nFlag = 0;
    EXPECT_EQ(VI_SUCCESS, match("?*{VI_ATTR_MANF_ID==1 && VI_ATTR_RSRC_NAME=='T?*'}", "TEST::1::INSTR", &nFlag));
    EXPECT_NE(0, nFlag); // asks for the attribute match
}

TEST_F(ServiceMatch, BadExpressionsAndArguments)
{
    for (const char* szExpr :
         {"", "*abc", "+", "[abc", "(abc", "abc)", "a\\", "?*{", "?*{}", "?*{VI_ATTR_NOPE==1}", "?*{VI_ATTR_MANF_ID==}",
          "?*{VI_ATTR_MANF_ID 1}", "?*{VI_ATTR_MANF_ID==1 &&}", "?*{(VI_ATTR_MANF_ID==1}", "?*{VI_ATTR_MANF_ID<'x'}",
          "?*{VI_ATTR_MANF_ID==1}x", "a**", "[z-a]"})
        EXPECT_EQ(VI_ERROR_INV_EXPR, match(szExpr, "TEST::1::INSTR")) << szExpr;
    EXPECT_EQ(VI_ERROR_INV_EXPR, match(nullptr, "TEST::1::INSTR"));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, match("?*", nullptr));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::matchRsrc(m_nRm, "?*", "TEST", nullptr));
    ViUInt16 nFlag = 0;
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::matchRsrc(0xDEAD, "?*", "TEST", &nFlag));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::matchAttributes(0xDEAD, "?*", "TEST", nullptr, 0));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::appendFound(0xDEAD, "TEST", 0));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::appendFound(m_nRm, "TEST", 0)); // not a find list
    // Attribute matching is part of a find: outside of one there is no passport to ask, also
    // after a passport's find threw.
    ViChar szDesc[VI_FIND_BUFLEN];
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viFindRsrc(m_nRm, "THROW", VI_NULL, VI_NULL, szDesc));
    EXPECT_EQ(VI_ERROR_INV_SETUP, CNiViSv::matchAttributes(m_nRm, "?*{VI_ATTR_MANF_ID==1}", "TEST", nullptr, 0));
    EXPECT_EQ(VI_SUCCESS, CNiViSv::matchAttributes(m_nRm, "?*", "TEST", nullptr, 0));
    // Nesting too deep for the stack is a bad expression too.
    EXPECT_EQ(VI_ERROR_INV_EXPR, match((std::string(5000, '(') + std::string(5000, ')')).c_str(), "T"));
    EXPECT_EQ(VI_ERROR_INV_EXPR, match(("?*{" + std::string(5000, '!') + "VI_ATTR_MANF_ID==1}").c_str(), "T"));
}

TEST_F(CVisaTest, SessionRecordHoldsThePassportSlot)
{
    ViSession nVi = open("TEST::1::INSTR");
    ViAddr* ppRecord = CNiViSv::sessionRecord(nVi);
    ASSERT_NE(nullptr, ppRecord);
    EXPECT_NE(nullptr, ppRecord[2]); // the test passport's object
    EXPECT_EQ(VI_SUCCESS, viClose(nVi));
    EXPECT_EQ(nullptr, CNiViSv::sessionRecord(nVi));
    EXPECT_EQ(nullptr, CNiViSv::sessionRecord(m_nRm)); // only sessions have records
}

TEST_F(CVisaTest, EventServicesNeedAnEnabledType)
{
    ViSession nVi = open("TEST::1::INSTR");
    ViEvent nContext = 0;
    ViUInt32 nMech = 0;
    EXPECT_EQ(VI_ERROR_NENABLED, CNiViSv::createEvent(nVi, VI_EVENT_SERVICE_REQ, &nContext, &nMech));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::createEvent(nVi, VI_EVENT_SERVICE_REQ, nullptr, &nMech));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::createEvent(0xDEAD, VI_EVENT_SERVICE_REQ, &nContext, &nMech));
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(nVi, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, CNiViSv::createEvent(nVi, VI_EVENT_SERVICE_REQ, &nContext, &nMech));
    EXPECT_EQ(static_cast<ViUInt32>(VI_QUEUE), nMech);
    EXPECT_EQ(VI_ERROR_INV_CONTEXT, CNiViSv::raiseEvent(nVi, nContext + 1000, nMech));
    EXPECT_EQ(VI_SUCCESS, CNiViSv::raiseEvent(nVi, nContext, nMech));
    ViEvent nOut = 0;
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(nVi, VI_EVENT_SERVICE_REQ, 0, VI_NULL, &nOut));
    EXPECT_EQ(nContext, nOut);
    const ViEventType anTypes[] = {VI_EVENT_USB_INTR};
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, CNiViSv::declareEvents(nVi, 1, nullptr, 0));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, CNiViSv::declareEvents(m_nRm, 1, anTypes, 0));
    EXPECT_EQ(VI_ERROR_INV_EVENT, viEnableEvent(nVi, VI_EVENT_USB_INTR, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_SUCCESS, CNiViSv::declareEvents(nVi, 1, anTypes, 0));
    EXPECT_EQ(VI_SUCCESS, viEnableEvent(nVi, VI_EVENT_USB_INTR, VI_QUEUE, VI_NULL));
}

} // namespace LbVisaHostTest
