#include "platform/queue/WorkQueue.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <atomic>
#include <memory>
#include <vector>

#include "platform/core/UniqueFd.h"
#include "tests/platform/Waiting.h"
#include "tests/support/Threads.h"

namespace orvanta::platform {
namespace {

using orvanta::test::Counter;
using orvanta::test::eventually;
using namespace std::chrono_literals;

// A running pool, and jobs on a queue of its whose end the test waits for.
class QueueFixture : public ::testing::Test {
 protected:
  QueueFixture() { _pool.start(); }

  template <class Step>
  void onQueue(Step step) {
    Counter done;
    _queue->post([&] {
      step();
      done.add();
    });
    ASSERT_TRUE(done.waitFor(1));
  }

  WorkPool _pool{2};
  std::shared_ptr<WorkQueue> _queue = _pool.makeQueue();
};

using WorkQueueTest = QueueFixture;
using TimerTest = QueueFixture;

TEST_F(WorkQueueTest, RunsJobsOneAtATimeAndInEachPostersOrder) {
  constexpr int kPosters = 4, kJobs = 500;
  int next[kPosters] = {};  // no lock: the queue is one
  int inside = 0;
  Counter done;
  orvanta::test::inThreads(kPosters, [&](int poster) {
    for (int job = 0; job < kJobs; ++job) {
      _queue->post([&, poster, job] {
        EXPECT_EQ(++inside, 1);
        EXPECT_EQ(next[poster]++, job);
        --inside;
        done.add();
      });
    }
  });
  ASSERT_TRUE(done.waitFor(kPosters * kJobs));
}

TEST(WorkPoolTest, HasThreadsFromStartToStop) {
  Counter ran;
  WorkPool pool(2);
  pool.post([&] { ran.add(); });
  pool.makeQueue()->post([&] { ran.add(); });
  EXPECT_EQ(pool.threadCount(), 0U);
  EXPECT_EQ(ran.value(), 0);
  pool.start();
  EXPECT_EQ(pool.threadCount(), 2U);
  EXPECT_TRUE(ran.waitFor(2));
  pool.stop();
  EXPECT_EQ(pool.threadCount(), 0U);
  pool.stop();
}

TEST(WorkPoolTest, DestroysUncalledWhatNeverRan) {
  const auto token = std::make_shared<int>();
  std::atomic<bool> called = false;
  {
    WorkPool pool(1);
    const auto queue = pool.makeQueue();
    const auto timer = queue->makeTimer();
    pool.start();
    Counter armed;
    queue->post([&] {
      timer->runAfter(1h, [&, token] { called = true; });
      armed.add();
    });
    ASSERT_TRUE(armed.waitFor(1));
    pool.stop();
    queue->post([&, token] { called = true; });
    pool.post([&, token] { called = true; });
  }
  EXPECT_FALSE(called);
  EXPECT_EQ(token.use_count(), 1) << "a job that never ran is still there";
}

// Jobs that block until they are released.
struct BlockingJobs {
  Counter blocked, release, ended;
  void post(WorkPool& pool, int count) {
    for (int i = 0; i < count; ++i) {
      pool.post([this] {
        {
          const BlockingScope scope;
          const BlockingScope nested;  // counts once
          blocked.add();
          release.waitFor(1);
        }
        ended.add();
      });
    }
  }
};

TEST(BlockingScopeTest, TenBlockedJobsOnTwoThreadsLeaveRoomForAnother) {
  BlockingJobs jobs;
  Counter ran;
  WorkPool pool(2);
  pool.start();
  jobs.post(pool, 10);
  ASSERT_TRUE(jobs.blocked.waitFor(10));
  EXPECT_LE(pool.threadCount(), 12U);
  pool.post([&] { ran.add(); });
  EXPECT_TRUE(ran.waitFor(1));
  jobs.release.add();
  ASSERT_TRUE(jobs.ended.waitFor(10));
  EXPECT_TRUE(eventually([&] { return pool.threadCount() == 2; })) << "superfluous threads stay";
  pool.post([&] { ran.add(); });
  EXPECT_TRUE(ran.waitFor(2));
}

TEST(BlockingScopeTest, ExtraThreadsAreCapped) {
  BlockingJobs jobs;
  WorkPool pool(1, 2);
  pool.start();
  jobs.post(pool, 6);
  ASSERT_TRUE(jobs.blocked.waitFor(3));
  EXPECT_EQ(pool.threadCount(), 3U);
  EXPECT_EQ(jobs.blocked.value(), 3);
  jobs.release.add();
  EXPECT_TRUE(jobs.ended.waitFor(6));
}

TEST(BlockingScopeTest, ShortScopesDoNotPileUpThreads) {
  Counter ended;
  std::atomic<std::size_t> most = 0;
  WorkPool pool(2);
  pool.start();
  for (int i = 0; i < 2000; ++i) {
    pool.post([&] {
      {
        const BlockingScope scope;
        most = std::max(most.load(), pool.threadCount());
      }
      ended.add();
    });
  }
  ASSERT_TRUE(ended.waitFor(2000));
  EXPECT_LE(most, 66U);
  EXPECT_TRUE(eventually([&] { return pool.threadCount() == 2; }));
}

TEST_F(TimerTest, RunsOnItsQueueNotBeforeItsTime) {
  std::vector<std::unique_ptr<Timer>> timers;
  Counter ran;
  onQueue([&] {
    const auto now = std::chrono::steady_clock::now();
    for (const auto delay : {20ms, 10ms, -5ms}) {
      timers.push_back(_queue->makeTimer());
      timers.back()->runAt(now + delay, [&, when = now + delay] {
        EXPECT_TRUE(_queue->isCurrent());
        EXPECT_GE(std::chrono::steady_clock::now(), when);
        ran.add();
      });
    }
  });
  EXPECT_TRUE(ran.waitFor(3));
  onQueue([&] { timers.clear(); });
}

TEST_F(TimerTest, NeverRunsOnceCancelledReplacedOrDestroyed) {
  enum class End { cancelled, replaced, destroyed };
  for (const End end : {End::cancelled, End::replaced, End::destroyed}) {
    for (int round = 0; round < 50; ++round) {
      auto timer = _queue->makeTimer();
      const auto token = std::make_shared<int>();
      bool ran = false;
      Counter replacement;
      onQueue([&] {
        timer->runAfter(0ns, [&, token] { ran = true; });
        // Let it become due, so that its completion may already wait behind this job.
        const auto until = std::chrono::steady_clock::now() + 200us;
        while (std::chrono::steady_clock::now() < until) continue;
        if (end == End::cancelled) timer->cancel();
        if (end == End::replaced) timer->runAfter(0ns, [&] { replacement.add(); });
        if (end == End::destroyed) timer.reset();
      });
      if (end == End::replaced) replacement.waitFor(1);
      ASSERT_TRUE(eventually([&] { return token.use_count() == 1; }));
      onQueue([&] { ASSERT_FALSE(ran) << "round " << round; });
      onQueue([&] { timer.reset(); });
    }
  }
}

TEST_F(TimerTest, MayBeDestroyedByItsOwnHandler) {
  Counter ran;
  auto timer = _queue->makeTimer();
  onQueue([&] {
    timer->runAfter(0ns, [&] {
      timer.reset();
      ran.add();
    });
  });
  EXPECT_TRUE(ran.waitFor(1));
}

class WatchTest : public QueueFixture {
 protected:
  WatchTest() {
    int fds[2];
    EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, fds), 0);
    _ours.reset(fds[0]);
    _theirs.reset(fds[1]);
  }
  ~WatchTest() override {
    onQueue([&] { _watch.reset(); });
  }
  void watch() {
    onQueue([&] { _watch = _queue->makeDescriptorWatch(_ours.get()); });
  }

