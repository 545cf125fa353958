// Atomic writes survive the writer being killed at any moment: after each kill the file is
// exactly one of the complete versions.
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <random>
#include <thread>

#include "runtime/fs/files.h"
#include "support/temp_dir.h"
#include "torn_write_versions.h"

extern char** environ;

namespace appsync {
namespace {

// Starts the writer on `path`; returns its pid once it has written the file completely once.
pid_t startWriter(const std::string& path) {
  int fds[2];
  if (::pipe(fds) != 0) return -1;
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, fds[1], STDOUT_FILENO);
  posix_spawn_file_actions_addclose(&actions, fds[0]);
  posix_spawn_file_actions_addclose(&actions, fds[1]);
  std::string program = APPSYNC_ATOMIC_WRITER_CHILD;
  char* argv[] = {program.data(), const_cast<char*>(path.c_str()), nullptr};
  pid_t pid = -1;
  int spawned = posix_spawn(&pid, program.c_str(), &actions, nullptr, argv, environ);
  posix_spawn_file_actions_destroy(&actions);
  ::close(fds[1]);
  char ready = 0;
  ssize_t n = spawned == 0 ? ::read(fds[0], &ready, 1) : -1;
  ::close(fds[0]);
  if (spawned != 0) return -1;
  if (n != 1) {
    ::kill(pid, SIGKILL);
    ::waitpid(pid, nullptr, 0);
    return -1;
  }
  return pid;
}

TEST(TornWriteTest, KilledWriterLeavesOneCompleteVersion) {
  testing::TempDir dir;
  std::string path = dir / "alternating.bin";
  const plist::Bytes versions[2] = {testing::tornWriteVersion(0), testing::tornWriteVersion(1)};
  std::mt19937 random(20261122);
  std::uniform_int_distribution<int> delayMicros(0, 4000);
  for (int round = 0; round < 20; ++round) {
    pid_t writer = startWriter(path);
    ASSERT_GT(writer, 0) << "the writer did not start";
    std::this_thread::sleep_for(std::chrono::microseconds(delayMicros(random)));
    ASSERT_EQ(::kill(writer, SIGKILL), 0);
    int status = 0;
    ASSERT_EQ(::waitpid(writer, &status, 0), writer);
    ASSERT_TRUE(WIFSIGNALED(status)) << "the writer stopped by itself, status " << status;

    std::optional<plist::Bytes> bytes = readFile(path);
    ASSERT_TRUE(bytes);
    EXPECT_TRUE(*bytes == versions[0] || *bytes == versions[1])
        << "kill " << round << " left a torn file of " << bytes->size() << " bytes";
  }
}

}  // namespace
}  // namespace appsync
