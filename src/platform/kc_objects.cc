// The install-coordination service's plain data objects.
#include <string>

#include "platform/kc.h"

namespace appsync {

std::string KCPlaceholderAttributes::describe() const {
  return std::string("<KCPlaceholderAttributes bundleVersion=") +
         (bundleVersion_ ? *bundleVersion_ : std::string("(null)")) +
         " launchProhibited=" + (launchProhibited_ ? "1" : "0") +
         " infoPlist=" + plist::Value(infoPlist_).describe() + ">";
}

}  // namespace appsync
