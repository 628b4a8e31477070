#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "interface/AggregatedEvent.h"
#include "interface/ClientSessionInterface.h"
#include "interface/ClientSessionReplyInterface.h"
#include "interface/Values.h"
#include "platform/ipc/Connection.h"
#include "platform/ipc/FrameDecoder.h"

namespace orvanta {

// What an argument must be on the wire. "Or nil" marks an optional one.
enum class ArgumentType { dictionary, dictionaryOrNil, array, arrayOrNil, boolean, uint16, string, stringOrNil };

struct RemoteArgument {
  const char* name;
  ArgumentType type;
};

// The eleven calls, in the interface's declared order. This table drives the marshalling on both sides, the argument
// checks, docs/protocol.md and the fuzzers.
enum class RemoteCallID {
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

struct RemoteCall {
  RemoteCallID id;
  const char* method;
  std::span<const RemoteArgument> arguments;
  const char* reply;  // for the docs: the values that come back
};

std::span<const RemoteCall, 11> remoteCalls();
// Null for an unknown operation.
const RemoteCall* findRemoteCall(std::string_view method);
// Null when the arguments fit the call; else what is wrong with which argument.
std::optional<std::string> checkArguments(const RemoteCall& call, const Array& params);

// Daemon's side. Carries out one frame on `target`: decodes and checks the arguments, makes the reply that answers
// through `outbox` (held weakly), and calls the operation. What is refused is answered with the reason; a refused
// notification is logged. Returns whether the operation was called. On the connection's queue.
bool dispatchCall(platform::Frame&& frame, ClientSessionInterface& target,
                  const std::shared_ptr<platform::Outbox>& outbox);

// Whole messages.
std::vector<std::uint8_t> encodeSendMessageToClient(const SharedDictionary& sessionInfo, double timestamp,
                                                    std::uint16_t category, std::uint16_t type,
                                                    const SharedDictionary& payload);
std::vector<std::uint8_t> encodeRemoveFile(std::string_view token);
// Client's side of the same two: false when the frame is no such notification or malformed.
std::optional<AggregatedEvent> decodeSendMessageToClient(platform::Frame& frame);
std::optional<std::string> decodeRemoveFile(const platform::Frame& frame);

// Client's side of replies: the values of a response frame, or the error it carries. Each fails the reply when the
// result has another shape than the call's.
void deliverResponse(platform::Frame&& frame, BackendNamesReply reply);
void deliverResponse(platform::Frame&& frame, StringReply reply);
void deliverResponse(platform::Frame&& frame, FlushReply reply);
void deliverResponse(platform::Frame&& frame, UploadReply reply);
void deliverResponse(platform::Frame&& frame, LogDataReply reply);
void deliverResponse(platform::Frame&& frame, DoneReply reply);

}  // namespace orvanta
