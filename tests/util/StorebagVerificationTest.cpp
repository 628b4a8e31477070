#include <gmock/gmock.h>

#include <filesystem>

#include "platform/PropertyList.h"
#include "tests/util/StorebagFixture.h"

namespace orvanta {
namespace {

using platform::Dictionary;
using platform::Value;
using test::Bytes;
using test::outerDocument;
using test::plistBytes;
using test::PlistForm;

class StorebagVerificationTest : public test::StorebagFixture {
 protected:
  platform::SharedDictionary open(std::string body) {
    serve(std::move(body));
    log.clear();
    return fetchStorebagWithName(platform, "quillon", fetch);
  }
  static std::string text(const Bytes& bytes) { return {bytes.begin(), bytes.end()}; }

  const Bytes bag = plistBytes(Dictionary{{"version", "7.1"}, {"refresh_cycle", 60}}, PlistForm::binary);
  const Bytes signature = signer.sign(bag);
};

constexpr const char* kNotVerified = "<3>fetchStorebagWithName: Signature can not be verified, 0x";

TEST_F(StorebagVerificationTest, refusesAnyChangedBit) {
  ASSERT_TRUE(open(outerDocument(signature, bag)));
  for (std::size_t bit = 0; bit < signature.size() * 8; bit += 13) {
    Bytes changed = signature;
    changed[bit / 8] = static_cast<std::uint8_t>(changed[bit / 8] ^ (1U << (bit % 8)));
    EXPECT_FALSE(open(outerDocument(changed, bag))) << "bit " << bit << " of the signature";
    EXPECT_EQ(log.count(kNotVerified), 1);
  }
  for (std::size_t bit = 0; bit < bag.size() * 8; bit += 5) {
    Bytes changed = bag;
    changed[bit / 8] = static_cast<std::uint8_t>(changed[bit / 8] ^ (1U << (bit % 8)));
    EXPECT_FALSE(open(outerDocument(signature, changed))) << "bit " << bit << " of the bag";
    EXPECT_EQ(log.count(kNotVerified), 1);
  }
}

TEST_F(StorebagVerificationTest, refusesDocumentsWithoutWhatItNeeds) {
  const std::string signatureText = platform::encodeBase64(signature);
  const std::string bagText = platform::encodeBase64(bag);
  const std::string missing = "<3>fetchStorebagWithName: Signature is missing";
  struct Row {
    const char* what;
    Value document;
    std::string errorLine;  // empty: refused without one
  };
  const Row rows[] = {
      {"no signature", Dictionary{{"bag", bagText}}, missing},
      {"an array", platform::Array{Value(signatureText), Value(bagText)}, missing},
      {"a text", "signature", missing},
      {"no bag", Dictionary{{"signature", signatureText}}, ""},
      {"a signature that is no base64", Dictionary{{"signature", "A"}, {"bag", bagText}}, ""},
      {"a signature that is no text", Dictionary{{"signature", platform::Data{signature}}, {"bag", bagText}}, ""},
      {"a bag that is no base64", Dictionary{{"signature", signatureText}, {"bag", "A"}}, ""},
      {"a bag that is no text", Dictionary{{"signature", signatureText}, {"bag", 12}}, ""},
  };
  for (const Row& row : rows) {
    EXPECT_FALSE(open(text(plistBytes(row.document, PlistForm::xml)))) << row.what;
    EXPECT_EQ(log.count("<3>"), row.errorLine.empty() ? 0 : 1) << row.what;
    EXPECT_TRUE(row.errorLine.empty() || log.contains(row.errorLine)) << row.what;
  }
}

TEST_F(StorebagVerificationTest, saysWhyABodyIsNoPropertyList) {
  for (const char* body : {"", "<html><body>404</body></html>", "bplist00", "{\"signature\": \"x\"}"}) {
    EXPECT_FALSE(open(body)) << body;
    const auto lines = log.lines();
    ASSERT_EQ(lines.size(), 3) << body;
    EXPECT_THAT(lines[1], testing::StartsWith("<3>fetchStorebagWithName: propertyListWithData error ")) << body;
    EXPECT_EQ(lines[2], "<3>fetchStorebagWithName: Signature is missing") << body;
  }
}

TEST_F(StorebagVerificationTest, aSignedBagThatIsNoDictionaryIsNone) {
  const Bytes notAPropertyList = {'n', 'o'};
  for (const Bytes& inner : {notAPropertyList, Bytes{}, plistBytes(platform::Array{Value(1)}, PlistForm::xml)}) {
    EXPECT_FALSE(open(outerDocument(signer.sign(inner), inner)));
    EXPECT_EQ(log.count("<3>"), 0);
  }
}

TEST_F(StorebagVerificationTest, skipsWhatIsNoBase64InBetween) {
  const auto broken = [](const std::string& text) {
    std::string lines;
    for (std::size_t at = 0; at < text.size(); at += 19) lines += text.substr(at, 19) + "\r\n\t *";
    return lines;
  };
  EXPECT_TRUE(open(text(plistBytes(Dictionary{{"signature", broken(platform::encodeBase64(signature))},
                                              {"bag", broken(platform::encodeBase64(bag))}},
                                   PlistForm::binary))));
}

TEST_F(StorebagVerificationTest, needsAKeyAndTakesOneThatComesLater) {
  const std::string document = outerDocument(signature, bag);
  std::filesystem::remove(platform.directory / "share/publicKey.der");
  EXPECT_FALSE(open(document));
  EXPECT_EQ(log.count("<3>"), 0);
  installKey({'n', 'o', ' ', 'k', 'e', 'y'});
  EXPECT_FALSE(open(document));
  EXPECT_EQ(log.count("<3>"), 0);
  installKey(signer.publicKeyDer(test::KeyLayout::pkcs1));
  EXPECT_TRUE(open(document));
}

}  // namespace
}  // namespace orvanta
