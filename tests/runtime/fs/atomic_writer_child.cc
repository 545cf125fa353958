// The writer process of the torn-write test: rewrites one file atomically, alternating between
// two versions, until it is killed. It writes one byte to its standard output once the file has
// been written completely for the first time, so that the test kills it only mid-loop.
#include <unistd.h>

#include <cstdio>

#include "runtime/fs/files.h"
#include "torn_write_versions.h"

int main(int argc, char** argv) {
  if (argc != 2) {
    std::fprintf(stderr, "usage: %s FILE\n", argv[0]);
    return 2;
  }
  const std::vector<std::uint8_t> versions[2] = {appsync::testing::tornWriteVersion(0),
                                                 appsync::testing::tornWriteVersion(1)};
  bool announced = false;
  for (unsigned long n = 0;; ++n) {
    appsync::ErrorRef error;
    if (!appsync::writeFileAtomically(argv[1], versions[n % 2], &error)) {
      std::fprintf(stderr, "%s\n", error->describe().c_str());
      return 1;
    }
    if (!announced) {
      announced = ::write(STDOUT_FILENO, "r", 1) == 1;
      if (!announced) return 1;
    }
  }
}
