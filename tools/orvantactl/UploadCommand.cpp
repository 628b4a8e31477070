#include <fmt/format.h>
#include <sys/stat.h>

#include <cerrno>
#include <fstream>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "interface/WireLimits.h"
#include "platform/codec/Json.h"
#include "platform/codec/PropertyList.h"
#include "platform/core/Text.h"
#include "platform/core/WholeFile.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/ConfiguredSession.h"
#include "tools/orvantactl/JsonValues.h"
#include "tools/orvantactl/Output.h"

namespace orvanta::ctl {

namespace {

struct UploadOptions : ClientOptions {
  std::vector<std::string> files;
};

// The values travel in one frame; their JSON may be twice as long.
constexpr std::size_t kMaximumLogBytes = 2 * kMaximumFrameBytes;

// The daemon's answer is only false. Checks the reasons that can be seen from here; the others are on the daemon's
// side.
std::string reasonNotTaken(const std::string& file) {
  struct stat facts {};
  if (::stat(file.c_str(), &facts) != 0) return platform::errnoText(errno);
  if (!S_ISREG(facts.st_mode)) return "it is not a regular file";
  if (static_cast<std::uint64_t>(facts.st_size) > kMaximumUploadBytes) {
    return fmt::format("it has {} bytes, and the daemon takes at most {} MiB", facts.st_size,
                       kMaximumUploadBytes >> 20U);
  }
  // Files of /proc have no size, but content.
  if (facts.st_size == 0 && std::ifstream(file).peek() == std::ifstream::traits_type::eof()) return "it is empty";
  return "the client type's storebag must have an \"upload_server\" with a \"post_url\"; the daemon's log says more";
}

int upload(const UploadOptions& options) {
  int status = kAllTaken;
  const auto session = configureOrComplain(options, status);
  if (!session.backends) return status;
  auto calls = session.connection->session().blocking();
  for (const auto& file : options.files) {
    const auto uploaded = calls.uploadFile(file);
    if (!uploaded) {
      status = complain(uploaded.error());
      if (!session.connection->isOpen()) break;
      continue;
    }
    printLine(platform::writeJson(Dictionary{{"file", file}, {"uploaded", *uploaded}}));
    if (!*uploaded) {
      complain(fmt::format("{} was not taken: {}", file, reasonNotTaken(file)));
      status = kSomethingNotTaken;
    }
  }
  return status;
}

int uploadLog(const UploadOptions& options) {
  const auto& file = options.files.front();
  const auto text = platform::readWholeFile(file, kMaximumLogBytes);
  if (!text) {
    complain(text.error());
    return kUsage;
  }
  auto parsed = parseTaggedJson(*text);
  if (!parsed || parsed->array() == nullptr) {
    complain(fmt::format("{} must hold a JSON array{}", file, parsed ? "" : ": " + parsed.error()));
    return kUsage;
  }
  // The daemon archives the values as a property list, and only answers false when it cannot.
  if (const auto archived = platform::writeBinaryPropertyList(*parsed); !archived) {
    complain(fmt::format("{} holds a value that cannot be archived: {}", file, archived.error()));
    return kUsage;
  }
  int status = kAllTaken;
  const auto session = configureOrComplain(options, status);
  if (!session.backends) return status;
  const auto answer = session.connection->session().blocking().uploadLogData(
      std::make_shared<const Array>(std::move(*parsed->array())));
  if (!answer) return complain(answer.error());
  Dictionary line{{"uploaded", answer->uploaded}};
  if (answer->error) line.set("error", answer->error->description);
  printLine(platform::writeJson(line));
  if (answer->uploaded) return kAllTaken;
  complain(
      "the log data was not taken: the client type's storebag must have a \"dashboard\" with a \"post_url\", and the "
      "server there must answer with a text. The daemon's log says more.");
  return kSomethingNotTaken;
}

}  // namespace

void addUploadCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<UploadOptions>();
  auto& command = *app.add_subcommand("upload", "Uploads files; one that the server confirms is removed");
  command.footer(
      "Writes {\"file\":…,\"uploaded\":true} for each. A file whose upload the server does not confirm stays.");
  command.add_option("FILE", options->files, "Regular files that this user can read")->required();
  options->addTo(command);
  command.callback([options, &status] { status = upload(*options); });
}

void addUploadLogCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<UploadOptions>();
  auto& command = *app.add_subcommand("upload-log", "Uploads log data: the values of a JSON array");
  command.footer("{\"$date\": SECONDS} and {\"$data\": \"BASE64\"} in it stand for a date and for data.");
  command.add_option("FILE", options->files, "File with the JSON array")->required()->expected(1);
  options->addTo(command);
  command.callback([options, &status] { status = uploadLog(*options); });
}

}  // namespace orvanta::ctl
