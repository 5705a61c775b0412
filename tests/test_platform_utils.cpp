// Reference counting, the looping thread, the sorted containers, String16 and the clocks.
#include <pthread.h>

#include <ctime>
#include <random>

#include <utils/KeyedVector.h>
#include <utils/RefBase.h>
#include <utils/SortedVector.h>
#include <utils/StrongPointer.h>
#include <utils/String16.h>
#include <utils/Thread.h>
#include <utils/Timers.h>

#include "support/PlatformTestSupport.h"

using namespace android;
using namespace korvo::platformtest;

namespace {

struct Hooks {
    std::atomic<int> firstRefs{0}, lastStrongRefs{0}, destroyed{0}, strongAtLast{-1};
};

class Counted : public RefBase {
public:
    explicit Counted(Hooks* h) : mHooks(h) {}
    ~Counted() override { mHooks->destroyed++; }
    int value = 7;

protected:
    void onFirstRef() override { mHooks->firstRefs++; }
    void onLastStrongRef(const void*) override {
        mHooks->lastStrongRefs++;
        mHooks->strongAtLast = getStrongCount();
    }

private:
    Hooks* mHooks;
};

struct Derived : Counted {
    using Counted::Counted;
};

// Counts its turns and stops after `limit` of them (0: runs until asked to exit).
class LoopThread : public Thread {
public:
    explicit LoopThread(int maxTurns, status_t ready = OK) : Thread(false), limit(maxTurns), mReady(ready) {}
    ~LoopThread() override { destroyed++; }
    std::atomic<int> limit, turns{0};
    std::atomic<bool> inLoop{false}, requestFromInside{false};
    std::atomic<status_t> insideResult{OK}, insideJoin{OK};
    std::string name;
    sp<LoopThread> self;  // when set, the loop drops it: the last reference goes from inside
    static std::atomic<int> destroyed;

private:
    status_t readyToRun() override {
        char buf[32] = {};
        pthread_getname_np(pthread_self(), buf, sizeof(buf));
        name = buf;
        return mReady;
    }
    bool threadLoop() override {
        if (self != nullptr) {
            sp<LoopThread> last;
            std::swap(last, self);
            last.clear();  // the object is gone from here on
            return true;
        }
        inLoop = true;
        if (requestFromInside) {
            insideResult = requestExitAndWait();
            insideJoin = join();
            inLoop = false;
            return false;
        }
        const int n = ++turns;
        std::this_thread::yield();
        inLoop = false;
        return limit == 0 || n < limit;
    }
    const status_t mReady;
};
std::atomic<int> LoopThread::destroyed{0};

using PlatformTest = PlatformFixture;

TEST_F(PlatformTest, StrongPointerCountsAndHooks) {
    Hooks h;
    Counted* raw = new Counted(&h);
    EXPECT_EQ(raw->getStrongCount(), 0);  // the initial marker reads as 0
    EXPECT_EQ(h.firstRefs, 0);
    {
        sp<Counted> a(raw);
        EXPECT_EQ(h.firstRefs, 1);
        EXPECT_EQ(a->getStrongCount(), 1);
        sp<Counted> b(a);
        EXPECT_EQ(a->getStrongCount(), 2);
        sp<Counted> c(std::move(b));
        EXPECT_EQ(b.get(), nullptr);
        EXPECT_EQ(a->getStrongCount(), 2);
        sp<Counted> d;
        d = a;
        EXPECT_EQ(a->getStrongCount(), 3);
        sp<Counted>& alias = d;
        d = alias;  // self-assignment keeps the count
        EXPECT_EQ(a->getStrongCount(), 3);
        d = std::move(c);
        EXPECT_EQ(c.get(), nullptr);
        EXPECT_EQ(a->getStrongCount(), 2);
        d.clear();
        EXPECT_EQ(a->getStrongCount(), 1);
        sp<Counted> e = raw;  // from a raw pointer again
        EXPECT_EQ(a->getStrongCount(), 2);
        EXPECT_TRUE(e == raw && e == a);
        EXPECT_FALSE(e == nullptr);
        EXPECT_EQ(h.firstRefs, 1);  // once, however many references follow
        EXPECT_EQ(h.destroyed, 0);
    }
    EXPECT_EQ(h.lastStrongRefs, 1);
    EXPECT_EQ(h.strongAtLast, 0);
    EXPECT_EQ(h.destroyed, 1);

    // Conversion to a base pointer shares the count; assigning null drops it.
    Hooks h2;
    sp<Derived> derived = new Derived(&h2);
    sp<Counted> base(derived);
    EXPECT_EQ(base->getStrongCount(), 2);
    derived = nullptr;
    EXPECT_EQ(h2.destroyed, 0);
    base = static_cast<Counted*>(nullptr);
    EXPECT_EQ(h2.destroyed, 1);
    EXPECT_FALSE(base);

    // Copies and moves from several threads at once.
    Hooks h3;
    sp<Counted> shared = new Counted(&h3);
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t) {
        threads.emplace_back([shared] {
            for (int i = 0; i < 20000; ++i) {
                sp<Counted> copy(shared);
                sp<Counted> moved(std::move(copy));
                ASSERT_EQ(moved->value, 7);
            }
        });
    }
    for (auto& t : threads) t.join();
    EXPECT_EQ(shared->getStrongCount(), 1);
    shared.clear();
    EXPECT_EQ(h3.destroyed, 1);
    EXPECT_EQ(h3.firstRefs, 1);
}

