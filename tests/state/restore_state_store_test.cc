// The restore state store: shape of the file, absence rules, bad files, concurrent writers.
#include "state/restore_state_store.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"
#include "support/temp_dir.h"
#include "support/text_file.h"

namespace appsync {
namespace {

using testing::readText;
using testing::writeText;

class RestoreStateStoreTest : public ::testing::Test {
 protected:
  testing::TempDir dir;
  std::string path = dir / "RestoreState.plist";
  RestoreStateStore store{path};
};

TEST_F(RestoreStateStoreTest, VersionsAreKeptApartAndCleanedTogether) {
  store.setProperty("/pkg/a-1.zip", "path", "com.a", std::string("1.0"));
  store.setProperty("/pkg/a-2.zip", "path", "com.a", std::string("2.0"));
  store.setProperty("/pkg/b.zip", "path", "com.b", std::string("1.0"));

  EXPECT_EQ(store.property("path", "com.a", std::string("1.0")), plist::Value("/pkg/a-1.zip"));
  EXPECT_EQ(store.property("path", "com.a", std::string("2.0")), plist::Value("/pkg/a-2.zip"));
  EXPECT_EQ(store.property("path", "com.a", std::string("3.0")), std::nullopt);
  EXPECT_EQ(store.property("path", "com.a", std::nullopt), std::nullopt);
  EXPECT_EQ(store.property("other", "com.a", std::string("1.0")), std::nullopt);

  // The file is an XML property list of three dictionary levels.
  EXPECT_NE(readText(path).find("<?xml"), std::string::npos);
  auto bytes = readFile(path);
  auto root = plist::parse(*bytes);
  ASSERT_TRUE(root && root->dict());
  EXPECT_EQ(root->dict()->size(), 2u);

  store.clean("com.a");
  EXPECT_EQ(store.property("path", "com.a", std::string("1.0")), std::nullopt);
  EXPECT_EQ(store.property("path", "com.a", std::string("2.0")), std::nullopt);
  EXPECT_EQ(store.property("path", "com.b", std::string("1.0")), plist::Value("/pkg/b.zip"));
}

TEST_F(RestoreStateStoreTest, CleaningTheLastIdentifierDeletesTheFileAndAWriteRecreatesIt) {
  store.setProperty("/pkg/a.zip", "path", "com.a", std::nullopt);  // no version: nothing written
  EXPECT_FALSE(fileExists(path));
  store.setProperty("/pkg/a.zip", "path", "com.a", std::string("1.0"));
  store.clean("com.a");
  EXPECT_FALSE(fileExists(path));
  EXPECT_EQ(store.property("path", "com.a", std::string("1.0")), std::nullopt);
  store.clean("com.a");  // nothing to read: nothing happens
  EXPECT_FALSE(fileExists(path));
  store.setProperty("/pkg/a.zip", "path", "com.a", std::string("1.0"));
  EXPECT_TRUE(fileExists(path));
}

TEST_F(RestoreStateStoreTest, UnusableFilesAnswerNothingAreNotRewrittenAndAreDeletedByAClean) {
  const std::vector<std::pair<const char*, std::string>> cases = {
      {"root is an array",
       "<?xml version=\"1.0\"?><plist><array><string>com.a</string></array></plist>"},
      {"truncated binary", "bplist00\xd1\x01\x02"},
      {"empty file", ""},
  };
  for (const auto& [name, content] : cases) {
    SCOPED_TRACE(name);
    writeText(path, content);
    EXPECT_EQ(store.property("path", "com.a", std::string("1.0")), std::nullopt);
    store.setProperty("/pkg/a.zip", "path", "com.a", std::string("1.0"));
    EXPECT_EQ(readText(path), content);
    store.clean("com.a");
    EXPECT_FALSE(fileExists(path));
  }
}

TEST_F(RestoreStateStoreTest, EntriesOfAnotherShapeAreLeftAlone) {
  writeText(path,
            "<?xml version=\"1.0\"?><plist><dict><key>com.a</key><string>odd</string>"
            "<key>com.b</key><dict><key>1.0</key><integer>3</integer></dict></dict></plist>");
  const std::string before = readText(path);
  EXPECT_EQ(store.property("path", "com.a", std::string("1.0")), std::nullopt);
  EXPECT_EQ(store.property("path", "com.b", std::string("1.0")), std::nullopt);
  store.setProperty("/x", "path", "com.a", std::string("1.0"));
  store.setProperty("/x", "path", "com.b", std::string("1.0"));
  EXPECT_EQ(readText(path), before);
}

TEST_F(RestoreStateStoreTest, ConcurrentWritersAndCleanersLoseNothing) {
  constexpr int kThreads = 10, kPerThread = 20;
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kPerThread; ++i) {
        std::string id = "com.keep." + std::to_string(t) + "." + std::to_string(i);
        store.setProperty("/pkg/" + id, "path", id, std::string("1.0"));
        std::string gone = "com.gone." + std::to_string(t) + "." + std::to_string(i);
        store.setProperty("/pkg/" + gone, "path", gone, std::string("1.0"));
        store.clean(gone);
      }
    });
  }
  for (auto& t : threads) t.join();
  for (int t = 0; t < kThreads; ++t) {
    for (int i = 0; i < kPerThread; ++i) {
      std::string id = "com.keep." + std::to_string(t) + "." + std::to_string(i);
      ASSERT_EQ(store.property("path", id, std::string("1.0")), plist::Value("/pkg/" + id)) << id;
      std::string gone = "com.gone." + std::to_string(t) + "." + std::to_string(i);
      ASSERT_EQ(store.property("path", gone, std::string("1.0")), std::nullopt) << gone;
    }
  }
}

}  // namespace
}  // namespace appsync
