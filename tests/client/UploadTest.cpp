#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <filesystem>
#include <vector>

#include "client/UploadTokens.h"
#include "interface/FileURL.h"
#include "tests/client/ClientFixture.h"

namespace orvanta::test {
namespace {

std::string contentOf(int fd) {
  std::array<char, 1000> buffer{};
  const auto count = ::read(fd, buffer.data(), buffer.size());
  return count < 0 ? "unreadable" : std::string(buffer.data(), static_cast<std::size_t>(count));
}

class Upload : public ClientFixture {
 protected:
  // The daemon's view of one upload that the test has begun.
  struct Call {
    Frame frame;
    std::string url;
    std::string token;
    platform::UniqueFd file;
  };
  Call nextUpload() {
    Call call{peer->expect("uploadFileAtPath"), {}, {}, peer->takeDescriptor()};
    call.url = *call.frame.params[0].string();
    call.token = *call.frame.params[1].string();
    return call;
  }
  // Uploads, lets `meanwhile` happen, has the daemon ask for the removal, and answers.
  template <class Meanwhile>
  void uploadAndRemove(const std::string& path, Meanwhile meanwhile) {
    Awaited<UploadReply> uploaded;
    session().uploadFileAtPath(path, uploaded.reply());
    const auto call = nextUpload();
    meanwhile();
    peer->notify("removeFile", {call.token});
    peer->answer(call.frame, {true});
    EXPECT_TRUE(std::get<0>(*uploaded.get().values));
  }

