// The other process of the two-process tests: consumes each token given as
// an argument through LinuxSandboxExtensions under QV_ROOT, then releases
// what it got, and releases the first handle once more. One line each:
//   consume <handle> <kind> <subject>   |   consume errno <n>
//   release <handle> ok                 |   release <handle> errno <n>
#include <cstdio>
#include <vector>

#include "platform/sandbox/LinuxSandboxExtensions.h"

using namespace platform::sandbox;

namespace {

void release(LinuxSandboxExtensions& extensions, std::int64_t handle) {
  platform::Status released = extensions.release(handle);
  if (released.ok()) {
    std::printf("release %lld ok\n", static_cast<long long>(handle));
  } else {
    std::printf("release %lld errno %d\n", static_cast<long long>(handle),
                sandboxErrno(released.error()));
  }
}

}  // namespace

int main(int argc, char** argv) {
  LinuxSandboxExtensions extensions;
  std::vector<std::int64_t> handles;
  for (int i = 1; i < argc; ++i) {
    platform::Result<std::int64_t> handle = extensions.consume(argv[i]);
    if (!handle.ok()) {
      std::printf("consume errno %d\n", sandboxErrno(handle.error()));
      continue;
    }
    handles.push_back(*handle);
    std::optional<ExtensionGrant> grant = LinuxSandboxExtensions::grantForHandle(*handle);
    std::printf("consume %lld %s %s\n", static_cast<long long>(*handle),
                grant ? std::string(extensionKindName(grant->kind)).c_str() : "?",
                grant ? grant->subject.c_str() : "?");
  }
  for (std::int64_t handle : handles) release(extensions, handle);
  if (!handles.empty()) release(extensions, handles.front());
  return 0;
}
