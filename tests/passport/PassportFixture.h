// Test support for the passport driven end to end: the VISA runtime of the build loads the
// passport LbViPmx64 beside it, which drives the simulated sensor library. Logging is configured
// (DEBUG into a file of the test's own) before the runtime loads the passport, so tests can
// look for the passport's log lines.
#ifndef LBTESTS_PASSPORT_PASSPORTFIXTURE_H
#define LBTESTS_PASSPORT_PASSPORTFIXTURE_H

#include <gtest/gtest.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "pmxsim/PmxSim.h"
#include "visahost/include/visa.h"

#if defined(_WIN32)
#include <windows.h>
#else
#include <unistd.h>
#endif

namespace LbPassportTest {

// Writes (or with a null value removes) one of the passport's configuration values.
inline void setConfiguration(const char* name, const char* value)
{
#if defined(_WIN32)
    HKEY key = 0;
    RegCreateKeyExA(
        HKEY_LOCAL_MACHINE,
        "SOFTWARE\\National Instruments\\NI-VISA for Windows 95/NT\\CurrentVersion\\IoLibraries\\LbViPmx.dll", 0, 0, 0,
        KEY_SET_VALUE, 0, &key, 0);
    if (value == 0) {
        RegDeleteValueA(key, name);
    } else {
        RegSetValueExA(key, name, 0, REG_SZ, reinterpret_cast<const BYTE*>(value),
                       static_cast<DWORD>(std::strlen(value) + 1));
    }
    RegCloseKey(key);
#else
    std::string variable = std::string("LBVIPMX_") + name;
    if (value == nullptr) {
        unsetenv(variable.c_str());
    } else {
        setenv(variable.c_str(), value, 1);
    }
#endif
}

inline void usePassport()
{
#if defined(_WIN32)
    _putenv_s("LBVISA_PASSPORTS", "LbViPmx64.dll");
#else
    setenv("LBVISA_PASSPORTS", "LbViPmx64.so", 1);
#endif
}

// A short path for a log file of this process (the passport accepts at most 79 characters).
inline std::string temporaryPath(const std::string& name)
{
#if defined(_WIN32)
    char folder[MAX_PATH] = {0};
    GetTempPathA(MAX_PATH, folder);
    return std::string(folder) + name + "-" + std::to_string(GetCurrentProcessId()) + ".log";
#else
    return "/tmp/" + name + "-" + std::to_string(getpid()) + ".log";
#endif
}

inline std::string readFile(const std::string& path)
{
    std::ifstream file(path.c_str(), std::ios::in | std::ios::binary);
    std::ostringstream text;
    text << file.rdbuf();
    return text.str();
}

inline bool fileExists(const std::string& path)
{
    std::ifstream file(path.c_str());
    return file.good();
}

// Waits for a condition that another thread of the system makes true, with a generous deadline.
template <class F> bool eventually(F condition, int seconds = 30)
{
    auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(seconds);
    while (!condition()) {
        if (std::chrono::steady_clock::now() > deadline) {
            return false;
        }
        std::this_thread::yield();
    }
    return true;
}

class CPassportTest : public ::testing::Test {
public:
    static std::string logPath()
    {
        static const std::string s_sPath = temporaryPath("lbpmx-passport-test");
        return s_sPath;
    }

    // Configures logging and loads the passport once per process.
    static void SetUpTestSuite()
    {
        static bool s_bLoaded = false;
        if (s_bLoaded) {
            return;
        }
        s_bLoaded = true;
        std::remove(logPath().c_str());
        usePassport();
        setConfiguration("LOG_LEVEL", "DEBUG");
        setConfiguration("LOG_FILE", logPath().c_str());
        ViSession rm = VI_NULL;
        ViStatus status = viOpenDefaultRM(&rm);
        // Read once at load: later processes must not inherit this configuration.
        setConfiguration("LOG_LEVEL", nullptr);
        setConfiguration("LOG_FILE", nullptr);
        ASSERT_EQ(VI_SUCCESS, status);
        viClose(rm);
    }

protected:
    void SetUp() override
    {
        ASSERT_EQ(0, PmxSimReset());
        ASSERT_EQ(VI_SUCCESS, viOpenDefaultRM(&m_nRm));
    }

    void TearDown() override
    {
        viClose(m_nRm);
        PmxSimReset();
    }

    ViSession open(const std::string& name)
    {
        ViSession session = VI_NULL;
        EXPECT_EQ(VI_SUCCESS, viOpen(m_nRm, name.c_str(), VI_NULL, 0, &session));
        return session;
    }

    static ViStatus write(ViSession session, const std::string& text, ViUInt32* count = nullptr)
    {
        return viWrite(session, reinterpret_cast<ViConstBuf>(text.data()), static_cast<ViUInt32>(text.size()), count);
    }

    // Reads one answer; the status goes to *status when given, else it must be VI_SUCCESS.
    static std::string read(ViSession session, ViUInt32 capacity = 1024, ViStatus* status = nullptr)
    {
        std::vector<ViByte> buffer(capacity + 1, 0);
        ViUInt32 count = 0;
        ViStatus result = viRead(session, buffer.data(), capacity, &count);
        if (status != nullptr) {
            *status = result;
        } else {
            EXPECT_EQ(VI_SUCCESS, result);
        }
        return std::string(reinterpret_cast<const char*>(buffer.data()), result == VI_SUCCESS ? count : 0);
    }

    static bool logContains(const std::string& text) { return readFile(logPath()).find(text) != std::string::npos; }

    static std::size_t logCount(const std::string& text)
    {
        std::string log = readFile(logPath());
        std::size_t count = 0;
        for (std::size_t at = log.find(text); at != std::string::npos; at = log.find(text, at + 1)) {
            ++count;
        }
        return count;
    }

    ViSession m_nRm = VI_NULL;
};

} // namespace LbPassportTest

#endif
