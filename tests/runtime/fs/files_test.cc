// Whole-file reads and atomic writes: results, modes, leftovers and failures on disk.
#include "runtime/fs/files.h"

#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <functional>
#include <vector>

#include "support/temp_dir.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

plist::Bytes bytesOf(std::string_view text) { return plist::Bytes(text.begin(), text.end()); }

std::string contentOf(const std::string& path) {
  std::optional<plist::Bytes> bytes = readFile(path);
  return bytes ? std::string(bytes->begin(), bytes->end()) : "<unreadable>";
}

std::vector<std::string> namesIn(const fs::path& dir) {
  std::vector<std::string> names;
  for (const auto& entry : fs::directory_iterator(dir)) names.push_back(entry.path().filename());
  std::sort(names.begin(), names.end());
  return names;
}

mode_t modeOf(const std::string& path) {
  struct stat st;
  return ::stat(path.c_str(), &st) == 0 ? (st.st_mode & 07777) : 0;
}

void expectPOSIXError(const ErrorRef& error, int code, const std::string& path) {
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, kPOSIXErrorDomain);
  EXPECT_EQ(error->code, code) << error->describe();
  const std::string* named = plist::stringAt(error->userInfo, kErrorPathKey);
  ASSERT_TRUE(named);
  EXPECT_EQ(*named, path);
}

TEST(WriteFileAtomicallyTest, ReplacesContentKeepsModeAndLeavesNoTemporaryFileAndReadsBack) {
  testing::TempDir dir;
  std::string path = dir / "state.plist";
  ASSERT_TRUE(writeFileAtomically(path, bytesOf("one")));
  EXPECT_EQ(contentOf(path), "one");
  EXPECT_EQ(modeOf(path), 0644u);

  ASSERT_EQ(::chmod(path.c_str(), 0600), 0);
  ASSERT_TRUE(writeFileAtomically(path, bytesOf("two, longer than one")));
  EXPECT_EQ(contentOf(path), "two, longer than one");
  EXPECT_EQ(modeOf(path), 0600u);
  ASSERT_TRUE(writeFileAtomically(path, {}));
  EXPECT_EQ(contentOf(path), "");
  EXPECT_EQ(namesIn(dir.path()), std::vector<std::string>{"state.plist"});

  ErrorRef error;
  EXPECT_FALSE(readFile(dir / "missing.plist", &error));
  expectPOSIXError(error, ENOENT, dir / "missing.plist");
}

TEST(WriteFileAtomicallyTest, FailuresLeaveTheOldFileIntact) {
  struct FailureCase {
    std::string name;
    std::string target;  // relative to the test directory
    int expectedErrno;
    std::function<void(const testing::TempDir&)> arrange;
    std::function<void(const testing::TempDir&)> restore;
  };
  std::vector<FailureCase> cases = {
      {"missing parent directory", "absent/file", ENOENT, nullptr, nullptr},
      {"target is a directory", "dir", EISDIR,
       [](const testing::TempDir& d) { fs::create_directory(d.path() / "dir"); }, nullptr},
      // The write itself fails half-way: the file-size limit stops it at 1000 bytes.
      {"write fails part-way", "old", EFBIG,
       [](const testing::TempDir&) {
         std::signal(SIGXFSZ, SIG_IGN);
         struct rlimit limit;
         ::getrlimit(RLIMIT_FSIZE, &limit);
         limit.rlim_cur = 1000;
         ::setrlimit(RLIMIT_FSIZE, &limit);
       },
       [](const testing::TempDir&) {
         struct rlimit limit;
         ::getrlimit(RLIMIT_FSIZE, &limit);
         limit.rlim_cur = limit.rlim_max;
         ::setrlimit(RLIMIT_FSIZE, &limit);
         std::signal(SIGXFSZ, SIG_DFL);
       }},
  };
  // Permissions do not stop the superuser, so this case only means something for others.
  if (::geteuid() != 0) {
    cases.push_back(
        {"read-only directory", "old", EACCES,
         [](const testing::TempDir& d) { fs::permissions(d.path(), fs::perms(0555)); },
         [](const testing::TempDir& d) { fs::permissions(d.path(), fs::perms(0755)); }});
  }
  for (const FailureCase& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir dir;
    std::string old = dir / "old";
    ASSERT_TRUE(writeFileAtomically(old, bytesOf("old contents")));
    if (c.arrange) c.arrange(dir);
    ErrorRef error;
    bool written = writeFileAtomically(dir / c.target, plist::Bytes(4000, 'x'), &error);
    if (c.restore) c.restore(dir);
    EXPECT_FALSE(written);
    expectPOSIXError(error, c.expectedErrno, dir / c.target);
    EXPECT_EQ(contentOf(old), "old contents");
    std::vector<std::string> names = namesIn(dir.path());
    std::erase(names, "dir");
    EXPECT_EQ(names, std::vector<std::string>{"old"});
  }
}

// mkdir -p starts below the deepest directory that exists and names the whole path on failure.
TEST(CreateDirectoriesTest, MakesWhatIsMissingBelowTheDeepestExistingDirectory) {
  struct Case {
    const char* name;
    std::string relative;  // the path to make, below the temporary directory
    std::string existing;  // the prefix of it expected to exist beforehand ("" for the root)
    int expectedErrno;     // 0 for success
  };
  const std::vector<Case> cases = {
      {"all there", "a/b", "a/b", 0},
      {"last missing", "a/b/c", "a/b", 0},
      {"several missing, doubled and trailing slashes", "x//y/z/", "", 0},
      {"through a link to a directory", "link/new", "link", 0},
      {"a file on the way", "file/sub", "", ENOTDIR},
      {"a file at the end", "file", "", ENOTDIR},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    testing::TempDir dir;
    ASSERT_TRUE(createDirectory(dir / "a") && createDirectory(dir / "a/b"));
    fs::create_directory_symlink("a", dir.path() / "link");
    ASSERT_TRUE(writeFileAtomically(dir / "file", bytesOf("x")));
    const std::string root = dir.path().string();
    const std::string path = root + "/" + c.relative;
    const std::string existing = c.existing.empty() ? root : root + "/" + c.existing;
    EXPECT_EQ(path.substr(0, existingDirectoryPrefix(path)), existing);
    ErrorRef error;
    EXPECT_EQ(createDirectories(path, &error), c.expectedErrno == 0);
    if (c.expectedErrno == 0) {
      EXPECT_FALSE(error);
      EXPECT_TRUE(directoryExists(path));
    } else {
      expectPOSIXError(error, c.expectedErrno, path);
    }
  }
}

}  // namespace
}  // namespace appsync
