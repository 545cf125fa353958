// Unpacking a zip package into a scratch folder: every entry is checked first (names, kinds,
// one top-level bundle folder, the size bounds), then the entries are written below the scratch
// folder only, counting the bytes as they come.
#include "platform/fake/fake_ar_package_archive.h"

#include <sys/stat.h>
#include <zip.h>

#include <array>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <vector>

#include "runtime/fs/files.h"

namespace appsync::fake_ar {

namespace fs = std::filesystem;

namespace {

struct ArchiveDiscarder {
  void operator()(zip_t* archive) const { zip_discard(archive); }
};
struct ArchiveEntryCloser {
  void operator()(zip_file_t* file) const { zip_fclose(file); }
};
struct OutputFileCloser {
  void operator()(std::FILE* file) const { std::fclose(file); }
};

struct ArchiveEntry {
  zip_uint64_t index = 0;
  std::string name;  // without a trailing "/"
  bool directory = false;
  zip_uint64_t size = 0;
};

// The components of an entry name, or empty with *why set when the name could lead anywhere
// but down from the scratch folder.
std::vector<std::string> safeComponents(const std::string& name, std::string* why) {
  if (name.empty() || name.front() == '/') {
    *why = "the entry \"" + name + "\" has an absolute or empty name";
    return {};
  }
  if (name.find('\\') != std::string::npos || name.find('\0') != std::string::npos) {
    *why = "the entry \"" + name + "\" has a backslash or NUL in its name";
    return {};
  }
  std::vector<std::string> parts;
  std::size_t begin = 0;
  while (begin < name.size()) {
    std::size_t end = name.find('/', begin);
    if (end == std::string::npos) end = name.size();
    std::string part = name.substr(begin, end - begin);
    if (part.empty() || part == "." || part == "..") {
      *why = "the entry \"" + name + "\" has an empty, \".\" or \"..\" component";
      return {};
    }
    parts.push_back(std::move(part));
    begin = end + 1;
  }
  return parts;
}

// The entry at `index`, checked; absent with *why set.
std::optional<ArchiveEntry> checkedEntry(zip_t* archive, zip_uint64_t index, std::string* why) {
  zip_stat_t stat;
  zip_stat_init(&stat);
  if (zip_stat_index(archive, index, 0, &stat) != 0 || !(stat.valid & ZIP_STAT_NAME) ||
      !(stat.valid & ZIP_STAT_SIZE)) {
    *why = "entry " + std::to_string(index) + " cannot be read";
    return std::nullopt;
  }
  ArchiveEntry entry{.index = index, .name = stat.name, .size = stat.size};
  entry.directory = entry.name.ends_with('/');
  if (entry.directory) entry.name.pop_back();

  zip_uint8_t system = 0;
  zip_uint32_t attributes = 0;
  if (zip_file_get_external_attributes(archive, index, 0, &system, &attributes) != 0) {
    *why = "the entry \"" + entry.name + "\" has unreadable attributes";
    return std::nullopt;
  }
  if (system == ZIP_OPSYS_UNIX) {
    const mode_t type = (attributes >> 16) & S_IFMT;
    if (type == S_IFLNK) {
      *why = "the entry \"" + entry.name + "\" is a symbolic link";
      return std::nullopt;
    }
    if (type != 0 && type != S_IFREG && type != S_IFDIR) {
      *why = "the entry \"" + entry.name + "\" is neither a file nor a folder";
      return std::nullopt;
    }
    if (type == S_IFDIR) entry.directory = true;
  }
  return entry;
}

// Writes one file entry to `target`, adding what it writes to *total.
bool writeEntry(zip_t* archive, const ArchiveEntry& entry, const std::string& target,
                const ArchiveLimits& limits, std::uint64_t* total, std::string* why) {
  std::unique_ptr<zip_file_t, ArchiveEntryCloser> in(zip_fopen_index(archive, entry.index, 0));
  // "x": never through something already there.
  std::unique_ptr<std::FILE, OutputFileCloser> out(std::fopen(target.c_str(), "wbx"));
  if (!in || !out) {
    *why = "the entry \"" + entry.name + "\" cannot be unpacked";
    return false;
  }
  std::array<char, 64 * 1024> buffer;
  std::uint64_t written = 0;
  for (;;) {
    const zip_int64_t n = zip_fread(in.get(), buffer.data(), buffer.size());
    if (n < 0) {
      *why = "the entry \"" + entry.name + "\" is corrupt: " + zip_file_strerror(in.get());
      return false;
    }
    if (n == 0) break;
    written += static_cast<std::uint64_t>(n);
    *total += static_cast<std::uint64_t>(n);
    if (written > entry.size || *total > limits.maxTotalBytes) {
      *why = "the entry \"" + entry.name + "\" unpacks to more than the archive declares";
      return false;
    }
    if (std::fwrite(buffer.data(), 1, static_cast<std::size_t>(n), out.get()) !=
        static_cast<std::size_t>(n)) {
      *why = "cannot write " + target;
      return false;
    }
  }
  if (std::fclose(out.release()) != 0) {
    *why = "cannot write " + target;
    return false;
  }
  return true;
}

}  // namespace

bool isPackageArchive(const std::string& path) {
  std::error_code ec;
  return fs::path(path).extension() == ".zip" && fs::is_regular_file(path, ec);
}

std::optional<std::string> unpackPackageArchive(const std::string& archivePath,
                                                const std::string& scratch,
                                                const ArchiveLimits& limits, std::string* why) {
  int openError = 0;
  std::unique_ptr<zip_t, ArchiveDiscarder> archive(
      zip_open(archivePath.c_str(), ZIP_RDONLY | ZIP_CHECKCONS, &openError));
  if (!archive) {
    zip_error_t error;
    zip_error_init_with_code(&error, openError);
    *why = std::string("not a readable zip archive: ") + zip_error_strerror(&error);
    zip_error_fini(&error);
    return std::nullopt;
  }
  const zip_int64_t count = zip_get_num_entries(archive.get(), 0);
  if (count < 0 || static_cast<std::uint64_t>(count) > limits.maxEntries) {
    *why = "the archive has more than " + std::to_string(limits.maxEntries) + " entries";
    return std::nullopt;
  }

  std::vector<ArchiveEntry> entries;
  std::optional<std::string> bundleName;
  std::uint64_t declared = 0;
  for (zip_uint64_t i = 0; i < static_cast<zip_uint64_t>(count); ++i) {
    std::optional<ArchiveEntry> entry = checkedEntry(archive.get(), i, why);
    if (!entry) return std::nullopt;
    std::vector<std::string> parts = safeComponents(entry->name, why);
    if (parts.empty()) return std::nullopt;
    if (parts.size() == 1 && !entry->directory) {
      *why = "the file \"" + entry->name + "\" lies outside a bundle folder";
      return std::nullopt;
    }
    if (bundleName && *bundleName != parts.front()) {
      *why = "the archive holds more than one top-level folder (" + *bundleName + ", " +
             parts.front() + ")";
      return std::nullopt;
    }
    bundleName = parts.front();
    declared += entry->size;
    if (declared > limits.maxTotalBytes) {
      *why = "the archive unpacks to more than " + std::to_string(limits.maxTotalBytes) + " bytes";
      return std::nullopt;
    }
    entries.push_back(std::move(*entry));
  }
  if (!bundleName || !bundleName->ends_with(".app") || *bundleName == ".app") {
    *why = "the archive holds no NAME.app bundle folder";
    return std::nullopt;
  }

  if (fs::exists(fs::symlink_status(scratch)) || !createDirectories(scratch)) {
    *why = "cannot make the scratch folder " + scratch;
    return std::nullopt;
  }
  std::uint64_t total = 0;
  for (const ArchiveEntry& entry : entries) {
    const std::string target = scratch + "/" + entry.name;
    if (entry.directory) {
      if (!createDirectories(target)) {
        *why = "cannot make " + target;
        return std::nullopt;
      }
      continue;
    }
    if (!createDirectories(fs::path(target).parent_path().string())) {
      *why = "cannot make the folder of " + target;
      return std::nullopt;
    }
    if (!writeEntry(archive.get(), entry, target, limits, &total, why)) return std::nullopt;
  }
  return scratch + "/" + *bundleName;
}

}  // namespace appsync::fake_ar
