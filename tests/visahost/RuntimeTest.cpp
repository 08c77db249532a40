// The VISA C API of the runtime, driven against the test passport.
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include "tests/visahost/VisaFixture.h"

namespace LbVisaHostTest {

class Find : public CVisaTest { };

TEST_F(Find, ListsMatchingResourcesInOrder)
{
    ViFindList nList = VI_NULL;
    ViUInt32 nCount = 0;
    ViChar szDesc[VI_FIND_BUFLEN] = {};
    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "?*::INSTR", &nList, &nCount, szDesc));
    EXPECT_EQ(2u, nCount);
    EXPECT_STREQ("TEST::1::INSTR", szDesc);
    EXPECT_EQ(VI_SUCCESS, viFindNext(nList, szDesc));
    EXPECT_STREQ("TEST::2::INSTR", szDesc);
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viFindNext(nList, szDesc));
    EXPECT_EQ(VI_ERROR_USER_BUF, viFindNext(nList, nullptr));
    EXPECT_EQ(VI_SUCCESS, viClose(nList));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viFindNext(nList, szDesc));

    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "test::[2-9]?*", &nList, &nCount, szDesc));
    EXPECT_EQ(1u, nCount);
    EXPECT_STREQ("TEST::2::INSTR", szDesc);
    // Without list or count pointers the first match is still reported.
    EXPECT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "?*1?*", VI_NULL, VI_NULL, szDesc));
    EXPECT_STREQ("TEST::1::INSTR", szDesc);
}

TEST_F(Find, AttributeExpressionsAskTheResource)
{
    ViFindList nList = VI_NULL;
    ViUInt32 nCount = 0;
    ViChar szDesc[VI_FIND_BUFLEN] = {};
    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "?*::INSTR{VI_ATTR_MANF_ID==2}", &nList, &nCount, szDesc));
    EXPECT_EQ(1u, nCount);
    EXPECT_STREQ("TEST::2::INSTR", szDesc);
    ASSERT_EQ(VI_SUCCESS, viFindRsrc(m_nRm, "?*{VI_ATTR_MANF_ID<2 || !(VI_ATTR_MANF_ID!=2)}", &nList, &nCount, szDesc));
    EXPECT_EQ(2u, nCount);
    // An attribute the passport does not know matches nothing.
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viFindRsrc(m_nRm, "?*{VI_ATTR_USB_PROTOCOL==0}", &nList, &nCount, szDesc));
}

TEST_F(Find, NothingFoundAndBadInput)
{
    ViFindList nList = 123;
    ViUInt32 nCount = 9;
    ViChar szDesc[VI_FIND_BUFLEN] = {};
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viFindRsrc(m_nRm, "GPIB?*", &nList, &nCount, szDesc));
    EXPECT_EQ(static_cast<ViFindList>(VI_NULL), nList);
    EXPECT_EQ(0u, nCount);
    EXPECT_EQ(VI_ERROR_INV_EXPR, viFindRsrc(m_nRm, "[?*", &nList, &nCount, szDesc));
    EXPECT_EQ(VI_ERROR_INV_EXPR, viFindRsrc(m_nRm, nullptr, &nList, &nCount, szDesc));
    EXPECT_EQ(VI_ERROR_USER_BUF, viFindRsrc(m_nRm, "?*", &nList, &nCount, nullptr));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viFindRsrc(0xDEAD, "?*", &nList, &nCount, szDesc));
}

class Parse : public CVisaTest { };

