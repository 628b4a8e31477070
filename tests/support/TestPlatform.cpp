#include "tests/support/TestPlatform.h"

#include <filesystem>
#include <utility>

namespace orvanta::test {

using platform::HttpLane;
using platform::HttpRequest;
using platform::HttpResponse;
using platform::HttpResult;

std::shared_ptr<HttpLane> ScriptedHttpClient::makeLane(LaneKind) {
  return std::make_shared<HttpLane>();
}

void ScriptedHttpClient::start(const std::shared_ptr<HttpLane>&, HttpRequest request, Observer observe,
                               Completion completion) {
  {
    const std::lock_guard lock(_mutex);
    _requests.push_back(request);
    if (hold) {
      _held.push_back({std::move(request), std::move(observe), std::move(completion)});
      return;
    }
  }
  HttpResult result = answerFor(request);
  if (observe && !observe(result)) return;
  if (completion) completion(std::move(result));
}

HttpResult ScriptedHttpClient::perform(const std::shared_ptr<HttpLane>&, HttpRequest request) {
  {
    const std::lock_guard lock(_mutex);
    _requests.push_back(request);
  }
  return answerFor(request);
}

std::vector<HttpRequest> ScriptedHttpClient::requests() const {
  const std::lock_guard lock(_mutex);
  return _requests;
}

void ScriptedHttpClient::clear() {
  const std::lock_guard lock(_mutex);
  _requests.clear();
}

bool ScriptedHttpClient::finishHeld(HttpResult result) {
  Taken taken;
  {
    const std::lock_guard lock(_mutex);
    if (_held.empty()) return false;
    taken = std::move(_held.front());
    _held.erase(_held.begin());
  }
  if (taken.observe && !taken.observe(result)) return true;
  if (taken.completion) taken.completion(std::move(result));
  return true;
}

HttpResult ScriptedHttpClient::status(int code, std::string body) {
  HttpResponse response;
  response.status = code;
  response.body = std::move(body);
  return {std::move(response), {}};
}

HttpResult ScriptedHttpClient::answerFor(const HttpRequest& request) {
  return answer ? answer(request) : status(200);
}

namespace {

std::unique_ptr<platform::Platform> makePlatform(const std::string& directory, std::size_t threads) {
  platform::Platform::Parts parts;
  parts.files.runtimeDirectory = directory + "/run";
  parts.files.stateDirectory = directory + "/state";
  parts.files.configurationDirectory = directory + "/etc";
  parts.files.frameworkDirectory = directory + "/share";
  parts.files.plugInsDirectory = directory + "/PlugIns";
  for (const auto* path :
       {&parts.files.runtimeDirectory, &parts.files.stateDirectory, &parts.files.configurationDirectory,
        &parts.files.frameworkDirectory, &parts.files.plugInsDirectory}) {
    std::filesystem::create_directories(*path);
  }
  parts.clock = std::make_unique<TestClock>();
  parts.device = std::make_unique<TestDevice>();
  parts.defaults = std::make_unique<platform::UserDefaults>(parts.files.stateDirectory, "com.kovalt.orvanta");
  parts.pool = std::make_unique<platform::WorkPool>(threads);
  parts.pool->start();
  parts.http = std::make_unique<ScriptedHttpClient>();
  parts.powerLog = std::make_unique<RecordedPowerLog>();
  return std::make_unique<platform::Platform>(std::move(parts));
}

}  // namespace

TestPlatform::TestPlatform(std::size_t threads)
    : _platform(makePlatform(directory.path(), threads)),
      clock(static_cast<TestClock&>(_platform->clock())),
      device(static_cast<TestDevice&>(_platform->device())),
      http(static_cast<ScriptedHttpClient&>(_platform->http())),
      powerLog(static_cast<RecordedPowerLog&>(_platform->powerLog())) {}

TestPlatform::~TestPlatform() = default;

}  // namespace orvanta::test
