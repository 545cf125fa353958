// Cost of one todo-list change: warm (the writer reuses the list it wrote last), cold (another
// writer replaced the file before each change), and ten threads sharing one writer.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "bench_support.h"
#include "platform/fake/fake_tr.h"
#include "runtime/fs/files.h"
#include "runtime/log/log.h"
#include "runtime/plist/codec.h"
#include "state/todo_list.h"

namespace appsync {
namespace {

using bench::CountingLogSink;

std::string numbered(const char* prefix, int i) {
  char text[48];
  std::snprintf(text, sizeof text, "%s%05d", prefix, i);
  return text;
}

// A binary todo list of `records` records in a fresh directory, one writer over it, and the
// operation every record should hold after the changes made so far.
class TodoFixture {
 public:
  explicit TodoFixture(int records) : expected_(records, std::string(kTodoInstall)) {
    if (dir_.path().empty()) return;
    path_ = (dir_.path() / "ApplicationsSync.plist").string();
    plist::Array list;
    list.reserve(records);
    for (int i = 0; i < records; ++i) {
      ids_.push_back(numbered("com.example.app", i));
      list.push_back(plist::Dict{{std::string(kTodoIdentifierKey), ids_.back()},
                                 {std::string(kTodoOperationKey), std::string(kTodoInstall)},
                                 {std::string(kTodoVersionKey), "1.2.3"},
                                 {std::string(kTodoNameKey), numbered("App ", i)}});
    }
    if (!writePlistAtomically(path_, list, plist::Format::Binary)) return;
    tr_.logger().setSink(sink_);
    todo_ = std::make_unique<TodoList>(path_, tr_);
  }
  bool ok() const { return todo_ != nullptr; }
  int size() const { return static_cast<int>(expected_.size()); }
  TodoList& todo() { return *todo_; }
  std::uint64_t changes() const { return changes_.load(); }

  // Flips record i between "DOWNLOADED" and "INSTALLED" (its first change leaves "install"), so
  // that every call really changes the file. Threads may call this for distinct records.
  void change(int i) {
    std::string& state = expected_[i];
    state = std::string(state == kTodoDownloaded ? kTodoInstalled : kTodoDownloaded);
    todo_->changeAssetID(ids_[i], state);
    changes_.fetch_add(1, std::memory_order_relaxed);
  }

  // Replaces the file with a copy of itself, as the host rewriting the list would: the writer
  // must notice and read it again.
  bool replaceFile() {
    const std::string copy = (dir_.path() / ".replacement").string();
    removeFile(copy);
    return copyFile(path_, copy) && moveItem(copy, path_);
  }

  // Empty when the file holds every change made and nothing else, and every change was logged;
  // otherwise what is wrong.
  std::string verify() const {
    auto bytes = readFile(path_);
    auto value = bytes ? plist::parse(*bytes) : std::nullopt;
    const plist::Array* list = value ? value->array() : nullptr;
    if (!list) return "the todo list no longer reads as an array";
    if (list->size() != expected_.size()) return "the todo list lost or gained records";
    for (std::size_t i = 0; i < list->size(); ++i) {
      const plist::Dict* record = (*list)[i].dict();
      const std::string* id = record ? plist::stringAt(*record, kTodoIdentifierKey) : nullptr;
      const std::string* op = record ? plist::stringAt(*record, kTodoOperationKey) : nullptr;
      const std::string* version = record ? plist::stringAt(*record, kTodoVersionKey) : nullptr;
      if (!id || *id != ids_[i] || !version || *version != "1.2.3") {
        return "record " + std::to_string(i) + " was damaged";
      }
      if (!op || *op != expected_[i]) {
        return "lost change: " + ids_[i] + " is " + (op ? *op : "(none)") + ", expected " +
               expected_[i];
      }
    }
    if (sink_->count() != changes()) {
      return "logged " + std::to_string(sink_->count()) + " changes of " +
             std::to_string(changes());
    }
    return {};
  }

