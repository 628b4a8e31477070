#include "bench/CallDriver.h"

#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <chrono>
#include <cstring>
#include <random>
#include <stdexcept>

#include "interface/RemoteCalls.h"
#include "platform/codec/MessagePack.h"
#include "platform/ipc/Connection.h"

namespace orvanta::bench {

namespace {
constexpr std::uint32_t kMessageID = 0x10000;
}

CallDriver::CallDriver(const std::string& socketPath)
    : _socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)), _buffer(1U << 16U) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
  if (::connect(_socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("cannot connect to " + socketPath);
  }
}

void CallDriver::write(const std::uint8_t* bytes, std::size_t length) {
  while (length > 0) {
    const ssize_t written = ::write(_socket.get(), bytes, length);
    if (written <= 0) throw std::runtime_error("the daemon has gone");
    bytes += written;
    length -= static_cast<std::size_t>(written);
  }
}

void CallDriver::read(std::size_t length) {
  while (length > 0) {
    const ssize_t got = ::read(_socket.get(), _buffer.data(), std::min(length, _buffer.size()));
    if (got <= 0) throw std::runtime_error("the daemon has gone");
    length -= static_cast<std::size_t>(got);
  }
}

std::size_t CallDriver::call(const std::vector<std::uint8_t>& message) {
  write(message.data(), message.size());
  std::size_t size = 0;
  platform::FrameDecoder decoder(kFrameLimits);
  for (;;) {
    auto outcome = decoder.next();
    if (const auto* frame = std::get_if<platform::Frame>(&outcome)) {
      if (frame->kind != platform::Frame::Kind::response) continue;
      if (!frame->error.isNull()) throw std::runtime_error("call refused: " + frame->error.description());
      return size;
    }
    const ssize_t got = ::read(_socket.get(), _buffer.data(), _buffer.size());
    if (got <= 0) throw std::runtime_error("the daemon has gone");
    size += static_cast<std::size_t>(got);
    decoder.append({_buffer.data(), static_cast<std::size_t>(got)});
  }
}

void CallDriver::configure(bool batchEvents) {
  call(encodeCall("setSessionInfo", {Dictionary{{"sessionID", 1}, {"clientType", 5}, {"batchEvent", batchEvents}},
                                     nullptr, nullptr, false}));
  call(encodeCall("startConfigWithCompletionHandler", {}));
}

void CallDriver::pipeline(const std::vector<std::uint8_t>& burst, std::size_t answerSize, std::uint64_t count,
                          std::uint64_t window) {
  for (std::uint64_t sent = 0; sent < count; sent += window) {
    write(burst.data(), burst.size());
    read(answerSize * window);
  }
}

std::vector<double> CallDriver::roundTrips(const std::vector<std::uint8_t>& request, std::size_t answerSize,
                                           std::uint64_t count) {
  std::vector<double> times;
  times.reserve(count);
  for (std::uint64_t i = 0; i < count; ++i) {
    const auto begun = std::chrono::steady_clock::now();
    write(request.data(), request.size());
    read(answerSize);
    times.push_back(std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - begun).count());
  }
  return times;
}

std::vector<std::uint8_t> encodeCall(const char* method, const Array& params) {
  std::vector<std::uint8_t> message;
  platform::appendRequestHeader(message, kMessageID, method, params.size());
  platform::MessagePackWriter out(message);
  for (const auto& param : params) out.value(param);
  return message;
}

std::vector<std::uint8_t> repeated(const std::vector<std::uint8_t>& call, std::uint64_t count) {
  std::vector<std::uint8_t> burst;
  for (std::uint64_t i = 0; i < count; ++i) burst.insert(burst.end(), call.begin(), call.end());
  return burst;
}

std::vector<std::uint8_t> encodeEvents(std::uint32_t count) {
  std::vector<std::uint8_t> burst;
  for (std::uint32_t i = 0; i < count; ++i) {
    const auto call = encodeCall("sendMessageWithDictionary",
                                 {Dictionary{{"category", 5}, {"type", 6}, {"payload", samplePayload(i)}}});
    burst.insert(burst.end(), call.begin(), call.end());
  }
  return burst;
}

Dictionary samplePayload(std::uint32_t number) {
  std::mt19937 random(number);  // the same in every run
  const auto below = [&random](std::uint32_t limit) { return random() % limit; };
  return {{"bitrate", 400'000 + below(7'000'000)},
          {"bufferLevel", below(30'000) / 1000.0},
          {"codec", "avc1.640028"},
          {"contentId", fmt::format("{:08x}-{:04x}-4f0e-9c1d-{:08x}", random(), below(0xffff), random())},
          {"droppedFrames", below(130)},
          {"fullscreen", below(2) == 0},
          {"networkType", "wifi"},
          {"position", below(7'200'000) / 1000.0},
          {"quality", "1080p"},
          {"rebufferCount", below(4)},
          {"resolution", "1920x1080"},
          {"server", fmt::format("edge-{}.fra", below(64))},
          {"startupTime", below(3000) / 1000.0},
          {"title", fmt::format("Episode {}", below(40))},
          {"volume", below(100) / 100.0}};
}

std::vector<std::uint8_t> sampleCall() {
  return encodeCall("sendMessageWithDictionary",
                    {Dictionary{{"category", 5}, {"type", 6}, {"payload", samplePayload(7)}}});
}

}  // namespace orvanta::bench
