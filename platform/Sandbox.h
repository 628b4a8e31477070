#pragma once

#include <map>
#include <string>

#include "platform/Result.h"

namespace platform {

// Confines the calling process by a named profile: the property list `directory`/`name`.plist. Its format is described
// in docs/operation.md. `variables` fill the ${NAME} places of the profile's paths.
//
// Must be called while the process has one thread: what is entered holds for that thread and all that it starts later.
// A failure says which step failed and why; the process may then be partly confined and should end. On success returns
// a text for the log: what was entered, and the kernel's Landlock ABI.
Result<std::string> enterSandbox(const std::string& directory, const std::string& name,
                                 const std::map<std::string, std::string>& variables);

}  // namespace platform
