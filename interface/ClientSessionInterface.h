#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "interface/OrvantaError.h"
#include "interface/Reply.h"
#include "interface/Values.h"

namespace orvanta {

using BackendNames = std::optional<std::vector<std::string>>;
using BackendNamesReply = Reply<BackendNames>;
using StringReply = Reply<std::optional<std::string>>;
using FlushReply = Reply<std::optional<std::string>, std::optional<OrvantaError>>;
using UploadReply = Reply<bool>;
using LogDataReply = Reply<bool, std::optional<OrvantaError>>;
using DoneReply = Reply<>;  // of operations without values: tells a waiting client that the call was carried out

// The eleven operations that a client calls on the daemon, in their declared order. Implemented by the daemon's
// session and by the client's proxy; interface/RemoteCalls.h carries calls from one to the other.
//
// Calls of one connection are carried out one at a time in the order in which they were made. A reply is empty when the
// client does not want one. Dictionaries and arrays are shared and never changed; a null one was not given.
class ClientSessionInterface {
 public:
  virtual ~ClientSessionInterface() = default;

  virtual void setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo, SharedArray frameworksToCheck,
                              bool hasAggregationBlock, DoneReply done) = 0;
  virtual void startConfigWithCompletionHandler(BackendNamesReply completion) = 0;
  virtual void fetchStatesWithUserInfo(SharedDictionary userInfo, BackendNamesReply completion) = 0;
  virtual void fetchDisplayURL(StringReply reply) = 0;
  virtual void sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                       StringReply reply) = 0;
  virtual void sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) = 0;
  virtual void flushMessagesWithCompletion(FlushReply completion) = 0;
  virtual void finishSessionWithReply(StringReply reply) = 0;
  // `extensionToken` stands for a descriptor that travelled with the call.
  virtual void uploadFileAtPath(std::string fileURL, std::optional<std::string> extensionToken,
                                UploadReply completion) = 0;
  virtual void uploadLogData(SharedArray logData, LogDataReply completion) = 0;
  virtual void sendMessageWithSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                          std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                          StringReply reply) = 0;
};

// The content of one notification to an aggregating client: one event, or the notice that aggregation has ended.
struct AggregatedEvent {
  SharedDictionary sessionInfo;  // of the session where the event entered; null in the end notice
  double timestamp = 0;          // seconds since 1970
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  SharedDictionary
      payload;  // with the user info of the session where the event entered; null if the event had no payload
  bool isEndNotice() const { return !sessionInfo && timestamp == 0 && category == 0 && type == 0 && !payload; }
};

// The operation that the daemon calls on its client: one-way, without a reply.
class ClientSessionReplyInterface {
 public:
  virtual ~ClientSessionReplyInterface() = default;
  // One aggregated event, in the parts of AggregatedEvent. All null or zero: aggregation for the session has ended.
  virtual void sendMessageToClient(const SharedDictionary& sessionInfo, double timestamp, std::uint16_t category,
                                   std::uint16_t type, const SharedDictionary& payload) = 0;
};

}  // namespace orvanta
