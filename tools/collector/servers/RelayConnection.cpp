#include "tools/collector/servers/RelayConnection.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <utility>

#include "platform/codec/Json.h"
#include "platform/core/Text.h"
#include "tools/collector/wire/MessageReader.h"

namespace orvanta::collector {

namespace {

// The library refuses further question marks in a query, although they are valid.
std::string targetForLibrary(std::string target) {
  const auto query = target.find('?');
  if (query == std::string::npos) return target;
  for (auto next = target.find('?', query + 1); next != std::string::npos; next = target.find('?', next)) {
    target.replace(next, 1, "%3F");
  }
  return target;
}

// Bounds what a hostile body inflates to: this many times the limit on the wire.
constexpr std::size_t kInflationAllowance = 4;

double wallSeconds() {
  return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

bool isPathBelow(std::string_view path, std::string_view top) {
  return path == top || (path.starts_with(top) && path.size() > top.size() && path[top.size()] == '/');
}

RequestKind kindOf(std::string_view method, std::string_view path) {
  if (isPathBelow(path, "/storebags") && method == "GET") return RequestKind::storebag;
  if (method != "POST") return RequestKind::other;
  if (isPathBelow(path, "/logdata")) return RequestKind::logData;
  if (isPathBelow(path, "/upload")) return RequestKind::upload;
  return RequestKind::events;
}

// Fields of the library's answer that belong to its own connection and are not passed on.
bool isHopByHop(const std::string& name) {
  constexpr std::array<const char*, 3> kNames{"Connection", "Keep-Alive", "Transfer-Encoding"};
  return std::any_of(kNames.begin(), kNames.end(),
                     [&](const char* each) { return platform::equalsIgnoringCase(each, name); });
}

void decodeBody(ReceivedRequest& request, std::size_t maximumBytes) {
  const std::string* encoding = request.header("Content-Encoding");
  const bool compressed = encoding != nullptr && (platform::equalsIgnoringCase(*encoding, "gzip") ||
                                                  platform::equalsIgnoringCase(*encoding, "deflate"));
  if (!compressed) {
    request.body = request.rawBody;
    return;
  }
  auto body = inflateBody(request.rawBody, maximumBytes);
  if (body) {
    request.body = std::move(body.value());
  } else {
    request.damage = body.error();
    request.body = request.rawBody;
  }
}

void parseEvents(ReceivedRequest& request) {
  if (!request.damage.empty()) return;
  auto parsed = platform::parseJson(request.body);
  if (!parsed) {
    request.damage = "the body is not JSON: " + parsed.error();
    return;
  }
  const Dictionary* envelope = parsed->dictionary();
  if (envelope == nullptr || envelope->array("events") == nullptr) {
    request.damage = "the body has no \"events\"";
    return;
  }
  request.json = std::make_shared<const Value>(std::move(parsed.value()));
}

}  // namespace

bool isOwnRequest(std::string_view method, std::string_view path) {
  if (isPathBelow(path, "/control")) return true;
  if (method == "DELETE") return path == "/requests";
  if (method != "GET" && method != "HEAD") return false;
  constexpr std::array<std::string_view, 5> kTops{"/requests", "/events", "/datagrams", "/uploads", "/logdata"};
  return path == "/" || path == "/ca.pem" || path == "/publicKey.der" ||
         std::any_of(kTops.begin(), kTops.end(), [&](std::string_view top) { return isPathBelow(path, top); });
}

void RelayConnection::run() {
  while (handleOne()) {
  }
}

Result<void, RelayConnection::Refusal> RelayConnection::readBody(const RequestHead& head, ReceivedRequest& request) {
  const auto length = head.contentLength();
  if (!length) return Refusal{400, length.error()};
  const bool hasBody = head.chunked() || length->value_or(0) > 0;
  if (!hasBody) return {};
  if (length->value_or(0) > _context.maximumBodyBytes) {
    return Refusal{413, fmt::format("the body is longer than {} bytes", _context.maximumBodyBytes)};
  }
  if (head.expectsContinue()) _stream.write("HTTP/1.1 100 Continue\r\n\r\n");
  auto body =
      head.chunked() ? _reader.readChunkedBody(_context.maximumBodyBytes) : _reader.readBody(length->value_or(0));
  if (!body) return Refusal{400, body.error()};
  request.rawBody = std::move(body.value());
  return {};
}

bool RelayConnection::handleOne() {
  const auto shared = std::make_shared<ReceivedRequest>();
  ReceivedRequest& request = *shared;
  request.client = _client;
  request.secure = _secure;
  const auto text = _reader.readHead();
  if (text && !text.value()) return false;
  if (!text) {
    // If the stream ended inside the head, no client is left to answer.
    return text.error() == MessageReader::kHeadTooLong && refuse(request, 431, text.error());
  }
  auto head = parseRequestHead(*text.value());
  if (!head) return refuse(request, 400, head.error());
  request.method = std::move(head->method);
  request.target = std::move(head->target);
  request.path = pathOfTarget(request.target);
  request.kind = kindOf(request.method, request.path);
  request.headers = std::move(head->headers);
  head->headers = request.headers;
  if (const auto read = readBody(*head, request); !read) {
    return refuse(request, read.error().status, read.error().reason);
  }
  request.time = wallSeconds();
  decodeBody(request, _context.maximumBodyBytes * kInflationAllowance);
  if (request.kind == RequestKind::events) parseEvents(request);
  request.note = request.damage;
  return answer(shared, head->keepsAlive());
}

bool RelayConnection::refuse(ReceivedRequest& request, int status, const std::string& reason) {
  request.time = wallSeconds();
  request.status = status;
  request.note = reason;
  store(request);
  BackendAnswer answer{{status, {{"Content-Type", "text/plain"}}}, reason + "\n"};
  send(request, answer, ConnectionFault::none, false);
  // Closing with bytes unread would reset the connection, and the client could lose the answer.
  _reader.discard(_context.maximumBodyBytes);
  return false;
}

BackendAnswer RelayConnection::usualAnswer(const ReceivedRequest& request) {
  const std::string head =
      fmt::format("{} {} HTTP/1.1\r\nHost: collector\r\n{}: {}\r\nContent-Length: 0\r\n\r\n", request.method,
                  targetForLibrary(request.target), Exchanges::kHeader, request.exchange);
  auto answer = _context.backend.exchange(head, request.method != "HEAD");
  if (answer) return std::move(answer.value());
  return {{502, {{"Content-Type", "text/plain"}}}, answer.error() + "\n"};
}

bool RelayConnection::answer(const std::shared_ptr<ReceivedRequest>& shared, bool keepsAlive) {
  ReceivedRequest& request = *shared;
  const bool own = isOwnRequest(request.method, request.path);
  const PathBehaviour behaviour =
      own ? PathBehaviour() : _context.behaviours.take(request.path).value_or(PathBehaviour());
  request.exchange = _context.inbox.nextExchange();
  const bool answers = behaviour.fault != ConnectionFault::reset && behaviour.fault != ConnectionFault::silent &&
                       behaviour.fault != ConnectionFault::garbage;
  BackendAnswer answer;
  if (answers && !behaviour.replacesAnswer()) {
    _context.exchanges.begin(shared);
    answer = usualAnswer(request);
    _context.exchanges.end(request.exchange);
  } else if (answers) {
    answer.head.status = behaviour.status.value_or(200);
    answer.body = behaviour.body.value_or("");
  }
  for (const auto& field : behaviour.headers) answer.head.headers.push_back(field);
  request.status = answer.head.status;
  if (behaviour.fault != ConnectionFault::none) request.note = connectionFaultText(behaviour.fault);
  if (!own) store(request);

  if (behaviour.delay.count() > 0 && _stream.waitForPeerToClose(behaviour.delay)) return false;
  return send(request, answer, behaviour.fault, keepsAlive);
}

bool RelayConnection::send(const ReceivedRequest& request, const BackendAnswer& answer, ConnectionFault fault,
                           bool keepsAlive) {
  switch (fault) {
    case ConnectionFault::reset:
      _stream.reset();
      return false;
    case ConnectionFault::silent:
      _stream.waitForPeerToClose(std::nullopt);
      return false;
    case ConnectionFault::garbage:
      _stream.write(std::string("\x16\x03garbage\r\n\0\xff\r\n\r\n", 17));
      _stream.finish();
      return false;
    case ConnectionFault::none:
    case ConnectionFault::truncate:
    case ConnectionFault::corrupt:
      break;
  }
  std::string bytes = fmt::format("HTTP/1.1 {} {}\r\n", answer.head.status, reasonPhrase(answer.head.status));
  bool hasLength = false;
  for (const auto& [name, value] : answer.head.headers) {
    if (isHopByHop(name)) continue;
    hasLength = hasLength || platform::equalsIgnoringCase(name, "Content-Length");
    bytes += fmt::format("{}: {}\r\n", name, value);
  }
  if (!hasLength) bytes += fmt::format("Content-Length: {}\r\n", answer.body.size());
  if (!keepsAlive) bytes += "Connection: close\r\n";
  bytes += "\r\n";
  const bool hasBody = request.method != "HEAD" && answer.head.status != 304 && answer.head.status != 204;
  const std::size_t headSize = bytes.size();
  if (hasBody) bytes += answer.body;
  if (fault == ConnectionFault::corrupt && bytes.size() > headSize) bytes[headSize + answer.body.size() / 2] ^= 1;
  if (fault == ConnectionFault::truncate) bytes.resize(headSize + (bytes.size() - headSize) / 2);
  const bool sent = _stream.write(bytes);
  const bool goesOn = sent && keepsAlive && fault != ConnectionFault::truncate;
  if (!goesOn) _stream.finish();
  return goesOn;
}

void RelayConnection::store(ReceivedRequest& request) {
  _context.inbox.add(request);
  if (_context.observer) _context.observer(request);
}

}  // namespace orvanta::collector
