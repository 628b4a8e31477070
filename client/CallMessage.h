#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "interface/ClientSessionInterface.h"

namespace orvanta {

// One call as it goes over the wire, put together argument by argument in the operation's declared order.
//
// Made and used up on the calling thread; the bytes sit in a buffer that the thread's calls share, so that a call costs
// no allocation: one CallMessage at a time per thread.
class CallMessage {
 public:
  // A request under `messageID`, or a notification when nobody waits for the answer.
  CallMessage(std::string_view method, std::size_t argumentCount, std::optional<std::uint32_t> messageID);
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
  // Why the daemon would end the connection over this message (too large, too deep); none when it is fine.
  std::optional<std::string> problem() const;

 private:
  std::vector<std::uint8_t>& _bytes;
  const std::string_view _method;
  bool _tooDeep = false;
};

}  // namespace orvanta