TEST_F(Parse, AsksThePassports)
{
    ViUInt16 nType = 0, nNum = 0;
    EXPECT_EQ(VI_SUCCESS, viParseRsrc(m_nRm, "test::2::instr", &nType, &nNum));
    EXPECT_EQ(0x8101, nType);
    EXPECT_EQ(2, nNum);
    ViChar szClass[VI_FIND_BUFLEN] = "x", szExpanded[VI_FIND_BUFLEN] = "x", szAlias[VI_FIND_BUFLEN] = "x";
    EXPECT_EQ(VI_SUCCESS, viParseRsrcEx(m_nRm, "test::1::instr", &nType, &nNum, szClass, szExpanded, szAlias));
    EXPECT_STREQ("INSTR", szClass);
    EXPECT_STREQ("TEST::1::INSTR", szExpanded);
    EXPECT_STREQ("", szAlias);
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viParseRsrc(m_nRm, "GPIB0::1::INSTR", &nType, &nNum));
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND,
              viParseRsrcEx(m_nRm, "TEST::3::INSTR", &nType, &nNum, szClass, szExpanded, szAlias));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viParseRsrc(m_nRm, "TEST::1::INSTR", nullptr, &nNum));
    EXPECT_EQ(VI_ERROR_INV_RSRC_NAME, viParseRsrc(m_nRm, nullptr, &nType, &nNum));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viParseRsrc(0xDEAD, "TEST::1::INSTR", &nType, &nNum));
}

class Sessions : public CVisaTest { };

TEST_F(Sessions, OpenWriteReadClose)
{
    ViSession nVi = open("TEST::1::INSTR");
    ASSERT_NE(static_cast<ViSession>(VI_NULL), nVi);
    EXPECT_EQ(VI_SUCCESS, write(nVi, "*IDN?"));
    char szBuf[32] = {};
    ViUInt32 nRet = 0;
    EXPECT_EQ(VI_SUCCESS, viRead(nVi, reinterpret_cast<ViPBuf>(szBuf), sizeof szBuf, &nRet));
    EXPECT_EQ(5u, nRet);
    EXPECT_STREQ("*IDN?", szBuf);
    ViUInt16 nStb = 0;
    EXPECT_EQ(VI_SUCCESS, viReadSTB(nVi, &nStb));
    EXPECT_EQ(0x41, nStb);
    EXPECT_EQ(VI_SUCCESS, viClose(nVi));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, write(nVi, "x"));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viClose(nVi));
}

TEST_F(Sessions, OperationsMissingFromTheTableAreNotSupported)
{
    ViSession nVi = open("TEST::2::INSTR");
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viAssertTrigger(nVi, VI_TRIG_PROT_DEFAULT));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viClear(nVi));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viTerminate(nVi, 0, 0));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viSetAttribute(nVi, VI_ATTR_TMO_VALUE, 2000));
    // Register-based, memory and bus-specific operations exist for programs written for other
    // instruments, and are not offered here.
    ViUInt8 n8 = 0;
    ViBusAddress nOffset = 0;
    ViUInt16 nRet = 0;
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viIn8(nVi, VI_A16_SPACE, 0, &n8));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viMemAlloc(nVi, 16, &nOffset));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viGpibControlREN(nVi, VI_GPIB_REN_ASSERT));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viMapTrigger(nVi, VI_TRIG_TTL0, VI_TRIG_TTL1, VI_NULL));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viUsbControlIn(nVi, 0, 0, 0, 0, 1, &n8, &nRet));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viMoveEx(m_nRm, VI_A32_SPACE, 0, VI_WIDTH_8, VI_A32_SPACE, 8, VI_WIDTH_8, 1));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viAssertUtilSignal(0xDEAD, VI_UTIL_ASSERT_SYSRESET));
    // Operations of the resource manager are not session operations.
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viClear(m_nRm));
    EXPECT_EQ(VI_ERROR_NSUP_OPER, write(m_nRm, "x"));
}

