#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "interface/RemoteCalls.h"
#include "platform/codec/MessagePack.h"

namespace orvanta {

// One call as it goes over the wire: its name comes from the table of calls, its arguments are appended one by one in
// the table's order, all of them.
//
// Made and sent on the calling thread. The bytes are in a buffer that the calls of the thread share, so that a call
// does not allocate: one CallMessage at a time per thread.
class CallMessage {
 public:
  // A request under `messageID`, or a notification without one.
  CallMessage(RemoteCallID id, std::optional<std::uint32_t> messageID);
  CallMessage(const CallMessage&) = delete;
  CallMessage& operator=(const CallMessage&) = delete;
  ~CallMessage();

  CallMessage& dictionary(const SharedDictionary& value);  // null goes as nil
  CallMessage& array(const SharedArray& value);            // null goes as nil
  CallMessage& boolean(bool value);
  CallMessage& number(std::uint16_t value);
  CallMessage& text(std::string_view value);
  CallMessage& optionalText(const std::optional<std::string>& value);

  const std::vector<std::uint8_t>& bytes() const { return _bytes; }
  // Why the daemon would end the connection over this message (too large, too deep); nullopt when it would not.
  std::optional<std::string> problem() const;

 private:
  platform::MessagePackWriter nextArgument();

  std::vector<std::uint8_t>& _bytes;
  const RemoteCall& _call;
  std::size_t _given = 0;  // arguments appended
  bool _tooDeep = false;
};

}  // namespace orvanta