TEST_F(PlatformTest, ThreadLoopsUntilFalseOrAsked) {
    sp<LoopThread> t = new LoopThread(25);
    EXPECT_FALSE(t->isRunning());
    ASSERT_EQ(t->run("LoopTest"), OK);
    ASSERT_TRUE(waitUntil([&] { return !t->isRunning(); }));
    EXPECT_EQ(t->turns, 25);
    EXPECT_EQ(t->name, "LoopTest");
    EXPECT_EQ(t->join(), OK);
    EXPECT_EQ(t->requestExitAndWait(), OK);  // nothing left to wait for
    // A thread that ended on its own may run again.
    t->limit = 50;
    ASSERT_EQ(t->run("LoopAgain"), OK);
    EXPECT_EQ(t->join(), OK);  // waits without asking the loop to stop
    EXPECT_EQ(t->turns, 50);
    EXPECT_FALSE(t->isRunning());

    sp<LoopThread> forever = new LoopThread(0);
    ASSERT_EQ(forever->run("an-overly-long-thread-name", PRIORITY_DEFAULT, 256 * 1024), OK);
    ASSERT_TRUE(waitUntil([&] { return forever->turns > 3; }));
    EXPECT_TRUE(forever->isRunning());
    EXPECT_EQ(forever->run("again"), INVALID_OPERATION);
    EXPECT_EQ(forever->requestExitAndWait(), OK);
    EXPECT_FALSE(forever->isRunning());
    EXPECT_FALSE(forever->inLoop);
    EXPECT_EQ(forever->name, "an-overly-long-");  // the kernel keeps 15 characters

    // requestExit alone: the loop sees exitPending and ends after its current turn.
    sp<LoopThread> u = new LoopThread(0);
    ASSERT_EQ(u->run("exitpending"), OK);
    ASSERT_TRUE(waitUntil([&] { return u->turns > 0; }));
    u->requestExit();
    ASSERT_TRUE(waitUntil([&] { return !u->isRunning(); }));
    EXPECT_EQ(u->join(), OK);
}

TEST_F(PlatformTest, ThreadEdgeCases) {
    sp<LoopThread> failing = new LoopThread(0, UNKNOWN_ERROR);  // readyToRun fails: no turn
    ASSERT_EQ(failing->run("notready"), OK);
    EXPECT_EQ(failing->join(), OK);
    EXPECT_EQ(failing->turns, 0);
    EXPECT_FALSE(failing->isRunning());

    sp<LoopThread> inside = new LoopThread(0);
    inside->requestFromInside = true;
    ASSERT_EQ(inside->run("inside"), OK);
    EXPECT_EQ(inside->join(), OK);
    EXPECT_EQ(inside->insideResult, WOULD_BLOCK);
    EXPECT_EQ(inside->insideJoin, WOULD_BLOCK);

    // A loop that ended by itself and was never joined: the destructor joins it
    // (a sanitizer reports a leaked thread otherwise).
    sp<LoopThread> ended = new LoopThread(3);
    LoopThread* raw = ended.get();
    ASSERT_EQ(ended->run("ended"), OK);
    ASSERT_TRUE(waitUntil([&] { return !raw->isRunning(); }));
    EXPECT_EQ(raw->turns, 3);
    const int before = LoopThread::destroyed;
    ended.clear();
    EXPECT_EQ(LoopThread::destroyed, before + 1);

    auto* dropping = new LoopThread(0);
    dropping->self = dropping;
    ASSERT_EQ(dropping->run("selfdrop"), OK);
    ASSERT_TRUE(waitUntil([&] { return LoopThread::destroyed == before + 2; }));
}

