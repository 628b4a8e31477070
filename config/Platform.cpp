#include "config/Platform.h"

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <string>
#include <utility>

namespace orvanta {

namespace {

enum class Listing { single, colonSeparated };

// Leaves `location` alone when the variable is unset or empty.
void takeFromEnvironment(std::string& location, const char* variable, Listing listing) {
  const char* text = std::getenv(variable);
  if (text == nullptr || *text == '\0') return;
  std::string path = text;
  if (listing == Listing::colonSeparated) path.resize(std::min(path.find(':'), path.size()));
  while (path.size() > 1 && path.back() == '/') path.pop_back();
  if (!path.empty()) location = std::move(path);
}

}  // namespace

FileLocations FileLocations::fromEnvironment() {
  FileLocations locations;
  takeFromEnvironment(locations.runtimeDirectory, "RUNTIME_DIRECTORY", Listing::colonSeparated);
  takeFromEnvironment(locations.stateDirectory, "STATE_DIRECTORY", Listing::colonSeparated);
  takeFromEnvironment(locations.configurationDirectory, "CONFIGURATION_DIRECTORY", Listing::colonSeparated);
  takeFromEnvironment(locations.frameworkDirectory, "ORVANTA_FRAMEWORK", Listing::single);
  takeFromEnvironment(locations.plugInsDirectory, "ORVANTA_PLUGINS", Listing::single);
  takeFromEnvironment(locations.caFile, "ORVANTA_CA_FILE", Listing::single);
  return locations;
}

void Platform::stop() {
  if (std::exchange(_stopped, true)) return;
  if (_parts.http) _parts.http->shutdown(std::chrono::milliseconds(0));
  if (_parts.pool) _parts.pool->stop();
}

Platform::~Platform() {
  stop();
  _parts.http.reset();
  _parts.pool.reset();
}

}  // namespace orvanta
