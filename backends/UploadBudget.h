#pragma once

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>

#include "interface/WireLimits.h"

namespace orvanta {

// How much memory file uploads of all sessions may take together. Owned by BackendServices; thread-safe.
//
// An upload takes its share before it reads the file, and waits for it in the order of arrival: a small one does not
// pass a large one for ever.
class UploadBudget {
 public:
  static constexpr std::uint64_t kMaximumFileBytes = kMaximumUploadBytes;
  // While it is compressed a file is in memory as it is, and twice as what becomes of it (a buffer of the worst size,
  // then the copy of the right size). Beside one of the largest there is room for small ones.
  static constexpr std::uint64_t kCopies = 3;
  static constexpr std::uint64_t kMaximumTotalBytes = kCopies * kMaximumFileBytes + (64U << 20U);

  // Holds `bytes`, at most kMaximumTotalBytes, while it lives.
  class Share {
   public:
    // Blocks until there is so much. Null once the budget is closed.
    static std::unique_ptr<Share> take(UploadBudget& budget, std::uint64_t bytes);
    ~Share() { shrinkTo(0); }
    Share(const Share&) = delete;
    Share& operator=(const Share&) = delete;
    void shrinkTo(std::uint64_t bytes);

   private:
    Share(UploadBudget& budget, std::uint64_t bytes) : _budget(budget), _bytes(bytes) {}

    UploadBudget& _budget;
    std::uint64_t _bytes;
  };

  // Nobody gets a share any more, those who wait included. For shutting down.
  void close();

 private:
  std::mutex _mutex;
  std::condition_variable _changed;
  std::uint64_t _taken = 0;       // guarded by _mutex, as what follows
  std::uint64_t _nextTicket = 0;  // of who comes next
  std::uint64_t _admitting = 0;   // the ticket whose turn it is
  bool _closed = false;
};

}  // namespace orvanta
