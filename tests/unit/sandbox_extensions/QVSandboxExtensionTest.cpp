// The receiving side: QVSandboxExtension over the recording fake.
#include <gtest/gtest.h>

#include <cerrno>
#include <memory>
#include <string>
#include <vector>

#include "Quorvex/QVSandboxExtension.h"
#include "SandboxTestSupport.h"
#include "platform/sandbox/testing/FakeSandboxExtensions.h"

namespace {

using platform::log::Level;
using platform::sandbox::ExtensionOperation;
using platform::sandbox::FakeSandboxExtensions;

class QVSandboxExtensionTest : public ::testing::Test {
 protected:
  std::vector<platform::log::CapturedLine> sandboxLines() {
    std::vector<platform::log::CapturedLine> lines;
    for (auto& line : capture_.lines().lines()) {
      if (line.category == "sandbox") lines.push_back(line);
    }
    return lines;
  }

  sandbox_testing::VerboseCapture capture_;
  std::shared_ptr<FakeSandboxExtensions> fake_ = std::make_shared<FakeSandboxExtensions>();
  const std::string token_ = "fake;file;/Apps/A.app";
};

TEST_F(QVSandboxExtensionTest, ConsumeAndExpelEachActOnce) {
  auto extension = QVSandboxExtension::initWithExtension(token_, fake_);
  EXPECT_EQ(extension->handle(), -1);
  extension->consume();
  extension->consume();
  EXPECT_EQ(extension->handle(), 1);
  EXPECT_EQ(fake_->consumed(), std::vector<std::string>{token_});
  extension->expel();
  extension->expel();
  EXPECT_EQ(extension->handle(), -1);
  EXPECT_EQ(fake_->released(), std::vector<std::int64_t>{1});

  const auto lines = sandboxLines();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].message, "consuming extension " + token_ + " -> 1");
  EXPECT_EQ(lines[0].level, Level::Debug);
  EXPECT_EQ(lines[1].message, "releasing extension 1");
  EXPECT_EQ(lines[1].level, Level::Debug);
}

TEST_F(QVSandboxExtensionTest, RefusedTokenStaysUnconsumedAndMayBeRetried) {
  auto extension = QVSandboxExtension::initWithExtension(token_, fake_);
  fake_->setFailure(ExtensionOperation::Consume, EPERM);
  extension->consume();
  EXPECT_EQ(extension->handle(), -1);
  fake_->setFailure(ExtensionOperation::Consume, 0);
  extension->consume();
  EXPECT_EQ(extension->handle(), 1);

  const auto lines = sandboxLines();
  ASSERT_GE(lines.size(), 1u);
  EXPECT_EQ(lines[0].message, "failed to consume extension " + token_ + " - errno=1");
  EXPECT_EQ(lines[0].level, Level::Default);
}

}  // namespace
