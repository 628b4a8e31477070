#include "config/StorebagKeys.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <utility>

namespace orvanta {
namespace {

std::string documentation() {
  std::ifstream file(ORVANTA_SOURCE_DIR "/docs/storebag.md");
  return {std::istreambuf_iterator<char>(file), {}};
}

// A place's keys as docs/storebag.md lists them.
std::string tableOf(StorebagPlace place) {
  std::string table = "| Key | Type | Absent | Wrong type | Meaning |\n|---|---|---|---|---|\n";
  for (const StorebagKeyInfo& row : storebagKeys()) {
    if (row.place != place) continue;
    table.append("| `").append(row.name).append("` | ").append(describe(row.type)).append(" | ").append(row.absent);
    table.append(" | ").append(describe(row.wrongType)).append(" | ").append(row.meaning).append(" |\n");
  }
  return table + "\n";
}

TEST(StorebagKeys, areDocumentedAsTheyAreRead) {
  const std::string text = documentation();
  std::size_t documented = 0;
  for (const auto place : {StorebagPlace::document, StorebagPlace::bag, StorebagPlace::environment,
                           StorebagPlace::httpsProfile, StorebagPlace::clientSection, StorebagPlace::countryThreshold,
                           StorebagPlace::filterRule, StorebagPlace::dashboardProfile, StorebagPlace::uploadProfile}) {
    const std::string table = tableOf(place);
    EXPECT_NE(text.find(table), std::string::npos) << "docs/storebag.md should hold:\n" << table;
    documented += static_cast<std::size_t>(std::count(table.begin(), table.end(), '\n')) - 3;
  }
  EXPECT_EQ(documented, storebagKeys().size());
}

TEST(StorebagKeys, standOncePerPlace) {
  std::set<std::pair<StorebagPlace, std::string_view>> keys;
  for (const StorebagKeyInfo& row : storebagKeys()) EXPECT_TRUE(keys.emplace(row.place, row.name).second) << row.name;
}

}  // namespace
}  // namespace orvanta
