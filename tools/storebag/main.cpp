#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>

#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"
#include "platform/host/Digest.h"
#include "platform/host/Process.h"
#include "tools/storebag/StorebagFile.h"

// Makes, checks and prints signed storebags without a server.

namespace {

using namespace orvanta;

int fail(const std::string& text) {
  std::fputs(fmt::format("orvanta-storebag: {}\n", text).c_str(), stderr);
  return 1;
}

// The exit status.
int print(const void* bytes, std::size_t size) {
  if (std::fwrite(bytes, 1, size, stdout) == size && std::fflush(stdout) == 0) return 0;
  return fail(fmt::format("cannot write to standard output: {}", std::strerror(errno)));
}
int print(const std::string& text) {
  return print(text.data(), text.size());
}

int printBytes(const std::string& path, const std::vector<std::uint8_t>& bytes) {
  if (path == "-") return print(bytes.data(), bytes.size());
  const auto failure = writeFile(path, bytes);
  return failure ? fail(failure->text) : 0;
}

int makeKey(const std::string& keyPath, const std::string& publicPath, const std::string& layout) {
  const auto key = SigningKey::readOrMake(keyPath);
  if (!key) return fail(key.error());
  const auto der =
      (*key)->publicKeyDer(layout == "pkcs1" ? PublicKeyLayout::pkcs1 : PublicKeyLayout::subjectPublicKeyInfo);
  return printBytes(publicPath, der);
}

int sign(const std::string& input, const std::string& keyPath, const std::string& output, const std::string& container,
         const std::string& bagForm) {
  const auto bag = readBagSource(input);
  if (!bag) return fail(bag.error());
  const auto key = SigningKey::read(keyPath);
  if (!key) return fail(key.error());
  const auto document =
      makeStorebag(*bag, **key, *propertyListFormFromText(container), *propertyListFormFromText(bagForm));
  if (!document) return fail(fmt::format("{}: {}", input, document.error()));
  return printBytes(output, *document);
}

Result<StorebagContent> openFile(const std::string& path) {
  const auto bytes = readFile(path);
  if (!bytes) return Failure{bytes.error()};
  auto content = openStorebag(*bytes);
  if (!content) return Failure{fmt::format("{}: {}", path, content.error())};
  return content;
}

int verify(const std::string& path, const std::string& publicPath) {
  const auto content = openFile(path);
  if (!content) return fail(content.error());
  const auto der = readFile(publicPath);
  if (!der) return fail(der.error());
  const auto key = platform::RsaPublicKey::fromDer(*der);
  if (!key) return fail(publicPath + " is no RSA public key in DER form");
  if (!key->verifySha1(platform::sha1(content->bag), content->signature)) {
    return fail(path + ": the signature is not that key's over this bag");
  }
  const Value* version = content->inner.dictionary() ? content->inner.dictionary()->find("version") : nullptr;
  return print(fmt::format("{}: good signature, version {}\n", path, version ? version->description() : "(none)"));
}

int show(const std::string& path, bool xml) {
  const auto content = openFile(path);
  if (!content) return fail(content.error());
  if (!xml) return print(platform::writeJson(content->inner, true) + "\n");
  const auto text = platform::writeXmlPropertyList(content->inner);
  if (!text) return fail(fmt::format("{}: {}", path, text.error()));
  return print(*text);
}

}  // namespace

int main(int argc, char** argv) {
  platform::secureStandardDescriptors();
  CLI::App app("Makes, checks and prints signed storebags", "orvanta-storebag");
  app.require_subcommand(1);
  std::string input;
  std::string output = "-";
  std::string key;
  std::string layout = "spki";
  std::string container = "xml";
  std::string bagForm = "xml";
  bool xml = false;

  CLI::App* keyCommand =
      app.add_subcommand("make-key", "Make a signing key (unless it exists) and its public key file");
  keyCommand->add_option("KEY", key, "private key, PEM")->required();
  keyCommand->add_option("-o,--output", output, "where publicKey.der goes (- for standard output)")->required();
  keyCommand->add_option("--layout", layout, "layout of publicKey.der")->check(CLI::IsMember({"spki", "pkcs1"}));

  CLI::App* signCommand = app.add_subcommand("sign", "Sign a bag (JSON or property list)");
  signCommand->add_option("BAG", input, "the inner bag")->required();
  signCommand->add_option("-k,--key", key, "private key, PEM")->required();
  signCommand->add_option("-o,--output", output, "where the storebag goes (default standard output)");
  signCommand->add_option("--container", container, "form of the outer document")
      ->check(CLI::IsMember({"xml", "binary"}));
  signCommand->add_option("--bag", bagForm, "form of the bag inside")->check(CLI::IsMember({"xml", "binary"}));

  CLI::App* verifyCommand = app.add_subcommand("verify", "Check a storebag's signature");
  verifyCommand->add_option("STOREBAG", input)->required();
  verifyCommand->add_option("-k,--public-key", key, "publicKey.der")->required();

  CLI::App* showCommand = app.add_subcommand("show", "Print the bag inside (the signature is not looked at)");
  showCommand->add_option("STOREBAG", input)->required();
  showCommand->add_flag("--xml", xml, "as an XML property list instead of JSON");

  CLI11_PARSE(app, argc, argv);
  if (keyCommand->parsed()) return makeKey(key, output, layout);
  if (signCommand->parsed()) return sign(input, key, output, container, bagForm);
  if (verifyCommand->parsed()) return verify(input, key);
  return show(input, xml);
}
