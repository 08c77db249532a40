// Shared by the tests of the simulated library: a recorder of every callback, waited on with a
// deadline, and a fixture that starts each test from a fresh library with its driver open.
#ifndef TESTS_PMXSIM_PMXSIMFIXTURE_H
#define TESTS_PMXSIM_PMXSIMFIXTURE_H

#include "pmxsim/PmxSim.h"
#include "tests/Waiting.h"

#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <functional>
#include <mutex>
#include <ostream>
#include <string>
#include <thread>
#include <vector>

namespace PmxSimTesting {

using LbTests::DEADLINE;

enum EKind { KIND_ACCEPTED, KIND_STATE, KIND_DATA, KIND_ERROR, KIND_DEVICE };

struct SCall {
    EKind kind;
    int64_t handle;
    int32_t value;
    std::thread::id thread;
    bool operator==(const SCall& other) const
    {
        return kind == other.kind && handle == other.handle && value == other.value;
    }
};

inline std::ostream& operator<<(std::ostream& out, const SCall& call)
{
    return out << "{" << call.kind << "," << call.handle << "," << call.value << "}";
}

// Records every callback; tests wait on it with a deadline, never with a sleep.
class CRecorder {
public:
    void add(EKind kind, int64_t handle, int32_t value)
    {
        std::lock_guard<std::mutex> lock(m_aMutex);
        m_aCalls.push_back(SCall{kind, handle, value, std::this_thread::get_id()});
        m_aChanged.notify_all();
        if (m_fnHook)
            m_fnHook(kind, handle, value);
    }
    // Waits until at least count calls satisfy pred.
    bool waitFor(const std::function<bool(const SCall&)>& pred, size_t count = 1)
    {
        std::unique_lock<std::mutex> lock(m_aMutex);
        return m_aChanged.wait_for(lock, DEADLINE, [&] {
            size_t matching = 0;
            for (const SCall& call : m_aCalls)
                matching += pred(call) ? 1 : 0;
            return matching >= count;
        });
    }
    bool waitCount(size_t count)
    {
        std::unique_lock<std::mutex> lock(m_aMutex);
        return m_aChanged.wait_for(lock, DEADLINE, [&] { return m_aCalls.size() >= count; });
    }
    std::vector<SCall> calls()
    {
        std::lock_guard<std::mutex> lock(m_aMutex);
        return m_aCalls;
    }
    void clear()
    {
        std::lock_guard<std::mutex> lock(m_aMutex);
        m_aCalls.clear();
    }
    // Runs on the callback thread, after recording (set before the driver opens).
    std::function<void(EKind, int64_t, int32_t)> m_fnHook;

private:
    std::mutex m_aMutex;
    std::condition_variable m_aChanged;
    std::vector<SCall> m_aCalls;
};

inline void onAccepted(int64_t h, int32_t v, void* user)
{
    static_cast<CRecorder*>(user)->add(KIND_ACCEPTED, h, v);
}
inline void onState(int64_t h, int32_t v, void* user)
{
    static_cast<CRecorder*>(user)->add(KIND_STATE, h, v);
}
inline void onData(int64_t h, int32_t v, void* user)
{
    static_cast<CRecorder*>(user)->add(KIND_DATA, h, v);
}
inline void onError(int64_t h, int32_t v, void* user)
{
    static_cast<CRecorder*>(user)->add(KIND_ERROR, h, v);
}
inline void onDevice(void* user)
{
    static_cast<CRecorder*>(user)->add(KIND_DEVICE, 0, 0);
}

inline void registerAll(CRecorder* recorder)
{
    ASSERT_EQ(0, PmxSetNotifyCallbackCommandAccepted(onAccepted, recorder));
    ASSERT_EQ(0, PmxSetNotifyCallbackStateChanged(onState, recorder));
    ASSERT_EQ(0, PmxSetNotifyCallbackDataAvailable(onData, recorder));
    ASSERT_EQ(0, PmxSetNotifyCallbackErrorOccurred(onError, recorder));
    ASSERT_EQ(0, PmxSetNotifyCallbackDeviceChanged(onDevice, recorder));
}

inline bool isAccepted(const SCall& c)
{
    return c.kind == KIND_ACCEPTED;
}

class PmxSimTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        ASSERT_EQ(0, PmxSimReset());
        ASSERT_EQ(0, PmxSimSetDelays(0, 0));
        registerAll(&m_aRecorder);
        ASSERT_EQ(0, PmxOpenDriver());
    }
    void TearDown() override { EXPECT_EQ(0, PmxSimReset()); }

    int64_t open(const char* descriptor = "USB::0x0c6f::0003::100000")
    {
        int64_t handle = 0;
        EXPECT_EQ(0, PmxOpenSensor(descriptor, &handle));
        return handle;
    }
    // Sends a command and waits for its acknowledgement.
    void command(int64_t handle, const char* text) { sendAndWait(handle, text, KIND_ACCEPTED); }
    // Sends a command and waits for its next result; the oldest pending result stays for the
    // caller to take.
    void awaitResult(int64_t handle, const char* text) { sendAndWait(handle, text, KIND_DATA); }
    // Sends a command and waits for the next callback of `kind` for the handle.
    void sendAndWait(int64_t handle, const char* text, EKind kind)
    {
        auto matches = [&](const SCall& c) { return c.kind == kind && c.handle == handle; };
        size_t before = 0;
        for (const SCall& c : m_aRecorder.calls())
            if (matches(c))
                ++before;
        ASSERT_EQ(0, PmxSendCommand(handle, text, 0));
        ASSERT_TRUE(m_aRecorder.waitFor(matches, before + 1)) << text;
    }
    std::string ask(int64_t handle, const char* text)
    {
        awaitResult(handle, text);
        char answer[256] = "";
        EXPECT_EQ(0, PmxGetStringResult(handle, answer, sizeof answer)) << text;
        return answer;
    }
    float measure(int64_t handle, const char* text = "meas?")
    {
        awaitResult(handle, text);
        float value = 0.0f;
        EXPECT_EQ(0, PmxGetFloatResult(handle, &value, nullptr, nullptr)) << text;
        return value;
    }
    std::string errorText(int32_t code)
    {
        char text[256] = "";
        EXPECT_EQ(0, PmxGetErrorText(code, text, sizeof text));
        return text;
    }

    CRecorder m_aRecorder;
};

} // namespace PmxSimTesting

#endif
