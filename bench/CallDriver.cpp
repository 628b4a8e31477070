#include "bench/CallDriver.h"

#include <sys/socket.h>
#include <sys/un.h>

#include <chrono>
#include <cstring>
#include <stdexcept>

#include "platform/Connection.h"
#include "platform/FrameDecoder.h"
#include "platform/MessagePack.h"

namespace orvanta::bench {

using platform::Dictionary;

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

void CallDriver::call(const std::vector<std::uint8_t>& message) {
  write(message.data(), message.size());
  platform::FrameDecoder decoder;
  for (;;) {
    auto outcome = decoder.next();
    if (const auto* frame = std::get_if<platform::Frame>(&outcome)) {
      if (frame->kind != platform::Frame::Kind::response) continue;
      if (!frame->error.isNull()) throw std::runtime_error("call refused: " + frame->error.description());
      return;
    }
    const ssize_t got = ::read(_socket.get(), _buffer.data(), _buffer.size());
    if (got <= 0) throw std::runtime_error("the daemon has gone");
    decoder.append({_buffer.data(), static_cast<std::size_t>(got)});
  }
}

void CallDriver::pipeline(const std::vector<std::uint8_t>& request, std::size_t answerSize, std::uint64_t count,
                          std::uint64_t window) {
  std::vector<std::uint8_t> burst;
  for (std::uint64_t i = 0; i < window; ++i) burst.insert(burst.end(), request.begin(), request.end());
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

std::vector<std::uint8_t> encodeCall(const char* method, const platform::Array& params) {
  std::vector<std::uint8_t> message;
  platform::appendRequestHeader(message, kMessageID, method, params.size());
  platform::MessagePackWriter out(message);
  for (const auto& param : params) out.value(param);
  return message;
}

Dictionary samplePayload(std::uint32_t number) {
  return {{"bitrate", 2'400'000 + number % 1000},
          {"bufferLevel", 12.5 + number % 7},
          {"codec", "avc1.640028"},
          {"contentId", "a81f3c52-77b0-4f0e-9c1d-" + std::to_string(100'000 + number)},
          {"droppedFrames", number % 13},
          {"fullscreen", number % 2 == 0},
          {"networkType", "wifi"},
          {"position", 18.25 * (number % 100)},
          {"quality", "1080p"},
          {"rebufferCount", number % 3},
          {"resolution", "1920x1080"},
          {"server", "edge-14.fra"},
          {"startupTime", 0.843},
          {"title", "Episode " + std::to_string(number % 40)},
          {"volume", 0.5}};
}

}  // namespace orvanta::bench
