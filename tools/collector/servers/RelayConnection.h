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

// What the connections of a relay share. Each part is thread-safe and outlives the relay.
struct RelayContext {
  Behaviours& behaviours;
  Inbox& inbox;
  Exchanges& exchanges;
  BackendConnections& backend;
  std::size_t maximumBodyBytes;
  std::function<void(const ReceivedRequest&)> observer;  // each stored request, on the relay's threads; may be empty
};

// One client's connection: reads requests, lets the HTTP library answer, records both, and does to the answer what the
// behaviour of the path asks for. run() belongs to one thread.
class RelayConnection {
 public:
  RelayConnection(Transport& stream, RelayContext& context, std::string client, bool secure)
      : _stream(stream), _reader(stream), _context(context), _client(std::move(client)), _secure(secure) {}
  // Until either side ends the connection.
  void run();

 private:
  // Each tells whether the connection goes on.
  bool handleOne();
  bool answer(const std::shared_ptr<ReceivedRequest>& shared, bool keepsAlive);
  bool refuse(ReceivedRequest& request, int status, const std::string& reason);

  // The answer to a request that cannot be read.
  struct Refusal {
    int status = 0;
    std::string reason;
  };
  // Takes the body off the wire into `request`.
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

// Requests of the collector's own readers, which are neither recorded nor disturbed.
bool isOwnRequest(std::string_view method, std::string_view path);

}  // namespace orvanta::collector
