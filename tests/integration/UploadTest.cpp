#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/capability.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <filesystem>
#include <future>
#include <thread>

#include "platform/codec/PropertyList.h"
#include "tests/integration/IntegrationFixture.h"
#include "tests/support/ForbiddenActs.h"
#include "tests/support/Peer.h"

namespace orvanta::test {
namespace {

namespace fs = std::filesystem;

constexpr char kNotRegular[] = "<3>UploadBackend(uploadFileAtPath): Only upload a regular file.";

// Gives up the calling thread's, and its later threads', right to write where the file modes forbid it.
void heedFileModes() {
  __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
  __user_cap_data_struct sets[2]{};
  ASSERT_EQ(::syscall(SYS_capget, &header, sets), 0);
  sets[0].effective &= ~(1U << CAP_DAC_OVERRIDE);
  ASSERT_EQ(::syscall(SYS_capset, &header, sets), 0);
}

class UploadTest : public IntegrationFixture {
 protected:
  void SetUp() override {
    IntegrationFixture::SetUp();
    setSection({{"upload_server", Dictionary{{"post_url", server->httpsURL("/upload")}}}});
    startDaemon();
    session = openSession({.sessionID = 77});
  }
  bool upload(const std::string& path) { return upload(*session, path); }
  static bool upload(OrvantaConnection& connection, const std::string& path) {
    const auto answer = connection.session().blocking().uploadFile(path);
    EXPECT_TRUE(answer) << answer.error().text;
    return answer && *answer;
  }
  void answerWith(std::string body) {
    collector::PathBehaviour behaviour;
    behaviour.body = std::move(body);
    server->setBehaviour("/upload", behaviour);
  }
  std::vector<collector::ReceivedRequest> uploads() { return server->requests(RequestKind::upload); }

