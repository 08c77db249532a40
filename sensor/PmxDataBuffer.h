#ifndef LBPMXVISA_PMXDATABUFFER_H
#define LBPMXVISA_PMXDATABUFFER_H
// CPmxDataBuffer: the caller's read buffer (write position, capacity, pointer to the caller's
// byte count) with one overflow rule: room left = capacity - count. A text write needs one more
// byte for its terminating zero, which is written but not counted; a raw write needs exactly
// its length. Copies share the caller's count (a snapshot); assigning a snapshot back restores
// its position while the count keeps its value. A buffer given a spill (setSpill) does not throw
// the overflow: from the write that does not fit on, the reply so far and every later write go
// to the spill, which its owner keeps for a later read.
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
    template <class T, int N> struct CTypeMapping;

    typedef LbCore::CISerializer<CPmxDataBuffer&, void> CSerializer;

    // A reply that outgrew the caller's buffer, whole: its bytes, and whether its last write was
    // a text write (which needs one byte more for its zero byte when it is written again).
    class CSpill {
    public:
        CSpill() : m_bActive(false), m_bText(false) { }
        bool isActive() const { return m_bActive; }
        void clear()
        {
            m_sBytes.clear();
            m_bActive = false;
            m_bText = false;
        }

    private:
        friend class CPmxDataBuffer;
        std::string m_sBytes;
        bool m_bActive;
        bool m_bText;
    };

    CPmxDataBuffer(CPmxSession& session, char* buffer, std::size_t capacity, std::uint32_t* count);
    CPmxDataBuffer(const CPmxDataBuffer& other);
    CPmxDataBuffer& operator=(const CPmxDataBuffer& other);
    ~CPmxDataBuffer() override { }

    // Raw writes take the length in bytes.
    void write(const std::string& text);
    void write(unsigned char (*source)[1024], unsigned length);
    void write(float* source, unsigned length);
    void write(const char* source, unsigned length);
    // Writes a spilled reply again, as one write of the kind it ended with.
    void write(const CSpill& reply);
    bool copyTo(char* destination, const void* source, std::size_t length);
    void setSpill(CSpill* spill) { m_pcSpill = spill; }
    void apply(const CSerializer& serializer) { serializer.serialize(*this); }

    char* getPosition() const { return m_pcPosition; }
    std::uint32_t getCount() const { return *m_pnCount; }
    std::size_t getRoom() const;

private:
    void writeRaw(const void* source, unsigned length);
    // True when the bytes went to the spill; false when there is none and the caller must throw.
    bool spill(const char* source, std::size_t length, bool text);

    char* m_pcPosition;
    std::size_t m_nCapacity;
    std::uint32_t* m_pnCount;
    CSpill* m_pcSpill;
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
