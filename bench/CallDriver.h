#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "interface/Values.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::bench {

// The client's side of the call path at next to no cost of its own: calls are encoded beforehand, answers counted by
// size. For one thread. Every call throws if the daemon has gone or refuses.
class CallDriver {
 public:
  // Connects; throws if no daemon listens.
  explicit CallDriver(const std::string& socketPath);

  // Writes `message`, reads until its answer is whole and returns the number of bytes read. For set-up calls.
  std::size_t call(const std::vector<std::uint8_t>& message);
  // Makes the connection a session of client type 5.
  void configure(bool batchEvents);
  // Sends `burst`, which holds `window` requests, until `count` are sent, each answered by `answerSize` bytes.
  void pipeline(const std::vector<std::uint8_t>& burst, std::size_t answerSize, std::uint64_t count,
                std::uint64_t window);
  // The halves of pipeline(), for driving many connections: bursts whose answers are read later.
  void send(const std::vector<std::uint8_t>& burst) { write(burst.data(), burst.size()); }
  void receive(std::size_t length) { read(length); }
  // Makes one call at a time and returns the round trips in microseconds.
  std::vector<double> roundTrips(const std::vector<std::uint8_t>& request, std::size_t answerSize, std::uint64_t count);

 private:
  void write(const std::uint8_t* bytes, std::size_t length);
  void read(std::size_t length);

  platform::UniqueFd _socket;
  std::vector<std::uint8_t> _buffer;
};

// A whole request frame. The id takes five bytes, so that answers to a given call always have the same size.
std::vector<std::uint8_t> encodeCall(const char* method, const Array& params);
// The size of a response with one nil: array, type, five bytes of id, nil, array of one, nil.
inline constexpr std::size_t kNilAnswer = 10;
// `count` calls that send an event each, no two alike.
std::vector<std::uint8_t> encodeEvents(std::uint32_t count);
// `count` times the same call.
std::vector<std::uint8_t> repeated(const std::vector<std::uint8_t>& call, std::uint64_t count);
// The payload of a typical event: 15 keys, as varied as those of a player's session.
Dictionary samplePayload(std::uint32_t number);
// A call that sends such an event.
std::vector<std::uint8_t> sampleCall();

}  // namespace orvanta::bench
