#include "backends/UploadBudget.h"

#include <memory>

namespace orvanta {

std::unique_ptr<UploadBudget::Reservation> UploadBudget::Reservation::take(UploadBudget& budget, std::uint64_t bytes) {
  platform::MutexLock lock(budget._mutex);
  const std::uint64_t ticket = budget._nextTicket++;
  while (!budget._closed && (ticket != budget._admitting || budget._taken + bytes > kMaximumTotalBytes)) {
    budget._changed.wait(lock);
  }
  if (budget._closed) return nullptr;
  budget._taken += bytes;
  ++budget._admitting;
  budget._changed.notifyAll();
  return std::unique_ptr<Reservation>(new Reservation(budget, bytes));
}

void UploadBudget::close() {
  const platform::MutexLock lock(_mutex);
  _closed = true;
  _changed.notifyAll();
}

void UploadBudget::Reservation::shrinkTo(std::uint64_t bytes) {
  const platform::MutexLock lock(_budget._mutex);
  if (bytes >= _bytes) return;
  _budget._taken -= _bytes - bytes;
  _bytes = bytes;
  _budget._changed.notifyAll();
}

}  // namespace orvanta
