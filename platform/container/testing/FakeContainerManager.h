// A ContainerManager that names containers under a base directory without
// touching the disk, records what was asked, and can be told to fail. The
// same identifiers are refused as by the real manager.
//
// Thread safety: safe from any thread; calls are serialised.
#pragma once

#include <sys/types.h>

#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "platform/container/ContainerManager.h"

namespace platform::container {

class FakeContainerManager final : public ContainerManager {
 public:
  explicit FakeContainerManager(std::string baseDirectory = "/fake/containers/User");

  // Every later request fails with `error` (none: succeed again).
  void setFailure(std::optional<Error> error);
  // The (uid, identifier) pairs asked for so far, refused ones included.
  std::vector<std::pair<uid_t, std::string>> requests() const;

  Result<std::string> userContainer(uid_t uid, std::string_view identifier) override;

 private:
  const std::string base_;
  mutable std::mutex mu_;
  std::optional<Error> failure_;
  std::vector<std::pair<uid_t, std::string>> requests_;
};

}  // namespace platform::container
