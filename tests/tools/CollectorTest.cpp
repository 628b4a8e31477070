#include "tools/collector/Collector.h"

#include <gmock/gmock.h>

#include <filesystem>

#include "config/Compression.h"
#include "tests/tools/CollectorFixture.h"

namespace orvanta::collector {
namespace {

using testing::ElementsAre;
using testing::Pair;

using CollectorTest = CollectorFixture;

TEST_F(CollectorTest, RecordsAChunkedPostWithItsHeadersInTheirOrder) {
  const std::string answer = converse(
      "POST /events?x=1 HTTP/1.1\r\nZebra: 1\r\nAlpha:  two words \r\nTransfer-Encoding: chunked\r\nZebra: again\r\n"
      "Connection: close\r\n\r\nd;ext=1\r\n{\"events\":[{}\r\n2\r\n]}\r\n0\r\nT: 1\r\n\r\n");
  EXPECT_THAT(answer, testing::EndsWith("\r\n\r\n{\"accepted\":1}\n"));
  const auto requests = collector->requests();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_THAT(requests[0].headers,
              ElementsAre(Pair("Zebra", "1"), Pair("Alpha", "two words"), Pair("Transfer-Encoding", "chunked"),
                          Pair("Zebra", "again"), Pair("Connection", "close")));
  EXPECT_EQ(requests[0].target, "/events?x=1");
  EXPECT_EQ(collector->events().size(), 1U);
}

TEST_F(CollectorTest, RefusesWhatIsNoHttpAndWhatIsTooLong) {
  CollectorOptions options;
  options.maximumBodyBytes = 1000;
  start(std::move(options));
  const std::string noHttp[] = {
      "\r\n\r\n",
      "GET /\r\n\r\n",
      "GET /x HTTP/3\r\n\r\n",
      "GET /x HTTP/1.1\r\nno colon\r\n\r\n",
      "GET /x HTTP/1.1\r\nA b: 1\r\n\r\n",
      "POST /events HTTP/1.1\r\nContent-Length: x\r\n\r\n",
      "POST /events HTTP/1.1\r\nContent-Length: 1\r\nContent-Length: 2\r\n\r\nab",
      "POST /events HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\n",
      "POST /events HTTP/1.1\r\nTransfer-Encoding: chunked\r\n\r\nfffffffffffffff0\r\n",
  };
  for (const std::string& bytes : noHttp) {
    EXPECT_THAT(converse(bytes, true), testing::StartsWith("HTTP/1.1 400 ")) << bytes;
  }
  EXPECT_THAT(converse("GET /" + std::string(70'000, 'a'), true), testing::StartsWith("HTTP/1.1 431 "));
  EXPECT_EQ(post("/events", std::string(1001, ' '))->status, 413);
  EXPECT_EQ(post("/events", "no JSON")->status, 400);
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
  EXPECT_EQ(at(at(at(list("/events?since=1"), "events"), 0), "event"), (Dictionary{{"n", 2}}));
  EXPECT_EQ(http().Get("/requests/1/body")->body, R"({"events":[{"n":1},{"n":2}]})");
  EXPECT_EQ(http().Get("/requests/99")->status, 404);
  EXPECT_EQ(http().Get("/requests?sinze=1")->status, 400);
  EXPECT_EQ(http().Delete("/requests")->status, 204);
  EXPECT_EQ(at(list("/"), "events"), 0);
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
  CollectorOptions damaged;
  damaged.directory = directory / "third";
  directory.write("third/storebag-key.pem", "no key");
  const auto third = Collector::start(std::move(damaged));
  ASSERT_FALSE(third);
  EXPECT_THAT(third.error(), testing::HasSubstr("storebag-key.pem"));
}

}  // namespace
}  // namespace orvanta::collector
