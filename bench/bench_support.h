// What the benchmarks share.
#pragma once

#include <atomic>
#include <cstdint>
#include <string_view>

#include "runtime/log/log.h"

namespace appsync::bench {

// Logging stays on as in production, but the lines are only counted: a memory sink would grow
// for the whole run and be counted as the measured work's own memory.
class CountingLogSink final : public LogSink {
 public:
  void write(int, LogLevel, std::string_view) override {
    count_.fetch_add(1, std::memory_order_relaxed);
  }
  std::uint64_t count() const { return count_.load(); }

 private:
  std::atomic<std::uint64_t> count_{0};
};

}  // namespace appsync::bench
