#include "sensor/PmxDataSerializer.h"
#include "tests/sensor/SimSessionFixture.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <vector>

using LbPmxVisa::CPmxDataBuffer;
using LbPmxVisa::CPmxDataSerializerFactory;
using LbPmxVisa::CPmxSessionDispatcher;
using LbPmxVisa::EDataType;
using LbPmxVisa::formatFloat;

namespace {

class DataBuffer : public LbTests::CSimSession {
protected:
    // A caller's buffer of `capacity` bytes with a guard byte behind it.
    void makeBuffer(std::size_t capacity)
    {
        m_cStorage.assign(capacity + 1, '\x7f');
        m_nCount = 0;
        m_pBuffer.reset(new CPmxDataBuffer(session(), m_cStorage.data(), capacity, &m_nCount));
    }
    std::string written() const { return std::string(m_cStorage.data(), m_nCount); }

    std::vector<char> m_cStorage;
    std::uint32_t m_nCount = 0;
    std::unique_ptr<CPmxDataBuffer> m_pBuffer;
};

} // namespace

TEST(FloatFormat, SixDigitsAndAThreeDigitSignedExponentOnEveryPlatform)
{
    EXPECT_EQ("1.234560e-003", formatFloat(0.00123456f));
    EXPECT_EQ("-4.500000e+001", formatFloat(-45.0f));
    EXPECT_EQ("0.000000e+000", formatFloat(0.0f));
    EXPECT_EQ("1.000000e+000", formatFloat(1.0f));
    EXPECT_EQ("3.402823e+038", formatFloat(3.4028235e38f));
    EXPECT_EQ("1.401298e-045", formatFloat(1.4e-45f));
    EXPECT_EQ("9.999999e-001", formatFloat(0.9999999f));
    EXPECT_EQ("1.000000e+001", formatFloat(9.9999999f)); // rounding carries into the exponent
}

