#include "sensor/PmxSessionState.h"
#include "tests/sensor/SimSessionFixture.h"

#include <gtest/gtest.h>

#include <chrono>
#include <string>
#include <thread>

using LbPmxVisa::CIPmxSessionState;
using LbPmxVisa::CPmxSessionDispatcher;

namespace {

typedef const CIPmxSessionState* (*CAccessor)();
const CAccessor STATES[] = {
    &CIPmxSessionState::noData,
    &CIPmxSessionState::waitingForData,
    &CIPmxSessionState::dataAvailable,
    &CIPmxSessionState::errorQueueToNoData,
    &CIPmxSessionState::errorQueueToPmxDataAvailable,
    &CIPmxSessionState::opStatusToNoData,
    &CIPmxSessionState::opStatusToPmxDataAvailable,
};
const char* const STATE_NAMES[] = {
    "NoData",
    "WaitingForData",
    "DataAvailable",
    "ErrorQueueDataAvailable_ToNoData",
    "ErrorQueueDataAvailable_ToPmxDataAvailable",
    "PmxOpStatusRegDataAvailable_ToNoData",
    "PmxOpStatusRegDataAvailable_ToPmxDataAvailable",
};
const int R = -1; // refused
// Successor by current state (rows) and requested target (columns), in the order above.
const int TRANSITION_TABLE[7][7] = {
    {0, 1, 2, 3, R, 5, R}, {0, R, 2, R, R, R, R}, {0, R, 2, 4, R, 6, R}, {0, R, 4, 3, R, R, R},
    {2, R, R, 4, 4, R, R}, {0, R, 6, R, R, 5, R}, {2, R, R, R, R, 6, R},
};

class SessionState : public LbTests::CSimSession {
protected:
    const CIPmxSessionState* state() { return session().getState(); }
    void reportError(std::int32_t code)
    {
        ASSERT_EQ(0, PmxSimReportError(LbTests::SENSOR_SERIAL, code));
        ASSERT_TRUE(m_cListener.waitErrors(++m_nErrors));
    }
    int m_nErrors = 0;
};

} // namespace

TEST_F(SessionState, EveryTransitionOfTheTable)
{
    for (int current = 0; current < 7; ++current) {
        EXPECT_EQ(STATE_NAMES[current], STATES[current]()->getName());
        for (int target = 0; target < 7; ++target) {
            const CIPmxSessionState* from = STATES[current]();
            const CIPmxSessionState* to = STATES[target]();
            SCOPED_TRACE(std::string(STATE_NAMES[current]) + " -> " + STATE_NAMES[target]);
            if (TRANSITION_TABLE[current][target] == R) {
                try {
                    from->nextState(session(), to);
                    ADD_FAILURE() << "accepted";
                } catch (const CIPmxSessionState::CPmxInvalidStateException& e) {
                    EXPECT_EQ(std::string("Can't change state from ") + STATE_NAMES[current] + " into state " +
                                  STATE_NAMES[target],
                              e.what());
                }
            } else {
                EXPECT_EQ(STATES[TRANSITION_TABLE[current][target]](), from->nextState(session(), to));
            }
            // Only WaitingForData -> DataAvailable hands a count to a waiting reader, once.
            EXPECT_EQ(current == 1 && target == 2, session().getDataSemaphore().wait(0));
            EXPECT_FALSE(session().getDataSemaphore().wait(0));
        }
    }
}

TEST_F(SessionState, ReadWithoutDataFailsAfterTheTimeoutAndEndsInNoData)
{
    session().setTimeout(50);
    auto start = std::chrono::steady_clock::now();
    EXPECT_THROW(read(), CIPmxSessionState::CPmxNoDataAvailableException);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(45));
    EXPECT_EQ(CIPmxSessionState::noData(), state());
    EXPECT_STREQ("no data available", CIPmxSessionState::CPmxNoDataAvailableException().what());
}

TEST_F(SessionState, AReadThatWaitsIsWokenByTheResult)
{
    session().setTimeout(20000);
    std::string reply;
    std::thread reader([&] { reply = read(); });
    auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (state() != CIPmxSessionState::waitingForData() && std::chrono::steady_clock::now() < deadline) {
        std::this_thread::yield();
    }
    EXPECT_EQ(CIPmxSessionState::waitingForData(), state());
    queueFloats(6, {2.0f});
    reader.join();
    EXPECT_EQ("2.000000e+000", reply);
    EXPECT_EQ(CIPmxSessionState::noData(), state());
    EXPECT_FALSE(session().getDataSemaphore().wait(0));
}

