#include "platform/sandbox/RefusedCalls.h"

#include <fmt/format.h>
#include <seccomp.h>

#include <cerrno>
#include <memory>
#include <span>
#include <string>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {

using Filter = std::unique_ptr<void, decltype(&::seccomp_release)>;

Failure failedStep(const std::string& step, int negativeError) {
  return Failure{"system calls: " + step + ": " + errnoText(-negativeError)};
}

// A filter that answers what no rule mentions with `others`.
Filter makeFilter(std::uint32_t others) {
  Filter filter(::seccomp_init(others), &::seccomp_release);
  if (filter) {
    // The profile has seen to it before Landlock, which needs it too.
    ::seccomp_attr_set(filter.get(), SCMP_FLTATR_CTL_NNP, 0);
    // Calls in another machine language, such as 32-bit ones, mean other things by the same numbers.
    ::seccomp_attr_set(filter.get(), SCMP_FLTATR_ACT_BADARCH, SCMP_ACT_KILL_PROCESS);
    // A search tree instead of a list: the filter runs at every call.
    ::seccomp_attr_set(filter.get(), SCMP_FLTATR_CTL_OPTIMIZE, 2);
  }
  return filter;
}

// 0 or a negative error.
int add(const Filter& filter, std::uint32_t action, std::span<const int> calls) {
  for (const int call : calls) {
    if (const int result = ::seccomp_rule_add(filter.get(), action, call, 0); result != 0) return result;
  }
  return 0;
}

int add(const Filter& filter, std::span<const SandboxCalls::Limit> limits) {
  for (const auto& limit : limits) {
    for (const std::uint64_t value : limit.values) {
      const scmp_arg_cmp condition{limit.argument, SCMP_CMP_MASKED_EQ, limit.bits, value};
      const int result = ::seccomp_rule_add_array(filter.get(), SCMP_ACT_ALLOW, limit.call, 1, &condition);
      if (result != 0) return result;
    }
  }
  return 0;
}

// The profile's rules, without those that `others` implies.
int addRules(const Filter& filter, const SandboxCalls& calls, std::uint32_t others) {
  constexpr std::uint32_t kRefuse = SCMP_ACT_ERRNO(ENOSYS);
  int error = add(filter, SCMP_ACT_ALLOW, calls.allow);
  if (error == 0) error = add(filter, SCMP_ACT_ALLOW, calls.untilStarted);
  if (error == 0) error = add(filter, calls.allowWith);
  if (error == 0 && others != kRefuse) error = add(filter, kRefuse, calls.refuse);
  if (error == 0) error = add(filter, SCMP_ACT_KILL_PROCESS, calls.end);
  return error;
}

}  // namespace

Result<int> filterCalls(const SandboxCalls& calls) {
  // Where another process watches already, as in some containers, the kernel does not take a second watcher. The
  // library does not tell that from other failures, which the second attempt meets again.
  int error = 0;
  for (const std::uint32_t others : {SCMP_ACT_NOTIFY, SCMP_ACT_ERRNO(ENOSYS)}) {
    const Filter filter = makeFilter(others);
    if (!filter) return failedStep("making a filter", -ENOMEM);
    if (error = addRules(filter, calls, others); error != 0) return failedStep("adding a rule", error);
    if (error = ::seccomp_load(filter.get()); error != 0) continue;
    return others == SCMP_ACT_NOTIFY ? ::seccomp_notify_fd(filter.get()) : -1;
  }
  return failedStep("the kernel does not take the filter (it needs CONFIG_SECCOMP_FILTER)", error);
}

Result<void> refuseStartCalls(const SandboxCalls& calls) {
  if (calls.untilStarted.empty()) return {};
  const Filter filter = makeFilter(SCMP_ACT_ALLOW);
  if (!filter) return failedStep("making a filter", -ENOMEM);
  if (const int error = add(filter, SCMP_ACT_ERRNO(EPERM), calls.untilStarted); error != 0) {
    return failedStep("adding a rule", error);
  }
  if (const int error = ::seccomp_load(filter.get()); error != 0) {
    return failedStep("refusing those of the start", error);
  }
  return {};
}

Result<void> filterWatcherCalls() {
  // ppoll, pselect6 and friends: what the C library makes of poll() differs between machines. Through a pipe the builds
  // that look for undefined behaviour ask whether memory can be read.
  static constexpr int kCalls[] = {
      SCMP_SYS(ioctl),      SCMP_SYS(poll),           SCMP_SYS(ppoll),         SCMP_SYS(futex),
      SCMP_SYS(gettid),     SCMP_SYS(getpid),         SCMP_SYS(clock_gettime), SCMP_SYS(restart_syscall),
      SCMP_SYS(write),      SCMP_SYS(writev),         SCMP_SYS(sendto),        SCMP_SYS(sendmsg),
      SCMP_SYS(socket),     SCMP_SYS(connect),        SCMP_SYS(close),         SCMP_SYS(read),
      SCMP_SYS(openat),     SCMP_SYS(newfstatat),     SCMP_SYS(fstat),         SCMP_SYS(mmap),
      SCMP_SYS(munmap),     SCMP_SYS(mprotect),       SCMP_SYS(brk),           SCMP_SYS(madvise),
      SCMP_SYS(exit),       SCMP_SYS(rt_sigprocmask), SCMP_SYS(rt_sigreturn),  SCMP_SYS(rseq),
      SCMP_SYS(exit_group), SCMP_SYS(sched_yield),    SCMP_SYS(sigaltstack),   SCMP_SYS(pipe),
      SCMP_SYS(pipe2),
  };
  const Filter filter = makeFilter(SCMP_ACT_ERRNO(ENOSYS));
  if (!filter) return failedStep("making a filter", -ENOMEM);
  if (const int error = add(filter, SCMP_ACT_ALLOW, kCalls); error != 0) return failedStep("adding a rule", error);
  if (const int error = ::seccomp_load(filter.get()); error != 0) return failedStep("filtering the watcher", error);
  return {};
}

}  // namespace orvanta::platform