TEST_F(Sessions, AttributesOfRuntimeAndPassport)
{
    ViSession nVi = open("TEST::2::INSTR");
    ViUInt16 nManf = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_MANF_ID, &nManf)); // from the passport
    EXPECT_EQ(2, nManf);
    ViUInt32 nQueue = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_MAX_QUEUE_LENGTH, &nQueue));
    EXPECT_EQ(50u, nQueue);
    ViSession nRm = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_RM_SESSION, &nRm));
    EXPECT_EQ(m_nRm, nRm);
    ViAttrState nUser = 0;
    EXPECT_EQ(VI_SUCCESS, viSetAttribute(nVi, VI_ATTR_USER_DATA, 0x1234567890ull));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_USER_DATA, &nUser));
    EXPECT_EQ(0x1234567890ull, nUser);
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viGetAttribute(nVi, VI_ATTR_TERMCHAR, &nUser));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viGetAttribute(nVi, VI_ATTR_MANF_ID, nullptr));
    EXPECT_EQ(VI_ERROR_NSUP_ATTR_STATE, viSetAttribute(nVi, VI_ATTR_MAX_QUEUE_LENGTH, 0));
    EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(nVi, VI_ATTR_RM_SESSION, 1));
    // Interface attributes the passport does not answer agree with viParseRsrcEx.
    ViUInt16 nType = 0, nNum = 0, nAttrType = 0, nAttrNum = 0;
    ViChar szClass[VI_FIND_BUFLEN] = {}, szExpanded[VI_FIND_BUFLEN] = {}, szAlias[VI_FIND_BUFLEN] = {};
    ViChar szAttrClass[VI_FIND_BUFLEN] = {}, szInst[VI_FIND_BUFLEN] = {};
    ASSERT_EQ(VI_SUCCESS, viParseRsrcEx(m_nRm, "TEST::2::INSTR", &nType, &nNum, szClass, szExpanded, szAlias));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_INTF_TYPE, &nAttrType));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_INTF_NUM, &nAttrNum));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_RSRC_CLASS, szAttrClass));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_INTF_INST_NAME, szInst));
    EXPECT_EQ(nType, nAttrType);
    EXPECT_EQ(nNum, nAttrNum);
    EXPECT_STREQ(szClass, szAttrClass);
    EXPECT_STREQ("TEST", szInst);
    ViVersion nSpec = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nVi, VI_ATTR_RSRC_SPEC_VERSION, &nSpec));
    EXPECT_EQ(static_cast<ViVersion>(VI_SPEC_VERSION), nSpec);
    // Those the runtime answers are read-only; the passport's own attributes keep its answer.
    const ViAttr anOwn[] = {VI_ATTR_INTF_TYPE, VI_ATTR_INTF_NUM, VI_ATTR_RSRC_CLASS, VI_ATTR_RSRC_SPEC_VERSION};
    for (ViAttr nAttr : anOwn)
        EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(nVi, nAttr, 1)) << std::hex << nAttr;
    EXPECT_EQ(VI_ERROR_NSUP_OPER, viSetAttribute(nVi, VI_ATTR_MANF_ID, 1));

    ViChar szText[256] = {};
    ViVersion nVersion = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nRm, VI_ATTR_RSRC_MANF_NAME, szText));
    EXPECT_STRNE("", szText);
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nRm, VI_ATTR_RSRC_SPEC_VERSION, &nVersion));
    EXPECT_EQ(static_cast<ViVersion>(VI_SPEC_VERSION), nVersion);
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nRm, VI_ATTR_RSRC_LOCK_STATE, &nVersion));
    EXPECT_EQ(static_cast<ViVersion>(VI_NO_LOCK), nVersion);
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viGetAttribute(m_nRm, VI_ATTR_TMO_VALUE, &nVersion));
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viGetAttribute(m_nRm, 0x3FFF7777, &nVersion));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nRm, VI_ATTR_RM_SESSION, &nRm));
    EXPECT_EQ(m_nRm, nRm);
    const ViAttr anReadOnly[] = {VI_ATTR_RSRC_MANF_ID, VI_ATTR_RSRC_SPEC_VERSION, VI_ATTR_RM_SESSION};
    for (ViAttr nAttr : anReadOnly)
        EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(m_nRm, nAttr, 1)) << std::hex << nAttr;
    EXPECT_EQ(VI_ERROR_NSUP_ATTR, viSetAttribute(m_nRm, VI_ATTR_TMO_VALUE, 1));
}

