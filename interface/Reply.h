#pragma once

#include <optional>
#include <string>
#include <tuple>
#include <utility>

#include "interface/Values.h"
#include "platform/core/UniqueFunction.h"

namespace orvanta {

// Why a call failed, for programs; people read the text.
enum class CallErrorKind {
  refused,          // the peer refused the call or dropped its reply; the text is the peer's
  noSuchService,    // no process listens on the service's socket
  notEntitled,      // the daemon closed the connection before it answered anything
  connectionLost,   // the connection ended before the answer came
  tooMuchWaiting,   // not sent: what the daemon has not read yet is over the limit
  fileNotReadable,  // not sent: the file to upload cannot be opened
  wrongThread,      // not sent: a call that waits was made on the thread that brings the replies
};

struct CallError {
  std::string text;
  CallErrorKind kind = CallErrorKind::refused;
};

// The result of a call that waits: its answer, or the reason why it failed.
template <class T>
using CallResult = Result<T, CallError>;

// The result of a call that does not wait: the reply's values, or, when they are nullopt, the reason why it failed.
template <class... Values>
struct ReplyOutcome {
  std::optional<std::tuple<Values...>> values;
  CallError error;
};

// The way back of one call's answer. Move-only; called at most once, from any thread; destroyed uncalled it reports
// that as an error, so that every caller hears the end of its call. Empty when the caller does not want an answer;
// calling an empty reply does nothing.
template <class... Values>
class Reply {
 public:
  using Outcome = ReplyOutcome<Values...>;
  using Receiver = platform::UniqueFunction<void(Outcome)>;

  Reply() noexcept = default;
  explicit Reply(Receiver receiver) : _receiver(std::move(receiver)) {}
  Reply(Reply&&) noexcept = default;
  Reply& operator=(Reply&& other) noexcept {
    if (this != &other) {
      reportDropped();
      _receiver = std::move(other._receiver);
    }
    return *this;
  }
  Reply(const Reply&) = delete;
  Reply& operator=(const Reply&) = delete;
  ~Reply() { reportDropped(); }

  // Returns whether the caller wants an answer: else its values need not be made.
  explicit operator bool() const noexcept { return static_cast<bool>(_receiver); }

  void operator()(Values... values) { deliver(Outcome{std::tuple<Values...>(std::move(values)...), {}}); }
  void fail(CallError error) { deliver(Outcome{std::nullopt, std::move(error)}); }

 private:
  void deliver(Outcome outcome) {
    if (!_receiver) return;
    auto receiver = std::move(_receiver);
    receiver(std::move(outcome));
  }
  void reportDropped() noexcept {
    if (!_receiver) return;
    try {
      fail(CallError{"the reply was dropped without being given"});
    } catch (...) {  // NOLINT(bugprone-empty-catch): a destructor cannot report it
    }
  }

  Receiver _receiver;
};

}  // namespace orvanta
