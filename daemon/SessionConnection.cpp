#include "daemon/SessionConnection.h"

#include <chrono>
#include <cstdint>
#include <vector>

#include "daemon/OrvantadAgent.h"
#include "interface/OrvantaLogging.h"
#include "interface/RemoteCalls.h"

namespace orvanta {

void SessionConnection::received(platform::Frame&& frame) {
  if (_ended && frame.kind == platform::Frame::Kind::request) {
    // Read before the daemon ended the session, and too late for it: the caller is told rather than left waiting.
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
  // A call that is refused leaves the descriptor that came with it untaken, and later calls would get the wrong one.
  const bool carriesDescriptor =
      frame.method == "uploadFileAtPath" && frame.params.size() > 1 && !frame.params[1].isNull();
  if (!dispatchCall(std::move(frame), *_session, _connection->outbox()) && carriesDescriptor) {
    const platform::BlockingScope blocking;  // whatever it is: closing it may take a while
    _connection->takeDescriptor();
  }
}

void SessionConnection::interrupted() {
  ORVANTA_LOG(debug, "listener: Vyx connection to {} was interrupted", _session->description());
}

void SessionConnection::invalidated(const std::optional<std::string>& protocolError) {
  if (protocolError) {
    ORVANTA_LOG(warning, "listener: Closing connection to {}: {}", _session->description(), *protocolError);
  }
  ORVANTA_LOG(debug, "listener: Vyx connection to {} was invalidated", _session->description());
  endSession();
  _agent.connectionEnded();
}

void SessionConnection::endSession() {
  _finished = true;
  if (_ended) return;
  _ended = true;
  _agent.invalidated(_session);
  _session->end();
  _agent.sessionEnded();
}

}  // namespace orvanta
