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

// The shared connection to the restriction service. Safe from any thread.
class RSProfileConnection {
 public:
  RSProfileConnection() = default;
  virtual ~RSProfileConnection() = default;
  RSProfileConnection(const RSProfileConnection&) = delete;
  RSProfileConnection& operator=(const RSProfileConnection&) = delete;

  // The effective value of a boolean restriction setting, one of the answers above. Cannot
  // fail: a setting without a value answers RSRestrictedBoolNoData.
  virtual int effectiveBoolValueForSetting(std::string_view setting) = 0;
};

}  // namespace appsync
