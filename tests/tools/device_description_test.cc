// Devices made from descriptions: each application recorded as a real install records it, the
// device-wide facts where the plugin reads them, bad descriptions refused where they are wrong,
// and `device init` as a command.
#include "device_description.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <string>

#include "bundle_maker.h"
#include "platform/ar.h"
#include "platform/bundle_keys.h"
#include "platform/icon/home_screen_icon_service.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/host_process.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync::host {
namespace {

namespace fs = std::filesystem;
using AppRecord = FakeARWorkspace::AppRecord;

// Placeholders, system apps, store metadata, restrictions, restore data, the host daemon, the
// icon order, the last sync and the uninstalled list are read by the plugin in the scenarios
// (sync-coordinated, reporting, sync-legacy, demo and others); the rest is shown here.
constexpr std::string_view kDescription = R"(apps:
  - identifier: com.a.notes
    name: Notes
    version: 1.0
    installType: storeDownload
    hasMIDBasedSINF: true
demotedApps: {AutomaticDowngrades: [com.a.later]}
)";

// The record with its paths made relative to `root`, and without the options of the install
// that made it (a described application had none).
AppRecord relative(AppRecord record, const fs::path& root) {
  for (auto* path : {&record.bundleDirectory, &record.containerDirectory, &record.iconPath}) {
    if (*path) *path = fs::path(**path).lexically_relative(root).generic_string();
  }
  record.lastInstallOptions = {};
  return record;
}

std::string show(const AppRecord& r) {
  const auto text = [](const std::optional<std::string>& s) { return s.value_or("-"); };
  return r.identifier + " " + r.applicationType + " " + text(r.version) + " " + text(r.name) +
         " type " + std::to_string(r.installType) + (r.isPlaceholder ? " placeholder " : " ") +
         text(r.bundleDirectory) + " in " + text(r.containerDirectory) + " icon " +
         text(r.iconPath) + " disk " +
         (r.staticDiskUsage ? std::to_string(*r.staticDiskUsage) : "-") +
         (r.hasMIDBasedSINF ? " sinf" : "");
}

// The records of a device, paths relative to its root, one line each in the registry's order.
std::vector<std::string> recordsOf(DeviceSession& session) {
  std::vector<std::string> out;
  for (const AppRecord& app : session.device().ar().applications()) {
    out.push_back(show(relative(app, session.root())));
  }
  return out;
}

TEST(DeviceDescriptionTest, EverythingDescribedIsWhereThePluginReadsIt) {
  testing::TempDir root;
  const YamlField description = YamlField::loadText(kDescription, "d.yaml");
  auto session = DeviceSession::create(root.path(), deviceOptions(&description));
  applyDescription(*session, &description);

  // The same Notes installed as a package on another device: the described one must not differ.
  testing::TempDir other;
  FakeARWorkspace installer(other.path());
  const fs::path package =
      makeBundle(other.path(), other.path() / "in",
                 {.identifier = "com.a.notes", .name = "Notes", .version = "1.0"});
  const plist::Dict install{{std::string(kBNBundleIdentifierKey), "com.a.notes"},
                            {std::string(ARInstallTypeKey), plist::Integer::fromUnsigned(1)}};
  ASSERT_TRUE(installer.installApplication(package.string(), install, nullptr));
  AppRecord installedNotes = relative(*installer.application("com.a.notes"), other.path());
  installedNotes.hasMIDBasedSINF = true;

  EXPECT_EQ(recordsOf(*session), std::vector<std::string>{show(installedNotes)});
  EXPECT_EQ(plist::parse(readFile(session->paths().demotedApps()).value_or(plist::Bytes{})),
            plist::Value(plist::Dict{{"AutomaticDowngrades", plist::Array{"com.a.later"}}}));
}

TEST(DeviceDescriptionErrorsTest, BadDescriptionsNameTheLineAndTheField) {
  struct Row {
    std::string document;
    std::string error;
  };
  const Row rows[] = {
      {"apps:\n  - identifier: com.a\n  - identifier: com.b\n  - identifier: com.a\n",
       "d.yaml:4: apps[2].identifier: \"com.a\" is described twice"},
      {"apps:\n  - identifier: ../../etc\n", "d.yaml:2: apps[0].identifier: \"../../etc\" cannot"},
      {"apps:\n  - identifier: com.a\n    name: ../A\n", "d.yaml:3: apps[0].name: \"../A\" cannot"},
      {"apps:\n  - identifier: com.a\n    installType: bought\n",
       "d.yaml:3: apps[0].installType: expected a number or one of"},
      {"- road: legacy\n", "d.yaml:1: a device description is a mapping"},
  };
  // Reading the options reads everything: bad input is found before a device exists.
  for (const Row& row : rows) {
    EXPECT_THAT(
        [&] {
          const YamlField description = YamlField::loadText(row.document, "d.yaml");
          deviceOptions(&description);
        },
        ::testing::ThrowsMessage<InputError>(::testing::StartsWith(row.error)))
        << row.document;
  }
}

