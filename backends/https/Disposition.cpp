#include "backends/https/Disposition.h"

namespace orvanta {

Disposition disposition(BackendState state, EventFlag flag, bool batches, bool knowsUser) {
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
