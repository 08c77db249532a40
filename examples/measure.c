/* lbpmx-measure: one measurement through the standard VISA C API, told step by step.
 *
 * Usage: lbpmx-measure [resource]
 *
 * Lists the VISA instruments, opens the given resource (or the first one found), asks it who it
 * is, triggers a power measurement and reads it as ASCII, then switches the sensor to a trace
 * and reads that as an IEEE 488.2 binary block of 32-bit floats, reads the error queue and the
 * status byte, and leaves the sensor as it found it. Any VISA error ends the program with its
 * status, the runtime's text for it and exit code 1.
 *
 * Only <visa.h> is used: the program knows nothing of the passport or the sensors behind it. */
#include <visa.h>

#include <stdio.h>
#include <stdlib.h>
#include <string.h>

/* A trace result of this many points is small enough to print whole. */
#define TRACE_POINTS 16
#define READ_SIZE 4096

static ViSession g_nRm = VI_NULL;
static ViSession g_nVi = VI_NULL;

/* Ends the program when a VISA call failed. Warnings and other success codes go on. */
static void check(ViStatus nStatus, const char* szWhat)
{
    ViChar szDesc[256];
    if (nStatus >= VI_SUCCESS)
        return;
    szDesc[0] = '\0';
    if (viStatusDesc(g_nVi != VI_NULL ? g_nVi : g_nRm, nStatus, szDesc) < VI_SUCCESS)
        strcpy(szDesc, "(no description)");
    fprintf(stderr, "\nVISA error in %s: status 0x%08lX: %s\n", szWhat, (unsigned long)(ViUInt32)nStatus, szDesc);
    if (g_nVi != VI_NULL)
        viClose(g_nVi);
    if (g_nRm != VI_NULL)
        viClose(g_nRm);
    exit(1);
}

static void sendCommand(const char* szCommand)
{
    ViUInt32 nDone = 0;
    printf("  > %s\n", szCommand);
    check(viWrite(g_nVi, (ViConstBuf)szCommand, (ViUInt32)strlen(szCommand), &nDone), szCommand);
}

/* Reads one answer; the bytes stay as they came, with a zero behind them for printing. */
static ViUInt32 receive(unsigned char* pBuf, ViUInt32 nSize)
{
    ViUInt32 nGot = 0;
    check(viRead(g_nVi, pBuf, nSize - 1, &nGot), "viRead");
    pBuf[nGot] = '\0';
    return nGot;
}

static void printText(const unsigned char* pBuf, ViUInt32 nLen)
{
    printf("  < %.*s   (%lu bytes)\n", (int)nLen, (const char*)pBuf, (unsigned long)nLen);
}

/* Decodes "#<n><length><data>"; returns the data and its length, or NULL when malformed. */
static const unsigned char* parseBlock(const unsigned char* pBuf, ViUInt32 nLen, unsigned long* pnData)
{
    unsigned nDigits, i;
    unsigned long nData = 0;
    if (nLen < 2 || pBuf[0] != '#' || pBuf[1] < '1' || pBuf[1] > '9')
        return NULL;
    nDigits = (unsigned)(pBuf[1] - '0');
    if (nLen < 2 + nDigits)
        return NULL;
    for (i = 0; i < nDigits; ++i) {
        if (pBuf[2 + i] < '0' || pBuf[2 + i] > '9')
            return NULL;
        nData = nData * 10 + (unsigned long)(pBuf[2 + i] - '0');
    }
    if (nData > nLen - 2 - nDigits)
        return NULL;
    *pnData = nData;
    return pBuf + 2 + nDigits;
}

/* The block's floats are IEEE 754 single precision, least significant byte first, whatever
 * the byte order of the machine reading them. */
static float floatAt(const unsigned char* p)
{
    ViUInt32 nBits = (ViUInt32)p[0] | (ViUInt32)p[1] << 8 | (ViUInt32)p[2] << 16 | (ViUInt32)p[3] << 24;
    float f;
    memcpy(&f, &nBits, sizeof f);
    return f;
}

static void showAttribute(ViAttr nAttr, const char* szName)
{
    ViChar szValue[256];
    check(viGetAttribute(g_nVi, nAttr, szValue), szName);
    printf("  %-22s %s\n", szName, szValue);
}

