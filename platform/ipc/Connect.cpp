#include "platform/ipc/Connect.h"

#include <sys/socket.h>

#include <cerrno>

#include "platform/core/Text.h"

namespace orvanta::platform {

namespace {
Failure failure(const std::string& path, int error, int* errorNumber) {
  if (errorNumber != nullptr) *errorNumber = error;
  return {"Cannot connect to " + path + ": " + errnoText(error)};
}
}  // namespace

Result<UniqueFd> connectToService(const std::string& directory, const std::string& service, int* errorNumber) {
  if (errorNumber != nullptr) *errorNumber = 0;
  const std::string path = directory + "/" + service;
  const auto address = unixAddress(path);
  if (!address) return failure(path, ENAMETOOLONG, errorNumber);
  UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
  if (!socket) return failure(path, errno, errorNumber);
  if (::connect(socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address) != 0) {
    return failure(path, errno, errorNumber);
  }
  return socket;
}

}  // namespace orvanta::platform
