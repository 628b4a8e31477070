#pragma once

#include <sys/socket.h>

#include <stdexcept>
#include <string>
#include <string_view>
#include <utility>

#include "interface/OrvantaConstants.h"
#include "interface/Values.h"
#include "platform/ipc/Connect.h"
#include "tests/support/Peer.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {

// The daemon's end of one connection, played by a test step by step.
class ScriptedPeer : public Peer {
 public:
  using Frame = platform::Frame;
  using Peer::Peer;

  // The next frame; throws when the client has closed instead.
  Frame next() {
    auto frame = nextFrame();
    if (!frame) throw std::runtime_error("the client closed the connection instead of calling");
    return std::move(*frame);
  }
  // The next frame, which must be a call of `method`.
  Frame expect(std::string_view method) {
    auto frame = next();
    if (frame.method == method) return frame;
    throw std::runtime_error("expected " + std::string(method) + ", the client called " + frame.method);
  }
  void answer(const Frame& request, const Array& results) { respond(request.messageID, nullptr, results); }
  void refuse(const Frame& request, std::string_view text) { respond(request.messageID, text, nullptr); }
  void notify(std::string_view method, const Array& params) { write(notification(method, params)); }
  void respond(std::uint32_t messageID, const Value& error, const Value& result) {
    write(response(messageID, result, error));
  }
};

// Listens as the daemon would, in a directory of its own.
class ScriptedDaemon {
 public:
  ScriptedDaemon() : _listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    const auto address = platform::unixAddress(_directory / kOrvantaServiceName);
    if (::bind(_listener.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0 ||
        ::listen(_listener.get(), 64) != 0) {
      throw std::runtime_error("cannot listen in " + directory());
    }
  }
  const std::string& directory() const { return _directory.path(); }
  ScriptedPeer accept() {
    Peer::await(_listener.get(), POLLIN);
    return ScriptedPeer(platform::UniqueFd(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC)));
  }
  // Leaves the socket file behind, as a daemon that was killed does.
  void stopListening() { _listener.reset(); }

 private:
  TemporaryDirectory _directory;
  platform::UniqueFd _listener;
};

}  // namespace orvanta::test
