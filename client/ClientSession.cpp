#include "client/ClientSession.h"

#include <utility>

#include "client/CallChannel.h"
#include "client/CallMessage.h"
#include "interface/FileURL.h"

namespace orvanta {

namespace {

// A call under way: its bytes, and the id under which its answer comes if the caller wants one.
class Call {
 public:
  template <class AnyReply>
  Call(CallChannel& channel, RemoteCallID id, AnyReply&& reply)
      : _channel(channel),
        _messageID(reply ? channel.nextMessageID() : 0),
        message(id, reply ? std::optional(_messageID) : std::nullopt) {
    if (reply) _reply = std::forward<AnyReply>(reply);
  }
  void send(platform::UniqueFd descriptor = {}) {
    _channel.submit(_messageID, message, std::move(_reply), std::move(descriptor));
  }

 private:
  CallChannel& _channel;
  const std::uint32_t _messageID;
  PendingReply _reply;

 public:
  CallMessage message;
};

}  // namespace

ClientSession::ClientSession(std::shared_ptr<CallChannel> channel) : _channel(std::move(channel)) {}

ClientSession::~ClientSession() = default;

void ClientSession::setAggregationHandler(std::function<void(const AggregatedEvent&)> event,
                                          std::function<void()> ended) {
  _channel->setHandlers({std::move(event), std::move(ended)});
}

bool ClientSession::hasAggregationHandler() const {
  return _channel->hasAggregationHandler();
}

void ClientSession::setSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                   SharedArray frameworksToCheck, bool hasAggregationBlock, DoneReply done) {
  if (hasAggregationBlock) _channel->expectAggregation();
  Call call(*_channel, RemoteCallID::setSessionInfo, std::move(done));
  call.message.dictionary(sessionInfo).dictionary(userInfo).array(frameworksToCheck).boolean(hasAggregationBlock);
  call.send();
}

void ClientSession::startConfigWithCompletionHandler(BackendNamesReply completion) {
  Call(*_channel, RemoteCallID::startConfigWithCompletionHandler, std::move(completion)).send();
}

void ClientSession::fetchStatesWithUserInfo(SharedDictionary userInfo, BackendNamesReply completion) {
  Call call(*_channel, RemoteCallID::fetchStatesWithUserInfo, std::move(completion));
  call.message.dictionary(userInfo);
  call.send();
}

void ClientSession::fetchDisplayURL(StringReply reply) {
  Call(*_channel, RemoteCallID::fetchDisplayURL, std::move(reply)).send();
}

void ClientSession::sendMessageWithCategory(std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                            StringReply reply) {
  Call call(*_channel, RemoteCallID::sendMessageWithCategory, std::move(reply));
  call.message.number(category).number(type).dictionary(payload);
  call.send();
}

void ClientSession::sendMessageWithDictionary(SharedDictionary parameters, StringReply reply) {
  Call call(*_channel, RemoteCallID::sendMessageWithDictionary, std::move(reply));
  call.message.dictionary(parameters);
  call.send();
}

void ClientSession::flushMessagesWithCompletion(FlushReply completion) {
  Call(*_channel, RemoteCallID::flushMessagesWithCompletion, std::move(completion)).send();
}

void ClientSession::finishSessionWithReply(StringReply reply) {
  Call(*_channel, RemoteCallID::finishSessionWithReply, std::move(reply)).send();
}

void ClientSession::uploadLogData(SharedArray logData, LogDataReply completion) {
  Call call(*_channel, RemoteCallID::uploadLogData, std::move(completion));
  call.message.array(logData);
  call.send();
}

void ClientSession::sendMessageWithSessionInfo(SharedDictionary sessionInfo, SharedDictionary userInfo,
                                               std::uint16_t category, std::uint16_t type, SharedDictionary payload,
                                               StringReply reply) {
  Call call(*_channel, RemoteCallID::sendMessageWithSessionInfo, std::move(reply));
  call.message.dictionary(sessionInfo).dictionary(userInfo).number(category).number(type).dictionary(payload);
  call.send();
}

void ClientSession::uploadFileAtPath(std::string fileURL, std::optional<std::string> extensionToken,
                                     UploadReply completion) {
  if (!extensionToken) {
    Call call(*_channel, RemoteCallID::uploadFileAtPath, std::move(completion));
    call.message.text(fileURL).optionalText(extensionToken);
    call.send();
    return;
  }
  const auto path = pathForFileURL(fileURL);
  if (!path) {
    _channel->failLater(std::move(completion),
                        {"not the URL of a file on this machine: " + fileURL, CallErrorKind::fileNotReadable});
    return;
  }
  uploadFile(*path, std::move(extensionToken), false, std::move(completion));
}

void ClientSession::uploadFileAtPath(const std::string& path, UploadReply completion) {
  uploadFile(path, std::nullopt, false, std::move(completion));
}

void ClientSession::uploadFile(const std::string& path, std::optional<std::string> token, bool wait,
                               UploadReply completion) {
  auto opened = _channel->uploads().open(path, std::move(token), wait);
  if (!opened) {
    // An empty reply is not monostate, but failing it does nothing.
    _channel->failLater(std::move(completion), opened.error());
    return;
  }
  // A request even when the program does not want an answer, since only the answer tells that the token is used up.
  UploadReply ended([channel = std::weak_ptr(_channel), token = opened->token,
                     completion = std::move(completion)](UploadReply::Outcome outcome) mutable {
    if (const auto live = channel.lock()) live->uploads().forget(token);
    if (outcome.values) {
      completion(std::get<0>(*outcome.values));
    } else {
      completion.fail(std::move(outcome.error));
    }
  });
  Call call(*_channel, RemoteCallID::uploadFileAtPath, std::move(ended));
  call.message.text(fileURLForPath(opened->path)).text(opened->token);
  call.send(std::move(opened->descriptor));
}

}  // namespace orvanta
