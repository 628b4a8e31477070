#pragma once

#include <fcntl.h>
#include <sys/inotify.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/ptrace.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>

#include "platform/core/UniqueFd.h"
#include "platform/ipc/Connect.h"

namespace orvanta::test {

// The outcome of a system call: "done" or errno's text.
inline std::string outcome(bool succeeded) {
  return succeeded ? "done" : std::string(::strerror(errno));
}

inline std::string opening(const std::string& path, int flags) {
  const platform::UniqueFd file(::open(path.c_str(), flags | O_CLOEXEC, 0600));
  return outcome(static_cast<bool>(file));
}

inline std::string binding(const std::string& path) {
  const platform::UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const auto address = platform::unixAddress(path);
  return outcome(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) == 0);
}

inline constexpr const char* kDenied = "Permission denied";
inline constexpr const char* kNotPermitted = "Operation not permitted";
inline constexpr const char* kNotImplemented = "Function not implemented";

// Acts forbidden to the daemon's process once it has started, and how they end. Shared by the sandbox's own tests
// and by the plug-in that tries it inside the real daemon.
struct ForbiddenAct {
  const char* name;
  // `readable` is a file that may be read; `closed` a directory that may not be used at all.
  std::string (*attempt)(const std::string& readable, const std::string& closed);
  const char* result;  // null: the process ends
};

inline const ForbiddenAct kForbiddenActs[] = {
    {"open a home directory", [](auto&, auto&) { return opening("/root", O_RDONLY | O_DIRECTORY); }, kDenied},
    {"write outside", [](auto&, auto& closed) { return opening(closed + "/new", O_WRONLY | O_CREAT); }, kDenied},
    {"overwrite what is for reading", [](auto& readable, auto&) { return opening(readable, O_WRONLY); }, kDenied},
    {"empty while reading", [](auto& file, auto&) { return opening(file, O_RDONLY | O_TRUNC); }, kNotPermitted},
    {"empty by name", [](auto& file, auto&) { return outcome(::truncate(file.c_str(), 0) == 0); }, kNotImplemented},
    {"change permissions", [](auto& file, auto&) { return outcome(::chmod(file.c_str(), 0) == 0); }, kNotPermitted},
    {"name a socket elsewhere", [](auto&, auto& closed) { return binding(closed + "/socket"); }, kDenied},
    {"listen on another socket",
     [](auto&, auto&) {
       const platform::UniqueFd socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
       return socket ? outcome(::listen(socket.get(), 1) == 0) : "no socket";
     },
     kNotPermitted},
    {"open a packet socket",
     [](auto&, auto&) {
       const platform::UniqueFd socket(::socket(AF_PACKET, SOCK_RAW | SOCK_CLOEXEC, 0));
       return outcome(static_cast<bool>(socket));
     },
     kNotPermitted},
    {"start a process",
     [](auto&, auto&) {
       const pid_t child = ::fork();
       if (child == 0) ::_exit(0);
       if (child > 0) ::waitpid(child, nullptr, 0);
       return outcome(child > 0);
     },
     kNotPermitted},
    {"write code",
     [](auto&, auto&) {
       return outcome(::mmap(nullptr, 4096, PROT_WRITE | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) != MAP_FAILED);
     },
     kNotPermitted},
    {"make a call of no use to it", [](auto&, auto&) { return outcome(::inotify_init1(0) >= 0); }, kNotImplemented},
    {"run a program", [](auto&, auto&) { return outcome(::execl("/bin/true", "/bin/true", nullptr) == 0); }, nullptr},
    {"trace", [](auto&, auto&) { return outcome(::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) == 0); }, nullptr},
    {"mount", [](auto&, auto& at) { return outcome(::mount("none", at.c_str(), "tmpfs", 0, nullptr) == 0); }, nullptr},
};

// The event of this category keeps the plug-in busy for ever.
inline constexpr std::uint16_t kActThatNeverEnds = 1000;

}  // namespace orvanta::test
