#include <gtest/gtest.h>

#include <cerrno>

#include "platform/root/Root.h"
#include "platform/values/Result.h"

namespace platform {
namespace {

TEST(ErrorTest, DescriptionLivesInUserInformation) {
  Error bare("Quorvex", 9);
  EXPECT_EQ(bare.code(), 9);
  EXPECT_EQ(bare.domain(), "Quorvex");
  EXPECT_FALSE(bare.userInfo());
  EXPECT_EQ(bare.localizedDescription(), nullptr);
  EXPECT_EQ(bare.description(), "The operation couldn't be completed. (Quorvex error 9.)");

  Error described("Quorvex", 4, "invalid request format");
  ASSERT_TRUE(described.userInfo());
  EXPECT_EQ(described.userInfo()->get(kLocalizedDescriptionKey), Value("invalid request format"));
  EXPECT_EQ(described.description(), "invalid request format");
  EXPECT_TRUE(described.is("Quorvex", 4));
  EXPECT_FALSE(described.is("POSIX", 4));
}

TEST(ErrorTest, PosixErrorsCarryErrnoAndContext) {
  Error e = Error::posix(ENOENT, "open /nowhere");
  EXPECT_EQ(e.domain(), kPosixErrorDomain);
  EXPECT_EQ(e.code(), ENOENT);
  EXPECT_EQ(e.description(), "open /nowhere: No such file or directory");
}

Result<int> parsePositive(int v) {
  if (v <= 0) return Error("test", 1, "not positive");
  return v;
}

TEST(ResultTest, HoldsValueOrError) {
  auto good = parsePositive(3);
  ASSERT_TRUE(good.ok());
  EXPECT_EQ(*good, 3);
  auto bad = parsePositive(-1);
  ASSERT_FALSE(bad.ok());
  EXPECT_EQ(bad.error().description(), "not positive");
  EXPECT_EQ(bad.valueOr(7), 7);
  Status s = Error("test", 2);
  EXPECT_FALSE(s.ok());
  EXPECT_TRUE(okStatus().ok());
}

TEST(RootTest, PathsLieUnderTheRoot) {
  std::string saved = rootDirectory();
  setRootDirectoryForTesting("/tmp/r/");
  EXPECT_EQ(rootPath("var/db/x"), "/tmp/r/var/db/x");
  EXPECT_EQ(rootPath("/etc/a"), "/tmp/r/etc/a");
  setRootDirectoryForTesting("/");
  EXPECT_EQ(rootPath("var/db/x"), "/var/db/x");
  setRootDirectoryForTesting(saved);
}

}  // namespace
}  // namespace platform
