// The log sinks: in memory for tests, and one line per message in a file.
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <ctime>

#include "runtime/fs/files.h"
#include "runtime/log/log.h"

namespace appsync {

void MemoryLogSink::write(int category, LogLevel level, std::string_view message) {
  std::lock_guard<std::mutex> guard(mutex_);
  lines_.push_back(Line{category, level, std::string(message)});
}

std::vector<MemoryLogSink::Line> MemoryLogSink::lines() const {
  std::lock_guard<std::mutex> guard(mutex_);
  return lines_;
}

std::vector<std::string> MemoryLogSink::messages() const {
  std::lock_guard<std::mutex> guard(mutex_);
  std::vector<std::string> out;
  out.reserve(lines_.size());
  for (const Line& line : lines_) out.push_back(line.message);
  return out;
}

std::size_t MemoryLogSink::count(std::string_view message) const {
  std::lock_guard<std::mutex> guard(mutex_);
  return static_cast<std::size_t>(std::count_if(
      lines_.begin(), lines_.end(), [&](const Line& line) { return line.message == message; }));
}

void MemoryLogSink::clear() {
  std::lock_guard<std::mutex> guard(mutex_);
  lines_.clear();
}

FileLogSink::FileLogSink(std::string path) : file_(openFileForAppending(path)) {}

FileLogSink::~FileLogSink() {
  if (file_) std::fclose(file_);
}

namespace {

// 2026-11-22T19:40:54.123Z
std::string utcTimestamp(std::chrono::system_clock::time_point when) {
  auto sinceEpoch = when.time_since_epoch();
  auto seconds = std::chrono::floor<std::chrono::seconds>(sinceEpoch);
  auto millis = std::chrono::duration_cast<std::chrono::milliseconds>(sinceEpoch - seconds);
  std::time_t t = static_cast<std::time_t>(seconds.count());
  std::tm tm{};
  gmtime_r(&t, &tm);
  char buffer[48];
  std::size_t n = std::strftime(buffer, sizeof buffer, "%Y-%m-%dT%H:%M:%S", &tm);
  std::snprintf(buffer + n, sizeof buffer - n, ".%03dZ", static_cast<int>(millis.count()));
  return buffer;
}

}  // namespace

void FileLogSink::write(int category, LogLevel level, std::string_view message) {
  std::string line = utcTimestamp(std::chrono::system_clock::now());
  line += '\t';
  line += std::to_string(category);
  line += '\t';
  line += logLevelName(level);
  line += '\t';
  // One message, one line: an embedded newline becomes the two characters \n.
  for (char c : message) {
    if (c == '\n') {
      line += "\\n";
    } else {
      line += c;
    }
  }
  line += '\n';
  std::lock_guard<std::mutex> guard(mutex_);
  if (!file_) return;
  std::fwrite(line.data(), 1, line.size(), file_);
  std::fflush(file_);
}

}  // namespace appsync
