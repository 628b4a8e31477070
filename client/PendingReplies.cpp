#include "client/PendingReplies.h"

#include <type_traits>
#include <utility>

namespace orvanta {

void failPending(PendingReply&& reply, const CallError& error) {
  std::visit(
      [&error](auto& held) {
        if constexpr (!std::is_same_v<std::decay_t<decltype(held)>, std::monostate>) held.fail(error);
      },
      reply);
}

bool PendingReplies::add(std::uint32_t messageID, PendingReply&& reply) {
  return _replies.try_emplace(messageID, std::move(reply)).second;
}

PendingReply PendingReplies::take(std::uint32_t messageID) {
  const auto node = _replies.extract(messageID);
  return node.empty() ? PendingReply{} : std::move(node.mapped());
}

void PendingReplies::failAll(const CallError& error) {
  while (!_replies.empty()) failPending(std::move(_replies.extract(_replies.begin()).mapped()), error);
}

}  // namespace orvanta
