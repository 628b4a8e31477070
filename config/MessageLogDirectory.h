#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/core/UniqueFd.h"

namespace orvanta {

// Returns whether a file of that name is a message log: "orvantad", digits or any other text without "_",
// "messageLog.diag", joined by "_".
bool isMessageLogName(std::string_view name);
std::string messageLogName(std::int32_t creationTime);

// The message-log directory during one call of writeToLogFile, used by its thread alone: the file operations that the
// rules for choosing a file need, each one system call on the open directory. A failure is told in the result; nothing
// is remembered from one call to the next.
class MessageLogDirectory {
 public:
  // Seconds since 1970; nullopt where the file system does not keep it.
  using CreationDate = std::optional<double>;

  struct Entry {
    std::string name;
    CreationDate created;
  };

  explicit MessageLogDirectory(std::string path);

  // The message logs among the regular files, in listing order. On failure errno's value, and no entries.
  int list(std::vector<Entry>& entries) const;
  // Makes the directory and its missing parents; failure shows in what follows.
  void create();
  // Opens for appending, by name only: never through a symbolic link. Without a descriptor when that is not possible.
  platform::UniqueFd openExisting(const std::string& name) const;
  platform::UniqueFd openNew(const std::string& name) const;
  CreationDate creationDate(const platform::UniqueFd& file) const;
  void remove(const std::string& name) const;

  const std::string& path() const { return _path; }
  std::string pathOf(const std::string& name) const { return _path + "/" + name; }

 private:
  void open();

  const std::string _path;
  platform::UniqueFd _directory;  // absent when it could not be opened
  int _listingError = 0;          // errno's value of opening it for listing
};

}  // namespace orvanta
