#pragma once

#include "backends/Event.h"
#include "backends/OrvantaBackend.h"

namespace orvanta {

// What becomes of one event.
enum class Disposition {
  drop,
  batch,  // it waits for a flush
  post,   // it goes at once
};

// The one decision that every event for an HTTPS backend meets. `batches`: the backend collects what is not realtime.
// `knowsUser`: the session has user info, or needs none. Pure.
Disposition disposition(BackendState state, EventFlag flag, bool batches, bool knowsUser);

}  // namespace orvanta
