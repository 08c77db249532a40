// Formatted I/O engines of the VISA C library: formatOutput turns a viPrintf format and its
// arguments into bytes, scanInput reads a viScanf format's arguments from a CScanInput.
// Numbers are converted by the C library (snprintf, strtoll, strtod). Arrays ("%,10f") are
// comma-separated; binary blocks ("%b") are IEEE 488.2 definite-length blocks ("%B" indefinite,
// "#0" up to the end of the message), "%y" raw binary; both big-endian unless "!ol".
// Bad formats answer VI_ERROR_INV_FMT, null argument pointers VI_ERROR_USER_BUF.
#ifndef LBVISAHOST_FORMATTEDIO_H
#define LBVISAHOST_FORMATTEDIO_H

#include <cstdarg>
#include <string>

#include "visahost/include/visa.h"

namespace LbVisaHost {

// A va_list that helpers can take by reference on every platform.
struct SArgs {
    va_list m_ap;
};

ViStatus formatOutput(ViConstString szFormat, SArgs& sArgs, std::string& strOut);

// The bytes a scan reads: those of one message, read on demand.
class CScanInput {
public:
    virtual ~CScanInput() = default;
    // The next byte, or -1 at the end of the message (or when a read failed: see status()).
    virtual int peek() = 0;
    virtual void next() = 0;
    // VI_SUCCESS, or the failure of a read the scan caused.
    virtual ViStatus status() const { return VI_SUCCESS; }
};

// Assigns the arguments of the conversions the input satisfies; a message that ends early
// leaves the later arguments untouched (VI_SUCCESS unless a read failed).
ViStatus scanInput(ViConstString szFormat, SArgs& sArgs, CScanInput& cInput);

// Bytes of an element of binary data for a modifier ("" 1, h 2, l z 4, ll L Z 8).
size_t binaryElementSize(const std::string& strModifier);

// Whether elements of nSize bytes change byte order between this machine and binary data that
// is little-endian ("!ol") or big-endian (the default).
bool swapsBytes(bool bLittleEndianData, size_t nSize);

} // namespace LbVisaHost

#endif
