#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "client/OrvantaClient.h"

namespace orvanta::test {

// One thing that one of many related sessions does.
struct GroupOperation {
  enum class Kind : std::uint8_t { join, regroup, leave, vanish, send, userInfo, flush, storebag };
  Kind kind = Kind::join;
  std::uint32_t member = 0;
  // Which of these count follows from the kind.
  std::uint32_t group = 0, level = 0;
  bool aggregates = false, batches = false;
  std::uint32_t variant = 0;          // of the user info or the storebag; of user info 0 is none
  std::uint32_t count = 0, flag = 0;  // events
};

// What the members do, in order: the same for the same seed, whatever the daemon's timing. Used by one thread.
class GroupOperations {
 public:
  static constexpr std::uint32_t kMembers = 200, kGroups = 20, kLevels = 5, kVariants = 4;

  explicit GroupOperations(std::uint64_t seed) : _random(seed) {}

  GroupOperation next();
  void everyoneHasLeft() { _here.fill(false); }
  // Of all operations so far: what shows that two runs did the same.
  std::uint64_t digest() const { return _digest; }

 private:
  // The engine's values are the same everywhere; the library's distributions are not.
  std::uint32_t below(std::uint32_t limit) { return static_cast<std::uint32_t>(_random() % limit); }
  GroupOperation::Kind kindFor(std::uint32_t member);
  void digest(std::uint32_t value) { _digest = (_digest ^ value) * 1'099'511'628'211U; }

  std::mt19937_64 _random;
  std::array<bool, kMembers> _here{};
  std::uint64_t _digest = 14'695'981'039'346'656'037U;
};

// Two hundred clients of one daemon, in twenty groups, that join, leave, send, flush and change their user info at
// random, and what must hold all the while: every call is answered, no event reaches two aggregators, whoever receives
// one gets its sender's user info with it, and something goes on all the time. A daemon from which nothing comes for a
// minute is taken to be locked up: that ends the process with what was going on.
//
// ORVANTA_RANDOM_SEED repeats a run, ORVANTA_RANDOM_SECONDS says how long it lasts, ORVANTA_RANDOM_OPERATIONS ends it
// after so many operations instead. Used by one test thread; failures are GoogleTest's.
class RandomGroups {
 public:
  struct Daemon {
    std::string socketDirectory;
    std::function<void(std::uint32_t variant)> changeStorebag;
    // Everybody has left; the first time, what the daemon holds then is the standard for later.
    std::function<void(bool first)> compareLeftovers;
  };
  RandomGroups(Daemon daemon, std::chrono::seconds duration);
  ~RandomGroups();
  RandomGroups(const RandomGroups&) = delete;
  RandomGroups& operator=(const RandomGroups&) = delete;

  // Rounds of operations, at whose end everybody leaves, until the time is up; prints the seed at once and a summary.
  void run();

  std::uint64_t eventsSent() const { return _eventsSent; }
  std::uint64_t eventsAggregated() const { return _eventsAggregated.load(); }

 private:
  // A client, with what its replies need.
  struct Member {
    std::uint32_t id = 0;
    std::unique_ptr<OrvantaConnection> connection;
    std::atomic<std::uint32_t> unanswered{0};
    std::atomic<bool> vanishing{false};
  };

  void runRound();
  void carryOut(const GroupOperation& operation);
  void join(Member& member, const GroupOperation& operation);
  void configure(Member& member, const GroupOperation& operation);
  void send(Member& member, const GroupOperation& operation);
  void leave(Member& member);
  void vanish(Member& member);
  bool timeIsUp() const;

  // A reply that must come; counts as unanswered until it has.
  template <class AnyReply>
  AnyReply owed(Member& member);
  void answered(Member& member, bool withValues, const std::string& error);
  void waitUntil(const std::function<bool()>& condition);
  // On the callback thread.
  void received(const AggregatedEvent& event);
  void watch();

  // Constant after construction.
  const Daemon _daemon;
  const std::uint64_t _seed;
  const std::uint64_t _operationLimit;  // 0: none
  const std::chrono::steady_clock::time_point _end;
  const std::shared_ptr<CallbackThread> _callbackThread;

  // The test thread's.
  GroupOperations _next;
  std::uint64_t _eventsSent = 0;
  std::array<Member, GroupOperations::kMembers> _members;

  // Any thread.
  std::atomic<std::uint64_t> _operations{0}, _progress{0}, _unanswered{0}, _eventsAggregated{0}, _calls{0};

  std::mutex _mutex;
  std::condition_variable _changed, _ended;
  std::vector<bool> _aggregatedOnce;  // guarded by _mutex: by the number of the event
  bool _over = false;                 // guarded by _mutex
  std::thread _watchdog;
};

}  // namespace orvanta::test
