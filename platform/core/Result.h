#pragma once

#include <string>
#include <utility>
#include <variant>

namespace orvanta::platform {

// Why something failed: one sentence that says what and where.
struct Failure {
  std::string text;
};

// A value or the reason why there is none.
template <class T>
class Result {
 public:
  Result(T value) : _content(std::in_place_index<0>, std::move(value)) {}  // NOLINT(google-explicit-constructor)
  Result(Failure failure)
      : _content(std::in_place_index<1>, std::move(failure)) {}  // NOLINT(google-explicit-constructor)

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
  const std::string& error() const { return std::get<1>(_content).text; }

 private:
  std::variant<T, Failure> _content;
};

}  // namespace orvanta::platform
