// What the install queue tests set up: delivered packages, the todo list and the assets.
#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "platform/fake/fake_platform.h"
#include "platform/tr.h"
#include "runtime/fs/files.h"

namespace appsync::testing {

// A delivered bundle folder for `identifier` under ROOT/staging; its path.
inline std::string writePackage(const std::filesystem::path& root, const std::string& identifier) {
  const std::string bundle = (root / "staging" / (identifier + ".app")).string();
  EXPECT_TRUE(createDirectories(bundle));
  EXPECT_TRUE(writePlistAtomically(bundle + "/Info.plist",
                                   plist::Dict{{"BNBundleIdentifier", identifier}},
                                   plist::Format::Binary));
  return bundle;
}

// A todo list with one "install" record per identifier.
inline void writeTodoList(FakePlatform& device, const std::vector<std::string>& identifiers) {
  plist::Array records;
  for (const auto& id : identifiers) {
    records.emplace_back(plist::Dict{{"identifier", id}, {"operation", "install"}});
  }
  ASSERT_TRUE(createDirectories(device.paths().syncFolder()));
  ASSERT_TRUE(writePlistAtomically(device.paths().todoList(), records, plist::Format::Binary));
}

inline std::shared_ptr<TRAsset> makeAsset(const std::string& identifier, const std::string& path,
                                          bool restore = false) {
  auto asset = TRAsset::downloadAssetWithIdentifier(identifier, "Application", std::nullopt);
  asset->setPath(path);
  asset->setIsRestore(restore);
  return asset;
}

}  // namespace appsync::testing
