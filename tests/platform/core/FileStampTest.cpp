#include "platform/core/FileStamp.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include "tests/support/TemporaryDirectory.h"

namespace orvanta::platform {
namespace {

using orvanta::test::TemporaryDirectory;

// On file systems with coarse times a second change could leave the same stamp as the first.
TEST(FileStamp, AFreshlyChangedFilesStampNeverHolds) {
  const TemporaryDirectory directory;
  const FileStamp stamp = FileStamp::of(directory.write("file", "content"));
  EXPECT_TRUE(stamp.exists);
  EXPECT_FALSE(stamp.settled);
  EXPECT_FALSE(stamp.stillHolds(stamp));
}

TEST(FileStamp, ASettledStampHoldsUntilAnythingDiffers) {
  FileStamp stamp;
  stamp.exists = stamp.settled = true;
  stamp.device = stamp.inode = 7;
  stamp.size = 7;
  stamp.modified = stamp.changed = {7, 7};
  EXPECT_TRUE(stamp.stillHolds(stamp));
  void (*const changes[])(FileStamp&) = {[](FileStamp& s) { s.exists = false; },
                                         [](FileStamp& s) { s.device = 8; },
                                         [](FileStamp& s) { s.inode = 8; },
                                         [](FileStamp& s) { s.size = 8; },
                                         [](FileStamp& s) { s.modified.tv_nsec = 8; },
                                         [](FileStamp& s) { s.changed.tv_nsec = 8; }};
  for (const auto& change : changes) {
    FileStamp now = stamp;
    change(now);
    EXPECT_FALSE(stamp.stillHolds(now));
  }
  EXPECT_TRUE(FileStamp::of("/no/such/file").stillHolds(FileStamp::of("/no/such/file")));
  EXPECT_FALSE(FileStamp::of("/no/such/file").stillHolds(stamp));
}

TEST(FileStamp, ReadingRefusesWhatIsNoFileOrTooLarge) {
  const TemporaryDirectory directory;
  const std::string file = directory.write("file", "12345");
  EXPECT_EQ(readStamped(file, 5)->bytes, "12345");
  EXPECT_FALSE(readStamped(file, 4));
  EXPECT_FALSE(readStamped(directory.path(), 100));
  const std::string fifo = directory / "fifo";
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0600), 0);
  EXPECT_FALSE(readStamped(fifo, 100)) << "and does not wait for a writer";
  const auto missing = readStamped(file + "/below", 100);
  ASSERT_TRUE(missing);
  EXPECT_FALSE(missing->stamp.exists);
}

}  // namespace
}  // namespace orvanta::platform
