// Reconciliation of an upload written by a hostile host computer: identifiers that name no
// application, todo lists of the wrong shape or size, and links out of the device root. Nothing
// outside the root is read into the sync, written, moved, removed or uninstalled.
#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {
namespace reconcile_hostile {

namespace fs = std::filesystem;
const std::string kPrefix = "com.vantor.trc.AppSync|";
const std::string kVictim = "com.example.victim";

struct Upload {
  FakePlatform& device;
  const fs::path outside;
  std::string staged(const std::string& name) const {
    return (fs::path(device.paths().stagingArea()) / name).string();
  }
  void write(const std::string& path, const plist::Value& value) const {
    fs::create_directories(fs::path(path).parent_path());
    ASSERT_TRUE(writePlistAtomically(path, value, plist::Format::Binary));
  }
  void link(const fs::path& target, const std::string& at) const {
    fs::create_directories(fs::path(at).parent_path());
    fs::create_symlink(target, at);
  }
};

plist::Value record(plist::Value identifier, plist::Value operation) {
  return plist::Dict{{"identifier", std::move(identifier)}, {"operation", std::move(operation)}};
}
const plist::Value kRemoveVictim = record(kVictim, "remove");

// Every entry under `dir`: its kind, its link target or its bytes.
std::map<std::string, std::string> snapshot(const fs::path& dir) {
  std::map<std::string, std::string> entries;
  for (const auto& entry : fs::recursive_directory_iterator(dir)) {
    std::string& seen = entries[fs::relative(entry.path(), dir).string()];
    if (entry.is_symlink()) {
      seen = "link " + fs::read_symlink(entry.path()).string();
    } else if (entry.is_regular_file()) {
      std::ifstream in(entry.path(), std::ios::binary);
      seen.assign(std::istreambuf_iterator<char>(in), {});
    }
  }
  return entries;
}

TEST(ReconcileHostileTest, RefusesOrSkipsWhatWouldReachOutsideTheRootAndGoesOn) {
  struct Case {
    const char* name;
    std::function<void(const Upload&)> stage;
    bool returned = true;
    std::vector<std::string> logged;
    std::vector<std::string> notLogged;
    std::vector<std::string> uninstalled;
    int posixError = 0;
  };
  const std::string homeScreenTold = "Notifying PV we are starting syncing";
  // clang-format off
  const std::vector<Case> cases = {
      {"identifiers that name no application",
       [](const Upload& u) {
         plist::Array list;
         for (std::string id : {"../x", "a/../../b", "/abs", "a/b", "..", "x\ny"}) {
           list.push_back(record(id, "remove"));
         }
         list.push_back(record(std::string("a\0b", 3), "remove"));
         list.push_back(record(plist::Value(std::int64_t{7}), "remove"));
         list.push_back(record("com.example.other", plist::Value(std::int64_t{5})));
         list.push_back(kRemoveVictim);
         u.write(u.staged("ApplicationsSync.plist"), list);
       },
       true, {"performing 1 deletions", homeScreenTold}, {"../x targeted"}, {kVictim}},
      {"a todo list whose root is not an array",
       [](const Upload& u) { u.write(u.staged("ApplicationsSync.plist"), plist::Dict{}); },
       true, {"todo list is not an array", "Nothing to do from Caravel", homeScreenTold}, {}, {}},
      {"records of the wrong types",
       [](const Upload& u) {
         u.write(u.staged("ApplicationsSync.plist"),
                 plist::Array{plist::Value(std::int64_t{1}), "remove", plist::Array{kRemoveVictim},
                              kRemoveVictim});
         u.write((u.outside / "debug.plist").string(), plist::Array{});
         u.link(u.outside / "debug.plist", u.staged("ApplicationsSync.plist-debug.plist"));
       },
       true, {"performing 1 deletions"}, {}, {kVictim}},
      {"a list of 100,000 records",
       [](const Upload& u) {
         plist::Array list(99999, record("com.example.app", "install"));
         list.push_back(kRemoveVictim);
         u.write(u.staged("ApplicationsSync.plist"), list);
       },
       true, {"performing 1 deletions"}, {}, {kVictim}},
      {"a staging area that is a link out of the root",
       [](const Upload& u) {
         u.write((u.outside / "upload/ApplicationsSync.plist").string(),
                 plist::Array{kRemoveVictim});
         u.link(u.outside / "upload", u.device.paths().stagingArea());
       },
       false, {"Can't move staging area"}, {homeScreenTold}, {}, ELOOP},
      {"a staging area reached through a link out of the root",
       [](const Upload& u) {
         u.write((u.outside / "public/ApplicationSync/ApplicationsSync.plist").string(),
                 plist::Array{kRemoveVictim});
         u.link(u.outside / "public", u.device.paths().publicStaging());
       },
       false, {"Can't move staging area"}, {homeScreenTold}, {}, EPERM},
      {"a work area that is a link out of the root",
       [](const Upload& u) {
         u.write((u.outside / "work/CaravelStuff/ApplicationsSync.plist").string(), plist::Array{});
         u.link(u.outside / "work", u.device.paths().workArea());
         u.write(u.staged("ApplicationsSync.plist"), plist::Array{kRemoveVictim});
       },
       false, {"can't create work area"}, {homeScreenTold}, {}, EPERM},
      {"a todo list and an icon layout that are links out of the root",
       [](const Upload& u) {
         u.write((u.outside / "todo.plist").string(), plist::Array{kRemoveVictim});
         u.write((u.outside / "layout.plist").string(), plist::Array{"com.example.a"});
         u.link(u.outside / "todo.plist", u.staged("ApplicationsSync.plist"));
         u.link(u.outside / "layout.plist", u.staged("PavilionIconState.plist"));
       },
       true, {"Nothing to do from Caravel", homeScreenTold}, {"Sending iconlayout to PV"}, {},
       ELOOP},
  };
  // clang-format on

  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir root, outside;
    FakePlatform device(root.path());
    for (std::string id : {"../x", "a/../../b", "/abs", "a/b", "x\ny", kVictim.c_str()}) {
      device.ar().putApplication({.identifier = id});
    }
    c.stage(Upload{device, outside.path()});
    const auto outsideBefore = snapshot(outside.path());
    ErrorRef error;
    bool returned;
    {
      AppsClient client(device.platform());
      returned = client.reconcileSync(1, "A", nullptr, &error);
    }

    EXPECT_EQ(returned, c.returned);
    if (c.posixError != 0) {
      ASSERT_TRUE(error);
      EXPECT_EQ(error->domain, kPOSIXErrorDomain);
      EXPECT_EQ(error->code, c.posixError);
    }
    EXPECT_TRUE(device.log().contains(kPrefix + "finished reconcile sync"));
    const std::vector<std::string> messages = device.log().messages();
    const auto logged = [&](const std::string& part) {
      return std::any_of(messages.begin(), messages.end(),
                         [&](const std::string& m) { return m.find(part) != std::string::npos; });
    };
    for (const std::string& part : c.logged) EXPECT_TRUE(logged(part)) << part;
    for (const std::string& part : c.notLogged) EXPECT_FALSE(logged(part)) << part;
    std::vector<std::string> uninstalled;
    for (const auto& call : device.ar().uninstallCalls()) uninstalled.push_back(call.identifier);
    EXPECT_EQ(uninstalled, c.uninstalled);
    EXPECT_EQ(snapshot(outside.path()), outsideBefore);
    EXPECT_FALSE(device.pv().lastIconState());
  }
}

}  // namespace reconcile_hostile
}  // namespace
}  // namespace appsync
