#ifndef LBPMXPASSPORT_INSTRSESNTEXT_H
#define LBPMXPASSPORT_INSTRSESNTEXT_H
// Texts into the fixed 256-byte buffers of VISA.
#include "passport/NiViSv.h"

#include <cstring>
#include <string>

namespace LbPmxPassport {

const std::size_t VISA_TEXT_LIMIT = 255; // bytes of a 256-byte VISA buffer we fill, zero included

// Copies text into a 256-byte VISA buffer; a longer text is cut so that it still ends in a zero.
inline void copyText(ViChar* destination, const std::string& text)
{
    std::size_t length = text.size() < VISA_TEXT_LIMIT - 1 ? text.size() : VISA_TEXT_LIMIT - 1;
    std::memcpy(destination, text.data(), length);
    destination[length] = '\0';
}

} // namespace LbPmxPassport

#endif
