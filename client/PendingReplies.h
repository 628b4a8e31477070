#pragma once

#include <cstddef>
#include <cstdint>
#include <map>

#include "interface/RemoteCalls.h"

namespace orvanta {

// Fails a reply of any kind. Calls into the program.
void failPending(PendingReply&& reply, const CallError& error);

// The calls of one connection that have not been answered, by message id: the channel adds one before its bytes go out,
// and takes it when the response comes or fails all when the connection ends. Not thread-safe: the channel locks.
class PendingReplies {
 public:
  // Returns false, and leaves the reply alone, when the id is in use.
  bool add(std::uint32_t messageID, PendingReply&& reply);
  // Returns monostate for an id under which no reply waits.
  PendingReply take(std::uint32_t messageID);
  // Fails all of them, in the order of their ids.
  void failAll(const CallError& error);
  std::size_t size() const { return _replies.size(); }

 private:
  std::map<std::uint32_t, PendingReply> _replies;
};

}  // namespace orvanta
