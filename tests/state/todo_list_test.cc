// The todo-list writer and its loader: first match, exact messages, untouched files, bad
// lists, unknown keys, changes batched during a rewrite, a list replaced while changes run, and
// no needless re-reads. (The install stress test loses no change among ten install threads.)
#include "state/todo_list.h"

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <mutex>
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
  // Every line so far has `level` and the plugin's category.
  void expectAllAt(LogLevel level) {
    for (const auto& line : tr.logSink()->lines()) {
      EXPECT_EQ(line.level, level) << line.message;
      EXPECT_EQ(line.category, 8) << line.message;
    }
  }

  testing::TempDir dir;
  std::string path = dir / "ApplicationsSync.plist";
  FakeTRHost tr;
  TodoList todo{path, tr};
};

// Unknown keys and types, and entries that are no records, survive the rewrite.
TEST_F(TodoListTest, ChangesTheFirstMatchingRecordAndWritesBinary) {
  plist::Dict a = record("com.a", "install");
  a.set("version", "1.2");
  a.set("x-host-extra", plist::Array{1, 2.5, plist::Bytes{1, 2}, plist::Date{12.0}});
  write(
      plist::Array{"a stray string", a, record("com.b", "install"), 42, record("com.a", "remove")});
  todo.changeAssetID("com.a", "DOWNLOADED");

  plist::Format format;
  auto value = plist::parse(bytes(), nullptr, &format);
  ASSERT_TRUE(value);
  EXPECT_EQ(format, plist::Format::Binary);
  a.set("operation", "DOWNLOADED");
  EXPECT_EQ(*value, plist::Value(plist::Array{"a stray string", a, record("com.b", "install"), 42,
                                              record("com.a", "remove")}));
  EXPECT_EQ(messages(), std::vector<std::string>{
                            "com.vantor.trc.AppSync|Changing com.a from install to DOWNLOADED"});
  expectAllAt(LogLevel::Default);
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
      {"zero-length file", "", {}},
      {"root is a dictionary",
       xmlHead + "<dict/></plist>",
       {"com.vantor.trc.AppSync|todo list is not an array"}},
      {"truncated binary", "bplist00\xd1\x01", {"com.vantor.trc.AppSync|couldn't parse todo list"}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    tr.logSink()->clear();
    writeRaw(c.content);
    const plist::Bytes before = bytes();
    todo.changeAssetID("com.a", "FAILED");
    EXPECT_EQ(bytes(), before);
    EXPECT_EQ(messages(), c.messages);
    expectAllAt(LogLevel::Error);
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

TEST_F(TodoListTest, LoadersReportWrongRootsAndUnreadableFiles) {
  write(plist::Array{record("com.a", "install")});
  EXPECT_EQ(AppsClient::_loadDemotedAppsPlist(tr, path, nullptr), std::nullopt);
  EXPECT_EQ(messages(), std::vector<std::string>{
                            "com.vantor.trc.AppSync|demoted apps list is not a dictionary"});
  expectAllAt(LogLevel::Error);

  tr.logSink()->clear();
  writeRaw("not a plist");
  ErrorRef error;
  EXPECT_EQ(AppsClient::_loadDemotedAppsPlist(tr, path, &error), std::nullopt);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(messages(),
            std::vector<std::string>{"com.vantor.trc.AppSync|couldn't parse demoted apps list"});
  expectAllAt(LogLevel::Error);

  error.reset();
  EXPECT_EQ(AppsClient::_loadPlist(tr, dir / "missing.plist", &error), std::nullopt);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->code, ENOENT);
}

// Holds the first message written until the test lets it go: the writer that logs it is then
// in the middle of its rewrite.
class GateSink : public LogSink {
 public:
  void write(int, LogLevel, std::string_view message) override {
    std::unique_lock lock(mutex_);
    messages_.emplace_back(message);
    if (messages_.size() == 1) {
      held_ = true;
      changed_.notify_all();
      changed_.wait(lock, [&] { return released_; });
    }
  }
  void waitUntilHeld() {
    std::unique_lock lock(mutex_);
    changed_.wait(lock, [&] { return held_; });
  }
  void release() {
    std::lock_guard lock(mutex_);
    released_ = true;
    changed_.notify_all();
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<std::string> messages_;
  bool held_ = false, released_ = false;
};

TEST_F(TodoListTest, ChangesThatArriveDuringARewriteShareTheNextOne) {
  plist::Array list;
  for (int i = 0; i < 10; ++i) list.emplace_back(record("com.app" + std::to_string(i), "install"));
  write(list, plist::Format::Binary);
  auto gate = std::make_shared<GateSink>();
  tr.logger().setSink(gate);

  std::thread first([&] { todo.changeAssetID("com.app0", "DOWNLOADED"); });
  gate->waitUntilHeld();
  std::vector<std::thread> others;
  for (int i = 1; i < 10; ++i) {
    others.emplace_back([&, i] { todo.changeAssetID("com.app" + std::to_string(i), "SENT"); });
  }
  while (todo.pendingChangeCount() < 9) std::this_thread::yield();
  gate->release();
  first.join();
  for (auto& t : others) t.join();

  EXPECT_EQ(todo.rewriteCount(), 2u);
  EXPECT_EQ(todo.loadCount(), 1u);
  plist::Array after = load();
  for (int i = 0; i < 10; ++i) {
    EXPECT_EQ(*plist::stringAt(*after[i].dict(), "operation"), i == 0 ? "DOWNLOADED" : "SENT");
  }
}

TEST_F(TodoListTest, AListReplacedWhileChangesRunIsNeverOverwritten) {
  // Ten threads keep changing their own records of the current list; the host keeps replacing
  // the list with a new generation. A write derived from an older generation would bring its
  // records back, and a change made to the current generation must never be lost. The checks
  // run once every writer that started before the last replacement is done: a call that began
  // after it has returned, and the writer is one at a time.
  constexpr int kThreads = 10, kRecords = 4, kGenerations = 150;
  auto id = [](int g, int t, int i) {
    return "g" + std::to_string(g) + ".t" + std::to_string(t) + ".r" + std::to_string(i);
  };
  auto generation = [&](int g) {
    plist::Array list;
    for (int t = 0; t < kThreads; ++t) {
      for (int i = 0; i < kRecords; ++i) list.emplace_back(record(id(g, t, i), "install"));
    }
    return list;
  };
  write(generation(0), plist::Format::Binary);

  std::atomic<int> current{0};
  std::atomic<bool> stop{false};
  // Per record of the current generation: (generation << 32) | the last value a call that
  // began after that generation was in place has finished writing.
  std::vector<std::atomic<std::uint64_t>> done(kThreads * kRecords);
  std::atomic<int> callsSinceReplacement{0};
  std::vector<std::thread> changers;
  struct JoinAll {
    std::atomic<bool>& stop;
    std::vector<std::thread>& threads;
    ~JoinAll() {
      stop.store(true);
      for (auto& t : threads) t.join();
    }
  } joinOnEveryWayOut{stop, changers};
  for (int t = 0; t < kThreads; ++t) {
    changers.emplace_back([&, t] {
      for (std::uint32_t n = 1; !stop.load(); ++n) {
        const int g = current.load();
        const int i = static_cast<int>(n % kRecords);
        todo.changeAssetID(id(g, t, i), std::to_string(n));
        done[t * kRecords + i].store((std::uint64_t(g) << 32) | n);
        if (current.load() == g) callsSinceReplacement.fetch_add(1);
      }
    });
  }
  for (int g = 1; g <= kGenerations; ++g) {
    while (callsSinceReplacement.load() < kThreads) std::this_thread::yield();
    std::vector<std::uint64_t> finished(done.size());
    for (std::size_t k = 0; k < done.size(); ++k) finished[k] = done[k].load();
    plist::Array seen = load();
    ASSERT_EQ(seen.size(), static_cast<std::size_t>(kThreads * kRecords)) << "generation " << g;
    for (int t = 0; t < kThreads; ++t) {
      for (int i = 0; i < kRecords; ++i) {
        const plist::Dict& r = *seen[t * kRecords + i].dict();
        ASSERT_EQ(*plist::stringAt(r, "identifier"), id(g - 1, t, i)) << "an older list came back";
        const std::uint64_t f = finished[t * kRecords + i];
        if (static_cast<int>(f >> 32) != g - 1 || (f & 0xffffffff) == 0) continue;
        const std::string& state = *plist::stringAt(r, "operation");
        ASSERT_NE(state, "install") << id(g - 1, t, i) << " lost change " << (f & 0xffffffff);
        ASSERT_GE(std::stoul(state), f & 0xffffffff) << id(g - 1, t, i) << " lost a change";
      }
    }
    write(generation(g), plist::Format::Binary);
    current.store(g);  // calls that read g began after the replacement
    callsSinceReplacement.store(0);
  }
}

}  // namespace
}  // namespace appsync
