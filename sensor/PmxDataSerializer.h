#ifndef LBPMXVISA_PMXDATASERIALIZER_H
#define LBPMXVISA_PMXDATASERIALIZER_H
// Result formatting. CPmxDataSerializerFactory::get(type) answers the shared serializer for the
// kind of result that the sensor library reported (EDataType 0..11); applied to a data buffer,
// the serializer fetches that result from the library for the buffer's session and writes it.
// Scalar results are always ASCII; float arrays and the stream result follow the session's
// data format; a binary-block result is copied through as it comes. Serializers keep no state,
// hold their result arrays on the stack and are shared by all sessions. A type outside 0..11
// is refused by throwing an empty C string (const char*), which callers rely on.
#include "core/Command.h"
#include "sensor/PmxCommands.h"
#include "sensor/PmxDataBuffer.h"
#include "sensor/PmxSession.h"
#include "sensor/PmxSessionDispatcher.h"

#include <cstdint>
#include <string>

namespace LbPmxVisa {

// The kind of result the library holds, as getData reports it.
enum EDataType : std::int32_t {
    eBinaryBlock = 0,
    eBitfield1 = 1,
    eBitfield2 = 2,
    eBitfield3 = 3,
    eFloatArray = 4,
    eFloatTriple = 5,
    eFloatSingle = 6,
    eFloatStream = 7,
    eLongTriple = 8,
    eLongSingle = 9,
    eString = 10,
    eAuxFloatArray = 11
};

typedef LbCore::CISerializer<CPmxDataBuffer&, void> CPmxDataSerializer;

// Whether a result of this type is written as text in the data format (0 ASCII, 1 binary); the
// others are raw bytes: the binary-block result always, float arrays and the stream result in
// binary.
inline bool isTextResult(EDataType type, std::uint32_t dataFormat)
{
    if (type == eBinaryBlock) {
        return false;
    }
    return dataFormat != 1 || (type != eFloatArray && type != eFloatStream && type != eAuxFloatArray);
}

// Text of one scalar: plain signed decimal for integers, formatFloat for floats.
inline std::string formatValue(std::int32_t value)
{
    return std::to_string(value);
}
inline std::string formatValue(float value)
{
    return formatFloat(value);
}

// The first value, as ASCII text in either data format. N is the data type served.
template <int N> struct CPmxOneDataFormatter {
    template <class Value> static void format(CPmxDataBuffer& buffer, const Value (&values)[3])
    {
        buffer.write(formatValue(values[0]));
    }
};

// The three values, as ASCII text joined by ",", in either data format.
template <int N> struct CPmxThreeDataFormatter {
    template <class Value> static void format(CPmxDataBuffer& buffer, const Value (&values)[3])
    {
        buffer.write(formatValue(values[0]) + "," + formatValue(values[1]) + "," + formatValue(values[2]));
    }
};

// Binary: a block of the first value alone ("#14" and four bytes); ASCII: the three values.
template <int N> struct CPmxStreamDataFormatter {
    static void format(CPmxDataBuffer& buffer, const float (&values)[3])
    {
        writeFloats(buffer, values, buffer.getParent()->getDataFormat() == 1 ? 1 : 3);
    }
};

// Fetches three values with one commands operation and lets the formatter write them.
template <class Formatter, class Value> class CPmxGenericDataSerializer : public CPmxDataSerializer {
public:
    typedef std::int32_t (CIPmxCommands::*COperation)(CPmxSession&, Value*, Value*, Value*);

    explicit CPmxGenericDataSerializer(COperation operation) : m_pfOperation(operation) { }

    void serialize(CPmxDataBuffer& buffer) const override
    {
        CPmxSession* session = buffer.getParent();
        Value values[3] = {};
        session->getParent()->callChecked(m_pfOperation, *session, &values[0], &values[1], &values[2]);
        Formatter::format(buffer, values);
    }

private:
    COperation m_pfOperation;
};

// The text result, up to its zero byte, as a text write.
class CStringDataSerializer : public CPmxDataSerializer {
public:
    void serialize(CPmxDataBuffer& buffer) const override;
};

class CPmxDataSerializerFactory {
public:
    static CPmxDataSerializerFactory& getInstance();
    // Throws an empty C string (const char*) for a type outside 0..11.
    const CPmxDataSerializer& get(EDataType type) const;

private:
    CPmxDataSerializerFactory() { }
};

} // namespace LbPmxVisa

#endif
