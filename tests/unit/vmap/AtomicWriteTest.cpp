// Replacing a file either fully succeeds or leaves the old file as it was
// and no temporary file behind, whichever step the disk fails at.
#include <gtest/gtest.h>

#include <cerrno>

#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/testing/FaultyFileOps.h"
#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

const Value kNewValue(Dictionary{{"Version", "2.0"}, {"Blob", Data(100000, 0x5A)}});
constexpr std::string_view kOldContents = "<vmap version=\"1.0\"><string>old</string></vmap>";

class VmapAtomicWrite : public ::testing::Test {
 protected:
  void SetUp() override { testing::writeText(target_, kOldContents); }

  void expectOldFileAloneRemains() {
    EXPECT_EQ(testing::readAll(target_), kOldContents);
    EXPECT_EQ(dir_.names(), std::vector<std::string>{"Info.vmap"});
  }

  testing::ScratchDirectory dir_;
  const std::string target_ = dir_.file("Info.vmap");
  FaultyFileOps ops_;
};

TEST_F(VmapAtomicWrite, ReplacesTheFileInOrder) {
  ASSERT_TRUE(writeFileAtomically(target_, kNewValue, Format::Binary, ops_).ok());
  Result<Value> back = readFile(target_);
  ASSERT_TRUE(back.ok());
  EXPECT_EQ(*back, kNewValue);
  EXPECT_EQ(dir_.names(), std::vector<std::string>{"Info.vmap"});
  const std::vector<FileStep> expected = {
      FileStep::OpenFile, FileStep::Write,         FileStep::Fsync,          FileStep::Close,
      FileStep::Rename,   FileStep::OpenDirectory, FileStep::FsyncDirectory, FileStep::Close};
  EXPECT_EQ(ops_.steps(), expected);
}

struct Fault {
  FileStep step;
  int err;
  PartialWrite partial = PartialWrite::No;
};

class VmapAtomicWriteFault : public VmapAtomicWrite, public ::testing::WithParamInterface<Fault> {};

TEST_P(VmapAtomicWriteFault, OldFileSurvivesAndTemporaryIsRemoved) {
  const Fault fault = GetParam();
  ops_.failAt(fault.step, fault.err, 1, fault.partial);
  Status status = writeFileAtomically(target_, kNewValue, Format::Xml, ops_);
  ASSERT_TRUE(ops_.fired());
  ASSERT_FALSE(status.ok());
  EXPECT_TRUE(status.error().is(kPosixErrorDomain, fault.err)) << status.error().description();
  EXPECT_TRUE(status.error().description().starts_with(target_ + ": ")) << status.error().description();
  expectOldFileAloneRemains();
}

INSTANTIATE_TEST_SUITE_P(
    VmapEveryStepBeforeTheRename, VmapAtomicWriteFault,
    ::testing::Values(Fault{FileStep::OpenFile, ENOSPC}, Fault{FileStep::Write, EIO, PartialWrite::Yes},
                      Fault{FileStep::Fsync, EIO}, Fault{FileStep::Rename, EIO}),
    [](const auto& info) { return std::string(fileStepName(info.param.step)); });

// After the rename the new contents are in place; the failure to make the
// rename durable is still reported.
TEST_F(VmapAtomicWrite, DirectoryFsyncFailureIsReportedAfterTheRename) {
  ops_.failAt(FileStep::FsyncDirectory, EIO);
  Status status = writeFileAtomically(target_, kNewValue, Format::Xml, ops_);
  ASSERT_FALSE(status.ok());
  EXPECT_TRUE(status.error().is(kPosixErrorDomain, EIO));
  EXPECT_EQ(*readFile(target_), kNewValue);
  EXPECT_EQ(dir_.names(), std::vector<std::string>{"Info.vmap"});
  EXPECT_EQ(ops_.steps().back(), FileStep::Close);  // the directory is closed all the same
}

TEST_F(VmapAtomicWrite, RefusalsTouchNoFile) {
  Status unwritable = writeFileAtomically(target_, Value(Array{Value()}), Format::Xml, ops_);
  ASSERT_FALSE(unwritable.ok());
  EXPECT_TRUE(testing::hasCode(unwritable.error(), ErrorCode::NotRepresentable));
  EXPECT_TRUE(unwritable.error().description().starts_with(target_ + ": "));
  for (const char* bad : {"Info.vmap", "", "/tmp/.."}) {
    Status status = writeFileAtomically(bad, kNewValue, Format::Xml, ops_);
    ASSERT_FALSE(status.ok()) << bad;
    EXPECT_TRUE(testing::hasCode(status.error(), ErrorCode::InvalidArgument)) << bad;
  }
  EXPECT_TRUE(ops_.steps().empty());
  expectOldFileAloneRemains();
}

}  // namespace
}  // namespace platform::vmap
