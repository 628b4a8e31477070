#pragma once

#include <csignal>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "interface/Values.h"
#include "tests/support/ChildProcess.h"
#include "tests/support/TemporaryDirectory.h"

namespace orvanta::test {

// The real orvantad with directories of its own, its log in memory. The current user is entitled unless a test says
// otherwise, the sandbox is on.
class DaemonProcess {
 public:
  struct Options {
    std::string storebagURL;              // the user default; empty to set none
    std::vector<std::uint8_t> publicKey;  // DER; empty: no key file
    std::string caFile;                   // ORVANTA_CA_FILE
    Dictionary device;                    // device.plist
    Dictionary defaults;                  // further user defaults
    bool entitled = true;
    bool sandbox = true;
    std::string version = "8.0.0";
    std::string logLevel = "7";
    std::int64_t landlockAbi = 1000;  // the highest that the sandbox makes use of
    std::string wrapper;              // a program that runs the daemon, if any
    std::map<std::string, std::string> environment;
  };

  explicit DaemonProcess(Options options);

  // Starts the program (again) and waits until it listens; false when it ended instead.
  bool start() {
    launch();
    return logged("main: Listener resumes with sandbox, start loop.");
  }
  // The same for log levels at which it does not say that it listens: waits for its socket instead.
  bool startQuietly();
  // SIGTERM; the exit status.
  int terminate() {
    _process->signal(SIGTERM);
    return _process->wait();
  }

  ChildProcess& process() { return *_process; }
  // Shorthands on the log.
  bool logged(const std::string& text, std::size_t count = 1) { return _process->waitForLine(text, count); }
  std::size_t count(const std::string& text) { return _process->count(text); }

  std::string runtimeDirectory() const { return _directory / "run"; }
  std::string stateDirectory() const { return _directory / "state"; }
  std::string configurationDirectory() const { return _directory / "etc"; }
  // A file of the state directory; empty when there is none.
  std::string stateFile(const std::string& name) const { return _directory.read("state/" + name); }
  std::string socketPath() const { return runtimeDirectory() + "/com.kovalt.orvantad"; }
  std::map<std::string, std::string> environment() const { return _environment; }

  // Open descriptors and threads of the daemon now, and its resident memory in KiB.
  std::size_t descriptorCount() const { return entries("fd"); }
  std::size_t threadCount() const { return entries("task"); }
  std::size_t residentKiB() const;
  // Counts until `counter` gives at most `limit`; false when it never does.
  bool settles(const std::function<std::size_t()>& counter, std::size_t limit) const;
  // Returns whether `work` leaves the resident memory as it was, but for `leewayKiB`. What is kept, such as the buffers
  // of a thread more, makes it grow once; a leak does each of a few times. Sanitizers keep what is freed: then it is
  // true.
  bool keepsItsMemory(std::size_t leewayKiB, const std::function<void()>& work) const;
  // The processor time that the daemon has used so far.
  double cpuSeconds() const;

  // The build's programs.
  static std::string programPath(const std::string& name) { return std::string(ORVANTA_BIN_DIR) + "/" + name; }

 private:
  void launch();
  std::size_t entries(const std::string& name) const;  // of a directory that /proc has for the daemon

  std::string _wrapper;
  TemporaryDirectory _directory;
  std::map<std::string, std::string> _environment;
  std::unique_ptr<ChildProcess> _process;
};

}  // namespace orvanta::test
