#include "platform/PeerIdentity.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>

#include "platform/UniqueFd.h"

namespace platform {
namespace {

TEST(PeerIdentityTest, IsWhatTheKernelKnowsOfTheOtherEnd) {
  int fds[2] = {-1, -1};
  ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM, 0, fds), 0);
  const UniqueFd ours(fds[0]);
  const UniqueFd theirs(fds[1]);
  const auto peer = peerIdentityOf(ours.get());
  ASSERT_TRUE(peer.ok()) << peer.error();
  EXPECT_EQ(peer->pid, ::getpid());
  EXPECT_EQ(peer->uid, ::geteuid());
  EXPECT_EQ(peer->gid, ::getegid());
  std::vector<gid_t> groups(static_cast<std::size_t>(::getgroups(0, nullptr)));
  groups.resize(static_cast<std::size_t>(::getgroups(static_cast<int>(groups.size()), groups.data())));
  std::vector<gid_t> found = peer->groups;
  std::sort(groups.begin(), groups.end());
  std::sort(found.begin(), found.end());
  EXPECT_EQ(found, groups);
  EXPECT_EQ(peer->label.find('\0'), std::string::npos);
}

TEST(PeerIdentityTest, FailsWhereNobodyIs) {
  const UniqueFd unconnected(::socket(AF_UNIX, SOCK_STREAM, 0));
  const UniqueFd internet(::socket(AF_INET, SOCK_STREAM, 0));
  for (const int socket : {unconnected.get(), internet.get(), -1}) {
    const auto peer = peerIdentityOf(socket);
    ASSERT_FALSE(peer.ok()) << socket;
    EXPECT_FALSE(peer.error().empty());
  }
}

}  // namespace
}  // namespace platform
