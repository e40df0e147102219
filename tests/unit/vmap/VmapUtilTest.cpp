// The built vmaputil, run as a user would: its output and exit statuses.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdlib>

#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

class VmapUtil : public ::testing::Test {
 protected:
  struct Run {
    int status;
    std::string out, err;
  };

  // Runs vmaputil in the scratch directory, so that relative paths work.
  Run run(const std::string& arguments) {
    const std::string command = "cd " + dir_.path() + " && " VMAPUTIL_PATH " " + arguments +
                                " >" + dir_.file(".out") + " 2>" + dir_.file(".err");
    const int raw = std::system(command.c_str());
    return {WIFEXITED(raw) ? WEXITSTATUS(raw) : -1, testing::readAll(dir_.file(".out")),
            testing::readAll(dir_.file(".err"))};
  }

  void SetUp() override {
    testing::writeText(dir_.file("Info.vmap"),
                       "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n<dict>\n"
                       "\t<key>Bundle</key>\n\t<dict>\n\t\t<key>Name</key>\n\t\t<string>Demo</string>\n"
                       "\t\t<key>Tags</key>\n\t\t<array>\n\t\t\t<string>x</string>\n\t\t\t<integer>5</integer>\n"
                       "\t\t</array>\n"
                       "\t</dict>\n</dict>\n</vmap>\n");
    testing::writeText(dir_.file("Bad.vmap"),
                       "<vmap version=\"1.0\">\n<dict>\n  <key>a</key>\n  <strnig/>\n</dict></vmap>");
  }

  testing::ScratchDirectory dir_;
};

TEST_F(VmapUtil, PrintAndGet) {
  Run r = run("print Info.vmap");
  EXPECT_EQ(r.status, 0) << r.err;
  EXPECT_EQ(r.out, "{\n    Bundle = {\n        Name = Demo;\n        Tags = (\n            x,\n"
                   "            5\n        );\n    };\n}\n");
  r = run("get Info.vmap Bundle.Tags.1");
  EXPECT_EQ(r.out, "5\n");
  r = run("get Info.vmap Bundle.Missing");
  EXPECT_EQ(r.status, 1);
  EXPECT_EQ(r.err, "Info.vmap: no value at Bundle.Missing\n");
  r = run("lint Info.vmap Bad.vmap Absent.vmap");
  EXPECT_EQ(r.status, 1);
  EXPECT_EQ(r.out, "Info.vmap: OK\n");
  EXPECT_EQ(r.err, "Bad.vmap:4:3: unknown element <strnig>\n"
                   "Absent.vmap: No such file or directory\n");
}

TEST_F(VmapUtil, UsageErrorsExitTwo) {
  for (const char* args : {"", "convert --to yaml Info.vmap", "get Info.vmap"}) {
    Run r = run(args);
    EXPECT_EQ(r.status, 2) << args;
    EXPECT_NE(r.err.find("usage: vmaputil "), std::string::npos) << args;
  }
}

}  // namespace
}  // namespace platform::vmap
