#include "tools/collector/servers/DashboardServer.h"

#include <fmt/format.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

#include "backends/dashboard/DashboardDatagram.h"
#include "platform/core/Text.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {
using platform::UniqueFd;

namespace {

constexpr std::size_t kMaximumDelayed = 100'000;
// Acknowledgements that are due go out between turns, even in a flood.
constexpr int kDatagramsPerTurn = 64;
constexpr int kReceiveBufferBytes = 4 << 20;

ReceivedDatagram readDatagram(std::string_view bytes) {
  ReceivedDatagram datagram;
  datagram.bytes = bytes;
  const auto packet = decodeDashboardDatagram({reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size()});
  if (!packet) return datagram;
  const DashboardHeader& header = packet->header;
  datagram.wellFormed = true;
  datagram.versionMajor = header.versionMajor;
  datagram.clientType = header.clientType;
  datagram.timeSeconds = header.timeSeconds;
  datagram.milliseconds = static_cast<std::uint16_t>(header.timeQuarterMs * 4);
  datagram.sessionID = header.sessionID();
  datagram.clientVersion = header.clientVersion();
  datagram.method = header.method;
  datagram.respCode = header.respCode;
  datagram.deviceID = header.deviceIDText();
  datagram.eventNumber = header.eventNumber;
  datagram.reliable = (header.mode & DashboardHeader::kModeAcknowledged) != 0;
  datagram.explicitServer = (header.mode & DashboardHeader::kModeExplicitServer) != 0;
  datagram.text = packet->text;
  return datagram;
}

}  // namespace

Result<std::unique_ptr<DashboardServer>> DashboardServer::start(const std::string& address, std::uint16_t port,
                                                                Inbox& inbox) {
  auto bound = bindSocket(SOCK_DGRAM, address, port);
  if (!bound) return Failure{bound.error()};
  auto foreign = bindSocket(SOCK_DGRAM, address, 0);
  if (!foreign) return Failure{foreign.error()};
  ::setsockopt(bound->socket.get(), SOL_SOCKET, SO_RCVBUF, &kReceiveBufferBytes, sizeof kReceiveBufferBytes);
  UniqueFd wakeUp(::eventfd(0, EFD_CLOEXEC));
  if (!wakeUp) return Failure{fmt::format("cannot make an event descriptor: {}", platform::errnoText(errno))};
  return std::unique_ptr<DashboardServer>(
      new DashboardServer(std::move(bound->socket), bound->port, std::move(foreign->socket), std::move(wakeUp), inbox));
}

DashboardServer::DashboardServer(UniqueFd socket, std::uint16_t port, UniqueFd foreignSocket, UniqueFd wakeUp,
                                 Inbox& inbox)
    : _socket(std::move(socket)),
      _port(port),
      _foreignSocket(std::move(foreignSocket)),
      _wakeUp(std::move(wakeUp)),
      _inbox(inbox) {
  _thread = std::thread([this] { run(); });
}

DashboardServer::~DashboardServer() {
  stop();
}

void DashboardServer::stop() {
  if (!_thread.joinable()) return;
  ::eventfd_write(_wakeUp.get(), 1);
  _thread.join();
}

void DashboardServer::setSettings(const AcknowledgementSettings& settings) {
  const platform::MutexLock lock(_mutex);
  _settings = settings;
}

AcknowledgementSettings DashboardServer::settings() const {
  const platform::MutexLock lock(_mutex);
  return _settings;
}

void DashboardServer::run() {
  std::array<pollfd, 2> waiting{pollfd{_socket.get(), POLLIN, 0}, pollfd{_wakeUp.get(), POLLIN, 0}};
  while (true) {
    int timeout = -1;
    if (!_delayed.empty()) {
      const auto left = std::chrono::ceil<std::chrono::milliseconds>(_delayed.begin()->first - Clock::now());
      timeout = static_cast<int>(std::max<std::int64_t>(left.count(), 0));
    }
    if (::poll(waiting.data(), waiting.size(), timeout) < 0 && errno != EINTR) return;
    if (waiting[1].revents != 0) return;
    receiveAll();
    sendDue();
  }
}

void DashboardServer::receiveAll() {
  // Longer than the longest valid datagram, so that a longer one is noticed.
  std::array<char, 2048> buffer{};
  for (int i = 0; i < kDatagramsPerTurn; ++i) {
    sockaddr_in from{};
    socklen_t size = sizeof from;
    const ssize_t count = ::recvfrom(_socket.get(), buffer.data(), buffer.size(), MSG_DONTWAIT,
                                     reinterpret_cast<sockaddr*>(&from), &size);
    // If the peer refused an acknowledgement, the next read reports it.
    if (count < 0 && (errno == EINTR || errno == ECONNREFUSED)) continue;
    if (count < 0) return;
    take({buffer.data(), static_cast<std::size_t>(count)}, from);
  }
}

void DashboardServer::take(std::string_view bytes, const sockaddr_in& from) {
  ReceivedDatagram datagram = readDatagram(bytes);
  datagram.time = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
  datagram.client = addressText(from);
  const AcknowledgementSettings current = settings();
  if (datagram.wellFormed && datagram.reliable) {
    const auto due = Clock::now() + current.delay;
    Planned planned = planAcknowledgements(datagram, from, current);
    datagram.acknowledgements = planned.rightOnes;
    for (auto& each : planned.all) {
      if (_delayed.size() < kMaximumDelayed) _delayed.emplace(due, std::move(each));
    }
  }
  _inbox.add(datagram);
}

DashboardServer::Planned DashboardServer::planAcknowledgements(const ReceivedDatagram& datagram,
                                                               const sockaddr_in& from,
                                                               const AcknowledgementSettings& settings) {
  const std::string right = datagram.bytes.substr(0, kDashboardHeaderBytes);
  std::string unknown = right;
  unknown[kDashboardEventNumberOffset] = static_cast<char>(unknown[kDashboardEventNumberOffset] ^ 0x80);
  Planned planned;
  std::vector<Acknowledgement>& all = planned.all;
  all.insert(all.end(), settings.unknownNumbers, {from, unknown, false});
  all.insert(all.end(), settings.tooShort, {from, right.substr(0, kDashboardEventNumberOffset + 1), false});
  all.insert(all.end(), settings.foreign, {from, right, true});
  const bool lost = std::uniform_int_distribution<unsigned>(0, 99)(_dice) < settings.lossPercent;
  if (settings.acknowledge && !lost) {
    all.insert(all.end(), settings.duplicates + 1, {from, right, false});
    planned.rightOnes = settings.duplicates + 1;
  }
  return planned;
}

void DashboardServer::sendDue() {
  const auto now = Clock::now();
  while (!_delayed.empty() && _delayed.begin()->first <= now) {
    const Acknowledgement& each = _delayed.begin()->second;
    const int socket = each.foreign ? _foreignSocket.get() : _socket.get();
    // If it cannot be sent it is lost, as datagrams may be.
    ::sendto(socket, each.bytes.data(), each.bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL,
             reinterpret_cast<const sockaddr*>(&each.to), sizeof each.to);
    _delayed.erase(_delayed.begin());
  }
}

}  // namespace orvanta::collector
