#include <fmt/format.h>
#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdint>
#include <memory>
#include <string>

#include "platform/core/UniqueFd.h"
#include "tools/orvantactl/AnswerLines.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/ConfiguredSession.h"
#include "tools/orvantactl/Output.h"

namespace orvanta::ctl {

namespace {

// Waits until SIGINT or SIGTERM arrives or the library's thread calls finish(), whichever comes first. Made before the
// library's thread, which inherits the blocked signals.
class EndOfWatch {
 public:
  EndOfWatch() : _finished(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGINT);
    sigaddset(&signals, SIGTERM);
    ::sigprocmask(SIG_BLOCK, &signals, nullptr);
    _signals.reset(::signalfd(-1, &signals, SFD_CLOEXEC));
  }
  bool usable() const { return _finished && _signals; }

  // Any thread. Returns whether it came first; the status of later calls does not count.
  bool finish(int status) {
    int undecided = kUndecided;
    if (!_status.compare_exchange_strong(undecided, status)) return false;
    const std::uint64_t one = 1;
    [[maybe_unused]] const auto written = ::write(_finished.get(), &one, sizeof one);
    return true;
  }
  // The exit status: 0 after a signal.
  int wait() {
    pollfd waits[] = {{_finished.get(), POLLIN, 0}, {_signals.get(), POLLIN, 0}};
    while (::poll(waits, 2, -1) < 0 && errno == EINTR) {
    }
    int decided = kUndecided;
    return _status.compare_exchange_strong(decided, kAllTaken) ? kAllTaken : decided;
  }

 private:
  static constexpr int kUndecided = -1;
  platform::UniqueFd _finished;
  platform::UniqueFd _signals;
  std::atomic<int> _status{kUndecided};
};

int watch(const ClientOptions& options) {
  int status = kAllTaken;
  const auto records = recordsOrComplain(options, status);
  if (!records) return status;
  EndOfWatch end;  // outlives the connection, whose handlers use it
  if (!end.usable()) {
    complain("the system has no descriptors left to wait with");
    return kSomethingNotTaken;
  }
  const auto connection = connectOrComplain(options, status);
  if (!connection) return status;
  auto& session = connection->session();
  session.setAggregationHandler(
      [&end](const AggregatedEvent& event) {
        if (!printLine(aggregatedEventLine(event))) end.finish(kAllTaken);
      },
      [&end] {
        printLine("{\"end\":true}");
        end.finish(kAllTaken);
      });
  const auto set = session.blocking().setSessionInfo(records->sessionInfo.dictionary(), records->userInfoDictionary(),
                                                     nullptr, true);
  if (!set) return complain(set.error());
  if (!printLine(watchingLine(options.hierarchyToken, options.level))) return kAllTaken;  // main says what was lost
  // The daemon closes the connection soon after the end notice, too.
  connection->setConnectionLostHandler([&end](const CallError& error) {
    if (end.finish(exitStatusFor(error))) complain(error);
  });
  return end.wait();
}

}  // namespace

void addWatchCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<ClientOptions>();
  auto& command = *app.add_subcommand("watch", "Joins a group of sessions as its aggregator and shows their events");
  command.footer(
      "Writes {\"watching\":…} once it has joined, then one line an event:\n"
      "  {\"timestamp\":…,\"category\":…,\"type\":…,\"payload\":…,\"session\":{…}}\n"
      "and {\"end\":true} when the daemon ends the aggregation. Ctrl-C leaves.\n"
      "Events come from sessions that give the same token with a higher level and have user info.");
  options->addTo(command);
  options->addHierarchyTo(command, "--token");
  command.get_option("--token")->required();
  command.callback([options, &status] { status = watch(*options); });
}

}  // namespace orvanta::ctl
