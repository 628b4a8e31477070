#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "client/CallbackThread.h"
#include "client/ClientSession.h"
#include "interface/Reply.h"
#include "interface/WireLimits.h"

namespace orvanta {

// Every field has an initialiser, so that {.socketDirectory = …} names only what it sets.
struct ConnectionOptions {
  // Where the daemon's socket com.kovalt.orvantad is. Empty: the first entry of RUNTIME_DIRECTORY, else /run/orvanta.
  std::string socketDirectory{};
  // Null: the connection starts a thread of its own for its callbacks.
  std::shared_ptr<CallbackThread> callbackThread{};
  // Bytes of calls that the daemon has not read yet. Above it an asynchronous call fails at once, a blocking one waits.
  std::size_t maximumWaitingBytes = kMaximumUnreadCalls;
  // How long close() and the destructor give a daemon that is slow to read the calls already sent.
  std::chrono::milliseconds closingTime = kClosingTime;
};

// A connection to the daemon, which is one session there: it lives from connect() until close(), the destructor, or the
// end of the daemon.
//
// Owned by the program. Any thread may call, but not while another destroys it. Destroying it closes it: unanswered
// calls first fail with connectionLost on the callback thread, and no callback runs after that. Destroyed in one of its
// own callbacks it does not wait: those calls fail on the spot, and the thread ends by itself soon after.
class OrvantaConnection {
 public:
  // Does not wait for the daemon, which admits or refuses the program only after this: the first call will tell.
  static CallResult<std::unique_ptr<OrvantaConnection>> connect(ConnectionOptions options = {});
  OrvantaConnection(const OrvantaConnection&) = delete;
  OrvantaConnection& operator=(const OrvantaConnection&) = delete;
  ~OrvantaConnection();

  ClientSession& session() { return _session; }

  // Called once, on the callback thread, when the connection ends without close(); at once if it has ended so already.
  // The unanswered calls have failed by then.
  void setConnectionLostHandler(std::function<void(const CallError&)> handler);
  // Returns whether calls are still taken.
  bool isOpen() const;
  // Ends the connection; calls already sent still go out (closingTime). Does not wait. Idempotent.
  void close();

 private:
  OrvantaConnection(std::shared_ptr<CallbackThread> thread, std::shared_ptr<CallChannel> channel,
                    std::chrono::milliseconds closingTime);

  // Constant after construction.
  std::shared_ptr<CallbackThread> _thread;
  std::shared_ptr<CallChannel> _channel;
  const std::chrono::milliseconds _closingTime;
  ClientSession _session;
};

}  // namespace orvanta
