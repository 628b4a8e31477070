#pragma once

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "backends/OrvantaBackend.h"
#include "config/DeviceInfo.h"
#include "session/DaemonServices.h"

namespace orvanta {

// The backends of a session by the name under which the storebag lists them, in the order of those names.
class BackendSet {
 public:
  using Entry = std::pair<std::string, std::shared_ptr<OrvantaBackend>>;

  void add(std::string key, std::shared_ptr<OrvantaBackend> backend) {
    _entries.emplace_back(std::move(key), std::move(backend));
  }
  // Null when there is none of that name.
  OrvantaBackend* find(std::string_view key) const {
    for (const auto& entry : _entries) {
      if (entry.first == key) return entry.second.get();
    }
    return nullptr;
  }
  bool empty() const { return _entries.empty(); }
  std::size_t size() const { return _entries.size(); }
  auto begin() const { return _entries.begin(); }
  auto end() const { return _entries.end(); }

 private:
  std::vector<Entry> _entries;
};

// Makes a backend of each entry of the storebag and fills it with the session's and the device's facts. None, with a
// log line, without a storebag or session info; entries that yield no backend are skipped. On the session's queue.
std::optional<BackendSet> createBackends(DaemonServices& services, const SharedDictionary& storebag,
                                         const SharedDictionary& sessionInfo, const SharedDictionary& userInfo,
                                         const DeviceIDBuffer& deviceID);

}  // namespace orvanta
