#include "sensor/PmxDataSerializer.h"

namespace LbPmxVisa {

namespace {

const unsigned BLOCK_SIZE = 1024;

} // namespace

void CStringDataSerializer::serialize(CPmxDataBuffer& buffer) const
{
    CPmxSession* session = buffer.getParent();
    // One byte more than the library may fill, so the text always ends in a zero byte.
    char text[BLOCK_SIZE + 1] = {};
    session->getParent()->callChecked(&CIPmxCommands::getStringResult, *session, text,
                                      static_cast<std::int32_t>(BLOCK_SIZE));
    buffer.write(std::string(text));
}

CPmxDataSerializerFactory& CPmxDataSerializerFactory::getInstance()
{
    static CPmxDataSerializerFactory factory;
    return factory;
}

const CPmxDataSerializer& CPmxDataSerializerFactory::get(EDataType type) const
{
    // A count the library reports beyond its array (or below zero) is cut to what was there.
    struct CCount {
        static unsigned clamp(std::int32_t count, std::int32_t capacity)
        {
            return count < 0 ? 0u : static_cast<unsigned>(count < capacity ? count : capacity);
        }
    };

    switch (type) {
    case eBinaryBlock: {
        class CFloatArraySerializer : public CPmxDataSerializer {
        public:
            void serialize(CPmxDataBuffer& buffer) const override
            {
                CPmxSession* session = buffer.getParent();
                unsigned char block[BLOCK_SIZE] = {};
                std::int32_t count = 0;
                session->getParent()->callChecked(&CIPmxCommands::getBinaryResult, *session, block,
                                                  static_cast<std::int32_t>(BLOCK_SIZE), &count);
                buffer.write(&block, CCount::clamp(count, BLOCK_SIZE));
            }
        };
        static const CFloatArraySerializer serializer{};
        return serializer;
    }
    case eBitfield1:
    case eBitfield2:
    case eBitfield3: {
        static const CPmxGenericDataSerializer<CPmxOneDataFormatter<3>, std::int32_t> serializer(
            &CIPmxCommands::getBitfieldResult);
        return serializer;
    }
    case eFloatArray: {
        class CFloatArraySerializer : public CPmxDataSerializer {
        public:
            void serialize(CPmxDataBuffer& buffer) const override
            {
                CPmxSession* session = buffer.getParent();
                float values[BLOCK_SIZE] = {};
                std::int32_t count = 0;
                session->getParent()->callChecked(&CIPmxCommands::getFloatArray, *session, values,
                                                  static_cast<std::int32_t>(BLOCK_SIZE), &count);
                writeFloats(buffer, values, CCount::clamp(count, BLOCK_SIZE));
            }
        };
        static const CFloatArraySerializer serializer{};
        return serializer;
    }
    case eFloatTriple: {
        static const CPmxGenericDataSerializer<CPmxThreeDataFormatter<5>, float> serializer(
            &CIPmxCommands::getFloatResult);
        return serializer;
    }
    case eFloatSingle: {
        static const CPmxGenericDataSerializer<CPmxOneDataFormatter<6>, float> serializer(
            &CIPmxCommands::getFloatResult);
        return serializer;
    }
    case eFloatStream: {
        static const CPmxGenericDataSerializer<CPmxStreamDataFormatter<7>, float> serializer(
            &CIPmxCommands::getFloatResult);
        return serializer;
    }
    case eLongTriple: {
        static const CPmxGenericDataSerializer<CPmxThreeDataFormatter<8>, std::int32_t> serializer(
            &CIPmxCommands::getLongResult);
        return serializer;
    }
    case eLongSingle: {
        static const CPmxGenericDataSerializer<CPmxOneDataFormatter<8>, std::int32_t> serializer(
            &CIPmxCommands::getLongResult);
        return serializer;
    }
    case eString: {
        static const CStringDataSerializer serializer{};
        return serializer;
    }
    case eAuxFloatArray: {
        class CFloatArraySerializer : public CPmxDataSerializer {
        public:
            void serialize(CPmxDataBuffer& buffer) const override
            {
                CPmxSession* session = buffer.getParent();
                float first[BLOCK_SIZE] = {};
                float second[BLOCK_SIZE] = {};
                float third[BLOCK_SIZE] = {};
                std::int32_t count = 0;
                session->getParent()->callChecked(&CIPmxCommands::getAuxFloatArray, *session, first, second, third,
                                                  static_cast<std::int32_t>(BLOCK_SIZE), &count);
                writeFloats(buffer, first, CCount::clamp(count, BLOCK_SIZE));
            }
        };
        static const CFloatArraySerializer serializer{};
        return serializer;
    }
    }
    throw "";
}

} // namespace LbPmxVisa
