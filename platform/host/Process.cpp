#include "platform/host/Process.h"

#include <fcntl.h>
#include <link.h>
#include <malloc.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstdint>

#include "platform/core/Log.h"

namespace orvanta::platform {

namespace {

constexpr int kKeptFreeBytes = 1 << 20;
constexpr int kMappedFromBytes = 1 << 20;
constexpr int kArenas = 2;

// A segment that is never written holds nothing that its file does not.
int dropReadOnlySegments(dl_phdr_info* object, std::size_t, void*) {
  const auto page = static_cast<std::uintptr_t>(::sysconf(_SC_PAGESIZE));
  for (int i = 0; i < object->dlpi_phnum; ++i) {
    const auto& segment = object->dlpi_phdr[i];
    if (segment.p_type != PT_LOAD || (segment.p_flags & PF_W) != 0) continue;
    const std::uintptr_t begin = (object->dlpi_addr + segment.p_vaddr + page - 1) / page * page;
    const std::uintptr_t end = (object->dlpi_addr + segment.p_vaddr + segment.p_memsz) / page * page;
    // A shared last page may belong to the next segment, which is written.
    if (begin < end) ::madvise(reinterpret_cast<void*>(begin), end - begin, MADV_DONTNEED);
  }
  return 0;
}

sigset_t terminationSignals() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  sigaddset(&signals, SIGINT);
  return signals;
}

}  // namespace

void secureStandardDescriptors() {
  for (const int standard : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    // open() takes the lowest free number, which is this one, as those below it are open by now.
    if (::fcntl(standard, F_GETFD) < 0 && errno == EBADF) ::open("/dev/null", O_RDWR);
  }
}

void enterUtilitySchedulingClass() {
  constexpr int kUtilityNice = 5;
  if (::setpriority(PRIO_PROCESS, 0, kUtilityNice) != 0) {
    PLATFORM_LOG(info, "enterUtilitySchedulingClass: The scheduling priority stays as it is (error {})", errno);
  }
}

void blockTerminationSignals() {
  const sigset_t signals = terminationSignals();
  ::pthread_sigmask(SIG_BLOCK, &signals, nullptr);
  ::signal(SIGPIPE, SIG_IGN);
}

int waitForTermination() {
  const sigset_t signals = terminationSignals();
  for (;;) {
    const int signal = ::sigwaitinfo(&signals, nullptr);
    if (signal > 0) return signal;
  }
}

void tuneAllocator() {
  ::mallopt(M_TRIM_THRESHOLD, kKeptFreeBytes);
  ::mallopt(M_MMAP_THRESHOLD, kMappedFromBytes);
  ::mallopt(M_ARENA_MAX, kArenas);
}

void releaseUnusedMemory() {
  ::malloc_trim(0);
  ::dl_iterate_phdr(dropReadOnlySegments, nullptr);
}

}  // namespace orvanta::platform
