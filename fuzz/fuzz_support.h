// Helpers shared by the fuzz targets that work on files.
#pragma once

#include <cstdio>
#include <cstdlib>
#include <string>

#include <unistd.h>

#include "runtime/fs/files.h"

namespace appsync::fuzz {

[[noreturn]] inline void fail(const char* what, const std::string& detail = {}) {
  std::fprintf(stderr, "%s%s%s\n", what, detail.empty() ? "" : ": ", detail.c_str());
  std::abort();
}

// One directory per process, created on first use and removed at exit; never destroyed, so
// that the exit handler can still name it.
inline const std::string& workDir(const char* name) {
  static const std::string* dir = [name] {
    const char* tmp = std::getenv("TMPDIR");
    std::string pattern = std::string(tmp && *tmp ? tmp : "/tmp") + "/" + name + ".XXXXXX";
    if (!::mkdtemp(pattern.data())) fail("cannot create the work directory");
    std::atexit([] { removeAll(*dir); });
    return new std::string(pattern);
  }();
  return *dir;
}

}  // namespace appsync::fuzz
