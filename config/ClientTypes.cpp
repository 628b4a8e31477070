#include "config/ClientTypes.h"

#include <array>

namespace orvanta {

namespace {

struct ClientTypeRow {
  std::string_view senderCode;
  std::string_view storebagName;  // empty when it has no storebag
};

constexpr std::array<ClientTypeRow, 19> kClientTypes{{
    {"QZ", ""},
    {"XJ", ""},
    {"ZUV", ""},
    {"JQ", ""},
    {"VX", ""},
    {"ZK", "quillon"},
    {"QB", "brindle"},
    {"XF", kConfluoStorebag},
    {"JZ", "skylume"},
    {"QW", "ostrel"},
    {"XQ", "pondera"},
    {"ZJ", kConfluoStorebag},
    {"QUBZ", "graphelle"},
    {"ZEPHQ", kConfluoStorebag},
    {"QB-ZIRL", "brindle"},
    {"QB-JOVEX", "brindle"},
    {"ZORNEPS", "scribehall"},
    {"JAXTRO", "halvora"},
    {"QUARNEX", "parrowick"},
}};

const ClientTypeRow* rowFor(std::int32_t clientType) {
  if (clientType < 0 || static_cast<std::size_t>(clientType) >= kClientTypes.size()) return nullptr;
  return &kClientTypes[static_cast<std::size_t>(clientType)];
}

}  // namespace

std::string_view senderCodeForClientType(std::int32_t clientType) {
  const ClientTypeRow* row = rowFor(clientType);
  return row == nullptr ? std::string_view() : row->senderCode;
}

std::optional<std::string_view> storebagNameForClientType(std::int32_t clientType) {
  const ClientTypeRow* row = rowFor(clientType);
  if (row == nullptr || row->storebagName.empty()) return std::nullopt;
  return row->storebagName;
}

}  // namespace orvanta
