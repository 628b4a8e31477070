#pragma once

#include <optional>
#include <string>
#include <type_traits>
#include <utility>
#include <variant>

namespace orvanta::platform {

// Why something failed: one sentence that says what and where.
struct Failure {
  std::string text;
};

// A value, or the reason why it could not be had: a Failure's text, or another type's whole error.
template <class T, class Error = Failure>
class [[nodiscard]] Result {
 public:
  Result(T value) : _content(std::in_place_index<0>, std::move(value)) {}      // NOLINT(google-explicit-constructor)
  Result(Error error) : _content(std::in_place_index<1>, std::move(error)) {}  // NOLINT(google-explicit-constructor)

  bool ok() const { return _content.index() == 0; }
  explicit operator bool() const { return ok(); }
  // Only when ok().
  T& value() { return std::get<0>(_content); }
  const T& value() const { return std::get<0>(_content); }
  T* operator->() { return &value(); }
  const T* operator->() const { return &value(); }
  T& operator*() { return value(); }
  const T& operator*() const { return value(); }
  // Only when not ok(). The text of a Failure; of another error the whole.
  const auto& error() const {
    if constexpr (std::is_same_v<Error, Failure>) {
      return std::get<1>(_content).text;
    } else {
      return std::get<1>(_content);
    }
  }

 private:
  std::variant<T, Error> _content;
};

// Success, or the reason for the failure.
template <class Error>
class [[nodiscard]] Result<void, Error> {
 public:
  Result() = default;
  Result(Error error) : _error(std::move(error)) {}  // NOLINT(google-explicit-constructor)

  bool ok() const { return !_error; }
  explicit operator bool() const { return ok(); }
  // Only when not ok(). The text of a Failure; of another error the whole.
  const auto& error() const {
    if constexpr (std::is_same_v<Error, Failure>) {
      return _error->text;
    } else {
      return *_error;
    }
  }

 private:
  std::optional<Error> _error;
};

}  // namespace orvanta::platform
