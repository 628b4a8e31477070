#include "tests/support/GroupOperations.h"

namespace orvanta::test {

using Kind = GroupOperation::Kind;

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

}  // namespace orvanta::test
