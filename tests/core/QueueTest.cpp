#include "core/Queue.h"
#include "core/Semaphore.h"
#include "tests/core/TestSupport.h"

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

using namespace LbCore;

namespace {

const unsigned INFINITE_WAIT_MS = CSemaphore::INFINITE_WAIT;

struct CItem {
    explicit CItem(int value, std::atomic<int>* deletions = nullptr) : m_nValue(value), m_pnDeletions(deletions) { }
    virtual ~CItem()
    {
        if (m_pnDeletions != nullptr) {
            ++*m_pnDeletions;
        }
    }
    int m_nValue;
    std::atomic<int>* m_pnDeletions;
};

int popValue(CQueue<CItem>& queue, unsigned timeoutMs = 0)
{
    CItem* item = nullptr;
    int result = queue.pop(item, timeoutMs);
    if (result != 0) {
        return -result;
    }
    int value = item->m_nValue;
    delete item;
    return value;
}

} // namespace

TEST(CQueueTest, ThirdPushIntoCapacityTwoIsAcceptedAndOrderIsKept)
{
    CQueue<CItem> queue(2);
    EXPECT_EQ(0, queue.push(new CItem(1), 0));
    EXPECT_EQ(0, queue.push(new CItem(2), 0));
    EXPECT_EQ(0, queue.push(new CItem(3), 0)); // a 0 ms wait on a full queue still appends
    EXPECT_EQ(3u, queue.size());
    EXPECT_EQ(1, popValue(queue));
    EXPECT_EQ(2, popValue(queue));
    EXPECT_EQ(3, popValue(queue));
    EXPECT_EQ(0u, queue.size());
}

TEST(CQueueTest, PopOnAnEmptyQueueTimesOut)
{
    CQueue<CItem> queue(2);
    CItem* item = nullptr;
    EXPECT_EQ(1, queue.pop(item, 0));
    EXPECT_EQ(1, queue.pop(item, 30));
    EXPECT_EQ(nullptr, item);
}

TEST(CQueueTest, InterruptIsServedBeforeQueuedItems)
{
    CQueue<CItem> queue(10);
    queue.push(new CItem(1), 0);
    queue.push(new CItem(2), 0);
    EXPECT_EQ(0, queue.interrupt());
    CItem* item = nullptr;
    EXPECT_EQ(2, queue.pop(item, 0));
    EXPECT_EQ(nullptr, item);
    EXPECT_EQ(2u, queue.size());
    EXPECT_EQ(1, popValue(queue));
    EXPECT_EQ(2, popValue(queue));
    EXPECT_EQ(-1, popValue(queue)); // one interrupt ends exactly one pop
}

TEST(CQueueTest, InterruptWakesAWaitingConsumer)
{
    CQueue<CItem> queue(2);
    std::atomic<int> result(-1);
    std::atomic<long> consumerId(-1);
    std::thread consumer([&] {
        consumerId = LbTests::currentThreadId();
        result = popValue(queue, INFINITE_WAIT_MS);
    });
    while (consumerId.load() == -1) {
        std::this_thread::yield();
    }
    ASSERT_TRUE(LbTests::waitUntilSleeping(consumerId.load())); // the consumer really waits
    queue.interrupt();
    consumer.join();
    EXPECT_EQ(-2, result.load());
}

TEST(CQueueTest, DestructionDeletesEveryLeftItemExactlyOnce)
{
    std::atomic<int> deletions(0);
    {
        CQueue<CItem> queue(2);
        for (int i = 0; i < 5; ++i) {
            queue.push(new CItem(i, &deletions), 0);
        }
        EXPECT_EQ(0, popValue(queue)); // a popped item belongs to the caller
        EXPECT_EQ(1, deletions.load());
        queue.interrupt(); // a pending interrupt must not stop the clean-up
    }
    EXPECT_EQ(5, deletions.load());
}

TEST(CQueueTest, ManyProducersKeepTheirOrderAtOneConsumer)
{
    const int PRODUCERS = 3;
    const int ITEMS = 300;
    CQueue<CItem> queue(2);
    std::vector<std::thread> producers;
    for (int p = 0; p < PRODUCERS; ++p) {
        producers.emplace_back([&queue, p] {
            for (int i = 0; i < ITEMS; ++i) {
                queue.push(new CItem(p * ITEMS + i), 0);
            }
        });
    }
    std::vector<int> next(PRODUCERS, 0);
    for (int n = 0; n < PRODUCERS * ITEMS; ++n) {
        int value = popValue(queue, 20000);
        ASSERT_GE(value, 0);
        int producer = value / ITEMS;
        EXPECT_EQ(next[producer], value % ITEMS);
        next[producer] = value % ITEMS + 1;
    }
    for (std::thread& producer : producers) {
        producer.join();
    }
    EXPECT_EQ(0u, queue.size());
}
