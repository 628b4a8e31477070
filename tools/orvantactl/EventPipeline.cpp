#include "tools/orvantactl/EventPipeline.h"

#include <fmt/format.h>

#include <utility>

#include "platform/codec/Json.h"

namespace orvanta::ctl {

std::string answerLine(std::uint64_t line, const StringReply::Outcome& outcome) {
  std::string text = fmt::format("{{\"event\":{},", line);
  if (!outcome.values) {
    text += "\"error\":";
    platform::appendJsonString(text, outcome.error.text);
  } else {
    text += "\"reply\":";
    if (const auto& reply = std::get<0>(*outcome.values)) {
      platform::appendJsonString(text, *reply);
    } else {
      text += "null";
    }
  }
  return text += "}\n";
}

void EventPipeline::send(std::uint64_t line, const MessageParameters& event) {
  std::uint64_t place = 0;
  {
    std::unique_lock lock(_mutex);
    _moved.wait(lock, [this] { return _lines.size() < _window; });
    place = _lines.reserve();
  }
  _session.sendMessageWithDictionary(event.dictionary(), StringReply([this, place, line](StringReply::Outcome outcome) {
                                       answered(place, line, std::move(outcome));
                                     }));
}

void EventPipeline::answered(std::uint64_t place, std::uint64_t line, StringReply::Outcome outcome) {
  const bool wanted = _out != nullptr;
  const std::lock_guard lock(_mutex);
  _lines.fill(place, wanted ? answerLine(line, outcome) : std::string());
  if (!outcome.values) {
    ++_failures;
    const auto kind = outcome.error.kind;
    _lost = _lost || kind == CallErrorKind::connectionLost || kind == CallErrorKind::notEntitled;
    if (!_firstError) _firstError = std::move(outcome.error);
  }
  while (const auto ready = _lines.take()) {
    if (wanted) std::fwrite(ready->data(), 1, ready->size(), _out);
  }
  // Whoever feeds events one at a time sees each answer before giving the next.
  if (wanted && _lines.size() == 0) std::fflush(_out);
  // Waking the sender for every answer would cost more than the answer.
  if (_lines.size() <= _window / 2) _moved.notify_one();
}

void EventPipeline::drain() {
  std::unique_lock lock(_mutex);
  _moved.wait(lock, [this] { return _lines.size() == 0; });
}

bool EventPipeline::lost() const {
  const std::lock_guard lock(_mutex);
  return _lost;
}

std::uint64_t EventPipeline::failures() const {
  const std::lock_guard lock(_mutex);
  return _failures;
}

std::optional<CallError> EventPipeline::firstError() const {
  const std::lock_guard lock(_mutex);
  return _firstError;
}

}  // namespace orvanta::ctl
