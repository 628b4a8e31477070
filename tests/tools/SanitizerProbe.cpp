#include <cstdio>
#include <memory>
#include <thread>

// Commits the fault that the build's sanitizer finds. A test expects the report, and so fails in a build
// that lacks its sanitizer.

namespace {

int gShared = 0;  // NOLINT(cppcoreguidelines-avoid-non-const-global-variables): written by two threads on purpose

#ifndef __SANITIZE_THREAD__
void useAfterFree() {
  auto owner = std::make_unique<int>(1);
  const volatile int* kept = owner.get();
  owner.reset();
  std::printf("%d\n", *kept);
}
#endif

void race() {
  std::thread other([] { ++gShared; });
  ++gShared;
  other.join();
  std::printf("%d\n", gShared);
}

}  // namespace

int main() {
#ifdef __SANITIZE_THREAD__
  race();
#else
  useAfterFree();
  race();
#endif
  return 0;
}
