#pragma once

#include <sys/types.h>

#include <cstdint>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/core/Clock.h"
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
  // Both under _mutex. False, with errno set, when there is no file to write to.
  bool openFile();
  bool append(std::string_view line);

  const Clock& _clock;
  const std::string _path;
  const std::string _olderPath;
  const std::size_t _generationBytes;
  std::mutex _mutex;
  UniqueFd _file;         // guarded by _mutex: kept open between records
  dev_t _device = 0;      // guarded by _mutex: which file that is
  ino_t _inode = 0;       // guarded by _mutex
  std::size_t _size = 0;  // guarded by _mutex: of the open file
  bool _failing = false;  // guarded by _mutex: the last record was lost
};

}  // namespace orvanta::platform
