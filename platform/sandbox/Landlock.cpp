#include "platform/sandbox/Landlock.h"

#include <linux/landlock.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <iterator>
#include <string>
#include <utility>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

// The things that a ruleset controls, as the newest kernels take it; installed headers may be older. Older kernels take
// the beginning.
struct RulesetAttributes {
  std::uint64_t files;
  std::uint64_t network;  // ABI 4
  std::uint64_t scoped;   // ABI 6
};
constexpr std::uint64_t kBindTcp = 1U << 0U;
constexpr std::uint64_t kScopeSignals = 1U << 1U;

Failure failedStep(const char* step) {
  return Failure{std::string(step) + ": " + errnoText(errno)};
}

Failure missingLandlock() {
  const char* reason = errno == ENOSYS       ? "the kernel has no Landlock"
                       : errno == EOPNOTSUPP ? "the kernel's Landlock is switched off"
                                             : "the kernel's Landlock cannot be used";
  return Failure{std::string(reason) + " (" + errnoText(errno) +
                 "): use a kernel with CONFIG_SECURITY_LANDLOCK, booted with \"landlock\" in its lsm= list, "
                 "or run without a sandbox by ORVANTA_SANDBOX=off"};
}

}  // namespace

std::uint64_t landlockRightsOfAbi(int abi) {
  std::uint64_t rights = 0;
  if (abi >= 1) rights |= (std::uint64_t{kLandlockMakeSymbolicLink} << 1U) - 1;
  if (abi >= 2) rights |= kLandlockRefer;
  if (abi >= 3) rights |= kLandlockTruncate;
  if (abi >= 5) rights |= kLandlockIoctlDevice;
  return rights;
}

std::uint64_t landlockFileRights(std::uint64_t rights) {
  return rights &
         (kLandlockExecute | kLandlockWriteFile | kLandlockReadFile | kLandlockTruncate | kLandlockIoctlDevice);
}

Result<Landlock> Landlock::create(int highestAbi) {
  const long kernelAbi = ::syscall(SYS_landlock_create_ruleset, nullptr, 0, LANDLOCK_CREATE_RULESET_VERSION);
  if (kernelAbi < 1) return missingLandlock();
  const int abi = static_cast<int>(std::min<long>(kernelAbi, highestAbi));
  RulesetAttributes attributes{landlockRightsOfAbi(abi), 0, 0};
  std::size_t size = offsetof(RulesetAttributes, network);
  if (abi >= 4) {
    attributes.network = kBindTcp;
    size = offsetof(RulesetAttributes, scoped);
  }
  if (abi >= 6) {
    attributes.scoped = kScopeSignals;
    size = sizeof attributes;
  }
  const long fd = ::syscall(SYS_landlock_create_ruleset, &attributes, size, 0);
  if (fd < 0) return failedStep("landlock_create_ruleset");
  return Landlock(abi, UniqueFd(static_cast<int>(fd)));
}

Result<void> Landlock::allow(const UniqueFd& target, std::uint64_t rights) {
  struct stat status {};
  if (::fstat(target.get(), &status) != 0) return failedStep("fstat");
  landlock_path_beneath_attr rule{};
  rule.allowed_access = rights & landlockRightsOfAbi(_abi);
  if (!S_ISDIR(status.st_mode)) rule.allowed_access = landlockFileRights(rule.allowed_access);
  rule.parent_fd = target.get();
  if (rule.allowed_access == 0) return {};  // the kernel refuses empty rules
  if (::syscall(SYS_landlock_add_rule, _ruleset.get(), LANDLOCK_RULE_PATH_BENEATH, &rule, 0) != 0) {
    return failedStep("landlock_add_rule");
  }
  return {};
}

Result<void> Landlock::restrictSelf() {
  if (::syscall(SYS_landlock_restrict_self, _ruleset.get(), 0) != 0) return failedStep("landlock_restrict_self");
  return {};
}

}  // namespace orvanta::platform
