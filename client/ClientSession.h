#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "client/BlockingCalls.h"
#include "interface/ClientSessionInterface.h"

namespace orvanta {

class CallChannel;

// The daemon's session of this connection, as the program calls it: the eleven operations, asynchronous. blocking() has
// them in a form that waits.
//
// Owned by the OrvantaConnection. Any thread may call. A reply is called on the library's callback thread, exactly
// once, with the answer or with the reason why it failed; it must not throw, and should return soon, since the
// other replies and events wait behind it. With an empty reply the program does not learn of a failure either.
//
// Dictionaries and arrays must not be changed once they have been passed in.
class ClientSession final : public ClientSessionInterface {
 public:
  explicit ClientSession(std::shared_ptr<CallChannel> channel);
  ClientSession(const ClientSession&) = delete;
  ClientSession& operator=(const ClientSession&) = delete;
  ~ClientSession() override;

  BlockingCalls blocking() { return BlockingCalls(*this, *_channel); }

  // `event` is called with the events of this session and of those below it in its hierarchy; `ended` once, after the
  // last. Set them before setSessionInfo, which tells the daemon (hasAggregationBlock). A handler that falls behind
  // loses events: the daemon keeps kMaximumWaitingAggregatedEvents bytes of them.
  void setAggregationHandler(std::function<void(const AggregatedEvent&)> event, std::function<void()> ended);
  bool hasAggregationHandler() const;

  void setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo, SharedArray frameworksToCheck,
                      bool hasAggregationBlock, DoneReply done) override;
  void startConfigWithCompletionHandler(BackendNamesReply completion) override;
  void fetchStatesWithUserInfo(SharedDictionary userInfo, BackendNamesReply completion) override;
  void fetchDisplayURL(StringReply reply) override;
  void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                               StringReply reply) override;
  void sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) override;
  void flushMessagesWithCompletion(FlushReply completion) override;
  void finishSessionWithReply(StringReply reply) override;
  // Opens the file behind the URL and passes the descriptor under the given token. Without a token no descriptor goes
  // out, so the daemon cannot read the file and answers false.
  void uploadFileAtPath(std::string fileURL, std::optional<std::string> extensionToken,
                        UploadReply completion) override;
  void uploadLogData(SharedArray logData, LogDataReply completion) override;
  void sendMessageWithSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo, std::uint16_t category,
                                  std::uint16_t type, SharedDictionary payload, StringReply reply) override;

  // The usual form: opens the file, makes up the token, and removes the file when the daemon says that the server has
  // it (only if the path still leads to the very file that was opened). At most kMaximumWaitingDescriptors at a time.
  void uploadFileAtPath(const std::string& path, UploadReply completion);

 private:
  friend class BlockingCalls;
  void uploadFile(const std::string& path, std::optional<std::string> token, bool wait, UploadReply completion);

  const std::shared_ptr<CallChannel> _channel;
};

}  // namespace orvanta
