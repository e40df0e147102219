// The locale of a Linux system: the LANG line of <root>/etc/locale.conf,
// read afresh on every question; without one, the process's LANG; else
// "en". Changes are noticed through inotify on <root>/etc, so that a file
// replaced by rename (as editors and tools write it) is seen too.
//
// Thread safety: safe from any thread; each observation runs its callbacks
// in order on the queue it was given.
#pragma once

#include <optional>
#include <string>

#include "platform/locale/LocaleService.h"

namespace platform::locale {

class LinuxLocaleService final : public LocaleService {
 public:
  // The configuration under the platform root; the fallback is this
  // process's LANG as it is now.
  LinuxLocaleService();
  // REQUIRES: configDirectory is absolute.
  LinuxLocaleService(std::string configDirectory, std::optional<std::string> processLang);

  std::string currentLocale() const override;
  Result<notify::ObservationHandle> observeChanges(std::shared_ptr<dispatch::Queue> queue,
                                                   LocaleCallback callback) override;

  // locale.conf is a few lines; anything longer is not one.
  static constexpr std::size_t kMaxConfigBytes = 4096;

 private:
  const std::string configDirectory_;
  const std::optional<std::string> processLang_;
};

}  // namespace platform::locale
