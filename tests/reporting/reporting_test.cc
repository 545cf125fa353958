// Reporting: installed-application metrics, store account identifiers, disabled asset types and
// backup preparation, seen through results, store metadata files and exact log lines.
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

namespace appsync::reporting_test {
namespace {

namespace fs = std::filesystem;
using AppRecord = FakeARWorkspace::AppRecord;

std::string pluginLine(std::string_view rest) {
  return "com.vantor.trc.AppSync|" + std::string(rest);
}

// The messages of one category and level, in order.
std::vector<std::string> messages(const MemoryLogSink& log, int category, LogLevel level) {
  std::vector<std::string> out;
  for (const auto& line : log.lines()) {
    if (line.category == category && line.level == level) out.push_back(line.message);
  }
  return out;
}

std::vector<std::string> typeErrors(const MemoryLogSink& log) {
  return messages(log, kTypeCheckLogCategory, LogLevel::Error);
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

TEST(ReportingTest, MetricsCountExactlyTheUserApplications) {
  struct Case {
    const char* name;
    std::vector<AppRecord> apps;
    std::uint64_t count;
    std::uint64_t size;
  };
  const std::vector<Case> cases = {
      {"none", {}, 0, 0},
      {"only system apps",
       {{.identifier = "s", .applicationType = "System", .staticDiskUsage = 70}},
       0,
       0},
      {"two user apps",
       {{.identifier = "a", .staticDiskUsage = 100}, {.identifier = "b", .staticDiskUsage = 250}},
       2,
       350},
      {"lower-case type is not counted",
       {{.identifier = "a", .applicationType = "user", .staticDiskUsage = 5},
        {.identifier = "b", .staticDiskUsage = 7}},
       1,
       7},
      {"no disk-usage figure still counts",
       {{.identifier = "a"}, {.identifier = "b", .staticDiskUsage = 9}},
       2,
       9},
      {"sizes above the signed range stay unsigned",
       {{.identifier = "a", .staticDiskUsage = 0xF000000000000000ull}},
       1,
       0xF000000000000000ull},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir root;
    FakePlatform device(root.path());
    for (const AppRecord& app : c.apps) device.ar().putApplication(app);
    AppsClient client(device.platform());
    const plist::Dict metrics = client.installedAssetMetrics();
    EXPECT_EQ(metrics, (plist::Dict{{"_Count", c.count},
                                    {"_PhysicalSize", c.size},
                                    {"_PurgeableSize", std::uint64_t{0}}}));
    EXPECT_EQ(device.log().count(pluginLine("found " + std::to_string(c.count) + " apps using " +
                                            std::to_string(c.size) + " bytes (0 purgeable)")),
              1u);
  }
}

struct Account {
  std::optional<std::string> id;
  std::optional<std::int64_t> prid;
  std::optional<std::string> alt;
  bool operator==(const Account&) const = default;
};

std::vector<Account> accountsOf(AppsClient& client) {
  std::vector<Account> out;
  for (const auto& a : client.accountsForAssets())
    out.push_back({a.vantorID(), a.PRID(), a.altPRID()});
  return out;
}

TEST(ReportingTest, AccountIdentifiersReadBothPlacesWithTypedLookups) {
  struct Case {
    const char* name;
    std::vector<plist::Dict> metadata;  // one app each, named app0, app1, ...
    std::set<std::string> ids;
    std::vector<std::string> idsTypeErrors;
    std::vector<Account> accounts;
    std::vector<std::string> accountsTypeErrors;
    std::vector<std::string> mismatches;  // "app: A vs B"
  };
  const std::vector<Case> cases = {
      {"both places, different",
       {[] {
         plist::Dict d = accountInfo({{"VantorID", "b@x"}, {"PRPersonID", 7}});
         d.set("vantorId", "a@x");
         return d;
       }()},
       {"a@x", "b@x"},
       {},
       {{"b@x", 7, {}}},
       {},
       {"app0: a@x vs b@x"}},
      {"same account twice: first app's record",
       {accountInfo({{"VantorID", "a@x"}, {"PRPersonID", 1}, {"AltPRID", "r1"}}),
        accountInfo({{"VantorID", "a@x"}, {"PRPersonID", 2}, {"AltPRID", "r2"}})},
       {"a@x"},
       {},
       {{"a@x", 1, "r1"}},
       {},
       {}},
      {"PRPersonID as a string",
       {accountInfo({{"VantorID", "a@x"}, {"PRPersonID", "1001"}, {"AltPRID", "r"}})},
       {"a@x"},
       {},
       {{"a@x", {}, "r"}},
       {"unexpected type for PRPersonID"},
       {}},
      {"PRPersonID as a real",
       {accountInfo({{"VantorID", "a@x"}, {"PRPersonID", 12.9}})},
       {"a@x"},
       {},
       {{"a@x", 12, {}}},
       {},
       {}},
      {"downloadInfo an array counts as absent",
       {{{"vantorId", "top@x"},
         {"com.vantor.CaravelStore.downloadInfo", plist::Array{plist::Value("a")}}}},
       {"top@x"},
       {"unexpected type for downloadInfo"},
       {{"top@x", {}, {}}},
       {"unexpected type for downloadInfo"},
       {}},
      {"every label of a wrong type",
       {{{"vantorId", 5},
         {"com.vantor.CaravelStore.downloadInfo", plist::Dict{{"accountInfo", "x"}}}},
        accountInfo({{"VantorID", true}, {"PRPersonID", 1}})},
       {},
       {"unexpected type for vantorID", "unexpected type for accountInfo",
        "unexpected type for VantorID"},
       {},
       {"unexpected type for accountInfo", "unexpected type for vantorID",
        "unexpected type for VantorID"},
       {}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Device d;
    for (std::size_t i = 0; i < c.metadata.size(); ++i) {
      d.addWithMetadata("app" + std::to_string(i), c.metadata[i]);
    }
    AppsClient client(d.platform.platform());
    EXPECT_EQ(client.vantorIDsForAssets(), c.ids);
    EXPECT_EQ(typeErrors(d.platform.log()), c.idsTypeErrors);
    for (const std::string& mismatch : c.mismatches) {
      EXPECT_EQ(d.platform.log().count(pluginLine("mismatched VantorID keys for " + mismatch)), 1u);
    }
    d.platform.log().clear();
    EXPECT_EQ(accountsOf(client), c.accounts);
    EXPECT_EQ(typeErrors(d.platform.log()), c.accountsTypeErrors);
  }
}

TEST(ReportingTest, MissingMetadataIsUnknownForIdsAndSilentForAccounts) {
  Device d;
  d.add({.identifier = "bare"});
  AppsClient client(d.platform.platform());
  EXPECT_TRUE(client.vantorIDsForAssets().empty());
  EXPECT_EQ(messages(d.platform.log(), 8, LogLevel::Default),
            (std::vector<std::string>{
                pluginLine("getting id's for assets"),
                pluginLine("unknown VantorID for bare (plist at " + d.metadataPath("bare") + ")"),
                pluginLine("Returning vantor ID set: ()")}));
  d.platform.log().clear();
  EXPECT_TRUE(accountsOf(client).empty());
  EXPECT_EQ(d.platform.log().messages(),
            (std::vector<std::string>{pluginLine("getting accounts for assets"),
                                      pluginLine("Returning accountInfo: ()")}));
}

TEST(ReportingTest, DisabledAssetTypesOnlyWhenBothAreForbidden) {
  struct Case {
    std::optional<int> installation, removal;
    bool disabled;
  };
  const std::vector<Case> cases = {{{}, {}, false},
                                   {RSRestrictedBoolExplicitNo, {}, false},
                                   {RSRestrictedBoolExplicitNo, RSRestrictedBoolExplicitYes, false},
                                   {{}, RSRestrictedBoolExplicitNo, false},
                                   {RSRestrictedBoolExplicitNo, RSRestrictedBoolExplicitNo, true}};
  for (const Case& c : cases) {
    testing::TempDir root;
    FakePlatform device(root.path());
    if (c.installation) device.rs().setValue(RSFeatureAppInstallationAllowed, *c.installation);
    if (c.removal) device.rs().setValue(RSFeatureAppRemovalAllowed, *c.removal);
    AppsClient client(device.platform());
    const auto types = client.disabledAssetTypes();
    EXPECT_EQ(types,
              c.disabled ? std::optional(std::set<std::string>{"Application"}) : std::nullopt);
  }
}

TEST(ReportingTest, BackupPreparationRewritesOnlyWhatItMarksChanged) {
  struct Case {
    const char* name;
    plist::Dict before;
    bool deviceBased;
    std::optional<plist::Dict> after;  // absent: the file is not touched
    std::vector<std::string> lines;
  };
  const std::vector<Case> cases = {
      {"no entry, flag false, no auto-download", {{"k", 1}}, false, std::nullopt, {}},
      {"auto-download false is kept", {{"is-auto-download", false}}, false, std::nullopt, {}},
      {"entry true, flag now false",
       {{"DeviceBasedBLK", true}},
       false,
       plist::Dict{{"DeviceBasedBLK", false}},
       {pluginLine("Updated DeviceBasedBLK state for : app to 0")}},
      {"entry already equal is written again",
       {{"DeviceBasedBLK", false}},
       false,
       plist::Dict{{"DeviceBasedBLK", false}},
       {pluginLine("Updated DeviceBasedBLK state for : app to 0")}},
      {"no entry, flag true",
       {{"k", 1}},
       true,
       plist::Dict{{"k", 1}, {"DeviceBasedBLK", true}},
       {pluginLine("Updated DeviceBasedBLK state for : app to 1")}},
      {"auto-download true is removed",
       {{"is-auto-download", true}, {"k", 1}},
       false,
       plist::Dict{{"k", 1}},
       {pluginLine("clearing is-auto-download value for app")}},
  };
  for (const plist::Format format : {plist::Format::Binary, plist::Format::Xml}) {
    for (const Case& c : cases) {
      SCOPED_TRACE(std::string(c.name) + (format == plist::Format::Xml ? " (XML)" : " (binary)"));
      Device d;
      d.addWithMetadata("app", c.before, format, c.deviceBased);
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
    std::function<void(Device&, const std::string& container)> make;
  };
  const std::vector<Case> cases = {
      {"root is an array",
       [](Device& d, const std::string&) {
         writePlistAtomically(d.metadataPath("hostile"), plist::Array{plist::Value(true)},
                              plist::Format::Binary);
       }},
      {"nesting deeper than the reader allows",
       [&](Device& d, const std::string&) {
         const std::string text = "<plist>" + deep + "</plist>";
         writeFileAtomically(d.metadataPath("hostile"),
                             {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
       }},
      {"a huge string",
       [&](Device& d, const std::string&) {
         writePlistAtomically(d.metadataPath("hostile"),
                              plist::Dict{{"vantorId", huge}, {"is-auto-download", true}},
                              plist::Format::Binary);
       }},
      {"a link to a file outside the root",
       [&](Device& d, const std::string&) {
         fs::create_symlink(outsideFile, d.metadataPath("hostile"));
       }},
      {"a container that leads outside the root",
       [&](Device&, const std::string& container) {
         fs::remove_all(container);
         fs::create_directory_symlink(outside.path(), container);
       }},
      {"a directory where the file belongs",
       [](Device& d, const std::string&) { fs::create_directory(d.metadataPath("hostile")); }},
      {"a pipe where the file belongs",
       [](Device& d, const std::string&) { ::mkfifo(d.metadataPath("hostile").c_str(), 0644); }},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    ASSERT_TRUE(writePlistAtomically(outsideFile, tempting, plist::Format::Binary));
    const FileIdentity outsideBefore = fileIdentity(outsideFile).value();
    Device d;
    d.addWithMetadata("a-first", plist::Dict{{"vantorId", "first@x"}, {"is-auto-download", true}});
    d.add({.identifier = "hostile", .hasMIDBasedSINF = true});
    c.make(d, d.container("hostile"));
    d.addWithMetadata("z-last", accountInfo({{"VantorID", "last@x"}}), plist::Format::Binary, true);
    AppsClient client(d.platform.platform());

    const std::set<std::string> ids = client.vantorIDsForAssets();
    EXPECT_TRUE(ids.count("first@x") && ids.count("last@x"));
    EXPECT_FALSE(ids.count("outside@x"));
    EXPECT_EQ(accountsOf(client).size(), ids.size());
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
