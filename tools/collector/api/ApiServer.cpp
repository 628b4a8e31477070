#include "tools/collector/api/ApiServer.h"

#include <httplib.h>

#include <charconv>
#include <limits>
#include <thread>
#include <utility>

#include "platform/codec/Json.h"
#include "tools/collector/servers/BackendConnections.h"

namespace orvanta::collector {

namespace {

class HttplibServer final : public ApiServer {
 public:
  explicit HttplibServer(ApiContext context) : _context(std::move(context)) {
    // Each kept-alive connection holds a thread. The relay has kMaximum of them, and closed ones linger a moment.
    _server.new_task_queue = [] { return new httplib::ThreadPool(2 * BackendConnections::kMaximum); };
    _server.set_keep_alive_max_count(std::numeric_limits<std::size_t>::max());
    _server.set_tcp_nodelay(true);
    addListingRoutes(_server, _context);
    addControlRoutes(_server, _context);
    addReceivingRoutes(_server, _context);
    _port = _server.bind_to_any_port("127.0.0.1");
    if (_port <= 0) return;
    _thread = std::thread([this] { _server.listen_after_bind(); });
    // A stop before the library runs would be lost.
    while (!_server.is_running()) std::this_thread::yield();
  }
  ~HttplibServer() override {
    if (!_thread.joinable()) return;
    _server.stop();
    _thread.join();
  }
  bool listening() const { return _thread.joinable(); }
  std::uint16_t port() const override { return static_cast<std::uint16_t>(_port); }

 private:
  const ApiContext _context;
  httplib::Server _server;
  int _port = 0;
  std::thread _thread;
};

}  // namespace

Result<std::unique_ptr<ApiServer>> ApiServer::start(ApiContext context) {
  auto server = std::make_unique<HttplibServer>(std::move(context));
  if (!server->listening()) return Failure{"the HTTP library cannot listen on the loopback"};
  return std::unique_ptr<ApiServer>(std::move(server));
}

std::shared_ptr<const ReceivedRequest> requestOf(const httplib::Request& request, httplib::Response& response,
                                                 const ApiContext& context) {
  const std::string text = request.get_header_value(Exchanges::kHeader);
  std::int64_t exchange = 0;
  std::from_chars(text.data(), text.data() + text.size(), exchange);
  auto found = context.exchanges.find(exchange);
  if (!found) answerError(response, 403, "the request did not come through the relay");
  return found;
}

void answerJson(httplib::Response& response, const Value& value, int status) {
  response.status = status;
  response.set_content(platform::writeJson(value) + "\n", "application/json");
}

void answerError(httplib::Response& response, int status, const std::string& reason) {
  answerJson(response, Dictionary{{"error", reason}}, status);
}

}  // namespace orvanta::collector
