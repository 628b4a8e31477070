#include "backends/UploadBackend.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <filesystem>
#include <thread>

#include "backends/UploadBudget.h"
#include "backends/UploadURL.h"
#include "platform/UniqueFd.h"
#include "tests/backends/HTTPSFixture.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {

using platform::Dictionary;
using platform::UniqueFd;

TEST(UploadURL, EncodesWhatAQueryCannotHold) {
  const std::pair<const char*, const char*> rows[] = {{"AZaz09-._~", "AZaz09-._~"},
                                                      {"!$&'()*+,;=:@/?", "!$&'()*+,;=:@/?"},
                                                      {"a b", "a%20b"},
                                                      {"100%", "100%25"},
                                                      {"\"<>\\^`{|}#[]", "%22%3C%3E%5C%5E%60%7B%7C%7D%23%5B%5D"},
                                                      {"é€", "%C3%A9%E2%82%AC"},
                                                      {"\n\x7f\xff", "%0A%7F%FF"}};
  for (const auto& [text, encoded] : rows) EXPECT_EQ(percentEncodeForQuery(text), encoded);
}

TEST(UploadURL, LastPathComponentAndWholeAddress) {
  const std::pair<const char*, const char*> rows[] = {{"/tmp/a b.log", "a b.log"},
                                                      {"a", "a"},
                                                      {"/a/b/", "b"},
                                                      {"/a//", "a"},
                                                      {"/", "/"},
                                                      {"//", "/"},
                                                      {"", ""},
                                                      {"/..", ".."}};
  for (const auto& [path, last] : rows) EXPECT_EQ(lastPathComponent(path), last) << path;
  EXPECT_EQ(
      fileUploadURL("U", "D", 7, "/tmp/a b.log"),
      "U?uuid=D&sequence=7&description=Parlix%20AFRC%20log%20(Uploaded%20by%20HQX)&filename=a%20b.log.gz&raw=true");
}

TEST(UploadURL, Validity) {
  for (const char* good : {"http://h", "https://h:8443/p?q=a%20b#f", "HTTP://[::1]/", "x+y-z.1://u:p@h"}) {
    EXPECT_TRUE(isValidURL(good)) << good;
  }
  for (const char* bad : {"", "h", "://h", "1ttp://h", "ht tp://h", "http:/h", "http://", "http:///p", "http://?q",
                          "http://:80", "http://h/a b", "http://h/%2", "http://h/%zz", "http://h/%", "http://h/\"",
                          "http://h/é", "http://h/\n", "http://h/<>", "http://h/\x7f"}) {
    EXPECT_FALSE(isValidURL(bad)) << bad;
  }
}

class UploadBackendTest : public ::testing::Test {
 protected:
  UploadBackendTest() { make("http://up.example/u"); }

  void make(const std::string& url) {
    backend = UploadBackend::create(
        platform, "upload_server",
        std::make_shared<const Dictionary>(Dictionary{{"post_url", url}, {"display_url", "http://show"}}), "Parva");
    BackendIdentity identity;
    identity.sessionID = 7;
    identity.udid = "D";
    backend->setIdentity(std::move(identity));
  }
  bool upload(const std::string& path, int descriptor) {
    return backend->uploadFileAtPath({path, "token", descriptor, [this] { ++removals; }});
  }
  bool uploadOpened(const std::string& path) {
    const UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    return upload(path, fd.get());
  }

  test::TestPlatform platform;
  test::LogCapture log;
  std::shared_ptr<UploadBackend> backend;
  int removals = 0;
};

