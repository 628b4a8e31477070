#pragma once

#include <cstdint>

#include "interface/Values.h"

namespace orvanta {

// What a daemon calls on its client: one-way, no reply.
class ClientSessionReplyInterface {
 public:
  virtual ~ClientSessionReplyInterface() = default;
  // One aggregated event. All values empty or zero: aggregation for the session has ended.
  virtual void sendMessageToClient(const SharedDictionary& sessionInfo, double timestamp, std::uint16_t category,
                                   std::uint16_t type, const SharedDictionary& payload) = 0;
};

}  // namespace orvanta
