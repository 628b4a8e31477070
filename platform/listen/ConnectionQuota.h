#pragma once

#include <sys/types.h>

#include <cstddef>
#include <memory>

namespace orvanta::platform {

// How many connections each user has. Thread-safe; places may outlive it.
class ConnectionQuota {
 public:
  explicit ConnectionQuota(std::size_t maximumPerUser);
  // A place for one connection, given back when the last copy goes; null when the user has no place left.
  std::shared_ptr<void> take(uid_t user);

 private:
  struct Counts;
  const std::size_t _maximum;
  const std::shared_ptr<Counts> _counts;
};

}  // namespace orvanta::platform
