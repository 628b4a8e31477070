#include "tools/collector/store/InboxRows.h"

#include <utility>

#include "platform/codec/Json.h"

namespace orvanta::collector::rows {

namespace {

std::string headersJson(const HeaderFields& headers) {
  Array list;
  list.reserve(headers.size());
  for (const auto& [name, value] : headers) list.emplace_back(Array{name, value});
  return platform::writeJson(list);
}

HeaderFields headersFromJson(std::string_view json) {
  HeaderFields headers;
  const auto parsed = platform::parseJson(json);
  const Array* list = parsed ? parsed->array() : nullptr;
  if (list == nullptr) return headers;
  for (const Value& entry : *list) {
    const Array* pair = entry.array();
    if (pair == nullptr || pair->size() != 2 || !(*pair)[0].string() || !(*pair)[1].string()) continue;
    headers.emplace_back(*(*pair)[0].string(), *(*pair)[1].string());
  }
  return headers;
}

}  // namespace

const char* const kSchema = R"(
  CREATE TABLE IF NOT EXISTS requests(
    id INTEGER PRIMARY KEY AUTOINCREMENT, exchange INTEGER, time REAL, client TEXT, secure INTEGER, kind TEXT, method TEXT,
    target TEXT, path TEXT, headers TEXT, raw_body BLOB, body BLOB, note TEXT, status INTEGER);
  CREATE INDEX IF NOT EXISTS requests_exchange ON requests(exchange);
  CREATE TABLE IF NOT EXISTS events(
    id INTEGER PRIMARY KEY AUTOINCREMENT, request INTEGER, position INTEGER, event TEXT);
  CREATE INDEX IF NOT EXISTS events_request ON events(request);
  CREATE TABLE IF NOT EXISTS datagrams(
    id INTEGER PRIMARY KEY AUTOINCREMENT, time REAL, client TEXT, bytes BLOB, well_formed INTEGER, version_major INTEGER,
    client_type INTEGER, time_seconds INTEGER, milliseconds INTEGER, session_id INTEGER, client_version INTEGER,
    method INTEGER, resp_code INTEGER, device_id TEXT, event_number INTEGER, reliable INTEGER, explicit_server INTEGER,
    text TEXT, acknowledgements INTEGER);
)";

// --- Requests ---

const std::string_view kInsertRequest =
    "INSERT INTO requests(exchange, time, client, secure, kind, method, target, path, headers, raw_body, body, note, "
    "status) VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?)";

const std::string_view kSelectRequests =
    "SELECT id, exchange, time, client, secure, kind, method, target, path, headers, raw_body, body, note, status "
    "FROM requests ";

void insert(Statement& statement, const ReceivedRequest& request) {
  const std::string headers = headersJson(request.headers);
  statement.bind(0, request.exchange)
      .bind(1, request.time)
      .bindText(2, request.client)
      .bind(3, std::int64_t{request.secure})
      .bindText(4, requestKindText(request.kind))
      .bindText(5, request.method)
      .bindText(6, request.target)
      .bindText(7, request.path)
      .bindText(8, headers)
      .bindBlob(9, request.rawBody)
      .bindText(11, request.note)
      .bind(12, std::int64_t{request.status});
  // A body that was not compressed is stored once.
  if (request.body == request.rawBody) {
    statement.bindNull(10);
  } else {
    statement.bindBlob(10, request.body);
  }
  statement.step();
}

ReceivedRequest readRequest(const Statement& statement) {
  ReceivedRequest request;
  request.id = statement.integer(0);
  request.exchange = statement.integer(1);
  request.time = statement.real(2);
  request.client = statement.bytes(3);
  request.secure = statement.integer(4) != 0;
  request.kind = requestKindFromText(statement.bytes(5)).value_or(RequestKind::other);
  request.method = statement.bytes(6);
  request.target = statement.bytes(7);
  request.path = statement.bytes(8);
  request.headers = headersFromJson(statement.bytes(9));
  request.rawBody = statement.bytes(10);
  request.body = statement.isNull(11) ? request.rawBody : statement.bytes(11);
  request.note = statement.bytes(12);
  request.status = static_cast<int>(statement.integer(13));
  return request;
}

