// Buffered, formatted, file and asynchronous I/O of the VISA C library.
#include "visahost/VisaApiInternal.h"

using LbVisaHost::unsupported;

extern "C" {

ViStatus _VI_FUNC viReadAsync(ViSession vi, ViPBuf, ViUInt32, ViPJobId) { return unsupported(vi); }
ViStatus _VI_FUNC viReadToFile(ViSession vi, ViConstString, ViUInt32, ViPUInt32) {
  return unsupported(vi);
}
ViStatus _VI_FUNC viWriteAsync(ViSession vi, ViConstBuf, ViUInt32, ViPJobId) {
  return unsupported(vi);
}
ViStatus _VI_FUNC viWriteFromFile(ViSession vi, ViConstString, ViUInt32, ViPUInt32) {
  return unsupported(vi);
}
ViStatus _VI_FUNC viSetBuf(ViSession vi, ViUInt16, ViUInt32) { return unsupported(vi); }
ViStatus _VI_FUNC viFlush(ViSession vi, ViUInt16) { return unsupported(vi); }
ViStatus _VI_FUNC viBufWrite(ViSession vi, ViConstBuf, ViUInt32, ViPUInt32) {
  return unsupported(vi);
}
ViStatus _VI_FUNC viBufRead(ViSession vi, ViPBuf, ViUInt32, ViPUInt32) { return unsupported(vi); }
ViStatus _VI_FUNC viVPrintf(ViSession vi, ViConstString, ViVAList) { return unsupported(vi); }
ViStatus _VI_FUNC viVSPrintf(ViSession vi, ViPBuf, ViConstString, ViVAList) {
  return unsupported(vi);
}
ViStatus _VI_FUNC viVScanf(ViSession vi, ViConstString, ViVAList) { return unsupported(vi); }
ViStatus _VI_FUNC viVSScanf(ViSession vi, ViConstBuf, ViConstString, ViVAList) {
  return unsupported(vi);
}
ViStatus _VI_FUNC viVQueryf(ViSession vi, ViConstString, ViConstString, ViVAList) {
  return unsupported(vi);
}

ViStatus _VI_FUNCC viPrintf(ViSession vi, ViConstString, ...) { return unsupported(vi); }
ViStatus _VI_FUNCC viSPrintf(ViSession vi, ViPBuf, ViConstString, ...) { return unsupported(vi); }
ViStatus _VI_FUNCC viScanf(ViSession vi, ViConstString, ...) { return unsupported(vi); }
ViStatus _VI_FUNCC viSScanf(ViSession vi, ViConstBuf, ViConstString, ...) {
  return unsupported(vi);
}
ViStatus _VI_FUNCC viQueryf(ViSession vi, ViConstString, ViConstString, ...) {
  return unsupported(vi);
}

}  // extern "C"
