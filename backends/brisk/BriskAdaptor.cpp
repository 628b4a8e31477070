#include "backends/brisk/BriskAdaptor.h"

#include <vector>

#include "interface/OrvantaLogging.h"
#include "platform/codec/MessagePack.h"
#include "platform/host/BundleLoader.h"

namespace orvanta {

namespace {

constexpr const char* kBundle = "/Tamberline.bundle/Bundles/HQXPerformance.bundle";

// The plug-in's class; null, with the reason in the log, when it cannot be had.
const OrvantaPluginClass* findAdaptorClass(BackendServices& services) {
  const std::string directory = services.platform().files().plugInsDirectory + kBundle;
  const platform::LoadedBundle* loaded = services.plugIns.load(directory);
  if (loaded == nullptr) return nullptr;
  const auto* bundle = static_cast<const OrvantaPluginBundle*>(loaded->symbol(ORVANTA_PLUGIN_SYMBOL));
  if (bundle == nullptr) {
    ORVANTA_LOG(error, "BriskAdaptor(create): {} exports no {}", directory, ORVANTA_PLUGIN_SYMBOL);
    return nullptr;
  }
  if (bundle->abiVersion != ORVANTA_PLUGIN_ABI_VERSION) {
    ORVANTA_LOG(error, "BriskAdaptor(create): {} has plug-in interface version {}, this daemon has {}", directory,
                bundle->abiVersion, ORVANTA_PLUGIN_ABI_VERSION);
    return nullptr;
  }
  const OrvantaPluginClass* adaptorClass =
      bundle->findClass == nullptr ? nullptr : bundle->findClass(BriskAdaptor::kClassName);
  if (adaptorClass == nullptr || adaptorClass->create == nullptr) {
    ORVANTA_LOG(error, "BriskAdaptor(create): {} has no class {}", directory, BriskAdaptor::kClassName);
    return nullptr;
  }
  return adaptorClass;
}

OrvantaPluginOperation findForwardingOperation(const OrvantaPluginClass& adaptorClass) {
  if (adaptorClass.findOperation == nullptr) return nullptr;
  return adaptorClass.findOperation(BriskAdaptor::kForwardingOperation);
}

}  // namespace

std::unique_ptr<BriskAdaptor> BriskAdaptor::create(BackendServices& services) {
  const platform::BlockingScope blocking;  // a plug-in may take as long as it likes, here and below
  const OrvantaPluginClass* adaptorClass = findAdaptorClass(services);
  if (adaptorClass == nullptr) return nullptr;
  void* const instance = adaptorClass->create();
  if (instance == nullptr) {
    ORVANTA_LOG(error, "BriskAdaptor(create): The class {} gave no instance", kClassName);
    return nullptr;
  }
  auto adaptor = std::make_unique<BriskAdaptor>(*adaptorClass, instance);
  if (!adaptor->respondsToForwarding()) {
    ORVANTA_LOG(error, "BriskAdaptor(create): The class {} has no operation {}", kClassName, kForwardingOperation);
  }
  return adaptor;
}

BriskAdaptor::BriskAdaptor(const OrvantaPluginClass& adaptorClass, void* instance)
    : _briskAdaptorClass(adaptorClass), _briskAdaptor(instance), _forward(findForwardingOperation(adaptorClass)) {}

BriskAdaptor::~BriskAdaptor() {
  const platform::BlockingScope blocking;
  if (_briskAdaptorClass.destroy != nullptr) _briskAdaptorClass.destroy(_briskAdaptor);
}

void BriskAdaptor::sendMessage(const Event& event) {
  const platform::BlockingScope blocking;
  if (!event.payload) {
    _forward(_briskAdaptor, event.category, event.type, nullptr, 0);
    return;
  }
  std::vector<std::uint8_t> bytes;
  platform::MessagePackWriter(bytes).dictionary(*event.payload);
  _forward(_briskAdaptor, event.category, event.type, bytes.data(), bytes.size());
}

}  // namespace orvanta
