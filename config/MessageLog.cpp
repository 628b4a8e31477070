#include "config/MessageLog.h"

#include <unistd.h>

#include <cerrno>
#include <optional>
#include <utility>
#include <vector>

#include "config/MessageLogDirectory.h"
#include "interface/OrvantaLogging.h"
#include "platform/core/Text.h"

namespace orvanta {

namespace {

using Entry = MessageLogDirectory::Entry;

constexpr double kMaximumAgeSeconds = 86400;
// The text of a large flush, which takes milliseconds to write.
constexpr std::size_t kLargeMessage = 256U << 10U;

std::string describeCreation(const MessageLogDirectory::CreationDate& created) {
  return created ? platform::describeDate(*created) : "(null)";
}

void expireLogFile(const MessageLogDirectory& directory, const Entry& file) {
  directory.remove(file.name);
  ORVANTA_LOG(info, "writeToLogFile: Deleted expired orvantad log file {} ({})", directory.pathOf(file.name),
              describeCreation(file.created));
}

// The message logs that the directory holds; empty when it cannot be listed. A missing directory is made.
std::vector<Entry> listOrCreate(MessageLogDirectory& directory) {
  std::vector<Entry> entries;
  const int error = directory.list(entries);
  if (error == ENOENT) {
    ORVANTA_LOG(info, "writeToLogFile: Creating orvantad log directory at {}", directory.path());
    directory.create();
  } else if (error != 0) {
    ORVANTA_LOG(error, "writeToLogFile: Error reading from log directory: {}", platform::errnoText(error));
  }
  return entries;
}

// The newest entry that is young enough. Expires the others.
std::optional<Entry> chooseFile(const MessageLogDirectory& directory, std::vector<Entry> entries, double now) {
  std::optional<Entry> chosen;
  for (Entry& entry : entries) {
    // NOLINTNEXTLINE(bugprone-branch-clone): expired by age, and expired by a newer one, in the order of the rules
    if (entry.created && now - *entry.created > kMaximumAgeSeconds) {
      expireLogFile(directory, entry);
    } else if (!chosen || !chosen->created) {
      chosen = std::move(entry);
    } else if (entry.created && *entry.created > *chosen->created) {
      expireLogFile(directory, *chosen);
      chosen = std::move(entry);
    } else {
      expireLogFile(directory, entry);
    }
  }
  return chosen;
}

// One write for the whole line, so that lines of several threads do not mix.
bool appendLine(const platform::UniqueFd& file, double now, std::string_view message) {
  std::string line;
  const std::string date = platform::describeDate(now);
  line.reserve(date.size() + message.size() + 4);
  line.append("(").append(date).append(") ").append(message).append("\n");
  return ::write(file.get(), line.data(), line.size()) == static_cast<ssize_t>(line.size());
}

}  // namespace

void writeToLogFile(Platform& platform, std::string_view message) {
  std::optional<platform::BlockingScope> large;
  if (message.size() > kLargeMessage) large.emplace();
  const double now = platform.clock().wallSeconds();
  MessageLogDirectory directory(platform.files().stateDirectory + "/Logs/Faultline/Retired");
  auto chosen = chooseFile(directory, listOrCreate(directory), now);
  platform::UniqueFd file;
  if (chosen) {
    file = directory.openExisting(chosen->name);
  } else {
    chosen = Entry{messageLogName(static_cast<std::int32_t>(static_cast<std::int64_t>(now))), std::nullopt};
    file = directory.openNew(chosen->name);
    if (!file) {
      ORVANTA_LOG(error, "writeToLogFile: Failed to create new orvantad log file {}", directory.pathOf(chosen->name));
      return;
    }
    chosen->created = directory.creationDate(file);
    ORVANTA_LOG(info, "writeToLogFile: Created new orvantad log file {} ({})", directory.pathOf(chosen->name),
                describeCreation(chosen->created));
  }
  if (file && appendLine(file, now, message)) {
    ORVANTA_LOG(info, "writeToLogFile: Saved log message to {}", directory.pathOf(chosen->name));
    return;
  }
  file.reset();
  expireLogFile(directory, *chosen);
}

}  // namespace orvanta
