#pragma once

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <array>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <functional>
#include <memory>
#include <mutex>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include "client/OrvantaClient.h"
#include "interface/Values.h"

namespace orvanta::test {

// One thing that one of many related sessions does.
struct GroupOperation {
  enum class Kind : std::uint8_t { join, regroup, leave, vanish, send, userInfo, flush, storebag };
  Kind kind = Kind::join;
  std::uint32_t member = 0;
  // Which of these count follows from the kind.
  std::uint32_t group = 0, level = 0;
  bool aggregates = false, batches = false;
  std::uint32_t variant = 0;          // of the user info or the storebag; 0 stands for no user info
  std::uint32_t count = 0, flag = 0;  // events
};

// The members' operations, in order: the same for the same seed under any timing of the daemon. Used by one thread.
class GroupOperations {
 public:
  static constexpr std::uint32_t kMembers = 200, kGroups = 20, kLevels = 5, kVariants = 4;

  explicit GroupOperations(std::uint64_t seed) : _random(seed) {}

  GroupOperation next() {
    GroupOperation operation;
    operation.member = below(kMembers);
    operation.kind = kindFor(operation.member);
    operation.group = below(kGroups);
    operation.level = below(kLevels);
    operation.aggregates = below(3) == 0;
    operation.batches = below(2) == 0;
    operation.variant = below(kVariants);
    operation.count = 1 + below(8);
    // Realtime events and promoting ones are the exception.
    operation.flag = below(8) == 0 ? below(4) : 0;
    if (operation.kind == Kind::join) _here[operation.member] = true;
    if (operation.kind == Kind::leave || operation.kind == Kind::vanish) _here[operation.member] = false;
    return operation;
  }
  void everyoneHasLeft() { _here.fill(false); }
  // Of all operations so far: what shows that two runs did the same.
  std::uint64_t digest() const { return _digest; }

 private:
  using Kind = GroupOperation::Kind;

  // The engine's values are the same everywhere; the library's distributions are not.
  std::uint32_t below(std::uint32_t limit) {
    const auto value = static_cast<std::uint32_t>(_random() % limit);
    _digest = (_digest ^ value) * 1'099'511'628'211U;
    return value;
  }
  Kind kindFor(std::uint32_t member) {
    if (!_here[member]) return Kind::join;
    const std::uint32_t chance = below(100);
    if (chance < 2) return Kind::leave;
    if (chance < 4) return Kind::vanish;
    if (chance < 10) return Kind::regroup;
    if (chance < 20) return Kind::userInfo;
    if (chance < 32) return Kind::flush;
    return chance < 33 ? Kind::storebag : Kind::send;
  }

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
    // All have left; what the daemon holds the first time is the standard for later.
    std::function<void(bool first)> compareLeftovers;
  };
  RandomGroups(Daemon daemon, std::chrono::seconds duration)
      : _daemon(std::move(daemon)),
        _seed(setting("ORVANTA_RANDOM_SEED", std::random_device()())),
        _operationLimit(setting("ORVANTA_RANDOM_OPERATIONS", 0)),
        _end(std::chrono::steady_clock::now() +
             std::chrono::seconds(setting("ORVANTA_RANDOM_SECONDS", static_cast<std::uint64_t>(duration.count())))),
        _callbackThread(CallbackThread::start().value()),
        _next(_seed) {
    for (std::uint32_t i = 0; i < GroupOperations::kMembers; ++i) _members[i].id = i + 1;
    _watchdog = std::thread([this] { watch(); });
  }
  ~RandomGroups() {
    for (auto& member : _members) {
      member.vanishing = true;
      member.connection.reset();
    }
    {
      const std::lock_guard lock(_mutex);
      _over = true;
    }
    _ended.notify_all();
    _watchdog.join();
  }
  RandomGroups(const RandomGroups&) = delete;
  RandomGroups& operator=(const RandomGroups&) = delete;

