#include <gtest/gtest.h>

#include <cerrno>

#include "platform/values/Result.h"

namespace platform {
namespace {

TEST(ErrorTest, DescriptionLivesInUserInformation) {
  Error bare("Quorvex", 9);
  EXPECT_FALSE(bare.userInfo());
  EXPECT_EQ(bare.description(), "The operation couldn't be completed. (Quorvex error 9.)");

  Error described("Quorvex", 4, "invalid request format");
  ASSERT_TRUE(described.userInfo());
  EXPECT_EQ(described.userInfo()->get(kLocalizedDescriptionKey), Value("invalid request format"));
  EXPECT_EQ(described.description(), "invalid request format");
  EXPECT_FALSE(described.is("POSIX", 4));
}

TEST(ErrorTest, PosixErrorsCarryErrnoAndContext) {
  Error e = Error::posix(ENOENT, "open /nowhere");
  EXPECT_EQ(e.domain(), kPosixErrorDomain);
  EXPECT_EQ(e.code(), ENOENT);
  EXPECT_EQ(e.description(), "open /nowhere: No such file or directory");
}

}  // namespace
}  // namespace platform
