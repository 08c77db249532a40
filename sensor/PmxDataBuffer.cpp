#include "sensor/PmxDataBuffer.h"

#include "sensor/PmxSession.h"

#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace LbPmxVisa {

// The holders of the three raw sources; each appends a given number of bytes of its source to
// the buffer it belongs to, for the one write it is made for.
template <class T> struct CPmxDataBuffer::CTypeMapping<T, 1> {
    class CBufferHolder : public LbCore::CParent<CPmxDataBuffer> {
    public:
        CBufferHolder(CPmxDataBuffer* buffer, T source) : LbCore::CParent<CPmxDataBuffer>(buffer), m_pSource(source) { }
        void write(unsigned length) const { getParent()->writeRaw(m_pSource, length); }

    private:
        T m_pSource;
    };
};

CPmxDataBuffer::CPmxDataBuffer(CPmxSession& session, char* buffer, std::size_t capacity, std::uint32_t* count)
    : LbCore::CParent<CPmxSession>(&session), m_pcPosition(buffer), m_nCapacity(capacity), m_pnCount(count),
      m_pcSpill(nullptr)
{
}

CPmxDataBuffer::CPmxDataBuffer(const CPmxDataBuffer& other)
    : LbCore::CParent<CPmxSession>(other.m_pcParent), m_pcPosition(other.m_pcPosition), m_nCapacity(other.m_nCapacity),
      m_pnCount(other.m_pnCount), m_pcSpill(other.m_pcSpill)
{
}

CPmxDataBuffer& CPmxDataBuffer::operator=(const CPmxDataBuffer& other)
{
    if (this != &other) {
        m_pcParent = other.m_pcParent;
        m_pcPosition = other.m_pcPosition;
        m_nCapacity = other.m_nCapacity;
        *m_pnCount = *other.m_pnCount;
        m_pcSpill = other.m_pcSpill;
    }
    return *this;
}

std::size_t CPmxDataBuffer::getRoom() const
{
    // A count beyond the capacity (a caller's mistake) leaves no room rather than wrapping.
    return *m_pnCount >= m_nCapacity ? 0 : m_nCapacity - *m_pnCount;
}

bool CPmxDataBuffer::spill(const char* source, std::size_t length, bool text)
{
    if (m_pcSpill == nullptr) {
        return false;
    }
    if (!m_pcSpill->m_bActive) {
        // What this read has written so far lies between the buffer's start and the position.
        m_pcSpill->m_sBytes.assign(m_pcPosition - *m_pnCount, *m_pnCount);
        m_pcSpill->m_bActive = true;
    }
    m_pcSpill->m_sBytes.append(source, length);
    m_pcSpill->m_bText = text;
    return true;
}

void CPmxDataBuffer::write(const std::string& text)
{
    if ((m_pcSpill != nullptr && m_pcSpill->m_bActive) || text.size() + 1 > getRoom()) {
        if (spill(text.data(), text.size(), true)) {
            return;
        }
        throw CPmxDataBufferOverFlowException();
    }
    if (!text.empty()) {
        // The zero byte is written but not counted: the next write overwrites it.
        std::memcpy(m_pcPosition, text.c_str(), text.size() + 1);
        *m_pnCount += static_cast<std::uint32_t>(text.size());
        m_pcPosition += text.size();
    }
}

void CPmxDataBuffer::write(unsigned char (*source)[1024], unsigned length)
{
    CTypeMapping<unsigned char(*)[1024], 1>::CBufferHolder(this, source).write(length);
}

void CPmxDataBuffer::write(float* source, unsigned length)
{
    CTypeMapping<float*, 1>::CBufferHolder(this, source).write(length);
}

void CPmxDataBuffer::write(const char* source, unsigned length)
{
    CTypeMapping<const char*, 1>::CBufferHolder(this, source).write(length);
}

void CPmxDataBuffer::write(const CSpill& reply)
{
    if (reply.m_bText) {
        write(reply.m_sBytes);
    } else {
        writeRaw(reply.m_sBytes.data(), static_cast<unsigned>(reply.m_sBytes.size()));
    }
}

void CPmxDataBuffer::writeRaw(const void* source, unsigned length)
{
    if ((m_pcSpill != nullptr && m_pcSpill->m_bActive) || length > getRoom()) {
        if (spill(static_cast<const char*>(source), length, false)) {
            return;
        }
        throw CPmxDataBufferOverFlowException();
    }
    if (length != 0) {
        std::memcpy(m_pcPosition, source, length);
        *m_pnCount += length;
        m_pcPosition += length;
    }
}

bool CPmxDataBuffer::copyTo(char* destination, const void* source, std::size_t length)
{
    // Compared as addresses: the destination may lie anywhere, even outside the caller's buffer.
    if (m_pcSpill != nullptr && m_pcSpill->m_bActive) {
        return false;
    }
    std::uintptr_t start = reinterpret_cast<std::uintptr_t>(m_pcPosition) - *m_pnCount;
    std::uintptr_t target = reinterpret_cast<std::uintptr_t>(destination);
    if (target < start + 1 || target > start + m_nCapacity || length > start + m_nCapacity - target ||
        length > getRoom()) {
        return false;
    }
    std::memmove(destination, source, length);
    return true;
}

void writeBlockHeader(CPmxDataBuffer& buffer, unsigned byteCount)
{
    std::string digits = std::to_string(byteCount);
    std::string header = "#" + std::to_string(digits.size()) + digits;
    buffer.write(header.c_str(), static_cast<unsigned>(header.size()));
}

void writeFloats(CPmxDataBuffer& buffer, const float* values, unsigned count)
{
    if (buffer.getParent()->getDataFormat() == 1) {
        writeBlockHeader(buffer, count * 4);
        // Both targets are little-endian, so the floats lie in memory least significant byte first.
        buffer.write(const_cast<float*>(values), count * 4);
        return;
    }
    std::string text;
    for (unsigned i = 0; i < count; ++i) {
        if (i != 0) {
            text += ',';
        }
        text += formatFloat(values[i]);
    }
    buffer.write(text);
}

std::string formatFloat(float value)
{
    double number = value;
    // Non-finite values get one spelling everywhere; printf's differs between runtimes.
    if (std::isnan(number)) {
        return "nan";
    }
    if (std::isinf(number)) {
        return number < 0 ? "-inf" : "inf";
    }
    // printf only supplies the correctly rounded digits and the exponent's value; the text is
    // built here, so neither the runtime's exponent width nor the locale's decimal point matter.
    char raw[64];
    std::snprintf(raw, sizeof(raw), "%.6e", number);
    std::string digits;
    const char* p = raw;
    for (; *p != '\0' && *p != 'e' && *p != 'E'; ++p) {
        if (*p >= '0' && *p <= '9') {
            digits += *p;
        }
    }
    long exponent = (*p != '\0') ? std::strtol(p + 1, nullptr, 10) : 0;
    std::string exponentDigits = std::to_string(exponent < 0 ? -exponent : exponent);
    while (exponentDigits.size() < 3) {
        exponentDigits.insert(exponentDigits.begin(), '0');
    }
    std::string text = std::signbit(number) ? "-" : "";
    text += digits.substr(0, 1);
    text += '.';
    text += digits.substr(1);
    text += 'e';
    text += exponent < 0 ? '-' : '+';
    text += exponentDigits;
    return text;
}

} // namespace LbPmxVisa
