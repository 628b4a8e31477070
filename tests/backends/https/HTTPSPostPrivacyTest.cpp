#include <gtest/gtest.h>

#include "tests/backends/https/HTTPSFixture.h"

namespace orvanta::test {
namespace {

const std::string kSecret = "s3cr3t-value-of-a-person";

class HTTPSPostPrivacyTest : public HTTPSFixture {
 protected:
  static Setup filtering(const Value& method = -1) {
    const Dictionary rule{{"key", "PersonName"}, {"method", method}, {"action", "remove"}};
    Setup setup = requiring({{"filters", Array{rule}}, {"event_threshold", 2}}, true);
    setup.userInfo = shared({{"clientName", "Mail"}, {"personName", kSecret}});
    return setup;
  }
  // How many posts carry the text, as they stand, uncompressed, in the address or in a header.
  std::size_t postsWith(const std::string& text) {
    std::size_t count = 0;
    for (const auto& request : requests()) {
      std::string all = request.url + request.body + plainBody(request);
      for (const auto& header : request.headers) all += header.name + header.value;
      count += all.find(text) != std::string::npos ? 1 : 0;
    }
    return count;
  }
};

TEST_F(HTTPSPostPrivacyTest, WhatEventsBeforeUserInfoAndOtherSessionsKeep) {
  // The filters come with the evaluation that has user info; what was batched before was prepared without them.
  Setup setup = filtering();
  const SharedDictionary userInfo = setup.userInfo;
  setup.userInfo = nullptr;
  const auto backend = makeBackend(setup);
  send(*backend, 1, 0, shared({{"personName", kSecret}}));
  backend->setUserInfoDict(shared({{"clientName", "Mail"}}));
  backend->updateState();
  flush(*backend);
  EXPECT_EQ(postsWith(kSecret), 1U);

  platform.http.clear();
  setup.identity.requireUserInfo = false;
  setup.userInfo = userInfo;
  send(*makeBackend(setup), 1, 1);
  EXPECT_EQ(postsWith(kSecret), 1U);
}

TEST_F(HTTPSPostPrivacyTest, FiltersForOneCategory) {
  const auto backend = makeBackend(filtering(3));
  send(*backend, 3, 1);
  EXPECT_EQ(postsWith(kSecret), 0U);
  send(*backend, 3);
  flush(*backend);
  EXPECT_EQ(postsWith(kSecret), 1U) << "a flush merges user info under no category";
}

}  // namespace
}  // namespace orvanta::test
