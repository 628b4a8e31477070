#include "tools/collector/servers/BackendConnections.h"

#include <charconv>
#include <utility>

#include "tools/collector/wire/MessageReader.h"

namespace orvanta::collector {

namespace {

constexpr std::size_t kKeptIdle = 4;
constexpr std::size_t kMaximumAnswerBytes = 1U << 30U;

}  // namespace

std::unique_ptr<Transport> BackendConnections::take() {
  platform::MutexLock lock(_mutex);
  while (_inUse >= kMaximum) _givenBack.wait(lock);
  ++_inUse;
  while (!_idle.empty()) {
    auto connection = std::move(_idle.back());
    _idle.pop_back();
    // The library closes connections that were idle for long, which makes them readable.
    if (!connection->readable()) return connection;
  }
  lock.unlock();
  return Transport::connectLoopback(_port);
}

void BackendConnections::giveBack(std::unique_ptr<Transport> connection) {
  const platform::MutexLock lock(_mutex);
  --_inUse;
  if (connection && _idle.size() < kKeptIdle) _idle.push_back(std::move(connection));
  _givenBack.notifyOne();
}

void BackendConnections::closeIdle() {
  const platform::MutexLock lock(_mutex);
  _idle.clear();
}

Result<BackendAnswer> BackendConnections::exchangeOn(Transport& connection, const std::string& head,
                                                     bool answerHasBody) {
  if (!connection.write(head)) return Failure{"the HTTP library does not accept the request"};
  MessageReader reader(connection);
  auto answerHead = reader.readHead();
  if (!answerHead) return Failure{answerHead.error()};
  if (!answerHead.value()) return Failure{"the HTTP library closed the connection"};
  auto parsed = parseResponseHead(*answerHead.value());
  if (!parsed) return Failure{parsed.error()};
  BackendAnswer answer{std::move(parsed.value()), {}};
  const std::string* length = findHeader(answer.head.headers, "Content-Length");
  std::size_t size = 0;
  if (length != nullptr) std::from_chars(length->data(), length->data() + length->size(), size);
  if (!answerHasBody || size == 0) return answer;
  if (size > kMaximumAnswerBytes) return Failure{"the HTTP library's answer is too long"};
  auto body = reader.readBody(size);
  if (!body) return Failure{body.error()};
  answer.body = std::move(body.value());
  return answer;
}

Result<BackendAnswer> BackendConnections::exchange(const std::string& head, bool answerHasBody) {
  Result<BackendAnswer> answer = Failure{"the HTTP library cannot be reached"};
  // The library may close a kept connection just now, so try a second one. Handlers may run twice without harm.
  for (int attempt = 0; attempt < 2 && !answer; ++attempt) {
    auto connection = take();
    if (connection) answer = exchangeOn(*connection, head, answerHasBody);
    if (!answer) connection.reset();
    giveBack(std::move(connection));
  }
  return answer;
}

}  // namespace orvanta::collector