  // Rounds of operations, at whose end all members leave, until the time is up; prints the seed at once and a summary.
  void run() {
    fmt::print("seed {}\n", _seed);
    std::fflush(stdout);
    std::uint64_t rounds = 0;
    do {
      runRound();
      ++rounds;
      if (rounds == 1 || rounds % kRoundsPerComparison == 0 || timeIsUp()) _daemon.compareLeftovers(rounds == 1);
      // Two rounds at least: the first sets the standard.
    } while ((!timeIsUp() || rounds < 2) && !::testing::Test::HasFailure());
    fmt::print("seed {}: {} rounds, {} operations (digest {:016x}), {} calls answered, {} events sent, {} aggregated\n",
               _seed, rounds, _operations.load(), _next.digest(), _calls.load(), _eventsSent, _eventsAggregated.load());
  }

  std::uint64_t eventsSent() const { return _eventsSent; }
  std::uint64_t eventsAggregated() const { return _eventsAggregated.load(); }

 private:
  using Kind = GroupOperation::Kind;
  static constexpr std::uint64_t kOperationsPerRound = 2'000;
  static constexpr std::uint64_t kRoundsPerComparison = 8;
  static constexpr std::uint64_t kMostUnanswered = 2'000;
  static constexpr std::chrono::seconds kLockedUpAfter{60};
  static constexpr std::uint16_t kCategory = 20;

  // A client, with what its replies need.
  struct Member {
    std::uint32_t id = 0;
    std::unique_ptr<OrvantaConnection> connection;
    std::atomic<std::uint32_t> unanswered{0};
    std::atomic<bool> vanishing{false};
  };

  static std::uint64_t setting(const char* name, std::uint64_t usual) {
    const char* text = std::getenv(name);
    return text == nullptr ? usual : std::strtoull(text, nullptr, 0);
  }
  static SharedDictionary userInfo(std::uint32_t id, std::uint32_t variant) {
    if (variant == 0) return nullptr;
    return UserInfo{"client" + std::to_string(variant), "service", {{"who", id}, {"marker", "covered?"}}}.dictionary();
  }

  bool timeIsUp() const {
    if (_operationLimit != 0) return _operations >= _operationLimit;
    return std::chrono::steady_clock::now() >= _end;
  }
  void runRound() {
    for (std::uint64_t i = 0; i < kOperationsPerRound; ++i) {
      if (_operationLimit != 0 && _operations >= _operationLimit) break;
      carryOut(_next.next());
      ++_operations;
      ++_progress;
      waitUntil([this] { return _unanswered.load() < kMostUnanswered; });
    }
    for (auto& member : _members) {
      if (member.connection) leave(member);
    }
    _next.everyoneHasLeft();
  }
  void carryOut(const GroupOperation& operation) {
    Member& member = _members[operation.member];
    switch (operation.kind) {
      case Kind::join:
        return join(member, operation);
      case Kind::regroup:
        return configure(member, operation);
      case Kind::leave:
        return leave(member);
      case Kind::vanish:
        return vanish(member);
      case Kind::send:
        return send(member, operation);
      case Kind::userInfo:
        return member.connection->session().fetchStatesWithUserInfo(userInfo(member.id, operation.variant),
                                                                    owed<BackendNamesReply>(member));
      case Kind::flush:
        return member.connection->session().flushMessagesWithCompletion(owed<FlushReply>(member));
      case Kind::storebag:
        return _daemon.changeStorebag(operation.variant);
    }
  }
  void join(Member& member, const GroupOperation& operation) {
    ConnectionOptions options;
    options.socketDirectory = _daemon.socketDirectory;
    options.callbackThread = _callbackThread;
    options.closingTime = std::chrono::milliseconds(0);
    auto connected = OrvantaConnection::connect(std::move(options));
    if (!connected) throw std::runtime_error(connected.error().text);
    member.connection = std::move(*connected);
    member.vanishing = false;
    member.connection->session().setAggregationHandler([this](const AggregatedEvent& event) { received(event); },
                                                       [] {});
    configure(member, operation);
  }
  void configure(Member& member, const GroupOperation& operation) {
    SessionInfo info{.sessionID = member.id, .clientType = 5};
    info.requireUserInfo = operation.count % 2 == 1;
    info.batchEvent = operation.batches;
    // Some belong to no member.
    if (operation.count != 8)
      info.hierarchyToken = HierarchyToken{fmt::format("group{}", operation.group), operation.level};
    auto& session = member.connection->session();
    session.setSessionInfo(info.dictionary(), userInfo(member.id, operation.variant), nullptr, operation.aggregates,
                           owed<DoneReply>(member));
    session.startConfigWithCompletionHandler(owed<BackendNamesReply>(member));
  }
  void send(Member& member, const GroupOperation& operation) {
    for (std::uint32_t i = 0; i < operation.count; ++i) {
      MessageParameters event{.category = kCategory, .type = static_cast<std::uint16_t>(operation.group)};
      event.payload = Dictionary{{"number", _eventsSent++}, {"marker", "own"}};
      event.flag = operation.flag;
      member.connection->session().sendMessageWithDictionary(event.dictionary(), owed<StringReply>(member));
    }
  }
  // With everything answered first, so that no answer may be missing.
  void leave(Member& member) {
    member.connection->session().finishSessionWithReply(owed<StringReply>(member));
    waitUntil([&member] { return member.unanswered.load() == 0; });
    member.connection.reset();
  }
  // In the middle of everything: what has not been answered fails, but nothing is forgotten.
  void vanish(Member& member) {
    member.vanishing = true;
    member.connection.reset();
    EXPECT_EQ(member.unanswered.load(), 0U) << "replies of session " << member.id << " are lost; seed " << _seed;
    _unanswered -= member.unanswered.exchange(0);
  }

