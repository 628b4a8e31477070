#include "backends/https/Disposition.h"

#include <gtest/gtest.h>

namespace orvanta {
namespace {

// D drops, B batches, P posts.
char letterOf(Disposition disposition) {
  switch (disposition) {
    case Disposition::drop:
      return 'D';
    case Disposition::batch:
      return 'B';
    case Disposition::post:
      return 'P';
  }
  return '?';
}

TEST(Disposition, OfEveryStateAndFlag) {
  const struct {
    BackendState state;
    // For the flags -1, 0 (none), 1 (realtime), 2 (promote), 3 (both), 4 and 5.
    const char* batching;
    const char* direct;
  } rows[] = {
      {kBackendWaiting, "BBBBBBB", "BBBBBBB"},
      {kBackendDisabled, "DDDDDDD", "DDDDDDD"},
      {kBackendEnabled, "BBPBPBB", "PPPPPPP"},
      {kBackendHeld, "BBBBPBB", "BBBPPBB"},
  };
  for (const auto& row : rows) {
    for (int flag = -1; flag <= 5; ++flag) {
      const auto becomes = [&](bool batches, bool knowsUser) {
        return letterOf(disposition(row.state, static_cast<EventFlag>(flag), batches, knowsUser));
      };
      EXPECT_EQ(becomes(true, true), row.batching[flag + 1]) << row.state << " batching, flag " << flag;
      EXPECT_EQ(becomes(false, true), row.direct[flag + 1]) << row.state << " direct, flag " << flag;
      const char unknown = row.state == kBackendDisabled ? 'D' : 'B';
      EXPECT_EQ(becomes(true, false), unknown) << row.state << " batching, user unknown, flag " << flag;
      EXPECT_EQ(becomes(false, false), unknown) << row.state << " direct, user unknown, flag " << flag;
    }
  }
}

}  // namespace
}  // namespace orvanta
