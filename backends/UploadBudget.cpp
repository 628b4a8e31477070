#include "backends/UploadBudget.h"

#include <memory>

namespace orvanta {

std::unique_ptr<UploadBudget::Share> UploadBudget::Share::take(UploadBudget& budget, std::uint64_t bytes) {
  std::unique_lock lock(budget._mutex);
  const std::uint64_t ticket = budget._nextTicket++;
  budget._changed.wait(lock, [&] {
    return budget._closed || (ticket == budget._admitting && budget._taken + bytes <= kMaximumTotalBytes);
  });
  if (budget._closed) return nullptr;
  budget._taken += bytes;
  ++budget._admitting;
  budget._changed.notify_all();
  return std::unique_ptr<Share>(new Share(budget, bytes));
}

void UploadBudget::close() {
  const std::lock_guard lock(_mutex);
  _closed = true;
  _changed.notify_all();
}

void UploadBudget::Share::shrinkTo(std::uint64_t bytes) {
  const std::lock_guard lock(_budget._mutex);
  if (bytes >= _bytes) return;
  _budget._taken -= _bytes - bytes;
  _bytes = bytes;
  _budget._changed.notify_all();
}

}  // namespace orvanta
