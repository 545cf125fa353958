// Writing and reading whole files as text in tests.
#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <filesystem>
#include <span>
#include <string>
#include <string_view>

#include "runtime/fs/files.h"

namespace appsync::testing {

// Replaces the file with `text` (atomically, as the plugin writes); fails the test if it cannot.
inline void writeText(const std::filesystem::path& path, std::string_view text) {
  ASSERT_TRUE(writeFileAtomically(
      path.string(), std::span(reinterpret_cast<const std::uint8_t*>(text.data()), text.size())));
}

// The file's bytes as a string; empty when it cannot be read.
inline std::string readText(const std::filesystem::path& path) {
  auto bytes = readFile(path.string());
  return bytes ? std::string(bytes->begin(), bytes->end()) : std::string();
}

}  // namespace appsync::testing
