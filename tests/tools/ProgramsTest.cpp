#include <gmock/gmock.h>

#include <csignal>
#include <filesystem>

#include "platform/codec/Json.h"
#include "tests/support/Bytes.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/storebag/StorebagFile.h"

// The programs orvanta-storebag, orvanta-collector and orvantactl, as a user starts them.

namespace orvanta {
namespace {

using test::ChildProcess;
using test::DaemonProcess;
using test::TemporaryDirectory;
using testing::HasSubstr;

struct Outcome {
  int status = 0;
  std::string output;
  std::string errors;
};

Outcome run(const std::string& program, std::vector<std::string> arguments) {
  ChildProcess::Options options;
  options.program = program.starts_with('/') ? program : DaemonProcess::programPath(program);
  options.arguments = std::move(arguments);
  options.keepOutput = true;
  ChildProcess process(std::move(options));
  const int status = process.wait();
  return {status, process.output(), process.allLines()};
}

TEST(StorebagProgramTest, SignsVerifiesAndShows) {
  const TemporaryDirectory directory;
  const std::string bag = directory.write("bag.json", R"({"version":"7","release":{"http_post":{"clients":[]}}})");
  const std::string key = directory / "key.pem";
  const std::string publicKey = directory / "publicKey.der";
  const std::string document = directory / "bag.storebag";
  ASSERT_EQ(run("orvanta-storebag", {"make-key", key, "-o", publicKey}).status, 0);
  ASSERT_EQ(run("orvanta-storebag", {"sign", bag, "-k", key, "-o", document, "--container", "binary"}).status, 0);
  const auto verified = run("orvanta-storebag", {"verify", document, "-k", publicKey});
  EXPECT_EQ(verified.status, 0);
  EXPECT_THAT(verified.output, HasSubstr("good signature, version 7"));
  const auto shown = platform::parseJson(run("orvanta-storebag", {"show", document}).output);
  EXPECT_EQ(shown.value(), platform::parseJson(R"({"version":"7","release":{"http_post":{"clients":[]}}})").value());
  EXPECT_THAT(run("orvanta-storebag", {"show", document, "--xml"}).output, HasSubstr("<plist version=\"1.0\">"));

  const std::string otherKey = directory / "other.der";
  ASSERT_EQ(run("orvanta-storebag", {"make-key", directory / "other.pem", "-o", otherKey}).status, 0);
  const auto refused = run("orvanta-storebag", {"verify", document, "-k", otherKey});
  EXPECT_EQ(refused.status, 1);
  EXPECT_THAT(refused.errors, HasSubstr("not that key's"));
}

TEST(StorebagProgramTest, SaysWhatIsWrong) {
  const TemporaryDirectory directory;
  const std::string key = directory / "key.pem";
  ASSERT_EQ(run("orvanta-storebag", {"make-key", key, "-o", directory / "publicKey.der"}).status, 0);
  const std::string broken = directory.write("broken.json", "{");
  const std::string list = directory.write("list.plist", "<plist version=\"1.0\"><array/></plist>");
  const std::string good = directory.write("good.json", "{}");
  const std::vector<std::pair<std::vector<std::string>, std::string>> table{
      {{"sign", broken, "-k", key}, "broken.json"},
      {{"sign", list, "-k", key}, "must be a dictionary"},
      {{"sign", good, "-k", good}, "no private key"},
      {{"sign", good, "-k", key, "-o", directory / "no/such/place"}, "cannot write"},
      {{"show", list}, "is not a dictionary"},
      {{"verify", good, "-k", good}, "no property list"},
  };
  for (const auto& [arguments, expected] : table) {
    const auto outcome = run("orvanta-storebag", arguments);
    EXPECT_EQ(outcome.status, 1) << arguments[0];
    EXPECT_THAT(outcome.errors, HasSubstr(expected));
  }
  EXPECT_NE(run("orvanta-storebag", {"sign", good, "-k", key, "--container", "json"}).status, 0);
  EXPECT_NE(run("orvanta-storebag", {}).status, 0);
}

TEST(OrvantactlProgramTest, TellsByItsStatusWhatWentWrong) {
  const TemporaryDirectory directory;
  std::filesystem::create_directories(directory / "unreadable/com.kovalt.orvanta.plist");
  std::filesystem::create_directory(directory / "empty");
  const struct {
    const char* command;  // follows the program's name; $1 is the directory
    int status;
    const char* errors;
  } rows[] = {
      {"upload-log --client-type 5 $1", 2, "Is a directory"},
      {"session --client-type 5 --file $1", 2, "Is a directory"},
      {"defaults --state-dir $1/none read", 1, "no directory"},
      {"defaults --state-dir $1/unreadable read", 1, "not a regular file"},
      {"defaults --state-dir $1/unreadable delete key", 1, "not a regular file"},
      {"defaults --state-dir $1/empty read", 0, ""},
      {"defaults --state-dir $1/empty read >/dev/full", 4, "No space left"},
      {"--help >/dev/full", 4, "No space left"},
      {"defaults --state-dir $1/none read 2>/dev/full", 1, ""},
  };
  for (const auto& row : rows) {
    const auto outcome = run("/bin/sh", {"-c", std::string("\"$0\" ") + row.command,
                                         DaemonProcess::programPath("orvantactl"), directory / ""});
    EXPECT_EQ(outcome.status, row.status) << row.command << ": " << outcome.errors;
    EXPECT_THAT(outcome.errors, HasSubstr(row.errors)) << row.command;
  }
}

TEST(StorebagFileTest, SaysWhatIsWrongWithADocument) {
  const std::string signature = "<key>signature</key><string>AAAA</string>";
  const std::pair<std::string, const char*> rows[] = {
      {"", "has no \"signature\""},
      {signature, "has no \"bag\""},
      {signature + "<key>bag</key><integer>1</integer>", "is not a string"},
      {signature + "<key>bag</key><string>A</string>", "is not base64"},
      {signature + "<key>bag</key><string>AAAA</string>", "the bag inside"},
      {signature + "<key>bag</key><string>PHBsaXN0PjxkaWN0Lz48L3BsaXN0Pg==</string>", ""},
  };
  for (const auto& [body, reason] : rows) {
    const std::string text = "<plist version=\"1.0\"><dict>" + body + "</dict></plist>";
    const auto content = openStorebag(test::bytesOf(text));
    EXPECT_EQ(content.ok(), *reason == '\0') << body;
    EXPECT_THAT(content ? std::string() : content.error(), HasSubstr(reason)) << body;
  }
}

TEST(CollectorProgramTest, TellsItsPlacesAndEndsOnSigterm) {
  const TemporaryDirectory directory;
  ChildProcess::Options options;
  // Standard output goes to standard error, which can be read while it runs.
  options.program = "/bin/sh";
  options.arguments = {"-c", "exec \"$0\" --directory \"$1\" --any-ports 1>&2",
                       DaemonProcess::programPath("orvanta-collector"), directory / "data"};
  ChildProcess process(std::move(options));
  ASSERT_TRUE(process.waitForLine("\"storebagURL\"")) << process.allLines();
  const auto ready = platform::parseJson(process.lines().back());
  ASSERT_TRUE(ready) << ready.error();
  for (const char* key : {"caFile", "publicKeyFile", "databaseFile"}) {
    EXPECT_TRUE(std::filesystem::is_regular_file(*ready->dictionary()->find(key)->string())) << key;
  }
  EXPECT_GT(ready->dictionary()->find("dashboardPort")->integerValue(), 0);
  process.signal(SIGTERM);
  EXPECT_EQ(process.wait(), 0) << process.allLines();
}

}  // namespace
}  // namespace orvanta
