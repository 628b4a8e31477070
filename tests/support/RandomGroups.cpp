#include "tests/support/RandomGroups.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <stdexcept>

namespace orvanta::test {

using platform::Dictionary;
using platform::SharedDictionary;
using Kind = GroupOperation::Kind;

namespace {

constexpr std::uint64_t kOperationsPerRound = 2'000;
constexpr std::uint64_t kRoundsPerComparison = 8;
constexpr std::uint64_t kMostUnanswered = 2'000;
constexpr std::chrono::seconds kLockedUpAfter{60};
constexpr std::uint16_t kCategory = 20;

std::uint64_t setting(const char* name, std::uint64_t usual) {
  const char* text = std::getenv(name);
  return text == nullptr ? usual : std::strtoull(text, nullptr, 0);
}

std::uint64_t randomSeed() {
  std::random_device device;
  return device();
}

std::shared_ptr<CallbackThread> startThread() {
  auto started = CallbackThread::start();
  if (!started) throw std::runtime_error(started.error().text);
  return *started;
}

SharedDictionary userInfo(std::uint32_t id, std::uint32_t variant) {
  if (variant == 0) return nullptr;
  return UserInfo{"client" + std::to_string(variant), "service", {{"who", id}, {"marker", "covered?"}}}.dictionary();
}

}  // namespace

GroupOperation::Kind GroupOperations::kindFor(std::uint32_t member) {
  if (!_here[member]) return Kind::join;
  const std::uint32_t chance = below(100);
  if (chance < 2) return Kind::leave;
  if (chance < 4) return Kind::vanish;
  if (chance < 10) return Kind::regroup;
  if (chance < 20) return Kind::userInfo;
  if (chance < 32) return Kind::flush;
  if (chance < 33) return Kind::storebag;
  return Kind::send;
}

GroupOperation GroupOperations::next() {
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
  for (const std::uint32_t value :
       {static_cast<std::uint32_t>(operation.kind), operation.member, operation.group, operation.level,
        std::uint32_t{operation.aggregates}, std::uint32_t{operation.batches}, operation.variant, operation.count,
        operation.flag}) {
    digest(value);
  }
  return operation;
}

RandomGroups::RandomGroups(Daemon daemon, std::chrono::seconds duration)
    : _daemon(std::move(daemon)),
      _seed(setting("ORVANTA_RANDOM_SEED", randomSeed())),
      _operationLimit(setting("ORVANTA_RANDOM_OPERATIONS", 0)),
      _end(std::chrono::steady_clock::now() +
           std::chrono::seconds(setting("ORVANTA_RANDOM_SECONDS", static_cast<std::uint64_t>(duration.count())))),
      _callbackThread(startThread()),
      _next(_seed) {
  for (std::uint32_t i = 0; i < GroupOperations::kMembers; ++i) _members[i].id = i + 1;
  _watchdog = std::thread([this] { watch(); });
}

RandomGroups::~RandomGroups() {
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

void RandomGroups::run() {
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

bool RandomGroups::timeIsUp() const {
  if (_operationLimit != 0) return _operations >= _operationLimit;
  return std::chrono::steady_clock::now() >= _end;
}

void RandomGroups::runRound() {
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

void RandomGroups::carryOut(const GroupOperation& operation) {
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

void RandomGroups::join(Member& member, const GroupOperation& operation) {
  ConnectionOptions options;
  options.socketDirectory = _daemon.socketDirectory;
  options.callbackThread = _callbackThread;
  options.closingTime = std::chrono::milliseconds(0);
  auto connected = OrvantaConnection::connect(std::move(options));
  if (!connected) throw std::runtime_error(connected.error().text);
  member.connection = std::move(*connected);
  member.vanishing = false;
  member.connection->session().setAggregationHandler([this](const AggregatedEvent& event) { received(event); }, [] {});
  configure(member, operation);
}

void RandomGroups::configure(Member& member, const GroupOperation& operation) {
  SessionInfo info{.sessionID = member.id, .clientType = 5};
  info.requireUserInfo = operation.count % 2 == 1;
  info.batchEvent = operation.batches;
  // Some belong to nobody.
  if (operation.count != 8)
    info.hierarchyToken = HierarchyToken{fmt::format("group{}", operation.group), operation.level};
  auto& session = member.connection->session();
  session.setSessionInfo(info.dictionary(), userInfo(member.id, operation.variant), nullptr, operation.aggregates,
                         owed<DoneReply>(member));
  session.startConfigWithCompletionHandler(owed<BackendNamesReply>(member));
}

void RandomGroups::send(Member& member, const GroupOperation& operation) {
  for (std::uint32_t i = 0; i < operation.count; ++i) {
    MessageParameters event{.category = kCategory, .type = static_cast<std::uint16_t>(operation.group)};
    event.payload = Dictionary{{"number", _eventsSent++}, {"marker", "own"}};
    event.flag = operation.flag;
    member.connection->session().sendMessageWithDictionary(event.dictionary(), owed<StringReply>(member));
  }
}

// With everything answered first, so that no answer may be missing.
void RandomGroups::leave(Member& member) {
  member.connection->session().finishSessionWithReply(owed<StringReply>(member));
  waitUntil([&member] { return member.unanswered.load() == 0; });
  member.connection.reset();
}

// In the middle of everything: what has not been answered fails, but nothing is forgotten.
void RandomGroups::vanish(Member& member) {
  member.vanishing = true;
  member.connection.reset();
  EXPECT_EQ(member.unanswered.load(), 0U) << "replies of session " << member.id << " are lost; seed " << _seed;
  _unanswered -= member.unanswered.exchange(0);
}

template <class AnyReply>
AnyReply RandomGroups::owed(Member& member) {
  ++member.unanswered;
  ++_unanswered;
  ++_calls;
  return AnyReply([this, &member](typename AnyReply::Outcome outcome) {
    answered(member, outcome.values.has_value(), outcome.error.text);
  });
}

void RandomGroups::answered(Member& member, bool withValues, const std::string& error) {
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

void RandomGroups::waitUntil(const std::function<bool()>& condition) {
  if (condition()) return;
  std::unique_lock lock(_mutex);
  _changed.wait(lock, condition);
}

void RandomGroups::received(const AggregatedEvent& event) {
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

void RandomGroups::watch() {
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

}  // namespace orvanta::test