  // A reply that must come; counts as unanswered until it has.
  template <class AnyReply>
  AnyReply owed(Member& member) {
    ++member.unanswered;
    ++_unanswered;
    ++_calls;
    return AnyReply([this, &member](typename AnyReply::Outcome outcome) {
      answered(member, outcome.values.has_value(), outcome.error.text);
    });
  }
  void answered(Member& member, bool withValues, const std::string& error) {
    if (!withValues && !member.vanishing) {
      ADD_FAILURE() << "session " << member.id << " got no answer: " << error << "; seed " << _seed;
    }
    ++_progress;
    {
      const std::lock_guard lock(_mutex);
      --member.unanswered;
      --_unanswered;
    }
    _changed.notify_all();
  }
  void waitUntil(const std::function<bool()>& condition) {
    if (condition()) return;
    std::unique_lock lock(_mutex);
    _changed.wait(lock, condition);
  }
  // On the callback thread.
  void received(const AggregatedEvent& event) {
    ++_progress;
    if (event.category != kCategory) return;
    const auto number = static_cast<std::uint64_t>(event.payload->find("number")->integerValue());
    if (const auto* who = event.payload->find("who")) {
      EXPECT_EQ(who->integerValue(), event.sessionInfo->find("sessionID")->integerValue()) << "seed " << _seed;
      EXPECT_EQ(event.payload->find("marker")->description(), "covered?") << "user info wins; seed " << _seed;
    }
    const std::lock_guard lock(_mutex);
    if (_aggregatedOnce.size() <= number) _aggregatedOnce.resize(number + 1);
    EXPECT_FALSE(_aggregatedOnce[number]) << "event " << number << " reached two aggregators; seed " << _seed;
    _aggregatedOnce[number] = true;
    ++_eventsAggregated;
  }
  void watch() {
    std::uint64_t seen = 0;
    auto quietSince = std::chrono::steady_clock::now();
    std::unique_lock lock(_mutex);
    while (!_ended.wait_for(lock, std::chrono::seconds(1), [this] { return _over; })) {
      const auto now = std::chrono::steady_clock::now();
      if (const auto progress = _progress.load(); progress != seen) {
        seen = progress;
        quietSince = now;
      }
      if (now - quietSince < kLockedUpAfter) continue;
      fmt::print(stderr, "LOCKED UP: nothing came for {} s; seed {}, operation {}, {} calls unanswered:\n",
                 kLockedUpAfter.count(), _seed, _operations.load(), _unanswered.load());
      for (const auto& member : _members) {
        if (member.unanswered != 0) fmt::print(stderr, "  session {}: {}\n", member.id, member.unanswered.load());
      }
      std::abort();
    }
  }

  // Constant after construction.
  const Daemon _daemon;
  const std::uint64_t _seed;
  const std::uint64_t _operationLimit;  // 0 for no limit
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
