#pragma once

#include <optional>
#include <string>
#include <utility>
#include <variant>

#include "interface/OrvantaError.h"
#include "interface/Reply.h"

namespace orvanta {

// What a call that waits brings back: its answer, or the reason why there is none.
template <class T>
class CallResult {
 public:
  CallResult(T answer) : _content(std::in_place_index<0>, std::move(answer)) {}  // NOLINT(google-explicit-constructor)
  CallResult(CallError error)
      : _content(std::in_place_index<1>, std::move(error)) {}  // NOLINT(google-explicit-constructor)

  bool ok() const { return _content.index() == 0; }
  explicit operator bool() const { return ok(); }
  // Only when ok().
  T& value() { return std::get<0>(_content); }
  const T& value() const { return std::get<0>(_content); }
  T* operator->() { return &value(); }
  const T* operator->() const { return &value(); }
  T& operator*() { return value(); }
  const T& operator*() const { return value(); }
  // Only when not ok().
  const CallError& error() const { return std::get<1>(_content); }

 private:
  std::variant<T, CallError> _content;
};

// The answer of an operation that has no values: it was carried out.
struct Done {};

// The answer to a flush. `error` is the daemon's own: what kept it from sending, while the call itself worked.
struct FlushAnswer {
  std::optional<std::string> text;
  std::optional<OrvantaError> error;
};

struct LogDataAnswer {
  bool uploaded = false;
  std::optional<OrvantaError> error;
};

}  // namespace orvanta
