#ifndef LBPMXVISA_PMXDATABUFFER_H
#define LBPMXVISA_PMXDATABUFFER_H
// CPmxDataBuffer: the caller's read buffer (write position, capacity, pointer to the caller's
// byte count) with one overflow rule: room left = capacity - count. A text write needs one more
// byte for its terminating zero, which is written but not counted; a raw write needs exactly
// its length. Copies share the caller's count (a snapshot); assigning a snapshot back restores
// its position while the count keeps its value.
#include "core/Command.h"
#include "core/Parent.h"

#include <cstddef>
#include <cstdint>
#include <exception>
#include <string>

namespace LbPmxVisa {

class CPmxSession;

class CPmxDataBuffer : public LbCore::CParent<CPmxSession> {
public:
    class CPmxDataBufferOverFlowException : public std::exception {
    public:
        const char* what() const noexcept override { return "Buffer Overflow"; }
    };

    // Raw-write holders for the three source types a result is copied from.
    template <class T, int N>
    struct CTypeMapping;

    typedef LbCore::CISerializer<CPmxDataBuffer&, void> CSerializer;

    CPmxDataBuffer(CPmxSession& session, char* buffer, std::size_t capacity, std::uint32_t* count);
    CPmxDataBuffer(const CPmxDataBuffer& other);
    CPmxDataBuffer& operator=(const CPmxDataBuffer& other);
    ~CPmxDataBuffer() override {}

    // Raw writes take the length in bytes.
    void write(const std::string& text);
    void write(unsigned char (*source)[1024], unsigned length);
    void write(float* source, unsigned length);
    void write(const char* source, unsigned length);
    bool copyTo(char* destination, const void* source, std::size_t length);
    void apply(const CSerializer& serializer) { serializer.serialize(*this); }

    char* getPosition() const { return m_pcPosition; }
    std::uint32_t getCount() const { return *m_pnCount; }
    std::size_t getCapacity() const { return m_nCapacity; }
    std::size_t getRoom() const;

private:
    void writeRaw(const void* source, unsigned length);

    char* m_pcPosition;
    std::size_t m_nCapacity;
    std::uint32_t* m_pnCount;
};

// Writes an IEEE 488.2 definite-length block header "#<digits><byteCount>".
void writeBlockHeader(CPmxDataBuffer& buffer, unsigned byteCount);
// Writes floats in the session's data format: ASCII "d.dddddde+xxx" joined by ",", or binary
// (header, then IEEE 754 single precision, least significant byte first).
void writeFloats(CPmxDataBuffer& buffer, const float* values, unsigned count);
// "1.234560e-003": six digits after the point, a signed exponent of at least three digits,
// identical on every platform.
std::string formatFloat(float value);

} // namespace LbPmxVisa

#endif
