#pragma once

#include "backends/Event.h"
#include "backends/OrvantaBackend.h"

namespace orvanta {

// The fate of one event.
enum class Disposition {
  drop,
  batch,  // it waits for a flush
  post,   // it goes at once
};

// The one decision that every event for an HTTPS backend meets. `batches`: the backend collects what is not realtime.
// `knowsUser`: the session has user info, or needs none. Pure.
constexpr Disposition disposition(BackendState state, EventFlag flag, bool batches, bool knowsUser) {
  switch (state) {
    case kBackendDisabled:
      return Disposition::drop;
    case kBackendWaiting:
      return Disposition::batch;  // realtime ones too: whether they may leave is not decided
    case kBackendHeld:
      if (!isPromoting(flag)) return Disposition::batch;
      break;  // it is enabled by this very event
    case kBackendEnabled:
      break;
  }
  return knowsUser && (isRealtime(flag) || !batches) ? Disposition::post : Disposition::batch;
}

}  // namespace orvanta
