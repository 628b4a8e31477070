#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace orvanta::platform {

// The right that a consumed extension token gives: reading one file that a client opened, and nothing else.
//
// A token stands for the open descriptor that came with the client's call, so that the file is read with the client's
// rights and never by its path. The handle borrows that descriptor for the length of the call; release() ends its use,
// the destructor too. Used by one thread at a time.
class ExtensionHandle {
 public:
  // Without a token, or without a descriptor behind it, a handle that gives no access.
  static ExtensionHandle consume(const std::optional<std::string>& token, int descriptor);
  ExtensionHandle(ExtensionHandle&& other) noexcept;
  ExtensionHandle& operator=(ExtensionHandle&&) = delete;
  ~ExtensionHandle() { release(); }

  bool grantsAccess() const { return _descriptor >= 0; }

  // The size of the file in bytes; nullopt without access, or when the descriptor does not lead to a regular file.
  std::optional<std::uint64_t> regularFileSize() const;
  // The file's first bytes, up to `size` of them; fewer when the file has shrunk, nullopt when it cannot be read or
  // memory is short. The client's own position in the file neither matters nor changes. May block on a slow file
  // system.
  std::optional<std::string> read(std::size_t size) const;

  void release() { _descriptor = -1; }

 private:
  explicit ExtensionHandle(int descriptor) : _descriptor(descriptor) {}

  int _descriptor = -1;  // borrowed
};

}  // namespace orvanta::platform
