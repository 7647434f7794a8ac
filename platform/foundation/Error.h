#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/foundation/Value.h"

namespace kx {

// An error value as it leaves an operation through an out-parameter (ErrorPtr*, which may be null:
// the caller does not want to know). Immutable, shared, safe from any thread.
class Error {
 public:
  Error(std::string domain, std::int64_t code, Value userInfo = Value())
      : domain_(std::move(domain)), code_(code), userInfo_(std::move(userInfo)) {}

  // An error whose user information holds one text for people under kErrorMessageKey.
  static std::shared_ptr<const Error> make(std::string domain, std::int64_t code,
                                           std::string message = {});

  const std::string& domain() const { return domain_; }
  std::int64_t code() const { return code_; }
  // A dictionary or null.
  const Value& userInfo() const { return userInfo_; }
  // The text under kErrorMessageKey, or "".
  std::string message() const;
  // `Error Domain=<domain> Code=<code> "<message>"`, the quoted part only when there is a message.
  std::string description() const;

 private:
  std::string domain_;
  std::int64_t code_;
  Value userInfo_;
};

using ErrorPtr = std::shared_ptr<const Error>;

inline constexpr const char* kErrorMessageKey = "message";
// What an error came from: a dictionary with the "domain" and "code" of that error.
inline constexpr const char* kUnderlyingErrorKey = "underlyingError";
// POSIX errors carry errno as their code.
inline constexpr const char* kPosixErrorDomain = "POSIX";

// Stores the error when the caller wants it.
inline void setError(ErrorPtr* out, ErrorPtr error) {
  if (out != nullptr) *out = std::move(error);
}

}  // namespace kx
