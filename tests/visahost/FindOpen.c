/* A VISA application written only against the standard VISA API: finds the instruments, opens
   the first one, writes a query and reads the answer back. Exit status 0 on success. */
#include <stdio.h>
#include <string.h>

#include <visa.h>

int main(void)
{
    ViSession rm = VI_NULL, vi = VI_NULL;
    ViFindList list = VI_NULL;
    ViUInt32 count = 0, ret = 0;
    ViChar desc[VI_FIND_BUFLEN], answer[64] = {0}, text[VI_FIND_BUFLEN];
    ViStatus status = viOpenDefaultRM(&rm);
    if (status < VI_SUCCESS)
        goto failed;
    status = viFindRsrc(rm, "?*::INSTR", &list, &count, desc);
    if (status < VI_SUCCESS)
        goto failed;
    printf("found %lu resources, first %s\n", (unsigned long)count, desc);
    status = viOpen(rm, desc, VI_NULL, VI_NULL, &vi);
    if (status < VI_SUCCESS)
        goto failed;
    status = viWrite(vi, (ViConstBuf) "*IDN?", 5, &ret);
    if (status < VI_SUCCESS)
        goto failed;
    status = viRead(vi, (ViPBuf)answer, sizeof answer - 1, &ret);
    if (status < VI_SUCCESS)
        goto failed;
    printf("answer %s\n", answer);
    if (strcmp(answer, "*IDN?") != 0)
        return 2;
    viClose(vi);
    viClose(rm);
    return 0;
failed:
    viStatusDesc(rm, status, text);
    printf("failed: %s\n", text);
    viClose(rm);
    return 1;
}
