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
#include "platform/sandbox/SandboxCalls.h"

namespace orvanta::platform {

// What a sandbox profile's property list says, checked but not yet applied to any file system. Its format is described
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

// `path` with its ${NAME} places filled; none when a variable is absent or empty.
std::optional<std::string> fillPlaces(std::string_view path, const std::map<std::string, std::string>& variables);

}  // namespace orvanta::platform
