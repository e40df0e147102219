// A locale service whose locale a test sets; observers hear of each change
// made through setLocale().
//
// Thread safety: safe from any thread.
#pragma once

#include <mutex>
#include <vector>

#include "platform/locale/LocaleService.h"

namespace platform::locale {

class FakeLocaleService final : public LocaleService {
 public:
  explicit FakeLocaleService(std::string locale = "en");

  // Changes the locale; observers are told when it differs from before.
  void setLocale(std::string locale);

  std::string currentLocale() const override;
  Result<notify::ObservationHandle> observeChanges(std::shared_ptr<dispatch::Queue> queue,
                                                   LocaleCallback callback) override;

 private:
  struct Observer {
    std::shared_ptr<dispatch::Queue> queue;
    LocaleCallback callback;
  };
  struct State {
    std::mutex mu;
    std::string locale;
    std::vector<std::shared_ptr<Observer>> observers;
  };
  const std::shared_ptr<State> state_ = std::make_shared<State>();
};

}  // namespace platform::locale