int main(int argc, char** argv)
{
    ViFindList nList = VI_NULL;
    ViUInt32 nCount = 0, i, nLen;
    ViChar szFirst[256], szRsrc[256];
    unsigned char aBuf[READ_SIZE];
    const unsigned char* pData;
    unsigned long nData = 0;
    ViUInt16 nStb = 0;
    char* pEnd;
    double dPower;
    char szPoints[32];

    setvbuf(stdout, NULL, _IONBF, 0); /* keep the story in order with error messages */
    printf("1. Opening the default VISA resource manager\n");
    check(viOpenDefaultRM(&g_nRm), "viOpenDefaultRM");

    printf("2. Looking for instruments with viFindRsrc(\"?*::INSTR\")\n");
    check(viFindRsrc(g_nRm, "?*::INSTR", &nList, &nCount, szFirst), "viFindRsrc");
    printf("  %lu found:\n  - %s\n", (unsigned long)nCount, szFirst);
    for (i = 1; i < nCount; ++i) {
        check(viFindNext(nList, szRsrc), "viFindNext");
        printf("  - %s\n", szRsrc);
    }
    check(viClose(nList), "viClose (find list)");

    if (argc > 1) {
        strncpy(szRsrc, argv[1], sizeof szRsrc - 1);
        szRsrc[sizeof szRsrc - 1] = '\0';
    } else {
        strcpy(szRsrc, szFirst);
    }
    printf("3. Opening %s\n", szRsrc);
    check(viOpen(g_nRm, szRsrc, VI_NULL, VI_NULL, &g_nVi), "viOpen");
    check(viSetAttribute(g_nVi, VI_ATTR_TMO_VALUE, 5000), "viSetAttribute VI_ATTR_TMO_VALUE");
    showAttribute(VI_ATTR_RSRC_NAME, "resource name:");
    showAttribute(VI_ATTR_MANF_NAME, "manufacturer:");
    showAttribute(VI_ATTR_USB_SERIAL_NUM, "serial number:");
    printf("  timeout set to 5000 ms\n");

    printf("4. Asking who it is\n");
    sendCommand("*IDN?");
    nLen = receive(aBuf, sizeof aBuf);
    printText(aBuf, nLen);

    printf("5. Measuring the average power: the sensor measures on a trigger (viAssertTrigger\n"
           "   sends \"*TRG\"), FETCh? asks for the result and viRead returns it as ASCII\n");
    sendCommand("FUNC POWER");
    printf("  > (viAssertTrigger)\n");
    check(viAssertTrigger(g_nVi, VI_TRIG_PROT_DEFAULT), "viAssertTrigger");
    sendCommand("FETCh?");
    nLen = receive(aBuf, sizeof aBuf);
    printText(aBuf, nLen);
    dPower = strtod((const char*)aBuf, &pEnd);
    if (nLen == 0 || *pEnd != '\0') {
        fprintf(stderr, "\nThe answer is not a number: \"%s\"\n", (const char*)aBuf);
        viClose(g_nVi);
        viClose(g_nRm);
        return 1;
    }
    printf("  Measured power: %.3f dBm\n", dPower);

    printf("6. Reading a trace as a binary block: a single power value is always answered in\n"
           "   ASCII, but float arrays follow the data format, so the sensor is switched to a\n"
           "   trace of %d points and the format to \"format real,32\"\n",
           TRACE_POINTS);
    sendCommand("FUNC TRACE");
    sprintf(szPoints, "TRAC:POIN %d", TRACE_POINTS);
    sendCommand(szPoints);
    sendCommand("format real,32");
    sendCommand("INIT");
    nLen = receive(aBuf, sizeof aBuf);
    pData = parseBlock(aBuf, nLen, &nData);
    if (!pData || nData % 4 != 0) {
        fprintf(stderr, "\nThe answer (%lu bytes) is not a block of floats\n", (unsigned long)nLen);
        viClose(g_nVi);
        viClose(g_nRm);
        return 1;
    }
    printf("  < %lu bytes: header \"%.*s\" and %lu bytes of data = %lu floats (dBm):\n", (unsigned long)nLen,
           (int)(pData - aBuf), (const char*)aBuf, nData, nData / 4);
    for (i = 0; i < nData / 4; ++i)
        printf("%s%8.2f%s", i % 8 == 0 ? "   " : " ", floatAt(pData + 4 * i),
               i % 8 == 7 || i + 1 == nData / 4 ? "\n" : "");
    printf("  Trace received: %lu points\n", nData / 4);

    printf("7. Reading the error queue\n");
    sendCommand("SYSTem:ERRor?");
    nLen = receive(aBuf, sizeof aBuf);
    printText(aBuf, nLen);

    printf("8. Reading the status byte with viReadSTB\n");
    check(viReadSTB(g_nVi, &nStb), "viReadSTB");
    printf("  status byte %u: error queued %s, result pending %s, measuring %s\n", nStb, nStb & 4 ? "yes" : "no",
           nStb & 16 ? "yes" : "no", nStb & 128 ? "yes" : "no");

    printf("9. Restoring ASCII and single power values, closing\n");
    sendCommand("format ascii");
    sendCommand("FUNC POWER");
    check(viClose(g_nVi), "viClose");
    g_nVi = VI_NULL;
    check(viClose(g_nRm), "viClose (resource manager)");
    printf("Done.\n");
    return 0;
}
