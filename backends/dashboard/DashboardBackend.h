#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/OrvantaBackend.h"
#include "backends/dashboard/ReliableDelivery.h"
#include "interface/Values.h"
#include "platform/host/UdpSocket.h"
#include "platform/queue/WorkQueue.h"

namespace orvanta {

// Sends each event as one datagram to a dashboard server, and uploads log data.
//
// The owner's calls come on the session's queue. Everything that touches the socket runs on the backend's own network
// queue, and that queue is its only lock. Armed timers and watches hold the backend; cleanup() disarms them for good,
// now or when nothing is left to deliver, closes the socket and so releases the backend. The timer is armed only while
// a datagram or the clean-up waits for it, always at a multiple of the period from creation: an idle backend causes no
// wake-ups.
//
// Lost datagrams are not reported. A send after the clean-up goes nowhere.
class DashboardBackend final : public OrvantaBackend {
  struct Made {};  // only the factories have one

 public:
  // With a profile: its "ip" and "port" name the server. Null when something is missing or fails, with a log line.
  static std::shared_ptr<DashboardBackend> create(BackendServices& services, std::string name, SharedDictionary profile,
                                                  const BackendSetup& setup);
  // Without one; delivery is then acknowledged.
  static std::shared_ptr<DashboardBackend> create(BackendServices& services, std::string name,
                                                  std::optional<std::string> serverIP, std::uint16_t serverPort,
                                                  const BackendSetup& setup);
  DashboardBackend(Made, BackendServices& services, std::string name, SharedDictionary profile,
                   const BackendSetup& setup, platform::UdpSocket socket);
  ~DashboardBackend() override;

  // Blocks for the whole exchange. Returns whether the server answered with a text, whatever its status; an event of
  // category 0 and type 2 announces where the data went.
  bool uploadLogData(const SharedArray& logData) override;
  void cleanup() override;

  bool reliableUDP() const { return _reliableUDP; }
  std::chrono::milliseconds period() const { return _period; }

  static constexpr std::chrono::milliseconds kDefaultPeriod{500};
  static constexpr std::chrono::milliseconds kLongestPeriod{86'400'000};
  static constexpr std::chrono::milliseconds kLastResortDelay{9500};

 protected:
  // The local log line, before the datagram has gone out; nullopt when it is not UTF-8. The flag does not matter.
  std::optional<std::string> sendNumbered(const Event& event) override;

 private:
  // The server address counts only without a profile.
  static std::shared_ptr<DashboardBackend> create(BackendServices& services, std::string name, SharedDictionary profile,
                                                  std::optional<std::string> serverIP, std::uint16_t serverPort,
                                                  const BackendSetup& setup);

  bool setUp(const std::optional<std::string>& serverIP, std::uint16_t serverPort);
  void useReliableUDP();
  void setPeriod(const Value& reliable);
  std::shared_ptr<DashboardBackend> self();

  // On the network queue, which they assert.
  void tryToSendMsg(std::vector<std::uint8_t> datagram, std::uint16_t eventNumber);
  void myPeriodicTask();
  void processSocketRead();
  void cleanupSources();
  void updateTimer();
  void watchSocket();

  // Constant after set-up.
  std::shared_ptr<platform::WorkQueue> _networkProcQueue;
  bool _reliableUDP = false;
  bool _usingProfile = false;
  std::chrono::milliseconds _period = kDefaultPeriod;
  std::chrono::steady_clock::time_point _createdAt;  // the timer's grid begins here
  std::optional<std::string> _postURL;

  // Network queue only, once set up. The sources are null after the clean-up.
  platform::UdpSocket _socket;
  std::unique_ptr<platform::DescriptorWatch> _readSource;
  std::unique_ptr<platform::Timer> _readPause;  // until a flooded socket is read on
  int _strays = 0;                              // datagrams since the last one that was awaited, as far as it matters
  std::unique_ptr<platform::Timer> _timer;
  bool _timerArmed = false;
  std::unique_ptr<platform::Timer> _lastResort;
  enum class CleanupState { none, requested, lastResortScheduled };
  CleanupState _cleanupState = CleanupState::none;
  ReliableDelivery _delivery;
};

}  // namespace orvanta
