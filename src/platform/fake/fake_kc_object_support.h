// What the objects of the fake install-coordination service share: asking the service for a
// scripted failure, reporting a failure, and single-line descriptions.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "runtime/error.h"
#include "platform/fake/fake_kc_service_hooks.h"

namespace appsync::fake_kc {

// The scripted failure of `operation`, or null (also once the service is gone).
inline ErrorRef scripted(const std::weak_ptr<FakeKCServiceHooks>& service,
                         std::string_view operation) {
  if (auto s = service.lock()) return s->scriptedFailure(operation);
  return nullptr;
}

// Hands `error` to the caller's out parameter; false, for returning.
inline bool fail(ErrorRef* out, ErrorRef error) {
  setError(out, std::move(error));
  return false;
}

// Descriptions are single-line whatever names and paths contain.
inline std::string oneLine(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    if (c == '\n') {
      out += "\\n";
    } else if (c == '\r') {
      out += "\\r";
    } else {
      out += c;
    }
  }
  return out;
}

inline const char* yesNo(bool b) { return b ? "YES" : "NO"; }

}  // namespace appsync::fake_kc
