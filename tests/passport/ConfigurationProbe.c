/* Loads the passport through the VISA runtime and makes it log one ERROR line (opening a sensor
   that is not attached), so that the configuration tests can look at what was written where. */
#include <stdio.h>

#include "visahost/include/visa.h"

int main(void)
{
    ViSession rm = VI_NULL;
    ViSession session = VI_NULL;
    if (viOpenDefaultRM(&rm) != VI_SUCCESS) {
        return 1;
    }
    viOpen(rm, "LBPMX::0x0003::999999::INSTR", VI_NULL, 0, &session);
    viClose(rm);
    return 0;
}
