#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/ipc/Connection.h"
#include "session/OrvantadSession.h"

namespace orvanta {

class OrvantadAgent;

// Carries the frames of one admitted connection to its session and ends the session when the connection ends. Calls
// that it refuses are answered with an error.
//
// Held by the connection until its invalidation, and by the agent's session list while the session is open. Everything
// runs on the session's queue, which is its connection's.
class SessionConnection final : public platform::ConnectionDelegate {
 public:
  SessionConnection(OrvantadAgent& agent, std::shared_ptr<OrvantadSession> session,
                    std::shared_ptr<platform::Connection> connection)
      : _agent(agent), _session(std::move(session)), _connection(std::move(connection)) {}

  void received(platform::Frame&& frame) override;
  void interrupted() override;
  void invalidated(const std::optional<std::string>& protocolError) override;

  // Takes the session out of the agent's lists and ends it, once. Requests that still come are answered with an error.
  void endSession();
  const std::shared_ptr<platform::Connection>& connection() const { return _connection; }

 private:
  OrvantadAgent& _agent;
  const std::shared_ptr<OrvantadSession> _session;
  const std::shared_ptr<platform::Connection> _connection;
  // The session's queue only.
  bool _finished = false;  // nothing more is carried out
  bool _ended = false;     // endSession() has begun
};

}  // namespace orvanta
