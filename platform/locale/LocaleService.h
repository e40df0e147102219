// The system's current locale, and notice when it changes: the daemon shows
// plug-in names in the user's language and drops what it cached in another
// one. LinuxLocaleService reads <root>/etc/locale.conf; testing/
// FakeLocaleService answers what a test sets.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/dispatch/Queue.h"
#include "platform/notify/ObservationHandle.h"
#include "platform/values/Result.h"

namespace platform::locale {

// Receives the new locale ("de_CH", "en").
using LocaleCallback = std::function<void(const std::string& locale)>;

class LocaleService {
 public:
  virtual ~LocaleService() = default;

  // The locale as it is now, without encoding or modifier: "de_DE", "fr",
  // "en" when nothing says otherwise.
  virtual std::string currentLocale() const = 0;

  // Runs `callback` on `queue` with the new locale each time it changes
  // after this call, until the handle is cancelled.
  // REQUIRES: queue and callback are not null.
  virtual Result<notify::ObservationHandle> observeChanges(std::shared_ptr<dispatch::Queue> queue,
                                                           LocaleCallback callback) = 0;
};

}  // namespace platform::locale
