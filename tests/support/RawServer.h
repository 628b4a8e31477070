#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <functional>
#include <list>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/UniqueFd.h"

namespace orvanta::test {

class RawServer;

// One accepted connection of a RawServer, in the hands of the script that runs for it.
class RawConnection {
 public:
  RawConnection(RawServer& server, int fd) : _server(server), _fd(fd) {}

  // The next whole request, headers and the body of their Content-Length, as it came; none when the client closed
  // before. The server remembers it.
  std::optional<std::string> readRequest();
  // False when the client is gone.
  bool write(std::string_view bytes);
  // Ends the connection with a reset instead of a close.
  void reset();
  // Until the client closes, or the server stops. What comes meanwhile is thrown away.
  void waitForClose();

 private:
  bool readMore();

  RawServer& _server;
  const int _fd;
  std::string _pending;
};

// A TCP server on the loopback interface that does exactly what a script says, wrong things too. The script runs on a
// thread of its own for each connection, which is closed when the script returns.
class RawServer {
 public:
  using Script = std::function<void(RawConnection&)>;

  explicit RawServer(Script script);
  ~RawServer();  // ends all connections, then waits for the scripts
  RawServer(const RawServer&) = delete;
  RawServer& operator=(const RawServer&) = delete;

  int port() const { return _port; }
  std::string url(std::string_view path = "/") const;
  // Requests read so far, in the order in which they were complete.
  std::vector<std::string> requests() const;
  std::size_t connectionCount() const;
  // False when they have not come within half a minute.
  bool waitForRequests(std::size_t count) const;

  // A script that answers every request of a connection alike.
  static Script answering(std::string answer);
  static std::string response(std::string_view statusLine, std::string_view headers = {}, std::string_view body = {});

 private:
  friend class RawConnection;
  void acceptAll();
  void remember(std::string request);

  Script _script;
  platform::UniqueFd _listener;
  int _port = 0;
  mutable std::mutex _mutex;
  mutable std::condition_variable _changed;
  std::vector<std::string> _requests;  // guarded by _mutex
  std::list<int> _open;                // guarded by _mutex: connections whose script runs
  std::size_t _accepted = 0;           // guarded by _mutex
  bool _stopping = false;              // guarded by _mutex
  std::vector<std::thread> _scripts;   // the accepting thread's, then the destructor's
  std::thread _acceptor;
};

}  // namespace orvanta::test