TEST_F(Sessions, ClosingTheResourceManagerClosesItsSessionsAndLists)
{
    ViSession nRm = VI_NULL;
    ASSERT_EQ(VI_SUCCESS, viOpenDefaultRM(&nRm));
    EXPECT_NE(m_nRm, nRm); // every call opens a new resource-manager session
    ViSession nA = VI_NULL, nB = VI_NULL, nOther = open("TEST::1::INSTR");
    ASSERT_EQ(VI_SUCCESS, viOpen(nRm, "TEST::1::INSTR", VI_NULL, 0, &nA));
    ASSERT_EQ(VI_SUCCESS, viOpen(nRm, "TEST::2::INSTR", VI_NULL, 0, &nB));
    ViFindList nList = VI_NULL;
    ViChar szDesc[VI_FIND_BUFLEN];
    ASSERT_EQ(VI_SUCCESS, viFindRsrc(nRm, "?*", &nList, VI_NULL, szDesc));
    EXPECT_EQ(VI_SUCCESS, viClose(nRm));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, write(nA, "x"));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viClose(nB));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viFindNext(nList, szDesc));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viOpen(nRm, "TEST::1::INSTR", VI_NULL, 0, &nA));
    EXPECT_EQ(VI_SUCCESS, write(nOther, "still open")); // another manager's session
}

TEST_F(Sessions, ParallelSessionsKeepTheirOwnState)
{
    std::vector<std::thread> vThreads;
    std::vector<int> vFailures(4, 0);
    for (int t = 0; t < 4; ++t) {
        vThreads.emplace_back([this, t, &vFailures] {
            for (int i = 0; i < 50; ++i) {
                ViSession nVi = VI_NULL;
                if (viOpen(m_nRm, t % 2 ? "TEST::1::INSTR" : "TEST::2::INSTR", VI_NULL, 0, &nVi) != VI_SUCCESS) {
                    ++vFailures[t];
                    continue;
                }
                std::string strText = "thread " + std::to_string(t) + " round " + std::to_string(i);
                char szBuf[64] = {};
                ViUInt32 nRet = 0;
                if (write(nVi, strText) != VI_SUCCESS ||
                    viRead(nVi, reinterpret_cast<ViPBuf>(szBuf), sizeof szBuf - 1, &nRet) != VI_SUCCESS ||
                    strText != szBuf || viClose(nVi) != VI_SUCCESS)
                    ++vFailures[t];
            }
        });
    }
    for (std::thread& c : vThreads)
        c.join();
    EXPECT_EQ((std::vector<int>{0, 0, 0, 0}), vFailures);
}

TEST_F(Sessions, BadInput)
{
    ViSession nVi = 77;
    EXPECT_EQ(VI_ERROR_RSRC_NFOUND, viOpen(m_nRm, "TEST::3::INSTR", VI_NULL, 0, &nVi));
    EXPECT_EQ(static_cast<ViSession>(VI_NULL), nVi);
    EXPECT_EQ(VI_ERROR_INV_RSRC_NAME, viOpen(m_nRm, nullptr, VI_NULL, 0, &nVi));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viOpen(m_nRm, "TEST::1::INSTR", VI_NULL, 0, nullptr));
    EXPECT_EQ(VI_ERROR_INV_ACC_MODE, viOpen(m_nRm, "TEST::1::INSTR", 0x100, 0, &nVi));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viOpenDefaultRM(nullptr));
    EXPECT_EQ(VI_WARN_NULL_OBJECT, viClose(VI_NULL));

    const ViSession nBad = 0xDEADBEEF;
    ViChar szText[VI_FIND_BUFLEN];
    ViUInt16 n16 = 0;
    ViUInt32 n32 = 0;
    ViEvent nEvent = 0;
    ViEventType nType = 0;
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viClose(nBad));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viOpen(nBad, "TEST::1::INSTR", VI_NULL, 0, &nVi));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viFindNext(nBad, szText));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viRead(nBad, reinterpret_cast<ViPBuf>(szText), 1, &n32));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, write(nBad, "x"));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viReadSTB(nBad, &n16));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viClear(nBad));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viAssertTrigger(nBad, 0));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viTerminate(nBad, 0, 0));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viGetAttribute(nBad, VI_ATTR_TMO_VALUE, &n32));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viSetAttribute(nBad, VI_ATTR_TMO_VALUE, 1));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viEnableEvent(nBad, VI_EVENT_SERVICE_REQ, VI_QUEUE, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viDisableEvent(nBad, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viDiscardEvents(nBad, VI_EVENT_SERVICE_REQ, VI_QUEUE));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viWaitOnEvent(nBad, VI_EVENT_SERVICE_REQ, 0, &nType, &nEvent));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viInstallHandler(nBad, VI_EVENT_SERVICE_REQ, nullptr, nullptr));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viUninstallHandler(nBad, VI_EVENT_SERVICE_REQ, nullptr, nullptr));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viLock(nBad, VI_EXCLUSIVE_LOCK, 0, VI_NULL, VI_NULL));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viUnlock(nBad));
    // Null outputs that the passport sees are its business; it answers like the real one.
    ViSession nOpen = open("TEST::1::INSTR");
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viReadSTB(nOpen, nullptr));
    EXPECT_EQ(VI_ERROR_INV_PARAMETER, viRead(nOpen, nullptr, 1, &n32));
}