// --- Events ---

const std::string_view kInsertEvent = "INSERT INTO events(request, position, event) VALUES(?,?,?)";

const std::string_view kSelectEvents =
    "SELECT events.id, request, position, path, secure, status, event "
    "FROM events JOIN requests ON request = requests.id ";

ReceivedEvent readEvent(const Statement& statement) {
  ReceivedEvent event;
  event.id = statement.integer(0);
  event.request = statement.integer(1);
  event.position = statement.integer(2);
  event.path = statement.bytes(3);
  event.secure = statement.integer(4) != 0;
  event.status = static_cast<int>(statement.integer(5));
  auto parsed = platform::parseJson(statement.bytes(6));
  if (parsed && parsed->dictionary() != nullptr) event.event = std::move(*parsed->dictionary());
  return event;
}

// --- Datagrams ---

const std::string_view kInsertDatagram =
    "INSERT INTO datagrams(time, client, bytes, well_formed, version_major, client_type, time_seconds, milliseconds, "
    "session_id, client_version, method, resp_code, device_id, event_number, reliable, explicit_server, text, "
    "acknowledgements) VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?)";

const std::string_view kSelectDatagrams =
    "SELECT id, time, client, bytes, well_formed, version_major, client_type, time_seconds, milliseconds, session_id, "
    "client_version, method, resp_code, device_id, event_number, reliable, explicit_server, text, acknowledgements "
    "FROM datagrams ";

void insert(Statement& statement, const ReceivedDatagram& datagram) {
  statement.bind(0, datagram.time)
      .bindText(1, datagram.client)
      .bindBlob(2, datagram.bytes)
      .bind(3, std::int64_t{datagram.wellFormed})
      .bind(4, std::int64_t{datagram.versionMajor})
      .bind(5, std::int64_t{datagram.clientType})
      .bind(6, std::int64_t{datagram.timeSeconds})
      .bind(7, std::int64_t{datagram.milliseconds})
      .bind(8, std::int64_t{datagram.sessionID})
      .bind(9, std::int64_t{datagram.clientVersion})
      .bind(10, std::int64_t{datagram.method})
      .bind(11, std::int64_t{datagram.respCode})
      .bindBlob(12, datagram.deviceID)
      .bind(13, std::int64_t{datagram.eventNumber})
      .bind(14, std::int64_t{datagram.reliable})
      .bind(15, std::int64_t{datagram.explicitServer})
      .bindBlob(16, datagram.text)
      .bind(17, datagram.acknowledgements)
      .step();
}

ReceivedDatagram readDatagram(const Statement& statement) {
  ReceivedDatagram datagram;
  datagram.id = statement.integer(0);
  datagram.time = statement.real(1);
  datagram.client = statement.bytes(2);
  datagram.bytes = statement.bytes(3);
  datagram.wellFormed = statement.integer(4) != 0;
  datagram.versionMajor = static_cast<std::uint8_t>(statement.integer(5));
  datagram.clientType = static_cast<std::uint8_t>(statement.integer(6));
  datagram.timeSeconds = static_cast<std::uint32_t>(statement.integer(7));
  datagram.milliseconds = static_cast<std::uint16_t>(statement.integer(8));
  datagram.sessionID = static_cast<std::uint32_t>(statement.integer(9));
  datagram.clientVersion = static_cast<std::uint16_t>(statement.integer(10));
  datagram.method = static_cast<std::uint16_t>(statement.integer(11));
  datagram.respCode = static_cast<std::uint16_t>(statement.integer(12));
  datagram.deviceID = statement.bytes(13);
  datagram.eventNumber = static_cast<std::uint16_t>(statement.integer(14));
  datagram.reliable = statement.integer(15) != 0;
  datagram.explicitServer = statement.integer(16) != 0;
  datagram.text = statement.bytes(17);
  datagram.acknowledgements = statement.integer(18);
  return datagram;
}

}  // namespace orvanta::collector::rows
