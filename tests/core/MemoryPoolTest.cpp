#include "core/MemoryPool.h"

#include <gtest/gtest.h>

#include <atomic>
#include <mutex>
#include <thread>
#include <vector>

using namespace LbCore;

namespace {

std::atomic<int> g_nAlive(0);

class CManaged : public CMemoryPool::CMemoryPoolManaged {
public:
    explicit CManaged(int value) : m_nValue(value), m_aPayload() { ++g_nAlive; }
    ~CManaged() override { --g_nAlive; }
    int m_nValue;
    char m_aPayload[40];
};

} // namespace

// Objects are made on one thread and freed on another, in no particular order.
TEST(CMemoryPoolTest, ManagedObjectsComeAndGoFromSeveralThreads)
{
    const int THREADS = 4;
    const int OBJECTS = 500;
    std::mutex mutex;
    std::vector<CManaged*> shared;
    std::vector<std::thread> threads;
    for (int t = 0; t < THREADS; ++t) {
        threads.emplace_back([&, t] {
            for (int i = 0; i < OBJECTS; ++i) {
                CManaged* made = (i % 3 == 0) ? new (std::nothrow) CManaged(t) : new CManaged(t);
                ASSERT_NE(nullptr, made);
                CManaged* old = nullptr;
                {
                    std::lock_guard<std::mutex> lock(mutex);
                    shared.push_back(made);
                    if (i % 2 == 1) {
                        old = shared.front();
                        shared.erase(shared.begin());
                    }
                }
                delete old;
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(static_cast<int>(shared.size()), g_nAlive.load());
    for (CManaged* managed : shared) {
        delete managed;
    }
    EXPECT_EQ(0, g_nAlive.load());
}
