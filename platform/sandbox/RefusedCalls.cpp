#include "platform/sandbox/RefusedCalls.h"

#include <linux/seccomp.h>
#include <poll.h>
#include <seccomp.h>
#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <future>
#include <set>
#include <string>
#include <system_error>
#include <vector>

#include "platform/core/Log.h"
#include "platform/core/SignalMask.h"
#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {
constexpr int kNamedCalls = 512;
}

// While it runs it allocates nothing: a thread that forks holds the allocator's locks until its call has been answered.
struct RefusedCalls::Watch {
  std::set<int> limited;  // allowed with other arguments; constant after construction
  UniqueFd stop{::eventfd(0, EFD_CLOEXEC)};
  std::promise<Result<void>> ready;  // the watcher is confined
  std::promise<int> notifications;   // the descriptor to watch; -1 for no watching

  void run();

 private:
  Result<void> prepare();
  // Returns false when the descriptor is of no more use.
  bool answer(int fd);

  // Owned by the watcher. Of the kernel's sizes, which may be larger than those that we were built with.
  std::vector<std::uint8_t> _request;
  std::vector<std::uint8_t> _response;
  // By the call's number; the last place is for all that have no name.
  std::vector<std::string> _names;
  std::vector<bool> _logged;
};

// Before the thread is confined, as it takes a call that it will not have.
Result<void> RefusedCalls::Watch::prepare() {
  seccomp_notif_sizes sizes{};
  if (::syscall(SYS_seccomp, SECCOMP_GET_NOTIF_SIZES, 0, &sizes) != 0) {
    return Failure{"system calls: refused ones cannot be watched (it takes Linux 5.0): " + errnoText(errno)};
  }
  _request.resize(std::max<std::size_t>(sizes.seccomp_notif, sizeof(seccomp_notif)));
  _response.resize(std::max<std::size_t>(sizes.seccomp_notif_resp, sizeof(seccomp_notif_resp)));
  for (int call = 0; call < kNamedCalls; ++call) {
    char* const name = ::seccomp_syscall_resolve_num_arch(SCMP_ARCH_NATIVE, call);
    _names.emplace_back(name == nullptr ? "unknown" : name);
    std::free(name);  // NOLINT(cppcoreguidelines-no-malloc): the library's own
  }
  _names.emplace_back("unknown");
  _logged.resize(_names.size());
  return filterWatcherCalls();
}

void RefusedCalls::Watch::run() {
  ready.set_value(prepare());
  const UniqueFd fd(notifications.get_future().get());
  while (fd) {
    pollfd events[2] = {{fd.get(), POLLIN, 0}, {stop.get(), POLLIN, 0}};
    if (::poll(events, 2, -1) < 0 && errno != EINTR) break;
    if (events[1].revents != 0) break;
    if ((events[0].revents & POLLIN) != 0 && !answer(fd.get())) break;
    if ((events[0].revents & (POLLHUP | POLLERR)) != 0) break;
  }
}

bool RefusedCalls::Watch::answer(int fd) {
  std::fill(_request.begin(), _request.end(), 0);  // the kernel insists
  seccomp_notif request{};
  if (::ioctl(fd, SECCOMP_IOCTL_NOTIF_RECV, _request.data()) != 0) {
    return errno == ENOENT || errno == EINTR;  // the waiting thread has ended
  }
  std::memcpy(&request, _request.data(), sizeof request);
  const int call = request.data.nr;
  const bool isLimited = limited.count(call) != 0;
  seccomp_notif_resp response{};
  response.id = request.id;
  response.error = isLimited ? -EPERM : -ENOSYS;
  std::memcpy(_response.data(), &response, sizeof response);
  // First of all, as the thread may hold what logging needs. When this fails, the thread has ended.
  ::ioctl(fd, SECCOMP_IOCTL_NOTIF_SEND, _response.data());
  const auto place = static_cast<std::size_t>(call >= 0 && call < kNamedCalls ? call : kNamedCalls);
  if (_logged[place]) return true;
  _logged[place] = true;
  PLATFORM_LOG(warning, "sandbox: Refused system call {} ({}){} in thread {}; further ones are not logged",
               _names[place], call, isLimited ? " with such arguments" : "", request.pid);
  return true;
}

RefusedCalls::RefusedCalls(const SandboxCalls& calls) : _watch(std::make_unique<Watch>()) {
  for (const auto& limit : calls.allowWith) _watch->limited.insert(limit.call);
}

Result<std::unique_ptr<RefusedCalls>> RefusedCalls::enter(const SandboxCalls& calls) {
  std::unique_ptr<RefusedCalls> made(new RefusedCalls(calls));  // NOLINT(modernize-make-unique): private
  if (!made->_watch->stop) return Failure{"system calls: no descriptor for the watcher"};
  auto prepared = made->_watch->ready.get_future();
  try {
    const AllSignalsBlocked blocked;
    made->_watcher = std::thread([watch = made->_watch.get()] { watch->run(); });
  } catch (const std::system_error& error) {
    return Failure{std::string("system calls: no thread for the watcher: ") + error.what()};
  }
  const auto ready = prepared.get();
  const auto filtered = ready ? filterCalls(calls) : Result<int>(Failure{ready.error()});
  made->_watch->notifications.set_value(filtered ? *filtered : -1);
  if (!filtered) return Failure{filtered.error()};
  if (*filtered < 0) PLATFORM_LOG(notice, "sandbox: Refused system calls are not logged: something else watches them");
  return made;
}

RefusedCalls::~RefusedCalls() {
  if (!_watcher.joinable()) return;
  if (::eventfd_write(_watch->stop.get(), 1) != 0) {
    _watcher.detach();
    _watch.release();  // NOLINT(bugprone-unused-return-value): the thread's from now on
    return;
  }
  _watcher.join();
}

}  // namespace orvanta::platform
