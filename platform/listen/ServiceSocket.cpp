#include "platform/listen/ServiceSocket.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <systemd/sd-daemon.h>

#include <array>
#include <cerrno>
#include <utility>

#include "platform/core/Log.h"
#include "platform/core/Text.h"
#include "platform/ipc/Connect.h"
#include "platform/listen/PeerIdentity.h"

namespace orvanta::platform {

namespace {

Failure failure(const std::string& what, int error) {
  return {what + ": " + errnoText(error)};
}

Failure takenBy(const std::string& path, const std::string& process) {
  return {"Process " + (process.empty() ? "unknown" : process) + " listens at " + path + " already"};
}

// One of `count` descriptors that the service manager passed.
Result<ServiceSocket> passedSocket(int count) {
  for (int fd = SD_LISTEN_FDS_START; fd < SD_LISTEN_FDS_START + count; ++fd) {
    if (::sd_is_socket_unix(fd, SOCK_STREAM, 1, nullptr, 0) <= 0) continue;
    const int flags = ::fcntl(fd, F_GETFL);
    if (flags < 0 || ::fcntl(fd, F_SETFL, flags | O_NONBLOCK) != 0) {
      return failure("The socket passed by the service manager is of no use", errno);
    }
    if (count > 1) PLATFORM_LOG(notice, "Listener: Takes the first socket of {} passed descriptors", count);
    ServiceSocket result;
    result.socket.reset(fd);
    return result;
  }
  return Failure{"The service manager passed no listening Unix stream socket"};
}

// The process at the other end, as text; empty when it belongs to another process namespace.
std::string processBehind(int socket) {
  const auto peer = peerIdentityOf(socket);
  return peer && peer->pid > 0 ? std::to_string(peer->pid) : std::string();
}

std::string lockHolder(const std::string& directory, const std::string& service, int lock) {
  if (const auto connected = connectToService(directory, service)) return processBehind(connected->get());
  // It holds the name but does not listen yet.
  std::array<char, 16> text{};
  const ssize_t size = ::pread(lock, text.data(), text.size(), 0);
  return size > 0 ? std::string(text.data(), static_cast<std::size_t>(size)) : std::string();
}

Result<UniqueFd> takeLock(const std::string& directory, const std::string& service) {
  const std::string path = directory + "/" + service;
  const std::string lockPath = path + ".lock";
  UniqueFd lock(::open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (!lock) return failure("Cannot open " + lockPath, errno);
  if (::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
    if (errno == EWOULDBLOCK) return takenBy(path, lockHolder(directory, service, lock.get()));
    return failure("Cannot lock " + lockPath, errno);
  }
  const std::string process = std::to_string(::getpid());
  if (::ftruncate(lock.get(), 0) != 0 ||
      ::pwrite(lock.get(), process.data(), process.size(), 0) != static_cast<ssize_t>(process.size())) {
    PLATFORM_LOG(notice, "Listener: {} cannot be written: {}", lockPath, errnoText(errno));
  }
  return lock;
}

// Removes a socket file without a listener; otherwise says what stands in the way.
Result<void> removeStale(const std::string& directory, const std::string& service) {
  const std::string path = directory + "/" + service;
  int error = 0;
  const auto connected = connectToService(directory, service, &error);
  if (connected) return takenBy(path, processBehind(connected->get()));
  if (error == EAGAIN) return takenBy(path, {});  // so busy that it takes no more
  if (error == ENOENT) return {};
  if (error != ECONNREFUSED) return Failure{connected.error()};

  struct stat status {};
  if (::lstat(path.c_str(), &status) != 0) return failure("Cannot look at " + path, errno);
  if (!S_ISSOCK(status.st_mode)) return Failure{path + " is in the way: it is no socket"};
  if (::unlink(path.c_str()) != 0 && errno != ENOENT) return failure("Cannot remove the stale socket " + path, errno);
  PLATFORM_LOG(notice, "Listener: A stale socket was replaced at {}", path);
  return {};
}

}  // namespace

Result<ServiceSocket> openServiceSocket(const std::string& directory, const std::string& service) {
  const int passed = ::sd_listen_fds(0);
  if (passed < 0) return failure("What the service manager passed cannot be read", -passed);
  if (passed > 0) return passedSocket(passed);

  ServiceSocket result;
  result.path = directory + "/" + service;
  const auto address = unixAddress(result.path);
  if (!address) return failure("Cannot listen at " + result.path, ENAMETOOLONG);
  auto lock = takeLock(directory, service);
  if (!lock) return Failure{lock.error()};
  result.lock = std::move(*lock);

  result.socket.reset(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!result.socket) return failure("Cannot make a socket", errno);
  const auto bind = [&] {
    return ::bind(result.socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) == 0;
  };
  if (!bind()) {
    if (errno != EADDRINUSE) return failure("Cannot bind " + result.path, errno);
    if (const auto removed = removeStale(directory, service); !removed) return Failure{removed.error()};
    if (!bind()) return failure("Cannot bind " + result.path, errno);
  }
  // Before listening, so that no client meets other permissions. Entitlements decide which peers are admitted.
  struct stat status {};
  if (::chmod(result.path.c_str(), 0666) != 0 || ::stat(result.path.c_str(), &status) != 0) {
    return failure("Cannot open " + result.path + " to everybody", errno);
  }
  result.device = status.st_dev;
  result.inode = status.st_ino;
  if (::listen(result.socket.get(), SOMAXCONN) != 0) return failure("Cannot listen at " + result.path, errno);
  return result;
}

void ServiceSocket::removeFile() {
  struct stat status {};
  if (!path.empty() && ::lstat(path.c_str(), &status) == 0 && status.st_dev == device && status.st_ino == inode) {
    ::unlink(path.c_str());
  }
  path.clear();
  lock.reset();
}

}  // namespace orvanta::platform
