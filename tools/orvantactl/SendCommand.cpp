#include <cstdint>
#include <memory>
#include <string>
#include <utility>

#include "platform/codec/Json.h"
#include "tools/orvantactl/Commands.h"
#include "tools/orvantactl/ConfiguredSession.h"
#include "tools/orvantactl/JsonValues.h"
#include "tools/orvantactl/Output.h"

namespace orvanta::ctl {

namespace {

struct SendOptions : ClientOptions {
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  std::string payloadJson;
};

int send(const SendOptions& options) {
  int status = kAllTaken;
  const auto records = recordsOrComplain(options, status);
  if (!records) return status;
  SharedDictionary payload;
  if (!options.payloadJson.empty()) {
    auto parsed = parseTaggedJson(options.payloadJson);
    auto* object = parsed ? parsed->dictionary() : nullptr;
    if (object == nullptr) {
      complain("--payload must be a JSON object such as '{\"duration\": 1.5}'" +
               (parsed ? std::string() : ": " + parsed.error()));
      return kUsage;
    }
    payload = std::make_shared<const Dictionary>(std::move(*object));
  }
  const auto connection = connectOrComplain(options, status);
  if (!connection) return status;
  const auto reply = connection->session().blocking().sendMessage(
      records->sessionInfo.dictionary(), records->userInfoDictionary(), options.category, options.type, payload);
  if (!reply) return complain(reply.error());
  printLine(platform::writeJson(Dictionary{{"reply", *reply ? Value(**reply) : nullptr}}));
  if (*reply == "finished") return kAllTaken;
  complain(
      "the event was not taken; \"storebag not available\" means that the daemon has no storebag for client type " +
      std::to_string(options.clientType));
  return kSomethingNotTaken;
}

}  // namespace

void addSendCommand(CLI::App& app, int& status) {
  auto options = std::make_shared<SendOptions>();
  auto& command = *app.add_subcommand("send", "Reports one event without a session");
  command.footer("Writes {\"reply\":\"finished\"} when the event has been passed to its backends.");
  options->addTo(command);
  options->addHierarchyTo(command, "--hierarchy-token");
  command.add_option("--category", options->category, "The event's category, 0 to 65535")->required()->type_name("N");
  command.add_option("--type", options->type, "The event's type, 0 to 65535")->required()->type_name("N");
  command.add_option("--payload", options->payloadJson, "The event's payload, an object")->type_name("JSON");
  command.callback([options, &status] { status = send(*options); });
}

}  // namespace orvanta::ctl
