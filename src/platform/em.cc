// The low-level installer's data objects: store metadata and install options.
#include "platform/em.h"

#include <string>

namespace appsync {

std::string EMStoreMetadata::describe() const {
  return "<EMStoreMetadata " + plist::Value(dictionary_).describe() + ">";
}

std::string EMInstallOptions::describe() const {
  return "<EMInstallOptions arInstallType=" + std::to_string(arInstallType_) +
         " installTargetType=" + std::to_string(installTargetType_) +
         " caravelMetadata=" + (metadata_ ? metadata_->describe() : std::string("(null)")) + ">";
}

}  // namespace appsync
