#include <arpa/inet.h>
#include <dirent.h>
#include <fcntl.h>
#include <fmt/core.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <stdexcept>
#include <thread>

#include "backends/dashboard/DashboardDatagram.h"
#include "bench/BenchDaemon.h"
#include "bench/CallDriver.h"
#include "bench/RawPeers.h"
#include "bench/Stages.h"
#include "config/MessageLog.h"
#include "interface/RemoteCalls.h"
#include "platform/core/UniqueFd.h"
#include "tests/support/TestPlatform.h"

// The dashboard path with its message-log line, and that line alone.

namespace orvanta::bench {

namespace {
using platform::UniqueFd;

constexpr double kSeconds = 1.0;
constexpr std::uint64_t kWindow = 64;

// Appends `line` to the only file of a directory, with or without the look-up by which a call that remembers nothing
// finds the file and its age.
double rawAppend(const test::TemporaryDirectory& directory, const std::string& line, bool lookUp) {
  const std::string file = directory.write("log/orvantad_1_messageLog.diag", "");
  const std::string parent = directory / "log";
  alignas(dirent64) char listing[4096];
  return measure(kSeconds,
                 [&] {
                   if (lookUp) {
                     const UniqueFd opened(::open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
                     while (::getdents64(opened.get(), listing, sizeof listing) > 0) {
                     }
                     struct statx status {};
                     ::statx(opened.get(), "orvantad_1_messageLog.diag", AT_SYMLINK_NOFOLLOW, STATX_BTIME, &status);
                   }
                   const UniqueFd fd(::open(file.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644));
                   if (::write(fd.get(), line.data(), line.size()) < 0) throw std::runtime_error("write");
                   return 1;
                 })
      .cpuPerEvent;
}

double rawSend(const DatagramSink& sink, const std::vector<std::uint8_t>& datagram) {
  const UniqueFd socket(::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(sink.port());
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  if (::connect(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
    throw std::runtime_error("connect");
  }
  // In bursts, as the daemon sends them: each time the receiver has to be woken.
  const auto figure = measure(kSeconds, [&] {
    std::uint64_t sent = 0;
    for (std::uint64_t i = 0; i < kWindow; ++i) {
      if (::sendto(socket.get(), datagram.data(), datagram.size(), MSG_NOSIGNAL, nullptr, 0) >= 0) ++sent;
    }
    std::this_thread::sleep_for(std::chrono::microseconds(300));
    return sent;
  });
  printFigure(fmt::format("sendto of {} bytes on a connected socket", datagram.size()), figure);
  return figure.cpuPerEvent;
}

double rawEcho(const std::string& path, const std::vector<std::uint8_t>& call, std::size_t answerSize) {
  constexpr std::uint64_t kCalls = 200'000;
  const EchoServer echo(path, call.size(), answerSize);
  CallDriver driver(path);
  const Stretch time(echo.pid());
  driver.pipeline(repeated(call, kWindow), answerSize, kCalls, kWindow);
  const auto decode = measure(kSeconds / 2, [&] {
    platform::FrameDecoder decoder(kFrameLimits);
    decoder.append(call);
    return std::get<platform::Frame>(decoder.next()).params.size();
  });
  return figureOf(time, kCalls).cpuPerEvent + decode.cpuPerEvent;
}

std::vector<std::uint8_t> sampleDatagram() {
  const auto payload = std::make_shared<const Dictionary>(samplePayload(7));
  DashboardSender sender;
  sender.deviceID = "0123456789abcdef0123456789abcdef01234567";
  return encodeDashboardDatagram(sender, {payload, {1'700'000'000, 0}, 5, 6, EventFlag::none, 1});
}

// Waits until no more arrive, since some may be lost on the way.
std::uint64_t settledCount(const DatagramSink& sink, std::uint64_t expected) {
  for (std::uint64_t count = 0;;) {
    const auto now = sink.datagrams();
    if (now >= expected || (now == count && now > 0)) return now;
    count = now;
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
  }
}

}  // namespace

double benchMessageLog() {
  test::TestPlatform device;
  const test::TemporaryDirectory directory;
  const std::string line = "[dashboard -> sendMessageWithDictionary] " + std::string(400, 'x');
  const double append = rawAppend(directory, line, false);
  const double withLookUp = rawAppend(directory, line, true);
  const auto figure = measure(kSeconds, [&] {
    writeToLogFile(device.get(), line);
    return 1;
  });
  printFigure("message-log line", figure);
  printRatio("  against open, append, close", figure.cpuPerEvent, append, 3.0);
  printRatio("  against listing, statx, open, append, close", figure.cpuPerEvent, withLookUp, 1.2);
  return withLookUp;
}

void benchDashboard() {
  printHeading("Dashboard: client, daemon, datagram and message-log line, local sink");
  const double logLine = benchMessageLog();
  const DatagramSink sink;
  const double datagram = rawSend(sink, sampleDatagram());
  std::this_thread::sleep_for(std::chrono::milliseconds(200));

  // The raw system calls pass no sandbox: the difference between the two is what it adds.
  for (const bool sandbox : {false, true}) {
    const BenchDaemon daemon({{"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", sink.port()}}}}, true, sandbox);
    CallDriver driver(daemon.process().socketPath());
    driver.configure(false);
    const auto call = sampleCall();
    const std::size_t answerSize = driver.call(call);  // the log line, always of the same length
    const double echo = rawEcho(daemon.process().runtimeDirectory() + "/echo", call, answerSize);

    constexpr std::uint64_t kEvents = kWindow * 300;
    const auto before = sink.datagrams();
    const Stretch time(daemon.process().process().pid());
    driver.pipeline(repeated(call, kWindow), answerSize, kEvents, kWindow);
    const double wall = time.wallMicroseconds();
    const auto arrived = settledCount(sink, before + kEvents) - before;
    const Figure figure{static_cast<double>(kEvents) / wall * 1e6, time.cpu() / static_cast<double>(kEvents)};
    printFigure(sandbox ? "datagrams with their lines, daemon's CPU" : "the same without the sandbox", figure);
    fmt::print("  {:<58} {:>12.2f} %\n", "  of them arrived", 100.0 * static_cast<double>(arrived) / kEvents);
    printRatio("  against echo, decode, sendto and raw line", figure.cpuPerEvent, echo + datagram + logLine, 1.2);
  }
}

}  // namespace orvanta::bench