  TemporaryDirectory files;
};

TEST_F(Upload, passesTheOpenFileWithTheCallAndForgetsTheTokenWithTheAnswer) {
  const auto path = files.write("a b%ü.log", "content");
  Awaited<UploadReply> uploaded;
  session().uploadFileAtPath(path, uploaded.reply());
  const auto call = nextUpload();
  EXPECT_TRUE(call.url.ends_with("/a%20b%25%C3%BC.log")) << call.url;
  EXPECT_GE(call.token.size(), 16U);
  EXPECT_EQ(contentOf(call.file.get()), "content");
  EXPECT_EQ(::fcntl(call.file.get(), F_GETFL) & O_ACCMODE, O_RDONLY);
  EXPECT_EQ(peer->waitingDescriptors(), 0U);
  peer->answer(call.frame, {true});
  EXPECT_TRUE(std::get<0>(*uploaded.get().values));
  peer->notify("removeFile", {call.token});
  exchangeOneCall();
  EXPECT_TRUE(std::filesystem::exists(path));
}

TEST_F(Upload, removesNoOtherFileThanTheOneItOpened) {
  const auto path = files.write("f", "mine");
  uploadAndRemove(path, [&] {
    std::filesystem::remove(path);
    files.write("f", "another file");
  });
  EXPECT_TRUE(std::filesystem::exists(path));
}

TEST_F(Upload, removesTheFileBehindALink) {
  const auto target = files.write("target", "x");
  const auto link = files / "link";
  std::filesystem::create_symlink(target, link);
  uploadAndRemove(link, [] {});
  EXPECT_FALSE(std::filesystem::exists(target));
  EXPECT_TRUE(std::filesystem::is_symlink(link));
}

TEST_F(Upload, ofWhatCannotBeOpenedFailsHere) {
  const std::string paths[] = {files / "missing", files.write("f", "x") + "/below-a-file", ""};
  for (const auto& path : paths) {
    Awaited<UploadReply> uploaded;
    session().uploadFileAtPath(path, uploaded.reply());
    const auto outcome = uploaded.get();
    EXPECT_FALSE(outcome.values) << path;
    EXPECT_EQ(outcome.error.kind, CallErrorKind::fileNotReadable) << path;
    EXPECT_NE(outcome.error.text.find(path), std::string::npos) << outcome.error.text;
  }
  exchangeOneCall();
}

TEST_F(Upload, neitherWaitsForAFifoNorOpensIt) {
  const auto fifo = files / "fifo";
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  Awaited<UploadReply> uploaded;
  session().uploadFileAtPath(fifo, uploaded.reply());
  const auto call = nextUpload();
  struct stat attributes {};
  EXPECT_TRUE(::fstat(call.file.get(), &attributes) == 0 && S_ISFIFO(attributes.st_mode));
  EXPECT_EQ(::open(fifo.c_str(), O_WRONLY | O_NONBLOCK | O_CLOEXEC), -1) << "no reader, so no writer was woken";
  peer->notify("removeFile", {call.token});
  peer->answer(call.frame, {false});
  EXPECT_FALSE(std::get<0>(*uploaded.get().values));
  EXPECT_TRUE(std::filesystem::exists(fifo)) << "only regular files are removed";
}

TEST_F(Upload, takesTheCallersOwnToken) {
  const auto path = files.write("with space", "x");
  Awaited<UploadReply> uploaded, twice, elsewhere;
  session().uploadFileAtPath(fileURLForPath(path), "token-1", uploaded.reply());
  session().uploadFileAtPath(fileURLForPath(path), "token-1", twice.reply());
  session().uploadFileAtPath(std::string("http://server/file"), "token-2", elsewhere.reply());
  EXPECT_EQ(twice.get().error.kind, CallErrorKind::refused);
  EXPECT_EQ(elsewhere.get().error.kind, CallErrorKind::fileNotReadable);
  const auto call = nextUpload();
  EXPECT_EQ(call.token, "token-1");
  EXPECT_EQ(contentOf(call.file.get()), "x");
  peer->answer(call.frame, {true});
  EXPECT_TRUE(uploaded.get().values);
}

TEST_F(Upload, keepsNoMoreDescriptorsWaitingThanTheDaemonAllows) {
  const auto path = files.write("f", "x");
  std::vector<Call> calls;
  for (std::size_t i = 0; i < UploadTokens::kMaximumInFlight; ++i) {
    session().uploadFileAtPath(path, {});
    calls.push_back(nextUpload());
    EXPECT_EQ(calls.back().frame.kind, Frame::Kind::request) << "the answer is wanted here";
  }
  Awaited<UploadReply> tooMany;
  session().uploadFileAtPath(path, tooMany.reply());
  EXPECT_EQ(tooMany.get().error.kind, CallErrorKind::tooMuchWaiting);

  auto waiting = std::async(std::launch::async, [&] { return session().blocking().uploadFile(path); });
  peer->answer(calls[7].frame, {true});
  peer->answer(nextUpload().frame, {true});
  EXPECT_TRUE(within(waiting).value());

  session().uploadFileAtPath(path, {});  // takes the free place again
  waiting = std::async(std::launch::async, [&] { return session().blocking().uploadFile(path); });
  peer->close();
  EXPECT_FALSE(within(waiting)) << "waiting for a place ends with the connection";
}

TEST(FileURLs, readBackAsThePathsTheyCameFrom) {
  std::string allBytes = "/";
  for (int c = 1; c < 256; ++c) allBytes += static_cast<char>(c);
  for (const auto& path : {std::string("/"), std::string("/tmp/a b.log"), std::string("/ü%20"), allBytes}) {
    EXPECT_EQ(pathForFileURL(fileURLForPath(path)), path);
  }
  EXPECT_EQ(fileURLForPath("/a b/c-d_e.f~"), "file:///a%20b/c-d_e.f~");
  EXPECT_EQ(pathForFileURL("file://localhost/x%c3%A4"), "/x\xc3\xa4");
}

TEST(FileURLs, ofOtherKindsAreRefused) {
  for (const char* url : {"", "/tmp/x", "file:/tmp/x", "file://", "file://host/x", "http://localhost/x", "file:///%",
                          "file:///%2", "file:///%zz", "file:///a%00b", "file://localhostx"}) {
    EXPECT_EQ(pathForFileURL(url), std::nullopt) << url;
  }
}

}  // namespace
}  // namespace orvanta::test
