#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>

namespace orvanta {

// The limits of the socket protocol: daemon, client library, tools and fuzzers take them from here and nowhere else.
// docs/protocol.md names each and says what happens beyond it.

// Of one frame, either way. Larger or deeper ones end the connection.
inline constexpr std::size_t kMaximumFrameBytes = 64U << 20U;    // the largest payload seen so far is 2 MiB
inline constexpr std::size_t kMaximumFrameDepth = 64;            // counting the frame's own array
inline constexpr std::size_t kMaximumFrameCharge = 256U << 20U;  // decoded; 64 MiB of nils would be gigabytes

// Kept by the daemon for one client.
inline constexpr std::size_t kMaximumUnreadReplies = 1U << 20U;            // then it reads nothing more
inline constexpr std::size_t kMaximumWaitingAggregatedEvents = 4U << 20U;  // then events are dropped, notices never
inline constexpr std::size_t kMaximumWaitingDescriptors = 16;              // received and not yet used

// Kept by the daemon for one user.
inline constexpr std::size_t kMaximumConnectionsPerUser = 4096;

// Taken by the daemon as an argument.
inline constexpr std::int64_t kMaximumHierarchyLevel = 2'147'483'647;
inline constexpr std::uint64_t kMaximumUploadBytes = 128U << 20U;       // of one file, which it holds in memory
inline constexpr std::uint64_t kMaximumUnsizedUploadBytes = 1U << 20U;  // of one whose size is not known, as in /proc
inline constexpr std::size_t kMaximumMethodInRefusal = 100;             // bytes of an unknown method's name

// Kept by the client library, unless ConnectionOptions say otherwise.
inline constexpr std::size_t kMaximumUnreadCalls = 64U << 20U;  // bytes that the daemon has not read yet
inline constexpr std::chrono::milliseconds kClosingTime{2000};  // for calls already sent, when the connection closes

}  // namespace orvanta