  UniqueFd _ours, _theirs;
  std::unique_ptr<DescriptorWatch> _watch;
};

TEST_F(WatchTest, FiresOnceForEachWait) {
  watch();
  Counter readable;
  onQueue([&] { _watch->whenReadable([&] { readable.add(); }); });
  ASSERT_EQ(::write(_theirs.get(), "ab", 2), 2);
  ASSERT_TRUE(readable.waitFor(1));
  EXPECT_EQ(::write(_theirs.get(), "c", 1), 1);
  onQueue([] {});
  EXPECT_EQ(readable.value(), 1);
  // Bytes that are still unread count at once.
  onQueue([&] { _watch->whenReadable([&] { readable.add(); }); });
  EXPECT_TRUE(readable.waitFor(2));
}

TEST_F(WatchTest, NeverFiresOnceCancelledOrDestroyed) {
  for (const bool destroyed : {false, true}) {
    for (int round = 0; round < 50; ++round) {
      watch();
      const auto token = std::make_shared<int>();
      bool fired = false;
      onQueue([&] {
        const auto handler = [&, token] { fired = true; };
        _watch->whenReadable(handler);
        _watch->whenWritable(handler);
        _watch->whenHungUp(handler);
        EXPECT_EQ(::write(_theirs.get(), "x", 1), 1);
        destroyed ? _watch.reset() : _watch->cancel();
      });
      ASSERT_TRUE(eventually([&] { return token.use_count() == 1; }));
      onQueue([&] { _watch.reset(); });
      ASSERT_FALSE(fired) << "round " << round;
    }
  }
}

TEST_F(WatchTest, TellsAHangUpFromAHalfClose) {
  watch();
  Counter readable, hungUp;
  onQueue([&] {
    _watch->whenHungUp([&] { hungUp.add(); });
    _watch->whenReadable([&] { readable.add(); });
  });
  ::shutdown(_theirs.get(), SHUT_WR);
  ASSERT_TRUE(readable.waitFor(1));
  onQueue([] {});
  EXPECT_EQ(hungUp.value(), 0);
  _theirs.reset();
  EXPECT_TRUE(hungUp.waitFor(1));
}

TEST_F(WatchTest, LeavesTheDescriptorOpenAndNeedsAnOpenOne) {
  watch();
  onQueue([&] { _watch.reset(); });
  EXPECT_EQ(::write(_theirs.get(), "x", 1), 1);
  char byte = 0;
  EXPECT_EQ(::read(_ours.get(), &byte, 1), 1);
  const int closed = _ours.release();
  ::close(closed);
  onQueue([&] { EXPECT_EQ(_queue->makeDescriptorWatch(closed), nullptr) << "that cannot be watched"; });
}

// In debug builds. The pool has not started, so that the process has one thread when it forks.
TEST(WorkQueueDeathTest, TimersAndWatchesAreUsedOnTheirQueueOnly) {
  WorkPool pool(1);
  const auto queue = pool.makeQueue();
  EXPECT_FALSE(queue->isCurrent());
  const auto timer = queue->makeTimer();
  EXPECT_DEBUG_DEATH(timer->cancel(), "isCurrent");
  EXPECT_DEBUG_DEATH(timer->runAfter(1h, [] {}), "isCurrent");
}

}  // namespace
}  // namespace orvanta::platform
