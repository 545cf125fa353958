// Package installs into the fake registry: a hostile or broken archive is refused as a bad
// package with nothing written, and the SINF bytes of the options decide the record's
// hasMIDBasedSINF. Good archives and bundle folders install in the coordinated-install scenario.
#include <gtest/gtest.h>

#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "platform/bundle_keys.h"
#include "platform/fake/fake_ar.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"
#include "support/text_file.h"
#include "support/zip_archive.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using testing::ZipEntry;
using Kind = ZipEntry::Kind;

constexpr std::int64_t kBadPackage = 2;

std::string infoPlist(const std::string& id, const std::string& version) {
  return *plist::writeXml(plist::Dict{{std::string(kBNBundleIdentifierKey), id},
                                      {std::string(kBNBundleVersionKey), version}});
}

plist::Dict packageOptions(const std::string& id) {
  return {{std::string(ARPackageTypeKey), std::string(ARPackageTypeCustomer)},
          {std::string(kBNBundleIdentifierKey), id}};
}

// Every file and folder below `dir`, relative to it, with a file's bytes ("" for a folder).
std::map<std::string, std::string> tree(const fs::path& dir) {
  std::map<std::string, std::string> out;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
    out[fs::relative(it->path(), dir).string()] =
        it->is_regular_file() ? testing::readText(it->path()) : "";
  }
  return out;
}

class FakeARPackageTest : public ::testing::Test {
 protected:
  testing::TempDir root;      // the device
  testing::TempDir packages;  // where packages are delivered from
  FakeARWorkspace registry{root.path()};
};

TEST_F(FakeARPackageTest, ABadPackageIsRefusedAndWritesNothing) {
  const std::string info = infoPlist("com.game", "2.0");
  const ZipEntry plistEntry{"Game.app/Info.plist", info};
  struct Case {
    const char* name;
    std::vector<ZipEntry> entries;  // written as an archive unless `raw` is set
    std::string raw{};
    fake_ar::ArchiveLimits limits{};
  };
  const Case cases[] = {
      {"a name leading up", {plistEntry, {"../../../../escaped", "x"}}},
      {"a name leading up from inside the bundle", {plistEntry, {"Game.app/../../escaped", "x"}}},
      {"an absolute name", {plistEntry, {"/escaped", "x"}}},
      {"a symbolic link", {plistEntry, {"Game.app/link", "/etc", Kind::Link}}},
      {"two bundles", {plistEntry, {"Other.app/Info.plist", info}}},
      {"a file beside the bundle", {plistEntry, {"stray", "x"}}},
      {"no bundle folder", {{"Game/Info.plist", info}}},
      {"an empty archive", {}, std::string("PK\x05\x06", 4) + std::string(18, '\0')},
      {"not an archive", {}, "PK\x03\x04 these bytes are no archive"},
      {"more bytes than allowed",
       {plistEntry, {"Game.app/big", std::string(4000, '\0')}},
       "",
       {.maxTotalBytes = 3000, .maxEntries = 100}},
      {"more entries than allowed",
       {plistEntry, {"Game.app/a", "1"}, {"Game.app/b", "2"}, {"Game.app/c", "3"}},
       "",
       {.maxTotalBytes = 1 << 20, .maxEntries = 3}},
  };
  // Each case on a device without the application, then on one where it is installed.
  for (bool installedBefore : {false, true}) {
    testing::TempDir device;
    FakeARWorkspace ar(device.path());
    if (installedBefore) {
      testing::writeZip(packages / "Good.zip", {plistEntry});
      ASSERT_TRUE(
          ar.installApplication(packages / "Good.zip", packageOptions("com.game"), nullptr));
    }
    const auto deviceBefore = tree(device.path());
    const auto recordBefore = ar.application("com.game");
    for (const Case& c : cases) {
      SCOPED_TRACE(std::string(c.name) + (installedBefore ? ", installed before" : ""));
      const std::string archive = packages / "Game.zip";
      c.raw.empty() ? testing::writeZip(archive, c.entries) : testing::writeText(archive, c.raw);
      ar.setArchiveLimits(c.limits);
      ErrorRef error;
      EXPECT_FALSE(ar.installApplication(archive, packageOptions("com.game"), &error));
      ASSERT_TRUE(error);
      EXPECT_EQ(error->domain, kAppRegistryErrorDomain);
      EXPECT_EQ(error->code, kBadPackage) << error->describe();
      EXPECT_EQ(tree(device.path()), deviceBefore);
      EXPECT_EQ(ar.application("com.game"), recordBefore);
      EXPECT_FALSE(fileExists(packages / "escaped"));
    }
  }
  // Neither a bundle folder nor an archive.
  writeFileAtomically(packages / "stray-file", plist::Bytes{1, 2, 3});
  for (const std::string& path : {packages / "Missing.zip", packages / "stray-file"}) {
    ErrorRef error;
    EXPECT_FALSE(registry.installApplication(path, packageOptions("com.game"), &error));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, kBadPackage) << path;
  }
}

TEST_F(FakeARPackageTest, TheOptionsSINFBytesMarkTheRecord) {
  struct Case {
    const char* name;
    std::optional<bool> before;        // the record's mark before the install; none: new
    std::optional<plist::Bytes> sinf;  // ApplicationSINF in the options
    bool expected;
  };
  const Case cases[] = {
      {"an update without SINF keeps the mark", true, std::nullopt, true},
      {"an update with empty SINF clears it", true, plist::Bytes{}, false},
      {"an update with SINF sets it", false, plist::Bytes{1}, true},
  };
  testing::writeZip(packages / "Game.zip", {{"Game.app/Info.plist", infoPlist("com.game", "1")}});
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    registry.removeApplication("com.game");
    if (c.before) registry.putApplication({.identifier = "com.game", .hasMIDBasedSINF = *c.before});
    plist::Dict options = packageOptions("com.game");
    if (c.sinf) options.set(std::string(ARApplicationSINFKey), *c.sinf);
    ASSERT_TRUE(registry.installApplication(packages / "Game.zip", options, nullptr));
    EXPECT_EQ(registry.application("com.game")->hasMIDBasedSINF, c.expected);
    EXPECT_EQ(registry.applicationProxyForIdentifier("com.game", false)->hasMIDBasedSINF,
              c.expected);
  }
}

}  // namespace
}  // namespace appsync
