// Hostile todo lists written by the host computer: each is refused or skipped, on either road,
// and nothing outside the device root is touched.
#include <gtest/gtest.h>

#include <filesystem>
#include <map>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using testing::TempDir;

// Every path under `dir` with its size and modification time.
std::map<std::string, std::string> snapshot(const fs::path& dir) {
  std::map<std::string, std::string> out;
  for (const auto& entry : fs::recursive_directory_iterator(dir)) {
    const auto stamp = entry.last_write_time().time_since_epoch().count();
    out[entry.path().string()] = std::to_string(entry.is_regular_file() ? entry.file_size() : 0) +
                                 "@" + std::to_string(stamp);
  }
  return out;
}

plist::Dict install(plist::Value identifier) {
  return plist::Dict{{"identifier", std::move(identifier)}, {"operation", "install"}};
}

TEST(OutstandingTransfers, RefusesHostileTodoListsWithoutTouchingAnythingOutsideTheRoot) {
  plist::Array many;
  for (int i = 0; i < 100000; ++i) {
    many.emplace_back(i % 3 == 0   ? install("../x")
                      : i % 3 == 1 ? install(std::int64_t{i})
                                   : install("com.example.many"));
  }
  struct Case {
    const char* name;
    plist::Value todoList;
    std::vector<std::string> returned;
    std::vector<std::string> refused;  // as "Ignoring invalid path" names them
  };
  const std::vector<Case> cases = {
      {"climbing",
       plist::Array{install("../x"), install("a/../../b"), install("..")},
       {},
       {"../x", "a/../../b", ".."}},
      {"absolute",
       plist::Array{install("/etc"), install(std::string("nul\0x", 5))},
       {},
       {"/etc", std::string("\"nul\0x\"", 7)}},
      {"linked out of the root", plist::Array{install("com.evil")}, {}, {"com.evil"}},
      {"newline stays inside", plist::Array{install("new\nline")}, {"new\nline"}, {}},
      {"wrong root type", plist::Dict{{"identifier", "com.example.a"}}, {}, {}},
      {"wrong record types",
       plist::Array{"com.example.a", std::int64_t{7}, install(std::int64_t{5}),
                    install(plist::Array{"com.example.b"}),
                    plist::Dict{{"identifier", "com.example.c"}, {"operation", std::int64_t{1}}}},
       {},
       {"5", "(com.example.b)"}},
      {"100,000 records", many, {"com.example.many"}, {}},
  };

  for (bool coordination : {false, true}) {
    for (const Case& c : cases) {
      SCOPED_TRACE(std::string(c.name) + (coordination ? " (coordinated)" : " (legacy)"));
      TempDir base;
      const fs::path root = base.path() / "root", outside = base.path() / "outside";
      FakePlatform device(root, {.coordination = coordination});
      ASSERT_TRUE(createDirectories((outside / "Evil.app").string()));
      ASSERT_TRUE(writePlistAtomically((outside / "Evil.app/Info.plist").string(),
                                       plist::Dict{{"BNBundleDisplayName", "Stolen"}},
                                       plist::Format::Binary));
      ASSERT_TRUE(createDirectories(device.paths().syncFolder()));
      fs::create_directory_symlink(outside / "Evil.app",
                                   fs::path(device.paths().syncFolder()) / "com.evil");
      ASSERT_TRUE(
          writePlistAtomically(device.paths().todoList(), c.todoList, plist::Format::Binary));
      const auto before = snapshot(base.path());

      AppsClient client(device.platform());
      std::vector<std::string> returned;
      for (const auto& asset : client.outstandingAssetTransfers()) {
        returned.push_back(asset->identifier());
      }
      device.ar().drain();

      EXPECT_EQ(returned, c.returned);
      std::vector<std::string> refused;
      for (const std::string& line : device.log().messages()) {
        if (line.starts_with("com.vantor.trc.AppSync|Ignoring invalid path: ")) {
          refused.push_back(line.substr(46));
        }
      }
      if (c.todoList.array() && c.todoList.array()->size() == many.size()) {
        EXPECT_EQ(refused.size(), 66667u);
      } else {
        EXPECT_EQ(refused, c.refused);
      }
      auto after = snapshot(base.path());
      std::erase_if(after, [&](const auto& item) { return item.first.starts_with(root.string()); });
      std::map<std::string, std::string> outsideBefore = before;
      std::erase_if(outsideBefore,
                    [&](const auto& item) { return item.first.starts_with(root.string()); });
      EXPECT_EQ(after, outsideBefore);
    }
  }
}

}  // namespace
}  // namespace appsync
