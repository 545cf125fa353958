// Reporting: what the scenario (tests/scenarios/reporting.yaml) cannot show: exact application
// types, files left untouched to the inode, XML kept as XML, and hostile metadata files.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync::reporting_test {
namespace {

namespace fs = std::filesystem;
using AppRecord = FakeARWorkspace::AppRecord;

std::string pluginLine(std::string_view rest) {
  return "com.vantor.trc.AppSync|" + std::string(rest);
}

plist::Dict accountInfo(plist::Dict info) {
  return {{"com.vantor.CaravelStore.downloadInfo", plist::Dict{{"accountInfo", std::move(info)}}}};
}

// A device whose applications each have a container; metadata is written there on request.
struct Device {
  testing::TempDir root;
  FakePlatform platform{root.path()};

  std::string container(const std::string& id) const { return root / ("containers/" + id); }
  std::string metadataPath(const std::string& id) const {
    return container(id) + "/CaravelMetadata.plist";
  }
  void add(AppRecord record) {
    fs::create_directories(container(record.identifier));
    record.containerDirectory = container(record.identifier);
    platform.ar().putApplication(std::move(record));
  }
  void addWithMetadata(const std::string& id, const plist::Value& metadata,
                       plist::Format format = plist::Format::Binary, bool deviceBased = false) {
    add({.identifier = id, .hasMIDBasedSINF = deviceBased});
    ASSERT_TRUE(writePlistAtomically(metadataPath(id), metadata, format));
  }
};

TEST(ReportingTest, MetricsCountOnlyTypeUserExactly) {
  testing::TempDir root;
  FakePlatform device(root.path());
  device.ar().putApplication({.identifier = "a", .applicationType = "user", .staticDiskUsage = 5});
  device.ar().putApplication(
      {.identifier = "b", .applicationType = "System", .staticDiskUsage = 6});
  device.ar().putApplication({.identifier = "c", .staticDiskUsage = 0xF000000000000000ull});
  device.ar().putApplication({.identifier = "d"});  // no disk-usage figure: 0 bytes, counted
  AppsClient client(device.platform());
  EXPECT_EQ(client.installedAssetMetrics(),
            (plist::Dict{{"_Count", std::uint64_t{2}},
                         {"_PhysicalSize", std::uint64_t{0xF000000000000000ull}},
                         {"_PurgeableSize", std::uint64_t{0}}}));
}

TEST(ReportingTest, BackupPreparationRewritesOnlyWhatItMarksChanged) {
  struct Case {
    const char* name;
    plist::Dict before;
    std::optional<plist::Dict> after;  // absent: the file is not touched
    std::vector<std::string> lines;
    bool sameBytesLeftAlone = false;  // the rewrite would give the file's own bytes
  };
  // A flag set or changed is shown by the reporting scenario.
  // clang-format off
  const std::vector<Case> cases = {
      {"no entry, flag false, no auto-download", {{"k", 1}}, std::nullopt, {}},
      {"auto-download false is kept", {{"is-auto-download", false}}, std::nullopt, {}},
      {"entry already equal: updated, and the file already holds it", {{"DeviceBasedBLK", false}},
       plist::Dict{{"DeviceBasedBLK", false}},
       {pluginLine("Updated DeviceBasedBLK state for : app to 0")}, true},
      {"auto-download true is removed", {{"is-auto-download", true}, {"k", 1}},
       plist::Dict{{"k", 1}}, {pluginLine("clearing is-auto-download value for app")}},
  };
  // clang-format on
  for (const plist::Format format : {plist::Format::Binary, plist::Format::Xml}) {
    for (const Case& c : cases) {
      SCOPED_TRACE(std::string(c.name) + (format == plist::Format::Xml ? " (XML)" : " (binary)"));
      Device d;
      d.addWithMetadata("app", c.before, format);
      const std::string path = d.metadataPath("app");
      const plist::Bytes bytesBefore = readFile(path).value();
      const FileIdentity identityBefore = fileIdentity(path).value();
      AppsClient client(d.platform.platform());
      client.prepareForBackup();

      std::vector<std::string> expectedLines = {pluginLine("preparing for backup")};
      expectedLines.insert(expectedLines.end(), c.lines.begin(), c.lines.end());
      expectedLines.push_back(pluginLine("finished preparing for backup"));
      EXPECT_EQ(d.platform.log().messages(), expectedLines);
      const plist::Bytes bytesAfter = readFile(path).value();
      if (!c.after) {
        EXPECT_EQ(bytesAfter, bytesBefore);
        EXPECT_EQ(fileIdentity(path).value(), identityBefore);
        continue;
      }
      plist::Format written;
      EXPECT_EQ(plist::parse(bytesAfter, nullptr, &written), plist::Value(*c.after));
      EXPECT_EQ(written, format);
      if (c.sameBytesLeftAlone) {
        EXPECT_EQ(fileIdentity(path).value(), identityBefore);
      }
    }
  }
}

// Each hostile application sits between two good ones: the walks must survive it, go on with
// the next application, and write nothing outside the root.
TEST(ReportingTest, HostileMetadataNeitherStopsAWalkNorEscapesTheRoot) {
  testing::TempDir outside;
  const std::string outsideFile = outside / "CaravelMetadata.plist";
  const plist::Dict tempting = {{"vantorId", "outside@x"}, {"is-auto-download", true}};
  std::string deep;
  for (int i = 0; i < 600; ++i) deep += "<array>";
  for (int i = 0; i < 600; ++i) deep += "</array>";
  const std::string huge(4u << 20, 'x');

  struct Case {
    const char* name;
    std::function<void(const std::string& file)> make;  // the hostile app's metadata file
  };
  const std::vector<Case> cases = {
      {"root is an array",
       [](const std::string& file) {
         writePlistAtomically(file, plist::Array{plist::Value(true)}, plist::Format::Binary);
       }},
      {"nesting deeper than the reader allows",
       [&](const std::string& file) { testing::writeText(file, "<plist>" + deep + "</plist>"); }},
      {"a huge string",
       [&](const std::string& file) {
         writePlistAtomically(file, plist::Dict{{"vantorId", huge}, {"is-auto-download", true}},
                              plist::Format::Binary);
       }},
      {"a link to a file outside the root",
       [&](const std::string& file) { fs::create_symlink(outsideFile, file); }},
      {"a container that leads outside the root",
       [&](const std::string& file) {
         const fs::path container = fs::path(file).parent_path();
         fs::remove_all(container);
         fs::create_directory_symlink(outside.path(), container);
       }},
      {"a directory where the file belongs",
       [](const std::string& file) { fs::create_directory(file); }},
      {"a pipe where the file belongs",
       [](const std::string& file) { ::mkfifo(file.c_str(), 0644); }},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(writePlistAtomically(outsideFile, tempting, plist::Format::Binary));
    const FileIdentity outsideBefore = fileIdentity(outsideFile).value();
    Device d;
    d.addWithMetadata("a-first", plist::Dict{{"vantorId", "first@x"}, {"is-auto-download", true}});
    d.add({.identifier = "hostile", .hasMIDBasedSINF = true});
    c.make(d.metadataPath("hostile"));
    d.addWithMetadata("z-last", accountInfo({{"VantorID", "last@x"}}), plist::Format::Binary, true);
    AppsClient client(d.platform.platform());

    const std::set<std::string> ids = client.vantorIDsForAssets();
    EXPECT_TRUE(ids.count("first@x") && ids.count("last@x"));
    EXPECT_FALSE(ids.count("outside@x"));
    EXPECT_EQ(client.accountsForAssets().size(), ids.size());
    client.prepareForBackup();
    EXPECT_EQ(d.platform.log().count(pluginLine("clearing is-auto-download value for a-first")),
              1u);
    EXPECT_EQ(d.platform.log().count(pluginLine("Updated DeviceBasedBLK state for : z-last to 1")),
              1u);
    EXPECT_EQ(fileIdentity(outsideFile).value(), outsideBefore);
  }
}

}  // namespace
}  // namespace appsync::reporting_test
