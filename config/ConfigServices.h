#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>

#include "config/Environment.h"
#include "config/Orvanta.h"
#include "config/Platform.h"

namespace orvanta {

// The configuration that the whole process shares: facts that are found out once, on first use, and then hold until the
// daemon ends, the storebag server's lane and the client framework. Owned by the services of the layer above, in the
// end by DaemonServices; destroyed when the platform has stopped and before it goes. Thread-safe: a caller that comes
// while a fact is being found out waits for it.
class ConfigServices {
 public:
  explicit ConfigServices(Platform& platform) : _platform(platform) {}
  ConfigServices(const ConfigServices&) = delete;
  ConfigServices& operator=(const ConfigServices&) = delete;

  Platform& platform() const { return _platform; }

  // Returns whether the device's release type is "Internal".
  bool isInternalBuild();
  // The section of storebags that this process reads.
  EnvironmentType currentEnvironmentType();
  // Base URL of the storebag server: the user default "orvanta_storebag_url", or else the one for the build.
  const std::string& storebagServerURL();
  // Storebag fetches have a lane of their own, which refuses no request.
  const std::shared_ptr<platform::HttpLane>& storebagLane();
  Orvanta& orvanta();

 private:
  // A value made by the first call of get().
  template <class T>
  class Lazy {
   public:
    template <class Make>
    T& get(Make make) {
      std::call_once(_once, [&] { _value.emplace(make()); });
      return *_value;
    }

   private:
    std::once_flag _once;
    std::optional<T> _value;  // constant once made
  };

  Platform& _platform;
  Lazy<bool> _internalBuild;
  Lazy<EnvironmentType> _environmentType;
  Lazy<std::string> _storebagServerURL;
  Lazy<std::shared_ptr<platform::HttpLane>> _storebagLane;
  Lazy<std::unique_ptr<Orvanta>> _orvanta;
};

}  // namespace orvanta
