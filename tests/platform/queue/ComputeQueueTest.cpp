#include "platform/queue/ComputeQueue.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <functional>
#include <future>
#include <iterator>
#include <memory>
#include <thread>
#include <vector>

#include "platform/queue/WorkQueue.h"
#include "tests/platform/Waiting.h"

namespace orvanta::platform {
namespace {

using orvanta::test::Counter;
using orvanta::test::eventually;
using namespace std::chrono_literals;

std::ptrdiff_t threadsOfProcess() {
  return std::distance(std::filesystem::directory_iterator("/proc/self/task"), {});
}

TEST(ComputeQueueTest, RunsItsJobsInTheirOrderWhileTheLoopGoesOn) {
  std::thread([] {}).join();  // sanitizers start a thread of their own with the first
  WorkPool pool(1);
  const auto compute = pool.makeComputeQueue(), other = pool.makeComputeQueue();
  const auto queue = pool.makeQueue();
  const auto before = threadsOfProcess();
  pool.start();
  EXPECT_EQ(threadsOfProcess(), before + 1) << "none for computing before there is a job";
  Counter loopRan, posted, done;
  std::vector<int> order;  // no lock: each queue is one, and one thread serves both
  for (int i = 0; i < 100; ++i) {
    (i % 2 == 0 ? compute : other)->post([&, i] {
      if (i == 0) {
        queue->post([&] { loopRan.add(); });
        loopRan.waitFor(1);
        posted.waitFor(1);
      }
      order.push_back(i);
      done.add();
    });
  }
  posted.add();
  ASSERT_TRUE(done.waitFor(100));
  EXPECT_TRUE(pool.drain(10s));
  pool.stop();
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end())) << "the queues take turns";
}

TEST(WorkPoolTest, DrainWaitsForTheJobsOfEveryQueueToEnd) {
  WorkPool pool(1);
  pool.start();
  const std::function<void(Job)> posts[] = {[&](Job job) { pool.makeComputeQueue()->post(std::move(job)); },
                                            [&](Job job) { pool.makeQueue()->post(std::move(job)); },
                                            [&](Job job) { pool.post(std::move(job)); }};
  for (const auto& post : posts) {
    Counter begun, release;
    post([&] {
      begun.add();
      release.waitFor(1);
    });
    begun.waitFor(1);
    EXPECT_FALSE(pool.drain(0ms));
    release.add();
    EXPECT_TRUE(pool.drain(10s));
  }
}

// Objects that jobs own may post when they are destroyed, and hold queues of both kinds.
TEST(ComputeQueueTest, DropsWhatHasNotBegunWhenThePoolStops) {
  std::atomic<int> dropped = 0;
  std::shared_ptr<ComputeQueue> survivor;
  {
    WorkPool pool(1);
    const auto compute = pool.makeComputeQueue(), other = pool.makeComputeQueue();
    const auto queue = pool.makeQueue();
    survivor = other;
    const auto makeOwned = [&] {
      return std::shared_ptr<void>(nullptr, [&dropped, compute, queue](void*) {
        ++dropped;
        compute->post([] { ADD_FAILURE(); });
        queue->post([] { ADD_FAILURE(); });
      });
    };
    Counter begun;
    std::promise<void> release;
    compute->post([&begun, released = release.get_future()] {
      begun.add();
      released.wait();
    });
    for (const auto& each : {compute, other}) each->post([owned = makeOwned()] { ADD_FAILURE(); });
    pool.start();
    begun.waitFor(1);
    auto stopped = std::async(std::launch::async, [&pool] { pool.stop(); });
    EXPECT_TRUE(eventually([&] {
      const auto probe = std::make_shared<int>();
      other->post([probe] {});
      return probe.use_count() == 1;
    }));
    EXPECT_EQ(stopped.wait_for(0ms), std::future_status::timeout) << "a running job ends first";
    release.set_value();
    stopped.get();
    EXPECT_EQ(dropped, 2);
    queue->post([owned = makeOwned()] { ADD_FAILURE(); });
  }
  EXPECT_EQ(dropped, 3);
  const auto owned = std::make_shared<int>();
  survivor->post([owned] { ADD_FAILURE(); });
  EXPECT_EQ(owned.use_count(), 1) << "destroyed at once";
}

TEST(BlockingScopeTest, AStandInStepsAsideAtOnceAndIsCalledBack) {
  WorkPool pool(1);
  pool.start();
  const auto blocked = pool.makeQueue(), other = pool.makeQueue();
  pid_t standIn = 0;
  for (int turn = 0; turn < 3; ++turn) {
    Counter ran, done;
    std::atomic<pid_t> helper = 0;
    blocked->post([&] {
      {
        const BlockingScope scope;
        for (int job = 1; job <= 2; ++job) {  // it stays while it is needed
          other->post([&] {
            helper = ::gettid();
            ran.add();
          });
          ran.waitFor(job);
        }
      }
      done.add();
    });
    ASSERT_TRUE(done.waitFor(1));
    EXPECT_TRUE(turn == 0 || helper == standIn) << "another thread was started";
    standIn = helper;
    // Either of the two may wait for the next job: after one each, one thread serves the loop.
    ASSERT_TRUE(eventually([&] {
      other->post([] {});
      return pool.threadCount() == 1;
    }));
  }
}

}  // namespace
}  // namespace orvanta::platform
