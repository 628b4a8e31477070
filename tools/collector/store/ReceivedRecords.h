#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "interface/Values.h"
#include "tools/collector/wire/HttpMessage.h"

namespace orvanta::collector {

// The purpose of a request, by its method and path.
enum class RequestKind { storebag, events, logData, upload, other };
std::string_view requestKindText(RequestKind kind);
std::optional<RequestKind> requestKindFromText(std::string_view text);

// One HTTP request as it stood on the wire, and how it was answered.
struct ReceivedRequest {
  std::int64_t id = 0;        // in the order of storing; 0 until stored
  std::int64_t exchange = 0;  // in the order of arrival
  double time = 0;            // seconds since 1970, when the request was complete
  std::string client;         // address:port
  bool secure = false;
  RequestKind kind = RequestKind::other;
  std::string method;
  std::string target;  // path and query as sent
  std::string path;    // percent-decoded, without the query
  HeaderFields headers;
  std::string rawBody;
  std::string body;  // decompressed; the same as rawBody if that was not compressed
  // Of a post of events: the body as JSON; null if it is damaged. Not stored.
  std::shared_ptr<const Value> json;
  std::string damage;  // why the body cannot be used; empty if it can. Not stored.
  std::string note;    // what was wrong with the body, or what was done to the answer; mostly empty
  int status = 0;      // of the answer; 0 if there was no answer

  const std::string* header(std::string_view name) const { return findHeader(headers, name); }
  // Returns the value of a query parameter, percent-decoded; nullopt if it is absent.
  std::optional<std::string> parameter(std::string_view name) const;
};

// One event of a post.
struct ReceivedEvent {
  std::int64_t id = 0;
  std::int64_t request = 0;   // ReceivedRequest::id
  std::int64_t position = 0;  // within the post
  std::string path;           // of the post
  bool secure = false;
  int status = 0;    // of the post's answer
  Dictionary event;  // as posted
};

// One dashboard datagram.
struct ReceivedDatagram {
  std::int64_t id = 0;
  double time = 0;
  std::string client;
  std::string bytes;
  bool wellFormed = false;  // the fields below are set only then
  std::uint8_t versionMajor = 0;
  std::uint8_t clientType = 0;
  std::uint32_t timeSeconds = 0;
  std::uint16_t milliseconds = 0;
  std::uint32_t sessionID = 0;
  std::uint16_t clientVersion = 0;
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::string deviceID;
  std::uint16_t eventNumber = 0;
  bool reliable = false;
  bool explicitServer = false;
  std::string text;
  std::int64_t acknowledgements = 0;  // sent for it; counts copies but not forged ones
};

// The records as JSON, for readers of the collector's URLs. Headers are pairs, in their order on the wire. A body is
// parsed JSON under "json", else "text", else (not UTF-8) "base64"; a long one is only named by "bodyURL".
Dictionary listRequest(const ReceivedRequest& request);
Dictionary listEvent(const ReceivedEvent& event);
Dictionary listDatagram(const ReceivedDatagram& datagram);
// A file upload: its name, description and numbers from the query, and where its bytes are.
Dictionary listUpload(const ReceivedRequest& request);
// A log-data upload: the archive as JSON.
Dictionary listLogData(const ReceivedRequest& request);

}  // namespace orvanta::collector
