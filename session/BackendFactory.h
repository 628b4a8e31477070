#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "backends/BackendServices.h"
#include "backends/OrvantaBackend.h"

namespace orvanta {

// How a backend's text serves as the reply to the client that sent the event: not at all, for want of a better one, or
// in place of any earlier one.
enum class ReplyRole { none, fallback, reply };

// The rules by which sessions treat one kind of backend differently from another.
struct BackendRules {
  ReplyRole reply = ReplyRole::none;
  int displayURLTurn = 0;  // backends are asked for the display URL in this order; 0: never
};

// Makes the backend of that name. Returns null, with a log line, when the name is unknown, the profile lacks something
// (the class logs that, too) or the device does not support it.
std::shared_ptr<OrvantaBackend> newBackendWithName(BackendServices& services, const std::string& name,
                                                   const SharedDictionary& profile, const BackendSetup& setup);

// Of the table's row of that name; all defaults for an unknown one.
BackendRules rulesForBackend(std::string_view name);

}  // namespace orvanta
