#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/BackendServices.h"
#include "backends/BackendSetup.h"
#include "backends/Event.h"
#include "config/DeviceInfo.h"
#include "interface/OrvantaError.h"
#include "interface/Values.h"
#include "platform/core/Mutex.h"
#include "platform/core/UniqueFunction.h"

namespace orvanta {

// How a backend reports.
enum BackendState : std::int32_t {
  kBackendWaiting = 0,   // batches its events until there is user info to decide by
  kBackendDisabled = 1,  // drops them
  kBackendEnabled = 2,   // sends or batches them
  kBackendHeld = 3,      // batches them; a promoting one turns it to enabled
};

// Called exactly once, with the text of what was flushed and the error, each of which may be nullopt. On any thread,
// with no lock of ours held.
using FlushCompletion = platform::UniqueFunction<void(std::optional<std::string>, std::optional<OrvantaError>)>;

// One way to deliver a session's events. Every operation that a backend has no use for has a harmless default.
//
// Owned by its session (or by one one-off send), which calls everything on its own queue, one operation at a time, and
// cleanup() last. Other sessions' threads may call state/setState, samplingThreshold/setSamplingThreshold,
// setCorrelatedSessionID and combinedSessionIDString at any time meanwhile; HTTP threads may set the state. Kept by
// shared_ptr because posts in flight hold weak references to it.
class OrvantaBackend : public std::enable_shared_from_this<OrvantaBackend> {
 public:
  // Draws the sampling factor: one draw per backend constructed, from the process's drand48 sequence.
  OrvantaBackend(BackendServices& services, std::string name, SharedDictionary profile, const BackendSetup& setup);
  virtual ~OrvantaBackend();
  OrvantaBackend(const OrvantaBackend&) = delete;
  OrvantaBackend& operator=(const OrvantaBackend&) = delete;

  // --- What the session drives ---

  virtual void cleanup() {}
  virtual void updateState() { setState(kBackendEnabled); }
  // Gives the event this backend's next number and sends it. Returns the text for the message log, or nullopt.
  std::optional<std::string> sendMessage(Event& event);
  // The completion may be empty. The base calls it at once with neither result nor error.
  virtual std::optional<std::string> flushMessagesWithCompletion(FlushCompletion completion);
  // `descriptor` is the client's open file, borrowed for the call; -1 without one. `removeFile` asks the client to
  // delete the file it opened. Blocks for the whole exchange.
  struct UploadFile {
    std::string path;
    std::optional<std::string> extensionToken;
    int descriptor = -1;
    std::function<void()> removeFile;
  };
  virtual bool uploadFileAtPath(const UploadFile& file);
  virtual bool uploadLogData(const SharedArray& logData);
  // Any thread.
  virtual void setCorrelatedSessionID(std::optional<std::string> combined) {
    setCombinedSessionIDString(std::move(combined));
  }

  bool isWhitelistedEvent(std::uint16_t category) const;
  bool isBlacklistedEvent(std::uint16_t category) const;

  // --- Properties ---

  const BackendIdentity& identity() const { return _identity; }
  const std::string& name() const { return _name; }
  const std::optional<std::string>& displayURL() const { return _displayURL; }

  BackendState state() const { return _state.load(std::memory_order_acquire); }
  void setState(BackendState state) { _state.store(state, std::memory_order_release); }
  double samplingFactor() const { return _samplingFactor; }
  void setSamplingFactor(double factor) { _samplingFactor = factor; }  // before the first evaluation
  std::optional<double> samplingThreshold() const;
  void setSamplingThreshold(std::optional<double> threshold);
  std::optional<std::string> combinedSessionIDString() const;
  void setCombinedSessionIDString(std::optional<std::string> combined);

  bool batchEvents() const { return _batchEvents; }
  void setBatchEvents(bool batch) { _batchEvents = batch; }
  const SharedDictionary& userInfoDict() const { return _userInfoDict; }
  virtual void setUserInfoDict(SharedDictionary userInfo) { _userInfoDict = std::move(userInfo); }

  using SelfVersion = orvanta::SelfVersion;

  // 64 lower-case hexadecimal digits over the text's bytes.
  static std::string convertIntoSHA256(std::string_view text);

 protected:
  // Sends the event, which has its number now.
  virtual std::optional<std::string> sendNumbered(const Event& event);

  BackendServices& services() const { return _services; }
  Platform& platform() const { return _services.platform(); }
  const SharedDictionary& profile() const { return _profile; }
  void setDisplayURL(std::optional<std::string> url) { _displayURL = std::move(url); }
  void setEventWhitelist(std::optional<std::vector<std::int32_t>> list) { _eventWhitelist = std::move(list); }
  void setEventBlacklist(std::optional<std::vector<std::int32_t>> list) { _eventBlacklist = std::move(list); }
  // For changes that depend on the present state.
  std::atomic<BackendState>& stateCell() { return _state; }
  // The backend's one lock.
  platform::Mutex& mutex() const RETURN_CAPABILITY(_mutex) { return _mutex; }

 private:
  BackendServices& _services;
  // Constant after construction (the sampling factor and display URL: after set-up).
  const std::string _name;
  const SharedDictionary _profile;
  const BackendIdentity _identity;
  std::optional<std::string> _displayURL;
  double _samplingFactor = 0;

  // Session's queue only.
  std::uint16_t _eventID = 0;
  bool _batchEvents;
  SharedDictionary _userInfoDict;
  std::optional<std::vector<std::int32_t>> _eventWhitelist;
  std::optional<std::vector<std::int32_t>> _eventBlacklist;

  // Any thread.
  std::atomic<BackendState> _state{kBackendWaiting};
  mutable platform::Mutex _mutex;
  std::optional<double> _samplingThreshold GUARDED_BY(_mutex);
  std::optional<std::string> _combinedSessionIDString GUARDED_BY(_mutex);
};

}  // namespace orvanta
