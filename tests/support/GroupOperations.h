#pragma once

#include <array>
#include <cstdint>
#include <random>

namespace orvanta::test {

// One thing that one of many related sessions does.
struct GroupOperation {
  enum class Kind : std::uint8_t { join, regroup, leave, vanish, send, userInfo, flush, storebag };
  Kind kind = Kind::join;
  std::uint32_t member = 0;
  // Which of these count follows from the kind.
  std::uint32_t group = 0;
  std::uint32_t level = 0;
  bool aggregates = false;
  bool batches = false;
  std::uint32_t variant = 0;  // of the user info or the storebag; of user info 0 is none
  std::uint32_t count = 0;    // events
  std::uint32_t flag = 0;
};

// What the members do, in order: the same for the same seed, whatever the daemon's timing. Used by one thread.
class GroupOperations {
 public:
  static constexpr std::uint32_t kMembers = 200;
  static constexpr std::uint32_t kGroups = 20;
  static constexpr std::uint32_t kLevels = 5;
  static constexpr std::uint32_t kVariants = 4;

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

}  // namespace orvanta::test
