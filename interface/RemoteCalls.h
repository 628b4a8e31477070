#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "interface/ClientSessionInterface.h"
#include "interface/Values.h"
#include "interface/WireLimits.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/FrameDecoder.h"

// The operations of ClientSessionInterface on the wire. docs/protocol.md shows the bytes.
//
//   client                                           daemon
//   ClientSession writes a call: CallMessage    -->  dispatchCall() checks it and calls the session
//   deliverResponse() gives the caller its reply <-- the reply that dispatchCall() made writes the response
//   decodeSendMessageToClient(), …RemoveFile()  <--  encodeSendMessageToClient(), encodeRemoveFile()
//
// Both sides take names, argument counts and argument types from the tables here: a test holds docs/protocol.md
// against them. Pure but for the sending of replies; no function throws.

namespace orvanta {

// The wire's limits as the platform takes them.
inline constexpr platform::FrameLimits kFrameLimits{kMaximumFrameBytes, kMaximumFrameCharge, kMaximumFrameDepth};
inline constexpr platform::ConnectionLimits kDaemonConnectionLimits{
    kFrameLimits, kMaximumUnreadReplies, kMaximumWaitingAggregatedEvents, kMaximumWaitingDescriptors};

// The type that an argument must have. "OrNil" marks an optional one.
enum class ArgumentType {
  dictionary,
  dictionaryOrNil,
  array,
  arrayOrNil,
  boolean,
  uint16,
  number,
  string,
  stringOrNil
};

struct RemoteArgument {
  const char* name;
  ArgumentType type;
};

struct RemoteCall {
  const char* method;
  std::span<const RemoteArgument> arguments;
  const char* reply;  // the values that come back, in words; null for a notification
};

// A client's calls on the daemon, in the order of ClientSessionInterface.
enum class RemoteCallID : std::uint8_t {
  setSessionInfo,
  startConfigWithCompletionHandler,
  fetchStatesWithUserInfo,
  fetchDisplayURL,
  sendMessageWithCategory,
  sendMessageWithDictionary,
  flushMessagesWithCompletion,
  finishSessionWithReply,
  uploadFileAtPath,
  uploadLogData,
  sendMessageWithSessionInfo,
};
inline constexpr std::size_t kRemoteCallCount = 11;

// The daemon's calls on its client; never answered.
enum class RemoteNotificationID : std::uint8_t { sendMessageToClient, removeFile };
inline constexpr std::size_t kRemoteNotificationCount = 2;

std::span<const RemoteCall, kRemoteCallCount> remoteCalls();
const RemoteCall& remoteCall(RemoteCallID id);
const RemoteCall& remoteNotification(RemoteNotificationID id);
// Returns nullopt for an unknown method.
std::optional<RemoteCallID> findRemoteCall(std::string_view method);
// "a map or nil", as refusals word it.
const char* wireTypeText(ArgumentType type);
// Returns nullopt when the arguments fit the call, else what is wrong with which one.
std::optional<std::string> checkArguments(const RemoteCall& call, const Array& params);

// Daemon's side (RemoteDispatch.cpp). Carries out one frame on `target`, on the connection's queue; replies are sent
// through `outbox`, which is held weakly. A call that is refused is logged, and answered with the reason if it was a
// request. Returns whether the operation was called.
bool dispatchCall(platform::Frame&& frame, ClientSessionInterface& target,
                  const std::shared_ptr<platform::Outbox>& outbox);

// Both sides of notifications (RemoteNotifications.cpp): whole messages, and back. Decoding gives nullopt for any other
// frame and for wrong arguments.
std::vector<std::uint8_t> encodeSendMessageToClient(const SharedDictionary& sessionInfo, double timestamp,
                                                    std::uint16_t category, std::uint16_t type,
                                                    const SharedDictionary& payload);
std::vector<std::uint8_t> encodeRemoveFile(std::string_view token);
std::optional<AggregatedEvent> decodeSendMessageToClient(platform::Frame& frame);
std::optional<std::string> decodeRemoveFile(const platform::Frame& frame);

// The reply that a client's call waits for; monostate when the caller does not want an answer.
using PendingReply =
    std::variant<std::monostate, DoneReply, BackendNamesReply, StringReply, FlushReply, UploadReply, LogDataReply>;

// Client's side (RemoteResponses.cpp). Gives the reply the values of a response, or fails it: with the error that the
// response carries, or because its result has another shape than the call's. Calls into the program.
void deliverResponse(platform::Frame&& frame, PendingReply reply);

}  // namespace orvanta
