#include "core/Interlocked.h"
#include "core/Lock.h"
#include "core/Semaphore.h"
#include "tests/core/TestSupport.h"

#include <gtest/gtest.h>

#include <chrono>
#include <stdexcept>
#include <thread>

using namespace LbCore;

namespace {

void expectReleaseFails(CSemaphore& semaphore, unsigned count)
{
    try {
        semaphore.release(count);
        FAIL() << "release(" << count << ") did not throw";
    } catch (const std::runtime_error& e) {
        EXPECT_STREQ("::ReleaseSemaphore failed", e.what());
    }
}

} // namespace

TEST(CCriticalSectionTest, IsRecursiveAndExcludesOtherThreads)
{
    CCriticalSection section;
    long counter = 0;
    // Re-entering on purpose, which the lock annotations cannot express.
    auto add = [&]() NO_THREAD_SAFETY_ANALYSIS {
        for (int i = 0; i < 20000; ++i) {
            CLock<CCriticalSection> outer(section);
            CLock<CCriticalSection> inner(section); // the owner may enter again
            ++counter;
        }
    };
    std::thread other(add);
    add();
    other.join();
    EXPECT_EQ(40000, counter);
}

TEST(CCriticalSectionTest, DestroyingAHeldSectionLogsAnError) NO_THREAD_SAFETY_ANALYSIS
{
#if defined(__SANITIZE_THREAD__)
    GTEST_SKIP() << "the sanitizer itself reports destroying a held lock";
#endif
    LbTests::CCaptureAppender capture;
    CCriticalSection* section = new CCriticalSection;
    section->enter();
    delete section;
    EXPECT_TRUE(capture.contains("[ERROR] CCriticalSection - LbCore::CCriticalSection::~CCriticalSection - "
                                 "Deleting a critical section when it's still blocking"));
}

TEST(CSemaphoreTest, CountsReleasesAndTimesOut)
{
    CSemaphore semaphore(1);
    EXPECT_TRUE(semaphore.wait(0));
    EXPECT_FALSE(semaphore.wait(0));
    semaphore.release(2);
    EXPECT_TRUE(semaphore.wait(0));
    EXPECT_TRUE(semaphore.wait(CSemaphore::INFINITE_WAIT));
    EXPECT_FALSE(semaphore.wait(0));

    auto begin = std::chrono::steady_clock::now();
    EXPECT_FALSE(semaphore.wait(60));
    auto waited = std::chrono::steady_clock::now() - begin;
    EXPECT_GE(waited, std::chrono::milliseconds(45));
    EXPECT_LT(waited, std::chrono::seconds(10));
}

TEST(CSemaphoreTest, ReleasePastTheMaximumThrowsAndKeepsTheCount)
{
    CSemaphore full(CSemaphore::MAX_COUNT);
    expectReleaseFails(full, 1);

    CSemaphore one(1);
    expectReleaseFails(one, 0x7FFFFFFFu);
    expectReleaseFails(one, 0x80000000u);
    EXPECT_TRUE(one.wait(0)); // the failed releases added nothing
    EXPECT_FALSE(one.wait(0));
}

TEST(InterlockedTest, ExchangesOnlyWhenTheComparandMatches)
{
    volatile std::int32_t flag = 0;
    EXPECT_EQ(0, interlockedCompareExchange(&flag, 1, 0));
    EXPECT_EQ(1, flag);
    EXPECT_EQ(1, interlockedCompareExchange(&flag, 2, 0));
    EXPECT_EQ(1, flag);
}
