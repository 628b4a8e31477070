#include "client/OrvantaConnection.h"

#include <fmt/format.h>

#include <cerrno>
#include <cstdlib>
#include <string_view>
#include <thread>
#include <utility>

#include "client/CallChannel.h"
#include "interface/OrvantaConstants.h"
#include "interface/RemoteCalls.h"
#include "platform/ipc/Connect.h"
#include "platform/ipc/Connection.h"

namespace orvanta {

namespace {

// A daemon whose queue of connections is full is asked again this often before connect() fails.
constexpr int kConnectAttempts = 300;
constexpr std::chrono::milliseconds kConnectInterval{10};

std::string defaultSocketDirectory() {
  const char* set = std::getenv("RUNTIME_DIRECTORY");
  const std::string_view value = set == nullptr ? "" : set;
  const auto first = value.substr(0, value.find(':'));
  return first.empty() ? "/run/orvanta" : std::string(first);
}

CallError connectError(const std::string& directory, const std::string& text, int error) {
  switch (error) {
    case ENOENT:
    case ECONNREFUSED:
      return {
          fmt::format("no daemon listens on {}/{}: is orvantad running, and is its runtime directory the right one?",
                      directory, kOrvantaServiceName),
          CallErrorKind::noSuchService};
    case EACCES:
    case EPERM:
      return {text, CallErrorKind::notEntitled};
    case EAGAIN:
      return {text + " (the daemon does not get round to accepting connections)", CallErrorKind::tooMuchWaiting};
    default:
      return {text, CallErrorKind::noSuchService};
  }
}

CallResult<platform::UniqueFd> connectSocket(const std::string& directory) {
  for (int attempt = 1;; ++attempt) {
    int error = 0;
    auto socket = platform::connectToService(directory, std::string(kOrvantaServiceName), &error);
    if (socket.ok()) return std::move(*socket);
    if (error != EAGAIN || attempt == kConnectAttempts) return connectError(directory, socket.error(), error);
    std::this_thread::sleep_for(kConnectInterval);
  }
}

platform::ConnectionLimits limits() {
  auto limits = kDaemonConnectionLimits;
  // Calls that wait to be sent must not keep answers from being read: a daemon that waits for its answers to be read
  // does not read calls either. The channel has a limit of its own.
  limits.maximumUnreadReplies = SIZE_MAX;
  return limits;
}

}  // namespace

CallResult<std::unique_ptr<OrvantaConnection>> OrvantaConnection::connect(ConnectionOptions options) {
  auto socket = connectSocket(options.socketDirectory.empty() ? defaultSocketDirectory() : options.socketDirectory);
  if (!socket) return socket.error();
  auto thread = std::move(options.callbackThread);
  if (!thread) {
    auto started = CallbackThread::start();
    if (!started) return started.error();
    thread = std::move(*started);
  }
  auto connection = platform::Connection::create(thread->pool(), std::move(*socket), limits());
  auto channel = std::make_shared<CallChannel>(std::move(connection), *thread, options.maximumWaitingBytes);
  channel->start();
  return std::unique_ptr<OrvantaConnection>(
      new OrvantaConnection(std::move(thread), std::move(channel), options.closingTime));
}

OrvantaConnection::OrvantaConnection(std::shared_ptr<CallbackThread> thread, std::shared_ptr<CallChannel> channel,
                                     std::chrono::milliseconds closingTime)
    : _thread(std::move(thread)), _channel(std::move(channel)), _closingTime(closingTime), _session(_channel) {}

OrvantaConnection::~OrvantaConnection() {
  _channel->close(_closingTime);
  if (!_thread->isCurrent()) {
    _channel->waitUntilQuiet();
    return;
  }
  _channel->abandon();
  // A thread cannot join itself: another waits until it has finished with the connection.
  std::thread([channel = std::move(_channel), thread = std::move(_thread)]() mutable {
    channel->waitUntilQuiet();
    channel.reset();
    thread.reset();
  }).detach();
}

void OrvantaConnection::setConnectionLostHandler(std::function<void(const CallError&)> handler) {
  _channel->setLostHandler(std::move(handler));
}

bool OrvantaConnection::isOpen() const {
  return _channel->isOpen();
}

void OrvantaConnection::close() {
  _channel->close(_closingTime);
}

}  // namespace orvanta
