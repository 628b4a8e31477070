#include "daemon/SessionConnection.h"

#include <cassert>
#include <chrono>
#include <cstdint>
#include <vector>

#include "daemon/OrvantadAgent.h"
#include "interface/OrvantaLogging.h"
#include "interface/RemoteCalls.h"

namespace orvanta {

void SessionConnection::received(platform::Frame&& frame) {
  assert(_connection->queue()->isCurrent());
  if (_ended && frame.kind == platform::Frame::Kind::request) {
    // Too late for the session that the daemon has ended: the caller gets an error rather than wait for ever.
    std::vector<std::uint8_t> answer;
    platform::appendErrorResponse(answer, frame.messageID, frame.method + ": the daemon is ending");
    _connection->outbox()->send(answer);
  }
  if (_finished) return;
  if (frame.kind == platform::Frame::Kind::response) {
    ORVANTA_LOG(warning, "listener: Closing connection to {}: it answered a call that was never made",
                _session->description());
    _finished = true;
    _connection->cancel(std::chrono::milliseconds(1000));  // answers to earlier calls still go out
    return;
  }
  // A refused call leaves the descriptor that came with it untaken, and later calls would get the wrong one.
  const bool carriesDescriptor =
      frame.method == "uploadFileAtPath" && frame.params.size() > 1 && !frame.params[1].isNull();
  if (!dispatchCall(std::move(frame), *_session, _connection->outbox()) && carriesDescriptor) {
    const platform::BlockingScope blocking;  // closing it may take a while, depending on its kind
    _connection->takeDescriptor();
  }
}

void SessionConnection::interrupted() {
  ORVANTA_LOG(debug, "listener: Vyx connection to {} was interrupted", _session->description());
}

void SessionConnection::invalidated(const std::optional<std::string>& protocolError) {
  assert(_connection->queue()->isCurrent());
  if (protocolError) {
    ORVANTA_LOG(warning, "listener: Closing connection to {}: {}", _session->description(), *protocolError);
  }
  ORVANTA_LOG(debug, "listener: Vyx connection to {} was invalidated", _session->description());
  endSession();
  _agent.sessions().connectionEnded(*_session);
}

void SessionConnection::endSession() {
  assert(_connection->queue()->isCurrent());
  _finished = true;
  if (_ended) return;
  _ended = true;
  _agent.invalidated(_session);
  _session->end();
  _agent.sessions().ended(*_session);
}

}  // namespace orvanta
