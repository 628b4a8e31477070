#include <utility>

#include "interface/RemoteCalls.h"

// The client's side of replies: from a response frame to the values that the caller waits for.

namespace orvanta {
using platform::Frame;

namespace {

bool read(Value& value, bool& out) {
  if (!value.isBool()) return false;
  out = value.boolValue();
  return true;
}

bool read(Value& value, std::optional<std::string>& out) {
  if (value.isNull()) return true;
  auto* text = value.string();
  if (text == nullptr) return false;
  out = std::move(*text);
  return true;
}

bool read(Value& value, BackendNames& out) {
  if (value.isNull()) return true;
  auto* list = value.array();
  if (list == nullptr) return false;
  std::vector<std::string> names;
  names.reserve(list->size());
  for (auto& entry : *list) {
    auto* name = entry.string();
    if (name == nullptr) return false;
    names.push_back(std::move(*name));
  }
  out = std::move(names);
  return true;
}

bool read(Value& value, std::optional<OrvantaError>& out) {
  if (value.isNull()) return true;
  const auto* map = value.dictionary();
  if (map == nullptr) return false;
  const Value* domain = map->find("domain");
  const Value* code = map->find("code");
  const Value* description = map->find("description");
  if (domain == nullptr || domain->string() == nullptr || code == nullptr || !code->isInteger() ||
      description == nullptr || description->string() == nullptr) {
    return false;
  }
  out = OrvantaError{*domain->string(), static_cast<std::int32_t>(code->integerValue()), *description->string()};
  return true;
}

template <class... Values, std::size_t... Index>
void deliver(Frame& frame, Reply<Values...>& reply, std::index_sequence<Index...> /*indices*/) {
  if (frame.refusal) return reply.fail({"the daemon's response is malformed: " + *frame.refusal});
  if (!frame.error.isNull()) {
    const auto* text = frame.error.string();
    return reply.fail({text != nullptr ? *text : frame.error.description()});
  }
  auto* results = frame.result.array();
  std::tuple<Values...> values;
  if (results == nullptr || results->size() != sizeof...(Values) ||
      !(read((*results)[Index], std::get<Index>(values)) && ...)) {
    return reply.fail({"the daemon's response has an unexpected shape"});
  }
  std::apply([&reply](auto&... value) { reply(std::move(value)...); }, values);
}

template <class... Values>
void deliverAny(Frame& frame, Reply<Values...>& reply) {
  deliver(frame, reply, std::index_sequence_for<Values...>{});
}

}  // namespace

void deliverResponse(Frame&& frame, BackendNamesReply reply) {
  deliverAny(frame, reply);
}
void deliverResponse(Frame&& frame, StringReply reply) {
  deliverAny(frame, reply);
}
void deliverResponse(Frame&& frame, FlushReply reply) {
  deliverAny(frame, reply);
}
void deliverResponse(Frame&& frame, UploadReply reply) {
  deliverAny(frame, reply);
}
void deliverResponse(Frame&& frame, LogDataReply reply) {
  deliverAny(frame, reply);
}
void deliverResponse(Frame&& frame, DoneReply reply) {
  deliverAny(frame, reply);
}

}  // namespace orvanta
