// A diagnostics adaptor that tries what the daemon's sandbox forbids. An event's category is the number of the act,
// counted from 1; its type is 0 for the session's own thread, 1 for a thread that the plug-in starts. What came of it
// is appended to acts.log in the daemon's state directory.

#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string>
#include <thread>

#include "interface/PluginBundle.h"
#include "tests/support/ForbiddenActs.h"

namespace {

using orvanta::test::kForbiddenActs;

void sendMessage(void* /*instance*/, std::uint16_t method, std::uint16_t respCode, const std::uint8_t* /*payload*/,
                 std::size_t /*payloadLength*/) {
  while (method == orvanta::test::kActThatNeverEnds) std::this_thread::sleep_for(std::chrono::hours(1));
  if (method == 0 || method > std::size(kForbiddenActs)) return;  // 0: the session's own records
  const auto& act = kForbiddenActs[method - 1];
  const std::string state = std::getenv("STATE_DIRECTORY");
  const std::string readable = std::getenv("CONFIGURATION_DIRECTORY") + std::string("/device.plist");
  std::string result;
  const auto attempt = [&] { result = act.attempt(readable, state + "/.."); };
  if (respCode == 0) {
    attempt();
  } else {
    std::thread(attempt).join();
  }
  std::ofstream(state + "/acts.log", std::ios::app) << act.name << ": " << result << '\n';
}

void* create() {
  static int instance;
  return &instance;
}

OrvantaPluginOperation findOperation(const char* name) {
  return std::strcmp(name, "sendMessageWithMethod:respCode:dict:") == 0 ? sendMessage : nullptr;
}

const OrvantaPluginClass* findClass(const char* name) {
  static const OrvantaPluginClass adaptorClass{create, nullptr, findOperation};
  return std::strcmp(name, "BriskAdaptor") == 0 ? &adaptorClass : nullptr;
}

}  // namespace

const OrvantaPluginBundle orvantaPluginBundle{ORVANTA_PLUGIN_ABI_VERSION, findClass};