TEST(StatusDesc, TextsForEveryStatusInUse)
{
    const ViStatus anStatus[] = {VI_SUCCESS,
                                 VI_SUCCESS_EVENT_EN,
                                 VI_SUCCESS_EVENT_DIS,
                                 VI_SUCCESS_QUEUE_EMPTY,
                                 VI_SUCCESS_QUEUE_NEMPTY,
                                 VI_SUCCESS_NESTED_EXCLUSIVE,
                                 VI_SUCCESS_NESTED_SHARED,
                                 VI_WARN_NULL_OBJECT,
                                 VI_WARN_UNKNOWN_STATUS,
                                 VI_WARN_QUEUE_OVERFLOW,
                                 VI_ERROR_SYSTEM_ERROR,
                                 VI_ERROR_INV_OBJECT,
                                 VI_ERROR_RSRC_LOCKED,
                                 VI_ERROR_INV_EXPR,
                                 VI_ERROR_RSRC_NFOUND,
                                 VI_ERROR_INV_RSRC_NAME,
                                 VI_ERROR_INV_ACC_MODE,
                                 VI_ERROR_TMO,
                                 VI_ERROR_NSUP_ATTR,
                                 VI_ERROR_NSUP_ATTR_STATE,
                                 VI_ERROR_ATTR_READONLY,
                                 VI_ERROR_INV_LOCK_TYPE,
                                 VI_ERROR_INV_ACCESS_KEY,
                                 VI_ERROR_INV_EVENT,
                                 VI_ERROR_INV_MECH,
                                 VI_ERROR_HNDLR_NINSTALLED,
                                 VI_ERROR_INV_HNDLR_REF,
                                 VI_ERROR_INV_CONTEXT,
                                 VI_ERROR_QUEUE_OVERFLOW,
                                 VI_ERROR_NENABLED,
                                 VI_ERROR_INV_SETUP,
                                 VI_ERROR_ALLOC,
                                 VI_ERROR_NSUP_OPER,
                                 VI_ERROR_USER_BUF,
                                 VI_ERROR_RSRC_BUSY,
                                 VI_ERROR_INV_PARAMETER,
                                 VI_ERROR_SESN_NLOCKED,
                                 VI_ERROR_NSUP_MECH,
                                 VI_ERROR_MACHINE_NAVAIL,
                                 VI_WARN_EXT_FUNC_NIMPL,
                                 VI_ERROR_INV_FMT,
                                 VI_ERROR_NSUP_FMT,
                                 VI_ERROR_FILE_IO,
                                 VI_ERROR_INTR_PENDING};
    ViChar szDesc[VI_FIND_BUFLEN];
    for (ViStatus nStatus : anStatus) {
        EXPECT_EQ(VI_SUCCESS, viStatusDesc(VI_NULL, nStatus, szDesc)) << std::hex << nStatus;
        EXPECT_EQ(0, std::strncmp(szDesc, "VI_", 3)) << szDesc;
    }
    EXPECT_EQ(VI_SUCCESS, viStatusDesc(VI_NULL, VI_ERROR_TMO, szDesc));
    EXPECT_STREQ("VI_ERROR_TMO: Timeout expired before operation completed.", szDesc);
    EXPECT_EQ(VI_WARN_UNKNOWN_STATUS, viStatusDesc(VI_NULL, 0x12345, szDesc));
    EXPECT_STREQ("Unknown status code 0x00012345.", szDesc);
    EXPECT_EQ(VI_ERROR_USER_BUF, viStatusDesc(VI_NULL, VI_SUCCESS, nullptr));
}

