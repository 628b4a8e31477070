#pragma once

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <condition_variable>
#include <cstring>
#include <map>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "platform/core/UniqueFd.h"

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
  // Waiting longer means that the test hangs; nothing should come near it.
  static constexpr std::chrono::seconds kTimeout{60};

  explicit ChildProcess(Options options) {
    Pipe input, output, error;
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawn_file_actions_adddup2(&actions, input.read.get(), STDIN_FILENO);
    if (options.keepOutput) ::posix_spawn_file_actions_adddup2(&actions, output.write.get(), STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions, error.write.get(), STDERR_FILENO);

    std::vector<std::string> arguments{options.program};
    arguments.insert(arguments.end(), options.arguments.begin(), options.arguments.end());
    auto environment = mergedEnvironment(options.environment);
    const int failed = ::posix_spawn(&_pid, options.program.c_str(), &actions, nullptr, pointersTo(arguments).data(),
                                     pointersTo(environment).data());
    ::posix_spawn_file_actions_destroy(&actions);
    if (failed != 0) throw std::runtime_error("cannot start " + options.program + ": " + std::strerror(failed));

    _error = std::move(error.read);
    _output = std::move(output.read);
    error.write.reset();
    output.write.reset();
    _errorReader = std::thread([this] { read(_error.get(), true); });
    _outputReader = std::thread([this] { read(_output.get(), false); });
    if (options.holdInput) {
      _input = std::move(input.write);
      return;
    }
    _inputWriter = std::thread([fd = std::move(input.write), text = std::move(options.input)] {
      std::string_view rest = text;
      while (!rest.empty()) {
        const ssize_t written = ::write(fd.get(), rest.data(), rest.size());
        if (written <= 0) return;
        rest.remove_prefix(static_cast<std::size_t>(written));
      }
    });
  }
  ~ChildProcess() {
    if (!_status) {
      signal(SIGKILL);
      wait();
    }
  }
  ChildProcess(const ChildProcess&) = delete;
  ChildProcess& operator=(const ChildProcess&) = delete;

  pid_t pid() const { return _pid; }
  // Returns whether a line that holds `text` has come, now or within kTimeout; false at once when the program ended
  // without it.
  bool waitForLine(const std::string& text, std::size_t wanted = 1) {
    std::unique_lock lock(_mutex);
    std::size_t scanned = 0, found = 0;
    const auto enough = [&] {
      for (; scanned < _lines.size(); ++scanned) {
        if (_lines[scanned].find(text) != std::string::npos) ++found;
      }
      return found >= wanted;
    };
    _changed.wait_for(lock, kTimeout, [&] { return enough() || _errorEnded; });
    return enough();
  }
  // These hold everything that the program had written when they were called.
  std::vector<std::string> lines() {
    const std::lock_guard lock(_mutex);
    if (!_errorEnded) readWhatIsThere(_error.get(), true);
    return _lines;
  }
  std::size_t count(const std::string& text) {
    const auto all = lines();
    return static_cast<std::size_t>(
        std::count_if(all.begin(), all.end(), [&](const auto& line) { return line.find(text) != std::string::npos; }));
  }
  std::string allLines() {
    std::string all;
    for (const auto& line : lines()) all += line + "\n";
    return all;
  }
  // After the program has ended.
  std::string output() {
    wait();
    const std::lock_guard lock(_mutex);
    return _outputText;
  }
  // With holdInput, while the program runs.
  void write(const std::string& input) {
    if (::write(_input.get(), input.data(), input.size()) != static_cast<ssize_t>(input.size())) {
      throw std::runtime_error("the program takes no input");
    }
  }
  void closeInput() { _input.reset(); }
  void signal(int number) { ::kill(_pid, number); }
  // The exit status, or minus the signal that ended it. Waits.
  int wait() {
    if (_status) return *_status;
    closeInput();
    int status = 0;
    while (::waitpid(_pid, &status, 0) < 0 && errno == EINTR) continue;
    _status = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
    for (auto* thread : {&_errorReader, &_outputReader, &_inputWriter}) {
      if (thread->joinable()) thread->join();
    }
    return *_status;
  }
  std::optional<int> exitStatus() const { return _status; }

 private:
  struct Pipe {
    platform::UniqueFd read, write;
    Pipe() {
      int fds[2];
      if (::pipe2(fds, O_CLOEXEC) != 0) throw std::runtime_error("pipe failed");
      read.reset(fds[0]);
      write.reset(fds[1]);
    }
  };
  static std::vector<std::string> mergedEnvironment(const std::map<std::string, std::string>& additions) {
    std::vector<std::string> merged;
    for (char** entry = ::environ; *entry != nullptr; ++entry) {
      const std::string text = *entry;
      if (additions.count(text.substr(0, text.find('='))) == 0) merged.push_back(text);
    }
    for (const auto& [name, value] : additions) merged.push_back(name + "=" + value);
    return merged;
  }
  static std::vector<char*> pointersTo(std::vector<std::string>& texts) {
    std::vector<char*> pointers;
    for (auto& text : texts) pointers.push_back(text.data());
    pointers.push_back(nullptr);
    return pointers;
  }
  void read(int fd, bool isError) {
    for (bool ended = false; !ended;) {
      pollfd ready{fd, POLLIN, 0};
      ::poll(&ready, 1, -1);
      const std::lock_guard lock(_mutex);
      ended = !readWhatIsThere(fd, isError);
    }
    if (!isError) return;
    const std::lock_guard lock(_mutex);
    if (!_partialLine.empty()) _lines.push_back(_partialLine);
    _errorEnded = true;
    _changed.notify_all();
  }
  // With _mutex held; false at the end.
  bool readWhatIsThere(int fd, bool isError) {
    char buffer[65536];
    for (pollfd ready{fd, POLLIN, 0}; ::poll(&ready, 1, 0) > 0;) {
      const ssize_t length = ::read(fd, buffer, sizeof buffer);
      if (length < 0 && errno == EINTR) continue;
      if (length <= 0) return false;
      (isError ? _partialLine : _outputText).append(buffer, static_cast<std::size_t>(length));
    }
    if (!isError) return true;
    for (std::size_t end; (end = _partialLine.find('\n')) != std::string::npos; _partialLine.erase(0, end + 1)) {
      _lines.push_back(_partialLine.substr(0, end));
    }
    _changed.notify_all();
    return true;
  }

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
