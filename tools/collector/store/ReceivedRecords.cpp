#include "tools/collector/store/ReceivedRecords.h"

#include <fmt/format.h>

#include <algorithm>
#include <array>
#include <span>
#include <utility>

#include "backends/dashboard/DashboardDatagram.h"
#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"

namespace orvanta::collector {

namespace {

constexpr std::array<std::pair<RequestKind, std::string_view>, 5> kKindTexts{{{RequestKind::storebag, "storebag"},
                                                                              {RequestKind::events, "events"},
                                                                              {RequestKind::logData, "logdata"},
                                                                              {RequestKind::upload, "upload"},
                                                                              {RequestKind::other, "other"}}};

// Longer bodies are fetched one by one.
constexpr std::size_t kMaximumListedBody = 256U << 10U;

std::span<const std::uint8_t> bytesOf(const std::string& text) {
  return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

void setBody(Dictionary& listed, const ReceivedRequest& request) {
  listed.set("bodyURL", fmt::format("/requests/{}/body", request.id));
  if (request.body.empty() || request.body.size() > kMaximumListedBody) return;
  if (request.kind == RequestKind::upload || request.kind == RequestKind::logData) return;
  if (auto json = platform::parseJson(request.body)) {
    listed.set("json", std::move(json.value()));
  } else if (platform::isValidUtf8(request.body)) {
    listed.set("text", request.body);
  } else {
    listed.set("base64", platform::encodeBase64(bytesOf(request.body)));
  }
}

void setParameters(Dictionary& listed, const ReceivedRequest& request) {
  for (const char* name : {"filename", "description", "uuid", "sequence"}) {
    if (auto value = request.parameter(name)) listed.set(name, std::move(*value));
  }
}

}  // namespace

std::string_view requestKindText(RequestKind kind) {
  return std::find_if(kKindTexts.begin(), kKindTexts.end(), [&](const auto& row) { return row.first == kind; })->second;
}

std::optional<RequestKind> requestKindFromText(std::string_view text) {
  const auto* const row =
      std::find_if(kKindTexts.begin(), kKindTexts.end(), [&](const auto& entry) { return entry.second == text; });
  if (row == kKindTexts.end()) return std::nullopt;
  return row->first;
}

std::optional<std::string> ReceivedRequest::parameter(std::string_view name) const {
  return queryParameter(target, name);
}

Dictionary listRequest(const ReceivedRequest& request) {
  Array headers;
  for (const auto& [name, value] : request.headers) headers.emplace_back(Array{name, value});
  Dictionary listed{{"id", request.id},
                    {"time", request.time},
                    {"client", request.client},
                    {"secure", request.secure},
                    {"kind", std::string(requestKindText(request.kind))},
                    {"method", request.method},
                    {"target", request.target},
                    {"path", request.path},
                    {"headers", std::move(headers)},
                    {"rawBytes", static_cast<std::int64_t>(request.rawBody.size())},
                    {"bodyBytes", static_cast<std::int64_t>(request.body.size())},
                    {"status", request.status}};
  if (!request.note.empty()) listed.set("note", request.note);
  setBody(listed, request);
  return listed;
}

Dictionary listEvent(const ReceivedEvent& event) {
  return Dictionary{{"id", event.id},      {"request", event.request}, {"position", event.position},
                    {"path", event.path},  {"secure", event.secure},   {"status", event.status},
                    {"event", event.event}};
}

Dictionary listDatagram(const ReceivedDatagram& datagram) {
  Dictionary listed{{"id", datagram.id},
                    {"time", datagram.time},
                    {"client", datagram.client},
                    {"bytes", static_cast<std::int64_t>(datagram.bytes.size())},
                    {"wellFormed", datagram.wellFormed},
                    {"acknowledgements", datagram.acknowledgements}};
  if (!datagram.wellFormed) {
    listed.set("base64", platform::encodeBase64(bytesOf(datagram.bytes)));
    return listed;
  }
  listed.merge(Dictionary{{"versionMajor", int{datagram.versionMajor}},
                          {"clientType", int{datagram.clientType}},
                          {"timeSeconds", static_cast<std::int64_t>(datagram.timeSeconds)},
                          {"milliseconds", int{datagram.milliseconds}},
                          {"sessionID", static_cast<std::int64_t>(datagram.sessionID)},
                          {"clientVersion", int{datagram.clientVersion}},
                          {"method", int{datagram.method}},
                          {"respCode", int{datagram.respCode}},
                          {"deviceID", datagram.deviceID},
                          {"eventNumber", int{datagram.eventNumber}},
                          {"reliable", datagram.reliable},
                          {"explicitServer", datagram.explicitServer},
                          {"text", datagram.text}});
  Dictionary values;
  for (auto& [key, value] : parseDashboardText(datagram.text)) values.set(key, std::move(value));
  listed.set("values", std::move(values));
  return listed;
}

Dictionary listUpload(const ReceivedRequest& request) {
  Dictionary listed{{"id", request.id},
                    {"time", request.time},
                    {"rawBytes", static_cast<std::int64_t>(request.rawBody.size())},
                    {"fileBytes", static_cast<std::int64_t>(request.body.size())},
                    {"status", request.status},
                    {"fileURL", fmt::format("/uploads/{}", request.id)}};
  setParameters(listed, request);
  if (!request.note.empty()) listed.set("note", request.note);
  return listed;
}

Dictionary listLogData(const ReceivedRequest& request) {
  Dictionary listed{{"id", request.id},
                    {"time", request.time},
                    {"bytes", static_cast<std::int64_t>(request.body.size())},
                    {"status", request.status},
                    {"location", fmt::format("/logdata/{}", request.exchange)}};
  if (auto archive = platform::parsePropertyList(bytesOf(request.body))) {
    listed.set("archive", std::move(archive.value()));
  } else {
    listed.set("note", archive.error());
  }
  return listed;
}

}  // namespace orvanta::collector
