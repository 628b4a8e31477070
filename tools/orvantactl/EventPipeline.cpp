#include "tools/orvantactl/EventPipeline.h"

#include <utility>

#include "tools/orvantactl/AnswerLines.h"

namespace orvanta::ctl {
using platform::MutexLock;

void EventPipeline::send(std::uint64_t line, const MessageParameters& event) {
  std::uint64_t place = 0;
  {
    MutexLock lock(_mutex);
    while (_lines.size() >= _window) _moved.wait(lock);
    place = _lines.reserve();
  }
  _session.sendMessageWithDictionary(event.dictionary(), StringReply([this, place, line](StringReply::Outcome outcome) {
                                       answered(place, line, std::move(outcome));
                                     }));
}

void EventPipeline::answered(std::uint64_t place, std::uint64_t line, StringReply::Outcome outcome) {
  const bool wanted = _out != nullptr;
  const MutexLock lock(_mutex);
  _lines.fill(place, wanted ? answerLine(line, outcome) + "\n" : std::string());
  if (!outcome.values) {
    ++_failures;
    const auto kind = outcome.error.kind;
    _lost = _lost || kind == CallErrorKind::connectionLost || kind == CallErrorKind::notEntitled;
    if (!_firstError) _firstError = std::move(outcome.error);
  }
  while (const auto ready = _lines.take()) {
    if (wanted) std::fwrite(ready->data(), 1, ready->size(), _out);
  }
  // A program that writes one event at a time reads each answer before the next event.
  if (wanted && _lines.size() == 0) std::fflush(_out);
  // Waking the sender for every answer would cost more than the answer.
  if (_lines.size() <= _window / 2) _moved.notifyOne();
}

void EventPipeline::drain() {
  MutexLock lock(_mutex);
  while (_lines.size() > 0) _moved.wait(lock);
}

bool EventPipeline::lost() const {
  const MutexLock lock(_mutex);
  return _lost;
}

std::uint64_t EventPipeline::failures() const {
  const MutexLock lock(_mutex);
  return _failures;
}

std::optional<CallError> EventPipeline::firstError() const {
  const MutexLock lock(_mutex);
  return _firstError;
}

}  // namespace orvanta::ctl
