#pragma once

#include <cstddef>

namespace orvanta {

// Limits of the wire protocol, one place for daemon, client library, docs and fuzzers.
inline constexpr std::size_t kMaximumFrameBytes = 64U << 20U;    // the largest payload anyone has needed is 2 MiB
inline constexpr std::size_t kMaximumFrameDepth = 64;            // counting the frame's own array
inline constexpr std::size_t kMaximumFrameCharge = 256U << 20U;  // decoded; 64 MiB of nils would be gigabytes
inline constexpr std::size_t kMaximumUnreadReplies = 1U << 20U;  // then nothing more is read from that client
inline constexpr std::size_t kMaximumWaitingAggregatedEvents = 4U
                                                               << 20U;  // bytes; then events are dropped, notices never
inline constexpr std::size_t kMaximumWaitingDescriptors = 16;
inline constexpr std::size_t kMaximumUploadBytes = 128U << 20U;  // of one file, which the daemon holds in memory
inline constexpr std::size_t kMaximumHierarchyLevel = 2'147'483'647;

}  // namespace orvanta
