// Bundles made from a few facts: an Info.plist, an icon of the application's own colour, and the
// zip archive of a bundle, all written under the device root only.
#include "bundle_maker.h"

#include <zip.h>

#include <algorithm>
#include <cstdint>
#include <deque>
#include <memory>
#include <stdexcept>
#include <system_error>
#include <vector>

#include "device_files.h"
#include "platform/bundle_keys.h"
#include "platform/icon/png_codec.h"
#include "runtime/fs/files.h"

namespace appsync::host {

namespace fs = std::filesystem;

namespace {

constexpr std::string_view kIconFileName = "Icon.png";
constexpr int kIconSide = 120;  // the 60-point icon at twice the resolution
// Archive entries carry this time (2001-01-01 UTC) so that one bundle always packs the same.
constexpr time_t kEntryTime = 978307200;

bool isPlainName(const std::string& name) {
  return !name.empty() && name != "." && name != ".." &&
         name.find_first_of(std::string_view("/\\\0", 3)) == std::string::npos;
}

// `path` lexically inside `root` (or `root` itself).
bool isUnder(const fs::path& root, const fs::path& path) {
  const fs::path relative = path.lexically_normal().lexically_relative(root.lexically_normal());
  return !relative.empty() && *relative.begin() != "..";
}

void requireUnder(const fs::path& root, const fs::path& path) {
  if (!isUnder(root, path)) {
    throw std::runtime_error(path.string() + " is outside the device root " + root.string());
  }
}

// A square of a colour derived from the identifier (FNV-1a), darkening towards the bottom, so
// that icons of different applications are told apart at a glance.
plist::Bytes iconPng(const std::string& identifier) {
  std::uint32_t hash = 2166136261u;
  for (unsigned char c : identifier) hash = (hash ^ c) * 16777619u;
  const std::uint8_t base[3] = {static_cast<std::uint8_t>(64 + (hash & 0x7f)),
                                static_cast<std::uint8_t>(64 + ((hash >> 8) & 0x7f)),
                                static_cast<std::uint8_t>(64 + ((hash >> 16) & 0x7f))};
  icon::Image image(kIconSide, kIconSide);
  for (int y = 0; y < kIconSide; ++y) {
    for (int x = 0; x < kIconSide; ++x) {
      std::uint8_t* p = image.pixel(x, y);
      for (int c = 0; c < 3; ++c)
        p[c] = static_cast<std::uint8_t>(base[c] * (2 * kIconSide - y) / (2 * kIconSide));
      p[3] = 255;
    }
  }
  std::string why;
  std::optional<plist::Bytes> png = icon::encodePng(image, &why);
  if (!png) throw std::runtime_error("cannot encode the icon of " + identifier + ": " + why);
  return std::move(*png);
}

plist::Dict infoPlist(const BundleFacts& facts) {
  plist::Dict info;
  info.set(std::string(kBNBundleIdentifierKey), facts.identifier);
  info.set(std::string(kBNBundleVersionKey), facts.version);
  info.set(std::string(_kBNBundleDisplayNameKey), facts.name);
  if (facts.withIcon) info.set(std::string(_kBNBundleIconFileKey), std::string(kIconFileName));
  for (const auto& [key, value] : facts.extraInfo) info.set(key, value);
  return info;
}

struct ZipCloser {
  void operator()(zip_t* archive) const { zip_discard(archive); }
};

[[noreturn]] void zipFailure(const fs::path& zipPath, const std::string& what, zip_error_t* error) {
  throw std::runtime_error("cannot pack " + zipPath.string() + ": " + what + ": " +
                           zip_error_strerror(error));
}

// The files and folders of `bundle`, sorted, as archive names below "NAME.app/". Links are
// refused: an archive must not carry files from outside the bundle.
std::vector<std::pair<fs::path, std::string>> bundleEntries(const fs::path& bundle) {
  std::vector<std::pair<fs::path, std::string>> entries;
  const std::string top = bundle.filename().string();
  entries.emplace_back(bundle, top + "/");
  std::error_code ec;
  for (fs::recursive_directory_iterator it(bundle, ec), end; !ec && it != end; it.increment(ec)) {
    const fs::file_status status = it->symlink_status();
    std::string name = top + "/" + it->path().lexically_relative(bundle).generic_string();
    if (fs::is_symlink(status)) {
      throw std::runtime_error(it->path().string() + " is a symbolic link: not packed");
    }
    if (fs::is_directory(status)) name += "/";
    entries.emplace_back(it->path(), std::move(name));
  }
  if (ec) throw std::runtime_error("cannot read " + bundle.string() + ": " + ec.message());
  std::sort(entries.begin(), entries.end(),
            [](const auto& a, const auto& b) { return a.second < b.second; });
  return entries;
}

// Copies what the in-memory archive holds after it was closed.
plist::Bytes sourceBytes(zip_source_t* source, const fs::path& zipPath) {
  zip_stat_t stat;
  zip_stat_init(&stat);
  if (zip_source_stat(source, &stat) != 0 || zip_source_open(source) != 0) {
    zipFailure(zipPath, "reading the archive back", zip_source_error(source));
  }
  plist::Bytes bytes(stat.size);
  const zip_int64_t read = zip_source_read(source, bytes.data(), bytes.size());
  zip_source_close(source);
  if (read < 0 || static_cast<zip_uint64_t>(read) != stat.size) {
    zipFailure(zipPath, "reading the archive back", zip_source_error(source));
  }
  return bytes;
}

}  // namespace

fs::path makeBundle(const fs::path& root, const fs::path& directory, const BundleFacts& facts) {
  if (!isPlainName(facts.name)) {
    throw std::runtime_error("\"" + facts.name + "\" cannot name a bundle folder");
  }
  const fs::path bundle = (directory / (facts.name + ".app")).lexically_normal();
  requireUnder(root, bundle);
  makeDeviceDirectory(root, directory);
  // An earlier bundle of that name is replaced as a whole (a link there is removed, not followed).
  std::error_code ec;
  fs::remove_all(bundle, ec);
  if (ec) throw std::runtime_error("cannot replace " + bundle.string() + ": " + ec.message());
  writeDevicePlist(root, bundle / "Info.plist", infoPlist(facts), /*xml=*/true);
  if (facts.withIcon) writeDeviceFile(root, bundle / kIconFileName, iconPng(facts.identifier));
  return bundle;
}

void zipBundle(const fs::path& root, const fs::path& bundle, const fs::path& zipPath) {
  requireUnder(root, bundle);
  requireUnder(root, zipPath);
  const auto entries = bundleEntries(bundle);

  zip_error_t error;
  zip_error_init(&error);
  zip_source_t* source = zip_source_buffer_create(nullptr, 0, 0, &error);
  if (!source) zipFailure(zipPath, "creating the archive", &error);
  zip_t* opened = zip_open_from_source(source, ZIP_TRUNCATE, &error);
  if (!opened) {
    zip_source_free(source);
    zipFailure(zipPath, "creating the archive", &error);
  }
  // The archive writes into the source and releases it when closed; this reference keeps the
  // written bytes readable afterwards.
  zip_source_keep(source);
  std::unique_ptr<zip_source_t, decltype(&zip_source_free)> ownedSource(source, zip_source_free);
  std::unique_ptr<zip_t, ZipCloser> archive(opened);

  std::deque<plist::Bytes> contents;  // kept until the archive is written
  for (const auto& [path, name] : entries) {
    zip_int64_t index = -1;
    if (name.ends_with('/')) {
      index = zip_dir_add(archive.get(), name.c_str(), ZIP_FL_ENC_UTF_8);
    } else {
      ErrorRef readError;
      std::optional<plist::Bytes> bytes = readFile(path.string(), &readError);
      if (!bytes) {
        throw std::runtime_error("cannot read " + path.string() +
                                 (readError ? ": " + readError->describe() : std::string()));
      }
      contents.push_back(std::move(*bytes));
      zip_source_t* file =
          zip_source_buffer(archive.get(), contents.back().data(), contents.back().size(), 0);
      if (file) index = zip_file_add(archive.get(), name.c_str(), file, ZIP_FL_ENC_UTF_8);
      if (index < 0 && file) zip_source_free(file);
    }
    if (index < 0) zipFailure(zipPath, "adding " + name, zip_get_error(archive.get()));
    zip_file_set_mtime(archive.get(), static_cast<zip_uint64_t>(index), kEntryTime, 0);
  }
  if (zip_close(archive.get()) != 0) {
    zipFailure(zipPath, "writing the archive", zip_get_error(archive.get()));
  }
  archive.release();  // closed: zip_close freed it
  writeDeviceFile(root, zipPath, sourceBytes(source, zipPath));
}

}  // namespace appsync::host
