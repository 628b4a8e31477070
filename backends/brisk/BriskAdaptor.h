#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "backends/BackendServices.h"
#include "backends/Event.h"
#include "interface/PluginBundle.h"

namespace orvanta {

// One instance of the diagnostics adaptor's class, made from the plug-in bundle. Owned by one BriskBackend and called
// on its session's queue. Failures inside the adaptor are its own.
class BriskAdaptor {
 public:
  static constexpr const char* kClassName = "BriskAdaptor";
  static constexpr const char* kForwardingOperation = "sendMessageWithMethod:respCode:dict:";

  // Null when there is no bundle of this ABI version, no class in it, or no instance of it; the log says which.
  static std::unique_ptr<BriskAdaptor> create(BackendServices& services);
  BriskAdaptor(const OrvantaPluginClass& adaptorClass, void* instance);
  ~BriskAdaptor();
  BriskAdaptor(const BriskAdaptor&) = delete;
  BriskAdaptor& operator=(const BriskAdaptor&) = delete;

  bool respondsToForwarding() const { return _forward != nullptr; }
  // Only when it responds.
  void sendMessage(const Event& event);
  // For log lines.
  static std::string description() { return std::string("<") + kClassName + ">"; }

 private:
  const OrvantaPluginClass& _briskAdaptorClass;
  void* const _briskAdaptor;
  const OrvantaPluginOperation _forward;  // null when the class has no such operation
};

}  // namespace orvanta
