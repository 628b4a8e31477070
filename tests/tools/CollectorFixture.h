#pragma once

#include <gtest/gtest.h>
#include <httplib.h>

#include <array>
#include <cerrno>
#include <chrono>
#include <memory>
#include <string>
#include <utility>

#include "interface/Values.h"
#include "platform/codec/Json.h"
#include "tests/support/TemporaryDirectory.h"
#include "tools/collector/Collector.h"
#include "tools/collector/wire/Transport.h"

namespace orvanta::collector {

// A collector in a directory of its own, and HTTP clients for it.
class CollectorFixture : public testing::Test {
 protected:
  static constexpr std::chrono::seconds kTimeout{30};

  void SetUp() override { start({}); }
  void start(CollectorOptions options) {
    collector.reset();
    options.directory = directory.path();
    auto started = Collector::start(std::move(options));
    ASSERT_TRUE(started) << started.error();
    collector = std::move(*started);
  }

  httplib::Client http() const { return withTimeout(httplib::Client("127.0.0.1", collector->httpPort())); }
  std::unique_ptr<httplib::SSLClient> https() const {
    auto client = std::make_unique<httplib::SSLClient>("localhost", collector->httpsPort());
    client->set_ca_cert_path(collector->caFile().c_str());
    client->enable_server_certificate_verification(true);
    client->set_read_timeout(kTimeout);
    return client;
  }
  httplib::Result post(const std::string& path, const std::string& body) const {
    return http().Post(path, body, "application/json");
  }
  // Sends bytes as they are, over a fresh connection, and reads until the collector closes or resets it.
  std::string converse(const std::string& bytes, bool finishes = false) const {
    const auto stream = Transport::connectLoopback(collector->httpPort());
    EXPECT_TRUE(stream->write(bytes));
    if (finishes) stream->finish();
    std::string answer;
    std::array<char, 4096> piece{};
    errno = 0;
    while (const std::size_t count = stream->read(piece.data(), piece.size())) answer.append(piece.data(), count);
    return errno == ECONNRESET ? answer + "[reset]" : answer;
  }
  Value list(const std::string& path) const {
    const auto answer = http().Get(path);
    EXPECT_TRUE(answer && answer->status == 200) << path << (answer ? ": " + answer->body : "");
    auto parsed = platform::parseJson(answer ? answer->body : "null");
    EXPECT_TRUE(parsed) << parsed.error();
    return parsed ? std::move(parsed.value()) : Value();
  }
  // The entry of a dictionary; throws if it is absent.
  static const Value& at(const Value& value, const std::string& key) {
    const Value* found = value.dictionary() != nullptr ? value.dictionary()->find(key) : nullptr;
    if (found == nullptr) throw std::out_of_range("no \"" + key + "\" in " + value.description());
    return *found;
  }
  static const Value& at(const Value& value, std::size_t index) { return value.array()->at(index); }

  test::TemporaryDirectory directory;
  std::unique_ptr<Collector> collector;

 private:
  static httplib::Client withTimeout(httplib::Client client) {
    client.set_read_timeout(kTimeout);
    client.set_tcp_nodelay(true);
    return client;
  }
};

}  // namespace orvanta::collector
