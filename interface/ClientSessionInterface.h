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
using DoneReply =
    Reply<>;  // for operations without a reply block: tells a waiting client that the call was carried out

// What a client calls on the daemon: the eleven operations, in their declared order. Implemented by the daemon's
// session and by the client's proxy; interface/RemoteCalls.h carries calls from one to the other.
//
// Calls of one connection are carried out one at a time in the order in which they were made. A reply is an empty
// object when the client wants none. Dictionaries and arrays are shared and never changed; null is "none".
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

}  // namespace orvanta
