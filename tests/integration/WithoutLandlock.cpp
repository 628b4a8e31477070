// Runs a program as on a kernel without Landlock: without_landlock PROGRAM [ARGUMENT...]

#include <seccomp.h>
#include <unistd.h>

#include <cerrno>

int main(int /*count*/, char** arguments) {
  const scmp_filter_ctx filter = ::seccomp_init(SCMP_ACT_ALLOW);
  for (const int call : {SCMP_SYS(landlock_create_ruleset), SCMP_SYS(landlock_restrict_self)}) {
    if (::seccomp_rule_add(filter, SCMP_ACT_ERRNO(ENOSYS), call, 0) != 0) return 125;
  }
  if (::seccomp_load(filter) != 0) return 125;
  ::execv(arguments[1], arguments + 1);
  return 126;
}
