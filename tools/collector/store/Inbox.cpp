#include "tools/collector/store/Inbox.h"

#include <algorithm>
#include <utility>

#include "platform/codec/Json.h"

namespace orvanta::collector {

namespace {

constexpr const char* kSchema = R"(
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

constexpr std::string_view kRequestColumns =
    "id, exchange, time, client, secure, kind, method, target, path, headers, raw_body, body, note, status";

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

std::int64_t limitOf(const InboxQuery& query) {
  return static_cast<std::int64_t>(query.limit);
}

std::size_t singleNumber(Statement statement) {
  return statement.step() ? static_cast<std::size_t>(std::max<std::int64_t>(statement.integer(0), 0)) : 0;
}

}  // namespace

Result<std::unique_ptr<Inbox>> Inbox::open(const std::string& databaseFile, const InboxLimits& limits) {
  auto database = Database::open(databaseFile, kSchema);
  if (!database) return Failure{database.error()};
  return std::unique_ptr<Inbox>(new Inbox(std::move(database.value()), limits));
}

Inbox::Inbox(std::unique_ptr<Database> database, const InboxLimits& limits)
    : _limits(limits),
      _database(std::move(database)),
      _insertRequest(
          _database->prepare("INSERT INTO requests(exchange, time, client, secure, kind, method, target, path, "
                             "headers, raw_body, body, note, status) VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?)")),
      _insertEvent(_database->prepare("INSERT INTO events(request, position, event) VALUES(?,?,?)")),
      _insertDatagram(_database->prepare(
          "INSERT INTO datagrams(time, client, bytes, well_formed, version_major, client_type, time_seconds, "
          "milliseconds, "
          "session_id, client_version, method, resp_code, device_id, event_number, reliable, explicit_server, text, "
          "acknowledgements) VALUES(?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?,?)")) {
  _counts.requests = singleNumber(_database->prepare("SELECT COUNT(*) FROM requests"));
  _counts.events = singleNumber(_database->prepare("SELECT COUNT(*) FROM events"));
  _counts.datagrams = singleNumber(_database->prepare("SELECT COUNT(*) FROM datagrams"));
  _bytes = singleNumber(
      _database->prepare("SELECT TOTAL(LENGTH(raw_body)) + TOTAL(LENGTH(COALESCE(body, ''))) FROM requests"));
  _lastExchange =
      static_cast<std::int64_t>(singleNumber(_database->prepare("SELECT COALESCE(MAX(exchange), 0) FROM requests")));
}

void Inbox::add(ReceivedRequest& request) {
  const std::string headers = headersJson(request.headers);
  const std::lock_guard lock(_mutex);
  _database->run("BEGIN");
  _insertRequest.bind(0, request.exchange)
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
  if (request.body == request.rawBody) {
    _insertRequest.bindNull(10);
  } else {
    _insertRequest.bindBlob(10, request.body);
    _bytes += request.body.size();
  }
  _insertRequest.step();
  request.id = _database->lastInsertId();
  _bytes += request.rawBody.size();
  ++_counts.requests;
  if (request.kind == RequestKind::events) addEvents(request);
  prune();
  _database->run("COMMIT");
  changed();
}

void Inbox::addEvents(const ReceivedRequest& request) {
  const Value* list = request.json ? request.json->dictionary()->find("events") : nullptr;
  if (list == nullptr) return;
  std::int64_t position = 0;
  for (const Value& event : *list->array()) {
    const std::string text = platform::writeJson(event);
    _insertEvent.bind(0, request.id).bind(1, position++).bindText(2, text).step();
    ++_counts.events;
  }
}

void Inbox::add(ReceivedDatagram& datagram) {
  const std::lock_guard lock(_mutex);
  _insertDatagram.bind(0, datagram.time)
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
  datagram.id = _database->lastInsertId();
  ++_counts.datagrams;
  prune();
  changed();
}

// Takes away a tenth at a time, so that most additions need not look.
void Inbox::prune() {
  if (_counts.datagrams > _limits.maximumDatagrams) {
    const auto share = static_cast<std::int64_t>(_limits.maximumDatagrams / 10 + 1);
    _database->prepare("DELETE FROM datagrams WHERE id IN (SELECT id FROM datagrams ORDER BY id LIMIT ?)")
        .bind(0, share)
        .step();
    _counts.datagrams = singleNumber(_database->prepare("SELECT COUNT(*) FROM datagrams"));
  }
  while (_counts.requests > _limits.maximumRequests || (_bytes > _limits.maximumBytes && _counts.requests > 1)) {
    const auto share = static_cast<std::int64_t>(_counts.requests / 10 + 1);
    Statement bound = _database->prepare("SELECT MAX(id) FROM (SELECT id FROM requests ORDER BY id LIMIT ?)");
    bound.bind(0, share);
    const auto last = static_cast<std::int64_t>(singleNumber(std::move(bound)));
    _database->prepare("DELETE FROM events WHERE request <= ?").bind(0, last).step();
    _database->prepare("DELETE FROM requests WHERE id <= ?").bind(0, last).step();
    _counts.requests = singleNumber(_database->prepare("SELECT COUNT(*) FROM requests"));
    _counts.events = singleNumber(_database->prepare("SELECT COUNT(*) FROM events"));
    _bytes = singleNumber(
        _database->prepare("SELECT TOTAL(LENGTH(raw_body)) + TOTAL(LENGTH(COALESCE(body, ''))) FROM requests"));
  }
}

void Inbox::clear() {
  const std::lock_guard lock(_mutex);
  _database->run("DELETE FROM requests; DELETE FROM events; DELETE FROM datagrams;");
  _counts = {};
  _bytes = 0;
  changed();
}

std::int64_t Inbox::nextExchange() {
  const std::lock_guard lock(_mutex);
  return ++_lastExchange;
}

std::vector<ReceivedRequest> Inbox::readRequests(Statement& statement) const {
  std::vector<ReceivedRequest> found;
  while (statement.step()) {
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
    found.push_back(std::move(request));
  }
  return found;
}

std::vector<ReceivedRequest> Inbox::requests(const InboxQuery& query) const {
  const std::string_view kind = query.kind ? requestKindText(*query.kind) : std::string_view();
  const std::lock_guard lock(_mutex);
  Statement statement = _database->prepare("SELECT " + std::string(kRequestColumns) +
                                           " FROM requests WHERE id > ?1 AND (?2 IS NULL OR path = ?2) AND "
                                           "(?3 IS NULL OR kind = ?3) ORDER BY id LIMIT ?4");
  statement.bind(0, query.since).bind(3, limitOf(query));
  if (query.path) statement.bindText(1, *query.path);
  if (query.kind) statement.bindText(2, kind);
  return readRequests(statement);
}

std::optional<ReceivedRequest> Inbox::request(std::int64_t id) const {
  const std::lock_guard lock(_mutex);
  Statement statement = _database->prepare("SELECT " + std::string(kRequestColumns) + " FROM requests WHERE id = ?");
  statement.bind(0, id);
  auto found = readRequests(statement);
  if (found.empty()) return std::nullopt;
  return std::move(found.front());
}

std::optional<ReceivedRequest> Inbox::requestOfExchange(std::int64_t exchange) const {
  const std::lock_guard lock(_mutex);
  Statement statement =
      _database->prepare("SELECT " + std::string(kRequestColumns) + " FROM requests WHERE exchange = ?");
  statement.bind(0, exchange);
  auto found = readRequests(statement);
  if (found.empty()) return std::nullopt;
  return std::move(found.front());
}

std::vector<ReceivedEvent> Inbox::events(const InboxQuery& query) const {
  std::vector<ReceivedEvent> found;
  const std::lock_guard lock(_mutex);
  Statement statement = _database->prepare(
      "SELECT events.id, request, position, path, secure, status, event FROM events JOIN requests ON request = "
      "requests.id "
      "WHERE events.id > ?1 AND (?2 IS NULL OR path = ?2) ORDER BY events.id LIMIT ?3");
  statement.bind(0, query.since).bind(2, limitOf(query));
  if (query.path) statement.bindText(1, *query.path);
  while (statement.step()) {
    ReceivedEvent event;
    event.id = statement.integer(0);
    event.request = statement.integer(1);
    event.position = statement.integer(2);
    event.path = statement.bytes(3);
    event.secure = statement.integer(4) != 0;
    event.status = static_cast<int>(statement.integer(5));
    auto parsed = platform::parseJson(statement.bytes(6));
    if (parsed && parsed->dictionary() != nullptr) event.event = std::move(*parsed->dictionary());
    found.push_back(std::move(event));
  }
  return found;
}

std::vector<ReceivedDatagram> Inbox::datagrams(const InboxQuery& query) const {
  std::vector<ReceivedDatagram> found;
  const std::lock_guard lock(_mutex);
  Statement statement = _database->prepare(
      "SELECT id, time, client, bytes, well_formed, version_major, client_type, time_seconds, milliseconds, "
      "session_id, "
      "client_version, method, resp_code, device_id, event_number, reliable, explicit_server, text, acknowledgements "
      "FROM datagrams WHERE id > ?1 ORDER BY id LIMIT ?2");
  statement.bind(0, query.since).bind(1, limitOf(query));
  while (statement.step()) {
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
    found.push_back(std::move(datagram));
  }
  return found;
}

InboxCounts Inbox::counts() const {
  const std::lock_guard lock(_mutex);
  return _counts;
}

void Inbox::changed() {
  ++_version;
  _condition.notify_all();
}

bool Inbox::waitUntil(const std::function<bool()>& predicate, std::chrono::milliseconds limit) const {
  const auto end = std::chrono::steady_clock::now() + limit;
  std::unique_lock lock(_mutex);
  while (true) {
    const std::uint64_t seen = _version;
    lock.unlock();
    if (predicate()) return true;
    lock.lock();
    if (!_condition.wait_until(lock, end, [&] { return _version != seen; })) return false;
  }
}

bool Inbox::waitForCounts(const InboxCounts& least, std::chrono::milliseconds limit) const {
  const auto reached = [&] {
    return _counts.requests >= least.requests && _counts.events >= least.events && _counts.datagrams >= least.datagrams;
  };
  std::unique_lock lock(_mutex);
  return _condition.wait_for(lock, limit, reached);
}

}  // namespace orvanta::collector
