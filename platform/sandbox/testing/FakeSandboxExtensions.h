// A SandboxExtensions that records what it is asked and answers readable
// tokens ("fake;file;<path>", "fake;service;<class>;<name>") without a key.
// A test can make any operation, or the file extension of one path, fail
// with an errno value. Paths are taken as given: no canonicalisation.
//
// Thread safety: safe from any thread; every member takes the fake's lock.
#pragma once

#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/sandbox/SandboxExtensions.h"

namespace platform::sandbox {

enum class ExtensionOperation { IssueFile, IssueService, Consume, Release };

class FakeSandboxExtensions final : public SandboxExtensions {
 public:
  struct Issued {
    ExtensionOperation operation;
    std::string extensionClass;
    std::string subject;
    PathResolution resolution;  // AsGiven for service extensions
  };

  // From now on `operation` fails with `err`; 0 makes it succeed again.
  void setFailure(ExtensionOperation operation, int err);
  // The file extension of exactly `path` fails with `err`.
  void failPath(std::string path, int err);

  Result<std::string> issueFileExtension(std::string_view path,
                                         PathResolution resolution) const override;
  Result<std::string> issueServiceExtension(std::string_view extensionClass,
                                            std::string_view serviceName) const override;
  // Any token the fake could have issued is accepted; handles count from 1.
  Result<std::int64_t> consume(std::string_view token) override;
  Status release(std::int64_t handle) override;

  // Successful issues, in order.
  std::vector<Issued> issued() const;
  // Tokens consumed successfully, in order.
  std::vector<std::string> consumed() const;
  // Handles released successfully, in order.
  std::vector<std::int64_t> released() const;
  std::set<std::int64_t> liveHandles() const;

 private:
  std::optional<Error> failureLocked(ExtensionOperation operation) const;

  mutable std::mutex mu_;
  std::map<ExtensionOperation, int> failures_;
  std::map<std::string, int> pathFailures_;
  mutable std::vector<Issued> issued_;
  std::vector<std::string> consumed_;
  std::vector<std::int64_t> released_;
  std::set<std::int64_t> live_;
  std::int64_t next_ = 1;
};

}  // namespace platform::sandbox
