#include "platform/listen/Listener.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <atomic>
#include <cstdlib>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <tuple>
#include <vector>

#include "platform/ipc/Connect.h"
#include "platform/listen/ServiceListener.h"
#include "platform/listen/ServiceSocket.h"
#include "tests/platform/ipc/ConnectionFixture.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {
namespace {

using ::testing::HasSubstr;

const std::string kService = "test.service";
const platform::ListenerLimits kLimits{kDaemonConnectionLimits, kMaximumConnectionsPerUser};

class ListenerTest : public ConnectionFixture {
 protected:
  // Admits every connection.
  Listener::Handler admitting() {
    return [this](OfferedConnection&& offered) {
      offered.connection->resume(std::make_shared<RecordingDelegate>());
      _admitted.add();
      return true;
    };
  }
  static bool refuse(OfferedConnection&& /*offered*/) { return false; }
  Result<std::unique_ptr<Listener>> create(Listener::Handler handler) {
    return Listener::create(*_pool, _directory.path(), kService, kLimits, std::move(handler));
  }
  std::unique_ptr<Listener> listen(Listener::Handler handler) {
    auto listener = create(std::move(handler));
    EXPECT_TRUE(listener.ok()) << listener.error();
    if (!listener) return nullptr;
    (*listener)->resume();
    return std::move(*listener);
  }
  Peer connect() {
    auto socket = connectToService(_directory.path(), kService);
    EXPECT_TRUE(socket.ok()) << socket.error();
    if (!socket) return {};
    return Peer(std::move(*socket));
  }
  std::string socketPath() const { return _directory / kService; }

