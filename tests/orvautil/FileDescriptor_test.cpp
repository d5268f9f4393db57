#include "orvautil/FileDescriptor.h"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <unistd.h>

#include <type_traits>
#include <utility>

namespace orva::util {
namespace {

static_assert(!std::is_copy_constructible_v<FileDescriptor>);
static_assert(!std::is_copy_assignable_v<FileDescriptor>);

/// A new descriptor, which nothing owns yet.
int NewDescriptor() {
  return open("/dev/null", O_RDONLY | O_CLOEXEC);
}

bool IsOpen(int descriptor) {
  return fcntl(descriptor, F_GETFD) != -1;
}

TEST(FileDescriptor, HasNoneByDefault) {
  const FileDescriptor none;
  EXPECT_FALSE(none);
  EXPECT_EQ(none.Get(), -1);
}

TEST(FileDescriptor, ClosesItsDescriptorAtTheEnd) {
  const int descriptor = NewDescriptor();
  {
    const FileDescriptor owner(descriptor);
    EXPECT_TRUE(owner);
    EXPECT_EQ(owner.Get(), descriptor);
    EXPECT_TRUE(IsOpen(descriptor));
  }
  EXPECT_FALSE(IsOpen(descriptor));
}

TEST(FileDescriptor, ReleaseLeavesTheDescriptorOpen) {
  const int descriptor = NewDescriptor();
  {
    FileDescriptor owner(descriptor);
    EXPECT_EQ(owner.Release(), descriptor);
    EXPECT_FALSE(owner);
    EXPECT_EQ(owner.Release(), -1);
  }
  EXPECT_TRUE(IsOpen(descriptor));
  close(descriptor);
}

TEST(FileDescriptor, ResetClosesTheDescriptorAndTakesAnother) {
  const int first = NewDescriptor();
  const int second = NewDescriptor();
  FileDescriptor owner(first);
  owner.Reset(second);
  EXPECT_FALSE(IsOpen(first));
  EXPECT_EQ(owner.Get(), second);
  owner.Reset();
  EXPECT_FALSE(IsOpen(second));
  EXPECT_FALSE(owner);
}

TEST(FileDescriptor, MovingTransfersTheDescriptor) {
  const int descriptor = NewDescriptor();
  FileDescriptor source(descriptor);
  const FileDescriptor& moved = source;
  const FileDescriptor target(std::move(source));
  EXPECT_FALSE(moved);
  EXPECT_EQ(target.Get(), descriptor);
  EXPECT_TRUE(IsOpen(descriptor));
}

TEST(FileDescriptor, MoveAssignmentClosesTheDescriptorThatItReplaces) {
  const int replaced = NewDescriptor();
  const int descriptor = NewDescriptor();
  FileDescriptor owner(replaced);
  owner = FileDescriptor(descriptor);
  EXPECT_FALSE(IsOpen(replaced));
  EXPECT_EQ(owner.Get(), descriptor);
  EXPECT_TRUE(IsOpen(descriptor));
}

TEST(FileDescriptor, MoveAssignmentToItselfKeepsTheDescriptor) {
  const int descriptor = NewDescriptor();
  FileDescriptor owner(descriptor);
  FileDescriptor& same = owner;
  owner = std::move(same);
  EXPECT_EQ(owner.Get(), descriptor);
  EXPECT_TRUE(IsOpen(descriptor));
}

} // namespace
} // namespace orva::util
