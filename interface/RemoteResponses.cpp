#include <type_traits>
#include <utility>

#include "interface/RemoteCalls.h"

// The client's side of replies: from a response frame to the values that the caller waits for. Each read() takes one
// value as RemoteDispatch.cpp wrote it, and returns false for another type.

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
  const auto* domain = map->text("domain");
  const Value* code = map->find("code");
  const auto* description = map->text("description");
  if (domain == nullptr || code == nullptr || !code->isInteger() || description == nullptr) return false;
  out = OrvantaError{*domain, static_cast<std::int32_t>(code->integerValue()), *description};
  return true;
}

template <class... Values>
void deliver(Frame& frame, Reply<Values...>& reply) {
  if (frame.refusal) return reply.fail({"the daemon's response is malformed: " + *frame.refusal});
  if (!frame.error.isNull()) {
    const auto* text = frame.error.string();
    return reply.fail({text != nullptr ? *text : frame.error.description()});
  }
  auto* results = frame.result.array();
  std::tuple<Values...> values;
  const auto readAll = [results](auto&... value) {
    [[maybe_unused]] std::size_t next = 0;
    return (read((*results)[next++], value) && ...);
  };
  if (results == nullptr || results->size() != sizeof...(Values) || !std::apply(readAll, values)) {
    return reply.fail({"the daemon's response has an unexpected shape"});
  }
  std::apply([&reply](auto&... value) { reply(std::move(value)...); }, values);
}

}  // namespace

void deliverResponse(Frame&& frame, PendingReply reply) {
  std::visit(
      [&frame]<class Held>(Held& held) {
        if constexpr (!std::is_same_v<Held, std::monostate>) deliver(frame, held);
      },
      reply);
}

}  // namespace orvanta