  TemporaryDirectory files;
  std::unique_ptr<OrvantaConnection> session;
};

TEST_F(UploadTest, FilesOfAnyNameArriveUnderItAndAreRemoved) {
  const char* const names[] = {"plain.log", "a b.log", "100%.log", "%41",        "grüße €.log",
                               "a\nb",      "#?=+",    "\xff\xfe", "'\"\\`<>{}", "~(*)!;:@,$"};
  std::size_t number = 0;
  for (const std::string name : names) {
    const std::string content = "content of " + name;
    const auto path = files.write(name, content);
    EXPECT_TRUE(upload(path)) << name;
    EXPECT_FALSE(fs::exists(path)) << name;
    const auto received = uploads();
    ASSERT_EQ(received.size(), ++number) << name;
    const auto& post = received.back();
    EXPECT_EQ(post.body, content);
    EXPECT_EQ(post.method, "POST");
    EXPECT_EQ(post.parameter("filename"), name + ".gz");
    EXPECT_EQ(post.target.find("/upload?uuid=00112233445566778899aabbccddeeff00112233&sequence=77&"
                               "description=Parlix%20AFRC%20log%20(Uploaded%20by%20HQX)&filename="),
              0U);
    EXPECT_EQ(*post.header("Content-Type"), "application/octet-stream");
    EXPECT_EQ(*post.header("Content-Encoding"), "gzip");
  }
}

TEST_F(UploadTest, WhateverDoesNotSaySuccessKeepsTheFile) {
  const auto path = files.write("file", "content");
  answerWith("SUCCESS");
  EXPECT_TRUE(upload(path));
  server->clearBehaviours();
  server->setFault("/upload", collector::ConnectionFault::reset);
  EXPECT_TRUE(upload(path)) << "the request was made";
  EXPECT_TRUE(daemon->logged("<3>UploadBackend(uploadFileAtPath): post "));
  EXPECT_TRUE(fs::exists(path));
}

TEST_F(UploadTest, AFileIsReadAndRemovedAsItWasOpened) {
  const auto precious = files.write("precious", "not the client's to give");
  const auto path = files.write("file", "the client's own");
  collector::PathBehaviour slow;
  slow.delay = std::chrono::milliseconds(1000);
  server->setBehaviour("/upload", slow);
  auto answer = std::async(std::launch::async, [&] { return upload(path); });
  EXPECT_TRUE(daemon->logged("UploadBackend(uploadFileAtPath): Uploading file"));
  fs::remove(path);
  fs::create_symlink(precious, path);
  EXPECT_TRUE(answer.get());
  EXPECT_EQ(uploads().back().body, "the client's own");
  EXPECT_TRUE(fs::exists(precious));
  EXPECT_TRUE(fs::is_symlink(path));
}

TEST_F(UploadTest, FilesThatChangeWhileTheyAreReadDoNoHarm) {
  answerWith("kept");
  const auto growing = files.write("growing", std::string(1'000'000, 'g'));
  const auto shrinking = files.write("shrinking", std::string(1'000'000, 's'));
  std::atomic<bool> done{false};
  std::thread writer([&] {
    std::ofstream more(growing, std::ios::binary | std::ios::app);
    for (int grown = 0; !done; ++grown) {
      if (grown < 5000) more << std::string(1000, 'h') << std::flush;
      fs::resize_file(shrinking, 0);
      fs::resize_file(shrinking, 1'000'000);
    }
  });
  for (int i = 0; i < 6; ++i) {
    EXPECT_TRUE(upload(growing));
    upload(shrinking);  // false when nothing was left of it
  }
  done = true;
  writer.join();
  for (const auto& post : uploads()) {
    EXPECT_EQ(post.damage + post.note, "") << "whole gzip bodies";
    if (post.parameter("filename") == "shrinking.gz") {
      EXPECT_LE(post.body.size(), 1'000'000U);
    } else {
      EXPECT_EQ(post.body.substr(0, 1'000'000), std::string(1'000'000, 'g'));
      EXPECT_EQ(post.body.find_first_not_of('h', 1'000'000), std::string::npos);
    }
  }
}

TEST_F(UploadTest, AFileInADirectoryThatMayNotBeWrittenStays) {
  const auto path = files.write("locked/file", "content");
  fs::permissions(files / "locked", fs::perms::owner_read | fs::perms::owner_exec);
  std::async(std::launch::async, [&] {
    heedFileModes();
    const auto restricted = openSession({.sessionID = 1});
    EXPECT_TRUE(upload(*restricted, path));
  }).get();
  EXPECT_TRUE(fs::exists(path));
  EXPECT_EQ(uploads().back().body, "content");
  fs::permissions(files / "locked", fs::perms::owner_all);
}

TEST_F(UploadTest, WhatIsNoRegularFileIsRefusedAtOnceAndStays) {
  const auto fifo = files / "fifo", socket = files / "socket", link = files / "link";
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  ASSERT_EQ(binding(socket), "done");
  fs::create_symlink("fifo", link);
  std::size_t refused = 0;
  for (const std::string& path :
       {fifo, socket, link, files.path(), std::string("/dev/zero"), std::string("/dev/tty")}) {
    EXPECT_FALSE(upload(path)) << path;
    EXPECT_TRUE(daemon->logged(kNotRegular, ++refused)) << path;
    EXPECT_TRUE(fs::exists(path)) << path;
  }
  EXPECT_FALSE(upload(files.write("empty", "")));
  EXPECT_TRUE(fs::exists(files / "empty"));
  EXPECT_TRUE(daemon->logged("<3>UploadBackend(uploadFileAtPath): Input file is empty"));
  EXPECT_TRUE(uploads().empty());
}

TEST_F(UploadTest, WithoutTokenAndDescriptorNothingIsRead) {
  const auto path = files.write("file", "content");
  const platform::UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  const platform::UniqueFd zero(::open("/dev/zero", O_RDONLY | O_CLOEXEC));
  const auto descriptors = daemon->descriptorCount();
  const auto call = [&](std::uint32_t id, const Value& token) {
    return request(id, "uploadFileAtPath", {"file://" + path, token});
  };
  RawClient client(daemon->runtimeDirectory());
  client.write(
      request(1, "setSessionInfo", {Dictionary{{"sessionID", 5}, {"clientType", 5}}, nullptr, nullptr, false}));
  client.write(request(2, "startConfigWithCompletionHandler"));
  client.write(call(3, nullptr));
  client.write(call(4, "a token"));
  client.writeWithDescriptors(call(5, "a token"), {zero.get()});
  client.writeWithDescriptors(call(6, "a token"), {file.get()});
  for (std::uint32_t id = 1; id <= 5; ++id) {
    const auto answer = client.answer();
    ASSERT_TRUE(answer && answer->messageID == id) << id;
    EXPECT_TRUE(id <= 2 || answer->result == Value(Array{false})) << id;
  }
  EXPECT_TRUE(daemon->logged(kNotRegular, 3));
  const auto removal = client.answer(), answer = client.answer();
  ASSERT_TRUE(removal && answer);
  EXPECT_EQ(removal->method, "removeFile");
  EXPECT_EQ(removal->params, Array{"a token"});
  EXPECT_EQ(answer->result, Value(Array{true}));
  EXPECT_EQ(uploads().size(), 1U);
  EXPECT_TRUE(fs::exists(path)) << "the daemon removes nothing itself";
  EXPECT_TRUE(daemon->settles([this] { return daemon->descriptorCount(); }, descriptors + 2));
}

using LogDataTest = IntegrationFixture;

TEST_F(LogDataTest, LogDataIsArchivedAndAnnounced) {
  setSection({{"http_post", httpPost(clientSection())},
              {"dashboard", Dictionary{{"ip", "127.0.0.1"},
                                       {"port", server->dashboardPort()},
                                       {"post_url", server->httpURL("/logdata")}}}});
  startDaemon();
  auto session = openSession({.sessionID = 77});
  const Array logData{1, 2.5, true, "grüße", platform::Date{86400}, platform::Data{{1, 2}}, Dictionary{{"k", Array{}}}};
  const auto answer = session->session().blocking().uploadLogData(std::make_shared<const Array>(logData));
  ASSERT_TRUE(answer && answer->uploaded);
  EXPECT_FALSE(answer->error);
  const auto posts = server->requests(RequestKind::logData);
  ASSERT_EQ(posts.size(), 1U);
  EXPECT_EQ(*posts[0].header("Content-Type"), "application/octet-stream");
  const auto archive = platform::parseBinaryPropertyList(
      {reinterpret_cast<const std::uint8_t*>(posts[0].body.data()), posts[0].body.size()});
  ASSERT_TRUE(archive) << archive.error();
  EXPECT_EQ(*archive, Dictionary({{"archiver", "OrvantaArchiver"}, {"version", 1}, {"root", logData}}));
  ASSERT_TRUE(server->waitForDatagrams(2, kTimeout)) << "the start of the session, and the announcement";
  const auto announcement = server->datagrams()[1];
  EXPECT_EQ(announcement.method, 0);
  EXPECT_EQ(announcement.respCode, 2);
  EXPECT_EQ(announcement.eventNumber, 2);
  EXPECT_EQ(announcement.text.find(" LogDataUploadLocation=" + server->httpURL("/logdata/")), 0U);
}

}  // namespace
}  // namespace orvanta::test
