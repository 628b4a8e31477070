#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "interface/Values.h"
#include "tools/collector/servers/Behaviours.h"
#include "tools/collector/servers/DashboardServer.h"
#include "tools/collector/servers/StorebagServer.h"
#include "tools/collector/store/Inbox.h"
#include "tools/collector/store/ReceivedRecords.h"
#include "tools/collector/wire/Tls.h"

namespace orvanta::collector {

struct CollectorOptions {
  // Holds keys, certificates, bags and the database; created if missing.
  std::string directory;
  std::string address = "127.0.0.1";
  // 0 takes any free port.
  std::uint16_t httpPort = 0;
  std::uint16_t httpsPort = 0;
  std::uint16_t dashboardPort = 0;
  CertificateFlaw certificateFlaw = CertificateFlaw::none;
  StorebagSettings storebag;
  InboxLimits inbox;
  std::size_t maximumBodyBytes = 64U << 20U;  // of one request; longer ones are answered 413
  // Sees each recorded request, on the collector's threads; may be empty.
  std::function<void(const ReceivedRequest&)> observer;
};

// Every server that a daemon talks to, on one machine: storebag server, event server (http and https), upload and
// log-data server, dashboard server. Records all that comes in. Owned by its program or test; runs on threads of its
// own from start() until stop() or destruction. Thread-safe.
class Collector {
 public:
  // The collector listens when this returns. A failure says which file or port could not be used.
  static Result<std::unique_ptr<Collector>> start(CollectorOptions options);
  virtual ~Collector() = default;
  // Ends all connections and answers nothing more. The records can still be read.
  virtual void stop() = 0;

  // --- Files and addresses ---

  virtual const std::string& directory() const = 0;
  virtual std::string databaseFile() const = 0;
  virtual std::string caFile() const = 0;         // for ORVANTA_CA_FILE
  virtual std::string publicKeyFile() const = 0;  // for the framework directory
  virtual std::string publicKeyPkcs1File() const = 0;
  virtual std::uint16_t httpPort() const = 0;
  virtual std::uint16_t httpsPort() const = 0;
  virtual std::uint16_t dashboardPort() const = 0;
  std::string httpURL(const std::string& path = {}) const;   // http://127.0.0.1:PORT
  std::string httpsURL(const std::string& path = {}) const;  // https://localhost:PORT
  // For the user default "orvanta_storebag_url".
  std::string storebagURL() const { return httpURL("/storebags"); }
  std::string eventsURL(bool secure = true) const { return secure ? httpsURL("/events") : httpURL("/events"); }

  // --- How it answers ---

  // Applies to requests to the path (see Behaviours) from the next one on.
  virtual void setBehaviour(const std::string& path, PathBehaviour behaviour) = 0;
  void setStatus(const std::string& path, int status);
  void setStatus(const std::string& path, int status, std::size_t times);
  void setFault(const std::string& path, ConnectionFault fault);
  virtual void clearBehaviours() = 0;
  virtual void setAcknowledgements(const AcknowledgementSettings& settings) = 0;
  // Serves this inner bag from now on: for one storebag name, or for all that have none of their own. Strings may hold
  // the placeholders "${http}", "${https}" and "${dashboard_port}".
  virtual void setBag(const std::string& name, Value inner) = 0;
  void setBag(Value inner) { setBag("", std::move(inner)); }
  // Serves a bag with this section for every environment.
  void setSection(Dictionary section);

  // --- The records ---

  virtual Inbox& inbox() = 0;
  std::vector<ReceivedRequest> requests(const InboxQuery& query = {}) { return inbox().requests(query); }
  std::vector<ReceivedRequest> requests(RequestKind kind);
  std::vector<ReceivedEvent> events(const InboxQuery& query = {}) { return inbox().events(query); }
  std::vector<ReceivedDatagram> datagrams(const InboxQuery& query = {}) { return inbox().datagrams(query); }
  // Each waits until `count` records exist; returns false if the time is over first. Counting restarts with clear().
  bool waitForRequests(std::size_t count, std::chrono::milliseconds limit);
  bool waitForRequests(RequestKind kind, std::size_t count, std::chrono::milliseconds limit);
  bool waitForEvents(std::size_t count, std::chrono::milliseconds limit);
  bool waitForDatagrams(std::size_t count, std::chrono::milliseconds limit);
  void clear() { inbox().clear(); }
};

}  // namespace orvanta::collector