TEST_F(SessionState, ResultFirstThenRead)
{
    queueFloats(6, {1.0f});
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    EXPECT_FALSE(session().getDataSemaphore().wait(0)); // idle: the semaphore stays untouched
    session().write("FETCh?");
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    EXPECT_EQ("1.000000e+000", read());
    EXPECT_EQ(CIPmxSessionState::noData(), state());
}

TEST_F(SessionState, DataAvailableWithoutAResultWaitsForTheNextOne)
{
    // An announcement whose result is gone: the read waits as in NoData.
    session().setTimeout(50);
    session().changeState(CIPmxSessionState::dataAvailable());
    EXPECT_THROW(read(), CIPmxSessionState::CPmxNoDataAvailableException);
    EXPECT_EQ(CIPmxSessionState::noData(), state());
}

TEST_F(SessionState, AFailedFetchFailsTheReadWithItsCode)
{
    queueFloats(6, {1.0f});
    ASSERT_EQ(0, PmxSimFailNext("PmxGetData", PMXSIM_E_SENSOR_DETACHED));
    try {
        read();
        ADD_FAILURE() << "read succeeded";
    } catch (const CPmxSessionDispatcher::CPmxCommandException& e) {
        EXPECT_EQ(PMXSIM_E_SENSOR_DETACHED, e.getErrorCode());
    }
    EXPECT_EQ(CIPmxSessionState::noData(), state());
}

TEST_F(SessionState, StatusQueryWhileAResultIsPendingIsAnsweredFirst)
{
    queueFloats(6, {1.0f});
    ASSERT_EQ(0, PmxSimSetTriggerState(LbTests::SENSOR_SERIAL, 3));
    session().write("STATus:OPERation:CONDition?");
    EXPECT_EQ(CIPmxSessionState::opStatusToPmxDataAvailable(), state());
    EXPECT_EQ("16", read());
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    EXPECT_EQ("1.000000e+000", read());
    ASSERT_EQ(0, PmxSimSetTriggerState(LbTests::SENSOR_SERIAL, 2));
    session().write("stat:oper:cond?");
    EXPECT_EQ("32", read());
    ASSERT_EQ(0, PmxSimSetTriggerState(LbTests::SENSOR_SERIAL, 1));
    session().write("stat:oper:cond?");
    EXPECT_EQ("0", read());
}

TEST_F(SessionState, ErrorQueryBlocksTheStatusQueryWhileAResultIsPending)
{
    reportError(LbPmxVisa::PMX_UNKNOWN_COMMAND);
    queueFloats(6, {1.0f});
    session().write("syst:err?");
    session().write("stat:oper:cond?");
    EXPECT_EQ(CIPmxSessionState::errorQueueToPmxDataAvailable(), state());
    EXPECT_EQ("-805306231, \"", read().substr(0, 13));
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    EXPECT_EQ("1.000000e+000", read());
}

TEST_F(SessionState, AResultDuringAnErrorOrStatusQueryIsRemembered)
{
    session().write("stat:oper:cond?");
    queueFloats(6, {1.0f});
    EXPECT_EQ(CIPmxSessionState::opStatusToPmxDataAvailable(), state());
    EXPECT_EQ("0", read());
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    EXPECT_EQ("1.000000e+000", read());

    session().write("syst:err?");
    queueFloats(6, {2.0f});
    EXPECT_EQ(CIPmxSessionState::errorQueueToPmxDataAvailable(), state());
    EXPECT_EQ("0, \"No Error\"", read());
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    EXPECT_EQ("2.000000e+000", read());
}

TEST_F(SessionState, ACommandForTheSensorGivesUpAPendingResultButNotAQueriedOne)
{
    queueFloats(6, {1.0f});
    session().write("*cls");
    EXPECT_EQ(CIPmxSessionState::noData(), state());

    queueFloats(6, {2.0f});
    session().write("syst:err?");
    session().write("*cls");
    EXPECT_EQ(CIPmxSessionState::dataAvailable(), state());
    // The library's buffers were emptied for the command, so nothing is left to fetch.
    session().setTimeout(50);
    EXPECT_THROW(read(), CIPmxSessionState::CPmxNoDataAvailableException);
}