class Locks : public CVisaTest { };

TEST_F(Locks, ExclusiveAndSharedLocksGuardTheResource)
{
    ViSession nA = open("TEST::1::INSTR"), nB = open("TEST::1::INSTR"), nC = open("TEST::1::INSTR");
    EXPECT_EQ(VI_SUCCESS, viLock(nA, VI_EXCLUSIVE_LOCK, 0, VI_NULL, VI_NULL));
    EXPECT_EQ(VI_SUCCESS_NESTED_EXCLUSIVE, viLock(nA, VI_EXCLUSIVE_LOCK, 0, VI_NULL, VI_NULL));
    EXPECT_EQ(VI_ERROR_RSRC_LOCKED, write(nB, "x"));
    EXPECT_EQ(VI_ERROR_TMO, viLock(nB, VI_EXCLUSIVE_LOCK, 10, VI_NULL, VI_NULL));
    ViAccessMode nState = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nB, VI_ATTR_RSRC_LOCK_STATE, &nState));
    EXPECT_EQ(static_cast<ViAccessMode>(VI_EXCLUSIVE_LOCK), nState);
    EXPECT_EQ(VI_SUCCESS, write(nA, "x"));
    EXPECT_EQ(VI_SUCCESS, viUnlock(nA));
    EXPECT_EQ(VI_ERROR_RSRC_LOCKED, write(nB, "x"));
    EXPECT_EQ(VI_SUCCESS, viUnlock(nA));
    EXPECT_EQ(VI_ERROR_SESN_NLOCKED, viUnlock(nA));
    EXPECT_EQ(VI_SUCCESS, write(nB, "x"));

    ViChar szKey[VI_FIND_BUFLEN] = {}, szKey2[VI_FIND_BUFLEN] = {};
    EXPECT_EQ(VI_SUCCESS, viLock(nA, VI_SHARED_LOCK, 0, VI_NULL, szKey));
    EXPECT_STRNE("", szKey);
    EXPECT_EQ(VI_ERROR_INV_ACCESS_KEY, viLock(nB, VI_SHARED_LOCK, 0, "other key", szKey2));
    EXPECT_EQ(VI_SUCCESS, viLock(nB, VI_SHARED_LOCK, 0, szKey, szKey2));
    EXPECT_STREQ(szKey, szKey2);
    EXPECT_EQ(VI_SUCCESS, write(nB, "x"));
    EXPECT_EQ(VI_ERROR_RSRC_LOCKED, write(nC, "x"));
    EXPECT_EQ(VI_ERROR_INV_LOCK_TYPE, viLock(nC, 3, 0, VI_NULL, szKey2));
    EXPECT_EQ(VI_SUCCESS, viClose(nA)); // closing releases the session's locks
    EXPECT_EQ(VI_SUCCESS, viUnlock(nB));
    EXPECT_EQ(VI_SUCCESS, write(nC, "x"));

    ViSession nD = VI_NULL;
    ASSERT_EQ(VI_SUCCESS, viOpen(m_nRm, "test::1", VI_EXCLUSIVE_LOCK, 0, &nD));
    EXPECT_EQ(VI_ERROR_RSRC_LOCKED, write(nC, "x")); // one resource, however it is spelled
    EXPECT_EQ(VI_ERROR_TMO, viOpen(m_nRm, "TEST::1::INSTR", VI_EXCLUSIVE_LOCK, 10, &nA));
    EXPECT_EQ(static_cast<ViSession>(VI_NULL), nA);
}

} // namespace LbVisaHostTest
