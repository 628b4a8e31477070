#include "platform/ipc/SocketIo.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/uio.h>

#include <cerrno>
#include <cstring>

namespace orvanta::platform {

namespace {

// The kernel passes no more with one message (its SCM_MAX_FD), so that what is lost was lost for want of descriptors.
constexpr std::size_t kMostDescriptors = 253;

void takeDescriptors(msghdr& message, std::vector<UniqueFd>& descriptors) {
  for (cmsghdr* header = CMSG_FIRSTHDR(&message); header != nullptr; header = CMSG_NXTHDR(&message, header)) {
    if (header->cmsg_level != SOL_SOCKET || header->cmsg_type != SCM_RIGHTS) continue;
    const std::size_t count = (header->cmsg_len - CMSG_LEN(0)) / sizeof(int);
    for (std::size_t i = 0; i < count; ++i) {
      int descriptor = -1;
      std::memcpy(&descriptor, CMSG_DATA(header) + i * sizeof(int), sizeof descriptor);
      descriptors.emplace_back(descriptor);
    }
  }
}

}  // namespace

Received receiveBytes(int socket, std::span<std::uint8_t> buffer, std::vector<UniqueFd>& descriptors) {
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int) * kMostDescriptors)];
  iovec vector{buffer.data(), buffer.size()};
  msghdr message{};
  message.msg_iov = &vector;
  message.msg_iovlen = 1;
  message.msg_control = control;
  message.msg_controllen = sizeof control;

  ssize_t size = -1;
  do {
    size = ::recvmsg(socket, &message, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
  } while (size < 0 && errno == EINTR);
  if (size < 0) return {errno == EAGAIN ? Received::Kind::nothing : Received::Kind::broken, 0, false};
  takeDescriptors(message, descriptors);
  if (size == 0) return {Received::Kind::endOfFile, 0, false};
  return {Received::Kind::bytes, static_cast<std::size_t>(size), (message.msg_flags & MSG_CTRUNC) != 0};
}

Sent sendBytes(int socket, std::span<const std::uint8_t> bytes, int descriptor) {
  iovec vector{const_cast<std::uint8_t*>(bytes.data()), bytes.size()};
  msghdr message{};
  message.msg_iov = &vector;
  message.msg_iovlen = 1;
  alignas(cmsghdr) char control[CMSG_SPACE(sizeof(int))] = {};
  if (descriptor >= 0) {
    message.msg_control = control;
    message.msg_controllen = sizeof control;
    cmsghdr* const header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int));
    std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
  }

  ssize_t size = -1;
  do {
    size = ::sendmsg(socket, &message, MSG_DONTWAIT | MSG_NOSIGNAL);
  } while (size < 0 && errno == EINTR);
  if (size >= 0) return {Sent::Kind::some, static_cast<std::size_t>(size)};
  switch (errno) {
    case EAGAIN:
      return {Sent::Kind::full, 0};
    case ENOBUFS:
    case ENOMEM:
    case ETOOMANYREFS:
      return {Sent::Kind::starved, 0};
    default:
      return {Sent::Kind::broken, 0};
  }
}

bool hasHungUp(int socket) {
  pollfd entry{socket, POLLRDHUP, 0};
  return ::poll(&entry, 1, 0) == 1 && (entry.revents & (POLLHUP | POLLERR)) != 0;
}

}  // namespace orvanta::platform
