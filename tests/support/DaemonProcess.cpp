#include "tests/support/DaemonProcess.h"

#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <thread>

#include "platform/codec/PropertyList.h"
#include "platform/ipc/Connect.h"

namespace orvanta::test {

namespace fs = std::filesystem;

DaemonProcess::DaemonProcess(Options options) : _wrapper(options.wrapper) {
  const auto plist = [this](const std::string& name, const Dictionary& content) {
    _directory.write(name, *platform::writeXmlPropertyList(content));
  };
  for (const char* name : {"run", "state", "etc", "framework", "plugins"}) fs::create_directories(_directory / name);
  // The shipped profile, with what only this build of the daemon needs.
  constexpr const char* kProfile = "/sandbox/com.kovalt.orvantad.plist";
  const auto shipped =
      platform::readPropertyListFile(std::string(ORVANTA_SOURCE_DIR) + "/packaging/share/orvanta" + kProfile);
  if (!shipped) throw std::runtime_error(shipped.error());
  Dictionary profile = *shipped->dictionary();
  profile.set("landlockABI", options.landlockAbi);
  plist(std::string("framework") + kProfile, profile);
  plist("framework/framework.plist", {{"version", options.version}});
  if (!options.publicKey.empty()) {
    _directory.write("framework/publicKey.der",
                     {reinterpret_cast<const char*>(options.publicKey.data()), options.publicKey.size()});
  }
  if (options.entitled) {
    plist("etc/entitlements.d/test.plist",
          {{"user", std::to_string(::getuid())}, {"entitlements", Dictionary{{"com.kovalt.private.orvantad", true}}}});
  }
  plist("etc/device.plist", options.device);
  Dictionary defaults = options.defaults;
  if (!options.storebagURL.empty()) defaults.set("orvanta_storebag_url", options.storebagURL);
  plist("state/com.kovalt.orvanta.plist", defaults);

  _environment = {{"RUNTIME_DIRECTORY", runtimeDirectory()},
                  {"STATE_DIRECTORY", stateDirectory()},
                  {"CONFIGURATION_DIRECTORY", configurationDirectory()},
                  {"ORVANTA_FRAMEWORK", _directory / "framework"},
                  {"ORVANTA_PLUGINS", _directory / "plugins"},
                  {"ORVANTA_LOG", "stderr"},
                  {"ORVANTA_LOG_LEVEL", options.logLevel},
                  {"ORVANTA_CA_FILE", options.caFile}};
  if (!options.sandbox) _environment["ORVANTA_SANDBOX"] = "off";
  // LeakSanitizer cannot work inside the sandbox; with it off, leaks are looked for.
  _environment["ASAN_OPTIONS"] = options.sandbox ? "detect_leaks=0" : "detect_leaks=1";
  for (const auto& [name, value] : options.environment) _environment[name] = value;
}

void DaemonProcess::launch() {
  ChildProcess::Options options;
  options.program = programPath("orvantad");
  if (!_wrapper.empty()) {
    options.arguments = {options.program};
    options.program = _wrapper;
  }
  options.environment = _environment;
  _process = std::make_unique<ChildProcess>(std::move(options));
}

bool DaemonProcess::startQuietly() {
  launch();
  return settles([this] { return platform::connectToService(runtimeDirectory(), "com.kovalt.orvantad") ? 0U : 1U; }, 0);
}

std::size_t DaemonProcess::entries(const std::string& name) const {
  const auto all = fs::directory_iterator("/proc/" + std::to_string(_process->pid()) + "/" + name);
  return static_cast<std::size_t>(std::distance(fs::begin(all), fs::end(all)));
}

std::size_t DaemonProcess::residentKiB() const {
  std::ifstream status("/proc/" + std::to_string(_process->pid()) + "/statm");
  std::size_t total = 0, resident = 0;
  status >> total >> resident;
  return resident * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)) / 1024;
}

bool DaemonProcess::keepsItsMemory(std::size_t leewayKiB, const std::function<void()>& work) const {
#if defined(__SANITIZE_THREAD__) || defined(__SANITIZE_ADDRESS__)
  constexpr bool kSanitized = true;
#else
  constexpr bool kSanitized = false;
#endif
  for (int tries = 0; tries < 4; ++tries) {
    const std::size_t before = residentKiB();
    work();
    if (kSanitized || residentKiB() <= before + leewayKiB) return true;
  }
  return false;
}

double DaemonProcess::cpuSeconds() const {
  clockid_t clock = 0;
  timespec used{};
  if (::clock_getcpuclockid(_process->pid(), &clock) != 0 || ::clock_gettime(clock, &used) != 0) return 0;
  return static_cast<double>(used.tv_sec) + static_cast<double>(used.tv_nsec) / 1e9;
}

bool DaemonProcess::settles(const std::function<std::size_t()>& counter, std::size_t limit) const {
  const auto deadline = std::chrono::steady_clock::now() + ChildProcess::kTimeout;
  while (counter() > limit) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::yield();
  }
  return true;
}

}  // namespace orvanta::test
