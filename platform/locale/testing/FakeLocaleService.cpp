#include "platform/locale/testing/FakeLocaleService.h"

#include <algorithm>

namespace platform::locale {

FakeLocaleService::FakeLocaleService(std::string locale) { state_->locale = std::move(locale); }

void FakeLocaleService::setLocale(std::string locale) {
  std::vector<std::shared_ptr<Observer>> observers;
  {
    std::lock_guard<std::mutex> lock(state_->mu);
    if (state_->locale == locale) return;
    state_->locale = locale;
    observers = state_->observers;
  }
  for (const auto& observer : observers) {
    observer->queue->async([observer, locale] { observer->callback(locale); });
  }
}

std::string FakeLocaleService::currentLocale() const {
  std::lock_guard<std::mutex> lock(state_->mu);
  return state_->locale;
}

Result<notify::ObservationHandle> FakeLocaleService::observeChanges(
    std::shared_ptr<dispatch::Queue> queue, LocaleCallback callback) {
  auto observer = std::make_shared<Observer>(Observer{std::move(queue), std::move(callback)});
  {
    std::lock_guard<std::mutex> lock(state_->mu);
    state_->observers.push_back(observer);
  }
  std::weak_ptr<State> weak = state_;
  return notify::ObservationHandle([weak, observer] {
    if (auto state = weak.lock()) {
      std::lock_guard<std::mutex> lock(state->mu);
      std::erase(state->observers, observer);
    }
  });
}

}  // namespace platform::locale
