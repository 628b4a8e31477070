#include "platform/WorkQueue.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

#include <algorithm>
#include <atomic>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

#include "platform/PoolThreads.h"
#include "platform/UniqueFd.h"
#include "tests/platform/Waiting.h"

namespace platform {
namespace {

using orvanta::test::Counter;
using orvanta::test::eventually;
using namespace std::chrono_literals;

TEST(WorkQueueTest, RunsJobsOneAtATimeAndInEachPostersOrder) {
  constexpr int kPosters = 4;
  constexpr int kJobs = 500;
  WorkPool pool(4);
  pool.start();
  const auto queue = pool.makeQueue();
  std::vector<std::vector<int>> seen(kPosters);  // no lock: the queue is one
  int inside = 0;
  bool overlapped = false;
  Counter done;
  std::vector<std::thread> posters;
  for (int poster = 0; poster < kPosters; ++poster) {
    posters.emplace_back([&, poster] {
      for (int job = 0; job < kJobs; ++job) {
        queue->post([&, poster, job] {
          overlapped = overlapped || ++inside != 1;
          seen[static_cast<std::size_t>(poster)].push_back(job);
          --inside;
          done.add();
        });
      }
    });
  }
  for (auto& poster : posters) poster.join();
  ASSERT_TRUE(done.waitFor(kPosters * kJobs));
  pool.stop();
  EXPECT_FALSE(overlapped);
  for (const auto& order : seen) {
    EXPECT_EQ(order.size(), static_cast<std::size_t>(kJobs));
    EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
  }
}

TEST(WorkQueueTest, DifferentQueuesRunAtOnce) {
  Counter inside;
  std::atomic<int> met = 0;
  WorkPool pool(2);
  pool.start();
  for (int i = 0; i < 2; ++i) {
    pool.makeQueue()->post([&] {  // the queue lives on in its job
      inside.add();
      met += inside.waitFor(2) ? 1 : 0;
    });
  }
  EXPECT_TRUE(eventually([&] { return met == 2; }));
}

TEST(WorkQueueTest, IsCurrentOnlyInItsOwnJobs) {
  WorkPool pool(2);
  pool.start();
  const auto queue = pool.makeQueue();
  const auto other = pool.makeQueue();
  Counter done;
  std::atomic<bool> own = false;
  std::atomic<bool> foreign = true;
  std::atomic<bool> none = true;
  queue->post([&] {
    own = queue->isCurrent();
    foreign = other->isCurrent();
    done.add();
  });
  pool.post([&] {
    none = queue->isCurrent();
    done.add();
  });
  ASSERT_TRUE(done.waitFor(2));
  EXPECT_TRUE(own);
  EXPECT_FALSE(foreign);
  EXPECT_FALSE(none);
  EXPECT_FALSE(queue->isCurrent());
}

TEST(WorkPoolTest, HasNoThreadAndRunsNothingBeforeStart) {
  Counter ran;
  WorkPool pool(2);
  pool.post([&] { ran.add(); });
  pool.makeQueue()->post([&] { ran.add(); });
  EXPECT_EQ(pool.threadCount(), 0U);
  EXPECT_EQ(ran.value(), 0);
  pool.start();
  EXPECT_EQ(pool.threadCount(), 2U);
  EXPECT_TRUE(ran.waitFor(2));
}

TEST(WorkPoolTest, StopLetsTheRunningJobEnd) {
  Counter begun;
  std::atomic<bool> ended = false;
  WorkPool pool(2);
  pool.start();
  pool.post([&] {
    begun.add();
    std::this_thread::yield();
    ended = true;
  });
  ASSERT_TRUE(begun.waitFor(1));
  pool.stop();
  EXPECT_TRUE(ended);
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
    const auto other = pool.makeQueue();
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
    // A job's belongings may post once more as they go.
    const auto postsAgain = std::shared_ptr<int>(new int, [&called, token, other](const int* p) {
      delete p;
      other->post([&called, token] { called = true; });
    });
    queue->post([postsAgain] {});
  }
  EXPECT_FALSE(called);
  EXPECT_EQ(token.use_count(), 1) << "a job that never ran is still there";
}

TEST(BlockingScopeTest, TenBlockedJobsOnTwoThreadsLeaveRoomForAnother) {
  Counter blocked;
  Counter release;
  Counter ended;
  WorkPool pool(2);
  pool.start();
  for (int i = 0; i < 10; ++i) {
    pool.post([&] {
      {
        const BlockingScope scope;
        const BlockingScope nested;  // counts once
        blocked.add();
        release.waitFor(1);
      }
      ended.add();
    });
  }
  ASSERT_TRUE(blocked.waitFor(10));
  EXPECT_LE(pool.threadCount(), 12U);
  Counter ran;
  pool.post([&] { ran.add(); });
  EXPECT_TRUE(ran.waitFor(1));
  release.add();
  ASSERT_TRUE(ended.waitFor(10));
  EXPECT_TRUE(eventually([&] { return pool.threadCount() == 2; })) << "superfluous threads stay";
  pool.post([&] { ran.add(); });
  EXPECT_TRUE(ran.waitFor(2));
}

TEST(BlockingScopeTest, ExtraThreadsAreCapped) {
  Counter blocked;
  Counter release;
  Counter ended;
  WorkPool pool(1, 2);
  pool.start();
  for (int i = 0; i < 6; ++i) {
    pool.post([&] {
      {
        const BlockingScope scope;
        blocked.add();
        release.waitFor(1);
      }
      ended.add();
    });
  }
  ASSERT_TRUE(blocked.waitFor(3));
  EXPECT_EQ(pool.threadCount(), 3U);
  EXPECT_EQ(blocked.value(), 3);
  release.add();
  EXPECT_TRUE(ended.waitFor(6));
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

TEST(BlockingScopeTest, RunsTheHookOfTheThreadThatBlocks) {
  int calls = 0;
  const BlockingScope::Hook hook = [](void* context) { ++*static_cast<int*>(context); };
  const auto before = BlockingScope::setBeforeBlocking({hook, &calls});
  { const BlockingScope scope; }
  std::thread([] { const BlockingScope scope; }).join();
  EXPECT_EQ(calls, 1);
  const auto mine = BlockingScope::setBeforeBlocking(before);
  EXPECT_EQ(mine.context, &calls);
  { const BlockingScope scope; }
  EXPECT_EQ(calls, 1);
}

// Jobs on a queue whose end the test waits for.
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

using TimerTest = QueueFixture;

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
      if (end == End::replaced) {
        ASSERT_TRUE(replacement.waitFor(1));
      }
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
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, fds) == 0) {
      _ours.reset(fds[0]);
      _theirs.reset(fds[1]);
    }
  }
  ~WatchTest() override {
    onQueue([&] { _watch.reset(); });
  }
  void watch() {
    onQueue([&] { _watch = _queue->makeDescriptorWatch(_ours.get()); });
  }

  UniqueFd _ours;
  UniqueFd _theirs;
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
  // What is still unread counts at once.
  onQueue([&] { _watch->whenReadable([&] { readable.add(); }); });
  EXPECT_TRUE(readable.waitFor(2));
}

