#pragma once

#include <cstdint>
#include <memory>

#include "interface/WireLimits.h"
#include "platform/core/Mutex.h"

namespace orvanta {

// How much memory file uploads of all sessions may take together. Owned by BackendServices; thread-safe.
//
// An upload reserves room before it reads the file, and waits for it in the order of arrival: a small one does not pass
// a large one for ever.
class UploadBudget {
 public:
  static constexpr std::uint64_t kMaximumFileBytes = kMaximumUploadBytes;
  // While it is compressed a file is in memory as it is, and twice as what becomes of it (a buffer of the worst size,
  // then the copy of the right size). Beside one of the largest there is room for small ones.
  static constexpr std::uint64_t kCopies = 3;
  static constexpr std::uint64_t kMaximumTotalBytes = kCopies * kMaximumFileBytes + (64U << 20U);

  // Holds `bytes`, at most kMaximumTotalBytes, while it lives.
  class Reservation {
   public:
    // Blocks until there is so much. Returns null once the budget is closed.
    static std::unique_ptr<Reservation> take(UploadBudget& budget, std::uint64_t bytes);
    ~Reservation() { shrinkTo(0); }
    Reservation(const Reservation&) = delete;
    Reservation& operator=(const Reservation&) = delete;
    void shrinkTo(std::uint64_t bytes);

   private:
    Reservation(UploadBudget& budget, std::uint64_t bytes) : _budget(budget), _bytes(bytes) {}

    UploadBudget& _budget;
    std::uint64_t _bytes;
  };

  // From now on no upload gets room, those that wait included. For shutting down.
  void close();

 private:
  platform::Mutex _mutex;
  platform::Condition _changed;
  std::uint64_t _taken GUARDED_BY(_mutex) = 0;
  std::uint64_t _nextTicket GUARDED_BY(_mutex) = 0;  // the next upload's
  std::uint64_t _admitting GUARDED_BY(_mutex) = 0;   // the ticket whose turn it is
  bool _closed GUARDED_BY(_mutex) = false;
};

}  // namespace orvanta
