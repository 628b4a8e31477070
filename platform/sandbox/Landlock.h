#pragma once

#include <cstdint>

#include "platform/core/Result.h"
#include "platform/core/UniqueFd.h"

namespace orvanta::platform {

// The kernel's rights to files, by their bits in its interface. Named here because the installed kernel headers may be
// older than the kernel.
enum LandlockRight : std::uint64_t {
  kLandlockExecute = 1U << 0U,
  kLandlockWriteFile = 1U << 1U,
  kLandlockReadFile = 1U << 2U,
  kLandlockReadDirectory = 1U << 3U,
  kLandlockRemoveDirectory = 1U << 4U,
  kLandlockRemoveFile = 1U << 5U,
  kLandlockMakeCharacterDevice = 1U << 6U,
  kLandlockMakeDirectory = 1U << 7U,
  kLandlockMakeRegular = 1U << 8U,
  kLandlockMakeSocket = 1U << 9U,
  kLandlockMakeFifo = 1U << 10U,
  kLandlockMakeBlockDevice = 1U << 11U,
  kLandlockMakeSymbolicLink = 1U << 12U,
  kLandlockRefer = 1U << 13U,        // ABI 2: linking and renaming into another directory
  kLandlockTruncate = 1U << 14U,     // ABI 3
  kLandlockIoctlDevice = 1U << 15U,  // ABI 5
};

// The file rights that a kernel of that Landlock ABI controls; all of them are denied except where a rule grants them.
std::uint64_t landlockRightsOfAbi(int abi);
// Those among `rights` that a rule for anything but a directory may name.
std::uint64_t landlockFileRights(std::uint64_t rights);

// A set of rules on its way to becoming the thread's confinement. Used by one thread. A call that fails has no
// effect.
//
// Beside files it forbids, where the kernel can, to bind TCP ports (ABI 4) and to signal processes outside (ABI 6).
// Connecting is left alone: the daemon talks to servers that its configuration names, and a service manager may listen
// at an abstract socket.
class Landlock {
 public:
  static constexpr int kAnyAbi = 1 << 30;
  // Uses no more than ABI `highestAbi`. Fails where the kernel has no Landlock, with a text that says what to do.
  static Result<Landlock> create(int highestAbi = kAnyAbi);

  int abi() const { return _abi; }
  // Grants `rights` to `target`, and to everything beneath a directory, as far as the kernel's ABI knows them.
  // `target` may be opened with O_PATH.
  Result<void> allow(const UniqueFd& target, std::uint64_t rights);
  // Confines the calling thread, and those that it starts later, to what was allowed. Needs no-new-privileges.
  Result<void> restrictSelf();

 private:
  Landlock(int abi, UniqueFd ruleset) : _abi(abi), _ruleset(std::move(ruleset)) {}

  int _abi;
  UniqueFd _ruleset;
};

}  // namespace orvanta::platform
