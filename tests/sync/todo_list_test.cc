// The todo-list writer and its loader: first match, exact messages, untouched files, bad
// lists, unknown keys, concurrency without lost changes, and no needless re-reads.
#include "sync/todo_list.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "core/apps_client.h"
#include "core/fs/files.h"
#include "core/plist/codec.h"
#include "platform/fake/fake_tr_host.h"
#include "support/temp_dir.h"

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
  void writeRaw(std::string_view text) {
    ASSERT_TRUE(writeFileAtomically(
        path, std::span(reinterpret_cast<const std::uint8_t*>(text.data()), text.size())));
  }
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
  constexpr int kThreads = 10, kPerThread = 1000;
  plist::Array list;
  for (int t = 0; t < kThreads; ++t) {
    for (int i = 0; i < kPerThread; ++i) {
      list.emplace_back(record("com.t" + std::to_string(t) + ".app" + std::to_string(i), "install"));
    }
  }
  write(list, plist::Format::Binary);
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kPerThread; ++i) {
        todo.changeAssetID("com.t" + std::to_string(t) + ".app" + std::to_string(i),
                           "INSTALLED-" + std::to_string(t));
      }
    });
  }
  for (auto& th : threads) th.join();
  plist::Array after = load();
  ASSERT_EQ(after.size(), list.size());
  for (int t = 0; t < kThreads; ++t) {
    for (int i = 0; i < kPerThread; ++i) {
      const plist::Dict* r = after[t * kPerThread + i].dict();
      ASSERT_NE(r, nullptr);
      ASSERT_EQ(*plist::stringAt(*r, "operation"), "INSTALLED-" + std::to_string(t));
    }
  }
  // Writers that arrived during a rewrite shared the next one.
  EXPECT_LT(todo.rewriteCount(), static_cast<std::uint64_t>(kThreads * kPerThread));
}

}  // namespace
}  // namespace appsync
