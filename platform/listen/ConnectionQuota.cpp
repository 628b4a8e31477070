#include "platform/listen/ConnectionQuota.h"

#include <unordered_map>

#include "platform/core/Mutex.h"

namespace orvanta::platform {

struct ConnectionQuota::Counts {
  Mutex mutex;
  std::unordered_map<uid_t, std::size_t> perUser GUARDED_BY(mutex);  // no zeros

  void release(uid_t user) {
    const MutexLock lock(mutex);
    const auto place = perUser.find(user);
    if (--place->second == 0) perUser.erase(place);
  }
};

ConnectionQuota::ConnectionQuota(std::size_t maximumPerUser)
    : _maximum(maximumPerUser), _counts(std::make_shared<Counts>()) {}

std::shared_ptr<void> ConnectionQuota::take(uid_t user) {
  {
    const MutexLock lock(_counts->mutex);
    std::size_t& count = _counts->perUser[user];
    if (count >= _maximum) return nullptr;
    ++count;
  }
  return {_counts.get(), [counts = _counts, user](void*) { counts->release(user); }};
}

}  // namespace orvanta::platform
