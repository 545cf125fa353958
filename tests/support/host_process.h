// Runs the appsync-host binary (its path comes from APPSYNC_HOST, set by the build for the
// client tests) and collects its exit status and output.
#pragma once

#include <sys/wait.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

namespace appsync::testing {

struct HostRun {
  int status;
  std::string stdoutText;
  std::string stderrText;
};

inline std::string slurp(const std::filesystem::path& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream out;
  out << in.rdbuf();
  return out.str();
}

// Runs `host arguments` (arguments are passed to the shell as written) with its output captured
// in files under `scratch`.
inline HostRun runHost(const std::string& host, const std::string& arguments,
                       const std::filesystem::path& scratch) {
  const auto outFile = scratch / "stdout.txt";
  const auto errFile = scratch / "stderr.txt";
  const std::string command = "'" + host + "' " + arguments + " >'" + outFile.string() + "' 2>'" +
                              errFile.string() + "'";
  const int raw = std::system(command.c_str());
  return {WIFEXITED(raw) ? WEXITSTATUS(raw) : -1, slurp(outFile), slurp(errFile)};
}

}  // namespace appsync::testing
