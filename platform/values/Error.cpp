#include "platform/values/Error.h"

#include <cstring>

namespace platform {

Error::Error(std::string domain, std::int64_t code) : domain_(std::move(domain)), code_(code) {}

Error::Error(std::string domain, std::int64_t code, std::string description)
    : domain_(std::move(domain)), code_(code), userInfo_(Dictionary{}) {
  userInfo_->set(kLocalizedDescriptionKey, Value(std::move(description)));
}

Error::Error(std::string domain, std::int64_t code, Dictionary userInfo)
    : domain_(std::move(domain)), code_(code), userInfo_(std::move(userInfo)) {}

Error Error::posix(int err, std::string_view context) {
  char buf[256];
  // The GNU variant returns a pointer that may or may not be buf.
  const char* text = strerror_r(err, buf, sizeof buf);
  std::string message = context.empty() ? std::string(text)
                                        : std::string(context) + ": " + text;
  return Error(std::string(kPosixErrorDomain), err, std::move(message));
}

const std::string* Error::localizedDescription() const {
  if (!userInfo_) return nullptr;
  return userInfo_->get(kLocalizedDescriptionKey).string();
}

std::string Error::description() const {
  if (const std::string* d = localizedDescription()) return *d;
  return "The operation couldn't be completed. (" + domain_ + " error " + std::to_string(code_) +
         ".)";
}

}  // namespace platform
