// The todo-list writer and its loader: first match, exact messages, untouched files, bad
// lists, unknown keys, concurrency without lost changes, and no needless re-reads.
#include "state/todo_list.h"

#include <gtest/gtest.h>

#include <map>
#include <sstream>
#include <thread>
#include <vector>

#include "client/apps_client.h"
#include "platform/fake/fake_tr.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

plist::Dict record(std::string id, std::string op) {
  plist::Dict d;
  d.set("identifier", std::move(id));
  d.set("operation", std::move(op));
  return d;
}

std::string repeat(std::string_view piece, int times) {
  std::string out;
  for (int i = 0; i < times; ++i) out += piece;
  return out;
}

class TodoListTest : public ::testing::Test {
 protected:
  void write(const plist::Value& list, plist::Format format = plist::Format::Xml) {
    ASSERT_TRUE(writePlistAtomically(path, list, format));
  }
  void writeRaw(std::string_view text) { testing::writeText(path, text); }
  plist::Bytes bytes() { return readFile(path).value_or(plist::Bytes{}); }
  plist::Array load() {
    auto value = plist::parse(bytes());
    return value && value->array() ? *value->array() : plist::Array{};
  }
  std::vector<std::string> messages() { return tr.logSink()->messages(); }

  testing::TempDir dir;
  std::string path = dir / "ApplicationsSync.plist";
  FakeTRHost tr;
  TodoList todo{path, tr};
};

TEST_F(TodoListTest, ChangesTheFirstMatchingRecordAndWritesBinary) {
  write(plist::Array{record("com.a", "install"), record("com.b", "install"),
                     record("com.a", "remove")});
  todo.changeAssetID("com.a", "DOWNLOADED");

  plist::Format format;
  auto value = plist::parse(bytes(), nullptr, &format);
  ASSERT_TRUE(value);
  EXPECT_EQ(format, plist::Format::Binary);
  EXPECT_EQ(*value, plist::Value(plist::Array{record("com.a", "DOWNLOADED"),
                                              record("com.b", "install"),
                                              record("com.a", "remove")}));
  EXPECT_EQ(messages(), std::vector<std::string>{
                            "com.vantor.trc.AppSync|Changing com.a from install to DOWNLOADED"});
}

TEST_F(TodoListTest, UnknownKeysAndTypesSurvive) {
  plist::Dict a = record("com.a", "install");
  a.set("version", "1.2");
  a.set("x-host-extra", plist::Array{1, 2.5, plist::Bytes{1, 2}, plist::Date{12.0}});
  write(plist::Array{a, "a stray string", 42});
  todo.changeAssetID("com.a", "INSTALLED");
  a.set("operation", "INSTALLED");
  EXPECT_EQ(load(), (plist::Array{a, "a stray string", 42}));
}

