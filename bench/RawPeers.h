#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

namespace orvanta::bench {

// The least that a server can do, each in a process of its own so that its CPU time is its own. Ended with the object.
class RawPeer {
 public:
  RawPeer(const RawPeer&) = delete;
  RawPeer& operator=(const RawPeer&) = delete;
  ~RawPeer();
  pid_t pid() const { return _pid; }

 protected:
  RawPeer() = default;
  pid_t _pid = -1;
};

// Answers every `requestSize` bytes on a Unix stream socket with `answerSize` bytes: what a call would cost if there
// were nothing to do.
class EchoServer : public RawPeer {
 public:
  EchoServer(const std::string& socketPath, std::size_t requestSize, std::size_t answerSize);
};

// Takes HTTP posts on any number of kept-alive connections and answers each with an empty 200.
class PostSink : public RawPeer {
 public:
  PostSink();
  std::uint16_t port() const { return _port; }
  std::string url() const { return "http://127.0.0.1:" + std::to_string(_port) + "/post"; }
  // Posts answered so far.
  std::uint64_t posts() const;

 private:
  std::uint16_t _port = 0;
  volatile std::uint64_t* _posts = nullptr;  // shared with the process
};

// Takes UDP datagrams as they come, as fast as its processor lets it.
class DatagramSink : public RawPeer {
 public:
  DatagramSink();
  std::uint16_t port() const { return _port; }
  // Datagrams received so far; what finds no room in the socket is lost.
  std::uint64_t datagrams() const;

 private:
  std::uint16_t _port = 0;
  volatile std::uint64_t* _datagrams = nullptr;  // shared with the process
};

}  // namespace orvanta::bench
