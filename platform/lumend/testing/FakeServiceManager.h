// A ServiceManager for tests of its callers: it records every addition and
// removal, answers additions with a set result, and replies to removals with
// the result set for the bundle identifier (ESRCH by default) on the
// caller's queue, at once or, while replies are held, only when the test
// releases them.
//
// Thread safety: safe from any thread.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/lumend/ServiceManager.h"

namespace platform::lumend {

class FakeServiceManager final : public ServiceManager {
 public:
  struct Addition {
    int hostPid = 0;
    std::string executablePath;
    Dictionary overlay;
  };
  struct Removal {
    std::string bundleIdentifier;
    std::string version;
  };

  void setAdditionResult(int error);
  void setRemovalResult(const std::string& bundleIdentifier, int error);
  // While held, removal replies wait for releaseReplies().
  void holdReplies();
  // Sends every held reply and stops holding. The number sent.
  std::size_t releaseReplies();

  int addExternalService(int hostPid, const std::string& executablePath,
                         const Dictionary& overlay) override;
  void removeExternalService(const std::string& bundleIdentifier, const std::string& version,
                             std::shared_ptr<dispatch::Queue> queue, RemovalReply reply) override;

  std::vector<Addition> additions() const;
  std::vector<Removal> removals() const;
  // Removal replies sent so far.
  std::size_t repliesSent() const;

 private:
  struct Pending {
    std::shared_ptr<dispatch::Queue> queue;
    RemovalReply reply;
    int error;
  };
  void send(Pending pending);

  mutable std::mutex mu_;
  int additionResult_ = 0;
  std::map<std::string, int> removalResults_;
  bool holding_ = false;
  std::vector<Pending> held_;
  std::vector<Addition> additions_;
  std::vector<Removal> removals_;
  std::size_t sent_ = 0;
};

}  // namespace platform::lumend
