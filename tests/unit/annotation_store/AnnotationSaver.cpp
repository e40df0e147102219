// The child of the crash test: adds annotations to the store at argv[1],
// saving after each, until killed; "ready" on stdout after the first save.
#include <unistd.h>

#include <cstdio>
#include <memory>
#include <string>

#include "platform/container/testing/FakeContainerManager.h"
#include "qvd/QVDAnnotationStore.h"

namespace {

struct Named final : qvd::QVDAnnotated {
  explicit Named(std::string k) : key(std::move(k)) {}
  std::string annotationKey() const override { return key; }
  std::string key;
};
}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) return 2;
  auto made = qvd::QVDAnnotationStore::initWithDatabase(
      std::string(argv[1]), std::make_shared<platform::container::FakeContainerManager>());
  if (!made.ok()) return 1;
  qvd::QVDAnnotationStore& store = **made;
  // Padding makes each file several pages long, so a kill can land mid-write.
  const std::string padding(512, 'x');
  bool announced = false;
  for (std::size_t n = store.annotations().size();; ++n) {
    platform::Dictionary extension{{"n", platform::Value(static_cast<long long>(n))},
                                   {"padding", platform::Value(padding)}};
    store.setAnnotationForPlugIn(
        platform::Dictionary{{"election", platform::Value(1)},
                             {"extension", platform::Value(std::move(extension))}},
        Named("p" + std::to_string(n)));
    if (!announced) {
      std::puts("ready");
      std::fflush(stdout);
      announced = true;
    }
  }
}
