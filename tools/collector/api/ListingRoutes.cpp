#include <fmt/format.h>
#include <httplib.h>

#include <charconv>
#include <optional>
#include <utility>

#include "platform/core/WholeFile.h"
#include "tools/collector/api/ApiServer.h"
#include "tools/collector/store/ReceivedRecords.h"

// The URLs that list what has been received.

namespace orvanta::collector {

using httplib::Request;
using httplib::Response;

namespace {

constexpr std::int64_t kUsualLimit = 1000;
constexpr std::int64_t kHighestLimit = 100'000;
constexpr std::size_t kMaximumFileBytes = 1U << 20U;  // certificates and keys take a few KiB

std::optional<std::int64_t> wholeNumber(const std::string& text) {
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error != std::errc() || end != text.data() + text.size() || number < 0) return std::nullopt;
  return number;
}

// Returns nullopt, and answers 400 with the reason, if a parameter is wrong or unknown.
std::optional<InboxQuery> readQuery(const Request& request, Response& response) {
  InboxQuery query;
  query.limit = kUsualLimit;
  for (const auto& [name, text] : request.params) {
    const auto number = wholeNumber(text);
    if (name == "since" && number) {
      query.since = *number;
    } else if (name == "limit" && number && *number <= kHighestLimit) {
      query.limit = static_cast<std::size_t>(*number);
    } else if (name == "path") {
      query.path = text;
    } else if (name == "kind" && requestKindFromText(text)) {
      query.kind = requestKindFromText(text);
    } else {
      answerError(response, 400, fmt::format("no such parameter or value: {}={}", name, text));
      return std::nullopt;
    }
  }
  return query;
}

template <class Records, class List>
void answerRecords(Response& response, const char* name, const Records& records, List list) {
  Array listed;
  listed.reserve(records.size());
  for (const auto& record : records) listed.emplace_back(list(record));
  answerJson(response, Dictionary{{name, std::move(listed)}});
}

void answerRequestsOfKind(const Request& request, Response& response, const ApiContext& context, const char* name,
                          std::optional<RequestKind> kind, Dictionary (*list)(const ReceivedRequest&)) {
  auto query = readQuery(request, response);
  if (!query) return;
  if (kind) query->kind = kind;
  answerRecords(response, name, context.inbox.requests(*query), list);
}

void answerBytes(Response& response, const std::optional<ReceivedRequest>& found, std::string ReceivedRequest::*bytes) {
  if (!found) return answerError(response, 404, "no such record");
  response.set_content((*found).*bytes, "application/octet-stream");
}

void answerFile(Response& response, const std::string& path, const char* type) {
  const auto file = platform::readWholeFile(path, kMaximumFileBytes);
  if (!file) return answerError(response, 404, file.error());
  response.set_content(*file, type);
}

std::int64_t numberIn(const Request& request) {
  return wholeNumber(request.matches[1]).value_or(0);
}

void answerSummary(Response& response, const ApiContext& context) {
  const InboxCounts counts = context.inbox.counts();
  answerJson(response,
             Dictionary{{"requests", static_cast<std::int64_t>(counts.requests)},
                        {"events", static_cast<std::int64_t>(counts.events)},
                        {"datagrams", static_cast<std::int64_t>(counts.datagrams)},
                        {"lists", Array{"/requests", "/events", "/datagrams", "/uploads", "/logdata", "/control"}},
                        {"storebags", context.baseURL() + "/storebags"}});
}

void addRecordRoutes(httplib::Server& server, const ApiContext& context) {
  server.Get(R"(/requests/(\d+))", [&context](const Request& request, Response& response) {
    const auto found = context.inbox.request(numberIn(request));
    found ? answerJson(response, listRequest(*found)) : answerError(response, 404, "no such record");
  });
  server.Get(R"(/requests/(\d+)/body)", [&context](const Request& request, Response& response) {
    answerBytes(response, context.inbox.request(numberIn(request)), &ReceivedRequest::body);
  });
  server.Get(R"(/requests/(\d+)/raw)", [&context](const Request& request, Response& response) {
    answerBytes(response, context.inbox.request(numberIn(request)), &ReceivedRequest::rawBody);
  });
  server.Get(R"(/uploads/(\d+))", [&context](const Request& request, Response& response) {
    answerBytes(response, context.inbox.request(numberIn(request)), &ReceivedRequest::body);
  });
  // Log data is named by its exchange, whose number is known when the location is given to the client.
  server.Get(R"(/logdata/(\d+))", [&context](const Request& request, Response& response) {
    answerBytes(response, context.inbox.requestOfExchange(numberIn(request)), &ReceivedRequest::body);
  });
}

}  // namespace

void addListingRoutes(httplib::Server& server, const ApiContext& context) {
  server.Get("/", [&context](const Request&, Response& response) { answerSummary(response, context); });
  server.Get("/ca.pem", [&context](const Request&, Response& response) {
    answerFile(response, context.caFile, "application/x-pem-file");
  });
  server.Get("/publicKey.der", [&context](const Request&, Response& response) {
    answerFile(response, context.storebags.publicKeyFile(), "application/octet-stream");
  });
  server.Get("/requests", [&context](const Request& request, Response& response) {
    answerRequestsOfKind(request, response, context, "requests", std::nullopt, listRequest);
  });
  server.Get("/uploads", [&context](const Request& request, Response& response) {
    answerRequestsOfKind(request, response, context, "uploads", RequestKind::upload, listUpload);
  });
  server.Get("/logdata", [&context](const Request& request, Response& response) {
    answerRequestsOfKind(request, response, context, "logdata", RequestKind::logData, listLogData);
  });
  server.Get("/events", [&context](const Request& request, Response& response) {
    if (const auto query = readQuery(request, response)) {
      answerRecords(response, "events", context.inbox.events(*query), listEvent);
    }
  });
  server.Get("/datagrams", [&context](const Request& request, Response& response) {
    if (const auto query = readQuery(request, response)) {
      answerRecords(response, "datagrams", context.inbox.datagrams(*query), listDatagram);
    }
  });
  server.Delete("/requests", [&context](const Request&, Response& response) {
    context.inbox.clear();
    response.status = 204;
  });
  addRecordRoutes(server, context);
}

}  // namespace orvanta::collector