TEST_F(DataBuffer, TextWritesNeedRoomForTheirZeroByteButCountOnlyTheText)
{
    makeBuffer(6);
    m_pBuffer->write(std::string("ab"));
    m_pBuffer->write(std::string("cd"));
    EXPECT_EQ("abcd", written());
    EXPECT_EQ('\0', m_cStorage[4]); // written, not counted
    EXPECT_THROW(m_pBuffer->write(std::string("ef")), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    m_pBuffer->write(std::string("e"));
    EXPECT_EQ("abcde", written());
    m_pBuffer->write(std::string()); // one byte left is room enough for the empty text
    m_pBuffer->write("f", 1);
    EXPECT_EQ("abcdef", written());
    EXPECT_EQ('\x7f', m_cStorage[6]);
    // No room left: even the empty text needs a byte.
    EXPECT_THROW(m_pBuffer->write(std::string()), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    EXPECT_EQ(6u, m_pBuffer->getCount());
}

TEST_F(DataBuffer, RawWritesFitExactlyTheRoomLeft)
{
    makeBuffer(4);
    const char bytes[] = {'\x01', '\0', '\x02', '\x03', '\x04'};
    EXPECT_THROW(m_pBuffer->write(bytes, 5), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    EXPECT_EQ(0u, m_nCount);
    m_pBuffer->write(bytes, 4);
    EXPECT_EQ(std::string(bytes, 4), written());
    EXPECT_EQ(0u, m_pBuffer->getRoom());
    EXPECT_EQ('\x7f', m_cStorage[4]);
    EXPECT_THROW(m_pBuffer->write(bytes, 1), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    m_pBuffer->write(bytes, 0);
    EXPECT_EQ(4u, m_nCount);
}

TEST_F(DataBuffer, SnapshotRestoresThePositionWhileTheSharedCountKeepsItsValue)
{
    makeBuffer(16);
    m_pBuffer->write(std::string("ab"));
    CPmxDataBuffer snapshot(*m_pBuffer);
    m_pBuffer->write(std::string("cd"));
    EXPECT_EQ(4u, snapshot.getCount()); // the copy shares the count
    *m_pBuffer = snapshot;
    EXPECT_EQ(m_cStorage.data() + 2, m_pBuffer->getPosition());
    EXPECT_EQ(4u, m_nCount);
    EXPECT_EQ(m_pBuffer.get(), &(*m_pBuffer = *m_pBuffer)); // self-assignment changes nothing
    EXPECT_EQ(m_cStorage.data() + 2, m_pBuffer->getPosition());
}

TEST_F(DataBuffer, CopyToStaysInsideTheCallersBufferAndMovesNothing)
{
    makeBuffer(8);
    m_pBuffer->write(std::string("abc"));
    char* start = m_cStorage.data();
    EXPECT_TRUE(m_pBuffer->copyTo(start + 1, "XY", 2));
    EXPECT_EQ("aXY", written());
    EXPECT_FALSE(m_pBuffer->copyTo(start, "Z", 1));          // the first byte is out of bounds
    EXPECT_FALSE(m_pBuffer->copyTo(start + 7, "ZZ", 2));     // would end behind the buffer
    EXPECT_FALSE(m_pBuffer->copyTo(start + 1, "123456", 6)); // more than the room left (5)
    EXPECT_TRUE(m_pBuffer->copyTo(start + 3, "12345", 5));
    EXPECT_EQ(3u, m_nCount);
    EXPECT_EQ(start + 3, m_pBuffer->getPosition());
    EXPECT_EQ("aXY12345", std::string(start, 8));
    EXPECT_EQ('\x7f', m_cStorage[8]);
}

TEST_F(DataBuffer, BlockHeaderCountsTheDigitsOfTheByteCount)
{
    makeBuffer(32);
    LbPmxVisa::writeBlockHeader(*m_pBuffer, 0);
    LbPmxVisa::writeBlockHeader(*m_pBuffer, 4);
    LbPmxVisa::writeBlockHeader(*m_pBuffer, 4096);
    EXPECT_EQ("#10#14#44096", written());
}

TEST_F(DataBuffer, FloatsFollowTheSessionsDataFormat)
{
    const float values[] = {1.0f, 0.5f, -2.0f};
    makeBuffer(64);
    LbPmxVisa::writeFloats(*m_pBuffer, values, 3);
    EXPECT_EQ("1.000000e+000,5.000000e-001,-2.000000e+000", written());

    binary();
    makeBuffer(64);
    LbPmxVisa::writeFloats(*m_pBuffer, values, 3);
    EXPECT_EQ("#212" + bytesOf(1.0f) + bytesOf(0.5f) + bytesOf(-2.0f), written());
    EXPECT_EQ(std::string("#212\0\0\x80\x3f", 8), written().substr(0, 8)); // least significant byte first

    makeBuffer(64);
    LbPmxVisa::writeFloats(*m_pBuffer, values, 0);
    EXPECT_EQ("#10", written());

    // The header stays written when the floats do not fit.
    makeBuffer(10);
    EXPECT_THROW(LbPmxVisa::writeFloats(*m_pBuffer, values, 3), CPmxDataBuffer::CPmxDataBufferOverFlowException);
    EXPECT_EQ("#212", written());
}

TEST_F(DataBuffer, EveryDataTypeInAscii)
{
    const std::string bytes("\x01\x00\xff", 3);
    queueText(0, bytes);
    EXPECT_EQ(bytes, read());
    for (int type : {1, 2, 3}) {
        queueInts(type, {-7, 8, 9});
        EXPECT_EQ("-7", read()) << type;
    }
    queueFloats(4, {1.0f, 0.5f, -2.0f});
    EXPECT_EQ("1.000000e+000,5.000000e-001,-2.000000e+000", read());
    queueFloats(5, {1.0f, 0.5f, -2.0f});
    EXPECT_EQ("1.000000e+000,5.000000e-001,-2.000000e+000", read());
    queueFloats(6, {-45.0f, 3.0f, 4.0f});
    EXPECT_EQ("-4.500000e+001", read());
    queueFloats(7, {1.0f, 0.5f, -2.0f});
    EXPECT_EQ("1.000000e+000,5.000000e-001,-2.000000e+000", read());
    queueInts(8, {-2147483647 - 1, 0, 2147483647});
    EXPECT_EQ("-2147483648,0,2147483647", read());
    queueInts(9, {42, 1, 2});
    EXPECT_EQ("42", read());
    queueText(10, "Marlowe&Tenby,PMX-M01,100000,1.0");
    EXPECT_EQ("Marlowe&Tenby,PMX-M01,100000,1.0", read());
    queueFloats(11, {0.00123456f, 2.0f});
    EXPECT_EQ("1.234560e-003,2.000000e+000", read());
}

TEST_F(DataBuffer, EveryDataTypeInBinary)
{
    binary();
    const std::string bytes("#14abcd", 7);
    queueText(0, bytes); // copied through, no header added
    EXPECT_EQ(bytes, read());
    for (int type : {1, 2, 3}) {
        queueInts(type, {5, 6, 7});
        EXPECT_EQ("5", read()) << type;
    }
    queueFloats(4, {1.0f, 0.5f, -2.0f});
    EXPECT_EQ("#212" + bytesOf(1.0f) + bytesOf(0.5f) + bytesOf(-2.0f), read());
    queueFloats(4, {});
    EXPECT_EQ("#10", read());
    queueFloats(5, {1.0f, 0.5f, -2.0f});
    EXPECT_EQ("1.000000e+000,5.000000e-001,-2.000000e+000", read());
    queueFloats(6, {-45.0f});
    EXPECT_EQ("-4.500000e+001", read());
    queueFloats(7, {0.5f, 2.0f, 3.0f});
    EXPECT_EQ("#14" + bytesOf(0.5f), read());
    queueInts(8, {1, 2, 3});
    EXPECT_EQ("1,2,3", read());
    queueInts(9, {-1});
    EXPECT_EQ("-1", read());
    queueText(10, "text");
    EXPECT_EQ("text", read());
    queueFloats(11, {1.0f});
    EXPECT_EQ("#14" + bytesOf(1.0f), read());
}

TEST_F(DataBuffer, PendingResultsAreWrittenOneAfterAnother)
{
    binary();
    queueFloats(7, {0.5f, 0.0f, 0.0f});
    queueFloats(6, {1.0f});
    queueFloats(4, {2.0f});
    EXPECT_EQ("#14" + bytesOf(0.5f) + "1.000000e+000" + "#14" + bytesOf(2.0f), read());
    EXPECT_EQ(LbPmxVisa::CIPmxSessionState::noData(), session().getState());
    // Everything was fetched: the next read waits for a new result.
    session().setTimeout(1);
    EXPECT_THROW(read(), LbPmxVisa::CIPmxSessionState::CPmxNoDataAvailableException);
}

TEST_F(DataBuffer, AResultThatDoesNotFitFailsTheReadAndIsDiscarded)
{
    queueFloats(4, {1.0f, 0.5f});
    EXPECT_THROW(read(27), CPmxDataBuffer::CPmxDataBufferOverFlowException); // 27 bytes + zero needed
    int32_t type = 0;
    EXPECT_EQ(LbPmxVisa::PMX_NO_FURTHER_RESULT, PmxGetData(session().getHandle(), &type, nullptr, nullptr));
    queueFloats(4, {1.0f, 0.5f});
    EXPECT_EQ("1.000000e+000,5.000000e-001", read(28));
}

TEST_F(DataBuffer, TypesOutsideTheTableAreRefusedWithAnEmptyCString)
{
    for (int type : {12, -1}) {
        try {
            CPmxDataSerializerFactory::getInstance().get(static_cast<EDataType>(type));
            ADD_FAILURE() << "type " << type << " accepted";
        } catch (const char* text) {
            EXPECT_STREQ("", text);
        }
    }
}

TEST_F(DataBuffer, ALibraryFailureWritesNothing)
{
    queueFloats(6, {1.0f});
    ASSERT_EQ(0, PmxSimFailNext("PmxGetFloatResult", PMXSIM_E_INVALID_HANDLE));
    try {
        read();
        ADD_FAILURE() << "read succeeded";
    } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
        EXPECT_EQ(PMXSIM_E_INVALID_HANDLE, e.getErrorCode());
    }
    EXPECT_EQ(LbPmxVisa::CIPmxSessionState::noData(), session().getState());
}
