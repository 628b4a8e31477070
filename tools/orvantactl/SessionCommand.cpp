#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "platform/codec/Json.h"
#include "platform/core/Text.h"
#include "platform/core/UniqueFd.h"
#include "tools/orvantactl/AnswerLines.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/ConfiguredSession.h"
#include "tools/orvantactl/EventLine.h"
#include "tools/orvantactl/EventPipeline.h"
#include "tools/orvantactl/LineReader.h"
#include "tools/orvantactl/Output.h"
#include "tools/orvantactl/ProgressBar.h"

namespace orvanta::ctl {

namespace {

constexpr const char* kFooter =
    "Events are read as one JSON object a line:\n"
    "  {\"category\": 1, \"type\": 2, \"payload\": {\"duration\": 1.5}, \"realtime\": true}\n"
    "category and type are whole numbers from 0 to 65535; payload (an object), flag (a number: 1 realtime, 2 "
    "promote),\n"
    "realtime and promote are optional. {\"$date\": SECONDS} and {\"$data\": \"BASE64\"} stand for a date and for "
    "data.\n"
    "\n"
    "Written to standard output, one JSON object a line:\n"
    "  {\"backends\":[…]}                     the reporting backends; null: the daemon has no storebag for the type\n"
    "  {\"event\":LINE,\"reply\":…}             for each event in order, by its line; null: the daemon had nothing to "
    "say\n"
    "  {\"event\":LINE,\"error\":\"…\"}           the event was not taken\n"
    "  {\"finish\":…}                         the answer to finishing the session\n"
    "  {\"flush\":{\"result\":…,\"error\":…}}     what the last flush sent; \"Nothing to flush\" is not a failure\n"
    "\n"
    "There is no option for an internal build: \"ReleaseType\" in the daemon's device.plist decides.";

struct SessionOptions : ClientOptions {
  std::string file;
  std::size_t window = 256;
  bool realtime = false;
  bool promote = false;
  bool noFlush = false;
  bool quiet = false;
};

// One run of the command, from connecting to the exit status.
class SessionRun {
 public:
  explicit SessionRun(const SessionOptions& options) : _options(options) {}

  int run() {
    if (!openInput()) return _status;
    // Without a storebag the events are sent all the same: their answers say what the daemon makes of them.
    auto session = configureOrComplain(_options, _status);
    if (!session.connection) return _status;
    _connection = std::move(session.connection);
    showBackends(session.backends);
    sendEvents();
    if (_connection->isOpen()) finish();
    return _status;
  }

 private:
  bool openInput() {
    if (_options.file.empty() || _options.file == "-") return true;
    _file.reset(::open(_options.file.c_str(), O_RDONLY | O_CLOEXEC));
    struct stat facts {};
    if (_file && ::fstat(_file.get(), &facts) == 0 && !S_ISDIR(facts.st_mode)) return true;
    complain(fmt::format("cannot read {}: {}", _options.file, platform::errnoText(_file ? EISDIR : errno)));
    _status = kUsage;
    return false;
  }

  void showBackends(const BackendNames& backends) const {
    if (_options.quiet) return;
    Array names;
    if (backends) names.assign(backends->begin(), backends->end());
    printLine("{\"backends\":" + platform::writeJson(backends ? Value(std::move(names)) : nullptr) + "}");
  }

  void sendEvents() {
    const int input = _file ? _file.get() : STDIN_FILENO;
    LineReader reader(input);
    EventPipeline pipeline(_connection->session(), _options.window, _options.quiet ? nullptr : stdout);
    // On a terminal the answers themselves show the progress.
    ProgressBar bar(::isatty(STDERR_FILENO) == 1 && (_options.quiet || ::isatty(STDOUT_FILENO) == 0), inputSize(input));
    std::uint64_t events = 0;
    std::string_view line;
    while (!pipeline.lost()) {
      const auto outcome = reader.next(line);
      if (outcome == LineReader::Outcome::end) break;
      if (outcome == LineReader::Outcome::failed) {
        bar.clear();
        notTaken(fmt::format("reading the events failed: {}", platform::errnoText(reader.error())));
        break;
      }
      if (outcome == LineReader::Outcome::tooLong) {
        bar.clear();
        notTaken(fmt::format("line {}: longer than the daemon takes", reader.lineNumber()));
        continue;
      }
      if (line.find_first_not_of(" \t") == std::string_view::npos) continue;
      const auto event = parseEventLine(line, {_options.realtime, _options.promote});
      if (!event) {
        bar.clear();
        notTaken(fmt::format("line {}: {}", reader.lineNumber(), event.error()));
        continue;
      }
      pipeline.send(reader.lineNumber(), *event);
      bar.update(++events, reader.bytesRead());
    }
    pipeline.drain();
    bar.clear();
    std::fflush(stdout);
    if (const auto error = pipeline.firstError()) {
      complain(fmt::format("{} of {} events were not taken; the first: {}", pipeline.failures(), events, error->text));
      _status = exitStatusFor(*error);
    }
  }

  void finish() {
    auto calls = _connection->session().blocking();
    const auto finished = calls.finishSession();
    if (!finished) {
      _status = complain(finished.error());
      return;
    }
    printLine("{\"finish\":" + optionalJson(*finished) + "}");
    if (_options.noFlush) return;
    const auto flushed = calls.flushMessages();
    if (!flushed) {
      _status = complain(flushed.error());
      return;
    }
    printLine(flushLine(*flushed));
    if (const auto problem = flushProblem(*flushed)) notTaken(*problem);
  }

  void notTaken(const std::string& text) {
    complain(text);
    if (_status == kAllTaken) _status = kSomethingNotTaken;
  }

  static std::optional<std::uint64_t> inputSize(int input) {
    struct stat facts {};
    if (::fstat(input, &facts) != 0 || !S_ISREG(facts.st_mode)) return std::nullopt;
    return static_cast<std::uint64_t>(facts.st_size);
  }

  const SessionOptions& _options;
  platform::UniqueFd _file;
  std::unique_ptr<OrvantaConnection> _connection;
  int _status = kAllTaken;
};

}  // namespace

void addSessionCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<SessionOptions>();
  auto& command = *app.add_subcommand("session", "Reports events from standard input or a file in one session");
  command.footer(kFooter);
  options->addTo(command);
  options->addHierarchyTo(command, "--hierarchy-token");
  command.add_option("--file", options->file, "Read the events from this file; default: standard input")
      ->type_name("F");
  command.add_flag("--realtime", options->realtime, "Every event goes out at once, unless its line says otherwise");
  command.add_flag("--promote", options->promote,
                   "Every event makes a session that is sampled out report after all, unless its line says otherwise");
  command.add_option("--window", options->window, "Unanswered events at a time; default: 256")
      ->check(CLI::Range(1, 100'000))
      ->type_name("N");
  command.add_flag("--no-flush", options->noFlush,
                   "Do not flush at the end; batched events go out later by themselves");
  command.add_flag("--quiet", options->quiet, "Write no answers to events; finish and flush are still written");
  command.callback([options, &status] { status = SessionRun(*options).run(); });
}

}  // namespace orvanta::ctl
