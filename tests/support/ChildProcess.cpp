#include "tests/support/ChildProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <stdexcept>

extern char** environ;

namespace orvanta::test {

namespace {

struct Pipe {
  platform::UniqueFd read, write;
  Pipe() {
    int fds[2];
    if (::pipe2(fds, O_CLOEXEC) != 0) throw std::runtime_error("pipe failed");
    read.reset(fds[0]);
    write.reset(fds[1]);
  }
};

std::vector<std::string> mergedEnvironment(const std::map<std::string, std::string>& additions) {
  std::vector<std::string> merged;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string text = *entry;
    if (additions.count(text.substr(0, text.find('='))) == 0) merged.push_back(text);
  }
  for (const auto& [name, value] : additions) merged.push_back(name + "=" + value);
  return merged;
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (auto& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

}  // namespace

ChildProcess::ChildProcess(Options options) {
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

ChildProcess::~ChildProcess() {
  if (!_status) {
    ::kill(_pid, SIGKILL);
    wait();
  }
}

void ChildProcess::read(int fd, bool isError) {
  pollfd ready{fd, POLLIN, 0};
  for (;;) {
    ::poll(&ready, 1, -1);
    const std::lock_guard lock(_mutex);
    if (!readWhatIsThere(fd, isError)) break;
  }
  const std::lock_guard lock(_mutex);
  if (isError) {
    if (!_partialLine.empty()) _lines.push_back(_partialLine);
    _errorEnded = true;
    _changed.notify_all();
  }
}

bool ChildProcess::readWhatIsThere(int fd, bool isError) {
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

bool ChildProcess::waitForLine(const std::string& text, std::size_t wanted) {
  std::unique_lock lock(_mutex);
  std::size_t scanned = 0, found = 0;
  const auto enough = [&] {
    for (; scanned < _lines.size(); ++scanned) {
      if (_lines[scanned].find(text) != std::string::npos) ++found;
    }
    return found >= wanted;
  };
  _changed.wait_for(lock, kPatience, [&] { return enough() || _errorEnded; });
  return enough();
}

std::vector<std::string> ChildProcess::lines() {
  const std::lock_guard lock(_mutex);
  if (!_errorEnded) readWhatIsThere(_error.get(), true);
  return _lines;
}

std::size_t ChildProcess::count(const std::string& text) {
  const std::lock_guard lock(_mutex);
  if (!_errorEnded) readWhatIsThere(_error.get(), true);
  return static_cast<std::size_t>(std::count_if(
      _lines.begin(), _lines.end(), [&](const auto& line) { return line.find(text) != std::string::npos; }));
}

std::string ChildProcess::allLines() {
  std::string all;
  for (const auto& line : lines()) all += line + "\n";
  return all;
}

std::string ChildProcess::output() {
  wait();
  const std::lock_guard lock(_mutex);
  return _outputText;
}

void ChildProcess::write(const std::string& input) {
  if (::write(_input.get(), input.data(), input.size()) != static_cast<ssize_t>(input.size())) {
    throw std::runtime_error("the program takes no input");
  }
}

void ChildProcess::signal(int number) {
  ::kill(_pid, number);
}

int ChildProcess::wait() {
  if (_status) return *_status;
  closeInput();
  int status = 0;
  while (::waitpid(_pid, &status, 0) < 0 && errno == EINTR) {
  }
  _status = WIFEXITED(status) ? WEXITSTATUS(status) : -WTERMSIG(status);
  for (auto* thread : {&_errorReader, &_outputReader, &_inputWriter}) {
    if (thread->joinable()) thread->join();
  }
  return *_status;
}

}  // namespace orvanta::test
