#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/core/Clock.h"
#include "platform/core/Mutex.h"
#include "platform/core/UniqueFd.h"
#include "platform/host/PowerLog.h"

namespace orvanta::platform {

// The power log of a device that has none of its own: one JSON line per record in the file `path`,
// {"event": number, "sender": text, "time": seconds since 1970, "record": {…}}.
//
// Two generations of at most `generationBytes` are kept: a line that does not fit makes the file `path`.1, in place of
// the one before, and begins a new one. Owned by the platform, whose clock outlives it. Thread-safe. A record that
// cannot be written is lost; the first of a run of such losses is logged.
class JsonLinesPowerLog final : public PowerLog {
 public:
  static constexpr std::size_t kGenerationBytes = 4U << 20U;

  JsonLinesPowerLog(std::string path, const Clock& clock, std::size_t generationBytes = kGenerationBytes);

  void registeredEvent(std::int32_t event, std::string_view sender, const Dictionary& record) override;

 private:
  // Both return false, with errno set, when there is no file to write to.
  bool openFile() REQUIRES(_mutex);
  bool append(std::string_view line) REQUIRES(_mutex);

  const Clock& _clock;
  const std::string _path;
  const std::string _olderPath;
  const std::size_t _generationBytes;
  Mutex _mutex;
  UniqueFd _file GUARDED_BY(_mutex);     // kept open between records
  dev_t _device GUARDED_BY(_mutex) = 0;  // which file that is
  ino_t _inode GUARDED_BY(_mutex) = 0;
  std::size_t _size GUARDED_BY(_mutex) = 0;  // of the open file
  bool _failing GUARDED_BY(_mutex) = false;  // the last record was lost
};

}  // namespace orvanta::platform
