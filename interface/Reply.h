#pragma once

#include <optional>
#include <string>
#include <tuple>
#include <utility>

#include "platform/core/UniqueFunction.h"

namespace orvanta {

// Why a call brought no reply, for programs; people read the text.
enum class CallErrorKind {
  refused,          // the peer refused the call or dropped its reply; the text is the peer's
  noSuchService,    // nobody listens on the service's socket
  notEntitled,      // the daemon closed the connection before it answered anything
  connectionLost,   // the connection ended before the answer came
  tooMuchWaiting,   // not sent: what the daemon has not read yet is over the limit
  fileNotReadable,  // not sent: the file to upload cannot be opened
  wrongThread,      // not sent: a call that waits was made on the thread that brings the replies
};

// Why a call brought no reply: the transport's own text (connection lost, call refused, reply dropped).
struct CallError {
  std::string text;
  CallErrorKind kind = CallErrorKind::refused;
};

// The result of a call: the reply's values, or the reason why there are none.
template <class... Values>
struct ReplyOutcome {
  std::optional<std::tuple<Values...>> values;
  CallError error;
};

// A reply that somebody waits for. Move-only; called at most once, from any thread; dropped uncalled it reports that as
// an error, so that no caller waits in silence. Empty when nobody waits; calling an empty reply does nothing.
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

  // Whether anybody waits: a value nobody wants need not be made.
  explicit operator bool() const noexcept { return static_cast<bool>(_receiver); }

  void operator()(Values... values) { deliver(Outcome{std::tuple<Values...>(std::move(values)...), {}}); }
  void fail(CallError error) { deliver(Outcome{std::nullopt, std::move(error)}); }
  // Forgets about the reply without reporting anything.
  void dismiss() noexcept { _receiver.reset(); }

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
    } catch (...) {  // NOLINT(bugprone-empty-catch): a destructor has nobody to tell
    }
  }

  Receiver _receiver;
};

}  // namespace orvanta
