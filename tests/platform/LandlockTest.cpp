#include "platform/Landlock.h"

#include <gtest/gtest.h>

namespace platform {
namespace {

TEST(Landlock, handlesNoMoreRightsThanTheKernelsAbiKnows) {
  const std::pair<int, std::uint64_t> rows[] = {{-1, 0},     {0, 0},      {1, 0x1fff}, {2, 0x3fff}, {3, 0x7fff},
                                                {4, 0x7fff}, {5, 0xffff}, {6, 0xffff}, {7, 0xffff}, {100, 0xffff}};
  for (const auto& [abi, rights] : rows) EXPECT_EQ(landlockRightsOfAbi(abi), rights) << abi;
}

TEST(Landlock, leavesOutOfAFilesRuleWhatOnlyDirectoriesHave) {
  EXPECT_EQ(landlockFileRights(~std::uint64_t{0}),
            kLandlockExecute | kLandlockWriteFile | kLandlockReadFile | kLandlockTruncate | kLandlockIoctlDevice);
  EXPECT_EQ(landlockFileRights(kLandlockReadFile | kLandlockReadDirectory), kLandlockReadFile);
  EXPECT_EQ(landlockFileRights(kLandlockMakeSocket | kLandlockRemoveFile), 0);
}

}  // namespace
}  // namespace platform
