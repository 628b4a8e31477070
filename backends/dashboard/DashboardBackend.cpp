#include "backends/dashboard/DashboardBackend.h"

#include <algorithm>
#include <array>
#include <cassert>
#include <new>
#include <span>
#include <utility>

#include "backends/dashboard/DashboardDatagram.h"
#include "config/Conversions.h"
#include "config/StorebagKeys.h"
#include "interface/OrvantaLogging.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Utf8.h"

namespace orvanta {

namespace {
using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr std::size_t kReceiveBuffer = 1088;
// A turn of reading ends after so many datagrams, so that a flood leaves other queues their turn. After as many in a
// row that nothing waited for, each turn waits for the pause, and the system drops the excess meanwhile.
constexpr int kReadsPerTurn = 256;
constexpr milliseconds kFloodPause{2};

std::optional<std::string> textAt(const Dictionary& dictionary, StorebagKey key) {
  const std::string* text = dictionary.text(nameOf(key));
  return text == nullptr ? std::nullopt : std::optional(*text);
}

// Null when the key is absent.
const Value* valueAt(const SharedDictionary& dictionary, StorebagKey key) {
  const Value* value = dictionary ? dictionary->find(nameOf(key)) : nullptr;
  return value == nullptr || value->isNull() ? nullptr : value;
}

std::uint16_t portOf(const Value& value) {
  return static_cast<std::uint16_t>(value.integerValue());
}

// The array in an archive of our own: the log-data server's contract, see docs/dashboard.md.
Result<std::vector<std::uint8_t>> archive(const SharedArray& logData) {
  if (!logData) return Failure{"there is no array"};
  Dictionary content{{"archiver", "OrvantaArchiver"}, {"version", 1}};
  content.set("root", *logData);
  return platform::writeBinaryPropertyList(std::move(content));
}

}  // namespace

// --- Set-up ---

std::shared_ptr<DashboardBackend> DashboardBackend::create(BackendServices& services, std::string name,
                                                           SharedDictionary profile, const BackendSetup& setup) {
  const Value* ip = valueAt(profile, StorebagKey::dashboardIP);
  const Value* port = valueAt(profile, StorebagKey::dashboardPort);
  std::optional<std::string> serverIP;
  if (ip != nullptr) serverIP = ip->description();
  return create(services, std::move(name), std::move(profile), std::move(serverIP),
                port == nullptr ? std::uint16_t{0} : portOf(*port), setup);
}

std::shared_ptr<DashboardBackend> DashboardBackend::create(BackendServices& services, std::string name,
                                                           std::optional<std::string> serverIP,
                                                           std::uint16_t serverPort, const BackendSetup& setup) {
  if (!serverIP) return nullptr;
  return create(services, std::move(name), nullptr, std::move(serverIP), serverPort, setup);
}

std::shared_ptr<DashboardBackend> DashboardBackend::create(BackendServices& services, std::string name,
                                                           SharedDictionary profile,
                                                           std::optional<std::string> serverIP,
                                                           std::uint16_t serverPort, const BackendSetup& setup) {
  if (profile) {
    const Value* ip = valueAt(profile, StorebagKey::dashboardIP);
    if (ip == nullptr) {
      ORVANTA_LOG(error, "DashboardBackend(initWithName): can't resolve server IP");
      return nullptr;
    }
    const Value* port = valueAt(profile, StorebagKey::dashboardPort);
    if (port == nullptr) {
      ORVANTA_LOG(error, "DashboardBackend(initWithName): can't resolve server port");
      return nullptr;
    }
    serverIP = ip->description();
    serverPort = portOf(*port);
  }
  platform::UdpSocket socket;
  if (const int error = socket.open(); error != 0) {
    ORVANTA_LOG(error, "DashboardBackend(initWithName): socket() failed ({})", error);
    return nullptr;
  }
  auto backend = std::make_shared<DashboardBackend>(Made{}, services, std::move(name), std::move(profile), setup,
                                                    std::move(socket));
  if (!backend->setUp(serverIP, serverPort)) return nullptr;
  return backend;
}

DashboardBackend::DashboardBackend(Made, BackendServices& services, std::string name, SharedDictionary profile,
                                   const BackendSetup& setup, platform::UdpSocket socket)
    : OrvantaBackend(services, std::move(name), std::move(profile), setup),
      _networkProcQueue(services.platform().pool().makeQueue()),
      _socket(std::move(socket)) {}

// Nothing is armed any more: armed timers and watches hold the backend.
DashboardBackend::~DashboardBackend() = default;

bool DashboardBackend::setUp(const std::optional<std::string>& serverIP, std::uint16_t serverPort) {
  if (profile()) {
    _usingProfile = true;
    setDisplayURL(textAt(*profile(), StorebagKey::dashboardDisplayURL));
    _postURL = textAt(*profile(), StorebagKey::dashboardPostURL);
    if (const Value* reliable = valueAt(profile(), StorebagKey::dashboardReliable)) {
      useReliableUDP();
      setPeriod(*reliable);
    }
  } else if (!serverIP) {
    ORVANTA_LOG(error, "DashboardBackend(initWithName): initWitName with all null params.");
    return false;
  } else {
    useReliableUDP();
  }
  if (_socket.connect(makeIPv4SocketAddress(*serverIP, serverPort)) != 0) {
    ORVANTA_LOG(error, "DashboardBackend(initWithName): socket connect() failed.");
    return false;
  }
  _timer = _networkProcQueue->makeTimer();
  if (!_timer) {
    ORVANTA_LOG(error, "DashboardBackend(initWithName): can't create timer source.");
    return false;
  }
  _createdAt = steady_clock::now();
  if (_readSource) _networkProcQueue->post([self = self()] { self->watchSocket(); });
  return true;
}

void DashboardBackend::useReliableUDP() {
  if (const int error = _socket.bindAnyPort(); error != 0) {
    ORVANTA_LOG(error, "DashboardBackend(useReliableUDP): can't bind socket, {}", error);
    return;
  }
  _reliableUDP = true;
  _delivery.useAcknowledgements();
  _readSource = _networkProcQueue->makeDescriptorWatch(_socket.descriptor());
  if (!_readSource) ORVANTA_LOG(error, "DashboardBackend(useReliableUDP): can't create read source");
}

void DashboardBackend::setPeriod(const Value& reliable) {
  const milliseconds asked{reliable.integerValue()};
  if (!reliable.isBool() && asked > milliseconds(0) && asked <= kLongestPeriod) {
    _period = asked;
    return;
  }
  if (asked > kLongestPeriod) _period = kLongestPeriod;
  ORVANTA_LOG(warning, "DashboardBackend(initWithName): \"reliable\" is {}, no period in milliseconds; {} is used",
              reliable.description(), _period.count());
}

std::shared_ptr<DashboardBackend> DashboardBackend::self() {
  return std::static_pointer_cast<DashboardBackend>(shared_from_this());
}

// --- The session's operations ---

std::optional<std::string> DashboardBackend::sendNumbered(const Event& event) {
  DashboardSender sender;
  sender.versionMajor = identity().selfVersion.major;
  sender.clientType = identity().clientType;
  sender.sessionID = identity().sessionID;
  sender.clientVersion = identity().clientVersion;
  sender.deviceID = identity().deviceID;
  sender.mode = static_cast<std::uint16_t>((_reliableUDP ? DashboardHeader::kModeAcknowledged : 0) |
                                           (_usingProfile ? 0 : DashboardHeader::kModeExplicitServer));
  std::vector<std::uint8_t> datagram;
  try {
    datagram = encodeDashboardDatagram(sender, event);
  } catch (const std::bad_alloc&) {
    ORVANTA_LOG(error, "DashboardBackend(sendMessage): can't malloc.");
    return std::nullopt;
  }
  std::optional<std::string> line = writeLocalLog(datagram);
  services().pendingDatagrams.begin();
  _networkProcQueue->post([self = self(), datagram = std::move(datagram), number = event.number]() mutable {
    self->tryToSendMsg(std::move(datagram), number);
    self->services().pendingDatagrams.end();
  });
  return line;
}

bool DashboardBackend::uploadLogData(const SharedArray& logData) {
  const platform::BlockingScope blocking;  // archives can be large
  if (!_postURL) {
    ORVANTA_LOG(error, "DashboardBackend(uploadLogData): Post URL for log data array is nil");
    return false;
  }
  const auto archived = archive(logData);
  if (!archived) {
    ORVANTA_LOG(error, "DashboardBackend(uploadLogData): Failed to serialize log data array for upload");
    ORVANTA_LOG(debug, "DashboardBackend(uploadLogData): {}", archived.error());
    return false;
  }
  platform::HttpRequest request;
  request.method = "POST";
  request.url = *_postURL;
  request.headers = {{"Content-Type", "application/octet-stream"}};
  request.body.assign(archived->begin(), archived->end());
  // One request at a time, for which the caller waits; a frame's size bounds it.
  const auto lane = platform().http().makeLane(platform::HttpClient::LaneKind::unrefused);
  platform::HttpResult result = platform().http().perform(lane, std::move(request));
  if (!result.response || result.response->body.empty() || !platform::isValidUtf8(result.response->body)) {
    ORVANTA_LOG(error, "DashboardBackend(uploadLogData): Error uploading log data array ({})",
                result.error.empty() ? "(null)" : result.error);
    return false;
  }
  std::string& location = result.response->body;
  ORVANTA_LOG(debug, "DashboardBackend(uploadLogData): Log data uploaded to {}", location);
  Event announcement{std::make_shared<const Dictionary>(Dictionary{{"LogDataUploadLocation", std::move(location)}}),
                     platform().clock().timeOfDay(), 0, 2};
  sendMessage(announcement);
  return true;
}

void DashboardBackend::cleanup() {
  _networkProcQueue->post([self = self()] {
    if (self->_delivery.empty()) {
      self->cleanupSources();
    } else if (self->_cleanupState == CleanupState::none) {
      self->_cleanupState = CleanupState::requested;
    }
  });
}

// --- On the network queue ---

void DashboardBackend::tryToSendMsg(std::vector<std::uint8_t> datagram, std::uint16_t eventNumber) {
  assert(_networkProcQueue->isCurrent());
  if (!_socket.isOpen()) return;
  const bool whole = _socket.send(datagram);
  _delivery.sent(std::move(datagram), eventNumber, whole);
  updateTimer();
}

void DashboardBackend::myPeriodicTask() {
  assert(_networkProcQueue->isCurrent());
  _delivery.tick([this](std::span<const std::uint8_t> datagram) { return _socket.send(datagram); });
  if (_cleanupState != CleanupState::none) {
    if (_delivery.empty()) {
      ORVANTA_LOG(debug, "DashboardBackend(myPeriodicTask): clean up at myPeriodicTask.");
      cleanupSources();
    } else if (_cleanupState == CleanupState::requested) {
      _cleanupState = CleanupState::lastResortScheduled;
      ORVANTA_LOG(debug, "DashboardBackend(myPeriodicTask): scheduled last resort clean-up in {} ms.",
                  kLastResortDelay.count());
      _lastResort = _networkProcQueue->makeTimer();
      _lastResort->runAfter(kLastResortDelay, [self = self()] { self->cleanupSources(); });
    }
  }
  updateTimer();
}

void DashboardBackend::processSocketRead() {
  assert(_networkProcQueue->isCurrent());
  std::array<std::uint8_t, kReceiveBuffer> buffer;
  int datagrams = 0;
  while (datagrams < kReadsPerTurn) {
    const std::optional<std::size_t> length = _socket.receive(buffer);
    if (!length) break;
    ++datagrams;
    _strays = std::min(_strays + 1, kReadsPerTurn);
    if (*length < kDashboardEventNumberOffset + 2) continue;  // too short for an event number
    const std::uint8_t* const number = buffer.data() + kDashboardEventNumberOffset;
    if (_delivery.acknowledged(static_cast<std::uint16_t>(number[0] << 8U | number[1]))) _strays = 0;
  }
  updateTimer();
  if (_strays < kReadsPerTurn) {
    watchSocket();
    return;
  }
  if (!_readPause) _readPause = _networkProcQueue->makeTimer();
  _readPause->runAfter(kFloodPause, [self = self()] { self->watchSocket(); });
}

void DashboardBackend::watchSocket() {
  assert(_networkProcQueue->isCurrent());
  if (_readSource) _readSource->whenReadable([self = self()] { self->processSocketRead(); });
}

void DashboardBackend::updateTimer() {
  assert(_networkProcQueue->isCurrent());
  const bool needed = _timer && (!_delivery.empty() || _cleanupState != CleanupState::none);
  if (needed == _timerArmed) return;
  _timerArmed = needed;
  if (!needed) {
    if (_timer) _timer->cancel();
    return;
  }
  const auto periods = (steady_clock::now() - _createdAt) / _period + 1;
  _timer->runAt(_createdAt + periods * _period, [self = self()] {
    self->_timerArmed = false;
    self->myPeriodicTask();
  });
}

// The sources are cancelled before the socket that they watch is closed.
void DashboardBackend::cleanupSources() {
  assert(_networkProcQueue->isCurrent());
  _timerArmed = false;
  _timer.reset();
  _lastResort.reset();
  _readPause.reset();
  _readSource.reset();
  _socket.close();
  _delivery.clear();
}

}  // namespace orvanta
