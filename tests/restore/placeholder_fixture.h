// A device with a client on the legacy road, and the small readers the placeholder tests share.
#pragma once

#include <gtest/gtest.h>

#include <optional>
#include <string>
#include <string_view>

#include "client/apps_client.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"

namespace appsync::testing {

// The log line of a plugin message: its "%s|" filled.
inline std::string pluginLine(std::string_view rest) {
  return std::string("com.vantor.trc.AppSync|") + std::string(rest);
}

// The root dictionary of the property list at `path`, or absent.
inline std::optional<plist::Dict> readDict(const std::string& path) {
  std::optional<plist::Bytes> bytes = readFile(path);
  if (!bytes) return std::nullopt;
  std::optional<plist::Value> root = plist::parse(*bytes);
  if (!root || !root->dict()) return std::nullopt;
  return *root->dict();
}

inline plist::Bytes binaryPlist(const plist::Value& value) {
  return plist::writeBinary(value).value();
}

// Messages of category 8 that start with `prefix`.
inline std::vector<std::string> linesStartingWith(const MemoryLogSink& log,
                                                  std::string_view prefix) {
  std::vector<std::string> out;
  for (const auto& line : log.lines()) {
    if (line.category == 8 && std::string_view(line.message).starts_with(prefix)) {
      out.push_back(line.message);
    }
  }
  return out;
}

// Expects exactly one message of category 8 starting with `prefix`, at `level`.
inline void expectOneLine(const MemoryLogSink& log, std::string_view prefix, LogLevel level) {
  const std::vector<std::string> lines = linesStartingWith(log, prefix);
  EXPECT_EQ(lines.size(), 1u) << prefix;
  for (const auto& line : log.lines()) {
    if (line.category == 8 && line.message.starts_with(prefix)) {
      EXPECT_EQ(line.level, level) << line.message;
    }
  }
}

struct PlaceholderDevice {
  TempDir root;
  FakePlatform device{root.path()};
  AppsClient client{device.platform()};

  std::string tempDir() const { return root / "tmp"; }
  std::string appsDir() const { return tempDir() + "/com.vantor.trc.Apps"; }
  std::string placeholderDir(const std::string& id) const { return appsDir() + "/" + id + ".app"; }
  // (scenario, success, description) of every scenario entry, as one line each.
  std::vector<std::string> scenarios() {
    std::vector<std::string> out;
    for (const auto& e : device.transactionLog().scenarios()) {
      out.push_back(e.scenario + (e.success ? " yes " : " no ") + e.bundleID + ": " +
                    e.description + (e.step == 0 ? "" : " (step not 0)"));
    }
    return out;
  }
};

}  // namespace appsync::testing
