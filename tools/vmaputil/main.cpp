#include <cstdio>
#include <string_view>
#include <vector>

#include "tools/vmaputil/VmapUtil.h"

int main(int argc, char** argv) {
  std::vector<std::string_view> args(argv + 1, argv + argc);
  return platform::vmap::runVmapUtil(args, stdout, stderr);
}
