#pragma once

#include <functional>
#include <memory>
#include <string>

#include "tools/collector/servers/BackendConnections.h"
#include "tools/collector/servers/Behaviours.h"
#include "tools/collector/store/Exchanges.h"
#include "tools/collector/store/Inbox.h"
#include "tools/collector/wire/MessageReader.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// The parts that the connections of a relay share. Each is thread-safe and outlives the relay.
struct RelayContext {
  Behaviours& behaviours;
  Inbox& inbox;
  Exchanges& exchanges;
  BackendConnections& backend;
  std::size_t maximumBodyBytes;
  std::function<void(const ReceivedRequest&)> observer;  // each stored request, on the relay's threads; may be empty
};

// One client's connection: reads requests, lets the HTTP library answer, applies the behaviour of the path, records
// both and sends the answer. Lives on its connection's thread. After a request that cannot be read it
// answers 4xx and ends.
class RelayConnection {
 public:
  RelayConnection(Transport& stream, RelayContext& context, std::string client, bool secure)
      : _stream(stream), _reader(stream), _context(context), _client(std::move(client)), _secure(secure) {}
  // Returns when either side has ended the connection.
  void run();

 private:
  // Each returns whether the connection stays open.
  bool handleOne();
  bool answer(const std::shared_ptr<ReceivedRequest>& shared, bool keepsAlive);
  bool refuse(ReceivedRequest& request, int status, const std::string& reason);

  // How a request that cannot be read is answered.
  struct Refusal {
    int status = 0;
    std::string reason;
  };
  // Reads the body into `request`, as it is on the wire.
  Result<void, Refusal> readBody(const RequestHead& head, ReceivedRequest& request);
  BackendAnswer usualAnswer(const ReceivedRequest& request);
  bool send(const ReceivedRequest& request, const BackendAnswer& answer, ConnectionFault fault, bool keepsAlive);
  void store(ReceivedRequest& request);

  Transport& _stream;
  MessageReader _reader;
  RelayContext& _context;
  const std::string _client;
  const bool _secure;
};

// Returns whether the request is for one of the collector's own pages. Those requests are not
// recorded, and no behaviour applies to them.
bool isOwnRequest(std::string_view method, std::string_view path);

}  // namespace orvanta::collector
