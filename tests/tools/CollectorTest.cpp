#include "tools/collector/Collector.h"

#include <gmock/gmock.h>

#include <filesystem>
#include <vector>

#include "platform/PropertyList.h"
#include "tests/tools/CollectorFixture.h"
#include "util/Compression.h"

namespace orvanta::collector {
namespace {

using testing::ElementsAre;
using testing::Pair;

using CollectorTest = CollectorFixture;

TEST_F(CollectorTest, RecordsAPostWithItsHeadersInTheirOrder) {
  const std::string answer = converse(
      "POST /events?x=1 HTTP/1.1\r\nZebra: 1\r\nHost: here\r\nX-ORV-Sender: ZK\r\nAlpha:  two words \r\nEmpty:\r\n"
      "X-ORV-Sender: again\r\nConnection: close\r\nContent-Length: 27\r\n\r\n{\"events\":[{\"_method\":300}]}");
  EXPECT_THAT(answer, testing::StartsWith("HTTP/1.1 400 ")) << "27 bytes cut the JSON short";
  const auto requests = collector->requests();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_THAT(requests[0].headers,
              ElementsAre(Pair("Zebra", "1"), Pair("Host", "here"), Pair("X-ORV-Sender", "ZK"),
                          Pair("Alpha", "two words"), Pair("Empty", ""), Pair("X-ORV-Sender", "again"),
                          Pair("Connection", "close"), Pair("Content-Length", "27")));
  EXPECT_EQ(requests[0].target, "/events?x=1");
  EXPECT_EQ(requests[0].path, "/events");
  EXPECT_EQ(requests[0].status, 400);
  EXPECT_THAT(requests[0].note, testing::HasSubstr("no JSON"));
  EXPECT_TRUE(collector->events().empty());
}

TEST_F(CollectorTest, TakesChunkedAndPipelinedRequests) {
  const std::string answer = converse(
      "POST /events HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nd;ext=1\r\n{\"events\":[{}\r\n2\r\n]}\r\n0\r\nT: "
      "1\r\n\r\n"
      "POST /events HTTP/1.1\r\nContent-Length: 13\r\n\r\n{\"events\":[]}"
      "POST /events HTTP/1.0\r\nContent-Length: 15\r\n\r\n{\"events\":[{}]}");  // and closes
  EXPECT_THAT(answer, testing::EndsWith("\r\n\r\n{\"accepted\":1}\n")) << "the last one's";
  EXPECT_EQ(collector->requests().size(), 3U);
  EXPECT_EQ(collector->events().size(), 2U);
}

TEST_F(CollectorTest, RefusesWhatIsNoHttpAndWhatIsTooLong) {
  CollectorOptions options;
  options.maximumBodyBytes = 1000;
  start(std::move(options));
  const std::string noHttp[] = {
      "\r\n\r\n",
      "GET /\r\n\r\n",
      "GET /x HTTP/3\r\n\r\n",
      "GET / a HTTP/1.1\r\n\r\n",
      "GET /x HTTP/1.1\r\nno colon\r\n\r\n",
      "GET /x HTTP/1.1\r\nA b: 1\r\n\r\n",
      "GET /x HTTP/1.1\r\n a: 2\r\n\r\n",
      "POST /events HTTP/1.1\r\nContent-Length: x\r\n\r\n",
      "POST /events HTTP/1.1\r\nContent-Length: -1\r\n\r\n",
      "POST /events HTTP/1.1\r\nContent-Length: 1\r\nContent-Length: 2\r\n\r\nab",
      "POST /events HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\n",
      "POST /events HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nfffffffffffffff0\r\n",
  };
  for (const std::string& bytes : noHttp) {
    EXPECT_THAT(converse(bytes, true), testing::StartsWith("HTTP/1.1 400 ")) << bytes;
  }
  EXPECT_THAT(converse("GET /" + std::string(70'000, 'a'), true), testing::StartsWith("HTTP/1.1 431 "));
  EXPECT_EQ(post("/events", std::string(1001, ' '))->status, 413);
}

TEST_F(CollectorTest, RefusesDamagedAndBoundlessCompression) {
  CollectorOptions options;
  options.maximumBodyBytes = 10'000;
  start(std::move(options));
  const auto postCompressed = [&](const std::string& body) {
    return http().Post("/events", {{"Content-Encoding", "gzip"}}, body, "application/json")->status;
  };
  const std::string good = *gzipDeflate(R"({"events":[]})");
  EXPECT_EQ(postCompressed(good), 200);
  EXPECT_EQ(postCompressed(good.substr(0, good.size() - 3)), 400);
  EXPECT_EQ(postCompressed(good + "x"), 400);
  EXPECT_EQ(postCompressed("no gzip"), 400);
  EXPECT_EQ(postCompressed(*gzipDeflate(std::string(1'000'000, ' '))), 400);
  EXPECT_THAT(collector->requests().back().note, testing::HasSubstr("inflates to more than"));
}

TEST_F(CollectorTest, ListsWhatItReceivedAsJson) {
  ASSERT_TRUE(http().Post("/events", {{"B", "1"}, {"A", "2"}}, R"({"events":[{"n":1},{"n":2}]})", "application/json"));
  ASSERT_TRUE(post("/other", "no json"));
  const auto requests = list("/requests");
  ASSERT_EQ(at(requests, "requests").array()->size(), 2U);
  const auto& first = at(at(requests, "requests"), 0);
  EXPECT_EQ(at(first, "json"), (Dictionary{{"events", Array{Dictionary{{"n", 1}}, Dictionary{{"n", 2}}}}}));
  EXPECT_EQ(at(at(at(requests, "requests"), 1), "text"), "no json");
  EXPECT_EQ(at(list("/requests?since=1&path=/other"), "requests").array()->size(), 1U);
  EXPECT_EQ(at(list("/requests?kind=upload"), "requests").array()->size(), 0U);
  EXPECT_EQ(at(at(at(list("/events?since=1"), "events"), 0), "event"), (Dictionary{{"n", 2}}));
  EXPECT_EQ(http().Get("/requests/1/body")->body, R"({"events":[{"n":1},{"n":2}]})");
  EXPECT_EQ(http().Get("/requests/99")->status, 404);
  EXPECT_EQ(http().Get("/requests?sinze=1")->status, 400);
  EXPECT_EQ(http().Get("/requests?since=-1")->status, 400);
  EXPECT_EQ(http().Get("/nowhere")->status, 404);
  EXPECT_EQ(http().Delete("/requests")->status, 204);
  EXPECT_EQ(at(list("/"), "events"), 0);
}

TEST_F(CollectorTest, KeepsUploadsAndLogData) {
  const std::string file = "line\nwith \0 zero\n";
  const auto answer = https()->Post(
      "/upload?uuid=D&sequence=7&description=Parlix%20AFRC%20log%20(Uploaded%20by%20HQX)&filename="
      "a%20b.log.gz&raw=true",
      {{"Content-Encoding", "gzip"}}, *gzipDeflate(file), "application/octet-stream");
  ASSERT_TRUE(answer);
  EXPECT_THAT(answer->body, testing::HasSubstr("success"));
  const auto uploads = list("/uploads");
  const auto& upload = at(at(uploads, "uploads"), 0);
  EXPECT_EQ(at(upload, "filename"), "a b.log.gz");
  EXPECT_EQ(at(upload, "description"), "Parlix AFRC log (Uploaded by HQX)");
  EXPECT_EQ(http().Get(*at(upload, "fileURL").string())->body, file);

  const auto archive = platform::writeBinaryPropertyList(Dictionary{{"root", Array{"one", 2}}});
  ASSERT_TRUE(archive);
  const auto location =
      http().Post("/logdata", std::string(archive->begin(), archive->end()), "application/octet-stream");
  ASSERT_TRUE(location);
  ASSERT_THAT(location->body, testing::StartsWith(collector->httpURL("/logdata/")));
  EXPECT_EQ(http().Get(location->body.substr(collector->httpURL().size()))->body,
            std::string(archive->begin(), archive->end()));
  const auto logData = list("/logdata");
  EXPECT_EQ(at(at(at(logData, "logdata"), 0), "archive"), (Dictionary{{"root", Array{"one", 2}}}));
}

TEST_F(CollectorTest, KeepsItsIdentityAndItsRecordsAcrossStarts) {
  ASSERT_TRUE(post("/events", R"({"events":[{"n":1}]})"));
  const auto key = http().Get("/publicKey.der")->body;
  const auto authority = http().Get("/ca.pem")->body;
  const std::int64_t exchange = collector->requests()[0].exchange;
  start({});
  EXPECT_EQ(http().Get("/publicKey.der")->body, key);
  EXPECT_EQ(http().Get("/ca.pem")->body, authority);
  ASSERT_TRUE(post("/events", R"({"events":[{"n":2}]})"));
  ASSERT_EQ(collector->events().size(), 2U);
  EXPECT_GT(collector->requests()[1].exchange, exchange);
  EXPECT_EQ(std::filesystem::status(directory / "ca-key.pem").permissions(),
            std::filesystem::perms::owner_read | std::filesystem::perms::owner_write);
}

TEST_F(CollectorTest, SaysWhyItCannotStart) {
  CollectorOptions taken;
  taken.directory = directory / "second";
  taken.httpPort = collector->httpPort();
  const auto second = Collector::start(std::move(taken));
  ASSERT_FALSE(second);
  EXPECT_THAT(second.error(), testing::HasSubstr("cannot use TCP port " + std::to_string(collector->httpPort())));
  CollectorOptions broken;
  broken.directory = directory.write("file", "") + "/below";
  EXPECT_FALSE(Collector::start(std::move(broken)));
  CollectorOptions damaged;
  damaged.directory = directory / "third";
  directory.write("third/storebag-key.pem", "no key");
  const auto third = Collector::start(std::move(damaged));
  ASSERT_FALSE(third);
  EXPECT_THAT(third.error(), testing::HasSubstr("storebag-key.pem"));
}

}  // namespace
}  // namespace orvanta::collector
