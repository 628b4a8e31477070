#include "tools/collector/store/Inbox.h"

#include <algorithm>
#include <utility>

#include "platform/codec/Json.h"
#include "tools/collector/store/InboxRows.h"

namespace orvanta::collector {

namespace {

std::int64_t limitOf(const InboxQuery& query) {
  return static_cast<std::int64_t>(query.limit);
}

std::size_t singleNumber(Statement statement) {
  return statement.step() ? static_cast<std::size_t>(std::max<std::int64_t>(statement.integer(0), 0)) : 0;
}

// Reads the remaining rows of the statement.
template <class Record>
std::vector<Record> readAll(Statement& statement, Record (*read)(const Statement&)) {
  std::vector<Record> found;
  while (statement.step()) found.push_back(read(statement));
  return found;
}

}  // namespace

Result<std::unique_ptr<Inbox>> Inbox::open(const std::string& databaseFile, const InboxLimits& limits) {
  auto database = Database::open(databaseFile, rows::kSchema);
  if (!database) return Failure{database.error()};
  return std::unique_ptr<Inbox>(new Inbox(std::move(database.value()), limits));
}

Inbox::Inbox(std::unique_ptr<Database> database, const InboxLimits& limits)
    : _limits(limits),
      _database(std::move(database)),
      _insertRequest(_database->prepare(rows::kInsertRequest)),
      _insertEvent(_database->prepare(rows::kInsertEvent)),
      _insertDatagram(_database->prepare(rows::kInsertDatagram)) {
  countRequests();
  _counts.datagrams = singleNumber(_database->prepare("SELECT COUNT(*) FROM datagrams"));
  _lastExchange =
      static_cast<std::int64_t>(singleNumber(_database->prepare("SELECT COALESCE(MAX(exchange), 0) FROM requests")));
}

void Inbox::countRequests() {
  _counts.requests = singleNumber(_database->prepare("SELECT COUNT(*) FROM requests"));
  _counts.events = singleNumber(_database->prepare("SELECT COUNT(*) FROM events"));
  _bytes = singleNumber(
      _database->prepare("SELECT TOTAL(LENGTH(raw_body)) + TOTAL(LENGTH(COALESCE(body, ''))) FROM requests"));
}

void Inbox::add(ReceivedRequest& request) {
  const platform::MutexLock lock(_mutex);
  _database->run("BEGIN");
  rows::insert(_insertRequest, request);
  request.id = _database->lastInsertId();
  _bytes += request.rawBody.size();
  if (request.body != request.rawBody) _bytes += request.body.size();
  ++_counts.requests;
  if (request.kind == RequestKind::events) addEvents(request);
  prune();
  _database->run("COMMIT");
  changed();
}

void Inbox::addEvents(const ReceivedRequest& request) {
  const Array* list = request.json ? request.json->dictionary()->array("events") : nullptr;
  if (list == nullptr) return;
  std::int64_t position = 0;
  for (const Value& event : *list) {
    const std::string text = platform::writeJson(event);
    _insertEvent.bind(0, request.id).bind(1, position++).bindText(2, text).step();
    ++_counts.events;
  }
}

void Inbox::add(ReceivedDatagram& datagram) {
  const platform::MutexLock lock(_mutex);
  rows::insert(_insertDatagram, datagram);
  datagram.id = _database->lastInsertId();
  ++_counts.datagrams;
  prune();
  changed();
}

// Deletes a tenth at a time, so that most additions find nothing to delete.
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
    countRequests();
  }
}

void Inbox::clear() {
  const platform::MutexLock lock(_mutex);
  _database->run("DELETE FROM requests; DELETE FROM events; DELETE FROM datagrams;");
  _counts = {};
  _bytes = 0;
  changed();
}

std::int64_t Inbox::nextExchange() {
  const platform::MutexLock lock(_mutex);
  return ++_lastExchange;
}

std::vector<ReceivedRequest> Inbox::requests(const InboxQuery& query) const {
  const std::string_view kind = query.kind ? requestKindText(*query.kind) : std::string_view();
  const platform::MutexLock lock(_mutex);
  Statement statement = select(rows::kSelectRequests,
                               "WHERE id > ?1 AND (?2 IS NULL OR path = ?2) AND (?3 IS NULL OR kind = ?3) "
                               "ORDER BY id LIMIT ?4");
  statement.bind(0, query.since).bind(3, limitOf(query));
  if (query.path) statement.bindText(1, *query.path);
  if (query.kind) statement.bindText(2, kind);
  return readAll(statement, rows::readRequest);
}

std::optional<ReceivedRequest> Inbox::request(std::int64_t id) const {
  return firstRequest("WHERE id = ?", id);
}

std::optional<ReceivedRequest> Inbox::requestOfExchange(std::int64_t exchange) const {
  return firstRequest("WHERE exchange = ?", exchange);
}

std::optional<ReceivedRequest> Inbox::firstRequest(std::string_view where, std::int64_t number) const {
  const platform::MutexLock lock(_mutex);
  Statement statement = select(rows::kSelectRequests, where);
  statement.bind(0, number);
  if (!statement.step()) return std::nullopt;
  return rows::readRequest(statement);
}

Statement Inbox::select(std::string_view columns, std::string_view which) const {
  return _database->prepare(std::string(columns).append(which));
}

std::vector<ReceivedEvent> Inbox::events(const InboxQuery& query) const {
  const platform::MutexLock lock(_mutex);
  Statement statement =
      select(rows::kSelectEvents, "WHERE events.id > ?1 AND (?2 IS NULL OR path = ?2) ORDER BY events.id LIMIT ?3");
  statement.bind(0, query.since).bind(2, limitOf(query));
  if (query.path) statement.bindText(1, *query.path);
  return readAll(statement, rows::readEvent);
}

std::vector<ReceivedDatagram> Inbox::datagrams(const InboxQuery& query) const {
  const platform::MutexLock lock(_mutex);
  Statement statement = select(rows::kSelectDatagrams, "WHERE id > ?1 ORDER BY id LIMIT ?2");
  statement.bind(0, query.since).bind(1, limitOf(query));
  return readAll(statement, rows::readDatagram);
}

InboxCounts Inbox::counts() const {
  const platform::MutexLock lock(_mutex);
  return _counts;
}

void Inbox::changed() {
  ++_version;
  _changed.notifyAll();
}

bool Inbox::waitUntil(const std::function<bool()>& predicate, std::chrono::milliseconds limit) const {
  const auto end = std::chrono::steady_clock::now() + limit;
  platform::MutexLock lock(_mutex);
  while (true) {
    const std::uint64_t seen = _version;
    lock.unlock();
    if (predicate()) return true;
    lock.lock();
    while (_version == seen) {
      if (!_changed.waitUntil(lock, end) && _version == seen) return false;
    }
  }
}

bool Inbox::reached(const InboxCounts& least) const {
  return _counts.requests >= least.requests && _counts.events >= least.events && _counts.datagrams >= least.datagrams;
}

bool Inbox::waitForCounts(const InboxCounts& least, std::chrono::milliseconds limit) const {
  const auto end = std::chrono::steady_clock::now() + limit;
  platform::MutexLock lock(_mutex);
  while (!reached(least)) {
    if (!_changed.waitUntil(lock, end)) return reached(least);
  }
  return true;
}

}  // namespace orvanta::collector
