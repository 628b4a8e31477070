#include <fmt/format.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "platform/Json.h"
#include "tools/orvantactl/ClientOptions.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/ConfiguredSession.h"
#include "tools/orvantactl/ExitStatus.h"
#include "tools/orvantactl/JsonValues.h"

namespace orvanta::ctl {

namespace {

struct UploadOptions : ClientOptions {
  std::vector<std::string> files;
};

int upload(const UploadOptions& options) {
  int status = kAllTaken;
  const auto session = configureOrComplain(options, status);
  if (!session.connection) return status;
  auto calls = session.connection->session().blocking();
  for (const auto& file : options.files) {
    const auto uploaded = calls.uploadFile(file);
    if (!uploaded) {
      status = complain(uploaded.error());
      if (!session.connection->isOpen()) break;
      continue;
    }
    printLine(platform::writeJson(platform::Dictionary{{"file", file}, {"uploaded", *uploaded}}));
    if (!*uploaded) {
      complain(
          fmt::format("{} was not taken: it must be a regular file that is not empty, and the client type's storebag "
                      "must have an upload server. The daemon's log says more.",
                      file));
      status = kSomethingNotTaken;
    }
  }
  return status;
}

int uploadLog(const UploadOptions& options) {
  const auto& file = options.files.front();
  std::ifstream input(file, std::ios::binary);
  const std::string text((std::istreambuf_iterator<char>(input)), std::istreambuf_iterator<char>());
  if (!input.is_open() || input.bad()) {
    complain(fmt::format("cannot read {}: {}", file, std::strerror(errno)));
    return kUsage;
  }
  auto parsed = parseTaggedJson(text);
  auto* entries = parsed ? parsed->array() : nullptr;
  if (entries == nullptr) {
    complain(fmt::format("{} must hold a JSON array{}", file, parsed ? "" : ": " + parsed.error()));
    return kUsage;
  }
  int status = kAllTaken;
  const auto session = configureOrComplain(options, status);
  if (!session.connection) return status;
  const auto answer = session.connection->session().blocking().uploadLogData(
      std::make_shared<const platform::Array>(std::move(*entries)));
  if (!answer) return complain(answer.error());
  platform::Dictionary line{{"uploaded", answer->uploaded}};
  if (answer->error) line.set("error", answer->error->description);
  printLine(platform::writeJson(line));
  if (answer->uploaded) return kAllTaken;
  complain("the log data was not taken: the client type's storebag must have a dashboard with a \"post_url\"");
  return kSomethingNotTaken;
}

void addOptions(CLI::App& command, UploadOptions& options) {
  options.addConnectionTo(command);
  options.addSessionTo(command);
  options.addUserInfoTo(command);
}

}  // namespace

void addUploadCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<UploadOptions>();
  auto& command = *app.add_subcommand("upload", "Uploads files; one that the server confirms is removed");
  command.footer(
      "Writes {\"file\":…,\"uploaded\":true} for each. A file whose upload the server does not confirm stays.");
  command.add_option("FILE", options->files, "Regular files that this user can read")->required();
  addOptions(command, *options);
  command.callback([options, &status] { status = upload(*options); });
}

void addUploadLogCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<UploadOptions>();
  auto& command = *app.add_subcommand("upload-log", "Uploads log data: the values of a JSON array");
  command.footer("{\"$date\": SECONDS} and {\"$data\": \"BASE64\"} in it stand for a date and for data.");
  command.add_option("FILE", options->files, "File with the JSON array")->required()->expected(1);
  addOptions(command, *options);
  command.callback([options, &status] { status = uploadLog(*options); });
}

}  // namespace orvanta::ctl