TEST_F(TodoListTest, NothingIsWrittenWhenNothingMatchesOrTheListIsUnusable) {
  struct Case {
    const char* name;
    std::string content;
    std::vector<std::string> messages;
  };
  const std::string xmlHead = "<?xml version=\"1.0\"?><plist>";
  const std::vector<Case> cases = {
      {"no matching record",
       xmlHead + "<array><dict><key>identifier</key><string>com.b</string></dict></array></plist>",
       {}},
      {"identifier that is not a string",
       xmlHead + "<array><dict><key>identifier</key><integer>7</integer></dict></array></plist>",
       {}},
      {"empty list", xmlHead + "<array/></plist>", {}},
      {"zero-length file", "", {}},
      {"root is a dictionary",
       xmlHead + "<dict/></plist>",
       {"com.vantor.trc.AppSync|todo list is not an array"}},
      {"garbage", "garbage", {"com.vantor.trc.AppSync|couldn't parse todo list"}},
      {"truncated binary", "bplist00\xd1\x01", {"com.vantor.trc.AppSync|couldn't parse todo list"}},
      {"deep nesting", xmlHead + repeat("<array>", 100000),
       {"com.vantor.trc.AppSync|couldn't parse todo list"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    tr.logSink()->clear();
    writeRaw(c.content);
    const plist::Bytes before = bytes();
    todo.changeAssetID("com.a", "FAILED");
    EXPECT_EQ(bytes(), before);
    EXPECT_EQ(messages(), c.messages);
  }
  tr.logSink()->clear();
  removeFile(path);
  todo.changeAssetID("com.a", "FAILED");  // a missing file is the ordinary case: silent
  EXPECT_FALSE(fileExists(path));
  EXPECT_TRUE(messages().empty());
}

TEST_F(TodoListTest, AFileWrittenByThisWriterIsNotReadAgainButAReplacedOneIs) {
  write(plist::Array{record("com.a", "install"), record("com.b", "install")});
  todo.changeAssetID("com.a", "DOWNLOADED");
  todo.changeAssetID("com.a", "INSTALLED");
  todo.changeAssetID("com.b", "FAILED");
  EXPECT_EQ(todo.loadCount(), 1u);
  EXPECT_EQ(todo.rewriteCount(), 3u);

  // The host replaces the list (a new sync): the next change must start from the new file.
  write(plist::Array{record("com.b", "install"), record("com.c", "install")});
  todo.changeAssetID("com.c", "DOWNLOADED");
  EXPECT_EQ(todo.loadCount(), 2u);
  EXPECT_EQ(load(), (plist::Array{record("com.b", "install"), record("com.c", "DOWNLOADED")}));
}

TEST_F(TodoListTest, LoadersAcceptBothFormatsAndReportWrongRoots) {
  plist::Array list{record("com.a", "install")};
  for (auto format : {plist::Format::Xml, plist::Format::Binary}) {
    write(list, format);
    ErrorRef error;
    EXPECT_EQ(AppsClient::_loadPlist(tr, path, &error), list);
    EXPECT_EQ(error, nullptr);
  }
  tr.logSink()->clear();
  write(list);
  EXPECT_EQ(AppsClient::_loadDemotedAppsPlist(tr, path, nullptr), std::nullopt);
  EXPECT_EQ(messages(), std::vector<std::string>{
                            "com.vantor.trc.AppSync|demoted apps list is not a dictionary"});

  tr.logSink()->clear();
  writeRaw("not a plist");
  ErrorRef error;
  EXPECT_EQ(AppsClient::_loadDemotedAppsPlist(tr, path, &error), std::nullopt);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(messages(), std::vector<std::string>{
                            "com.vantor.trc.AppSync|couldn't parse demoted apps list"});

  error.reset();
  EXPECT_EQ(AppsClient::_loadPlist(tr, dir / "missing.plist", &error), std::nullopt);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code, ENOENT);
}

TEST_F(TodoListTest, ConcurrentChangesAreAllKept) {
  // 10 threads make 1,000 changes each: every thread walks its own 100 records ten times. A
  // lost update would show as a final state that is not the last round, or as a logged change
  // whose "from" is not the state the previous change of that record wrote.
  constexpr int kThreads = 10, kRecords = 100, kRounds = 10;
  auto id = [](int t, int i) { return "com.t" + std::to_string(t) + ".app" + std::to_string(i); };
  plist::Array list;
  for (int t = 0; t < kThreads; ++t) {
    for (int i = 0; i < kRecords; ++i) list.emplace_back(record(id(t, i), "install"));
  }
  write(list, plist::Format::Binary);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int round = 0; round < kRounds; ++round) {
        for (int i = 0; i < kRecords; ++i) todo.changeAssetID(id(t, i), "R" + std::to_string(round));
      }
    });
  }
  for (auto& th : threads) th.join();

  plist::Array after = load();
  ASSERT_EQ(after.size(), list.size());
  for (const plist::Value& r : after) {
    ASSERT_EQ(*plist::stringAt(*r.dict(), "operation"), "R" + std::to_string(kRounds - 1));
  }
  std::map<std::string, std::string> last;
  std::size_t changes = 0;
  const std::string prefix = "com.vantor.trc.AppSync|Changing ";
  for (const std::string& m : messages()) {
    ASSERT_EQ(m.rfind(prefix, 0), 0u) << m;
    std::istringstream words(m.substr(prefix.size()));
    std::string who, from, fromValue, to, toValue;
    words >> who >> from >> fromValue >> to >> toValue;
    auto [it, fresh] = last.try_emplace(who, "install");
    ASSERT_EQ(fromValue, it->second) << m;
    it->second = toValue;
    ++changes;
  }
  EXPECT_EQ(changes, static_cast<std::size_t>(kThreads * kRecords * kRounds));
  // Writers that arrived during a rewrite shared the next one.
  EXPECT_LT(todo.rewriteCount(), changes);
}

}  // namespace
}  // namespace appsync