TEST_F(UploadBackendTest, PostsTheCompressedFile) {
  const std::string content(100'000, 'x');
  const std::string path = platform.directory.write("a b.log", content);
  EXPECT_TRUE(uploadOpened(path));
  const auto requests = platform.http.requests();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_EQ(requests[0].method, "POST");
  EXPECT_EQ(requests[0].url, fileUploadURL("http://up.example/u", "D", 7, path));
  EXPECT_EQ(test::headerOf(requests[0], "Content-Type"), "application/octet-stream");
  EXPECT_EQ(test::headerOf(requests[0], "Content-Encoding"), "gzip");
  EXPECT_EQ(requests[0].headers.size(), 2U);
  EXPECT_EQ(test::gunzip(requests[0].body), content);
  EXPECT_EQ(backend->displayURL(), "http://show");
}

TEST_F(UploadBackendTest, OnlyAnAnswerThatSaysSuccessDeletes) {
  using test::ScriptedHttpClient;
  const struct {
    platform::HttpResult answer;
    int removals;
    const char* line;
  } rows[] = {
      {ScriptedHttpClient::status(200, "{\"unsuccessful\": 0}"), 1,
       "<7>UploadBackend(uploadFileAtPath): sending to |http://up.example/u|, Json output: {\"unsuccessful\": 0}"},
      {ScriptedHttpClient::status(500, "success"), 1, "Json output: success"},
      {ScriptedHttpClient::status(200, "Success"), 0, "Json output: Success"},
      {ScriptedHttpClient::status(200, ""), 0, "<7>UploadBackend(uploadFileAtPath): sending to |"},
      {ScriptedHttpClient::status(200, "success\xff"), 0, "Json output: (null)"},
      {{std::nullopt, "no route"}, 0, "<3>UploadBackend(uploadFileAtPath): post no route"},
  };
  for (const auto& row : rows) {
    log.clear();
    removals = 0;
    platform.http.answer = [&row](const auto&) { return row.answer; };
    EXPECT_TRUE(uploadOpened(platform.directory.write("file", "content")));
    EXPECT_EQ(removals, row.removals) << row.line;
    EXPECT_EQ(log.count(row.line), 1U) << row.line;
  }
}

TEST_F(UploadBackendTest, RefusesWhatIsNoReadableRegularFile) {
  const std::string& directory = platform.directory.path();
  const std::string file = platform.directory.write("file", "content");
  const std::string sparse = platform.directory.write("sparse", "");
  std::filesystem::resize_file(sparse, UploadBudget::kMaximumFileBytes + 1);
  ASSERT_EQ(::mkfifo((directory + "/fifo").c_str(), 0600), 0);
  std::filesystem::create_symlink("fifo", directory + "/link");
  const UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  const char* const kRegular = "<3>UploadBackend(uploadFileAtPath): Only upload a regular file.";
  const char* const kEmpty = "<3>UploadBackend(uploadFileAtPath): Input file is empty";
  const auto opened = [](const std::string& path, int flags) { return UniqueFd(::open(path.c_str(), flags)); };
  const struct {
    const char* what;
    UniqueFd fd;
    std::string line;
  } rows[] = {
      {"no descriptor", UniqueFd(), kRegular},
      {"directory", opened(directory, O_RDONLY), kRegular},
      {"fifo", opened(directory + "/fifo", O_RDWR), kRegular},
      {"link to a fifo", opened(directory + "/link", O_RDWR), kRegular},
      {"device", opened("/dev/zero", O_RDONLY), kRegular},
      {"socket", UniqueFd(::dup(socket.get())), kRegular},
      {"empty", opened(platform.directory.write("empty", ""), O_RDONLY), kEmpty},
      {"write only", opened(file, O_WRONLY), kEmpty},
      {"path only", opened(file, O_PATH), kEmpty},
      {"too large", opened(sparse, O_RDONLY),
       "<3>UploadBackend(uploadFileAtPath): The file has 134217729 bytes, more than the limit of 134217728."},
  };
  for (const auto& row : rows) {
    log.clear();
    EXPECT_FALSE(upload(file, row.fd.get())) << row.what;
    EXPECT_EQ(log.count("<3>"), 1U) << row.what;
    EXPECT_EQ(log.count(row.line), 1U) << row.what;
  }
  const UniqueFd fd(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_FALSE(backend->uploadFileAtPath({file, std::nullopt, fd.get(), {}})) << "no token";
  EXPECT_TRUE(platform.http.requests().empty());
}

TEST_F(UploadBackendTest, ReadsThroughTheDescriptorFromTheBeginningAndNeverByThePath) {
  const std::string path = platform.directory.write("file", "the client's own");
  const UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  ::lseek(fd.get(), 5, SEEK_SET);
  std::filesystem::remove(path);
  platform.directory.write("file", "somebody else's");
  EXPECT_TRUE(upload(path, fd.get()));
  EXPECT_EQ(test::gunzip(platform.http.requests().at(0).body), "the client's own");
  EXPECT_EQ(::lseek(fd.get(), 0, SEEK_CUR), 5);
}

TEST_F(UploadBackendTest, RequestsThatCannotBeMade) {
  const std::string path = platform.directory.write("file", "content");
  for (const char* url : {"not a url", "http://h/a b", "relative"}) {
    make(url);
    log.clear();
    EXPECT_FALSE(uploadOpened(path)) << url;
    EXPECT_EQ(log.count("<3>UploadBackend(uploadFileAtPath): Unable to create URL request"), 1U) << url;
  }
  log.clear();
  backend->setUploadURL(std::nullopt);
  EXPECT_FALSE(uploadOpened(path));
  EXPECT_EQ(log.lines(), std::vector<std::string>{"<7>UploadBackend(uploadFileAtPath): Uploading file " + path});
  EXPECT_TRUE(platform.http.requests().empty());

  log.clear();
  for (const auto& profile : {SharedDictionary(), std::make_shared<const Dictionary>(),
                              std::make_shared<const Dictionary>(Dictionary{{"post_url", 1}})}) {
    EXPECT_EQ(UploadBackend::create(platform, "upload_server", profile, "Parva"), nullptr);
  }
  EXPECT_EQ(log.count("<3>UploadBackend(initWithName): can't resolve upload post URL."), 3U);
}

TEST_F(UploadBackendTest, UploadsShareTheirMemory) {
  UploadBudget budget;
  std::optional<UploadBudget::Share> large(std::in_place, budget, UploadBudget::kMaximumTotalBytes);
  std::atomic<bool> admitted = false;
  std::thread second([&] {
    const UploadBudget::Share share(budget, UploadBudget::kMaximumTotalBytes - 1);
    admitted = true;
  });
  large->shrinkTo(2);  // not yet enough
  EXPECT_FALSE(admitted);
  large.reset();
  second.join();
  EXPECT_TRUE(admitted);
}

}  // namespace
}  // namespace orvanta
