#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/codec/MessagePack.h"
#include "platform/core/Value.h"

namespace orvanta::platform {

// One MessagePack-RPC message, taken apart.
struct Frame {
  enum class Kind { request, response, notification };
  Kind kind = Kind::notification;
  std::uint32_t messageID = 0;  // requests and responses
  std::string method;           // requests and notifications
  Array params;                 // requests and notifications
  Value error;                  // responses; null when there is no error
  Value result;                 // responses
  // Not null: the frame was whole and well formed, but its arguments hold something that refuses the call (a duplicate
  // key, an unknown extension, a key or text that is not UTF-8, params that are not an array). The call is answered
  // with this text and not carried out.
  std::optional<std::string> refusal;
  std::size_t wireSize = 0;  // bytes the frame took on the wire
  std::size_t charge = 0;    // what its values take in memory, about
};

// Set by the side that opens a connection; a limit that is not set admits nothing.
struct FrameLimits {
  std::size_t maximumFrame = 0;   // bytes on the wire
  std::size_t maximumCharge = 0;  // bytes that the values take in memory
  std::size_t maximumDepth = 0;   // counting the frame's own array
};

// Turns a byte stream into frames, without any I/O. Used by one thread at a time.
//
// Bytes are appended; next() gives whole frames until none is left. A claimed length allocates nothing before its
// bytes are there. A protocol error (not MessagePack, not a frame, too deep, too large) is final: frames that ended
// before the offending byte are still given out first, then every call returns the error.
class FrameDecoder {
 public:
  explicit FrameDecoder(FrameLimits limits);

  void append(std::span<const std::uint8_t> bytes);

  struct NeedMore {};
  struct ProtocolError {
    std::string text;
  };
  using Outcome = std::variant<Frame, NeedMore, ProtocolError>;
  Outcome next();

  // Bytes appended and not yet given out as frames.
  std::size_t pending() const { return _buffer.size() - _start; }
  // Returns whether next() may give a frame of more than `bytes` that took several appends.
  bool mayHoldMoreThan(std::size_t bytes) const {
    return _scan.active && _scan.offset > bytes && _scan.offset <= pending();
  }

 private:
  // How far an incomplete frame has been looked through. Only its structure is followed: a frame that is whole on
  // arrival, as nearly all are, is never scanned, and one that arrives byte by byte is scanned once.
  struct Scan {
    bool active = false;
    bool shapeSeen = false;                // the frame begins as one of the three shapes
    std::size_t offset = 0;                // next byte to look at, from _start; may lie behind what has arrived
    std::size_t charge = 0;                // what the values seen so far will take in memory
    std::uint64_t owed = 0;                // values announced and not yet begun
    std::vector<std::uint64_t> remaining;  // of these, per open container, outermost first
  };
  enum class Progress { complete, incomplete, failed };

  Outcome decode(std::span<const std::uint8_t> window);  // NeedMore when the window ends too early
  Progress scanOn();
  Progress scanStructure();
  Outcome fail(std::string text);
  void consume(std::size_t bytes);
  std::span<const std::uint8_t> unread() const { return {_buffer.data() + _start, pending()}; }

  FrameLimits _limits;
  std::vector<std::uint8_t> _buffer;
  std::size_t _start = 0;
  Scan _scan;
  std::optional<std::string> _failed;
};

// Encoders of whole messages, appended to `out`.
void appendRequestHeader(std::vector<std::uint8_t>& out, std::uint32_t messageID, std::string_view method,
                         std::size_t paramCount);
void appendNotificationHeader(std::vector<std::uint8_t>& out, std::string_view method, std::size_t paramCount);
// The caller appends the error value, then the result value.
void appendResponseHeader(std::vector<std::uint8_t>& out, std::uint32_t messageID);
// A whole response that carries the transport's own error text.
void appendErrorResponse(std::vector<std::uint8_t>& out, std::uint32_t messageID, std::string_view text);

}  // namespace orvanta::platform
