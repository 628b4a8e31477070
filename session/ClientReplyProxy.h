#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

#include "interface/ClientSessionInterface.h"
#include "interface/Values.h"
#include "platform/ipc/Connection.h"

namespace orvanta {

// The client at the other end of a connection, as the daemon calls it. Never blocks: what the client does not read
// waits in its outbox, up to the outbox's limit. Used under its session's aggregation lock, and by uploads on the
// session's queue.
class ClientReplyProxy final : public ClientSessionReplyInterface {
 public:
  explicit ClientReplyProxy(std::shared_ptr<platform::Outbox> outbox) : _outbox(std::move(outbox)) {}

  void sendMessageToClient(const SharedDictionary& sessionInfo, double timestamp, std::uint16_t category,
                           std::uint16_t type, const SharedDictionary& payload) override;
  // Asks the client to delete the file that `token` stands for.
  void removeFile(std::string_view token);

 private:
  const std::shared_ptr<platform::Outbox> _outbox;
  std::uint64_t _dropped = 0;  // since the client last kept up
};

}  // namespace orvanta
