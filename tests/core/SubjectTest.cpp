#include "core/Parent.h"
#include "core/Subject.h"
#include "tests/core/TestSupport.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <thread>
#include <vector>

using namespace LbCore;

namespace {

class CObserver {
public:
    CObserver(std::vector<int>& calls, int id, bool answer = false) : m_rcCalls(calls), m_nId(id), m_bAnswer(answer) { }
    virtual ~CObserver() { }
    virtual bool seen(int value)
    {
        m_rcCalls.push_back(m_nId * 100 + value);
        return m_bAnswer;
    }
    bool other(int value)
    {
        m_rcCalls.push_back(-(m_nId * 100 + value));
        return false;
    }

protected:
    std::vector<int>& m_rcCalls;
    int m_nId;
    bool m_bAnswer;
};

typedef CSubject<CObserver, bool(int)> CBoolSubject;

// Blocks inside its notification until the test lets it go.
class CBlockingObserver : public CObserver {
public:
    using CObserver::CObserver;
    bool seen(int value) override
    {
        m_cEntered.open();
        EXPECT_TRUE(m_cGo.waitOpen());
        return CObserver::seen(value);
    }
    LbTests::CLatch m_cEntered;
    LbTests::CLatch m_cGo;
};

} // namespace

TEST(CSubjectTest, NotifiesInAttachmentOrderWithoutDuplicates)
{
    std::vector<int> calls;
    CObserver a(calls, 1), b(calls, 2), c(calls, 3);
    CBoolSubject subject(&CObserver::seen, false);
    EXPECT_TRUE(subject.attach(b));
    EXPECT_TRUE(subject.attach(a));
    EXPECT_TRUE(subject.attach(c));
    EXPECT_FALSE(subject.attach(a));
    EXPECT_FALSE(subject.notify(7));
    EXPECT_EQ((std::vector<int>{207, 107, 307}), calls);

    calls.clear();
    subject.notify(1, &CObserver::other);
    EXPECT_EQ((std::vector<int>{-201, -101, -301}), calls);

    calls.clear();
    EXPECT_TRUE(subject.detach(a));
    EXPECT_FALSE(subject.detach(a));
    subject.notify(2);
    EXPECT_EQ((std::vector<int>{202, 302}), calls);
}

TEST(CSubjectTest, ResultDiffersFromDefaultWhenAnyObserverDiffers)
{
    std::vector<int> calls;
    CObserver no(calls, 1, false), yes(calls, 2, true);
    CBoolSubject subject(&CObserver::seen, false);
    EXPECT_FALSE(subject.notify(0)); // no observers: the default
    subject.attach(yes);
    subject.attach(no);
    EXPECT_TRUE(subject.notify(0));

    CBoolSubject withoutMember(nullptr, true);
    withoutMember.attach(no);
    calls.clear();
    EXPECT_TRUE(withoutMember.notify(0));
    EXPECT_TRUE(calls.empty());
}

TEST(CSubjectTest, DisableStopsAWalkInProgressBeforeTheNextObserver)
{
    std::vector<int> calls;
    CBlockingObserver first(calls, 1);
    CObserver second(calls, 2);
    CBoolSubject subject(&CObserver::seen, false);
    subject.attach(first);
    subject.attach(second);

    std::thread walker([&] { subject.notify(5); });
    ASSERT_TRUE(first.m_cEntered.waitOpen());
    subject.disable(); // must not wait for the walk's lock
    first.m_cGo.open();
    walker.join();
    EXPECT_EQ(std::vector<int>{105}, calls);

    calls.clear();
    subject.notify(6);
    EXPECT_TRUE(calls.empty());
    EXPECT_TRUE(subject.detach(second)); // the list still changes
    EXPECT_TRUE(subject.attach(second));
}

TEST(CParentTest, NullParentThrows)
{
    int owner = 4;
    EXPECT_EQ(&owner, CParent<int>(&owner).getParent());
    try {
        CParent<int>(nullptr).getParent();
        FAIL() << "getParent() on a null parent did not throw";
    } catch (const std::runtime_error& e) {
        EXPECT_STREQ("NULL pointer m_pcParent", e.what());
    }
}
