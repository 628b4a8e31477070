#pragma once

#include <map>
#include <memory>
#include <string>
#include <utility>

#include "platform/core/Result.h"
#include "platform/sandbox/RefusedCalls.h"
#include "platform/sandbox/SandboxProfile.h"

namespace orvanta::platform {

// The process's confinement by a named profile, the property list `directory`/`name`.plist whose format
// docs/sandbox.md describes. Owned by main, on whose thread everything here is called. Destroying it takes nothing
// back.
class Sandbox {
 public:
  // Confines the process, which must have one thread: what is entered holds for that thread and all that it starts
  // later. `variables` fill the ${NAME} places of the profile's paths. A failure says which step failed and why; the
  // process may then be partly confined and should end.
  static Result<std::unique_ptr<Sandbox>> enter(const std::string& directory, const std::string& name,
                                                const std::map<std::string, std::string>& variables);
  // No confinement at all.
  static std::unique_ptr<Sandbox> none();

  // For the log: what was entered, and the kernel's Landlock ABI.
  const std::string& description() const { return _description; }
  // To be called when start-up has made its last special calls and no other thread runs yet: takes back what the
  // profile allows only until then.
  Result<void> started();

 private:
  Sandbox() = default;

  std::string _description;
  SandboxCalls _calls;
  std::unique_ptr<RefusedCalls> _refused;
};

}  // namespace orvanta::platform
