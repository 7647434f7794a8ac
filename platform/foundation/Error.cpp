#include "platform/foundation/Error.h"

namespace kx {

std::shared_ptr<const Error> Error::make(std::string domain, std::int64_t code,
                                         std::string message) {
  Value userInfo;
  if (!message.empty()) {
    userInfo = Value::dictionary({{kErrorMessageKey, Value::string(message)}});
  }
  return std::make_shared<const Error>(std::move(domain), code, std::move(userInfo));
}

std::string Error::message() const {
  const Value text = userInfo_[kErrorMessageKey];
  return text.isString() ? std::string(text.stringValue()) : std::string();
}

std::string Error::description() const {
  std::string result = "Error Domain=" + domain_ + " Code=" + std::to_string(code_);
  const std::string text = message();
  if (!text.empty()) result += " \"" + text + "\"";
  return result;
}

}  // namespace kx
