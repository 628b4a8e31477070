// A platform power log: appends each call as one line to power.log in the daemon's state directory.

#include <cstdlib>
#include <fstream>
#include <msgpack.hpp>

#include "platform/host/PowerLogLibrary.h"

__attribute__((visibility("default"))) void VMLogRegisteredEvent(int32_t event, const char* sender,
                                                                 const VMPowerLogRecord* record, const void* reserved) {
  std::ofstream log(std::string(std::getenv("STATE_DIRECTORY")) + "/power.log", std::ios::app);
  log << event << ' ' << sender << ' '
      << msgpack::unpack(reinterpret_cast<const char*>(record->bytes), record->length).get() << ' '
      << (reserved == nullptr ? "null" : "something") << '\n';
}
