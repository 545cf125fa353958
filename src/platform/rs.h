// The device-restriction service.
#pragma once

#include <string>
#include <string_view>

namespace appsync {

inline constexpr std::string_view RSFeatureAppInstallationAllowed = "allowAppInstallation";
inline constexpr std::string_view RSFeatureAppRemovalAllowed = "allowAppRemoval";

// Answers of effectiveBoolValueForSetting.
inline constexpr int RSRestrictedBoolNoData = 0;
inline constexpr int RSRestrictedBoolExplicitYes = 1;
inline constexpr int RSRestrictedBoolExplicitNo = 2;

class RSProfileConnection {
 public:
  virtual ~RSProfileConnection() = default;
  // The effective value of a boolean restriction setting; safe from any thread.
  virtual int effectiveBoolValueForSetting(std::string_view setting) = 0;
};

}  // namespace appsync
