#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <variant>

#include "interface/ClientSessionInterface.h"
#include "platform/ipc/FrameDecoder.h"

namespace orvanta {

// Whoever waits for the answer to one call; monostate: nobody.
using PendingReply =
    std::variant<std::monostate, DoneReply, BackendNamesReply, StringReply, FlushReply, UploadReply, LogDataReply>;

// Gives a reply its answer, or the reason why there is none. Calls into the program.
void deliverPending(PendingReply&& reply, platform::Frame&& response);
void failPending(PendingReply&& reply, const CallError& error);

// The calls of one connection that have not been answered, by message id. Not thread-safe.
class PendingReplies {
 public:
  // False, with nothing taken, when the id is in use.
  bool add(std::uint32_t messageID, PendingReply&& reply);
  // monostate for an id nobody waits for.
  PendingReply take(std::uint32_t messageID);
  // Fails all of them, in the order of their ids.
  void failAll(const CallError& error);
  std::size_t size() const { return _replies.size(); }

 private:
  std::map<std::uint32_t, PendingReply> _replies;
};

}  // namespace orvanta