 private:
  bench::TempDir dir_{"todo_list_bench"};
  std::string path_;
  std::vector<std::string> ids_;
  std::vector<std::string> expected_;
  std::shared_ptr<CountingLogSink> sink_ = std::make_shared<CountingLogSink>();
  FakeTRHost tr_;
  std::unique_ptr<TodoList> todo_;
  std::atomic<std::uint64_t> changes_{0};
};

void reportRewritesAndLoads(benchmark::State& state, TodoFixture& fixture) {
  const double changes = static_cast<double>(std::max<std::uint64_t>(fixture.changes(), 1));
  state.counters["rewrites_per_change"] = fixture.todo().rewriteCount() / changes;
  state.counters["loads_per_change"] = fixture.todo().loadCount() / changes;
}

// One caller, changing records in turn; after the first change the writer reuses its list.
void BM_TodoListChange(benchmark::State& state) {
  TodoFixture fixture(static_cast<int>(state.range(0)));
  if (!fixture.ok()) return state.SkipWithError("cannot write the todo list");
  int next = 0;
  for (auto _ : state) {
    fixture.change(next);
    next = (next + 1) % fixture.size();
  }
  if (std::string problem = fixture.verify(); !problem.empty()) {
    return state.SkipWithError(problem.c_str());
  }
  reportRewritesAndLoads(state, fixture);
}
BENCHMARK(BM_TodoListChange)
    ->Arg(100)
    ->Arg(1000)
    ->Arg(10000)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// One caller, but the file is replaced before every change (not timed), so every change reads
// and parses the whole list again.
void BM_TodoListChangeCold(benchmark::State& state) {
  TodoFixture fixture(static_cast<int>(state.range(0)));
  if (!fixture.ok()) return state.SkipWithError("cannot write the todo list");
  int next = 0;
  for (auto _ : state) {
    state.PauseTiming();
    const bool replaced = fixture.replaceFile();
    state.ResumeTiming();
    if (!replaced) {
      state.SkipWithError("cannot replace the todo list");
      break;
    }
    fixture.change(next);
    next = (next + 1) % fixture.size();
  }
  if (std::string problem = fixture.verify(); !problem.empty()) {
    return state.SkipWithError(problem.c_str());
  }
  reportRewritesAndLoads(state, fixture);
}
BENCHMARK(BM_TodoListChangeCold)
    ->Arg(1000)
    ->Arg(10000)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

// Ten threads share one writer, each changing its own records (record i belongs to thread
// i % 10). One iteration is one round in which every thread makes its share of changes; the
// time reported is the round's wall time divided by the changes in it, i.e. the cost of one
// change at this concurrency. After every round the file must hold every change.
void BM_TodoListChangeThreads(benchmark::State& state) {
  constexpr int kThreads = 10;
  TodoFixture fixture(static_cast<int>(state.range(0)));
  if (!fixture.ok()) return state.SkipWithError("cannot write the todo list");
  const int ownRecords = fixture.size() / kThreads;
  const int perThread = std::min(20, ownRecords);
  std::vector<int> cursor(kThreads, 0);
  double callSeconds = 0;
  using Clock = std::chrono::steady_clock;
  for (auto _ : state) {
    std::vector<double> threadCallSeconds(kThreads, 0.0);
    const Clock::time_point start = Clock::now();
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t) {
      threads.emplace_back([&, t] {
        for (int k = 0; k < perThread; ++k) {
          const int record = t + kThreads * cursor[t];
          cursor[t] = (cursor[t] + 1) % ownRecords;
          const Clock::time_point callStart = Clock::now();
          fixture.change(record);
          threadCallSeconds[t] += std::chrono::duration<double>(Clock::now() - callStart).count();
        }
      });
    }
    for (std::thread& thread : threads) thread.join();
    const double wall = std::chrono::duration<double>(Clock::now() - start).count();
    state.SetIterationTime(wall / (kThreads * perThread));
    for (double seconds : threadCallSeconds) callSeconds += seconds;
    if (std::string problem = fixture.verify(); !problem.empty()) {
      state.SkipWithError(problem.c_str());
      break;
    }
  }
  reportRewritesAndLoads(state, fixture);
  // What one caller waits for its change to be on disk (it may wait for a rewrite in progress
  // and then write a whole batch).
  state.counters["call_ms"] =
      1000.0 * callSeconds / static_cast<double>(std::max<std::uint64_t>(fixture.changes(), 1));
}
BENCHMARK(BM_TodoListChangeThreads)
    ->Arg(100)
    ->Arg(1000)
    ->Arg(10000)
    ->UseManualTime()
    ->Iterations(10)
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