TEST_F(PlatformTest, SortedContainers) {
    SortedVector<uint32_t> v;
    for (uint32_t x : {30000u, 5u, 0x80000000u, 86000u, 1u, 5u}) v.add(x);
    ASSERT_EQ(v.size(), 5u);  // the second 5 replaced the first
    const uint32_t expected[] = {1u, 5u, 30000u, 86000u, 0x80000000u};  // unsigned order
    for (size_t i = 0; i < 5; ++i) EXPECT_EQ(v[i], expected[i]);
    EXPECT_EQ(v.indexOf(86000u), 3);
    EXPECT_EQ(v.indexOf(4u), NAME_NOT_FOUND);
    EXPECT_EQ(v.remove(5u), 1);
    EXPECT_EQ(v.remove(5u), NAME_NOT_FOUND);
    EXPECT_EQ(v.removeItemsAt(1, 2), 1);
    ASSERT_EQ(v.size(), 2u);
    EXPECT_EQ(v.itemAt(1), 0x80000000u);
    EXPECT_EQ(v.removeItemsAt(1, 5), BAD_VALUE);

    // KeyedVector against an ordered map, under random adds, replaces and removals.
    KeyedVector<uint32_t, int> kv;
    std::map<uint32_t, int> oracle;
    std::mt19937 rng(1234);
    for (int i = 0; i < 3000; ++i) {
        const uint32_t key = rng() % 500 + (rng() % 2 ? 0x80000000u : 0u);
        const int value = static_cast<int>(rng() % 1000);
        const unsigned op = rng() % 4;
        if (op < 2) {
            kv.add(key, value);
            oracle[key] = value;
        } else if (op == 2 && oracle.count(key)) {
            kv.replaceValueFor(key, value);
            oracle[key] = value;
        } else if (op == 3) {
            EXPECT_EQ(kv.removeItem(key) >= 0, oracle.erase(key) == 1);
        }
    }
    ASSERT_EQ(kv.size(), oracle.size());
    size_t i = 0;
    for (const auto& [key, value] : oracle) {
        EXPECT_EQ(kv.keyAt(i), key);
        EXPECT_EQ(kv.valueAt(i), value);
        EXPECT_EQ(kv.indexOfKey(key), static_cast<ssize_t>(i++));
        EXPECT_EQ(kv.valueFor(key), value);
    }
    EXPECT_EQ(kv.indexOfKey(600), NAME_NOT_FOUND);
    kv.editValueAt(0) = -1;
    EXPECT_EQ(kv.valueAt(0), -1);
    kv.clear();
    EXPECT_TRUE(kv.isEmpty());
}

TEST_F(PlatformTest, String16FromUtf8AndClocks) {
    EXPECT_EQ(String16().size(), 0u);
    EXPECT_EQ(String16().string()[0], u'\0');
    EXPECT_EQ(String16(nullptr).size(), 0u);
    EXPECT_TRUE(String16("") == String16());
    EXPECT_EQ(String16("abc").size(), 3u);
    const std::pair<const char*, std::u16string> cases[] = {
        {"abc", u"abc"},
        {"caf\xC3\xA9", u"caf\u00E9"},
        {"\xE2\x82\xAC", u"\u20AC"},
        {"\xF0\x9F\x98\x80", {0xD83D, 0xDE00}},
        // Broken sequences become U+FFFD, overlong forms included.
        {"a\xFF" "b", u"a\uFFFDb"},
        {"\xC0\xAF", u"\uFFFD\uFFFD"},
        {"\xE2\x82", u"\uFFFD\uFFFD"},
    };
    for (const auto& [utf8, utf16] : cases) EXPECT_EQ(std::u16string(String16(utf8).string()), utf16) << utf8;

    timespec mono{};
    clock_gettime(CLOCK_MONOTONIC, &mono);
    EXPECT_LE(static_cast<nsecs_t>(mono.tv_sec) * 1000000000LL + mono.tv_nsec, systemTime());
    EXPECT_NEAR(static_cast<double>(systemTime(SYSTEM_TIME_REALTIME) / 1000000000LL),
                static_cast<double>(time(nullptr)), 2.0);
    EXPECT_EQ(nanoseconds_to_milliseconds(1999999), 1);
}

}  // namespace
