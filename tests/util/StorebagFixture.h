#pragma once

#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "tests/support/LogCapture.h"
#include "tests/support/TestPlatform.h"
#include "tests/util/SignedStorebag.h"
#include "util/Storebag.h"

namespace orvanta::test {

// A device with the server's key installed, and a server that gives every request the same answer.
class StorebagFixture : public testing::Test {
 protected:
  StorebagFixture() { installKey(signer.publicKeyDer(KeyLayout::subjectPublicKeyInfo)); }

  void installKey(const Bytes& der) {
    platform.directory.write("share/publicKey.der", {reinterpret_cast<const char*>(der.data()), der.size()});
  }
  void serve(std::string body, std::vector<platform::HttpHeader> headers = {}, int status = 200) {
    platform::HttpResult result = ScriptedHttpClient::status(status, std::move(body));
    result.response->headers = std::move(headers);
    platform.http.answer = [result](const platform::HttpRequest&) { return result; };
  }
  void failTransport(const std::string& error) {
    platform.http.answer = [error](const platform::HttpRequest&) { return platform::HttpResult{std::nullopt, error}; };
  }

  StorebagSigner signer;
  TestPlatform platform;
  StorebagFetch fetch;
  LogCapture log;
};

}  // namespace orvanta::test
