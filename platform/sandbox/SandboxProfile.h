#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/Result.h"
#include "platform/core/Value.h"
#include "platform/sandbox/Landlock.h"

namespace orvanta::platform {

// A sandbox profile's rules for system calls, by their numbers on this machine; calls that other machines have are
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
  std::vector<int> refuse;  // answered as if the kernel did not know them; so is every call that is not named at all
  std::vector<int> end;     // end the process

  // Strict: an unknown name or word, and a call with two meanings, is an error that names the place.
  static Result<SandboxCalls> fromPropertyList(const Value& section);
};

// A sandbox profile's property list, checked but not yet applied to any file system. Its format is described
// in docs/sandbox.md. Plain data.
struct SandboxProfile {
  struct FileRule {
    std::vector<std::string> paths;          // as written, with their ${NAME} places
    std::vector<std::string> directoriesOf;  // the same; the directory in which each really lies is meant
    std::uint64_t rights = 0;                // of LandlockRight
    bool optional = false;                   // a path that does not exist, or has an empty variable, is skipped
  };
  std::vector<FileRule> files;
  SandboxCalls calls;
  int landlockAbi = Landlock::kAnyAbi;  // the highest to make use of

  // Strict: a key or word that is not known is an error, which names the place and the nearest known one.
  static Result<SandboxProfile> fromPropertyList(const Value& document);
};

// `path` with its ${NAME} places filled; nullopt when a variable is absent or empty.
std::optional<std::string> fillPlaces(std::string_view path, const std::map<std::string, std::string>& variables);

}  // namespace orvanta::platform
