#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "client/Records.h"
#include "interface/ClientSessionInterface.h"

namespace orvanta {

class CallChannel;
class ClientSession;

// The answer to a flush. `error` is the daemon's own: what kept it from sending, while the call itself worked.
struct FlushAnswer {
  std::optional<std::string> text;
  std::optional<OrvantaError> error;
};

struct LogDataAnswer {
  bool uploaded = false;
  std::optional<OrvantaError> error;
};

// The operations of a session in a form that waits for the answer, however long the daemon takes; closing the
// connection from another thread ends the wait. While too many bytes wait for the daemon, they wait for that first.
//
// A view of a ClientSession, made by its blocking() and valid as long as its connection. Any thread may call except the
// library's callback thread: there a call fails at once (wrongThread), since the answer could never come.
class BlockingCalls {
 public:
  BlockingCalls(ClientSession& session, CallChannel& channel);

  // Sets the session up: setSessionInfo, which also tells the daemon whether the session has an aggregation handler,
  // and startConfig. Returns the names of the reporting backends; nullopt when the daemon has no storebag for the
  // client type.
  CallResult<BackendNames> configure(const SessionInfo& sessionInfo, const std::optional<UserInfo>& userInfo = {});

  CallResult<void> setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                  SharedArray frameworksToCheck, bool hasAggregationBlock);
  CallResult<BackendNames> startConfig();
  CallResult<BackendNames> fetchStates(SharedDictionary userInfo);
  CallResult<std::optional<std::string>> fetchDisplayURL();
  CallResult<std::optional<std::string>> sendMessage(std::uint16_t category, std::uint16_t type,
                                                     SharedDictionary payload);
  CallResult<std::optional<std::string>> sendMessage(SharedDictionary parameters);
  CallResult<std::optional<std::string>> sendMessage(const MessageParameters& parameters);
  CallResult<FlushAnswer> flushMessages();
  CallResult<std::optional<std::string>> finishSession();
  // While kMaximumWaitingDescriptors files are being uploaded, waits for one to end.
  CallResult<bool> uploadFile(const std::string& path);
  CallResult<LogDataAnswer> uploadLogData(SharedArray logData);
  // One event without a session. Returns "finished" or "storebag not available".
  CallResult<std::optional<std::string>> sendMessage(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                                     std::uint16_t category, std::uint16_t type,
                                                     SharedDictionary payload);

 private:
  template <class Answer, class AnyReply, class MakeCall>
  CallResult<Answer> wait(MakeCall makeCall);

  ClientSession& _session;
  CallChannel& _channel;
};

}  // namespace orvanta
