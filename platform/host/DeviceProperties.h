#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/core/Value.h"

namespace orvanta::platform {

// The device's own description. Every query may be called from any thread, and returns nullopt when the platform has
// no answer.
class DeviceProperties {
 public:
  virtual ~DeviceProperties() = default;
  virtual std::optional<std::string> uniqueDeviceID() const = 0;  // at most 40 characters
  virtual std::optional<std::string> productVersion() const = 0;  // operating-system version
  virtual std::optional<std::string> buildVersion() const = 0;    // operating-system build
  virtual std::optional<std::string> hardwareModel() const = 0;
  virtual std::optional<std::string> serialNumber() const = 0;
  virtual std::optional<std::string> productType() const = 0;
  virtual std::optional<std::string> deviceName() const = 0;  // the device family
  virtual std::optional<std::string> releaseType() const = 0;
  virtual std::optional<std::string> countryCode() const = 0;
  virtual std::optional<bool> automaticTimeZone() const = 0;
  // The user's consent to diagnostics submission: false unless granted.
  virtual bool diagnosticsSubmissionAllowed() const = 0;
  // Seconds east of GMT of the local time zone at that moment; follows a change of the system's zone when asked about
  // another second.
  virtual int timeZoneOffset(double wallSeconds) const = 0;
};

// `configurationDirectory`/device.plist first, read again when it changes; then os-release, DMI or the device tree,
// machine-id and the environment's locale as it was at construction. `application` goes into the unique identifier,
// which is derived from machine-id and never equals it. A device.plist that cannot be read or parsed is logged and
// counts as empty, and so does each key of the wrong type. Thread-safe.
class LinuxDeviceProperties final : public DeviceProperties {
 public:
  // `systemRoot` stands before the paths of the system's own files, for tests.
  LinuxDeviceProperties(std::string configurationDirectory, std::string application, std::string systemRoot = {});
  ~LinuxDeviceProperties() override;

  std::optional<std::string> uniqueDeviceID() const override;
  std::optional<std::string> productVersion() const override;
  std::optional<std::string> buildVersion() const override;
  std::optional<std::string> hardwareModel() const override;
  std::optional<std::string> serialNumber() const override;
  std::optional<std::string> productType() const override;
  std::optional<std::string> deviceName() const override;
  std::optional<std::string> releaseType() const override;
  std::optional<std::string> countryCode() const override;
  std::optional<bool> automaticTimeZone() const override;
  bool diagnosticsSubmissionAllowed() const override;
  int timeZoneOffset(double wallSeconds) const override;

 private:
  struct State;
  std::unique_ptr<State> _state;
};

}  // namespace orvanta::platform
