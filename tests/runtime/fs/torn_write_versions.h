// The two file versions the torn-write test alternates between, shared by the test and its
// writer process.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

namespace appsync::testing {

// Version 0 is 200 KB, version 1 is 300 KB; every byte depends on the version and position, so
// a file made of parts of both, or cut short, matches neither.
inline std::vector<std::uint8_t> tornWriteVersion(int which) {
  std::size_t size = which == 0 ? 200 * 1024 : 300 * 1024;
  std::vector<std::uint8_t> bytes(size);
  for (std::size_t i = 0; i < size; ++i) {
    bytes[i] = static_cast<std::uint8_t>((i * 131 + i / 251 + (which ? 0x5a : 0xa5)) & 0xff);
  }
  return bytes;
}

}  // namespace appsync::testing
