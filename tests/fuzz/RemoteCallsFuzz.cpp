#include <memory>

#include "interface/RemoteCalls.h"
#include "tests/fuzz/Require.h"
#include "tests/support/NotedSession.h"

namespace {

using namespace orvanta;
using platform::Frame;
using platform::FrameDecoder;

// Takes the answers to one request at a time.
class Answers final : public platform::Outbox {
 public:
  bool send(std::span<const std::uint8_t> message, Urgency) override {
    FrameDecoder decoder(kFrameLimits);
    decoder.append(message);
    const auto outcome = decoder.next();
    const Frame* frame = std::get_if<Frame>(&outcome);
    REQUIRE(frame != nullptr && decoder.pending() == 0);
    REQUIRE(frame->kind == Frame::Kind::response && frame->messageID == expected && !frame->refusal);
    ++count;
    return true;
  }
  bool sendWithDescriptor(std::span<const std::uint8_t>, platform::UniqueFd) override { return false; }
  std::size_t pending() const override { return 0; }
  bool isClosed() const override { return false; }

  std::uint32_t expected = 0;
  int count = 0;
};

template <class... Values>
void deliverTo(const Frame& frame, Reply<Values...> /*kind*/) {
  int calls = 0;
  deliverResponse(Frame(frame), Reply<Values...>([&calls](auto) { ++calls; }));
  REQUIRE(calls == 1);
}

void takeAsClient(Frame frame) {
  if (frame.kind == Frame::Kind::response) {
    deliverTo(frame, BackendNamesReply());
    deliverTo(frame, StringReply());
    deliverTo(frame, FlushReply());
    deliverTo(frame, UploadReply());
    deliverTo(frame, LogDataReply());
    deliverTo(frame, DoneReply());
  }
  if (const auto token = decodeRemoveFile(frame)) REQUIRE(frame.method == "removeFile");
  auto event = decodeSendMessageToClient(frame);
  if (!event) return;
  // Its meaning survives being sent on.
  FrameDecoder decoder(kFrameLimits);
  decoder.append(
      encodeSendMessageToClient(event->sessionInfo, event->timestamp, event->category, event->type, event->payload));
  auto outcome = decoder.next();
  auto again = decodeSendMessageToClient(std::get<Frame>(outcome));
  REQUIRE(again && again->category == event->category && again->type == event->type);
  REQUIRE((again->payload == nullptr) == (event->payload == nullptr));
  REQUIRE(again->isEndNotice() == event->isEndNotice());
}

}  // namespace

// A peer's bytes as calls on a session, and as answers and notices to a client. The first byte says whether the session
// answers or drops its replies; either way each request has one answer and a notification no answer.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* bytes, std::size_t size) {
  if (size == 0) return 0;
  test::NotedSession session;
  if ((bytes[0] & 1U) != 0) session.fate = test::NotedSession::dropped;
  const auto answers = std::make_shared<Answers>();
  FrameDecoder decoder({4096, 64U << 10U, 16});
  decoder.append({bytes + 1, size - 1});
  for (;;) {
    auto outcome = decoder.next();
    Frame* frame = std::get_if<Frame>(&outcome);
    if (frame == nullptr) return 0;
    takeAsClient(*frame);
    if (frame->kind == Frame::Kind::response) continue;  // ends the connection before it becomes a call
    const bool isRequest = frame->kind == Frame::Kind::request;
    answers->expected = frame->messageID;
    answers->count = 0;
    dispatchCall(std::move(*frame), session, answers);
    REQUIRE(answers->count == (isRequest ? 1 : 0));
  }
}
