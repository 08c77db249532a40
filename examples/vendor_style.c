/* vendor-style: a measurement program of the kind instrument vendors ship, written only
 * against <visa.h> with formatted I/O. It opens the first instrument found (or the resource
 * given), asks for its identity with viQueryf, reads a power value, reads a trace as a
 * comma-separated array ("%,#f") and as an IEEE 488.2 binary block of little-endian floats
 * ("%#!olzb"), and flushes the buffers between the steps.
 *
 * Usage: vendor-style [resource] */
#include <visa.h>

#include <stdio.h>
#include <string.h>

#define TRACE_POINTS 16

static int failed(ViSession vi, ViStatus status, const char* what)
{
    ViChar desc[256] = "";
    if (status >= VI_SUCCESS)
        return 0;
    viStatusDesc(vi, status, desc);
    fprintf(stderr, "%s failed: 0x%08lX %s\n", what, (unsigned long)(ViUInt32)status, desc);
    return 1;
}

int main(int argc, char** argv)
{
    ViSession rm = VI_NULL, vi = VI_NULL;
    ViChar rsrc[VI_FIND_BUFLEN], idn[256], error[256];
    ViReal64 power = 0;
    ViReal32 trace[TRACE_POINTS];
    ViInt32 count = TRACE_POINTS, i;
    int rc = 1;

    if (failed(VI_NULL, viOpenDefaultRM(&rm), "viOpenDefaultRM"))
        return 1;
    if (argc > 1) {
        strncpy(rsrc, argv[1], sizeof rsrc - 1);
        rsrc[sizeof rsrc - 1] = '\0';
    } else if (failed(rm, viFindRsrc(rm, "?*::INSTR", VI_NULL, VI_NULL, rsrc), "viFindRsrc")) {
        goto done;
    }
    if (failed(rm, viOpen(rm, rsrc, VI_NULL, 5000, &vi), "viOpen"))
        goto done;
    viSetAttribute(vi, VI_ATTR_TMO_VALUE, 5000);
    printf("Instrument %s\n", rsrc);

    if (failed(vi, viQueryf(vi, "*IDN?\n", "%255[^\n]", idn), "*IDN?"))
        goto done;
    printf("  Identity: %s\n", idn);

    if (failed(vi, viPrintf(vi, "FUNC POWER\n"), "FUNC POWER") ||
        failed(vi, viAssertTrigger(vi, VI_TRIG_PROT_DEFAULT), "viAssertTrigger") ||
        failed(vi, viQueryf(vi, "FETCh?\n", "%lf", &power), "FETCh?"))
        goto done;
    printf("  Measured power: %.3f dBm\n", power);

    /* The trace as ASCII: a comma-separated array of floats. */
    if (failed(vi, viPrintf(vi, "FUNC TRACE;TRAC:POIN %d;format ascii\n", TRACE_POINTS), "setup") ||
        failed(vi, viPrintf(vi, "INIT\n"), "INIT") || failed(vi, viScanf(vi, "%,#f", &count, trace), "ASCII trace"))
        goto done;
    printf("  ASCII trace: %ld points:", (long)count);
    for (i = 0; i < count; ++i)
        printf(" %.2f", trace[i]);
    printf("\n");
    if (failed(vi, viFlush(vi, VI_READ_BUF), "viFlush"))
        goto done;

    /* The same trace as a binary block of 32-bit little-endian floats. */
    count = TRACE_POINTS;
    if (failed(vi, viPrintf(vi, "format real,32\n"), "format") || failed(vi, viPrintf(vi, "INIT\n"), "INIT") ||
        failed(vi, viScanf(vi, "%#!olzb", &count, trace), "binary trace") ||
        failed(vi, viFlush(vi, VI_READ_BUF | VI_WRITE_BUF), "viFlush"))
        goto done;
    printf("  Trace received: %ld points:", (long)count);
    for (i = 0; i < count; ++i)
        printf(" %.2f", trace[i]);
    printf("\n");

    if (failed(vi, viPrintf(vi, "format ascii;FUNC POWER\n"), "restore") ||
        failed(vi, viQueryf(vi, "SYSTem:ERRor?\n", "%255[^\n]", error), "SYSTem:ERRor?"))
        goto done;
    printf("  Error queue: %s\n", error);
    rc = count == TRACE_POINTS ? 0 : 1;

done:
    if (vi != VI_NULL)
        viClose(vi);
    viClose(rm);
    return rc;
}
