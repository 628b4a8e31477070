#pragma once

#include <chrono>
#include <filesystem>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "config/Platform.h"
#include "interface/Values.h"
#include "tests/support/TemporaryDirectory.h"
#include "tests/support/TestClock.h"

namespace orvanta::test {

// A device whose every answer a test sets. Set before threads ask.
struct TestDevice final : platform::DeviceProperties {
  std::optional<std::string> udid = "0123456789abcdef0123456789abcdef01234567";
  std::optional<std::string> version = "12.5", build = "12F5", model = "Model7,1", serial = "SN0001";
  std::optional<std::string> type = "Parva3,2", name = "Parva", release, country = "DE";
  std::optional<bool> automatic = true;
  bool consent = false;
  int offset = 3600;

  std::optional<std::string> uniqueDeviceID() const override { return udid; }
  std::optional<std::string> productVersion() const override { return version; }
  std::optional<std::string> buildVersion() const override { return build; }
  std::optional<std::string> hardwareModel() const override { return model; }
  std::optional<std::string> serialNumber() const override { return serial; }
  std::optional<std::string> productType() const override { return type; }
  std::optional<std::string> deviceName() const override { return name; }
  std::optional<std::string> releaseType() const override { return release; }
  std::optional<std::string> countryCode() const override { return country; }
  std::optional<bool> automaticTimeZone() const override { return automatic; }
  bool diagnosticsSubmissionAllowed() const override { return consent; }
  int timeZoneOffset(double) const override { return offset; }
};

// An HTTP client without a network: gathers requests, answers each from a script or when a test says so. Completions
// run on the calling thread. Thread-safe.
class ScriptedHttpClient : public platform::HttpClient {
 public:
  // The answer to requests that are not held; default 200 with an empty body. May be called on several threads at once.
  std::function<platform::HttpResult(const platform::HttpRequest&)> answer;
  // While true, started requests wait in `held` for finishHeld().
  bool hold = false;

  std::shared_ptr<platform::HttpLane> makeLane(LaneKind) override { return std::make_shared<platform::HttpLane>(); }
  void start(const std::shared_ptr<platform::HttpLane>&, platform::HttpRequest request, Observer observe,
             Completion completion) override {
    {
      const std::lock_guard lock(_mutex);
      _requests.push_back(request);
      if (hold) {
        _held.push_back({std::move(observe), std::move(completion)});
        return;
      }
    }
    end({std::move(observe), std::move(completion)}, answerFor(request));
  }
  platform::HttpResult perform(const std::shared_ptr<platform::HttpLane>&, platform::HttpRequest request) override {
    {
      const std::lock_guard lock(_mutex);
      _requests.push_back(request);
    }
    return answerFor(request);
  }
  void abortBlockingRequests() override {}
  void shutdown(std::chrono::milliseconds) override {}

  // Every request so far, in order, held ones included.
  std::vector<platform::HttpRequest> requests() const {
    const std::lock_guard lock(_mutex);
    return _requests;
  }
  void clear() {
    const std::lock_guard lock(_mutex);
    _requests.clear();
  }
  // Ends the oldest held request with `result`; false when none waits.
  bool finishHeld(platform::HttpResult result) {
    Held oldest;
    {
      const std::lock_guard lock(_mutex);
      if (_held.empty()) return false;
      oldest = std::move(_held.front());
      _held.erase(_held.begin());
    }
    end(std::move(oldest), std::move(result));
    return true;
  }

  static platform::HttpResult status(int code, std::string body = {}) {
    platform::HttpResponse response;
    response.status = code;
    response.body = std::move(body);
    return {std::move(response), {}};
  }

 private:
  struct Held {
    Observer observe;
    Completion completion;
  };
  static void end(Held request, platform::HttpResult result) {
    if (request.observe && !request.observe(result)) return;
    if (request.completion) request.completion(std::move(result));
  }
  platform::HttpResult answerFor(const platform::HttpRequest& request) {
    return answer ? answer(request) : status(200);
  }

  mutable std::mutex _mutex;
  std::vector<platform::HttpRequest> _requests;  // guarded by _mutex
  std::vector<Held> _held;                       // guarded by _mutex
};

struct RecordedPowerLog final : platform::PowerLog {
  struct Record {
    std::int32_t event;
    std::string sender;
    Dictionary record;
  };
  void registeredEvent(std::int32_t event, std::string_view sender, const Dictionary& record) override {
    const std::lock_guard lock(mutex);
    records.push_back({event, std::string(sender), record});
  }
  std::mutex mutex;
  std::vector<Record> records;  // guarded by mutex
};

// A platform over the parts above, with its files in a directory of its own. The pool is started.
class TestPlatform {
 public:
  explicit TestPlatform(std::size_t threads = 2) : _platform(make(threads)) {}

  Platform& get() { return *_platform; }
  operator Platform&() { return *_platform; }  // NOLINT(google-explicit-constructor): stands for the platform

  TemporaryDirectory directory;

 private:
  std::unique_ptr<Platform> make(std::size_t threads) const {
    Platform::Parts parts;
    parts.files.runtimeDirectory = directory / "run";
    parts.files.stateDirectory = directory / "state";
    parts.files.configurationDirectory = directory / "etc";
    parts.files.frameworkDirectory = directory / "share";
    parts.files.plugInsDirectory = directory / "PlugIns";
    for (const char* name : {"run", "state", "etc", "share", "PlugIns"}) {
      std::filesystem::create_directory(directory / name);
    }
    parts.clock = std::make_unique<TestClock>();
    parts.device = std::make_unique<TestDevice>();
    parts.defaults = std::make_unique<platform::UserDefaults>(parts.files.stateDirectory, "com.kovalt.orvanta");
    parts.pool = std::make_unique<platform::WorkPool>(threads);
    parts.pool->start();
    parts.http = std::make_unique<ScriptedHttpClient>();
    parts.powerLog = std::make_unique<RecordedPowerLog>();
    return std::make_unique<Platform>(std::move(parts));
  }
  std::unique_ptr<Platform> _platform;

 public:
  // Parts of the platform.
  TestClock& clock = static_cast<TestClock&>(_platform->clock());
  TestDevice& device = static_cast<TestDevice&>(_platform->device());
  ScriptedHttpClient& http = static_cast<ScriptedHttpClient&>(_platform->http());
  RecordedPowerLog& powerLog = static_cast<RecordedPowerLog&>(_platform->powerLog());
};

// The same with one layer's services above it, ended in the order in which the daemon ends them.
template <class Services>
class TestServices : public TestPlatform {
 public:
  explicit TestServices(std::size_t threads = 2) : TestPlatform(threads), services(get()) {}
  ~TestServices() { get().stop(); }

  operator Services&() { return services; }  // NOLINT(google-explicit-constructor): stands for the services

  Services services;
};

}  // namespace orvanta::test
