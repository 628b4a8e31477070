#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

// What a sandbox profile says about system calls, by their numbers on this machine; calls that other machines have are
// left out. Plain data, checked but not yet applied. The format is described in docs/sandbox.md.
struct SandboxCalls {
  // The call is allowed when one of its arguments, or some bits of it, has one of these values.
  struct Limit {
    int call = 0;
    unsigned argument = 0;
    std::uint64_t bits = ~std::uint64_t{0};
    std::vector<std::uint64_t> values;
  };
  std::vector<int> allow;
  std::vector<Limit> allowWith;
  std::vector<int> untilStarted;  // allowed until the process has started up
  std::vector<int> refuse;        // answered as if the kernel did not know them; all that is named nowhere is, too
  std::vector<int> end;           // end the process

  // Strict: an unknown name or word, and a call with two meanings, is an error that names the place.
  static Result<SandboxCalls> fromPropertyList(const Value& section);
};

}  // namespace orvanta::platform
