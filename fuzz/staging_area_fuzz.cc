// Fuzzes a sync on an upload the host computer wrote: reconcileSync takes the staging area over
// as the sync folder and runs its removals, then outstandingAssetTransfers reads it. Folder names
// (some of them links leading out of the device root) and the todo list's bytes come from the
// input, on either installation road. Whatever the input, nothing outside the root changes.
//
// Input: byte 0 picks the road (bit 0) and which names become links out of the root (the other
// bits, one per name in turn); then names separated by '\n' up to a NUL byte; the rest is the
// todo list file.
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "client/apps_client.h"
#include "fuzz_support.h"
#include "platform/fake/fake_platform.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace {

using namespace appsync;
namespace fs = std::filesystem;

// Every path under `dir` with its size and modification time.
std::map<std::string, std::string> snapshot(const fs::path& dir) {
  std::map<std::string, std::string> out;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
    const auto status = it->symlink_status();
    std::string facts = std::to_string(static_cast<int>(status.type()));
    if (fs::is_regular_file(status)) {
      facts += " " + std::to_string(it->file_size()) + " " +
               std::to_string(it->last_write_time().time_since_epoch().count());
    }
    out[it->path().string()] = facts;
  }
  return out;
}

// What lies outside the device root: a bundle the links point at, with its Info.plist and an
// artwork file that a placeholder would copy.
const fs::path& outside() {
  static const fs::path dir = [] {
    const fs::path path = fs::path(fuzz::workDir("staging_area_fuzz")) / "outside";
    const std::string bundle = (path / "Evil.app").string();
    if (!createDirectories(bundle) ||
        !writePlistAtomically(bundle + "/Info.plist",
                              plist::Dict{{"BNBundleIdentifier", "com.evil"},
                                          {"BNBundleDisplayName", "Evil"},
                                          {"BNBundleIconFile", "Icon.png"}},
                              plist::Format::Binary) ||
        !writeFileAtomically(bundle + "/CaravelArtwork", plist::Bytes{1, 2, 3})) {
      fuzz::fail("cannot create the outside bundle");
    }
    return path;
  }();
  return dir;
}

// A name the host can give a folder of the sync folder: one path component.
bool usableName(std::string_view name) {
  return !name.empty() && name != "." && name != ".." &&
         name.find_first_of(std::string_view("/\0", 2)) == std::string_view::npos &&
         name.size() < 200;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  static const std::map<std::string, std::string> outsideBefore = snapshot(outside());
  const fs::path base = fuzz::workDir("staging_area_fuzz");
  const fs::path root = base / "root";
  removeAll(root.string());

  const std::uint8_t flags = data[0];
  const std::string_view rest(reinterpret_cast<const char*>(data + 1), size - 1);
  const std::size_t split = rest.find('\0');
  const std::string_view names = rest.substr(0, split);
  const std::string_view todo =
      split == std::string_view::npos ? std::string_view() : rest.substr(split + 1);

  {
    FakePlatform device(root, {.coordination = (flags & 1) != 0});
    const std::string upload = device.paths().stagingArea();
    if (!createDirectories(upload)) fuzz::fail("cannot create the staging area");
    int index = 0;
    for (std::size_t start = 0; start <= names.size();) {
      std::size_t end = names.find('\n', start);
      if (end == std::string_view::npos) end = names.size();
      const std::string_view name = names.substr(start, end - start);
      start = end + 1;
      if (!usableName(name)) continue;
      const fs::path folder = fs::path(upload) / std::string(name);
      std::error_code ec;
      if (index < 7 && (flags >> (index + 1) & 1)) {
        fs::create_directory_symlink(outside() / "Evil.app", folder, ec);
      } else if (fs::create_directory(folder, ec)) {  // a name given twice is made once
        writePlistAtomically((folder / "Info.plist").string(),
                             plist::Dict{{"BNBundleIdentifier", std::string(name)},
                                         {"BNBundleDisplayName", "Fuzzed"}},
                             plist::Format::Binary);
      }
      ++index;
    }
    writeFileAtomically((fs::path(upload) / "ApplicationsSync.plist").string(),
                        plist::Bytes(todo.begin(), todo.end()));

    AppsClient client(device.platform());
    ErrorRef error;
    client.reconcileSync(1, "fuzz", nullptr, &error);
    client.outstandingAssetTransfers();
    device.ar().drain();
    device.kc().drain();
  }

  for (const auto& [path, facts] : snapshot(outside())) {
    auto before = outsideBefore.find(path);
    if (before == outsideBefore.end() || before->second != facts) {
      fuzz::fail("a file outside the root changed", path);
    }
  }
  if (snapshot(outside()).size() != outsideBefore.size()) {
    fuzz::fail("a file outside the root went away");
  }
  std::error_code ec;
  for (const auto& entry : fs::directory_iterator(base, ec)) {
    if (entry.path() != root && entry.path() != outside()) {
      fuzz::fail("written outside the root", entry.path().string());
    }
  }
  return 0;
}
