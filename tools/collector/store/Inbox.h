#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "tools/collector/store/Database.h"
#include "tools/collector/store/ReceivedRecords.h"

namespace orvanta::collector {

// Beyond the number or the bytes, the oldest requests are deleted with their events. Datagrams have their own number.
struct InboxLimits {
  std::size_t maximumRequests = 200'000;
  std::size_t maximumBytes = 1U << 30U;  // of bodies
  std::size_t maximumDatagrams = 1'000'000;
};

// Selects records; all of them by default.
struct InboxQuery {
  std::int64_t since = 0;  // only records with a greater id
  std::size_t limit = 1'000'000;
  std::optional<std::string> path;  // requests and events
  std::optional<RequestKind> kind;  // requests
};

struct InboxCounts {
  std::size_t requests = 0;
  std::size_t events = 0;
  std::size_t datagrams = 0;
};

// Everything that the collector has received, kept in a SQLite file, in the order in which it was complete.
// Owned by the collector. Thread-safe: the relays' and the dashboard server's threads add, the HTTP library's read.
class Inbox {
 public:
  // Keeps the records that the file already holds. The failure names the file.
  static Result<std::unique_ptr<Inbox>> open(const std::string& databaseFile, const InboxLimits& limits);

  // Stores the request, and for a post of events each event of its body; sets the id. Then deletes the oldest records
  // beyond the limits.
  void add(ReceivedRequest& request);
  void add(ReceivedDatagram& datagram);
  void clear();
  // The number for the next exchange. Numbers go on across restarts.
  std::int64_t nextExchange();

  std::vector<ReceivedRequest> requests(const InboxQuery& query = {}) const;
  std::optional<ReceivedRequest> request(std::int64_t id) const;
  std::optional<ReceivedRequest> requestOfExchange(std::int64_t exchange) const;
  std::vector<ReceivedEvent> events(const InboxQuery& query = {}) const;
  std::vector<ReceivedDatagram> datagrams(const InboxQuery& query = {}) const;
  InboxCounts counts() const;

  // Each waits until its condition holds and returns false if the time is over first. waitUntil() evaluates the
  // predicate again after each change, without the lock held, so that it may query the inbox.
  bool waitUntil(const std::function<bool()>& predicate, std::chrono::milliseconds limit) const;
  bool waitForCounts(const InboxCounts& least, std::chrono::milliseconds limit) const;

 private:
  explicit Inbox(std::unique_ptr<Database> database, const InboxLimits& limits);
  void addEvents(const ReceivedRequest& request) REQUIRES(_mutex);
  void prune() REQUIRES(_mutex);
  void changed() REQUIRES(_mutex);
  void countRequests() REQUIRES(_mutex);
  bool reached(const InboxCounts& least) const REQUIRES(_mutex);
  Statement select(std::string_view columns, std::string_view which) const REQUIRES(_mutex);
  std::optional<ReceivedRequest> firstRequest(std::string_view where, std::int64_t number) const;

  const InboxLimits _limits;
  mutable platform::Mutex _mutex;
  mutable platform::Condition _changed;
  const std::unique_ptr<Database> _database POINTEE_GUARDED_BY(_mutex);
  Statement _insertRequest GUARDED_BY(_mutex);
  Statement _insertEvent GUARDED_BY(_mutex);
  Statement _insertDatagram GUARDED_BY(_mutex);
  InboxCounts _counts GUARDED_BY(_mutex);
  std::size_t _bytes GUARDED_BY(_mutex) = 0;  // of bodies, as InboxLimits counts them
  std::int64_t _lastExchange GUARDED_BY(_mutex) = 0;
  std::uint64_t _version GUARDED_BY(_mutex) = 0;  // counts changes
};

}  // namespace orvanta::collector