TEST_F(WatchTest, ThereIsNoneForWhatCannotBeWatched) {
  const int closed = _ours.get();
  _ours.reset();
  std::unique_ptr<DescriptorWatch> none;
  onQueue([&] { none = _queue->makeDescriptorWatch(closed); });
  EXPECT_EQ(none, nullptr);
}

TEST_F(WatchTest, WaitsForRoomToWrite) {
  watch();
  std::vector<char> block(1U << 16U);
  while (::send(_ours.get(), block.data(), block.size(), MSG_NOSIGNAL) > 0) continue;
  Counter writable;
  onQueue([&] { _watch->whenWritable([&] { writable.add(); }); });
  onQueue([] {});
  EXPECT_EQ(writable.value(), 0);
  while (::read(_theirs.get(), block.data(), block.size()) > 0) continue;
  EXPECT_TRUE(writable.waitFor(1));
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
        if (destroyed) {
          _watch.reset();
        } else {
          _watch->cancel();
        }
      });
      ASSERT_TRUE(eventually([&] { return token.use_count() == 1; }));
      onQueue([&] { _watch.reset(); });
      ASSERT_FALSE(fired) << "round " << round;
    }
  }
}

TEST_F(WatchTest, TellsAHangUpFromAHalfClose) {
  watch();
  Counter readable;
  Counter hungUp;
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

TEST_F(WatchTest, LeavesTheDescriptorOpen) {
  watch();
  onQueue([&] { _watch.reset(); });
  EXPECT_EQ(::write(_theirs.get(), "x", 1), 1);
  char byte = 0;
  EXPECT_EQ(::read(_ours.get(), &byte, 1), 1);
}

}  // namespace
}  // namespace platform
