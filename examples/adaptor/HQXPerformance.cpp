// A diagnostics adaptor to begin from: it appends each event as one line to adaptor.log in the daemon's state
// directory.

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <memory>
#include <msgpack.hpp>
#include <sstream>
#include <string>

#include <orvanta/interface/PluginBundle.h>

namespace {

// Where the daemon may write: its STATE_DIRECTORY, of several the first.
std::string logPath() {
  const char* const directories = std::getenv("STATE_DIRECTORY");  // NOLINT(concurrency-mt-unsafe): never set
  std::string directory = directories == nullptr ? "/var/lib/orvanta" : directories;
  directory.resize(std::min(directory.find(':'), directory.size()));
  return directory + "/adaptor.log";
}

class BriskAdaptor {
 public:
  BriskAdaptor() : _path(logPath()) {}

  void sendMessage(std::uint16_t method, std::uint16_t respCode, const std::uint8_t* payload,
                   std::size_t payloadLength) const {
    std::ostringstream line;
    line << method << ' ' << respCode << ' ';
    if (payload == nullptr) {
      line << "null";
    } else {
      line << msgpack::unpack(reinterpret_cast<const char*>(payload), payloadLength).get();
    }
    line << '\n';
    append(line.str());
  }

 private:
  // Opened in append mode and written at once, so that the lines of several sessions do not mix.
  void append(const std::string& line) const {
    std::FILE* const file = std::fopen(_path.c_str(), "ae");
    if (file == nullptr) return;
    std::setvbuf(file, nullptr, _IONBF, 0);
    std::fwrite(line.data(), 1, line.size(), file);
    std::fclose(file);
  }

  std::string _path;
};

void sendMessage(void* instance, std::uint16_t method, std::uint16_t respCode, const std::uint8_t* payload,
                 std::size_t payloadLength) {
  try {
    static_cast<const BriskAdaptor*>(instance)->sendMessage(method, respCode, payload, payloadLength);
  } catch (const std::exception& error) {  // must not reach the daemon
    std::fprintf(stderr, "BriskAdaptor: %s\n", error.what());
  }
}

void* create() {
  try {
    return std::make_unique<BriskAdaptor>().release();
  } catch (const std::exception&) {
    return nullptr;
  }
}

void destroy(void* instance) {
  delete static_cast<BriskAdaptor*>(instance);
}

OrvantaPluginOperation findOperation(const char* name) {
  return std::strcmp(name, "sendMessageWithMethod:respCode:dict:") == 0 ? sendMessage : nullptr;
}

const OrvantaPluginClass* findClass(const char* name) {
  static const OrvantaPluginClass adaptorClass{create, destroy, findOperation};
  return std::strcmp(name, "BriskAdaptor") == 0 ? &adaptorClass : nullptr;
}

}  // namespace

const OrvantaPluginBundle orvantaPluginBundle{ORVANTA_PLUGIN_ABI_VERSION, findClass};
