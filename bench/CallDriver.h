#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/UniqueFd.h"
#include "platform/Value.h"

namespace orvanta::bench {

// The client's side of the call path with next to no cost of its own: calls encoded beforehand, answers counted by
// size.
class CallDriver {
 public:
  // Connects; throws when nobody listens.
  explicit CallDriver(const std::string& socketPath);

  // Writes `message` and reads one whole frame back. For set-up calls.
  void call(const std::vector<std::uint8_t>& message);
  // Sends `burst`, which holds `window` requests, until `count` are sent, each answered by `answerSize` bytes.
  void pipeline(const std::vector<std::uint8_t>& burst, std::size_t answerSize, std::uint64_t count,
                std::uint64_t window);
  // One at a time; the round trips in microseconds.
  std::vector<double> roundTrips(const std::vector<std::uint8_t>& request, std::size_t answerSize, std::uint64_t count);

 private:
  void write(const std::uint8_t* bytes, std::size_t length);
  void read(std::size_t length);

  platform::UniqueFd _socket;
  std::vector<std::uint8_t> _buffer;
};

// A whole request frame. The id takes five bytes, so that answers to a given call always have the same size.
std::vector<std::uint8_t> encodeCall(const char* method, const platform::Array& params);
// `count` calls that hand in an event each, no two alike.
std::vector<std::uint8_t> encodeEvents(std::uint32_t count);
// An event of the kind that clients send: a payload of 15 keys, as varied as those of a player's session.
platform::Dictionary samplePayload(std::uint32_t number);

}  // namespace orvanta::bench
