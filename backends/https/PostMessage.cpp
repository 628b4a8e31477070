#include "backends/https/PostMessage.h"

#include "backends/https/EventField.h"
#include "config/Conversions.h"
#include "platform/codec/Json.h"

namespace orvanta {
namespace {

constexpr std::size_t kEnvelopeBytesAbout = 128;
constexpr std::size_t kEventBytesAbout = 1024;

void appendCompact(std::string& out, double postTime, std::string_view clientID,
                   std::span<const OutgoingEvent> events) {
  out.append("{\"postTime\":");
  platform::appendJsonNumber(out, postTime);
  out.append(",\"clientId\":");
  platform::appendJsonString(out, clientID);
  out.append(",\"events\":[");
  for (const OutgoingEvent& event : events) {
    FieldWriter writer(out, FieldWriter::Form::compact);
    event.record->write(writer, event.overlay);
    writer.finish();
    out.push_back(',');
  }
  if (!events.empty()) out.pop_back();
  out.append("]}");
}

void appendPretty(std::string& out, double postTime, std::string_view clientID, std::span<const OutgoingEvent> events) {
  out.append("{\n  \"postTime\": ");
  platform::appendJsonNumber(out, postTime);
  out.append(",\n  \"clientId\": ");
  platform::appendJsonString(out, clientID);
  out.append(",\n  \"events\": [");
  for (const OutgoingEvent& event : events) {
    out.append("\n    ");
    FieldWriter writer(out, FieldWriter::Form::pretty);
    event.record->write(writer, event.overlay);
    writer.finish();
    out.push_back(',');
  }
  if (!events.empty()) out.pop_back();
  out.append("\n  ]\n}");
}

}  // namespace

PostMessage createMessageForPostAndLogging(double postTime, std::string_view clientID,
                                           std::span<const OutgoingEvent> events, bool pretty) {
  const double time = sanitizeDouble(postTime);
  PostMessage message;
  message.json.reserve(kEnvelopeBytesAbout + events.size() * kEventBytesAbout);
  appendCompact(message.json, time, clientID, events);
  if (pretty) {
    message.prettyJsonString.emplace();
    message.prettyJsonString->reserve(message.json.size() * 2);
    appendPretty(*message.prettyJsonString, time, clientID, events);
  }
  return message;
}

}  // namespace orvanta
