#include "platform/Landlock.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Landlock, handlesNoMoreRightsThanTheKernelsAbiKnows) {
  struct Row {
    int abi;
    std::uint64_t rights;
  };
  const Row rows[] = {{-1, 0},     {0, 0},      {1, 0x1fff}, {2, 0x3fff}, {3, 0x7fff},
                      {4, 0x7fff}, {5, 0xffff}, {6, 0xffff}, {7, 0xffff}, {100, 0xffff}};
  for (const Row& row : rows) EXPECT_EQ(landlockRightsOfAbi(row.abi), row.rights) << row.abi;
}

TEST(Landlock, leavesOutOfAFilesRuleWhatOnlyDirectoriesHave) {
  EXPECT_EQ(landlockFileRights(~std::uint64_t{0}),
            kLandlockExecute | kLandlockWriteFile | kLandlockReadFile | kLandlockTruncate | kLandlockIoctlDevice);
  EXPECT_EQ(landlockFileRights(kLandlockReadFile | kLandlockReadDirectory), kLandlockReadFile);
  EXPECT_EQ(landlockFileRights(kLandlockMakeSocket | kLandlockRemoveFile), 0);
}

}  // namespace
}  // namespace platform
