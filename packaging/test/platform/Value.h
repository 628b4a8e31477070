#pragma once

#include <string>

// The program's own, although the library has a header and a class of these names too.
namespace platform {

struct Value {
  int number;
};

inline std::string describe(const Value& value) {
  return "hello " + std::to_string(value.number);
}

}  // namespace platform
