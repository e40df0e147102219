// The child of the crash test: opens the store on the file named by its
// argument and adds one annotation after another, saving after each, until
// it is killed. "ready" on stdout after the first save tells the test that
// killing it now interrupts saves and not start-up.
#include <unistd.h>

#include <cstdio>
#include <memory>
#include <string>

#include "platform/container/testing/FakeContainerManager.h"
#include "qvd/QVDAnnotationStore.h"

namespace {

class Named final : public qvd::QVDAnnotated {
 public:
  explicit Named(std::string key) : key_(std::move(key)) {}
  std::string annotationKey() const override { return key_; }

 private:
  std::string key_;
};

}  // namespace

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: %s FILE\n", argv[0]);
    return 2;
  }
  auto made = qvd::QVDAnnotationStore::initWithDatabase(
      std::string(argv[1]), std::make_shared<platform::container::FakeContainerManager>());
  if (!made.ok()) {
    std::fprintf(stderr, "%s\n", made.error().description().c_str());
    return 1;
  }
  qvd::QVDAnnotationStore& store = **made;
  // Padding makes each file several pages long, so a kill can land in the
  // middle of writing one.
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