// Packed bundles install in the scenarios (coordinated-install, host-computer-staging).
TEST(BundleMakerTest, BundlesRenderAndStayUnderTheRoot) {
  testing::TempDir root;
  const BundleFacts facts{.identifier = "com.a.notes", .name = "Notes", .version = "3"};
  const fs::path bundle = makeBundle(root.path(), root.path() / "b", facts);
  EXPECT_EQ(bundle, root.path() / "b" / "Notes.app");
  std::string why;
  EXPECT_TRUE(renderIconPng(bundle.string(), 57, &why)) << why;

  // Nothing outside the root, and no link packed or written through.
  testing::TempDir outside;
  EXPECT_THROW(makeBundle(root.path(), root.path() / ".." / "x", facts), std::runtime_error);
  EXPECT_THROW(makeBundle(root.path(), root.path() / "b",
                          {.identifier = "x", .name = "../x", .version = "1"}),
               std::runtime_error);
  fs::create_directory_symlink(outside.path(), root.path() / "link");
  EXPECT_THROW(makeBundle(root.path(), root.path() / "link", facts), std::runtime_error);
  EXPECT_TRUE(fs::is_empty(outside.path()));
  fs::create_symlink(outside.path(), bundle / "escape");
  EXPECT_THROW(zipBundle(root.path(), bundle, root.path() / "Again.zip"), std::runtime_error);
  EXPECT_FALSE(fs::exists(root.path() / "Again.zip"));
}

TEST(DeviceInitCommandTest, MakesSavesAndRefusesDevices) {
  const char* host = std::getenv("APPSYNC_HOST");
  const char* source = std::getenv("APPSYNC_SOURCE_DIR");
  ASSERT_TRUE(host && source) << "APPSYNC_HOST and APPSYNC_SOURCE_DIR are set by the build";
  const fs::path examples = fs::path(source) / "tests" / "scenarios" / "devices";
  testing::TempDir dir;
  const auto init = [&](const std::string& root, const std::string& from) {
    return testing::runHost(host,
                            "device init --root '" + (dir / root) + "'" +
                                (from.empty() ? "" : " --from '" + from + "'"),
                            dir.path());
  };

  // Each example as a command makes it, and a later command loads the records the description
  // gives.
  for (const std::string name : {"default.yaml", "coordinated-daemon.yaml", "legacy-road.yaml"}) {
    const testing::HostRun made = init(name, (examples / name).string());
    ASSERT_EQ(made.status, 0) << name << ": " << made.stderrText;
    const YamlField description = YamlField::loadFile((examples / name).string());
    testing::TempDir direct;
    auto expected = DeviceSession::create(direct.path(), deviceOptions(&description));
    applyDescription(*expected, &description);
    const auto loaded = DeviceSession::open(dir / name);
    EXPECT_EQ(recordsOf(*loaded), recordsOf(*expected)) << name;
  }
  // Without a description: the default device, as default.yaml writes it out.
  ASSERT_EQ(init("plain", "").status, 0);
  EXPECT_EQ(recordsOf(*DeviceSession::open(dir / "plain")),
            recordsOf(*DeviceSession::open(dir / "default.yaml")));

  // A root that holds a device is refused and left alone; bad input makes no device.
  const testing::HostRun again = init("plain", "");
  EXPECT_EQ(again.status, 2);
  EXPECT_NE(again.stderrText.find("already holds a device"), std::string::npos) << again.stderrText;
  testing::writeText(dir.path() / "bad.yaml", "apps:\n  - identifier: com.a\n    tpye: system\n");
  const testing::HostRun bad = init("badroot", dir / "bad.yaml");
  EXPECT_EQ(bad.status, 2);
  EXPECT_NE(bad.stderrText.find("bad.yaml:3: apps[0].tpye: unknown field"), std::string::npos)
      << bad.stderrText;
  EXPECT_FALSE(fs::exists(dir.path() / "badroot"));
}

}  // namespace
}  // namespace appsync::host
