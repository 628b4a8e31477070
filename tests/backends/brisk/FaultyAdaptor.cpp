// Plug-ins that are wrong in one way each, chosen by FAULT.

#include "interface/PluginBundle.h"

namespace {

int instance;

void* create() {
#if FAULT == 4
  return nullptr;
#else
  return &instance;
#endif
}

OrvantaPluginOperation findOperation(const char*) {
  return nullptr;
}

const OrvantaPluginClass* findClass(const char*) {
#if FAULT == 2
  return nullptr;
#else
  static const OrvantaPluginClass adaptorClass{create, nullptr, findOperation};
  return &adaptorClass;
#endif
}

}  // namespace

#if FAULT == 0
extern ORVANTA_PLUGIN_EXPORT const int somethingElse;
const int somethingElse = 0;
#elif FAULT == 1
const OrvantaPluginBundle orvantaPluginBundle{ORVANTA_PLUGIN_ABI_VERSION + 1, findClass};
#else
const OrvantaPluginBundle orvantaPluginBundle{ORVANTA_PLUGIN_ABI_VERSION, findClass};
#endif
