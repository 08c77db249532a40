// Formatted and buffered I/O of the VISA C library: the test passport answers a read with
// what the last write left, so a session echoes what it is sent.
#include <cstdio>
#include <cstring>
#include <functional>
#include <string>

#include "tests/visahost/VisaFixture.h"

namespace LbVisaHostTest {

class FormattedIo : public CVisaTest {
protected:
    void SetUp() override
    {
        CVisaTest::SetUp();
        m_nVi = open("TEST::1::INSTR");
    }
    std::string readAll()
    {
        char acBuf[512];
        ViUInt32 nRet = 0;
        viRead(m_nVi, reinterpret_cast<ViPBuf>(acBuf), sizeof acBuf, &nRet);
        return std::string(acBuf, nRet);
    }
    ViSession m_nVi = VI_NULL;
};

TEST_F(FormattedIo, PrintConversions)
{
    ViInt16 anShort[] = {-1, 2};
    ViReal64 adReal[] = {1.5, -2.25};
    ViReal32 afReal[] = {0.5f, 4.0f};
    unsigned char acBytes[] = {1, 2, 3};
    ViInt16 anWords[] = {0x0102, 0x0304};
    struct {
        ViStatus m_nStatus;
        const char* m_szExpected;
        std::function<ViStatus(ViPBuf)> m_fPrint;
    } asCases[] = {
        {VI_SUCCESS, "  42|-7  |+3|  5",
         [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%4d|%-4d|%+d|%*d", 42, -7, 3, 3, 5); }},
        {VI_SUCCESS, "0x1f 17 FFFF 4294967295",
         [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%#x %o %hX %u", 31, 15, -1, -1); }},
        {VI_SUCCESS, "3.14 1.500000E+00 2.5 1e+06",
         [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%.2f %E %g %lg", 3.14159, 1.5, 2.5, 1e6); }},
        {VI_SUCCESS, "  ab|x|%", [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%4.2s|%c|%%", "abc", 'x'); }},
        {VI_SUCCESS, "-1,2;1.50,-2.25;0.5,4",
         [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%,2hd;%,#.2lf;%,2g", anShort, 2, adReal, afReal); }},
        {VI_SUCCESS, "#13\x01\x02\x03", [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%3b", acBytes); }},
        {VI_SUCCESS, "#14\x01\x02\x03\x04|#14\x02\x01\x04\x03",
         [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%2hb|%#!olhb", anWords, 2, anWords); }},
        {VI_SUCCESS, "#0\x01\x02\x03|\x01\x02",
         [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%3B|%2y", acBytes, acBytes); }},
        {VI_ERROR_INV_FMT, "", [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%q", 1); }},
        {VI_ERROR_INV_FMT, "", [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%,f", adReal); }},
        {VI_ERROR_INV_FMT, "", [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%b", acBytes); }}, // no count
        {VI_ERROR_USER_BUF, "", [&](ViPBuf p) { return viSPrintf(m_nVi, p, "%s", static_cast<char*>(nullptr)); }},
        {VI_ERROR_NSUP_OPER, "", [&](ViPBuf p) { return viSPrintf(m_nRm, p, "x"); }},
    };
    for (const auto& s : asCases) {
        char acOut[256] = {};
        EXPECT_EQ(s.m_nStatus, s.m_fPrint(reinterpret_cast<ViPBuf>(acOut))) << s.m_szExpected;
        if (s.m_nStatus == VI_SUCCESS) {
            EXPECT_EQ(std::string(s.m_szExpected), acOut);
        }
    }
}

TEST_F(FormattedIo, ScanConversions)
{
    ViInt32 n1 = 0, n2 = 0, n3 = -99, nCount = 0;
    ViReal64 d = 0, adReal[3] = {};
    char sz1[32] = {}, sz2[32] = {};
    ViInt16 anWords[2] = {};
    unsigned char acBytes[4] = {};
    auto scan = [&](const char* szIn, std::function<ViStatus(ViConstBuf)> f) {
        return f(reinterpret_cast<ViConstBuf>(szIn));
    };
    EXPECT_EQ(VI_SUCCESS, scan("12,3.5e1", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%d,%lf", &n1, &d); }));
    EXPECT_EQ(12, n1);
    EXPECT_EQ(35.0, d);
    EXPECT_EQ(VI_SUCCESS,
              scan("ff 0x10 17", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%x %i %o", &n1, &n2, &n3); }));
    EXPECT_EQ(255, n1);
    EXPECT_EQ(16, n2);
    EXPECT_EQ(15, n3);
    // A message that ends early leaves the later arguments as they were.
    n3 = -99;
    EXPECT_EQ(VI_SUCCESS, scan("5", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%d%d", &n1, &n3); }));
    EXPECT_EQ(-99, n3);
    // A buffer smaller than the answer gets what fits, terminated, and its length.
    nCount = 4;
    EXPECT_EQ(VI_SUCCESS, scan("  abcdef", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%#s", &nCount, sz1); }));
    EXPECT_STREQ("abc", sz1);
    EXPECT_EQ(3, nCount);
    EXPECT_EQ(VI_SUCCESS, scan("ab c,rest\n", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%[^,],%t", sz1, sz2); }));
    EXPECT_STREQ("ab c", sz1);
    EXPECT_STREQ("rest\n", sz2);
    nCount = 2;
    EXPECT_EQ(VI_SUCCESS,
              scan("1.5, 2.5,3", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%,#lf", &nCount, adReal); }));
    EXPECT_EQ(2, nCount);
    EXPECT_EQ(2.5, adReal[1]);
    EXPECT_EQ(0.0, adReal[2]);
    nCount = 2;
    EXPECT_EQ(VI_SUCCESS,
              scan("#14\x01\x02\x03\x04", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%#hb", &nCount, anWords); }));
    EXPECT_EQ(2, nCount);
    EXPECT_EQ(0x0304, anWords[1]);
    nCount = 2; // more data than room: the block is read whole, the room filled
    EXPECT_EQ(VI_SUCCESS,
              scan("#0\x05\x06\x07", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%#b%d", &nCount, acBytes, &n1); }));
    EXPECT_EQ(2, nCount);
    EXPECT_EQ(6, acBytes[1]);
    EXPECT_EQ(0, acBytes[2]);
    EXPECT_EQ(VI_ERROR_INV_FMT, scan("1", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%q", &n1); }));
    EXPECT_EQ(VI_ERROR_USER_BUF, scan("1", [&](ViConstBuf b) { return viSScanf(m_nVi, b, "%d", nullptr); }));
}

TEST_F(FormattedIo, BuffersMeetTheDevice)
{
    // Without "\n" a write waits in the buffer until flushed.
    ASSERT_EQ(VI_SUCCESS, viPrintf(m_nVi, "*IDN?"));
    EXPECT_EQ("", readAll());
    ASSERT_EQ(VI_SUCCESS, viFlush(m_nVi, VI_WRITE_BUF));
    EXPECT_EQ("*IDN?", readAll());
    ASSERT_EQ(VI_SUCCESS, viPrintf(m_nVi, "%s\n", "MEAS?"));
    EXPECT_EQ("MEAS?\n", readAll());
    // A query sends whole, then reads; the echo comes back.
    char szAnswer[64] = {};
    ASSERT_EQ(VI_SUCCESS, viQueryf(m_nVi, "%d,%s", "%t", 7, "text", szAnswer));
    EXPECT_STREQ("7,text", szAnswer);
    // An answer longer than the read buffer arrives in several reads.
    ASSERT_EQ(VI_SUCCESS, viSetBuf(m_nVi, VI_READ_BUF, 4));
    ViUInt32 nSize = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nVi, VI_ATTR_RD_BUF_SIZE, &nSize));
    EXPECT_EQ(4u, nSize);
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "0123456789,42"));
    ViInt32 n = 0;
    EXPECT_EQ(VI_SUCCESS, viScanf(m_nVi, "%[0-9],", szAnswer));
    EXPECT_STREQ("0123456789", szAnswer);
    EXPECT_EQ(VI_SUCCESS, viScanf(m_nVi, "%d", &n)); // the rest of the message was kept
    EXPECT_EQ(42, n);
    // In VI_FLUSH_ON_ACCESS mode the rest of a message is dropped after each scan.
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(m_nVi, VI_ATTR_RD_BUF_OPER_MODE, VI_FLUSH_ON_ACCESS));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "1,2"));
    EXPECT_EQ(VI_SUCCESS, viScanf(m_nVi, "%d", &n));
    EXPECT_EQ("", readAll());
    // viBufWrite / viBufRead go through the same buffers.
    ViUInt32 nRet = 0;
    ASSERT_EQ(VI_SUCCESS, viBufWrite(m_nVi, reinterpret_cast<ViConstBuf>("abc"), 3, &nRet));
    EXPECT_EQ(3u, nRet);
    ASSERT_EQ(VI_SUCCESS, viFlush(m_nVi, VI_WRITE_BUF));
    char acBuf[8] = {};
    EXPECT_EQ(VI_SUCCESS, viBufRead(m_nVi, reinterpret_cast<ViPBuf>(acBuf), sizeof acBuf, &nRet));
    EXPECT_EQ(std::string("abc"), std::string(acBuf, nRet));

    EXPECT_EQ(VI_ERROR_INV_MASK, viFlush(m_nVi, VI_READ_BUF | VI_READ_BUF_DISCARD));
    EXPECT_EQ(VI_ERROR_INV_MASK, viFlush(m_nVi, 0));
    EXPECT_EQ(VI_SUCCESS, viFlush(m_nVi, VI_READ_BUF_DISCARD | VI_WRITE_BUF_DISCARD | VI_IO_IN_BUF));
    EXPECT_EQ(VI_WARN_NSUP_BUF, viSetBuf(m_nVi, VI_IO_IN_BUF, 64));
    EXPECT_EQ(VI_ERROR_NSUP_ATTR_STATE, viSetAttribute(m_nVi, VI_ATTR_WR_BUF_OPER_MODE, 99));
    EXPECT_EQ(VI_ERROR_ATTR_READONLY, viSetAttribute(m_nVi, VI_ATTR_WR_BUF_SIZE, 99));
    EXPECT_EQ(VI_ERROR_INV_OBJECT, viFlush(0xDEAD, VI_WRITE_BUF));
}

TEST_F(FormattedIo, AnswerDeliveredWholeGrowsTheRead)
{
    // A device that refuses reads smaller than its answer: scans and buffered reads ask again
    // with more room until the answer fits; the size the user set stays.
    std::string strAnswer;
    for (int i = 0; i < 3000; ++i)
        strAnswer += std::to_string(i % 10) + ",";
    strAnswer.back() = '\n';
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "WHOLE " + strAnswer));
    static ViInt32 s_anValues[4000];
    ViInt32 nCount = 4000;
    EXPECT_EQ(VI_SUCCESS, viScanf(m_nVi, "%,#d", &nCount, s_anValues));
    EXPECT_EQ(3000, nCount);
    EXPECT_EQ(9, s_anValues[2999]);
    ASSERT_EQ(VI_SUCCESS, viSetBuf(m_nVi, VI_READ_BUF, 100));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "WHOLE " + strAnswer));
    std::string strRead(8000, '\0');
    ViUInt32 nRet = 0;
    EXPECT_EQ(VI_SUCCESS, viBufRead(m_nVi, reinterpret_cast<ViPBuf>(&strRead[0]), 8000, &nRet));
    EXPECT_EQ(strAnswer, strRead.substr(0, nRet));
    ViUInt32 nSize = 0;
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(m_nVi, VI_ATTR_RD_BUF_SIZE, &nSize));
    EXPECT_EQ(100u, nSize);
}

TEST_F(FormattedIo, FilesAndAsynchronousJobs)
{
    const char szFile[] = "visahost_file_io.bin";
    ViUInt32 nRet = 0;
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "abc"));
    EXPECT_EQ(VI_SUCCESS, viReadToFile(m_nVi, szFile, 100, &nRet));
    EXPECT_EQ(3u, nRet);
    ASSERT_EQ(VI_SUCCESS, viSetAttribute(m_nVi, VI_ATTR_FILE_APPEND_EN, VI_TRUE));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "de"));
    EXPECT_EQ(VI_SUCCESS, viReadToFile(m_nVi, szFile, 100, &nRet));
    EXPECT_EQ(VI_SUCCESS, viWriteFromFile(m_nVi, szFile, 4, &nRet)); // at most the count
    EXPECT_EQ(4u, nRet);
    EXPECT_EQ("abcd", readAll());
    std::remove(szFile);
    EXPECT_EQ(VI_ERROR_FILE_ACCESS, viWriteFromFile(m_nVi, szFile, 4, &nRet));

    // Jobs run at once; their completion events name status, job, count and buffer.
    ASSERT_EQ(VI_SUCCESS, viEnableEvent(m_nVi, VI_EVENT_IO_COMPLETION, VI_QUEUE, VI_NULL));
    ASSERT_EQ(VI_SUCCESS, write(m_nVi, "xyz"));
    char acBuf[8] = {};
    ViJobId nJob = 0;
    ASSERT_EQ(VI_SUCCESS_SYNC, viReadAsync(m_nVi, reinterpret_cast<ViPBuf>(acBuf), sizeof acBuf, &nJob));
    ViEvent nContext = 0;
    ASSERT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_IO_COMPLETION, 0, VI_NULL, &nContext));
    ViStatus nStatus = VI_ERROR_SYSTEM_ERROR;
    ViJobId nEventJob = 0;
    ViUInt32 nCount = 0;
    ViAddr pBuffer = nullptr;
    ViChar szOper[VI_FIND_BUFLEN] = {};
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_STATUS, &nStatus));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_JOB_ID, &nEventJob));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_RET_COUNT_32, &nCount));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_BUFFER, &pBuffer));
    EXPECT_EQ(VI_SUCCESS, viGetAttribute(nContext, VI_ATTR_OPER_NAME, szOper));
    EXPECT_EQ(VI_SUCCESS, nStatus);
    EXPECT_EQ(nJob, nEventJob);
    EXPECT_EQ(3u, nCount);
    EXPECT_EQ(static_cast<ViAddr>(acBuf), pBuffer);
    EXPECT_STREQ("viReadAsync", szOper);
    EXPECT_EQ(std::string("xyz"), acBuf);
    EXPECT_EQ(VI_ERROR_INV_JOB_ID, viTerminate(m_nVi, VI_NULL, nJob));
    ASSERT_EQ(VI_SUCCESS_SYNC, viWriteAsync(m_nVi, reinterpret_cast<ViConstBuf>("uv"), 2, &nJob));
    EXPECT_EQ(VI_SUCCESS, viWaitOnEvent(m_nVi, VI_EVENT_IO_COMPLETION, 0, VI_NULL, VI_NULL));
    EXPECT_EQ("uv", readAll());
}

} // namespace LbVisaHostTest
