// What the benchmarks share.
#pragma once

#include <stdlib.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>

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

// A fresh directory TMPDIR/NAME.XXXXXX (TMPDIR defaults to /tmp), removed with everything in it.
// Its path is empty when it could not be made.
class TempDir {
 public:
  explicit TempDir(std::string_view name) {
    const char* tmp = std::getenv("TMPDIR");
    std::string pattern = std::string(tmp && *tmp ? tmp : "/tmp") + "/";
    pattern.append(name).append(".XXXXXX");
    if (::mkdtemp(pattern.data())) path_ = pattern;
  }
  ~TempDir() {
    std::error_code ec;
    if (!path_.empty()) std::filesystem::remove_all(path_, ec);
  }
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;

  const std::filesystem::path& path() const { return path_; }

 private:
  std::filesystem::path path_;
};

}  // namespace appsync::bench
