#include <memory>
#include <string>

#include "backends/https/HTTPSPostBackend.h"
#include "config/Storebag.h"
#include "platform/core/Log.h"
#include "tests/config/SignedStorebag.h"
#include "tests/fuzz/Require.h"
#include "tests/support/TestPlatform.h"

namespace {

using namespace orvanta;

struct Swallow final : platform::LogSink {
  void write(platform::LogLevel, std::string_view line) override { REQUIRE(line.find('\n') == std::string_view::npos); }
};

// A device that trusts the server's key, and the server.
struct World {
  World() {
    installKey(device, signer.publicKeyDer(test::KeyLayout::subjectPublicKeyInfo));
    device.http.answer = [this](const platform::HttpRequest&) {
      return test::ScriptedHttpClient::status(200, document);
    };
    platform::installLogSink(&log);
    platform::setLogLevel(platform::LogLevel::debug);
  }
  Swallow log;
  test::StorebagSigner signer;
  test::TestServices<BackendServices> device;
  std::string document;
};

void evaluate(BackendServices& services, const Value& profile) {
  if (profile.dictionary() == nullptr) return;
  BackendSetup setup;
  setup.identity.clientType = 5;
  setup.identity.productFamily = "Parva";
  setup.identity.requireUserInfo = true;
  setup.identity.selfVersion = SelfVersion::parse("8.0.0");
  const auto backend =
      HTTPSPostBackend::create(services, "http_post", std::make_shared<const Dictionary>(*profile.dictionary()), setup);
  if (!backend) return;
  backend->updateState();
  REQUIRE(backend->state() == kBackendWaiting);
  backend->setUserInfoDict(std::make_shared<const Dictionary>(Dictionary{{"clientName", "c"}, {"serviceName", "s"}}));
  backend->updateState();
  REQUIRE(backend->state() >= kBackendWaiting && backend->state() <= kBackendHeld);
  REQUIRE(backend->state() == kBackendWaiting || backend->reason());
}

}  // namespace

// The answer of a configuration server: the whole document when the first byte is even, else a bag that is signed as
// the server would. A bag that comes through is evaluated for a client, profile by profile.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  static World& world = *new World;
  if (size == 0) return 0;
  const std::span<const std::uint8_t> rest(bytes + 1, size - 1);
  const bool isSigned = (bytes[0] & 1U) != 0;
  world.document = isSigned ? world.signer.document(rest) : std::string(rest.begin(), rest.end());
  StorebagFetch fetch;
  const auto section = fetchStorebagForEnvironmentAndClientType(world.device.services.config, 5, fetch);
  if (!section) return 0;
  REQUIRE(isSigned);  // a signature cannot be guessed
  for (const auto& [name, profile] : *section) evaluate(world.device, profile);
  return 0;
}
