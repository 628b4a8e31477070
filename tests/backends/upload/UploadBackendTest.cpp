#include "backends/upload/UploadBackend.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>

#include <filesystem>
#include <future>

#include "backends/UploadBudget.h"
#include "backends/upload/UploadURL.h"
#include "platform/core/UniqueFd.h"
#include "tests/backends/https/HTTPSFixture.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"

namespace orvanta {
namespace {
using platform::UniqueFd;

TEST(UploadURL, EncodesWhatAQueryCannotHold) {
  EXPECT_EQ(
      fileUploadURL("U", "D", 7, "/tmp/a b.log"),
      "U?uuid=D&sequence=7&description=Parlix%20AFRC%20log%20(Uploaded%20by%20HQX)&filename=a%20b.log.gz&raw=true");
  const std::string kept = "AZaz09-._~!$&'()*+,;=:@/?";
  EXPECT_EQ(percentEncodeForQuery(kept), kept);
  EXPECT_EQ(percentEncodeForQuery("a \"%<>\\^`{|}#[]"), "a%20%22%25%3C%3E%5C%5E%60%7B%7C%7D%23%5B%5D");
  EXPECT_EQ(percentEncodeForQuery("é€\n\x7f\xff"), "%C3%A9%E2%82%AC%0A%7F%FF");
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
    BackendSetup setup;
    setup.identity.sessionID = 7;
    setup.identity.deviceID = "D";
    backend = UploadBackend::create(
        platform, "upload_server",
        std::make_shared<const Dictionary>(Dictionary{{"post_url", url}, {"display_url", "http://show"}}), setup);
  }
  bool upload(const std::string& path, int descriptor) {
    return backend->uploadFileAtPath({path, "token", descriptor, [this] { ++removals; }});
  }
  bool uploadOpened(const std::string& path) {
    const UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
    return upload(path, fd.get());
  }

