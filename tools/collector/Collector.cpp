#include "tools/collector/Collector.h"

#include <fmt/format.h>

#include <filesystem>
#include <utility>

#include "tools/collector/api/ApiServer.h"
#include "tools/collector/servers/BackendConnections.h"
#include "tools/collector/servers/DashboardServer.h"
#include "tools/collector/servers/Relay.h"
#include "tools/collector/wire/Tls.h"

namespace orvanta::collector {

namespace {

// The parts in the order in which they need each other; destruction goes backwards.
class WholeCollector final : public Collector {
 public:
  explicit WholeCollector(CollectorOptions options) : _options(std::move(options)) {}
  ~WholeCollector() override { WholeCollector::stop(); }

  // A failure says which part could not be made.
  Result<void> open();
  void stop() override;

  const std::string& directory() const override { return _options.directory; }
  std::string databaseFile() const override { return _options.directory + "/collector.sqlite"; }
  std::string caFile() const override { return _options.directory + "/ca.pem"; }
  std::string publicKeyFile() const override { return _storebags->publicKeyFile(); }
  std::string publicKeyPkcs1File() const override { return _storebags->publicKeyPkcs1File(); }
  std::uint16_t httpPort() const override { return _http->port(); }
  std::uint16_t httpsPort() const override { return _https->port(); }
  std::uint16_t dashboardPort() const override { return _dashboard->port(); }

  void setBehaviour(const std::string& path, PathBehaviour behaviour) override {
    _behaviours.set(path, std::move(behaviour));
  }
  void clearBehaviours() override { _behaviours.clearAll(); }
  void setAcknowledgements(const AcknowledgementSettings& settings) override { _dashboard->setSettings(settings); }
  using Collector::setBag;
  void setBag(const std::string& name, Value inner) override { _storebags->setBag(name, std::move(inner)); }
  Inbox& inbox() override { return *_inbox; }

 private:
  Result<void> openServers();

  const CollectorOptions _options;
  Behaviours _behaviours;
  Exchanges _exchanges;
  // Set by open(), constant afterwards.
  std::unique_ptr<Inbox> _inbox;
  std::unique_ptr<StorebagServer> _storebags;
  std::unique_ptr<DashboardServer> _dashboard;
  std::unique_ptr<ApiServer> _api;
  std::unique_ptr<BackendConnections> _backend;
  std::unique_ptr<Relay> _http;
  std::unique_ptr<Relay> _https;
};

Result<void> WholeCollector::open() {
  if (_options.directory.empty()) return Failure{"the collector needs a directory"};
  std::error_code error;
  std::filesystem::create_directories(_options.directory, error);
  if (error) return Failure{fmt::format("cannot make {}: {}", _options.directory, error.message())};
  auto inbox = Inbox::open(databaseFile(), _options.inbox);
  if (!inbox) return Failure{inbox.error()};
  _inbox = std::move(inbox.value());
  auto storebags = StorebagServer::make(_options.directory);
  if (!storebags) return Failure{storebags.error()};
  _storebags = std::move(storebags.value());
  _storebags->setSettings(_options.storebag);
  return openServers();
}

Result<void> WholeCollector::openServers() {
  auto authority = CertificateAuthority::readOrMake(_options.directory);
  if (!authority) return Failure{authority.error()};
  const auto identity = authority->issueServerIdentity(_options.certificateFlaw);
  if (!identity) return Failure{identity.error()};
  auto tls = TlsServer::make(identity.value());
  if (!tls) return Failure{tls.error()};

  auto dashboard = DashboardServer::start(_options.address, _options.dashboardPort, *_inbox);
  if (!dashboard) return Failure{dashboard.error()};
  _dashboard = std::move(dashboard.value());
  auto api = ApiServer::start({*_inbox, _exchanges, _behaviours, *_storebags, *_dashboard, [this] { return httpURL(); },
                               authority->certificateFile()});
  if (!api) return Failure{api.error()};
  _api = std::move(api.value());
  _backend = std::make_unique<BackendConnections>(_api->port());

  const RelayContext context{_behaviours, *_inbox, _exchanges, *_backend, _options.maximumBodyBytes, _options.observer};
  auto https = Relay::listen(_options.address, _options.httpsPort, std::move(tls.value()), context);
  if (!https) return Failure{https.error()};
  _https = std::move(https.value());
  auto http = Relay::listen(_options.address, _options.httpPort, nullptr, context);
  if (!http) return Failure{http.error()};
  _http = std::move(http.value());
  // The first answer may need the placeholders: they are set before the relays begin.
  _storebags->setPlaceholders({httpURL(), httpsURL(), _dashboard->port()});
  _http->begin();
  _https->begin();
  return {};
}

void WholeCollector::stop() {
  if (_http) _http->stop();
  if (_https) _https->stop();
  // The library ends once no kept connection holds one of its threads.
  if (_backend) _backend->closeIdle();
  _api.reset();
  if (_dashboard) _dashboard->stop();
}

}  // namespace

Result<std::unique_ptr<Collector>> Collector::start(CollectorOptions options) {
  auto collector = std::make_unique<WholeCollector>(std::move(options));
  if (const auto opened = collector->open(); !opened) return Failure{opened.error()};
  return std::unique_ptr<Collector>(std::move(collector));
}

std::string Collector::httpURL(const std::string& path) const {
  return fmt::format("http://127.0.0.1:{}{}", httpPort(), path);
}

std::string Collector::httpsURL(const std::string& path) const {
  return fmt::format("https://localhost:{}{}", httpsPort(), path);
}

void Collector::setStatus(const std::string& path, int status) {
  PathBehaviour behaviour;
  behaviour.status = status;
  setBehaviour(path, std::move(behaviour));
}

void Collector::setStatus(const std::string& path, int status, std::size_t times) {
  PathBehaviour behaviour;
  behaviour.status = status;
  behaviour.times = times;
  setBehaviour(path, std::move(behaviour));
}

void Collector::setFault(const std::string& path, ConnectionFault fault) {
  PathBehaviour behaviour;
  behaviour.fault = fault;
  setBehaviour(path, std::move(behaviour));
}

void Collector::setSection(Dictionary section) {
  setBag(Dictionary{{"version", "test"},
                    {"development", section},
                    {"kovalt_internal", section},
                    {"seed", section},
                    {"release", std::move(section)}});
}

std::vector<ReceivedRequest> Collector::requests(RequestKind kind) {
  InboxQuery query;
  query.kind = kind;
  return inbox().requests(query);
}

bool Collector::waitForRequests(std::size_t count, std::chrono::milliseconds limit) {
  return inbox().waitForCounts({count, 0, 0}, limit);
}

bool Collector::waitForRequests(RequestKind kind, std::size_t count, std::chrono::milliseconds limit) {
  return inbox().waitUntil([&] { return requests(kind).size() >= count; }, limit);
}

bool Collector::waitForEvents(std::size_t count, std::chrono::milliseconds limit) {
  return inbox().waitForCounts({0, count, 0}, limit);
}

bool Collector::waitForDatagrams(std::size_t count, std::chrono::milliseconds limit) {
  return inbox().waitForCounts({0, 0, count}, limit);
}

}  // namespace orvanta::collector
