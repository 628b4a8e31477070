#include "tools/collector/servers/StorebagServer.h"

#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <utility>

#include "tools/collector/wire/HttpMessage.h"

namespace orvanta::collector {

namespace {

constexpr std::array<const char*, 2> kExtensions{".json", ".plist"};
constexpr std::int64_t kNanoseconds = 1'000'000'000;
constexpr std::int64_t kLongestRefreshCycle = 86'400;  // daemons count no more

std::optional<std::int64_t> modifiedNanoseconds(const std::string& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
  return status.st_mtim.tv_sec * kNanoseconds + status.st_mtim.tv_nsec;
}

// Names become file names: they must not lead out of the directory.
bool isBagName(const std::string& name) {
  const auto allowed = [](unsigned char c) { return std::isalnum(c) != 0 || c == '_' || c == '-' || c == '.'; };
  return !name.empty() && name.size() <= 100 && name.front() != '.' && std::all_of(name.begin(), name.end(), allowed);
}

void replaceAll(std::string& text, std::string_view what, std::string_view with) {
  for (auto at = text.find(what); at != std::string::npos; at = text.find(what, at + with.size())) {
    text.replace(at, what.size(), with);
  }
}

HttpAnswer failure(int status, const std::string& reason) {
  return {status, {}, "text/plain", reason + "\n"};
}

std::optional<std::int64_t> maxAgeFor(const Value& bag, const StorebagSettings& settings) {
  const Value* cycle =
      settings.maxAgeOfBag && bag.dictionary() != nullptr ? bag.dictionary()->find("refresh_cycle") : nullptr;
  return cycle != nullptr ? std::min(cycle->integerValue(), kLongestRefreshCycle) : settings.maxAge;
}

}  // namespace

Value fillPlaceholders(const Value& value, const BagPlaceholders& placeholders) {
  constexpr std::string_view kPort = "${dashboard_port}";
  if (const std::string* text = value.string()) {
    if (*text == kPort) return Value(static_cast<std::int64_t>(placeholders.dashboardPort));
    std::string filled = *text;
    replaceAll(filled, "${http}", placeholders.http);
    replaceAll(filled, "${https}", placeholders.https);
    replaceAll(filled, kPort, std::to_string(placeholders.dashboardPort));
    return filled;
  }
  if (const Array* array = value.array()) {
    Array filled;
    filled.reserve(array->size());
    for (const Value& element : *array) filled.push_back(fillPlaceholders(element, placeholders));
    return filled;
  }
  if (const Dictionary* dictionary = value.dictionary()) {
    Dictionary filled;
    for (const auto& [key, element] : *dictionary) filled.set(key, fillPlaceholders(element, placeholders));
    return filled;
  }
  return value;
}

struct StorebagServer::Source {
  std::string identity;  // the file's path, or the name of a held bag
  std::int64_t modifiedNanoseconds = 0;
  std::optional<Value> held;
};

Result<std::unique_ptr<StorebagServer>> StorebagServer::make(const std::string& directory) {
  auto key = SigningKey::readOrMake(directory + "/storebag-key.pem");
  if (!key) return Failure{key.error()};
  std::unique_ptr<StorebagServer> server(new StorebagServer(directory, std::move(key.value())));
  for (const auto& [file, layout] : {std::pair(server->publicKeyFile(), PublicKeyLayout::subjectPublicKeyInfo),
                                     std::pair(server->publicKeyPkcs1File(), PublicKeyLayout::pkcs1)}) {
    const auto written = writeFile(file, server->_key->publicKeyDer(layout));
    if (!written) return Failure{written.error()};
  }
  const std::string common = directory + "/storebag";
  const auto exists = [&](const char* extension) { return modifiedNanoseconds(common + extension).has_value(); };
  if (std::none_of(kExtensions.begin(), kExtensions.end(), exists)) {
    const std::string_view text = defaultStorebagJson();
    const std::span bytes(reinterpret_cast<const std::uint8_t*>(text.data()), text.size());
    if (const auto written = writeFile(common + ".json", bytes); !written) return Failure{written.error()};
  }
  return server;
}

StorebagServer::StorebagServer(std::string directory, std::shared_ptr<const SigningKey> key)
    : _directory(std::move(directory)), _key(std::move(key)) {}

void StorebagServer::setPlaceholders(BagPlaceholders placeholders) {
  _placeholders = std::move(placeholders);
}

void StorebagServer::setSettings(const StorebagSettings& settings) {
  const platform::MutexLock lock(_mutex);
  _settings = settings;
}

StorebagSettings StorebagServer::settings() const {
  const platform::MutexLock lock(_mutex);
  return _settings;
}

void StorebagServer::setBag(const std::string& name, Value inner) {
  const auto now = std::chrono::system_clock::now().time_since_epoch();
  const std::int64_t nanoseconds = std::chrono::duration_cast<std::chrono::nanoseconds>(now).count();
  const platform::MutexLock lock(_mutex);
  HeldBag& held = _held[name];
  held.inner = std::move(inner);
  held.modifiedNanoseconds = std::max(nanoseconds, held.modifiedNanoseconds + 1);
}

void StorebagServer::clearBags() {
  const platform::MutexLock lock(_mutex);
  _held.clear();
}

Result<StorebagServer::Source> StorebagServer::sourceFor(const std::string& name) const {
  const platform::MutexLock lock(_mutex);
  // The bag's own source takes precedence over the one for all names, held bags over files.
  const std::array<std::pair<std::string, std::string>, 2> candidates{{{name, name}, {"", "storebag"}}};
  for (const auto& [heldName, fileName] : candidates) {
    const auto held = _held.find(heldName);
    if (held != _held.end()) return Source{":" + heldName, held->second.modifiedNanoseconds, held->second.inner};
    for (const char* extension : kExtensions) {
      const std::string path = fmt::format("{}/{}{}", _directory, fileName, extension);
      if (const auto modified = modifiedNanoseconds(path)) return Source{path, *modified, std::nullopt};
    }
  }
  return Failure{fmt::format("no file for the storebag {}", name)};
}

// HTTP's times are whole seconds, in which a file may change twice: each change gets a second of its own.
std::int64_t StorebagServer::stampFor(const std::string& identity, std::int64_t modified) {
  const platform::MutexLock lock(_mutex);
  Stamp& last = _stamps[identity];
  if (last.modifiedNanoseconds != modified) {
    last.stamp = last.stamp == 0 ? modified / kNanoseconds : std::max(modified / kNanoseconds, last.stamp + 1);
    last.modifiedNanoseconds = modified;
  }
  return last.stamp;
}

HttpAnswer StorebagServer::answer(const std::string& name, const std::string* ifModifiedSince) {
  if (!isBagName(name)) return failure(404, "no such storebag");
  auto source = sourceFor(name);
  if (!source) return failure(404, source.error());
  const StorebagSettings current = settings();

  const auto inner = source->held ? Result<Value>(std::move(*source->held)) : readBagSource(source->identity);
  if (!inner) return failure(500, inner.error());

  HttpAnswer answer;
  if (const auto maxAge = maxAgeFor(*inner, current)) {
    answer.headers.emplace_back("Cache-Control", fmt::format("max-age={}", *maxAge));
  }
  if (current.lastModified) {
    const std::int64_t stamp = stampFor(source->identity, source->modifiedNanoseconds);
    answer.headers.emplace_back("Last-Modified", httpDate(stamp));
    const auto since = ifModifiedSince != nullptr ? parseHttpDate(*ifModifiedSince) : std::nullopt;
    if (since && stamp <= *since) {
      answer.status = 304;
      return answer;
    }
  }
  const auto document = makeStorebag(fillPlaceholders(*inner, _placeholders), *_key, current.container, current.bag);
  if (!document) return failure(500, fmt::format("{}: {}", source->identity, document.error()));
  answer.contentType = current.container == PropertyListForm::xml ? "application/xml" : "application/octet-stream";
  answer.body.assign(document->begin(), document->end());
  return answer;
}

}  // namespace orvanta::collector
