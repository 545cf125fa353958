// Construction and description of errors.
#include "runtime/error.h"

#include <cstring>

namespace appsync {

std::string Error::describe() const {
  std::string out = "Error Domain=" + domain + " Code=" + std::to_string(code);
  if (const std::string* text = plist::stringAt(userInfo, kErrorDescriptionKey)) {
    out += " \"" + *text + "\"";
  }
  if (!userInfo.empty()) out += " UserInfo=" + plist::Value(userInfo).describe();
  if (underlying) out += " (underlying: " + underlying->describe() + ")";
  return out;
}

ErrorRef makeError(std::string_view domain, std::int64_t code) {
  auto e = std::make_shared<Error>();
  e->domain = std::string(domain);
  e->code = code;
  return e;
}

ErrorRef makeError(std::string_view domain, std::int64_t code, std::string_view description,
                   std::string_view path) {
  auto e = std::make_shared<Error>();
  e->domain = std::string(domain);
  e->code = code;
  e->userInfo.set(std::string(kErrorDescriptionKey), std::string(description));
  if (!path.empty()) e->userInfo.set(std::string(kErrorPathKey), std::string(path));
  return e;
}

ErrorRef makePOSIXError(int err, std::string_view path) {
  return makeError(kPOSIXErrorDomain, err, std::strerror(err), path);
}

}  // namespace appsync
