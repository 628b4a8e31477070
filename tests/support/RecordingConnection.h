#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "interface/RemoteCalls.h"
#include "platform/ipc/Connection.h"

namespace orvanta::test {

// A connection whose client keeps everything that the daemon sends, decoded. Thread-safe.
class RecordingConnection : public platform::Connection {
 public:
  struct Received final : platform::Outbox {
    bool send(std::span<const std::uint8_t> message, Urgency urgency) override {
      const std::lock_guard lock(mutex);
      if (closed || (full && urgency == Urgency::droppable)) return false;
      decoder.append(message);
      auto outcome = decoder.next();
      if (auto* frame = std::get_if<platform::Frame>(&outcome)) frames.push_back(std::move(*frame));
      return true;
    }
    bool sendWithDescriptor(std::span<const std::uint8_t> message, platform::UniqueFd) override {
      return send(message, Urgency::reply);
    }
    std::size_t pending() const override { return 0; }
    bool isClosed() const override {
      const std::lock_guard lock(mutex);
      return closed;
    }

    mutable std::mutex mutex;
    platform::FrameDecoder decoder{kFrameLimits};  // guarded by mutex
    std::vector<platform::Frame> frames;           // guarded by mutex
    bool full = false;                             // guarded by mutex: the client does not read
    bool closed = false;                           // guarded by mutex: the client has gone
  };

  explicit RecordingConnection(platform::WorkPool& pool) : _queue(pool.makeQueue()) {}

  void resume(std::shared_ptr<platform::ConnectionDelegate>) override {}
  void cancel(std::chrono::milliseconds) override {}
  void shutdownSending() override {}
  const std::shared_ptr<platform::Outbox>& outbox() const override { return _outbox; }
  const std::shared_ptr<platform::WorkQueue>& queue() const override { return _queue; }
  platform::UniqueFd takeDescriptor() override { return std::move(descriptor); }
  const std::string& description() const override { return _description; }
  void setDescription(std::string text) override { _description = std::move(text); }

  // The aggregated events and end notices that the client has received so far.
  std::vector<AggregatedEvent> aggregated() {
    std::vector<AggregatedEvent> events;
    const std::lock_guard lock(received->mutex);
    for (auto frame : received->frames) {
      if (auto event = decodeSendMessageToClient(frame)) events.push_back(std::move(*event));
    }
    return events;
  }

  std::shared_ptr<Received> received = std::make_shared<Received>();
  platform::UniqueFd descriptor;

 private:
  std::shared_ptr<platform::Outbox> _outbox = received;
  std::shared_ptr<platform::WorkQueue> _queue;
  std::string _description = "recording connection";
};

}  // namespace orvanta::test