  TemporaryDirectory _directory;
  Counter _admitted;
};

UniqueFd listeningSocket(const std::string& path, bool listening = true) {
  UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const auto address = unixAddress(path);
  EXPECT_EQ(::bind(socket.get(), reinterpret_cast<const sockaddr*>(&*address), sizeof *address), 0);
  if (listening) {
    EXPECT_EQ(::listen(socket.get(), 8), 0);
  }
  return socket;
}

TEST_F(ListenerTest, OffersAConnectionWithItsPeer) {
  const std::string who = " (pid " + std::to_string(::getpid()) + ", uid " + std::to_string(::geteuid()) + ")";
  std::vector<gid_t> groups(64);
  groups.resize(static_cast<std::size_t>(::getgroups(64, groups.data())));
  const auto listener = listen([&, admit = admitting()](OfferedConnection&& offered) {
    EXPECT_EQ(offered.peer.pid, ::getpid());
    EXPECT_EQ(offered.peer.uid, ::geteuid());
    EXPECT_EQ(offered.peer.gid, ::getegid());
    EXPECT_THAT(offered.peer.groups, ::testing::UnorderedElementsAreArray(groups));
    EXPECT_EQ(offered.peer.label.find('\0'), std::string::npos);
    EXPECT_THAT(offered.connection->description(),
                ::testing::AllOf(::testing::StartsWith("fd "), ::testing::EndsWith(who)));
    return admit(std::move(offered));
  });
  const Peer peer = connect();
  ASSERT_TRUE(_admitted.waitFor(1));
  listener->stop();
  const UniqueFd unconnected(::socket(AF_UNIX, SOCK_STREAM, 0));
  const UniqueFd internet(::socket(AF_INET, SOCK_STREAM, 0));
  for (const int peerless : {unconnected.get(), internet.get(), -1}) EXPECT_FALSE(peerIdentityOf(peerless).ok());
}

TEST_F(ListenerTest, EveryUserMayConnectUnderAnyMaskButNoneIsAcceptedBeforeResume) {
  const mode_t before = ::umask(0077);
  auto listener = create(admitting());
  ::umask(before);
  ASSERT_TRUE(listener.ok());
  struct stat status {};
  ASSERT_EQ(::stat(socketPath().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0666U);
  Peer early = connect();
  EXPECT_EQ(_admitted.value(), 0);
  (*listener)->resume();
  EXPECT_TRUE(_admitted.waitFor(1));
  (*listener)->stop();
}

// One that knows nothing of our lock.
TEST_F(ListenerTest, LeavesAForeignLiveSocketAlone) {
  const UniqueFd foreign = listeningSocket(socketPath());
  const auto listener = create(refuse);
  ASSERT_FALSE(listener.ok());
  EXPECT_THAT(listener.error(), HasSubstr("Process " + std::to_string(::getpid())));
  EXPECT_TRUE(connectToService(_directory.path(), kService).ok());
}

TEST_F(ListenerTest, SaysWhatStandsInTheWay) {
  _directory.write("taken", "a file");
  const std::tuple<std::string, std::string, const char*> rows[] = {
      {_directory.path(), "taken", "no socket"},
      {_directory / "absent", kService, "No such file or directory"},
      {_directory.path(), std::string(120, 'x'), "File name too long"},
  };
  for (const auto& [directory, service, reason] : rows) {
    const auto listener = Listener::create(*_pool, directory, service, kLimits, refuse);
    ASSERT_FALSE(listener.ok()) << service;
    EXPECT_THAT(listener.error(), HasSubstr(reason));
  }
  EXPECT_EQ(::access((_directory / "taken").c_str(), F_OK), 0);
}

TEST_F(ListenerTest, OfSeveralThatStartAtOnceOneWins) {
  { const UniqueFd gone = listeningSocket(socketPath()); }
  constexpr int kStarters = 8;
  Counter ready;
  std::vector<std::future<Result<std::unique_ptr<Listener>>>> starters;
  for (int i = 0; i < kStarters; ++i) {
    starters.push_back(std::async(std::launch::async, [&] {
      ready.add();
      ready.waitFor(kStarters);
      return create(admitting());
    }));
  }
  std::vector<std::unique_ptr<Listener>> winners;
  for (auto& starter : starters) {
    auto listener = starter.get();
    if (listener) {
      winners.push_back(std::move(*listener));
    } else {
      EXPECT_THAT(listener.error(), HasSubstr("listens at"));
    }
  }
  ASSERT_EQ(winners.size(), 1U);
  winners.front()->resume();
  Peer peer = connect();
  EXPECT_TRUE(_admitted.waitFor(1));
  winners.front()->stop();
}

TEST_F(ListenerTest, StopRemovesItsSocketFreesTheNameAndLeavesOthersAlone) {
  for (int round = 0; round < 2; ++round) {
    const auto listener = listen(refuse);
    listener->stop();
    listener->stop();
    int error = 0;
    EXPECT_FALSE(connectToService(_directory.path(), kService, &error).ok());
    EXPECT_EQ(error, ENOENT);
  }
  const auto listener = listen(refuse);
  ASSERT_EQ(::unlink(socketPath().c_str()), 0);
  const UniqueFd foreign = listeningSocket(socketPath());
  listener->stop();
  EXPECT_TRUE(connectToService(_directory.path(), kService).ok());
}

TEST_F(ListenerTest, StopWaitsForHandlersUnderWay) {
  Counter entered, release;
  std::atomic<bool> left = false;
  const auto listener = listen([&](OfferedConnection&&) {
    entered.add();
    release.waitFor(1);
    left = true;
    return false;
  });
  Peer peer = connect();
  ASSERT_TRUE(entered.waitFor(1));
  std::thread releaser([&] { release.add(); });
  listener->stop();
  EXPECT_TRUE(left);
  releaser.join();
  EXPECT_TRUE(peer.atEnd());
}

TEST_F(ListenerTest, OneUserHasOnlySoManyConnectionsAtATime) {
  LogCapture log;
  auto socket = openServiceSocket(_directory.path(), kService);
  ASSERT_TRUE(socket.ok());
  const auto welcoming = [admit = admitting()](OfferedConnection&& offered) {
    offered.connection->outbox()->send(notification("welcome"));
    return admit(std::move(offered));
  };
  ServiceListener listener(*_pool, std::move(*socket), {kDaemonConnectionLimits, 3}, welcoming);
  listener.resume();
  std::vector<Peer> peers;
  for (int i = 0; i < 3; ++i) peers.push_back(connect());
  ASSERT_TRUE(_admitted.waitFor(3));
  for (int i = 0; i < 5; ++i) EXPECT_TRUE(connect().atEnd());
  EXPECT_EQ(_admitted.value(), 3);
  EXPECT_EQ(log.count("User " + std::to_string(::geteuid()) + " has 3 already"), 1U) << "one line a minute";
  // A place is free again once its connection has gone for good.
  peers.pop_back();
  EXPECT_TRUE(eventually([&] { return !connect().atEnd(); }));
  listener.stop();
}

#if !defined(__SANITIZE_ADDRESS__)  // which looks at objects through a pipe and so needs descriptors

// Lets the process open no further descriptor while it lives.
class DescriptorsExhausted {
 public:
  DescriptorsExhausted() {
    ::getrlimit(RLIMIT_NOFILE, &_before);
    const int lowestFree = ::dup(STDERR_FILENO);
    ::close(lowestFree);
    rlimit limit = _before;
    limit.rlim_cur = static_cast<rlim_t>(lowestFree);
    ::setrlimit(RLIMIT_NOFILE, &limit);
  }
  ~DescriptorsExhausted() { ::setrlimit(RLIMIT_NOFILE, &_before); }
  DescriptorsExhausted(const DescriptorsExhausted&) = delete;
  DescriptorsExhausted& operator=(const DescriptorsExhausted&) = delete;

 private:
  rlimit _before{};
};

TEST_F(ListenerTest, PausesWhenDescriptorsRunOutAndGoesOn) {
  LogCapture log;
  auto listener = create(admitting());
  ASSERT_TRUE(listener.ok());
  Peer first = connect();
  Peer second = connect();
  {
    const DescriptorsExhausted exhausted;
    (*listener)->resume();
    ASSERT_TRUE(eventually([&] { return log.contains("<3>Listener: No connection can be accepted"); }));
    EXPECT_EQ(_admitted.value(), 0);
  }
  EXPECT_TRUE(_admitted.waitFor(2));
  EXPECT_EQ(log.count("No connection can be accepted"), 1U);
  (*listener)->stop();
}

// Back-pressure wants a descriptor of its own; without one it must still get on.
TEST_F(ListenerTest, RepliesStillGoOutWhenDescriptorsRunOut) {
  auto made = open();
  const Bytes reply = response(1, std::string(2U << 20U, 'r'));
  {
    const DescriptorsExhausted exhausted;
    EXPECT_TRUE(made.connection->outbox()->send(reply));
    EXPECT_EQ(made.peer.read(reply.size()), reply);
  }
}

#endif

// The test starts itself again as the service manager would start the daemon, with the listening socket as
// descriptor 3.
TEST_F(ListenerTest, TakesTheSocketOfTheServiceManager) {
  if (std::getenv("LISTEN_FDS") != nullptr) {
    const auto listener =
        Listener::create(*_pool, "/nonexistent", kService, kLimits, [admit = admitting()](OfferedConnection&& offered) {
          offered.connection->outbox()->send(notification("activated"));
          return admit(std::move(offered));
        });
    ASSERT_TRUE(listener.ok()) << listener.error();
    (*listener)->resume();
    ASSERT_TRUE(_admitted.waitFor(1));
    (*listener)->stop();
    return;
  }

  const UniqueFd listening = listeningSocket(socketPath());
  const pid_t child = ::fork();
  if (child == 0) {
    ::setenv("LISTEN_FDS", "1", 1);
    ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
    ::dup2(::dup(listening.get()), 3);  // the duplicate is not closed when the program starts
    ::execl("/proc/self/exe", "test", "--gtest_filter=ListenerTest.TakesTheSocketOfTheServiceManager", nullptr);
    ::_exit(127);
  }
  ASSERT_GT(child, 0);
  Peer peer = connect();
  const Bytes expected = notification("activated");
  EXPECT_EQ(peer.read(expected.size()), expected);
  int status = -1;
  ::waitpid(child, &status, 0);
  EXPECT_EQ(status, 0);
  EXPECT_EQ(::access(socketPath().c_str(), F_OK), 0) << "the socket file is the service manager's";
}

TEST(ConnectToServiceTest, TellsWhyNot) {
  const TemporaryDirectory directory;
  const UniqueFd bound = listeningSocket(directory / "deaf", false);
  directory.write("file", "no socket");
  const std::tuple<std::string, std::string, int> rows[] = {
      {directory.path(), "absent", ENOENT},     {directory / "absent", "service", ENOENT},
      {directory.path(), "deaf", ECONNREFUSED}, {directory.path(), "file", ECONNREFUSED},
      {directory / "file", "service", ENOTDIR}, {directory.path(), std::string(200, 'x'), ENAMETOOLONG},
  };
  for (const auto& [in, service, expected] : rows) {
    int error = 0;
    const auto socket = connectToService(in, service, &error);
    ASSERT_FALSE(socket.ok()) << service;
    EXPECT_EQ(error, expected) << service;
    EXPECT_THAT(socket.error(), HasSubstr(in + "/" + service));
  }
}

TEST(ConnectToServiceTest, DoesNotWaitForABusyService) {
  const TemporaryDirectory directory;
  const UniqueFd listening = listeningSocket(directory / "busy");
  std::vector<UniqueFd> waiting;
  int error = 0;
  while (waiting.size() < 100) {
    auto socket = connectToService(directory.path(), "busy", &error);
    if (!socket) break;
    EXPECT_EQ(::fcntl(socket->get(), F_GETFD) & FD_CLOEXEC, FD_CLOEXEC);
    waiting.push_back(std::move(*socket));
  }
  EXPECT_EQ(error, EAGAIN);
}

}  // namespace
}  // namespace orvanta::test
