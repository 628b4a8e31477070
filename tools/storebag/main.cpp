#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <cstdio>
#include <string>

#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"
#include "platform/host/Digest.h"
#include "platform/host/Process.h"
#include "tools/storebag/StorebagFile.h"

// Makes, checks and prints signed storebags without a server.

namespace {

using namespace orvanta;

Result<void> print(const void* bytes, std::size_t size) {
  if (std::fwrite(bytes, 1, size, stdout) == size && std::fflush(stdout) == 0) return {};
  return Failure{"cannot write to standard output: " + platform::errnoText(errno)};
}
Result<void> print(const std::string& text) {
  return print(text.data(), text.size());
}

// "-" is standard output.
Result<void> writeTo(const std::string& path, const std::vector<std::uint8_t>& bytes) {
  return path == "-" ? print(bytes.data(), bytes.size()) : writeFile(path, bytes);
}

// The subcommands.

Result<void> makeKey(const std::string& keyPath, const std::string& publicPath, const std::string& layout) {
  const auto key = SigningKey::readOrMake(keyPath);
  if (!key) return Failure{key.error()};
  const auto der =
      (*key)->publicKeyDer(layout == "pkcs1" ? PublicKeyLayout::pkcs1 : PublicKeyLayout::subjectPublicKeyInfo);
  return writeTo(publicPath, der);
}

Result<void> sign(const std::string& input, const std::string& keyPath, const std::string& output,
                  const std::string& container, const std::string& bagForm) {
  const auto bag = readBagSource(input);
  if (!bag) return Failure{bag.error()};
  const auto key = SigningKey::read(keyPath);
  if (!key) return Failure{key.error()};
  const auto document =
      makeStorebag(*bag, **key, *propertyListFormFromText(container), *propertyListFormFromText(bagForm));
  if (!document) return Failure{fmt::format("{}: {}", input, document.error())};
  return writeTo(output, *document);
}

Result<StorebagContent> openFile(const std::string& path) {
  const auto bytes = readFile(path);
  if (!bytes) return Failure{bytes.error()};
  auto content = openStorebag(*bytes);
  if (!content) return Failure{fmt::format("{}: {}", path, content.error())};
  return content;
}

Result<void> verify(const std::string& path, const std::string& publicPath) {
  const auto content = openFile(path);
  if (!content) return Failure{content.error()};
  const auto der = readFile(publicPath);
  if (!der) return Failure{der.error()};
  const auto key = platform::RsaPublicKey::fromDer(*der);
  if (!key) return Failure{publicPath + " is not an RSA public key in DER form"};
  if (!key->verifySha1(platform::sha1(content->bag), content->signature)) {
    return Failure{path + ": the signature is not that key's over this bag"};
  }
  const Value* version = content->inner.dictionary() ? content->inner.dictionary()->find("version") : nullptr;
  return print(fmt::format("{}: good signature, version {}\n", path, version ? version->description() : "(none)"));
}

Result<void> show(const std::string& path, bool xml) {
  const auto content = openFile(path);
  if (!content) return Failure{content.error()};
  if (!xml) return print(platform::writeJson(content->inner, true) + "\n");
  const auto text = platform::writeXmlPropertyList(content->inner);
  if (!text) return Failure{fmt::format("{}: {}", path, text.error())};
  return print(*text);
}

}  // namespace

int main(int argc, char** argv) {
  platform::secureStandardDescriptors();
  CLI::App app("Signs storebags, checks their signatures and prints the bags inside, without a server.",
               "orvanta-storebag");
  app.footer("More: man orvanta-storebag; the keys of a bag: docs/storebag.md");
  app.require_subcommand(1);
  std::string input;
  std::string output = "-";
  std::string key;
  std::string layout = "spki";
  std::string container = "xml";
  std::string bagForm = "xml";
  bool xml = false;

  CLI::App* keyCommand =
      app.add_subcommand("make-key", "Make a signing key, unless it exists, and write its public key");
  keyCommand->add_option("KEY", key, "private key file (PEM)")->required();
  keyCommand->add_option("-o,--output", output, "publicKey.der to write (- for standard output)")->required();
  keyCommand->add_option("--layout", layout, "layout of publicKey.der")
      ->capture_default_str()
      ->check(CLI::IsMember({"spki", "pkcs1"}));

  CLI::App* signCommand = app.add_subcommand("sign", "Make a storebag from a bag");
  signCommand->add_option("BAG", input, "the bag, as JSON or a property list")->required();
  signCommand->add_option("-k,--key", key, "private key file (PEM)")->required();
  signCommand->add_option("-o,--output", output, "storebag to write (default: standard output)");
  signCommand->add_option("--container", container, "form of the signed document")
      ->capture_default_str()
      ->check(CLI::IsMember({"xml", "binary"}));
  signCommand->add_option("--bag", bagForm, "form of the bag inside it")
      ->capture_default_str()
      ->check(CLI::IsMember({"xml", "binary"}));

  CLI::App* verifyCommand = app.add_subcommand("verify", "Check a storebag's signature");
  verifyCommand->add_option("STOREBAG", input, "the signed document")->required();
  verifyCommand->add_option("-k,--public-key", key, "public key file (DER), such as publicKey.der")->required();

  CLI::App* showCommand = app.add_subcommand("show", "Print the bag inside, without checking the signature");
  showCommand->add_option("STOREBAG", input, "the signed document")->required();
  showCommand->add_flag("--xml", xml, "print an XML property list instead of JSON");

  CLI11_PARSE(app, argc, argv);
  const auto done = keyCommand->parsed()      ? makeKey(key, output, layout)
                    : signCommand->parsed()   ? sign(input, key, output, container, bagForm)
                    : verifyCommand->parsed() ? verify(input, key)
                                              : show(input, xml);
  if (done) return 0;
  std::fputs(fmt::format("orvanta-storebag: {}\n", done.error()).c_str(), stderr);
  return 1;
}
