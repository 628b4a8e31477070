#include "backends/UploadBudget.h"

#include <memory>

namespace orvanta {

UploadBudget& UploadBudget::of(platform::Platform& platform) {
  return *platform.once<std::unique_ptr<UploadBudget>>([] { return std::make_unique<UploadBudget>(); });
}

UploadBudget::Share::Share(UploadBudget& budget, std::uint64_t bytes) : _budget(budget), _bytes(bytes) {
  std::unique_lock lock(_budget._mutex);
  const std::uint64_t ticket = _budget._nextTicket++;
  _budget._changed.wait(lock,
                        [&] { return ticket == _budget._admitting && _budget._taken + bytes <= kMaximumTotalBytes; });
  _budget._taken += bytes;
  ++_budget._admitting;
  _budget._changed.notify_all();
}

void UploadBudget::Share::shrinkTo(std::uint64_t bytes) {
  const std::lock_guard lock(_budget._mutex);
  if (bytes >= _bytes) return;
  _budget._taken -= _bytes - bytes;
  _bytes = bytes;
  _budget._changed.notify_all();
}

}  // namespace orvanta
