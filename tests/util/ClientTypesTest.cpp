#include "util/ClientTypes.h"

#include <gtest/gtest.h>

#include <limits>

namespace orvanta {
namespace {

TEST(ClientTypes, namesEveryTypesSenderAndStorebag) {
  struct Row {
    std::int32_t clientType;
    std::string_view senderCode;
    std::optional<std::string_view> storebagName;
  };
  const Row rows[] = {
      {0, "QZ", {}},
      {1, "XJ", {}},
      {2, "ZUV", {}},
      {3, "JQ", {}},
      {4, "VX", {}},
      {5, "ZK", "quillon"},
      {6, "QB", "brindle"},
      {7, "XF", "confluo"},
      {8, "JZ", "skylume"},
      {9, "QW", "ostrel"},
      {10, "XQ", "pondera"},
      {11, "ZJ", "confluo"},
      {12, "QUBZ", "graphelle"},
      {13, "ZEPHQ", "confluo"},
      {14, "QB-ZIRL", "brindle"},
      {15, "QB-JOVEX", "brindle"},
      {16, "ZORNEPS", "scribehall"},
      {17, "JAXTRO", "halvora"},
      {18, "QUARNEX", "parrowick"},
      {19, "", {}},
      {-1, "", {}},
      {std::numeric_limits<std::int32_t>::min(), "", {}},
      {std::numeric_limits<std::int32_t>::max(), "", {}},
  };
  for (const Row& row : rows) {
    EXPECT_EQ(senderCodeForClientType(row.clientType), row.senderCode) << row.clientType;
    EXPECT_EQ(storebagNameForClientType(row.clientType), row.storebagName) << row.clientType;
  }
}

}  // namespace
}  // namespace orvanta
