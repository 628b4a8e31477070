#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

namespace orvanta::bench {

// A server that does the least it can, in a process of its own so that its CPU time counts for neither side. Destroying
// the object ends the process.
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

// Answers every `requestSize` bytes on a Unix stream socket with `answerSize` bytes: what a call costs that does
// nothing.
class EchoServer : public RawPeer {
 public:
  EchoServer(const std::string& socketPath, std::size_t requestSize, std::size_t answerSize);
};

// Receives HTTP posts on any number of kept-alive connections and answers each with an empty 200.
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

// Receives UDP datagrams as fast as its processor lets it.
class DatagramSink : public RawPeer {
 public:
  DatagramSink();
  std::uint16_t port() const { return _port; }
  // Datagrams received so far. Those that find the socket full are lost.
  std::uint64_t datagrams() const;

 private:
  std::uint16_t _port = 0;
  volatile std::uint64_t* _datagrams = nullptr;  // shared with the process
};

}  // namespace orvanta::bench