  test::TestServices<BackendServices> platform;
  test::LogCapture log;
  std::shared_ptr<UploadBackend> backend;
  int removals = 0;
};

TEST_F(UploadBackendTest, OnlyAnAnswerThatSaysSuccessDeletes) {
  using test::ScriptedHttpClient;
  const std::string sending = "<7>UploadBackend(uploadFileAtPath): sending to |http://up.example/u|, Json output: ";
  const std::tuple<platform::HttpResult, int, std::string> rows[] = {
      {ScriptedHttpClient::status(500, "{\"unsuccessful\": 0}"), 1, sending + "{\"unsuccessful\": 0}"},
      {ScriptedHttpClient::status(200, "Success"), 0, sending + "Success"},
      {ScriptedHttpClient::status(200, "success\xff"), 0, sending + "(null)"},
      {{std::nullopt, "no route"}, 0, "<3>UploadBackend(uploadFileAtPath): post no route"},
  };
  for (const auto& row : rows) {
    const auto& [answer, expected, line] = row;
    log.clear();
    removals = 0;
    platform.http.answer = [&row](const auto&) { return std::get<0>(row); };
    EXPECT_TRUE(uploadOpened(platform.directory.write("file", "content")));
    EXPECT_EQ(removals, expected) << line;
    EXPECT_EQ(log.count(line), 1U) << line;
  }
}

// The description of a process's memory grows with it.
TEST_F(UploadBackendTest, AFileThatDoesNotTellItsSizeGoesWholeOrNotAtAll) {
  EXPECT_TRUE(uploadOpened("/proc/self/stat"));
  ASSERT_EQ(platform.http.requests().size(), 1U);
  constexpr std::size_t kPage = 4096, kPages = 6000;
  void* const memory = ::mmap(nullptr, kPages * kPage, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  ASSERT_NE(memory, MAP_FAILED);
  for (std::size_t page = 0; page < kPages; page += 2) {
    ASSERT_EQ(::mprotect(static_cast<char*>(memory) + page * kPage, kPage, PROT_READ), 0);
  }
  EXPECT_FALSE(uploadOpened("/proc/self/smaps"));
  EXPECT_EQ(::munmap(memory, kPages * kPage), 0);
  EXPECT_EQ(log.count("<3>UploadBackend(uploadFileAtPath): The file does not tell its size and has more than "), 1U);
  EXPECT_EQ(platform.http.requests().size(), 1U);
}

TEST_F(UploadBackendTest, RefusesAllButReadableRegularFiles) {
  const std::string& directory = platform.directory.path();
  const std::string file = platform.directory.write("file", "content");
  const std::string sparse = platform.directory.write("sparse", "");
  std::filesystem::resize_file(sparse, UploadBudget::kMaximumFileBytes + 1);
  ASSERT_EQ(::mkfifo((directory + "/fifo").c_str(), 0600), 0);
  const std::string regular = "Only upload a regular file.", empty = "Input file is empty";
  const auto opened = [](const std::string& path, int flags) { return UniqueFd(::open(path.c_str(), flags)); };
  const struct {
    const char* what;
    UniqueFd fd;
    std::string line;
  } rows[] = {
      {"no descriptor", UniqueFd(), regular},
      {"directory", opened(directory, O_RDONLY), regular},
      {"fifo", opened(directory + "/fifo", O_RDWR), regular},
      {"device", opened("/dev/zero", O_RDONLY), regular},
      {"socket", UniqueFd(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)), regular},
      {"empty", opened(platform.directory.write("empty", ""), O_RDONLY), empty},
      {"write only", opened(file, O_WRONLY), empty},
      {"path only", opened(file, O_PATH), empty},
      {"too large", opened(sparse, O_RDONLY), "The file has 134217729 bytes, more than the limit of 134217728."},
  };
  for (const auto& row : rows) {
    log.clear();
    EXPECT_FALSE(upload(file, row.fd.get())) << row.what;
    EXPECT_EQ(log.count("<3>"), 1U) << row.what;
    EXPECT_EQ(log.count("<3>UploadBackend(uploadFileAtPath): " + row.line), 1U) << row.what;
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
  platform.directory.write("file", "another's");
  EXPECT_TRUE(upload(path, fd.get()));
  const auto request = platform.http.requests().at(0);
  EXPECT_EQ(request.url, fileUploadURL("http://up.example/u", "D", 7, path));
  EXPECT_EQ(test::gunzip(request.body), "the client's own");
  EXPECT_EQ(::lseek(fd.get(), 0, SEEK_CUR), 5);
}

TEST_F(UploadBackendTest, RequestsThatCannotBeMade) {
  const std::string path = platform.directory.write("file", "content");
  make("http://h/a b");
  EXPECT_FALSE(uploadOpened(path));
  EXPECT_EQ(log.count("<3>UploadBackend(uploadFileAtPath): Unable to create URL request"), 1U);
  log.clear();
  backend->setUploadURL(std::nullopt);
  EXPECT_FALSE(uploadOpened(path));
  EXPECT_EQ(log.lines(), std::vector<std::string>{"<7>UploadBackend(uploadFileAtPath): Uploading file " + path});
  EXPECT_TRUE(platform.http.requests().empty());

  for (const auto& profile : {SharedDictionary(), std::make_shared<const Dictionary>(),
                              std::make_shared<const Dictionary>(Dictionary{{"post_url", 1}})}) {
    EXPECT_EQ(UploadBackend::create(platform, "upload_server", profile, {}), nullptr);
  }
  EXPECT_EQ(log.count("<3>UploadBackend(initWithName): can't resolve upload post URL."), 3U);
}

TEST_F(UploadBackendTest, UploadsShareTheirMemoryUntilTheDaemonEnds) {
  using Reservation = UploadBudget::Reservation;
  auto& budget = platform.services.uploadBudget;
  auto large = Reservation::take(budget, UploadBudget::kMaximumTotalBytes);
  auto second =
      std::async(std::launch::async, [&] { return Reservation::take(budget, UploadBudget::kMaximumTotalBytes - 1); });
  large->shrinkTo(2);
  EXPECT_EQ(second.wait_for(std::chrono::milliseconds(20)), std::future_status::timeout) << "not yet enough";
  large.reset();
  const auto taken = second.get();
  EXPECT_NE(taken, nullptr);

  const std::string file = platform.directory.write("file", "content");
  const UniqueFd fd(::open(file.c_str(), O_RDONLY | O_CLOEXEC));
  auto waiting = std::async(std::launch::async, [&] { return upload(file, fd.get()); });
  EXPECT_EQ(waiting.wait_for(std::chrono::milliseconds(20)), std::future_status::timeout);
  budget.close();
  EXPECT_FALSE(waiting.get());
  EXPECT_EQ(log.count("<3>UploadBackend(uploadFileAtPath): The daemon is ending."), 1U);
}

}  // namespace
}  // namespace orvanta
