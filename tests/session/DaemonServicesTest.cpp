#include "session/DaemonServices.h"

#include <gtest/gtest.h>

#include <future>
#include <string>
#include <vector>

#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using Ends = std::vector<std::string>;

// Tells in which order the parts of a platform end, and what was made from them.
class TellingHttpClient final : public test::ScriptedHttpClient {
 public:
  TellingHttpClient(platform::WorkPool& pool, Ends& ends) : _pool(pool), _ends(ends) {}
  ~TellingHttpClient() override { _ends.emplace_back("client destroyed"); }
  void shutdown(std::chrono::milliseconds) override {
    EXPECT_EQ(_pool.threadCount(), 1U) << "no thread would run the last completions";
    _ends.emplace_back("client shut down");
  }
  std::shared_ptr<platform::HttpLane> makeLane(LaneKind) override {
    return {new platform::HttpLane, [this](platform::HttpLane* lane) {
              delete lane;
              EXPECT_EQ(_pool.threadCount(), 0U) << "a job may still use it";
              _ends.emplace_back("services destroyed");
              using Telling = std::shared_ptr<void>;
              _pool.post([last = Telling(nullptr, [&ends = _ends](void*) { ends.emplace_back("pool destroyed"); })] {});
            }};
  }

 private:
  platform::WorkPool& _pool;
  Ends& _ends;
};

// What the services hold of the client and the pool must go while they are there.
TEST(DaemonServices, goBetweenThePlatformsStopAndItsEnd) {
  Ends ends;
  {
    Platform::Parts parts;
    parts.pool = std::make_unique<platform::WorkPool>(1);
    parts.pool->start();
    parts.http = std::make_unique<TellingHttpClient>(*parts.pool, ends);
    Platform platform(std::move(parts));
    DaemonServices services(platform);
    services.config().storebagLane();
    std::promise<void> ran;
    platform.pool().post([&] {
      ends.emplace_back("job");
      ran.set_value();
    });
    ran.get_future().get();
  }
  EXPECT_EQ(ends, (Ends{"job", "client shut down", "services destroyed", "client destroyed", "pool destroyed"}));
}

}  // namespace
}  // namespace orvanta
