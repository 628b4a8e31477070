#pragma once

#include <netinet/in.h>

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "platform/core/UniqueFd.h"
#include "tools/collector/store/Inbox.h"

namespace orvanta::collector {

// How the dashboard server acknowledges the datagrams that ask for it. Forged acknowledgements go out before the right
// one, and even if that is lost.
struct AcknowledgementSettings {
  bool acknowledge = true;
  unsigned lossPercent = 0;  // of the right ones
  std::chrono::milliseconds delay{0};
  unsigned duplicates = 0;      // further copies of each right one
  unsigned unknownNumbers = 0;  // forged: event numbers that were never sent
  unsigned tooShort = 0;        // forged: the right bytes, cut before the event number
  unsigned foreign = 0;         // forged: the right number, from another port
};

// Receives dashboard datagrams on one UDP port, stores them in the inbox and acknowledges those that ask for it, on a
// thread of its own. Owned by the collector. Any other thread may read and change the settings
// and call stop().
class DashboardServer {
 public:
  // Port 0 takes any free one. The inbox outlives the server.
  static Result<std::unique_ptr<DashboardServer>> start(const std::string& address, std::uint16_t port, Inbox& inbox);
  ~DashboardServer();
  DashboardServer(const DashboardServer&) = delete;
  DashboardServer& operator=(const DashboardServer&) = delete;

  std::uint16_t port() const { return _port; }
  void setSettings(const AcknowledgementSettings& settings);
  AcknowledgementSettings settings() const;
  void stop();

 private:
  using Clock = std::chrono::steady_clock;
  struct Acknowledgement {
    sockaddr_in to{};
    std::string bytes;
    bool foreign = false;
  };
  struct Planned {
    std::vector<Acknowledgement> all;
    std::int64_t rightOnes = 0;
  };
  DashboardServer(platform::UniqueFd socket, std::uint16_t port, platform::UniqueFd foreignSocket,
                  platform::UniqueFd wakeUp, Inbox& inbox);
  void run();
  void receiveAll();
  void take(std::string_view bytes, const sockaddr_in& from);
  Planned planAcknowledgements(const ReceivedDatagram& datagram, const sockaddr_in& from,
                               const AcknowledgementSettings& settings);
  void sendDue();

  // Constant after construction.
  const platform::UniqueFd _socket;
  const std::uint16_t _port;
  const platform::UniqueFd _foreignSocket;
  const platform::UniqueFd _wakeUp;
  Inbox& _inbox;

  // Owned by the thread.
  std::multimap<Clock::time_point, Acknowledgement> _delayed;
  std::minstd_rand _dice{1};  // the same losses in every run

  mutable platform::Mutex _mutex;
  AcknowledgementSettings _settings GUARDED_BY(_mutex);

  std::thread _thread;  // from construction until stop()
};

}  // namespace orvanta::collector
