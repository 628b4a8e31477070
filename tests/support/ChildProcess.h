#pragma once

#include <sys/types.h>

#include <chrono>
#include <condition_variable>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/UniqueFd.h"

namespace orvanta::test {

// A real program, started with an environment of its own; what it writes to standard error is gathered line by line,
// and standard output too when asked for. Ends with the object, by SIGKILL if need be. Used by one test thread.
class ChildProcess {
 public:
  struct Options {
    std::string program;
    std::vector<std::string> arguments;
    std::map<std::string, std::string> environment;  // on top of the test's own
    std::string input;                               // on standard input, then end of file
    bool holdInput = false;                          // no end of file before closeInput()
    bool keepOutput = false;
  };
  // What waiting may take before the test counts as hung; nothing should come near it.
  static constexpr std::chrono::seconds kPatience{60};

  explicit ChildProcess(Options options);
  ~ChildProcess();
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return _pid; }
  // Whether a line that holds `text` has come, now or within the patience; false at once when the program ended without
  // it.
  bool waitForLine(const std::string& text, std::size_t count = 1);
  // These hold everything that the program had written when they were called.
  std::vector<std::string> lines();
  std::size_t count(const std::string& text);
  std::string allLines();
  std::string output();  // after the program has ended
  // With holdInput, while the program runs.
  void write(const std::string& input);
  void closeInput() { _input.reset(); }
  void signal(int number);
  // The exit status, or minus the signal that ended it. Waits.
  int wait();
  std::optional<int> exitStatus() const { return _status; }

 private:
  void read(int fd, bool isError);
  bool readWhatIsThere(int fd, bool isError);  // with _mutex held; false at the end

  pid_t _pid = -1;
  std::optional<int> _status;
  platform::UniqueFd _error, _output, _input;
  std::thread _errorReader, _outputReader, _inputWriter;
  mutable std::mutex _mutex;
  std::condition_variable _changed;
  std::vector<std::string> _lines;  // guarded by _mutex
  std::string _partialLine;         // guarded by _mutex
  std::string _outputText;          // guarded by _mutex
  bool _errorEnded = false;         // guarded by _mutex
};

}  // namespace orvanta::test
