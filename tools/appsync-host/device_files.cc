// Paths under the device root, checked before anything is written.
#include "device_files.h"

#include <stdexcept>
#include <system_error>

#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync::host {

namespace fs = std::filesystem;

namespace {

// Fails when a directory from `root` down to `path`'s parent, or `path` itself, is a link.
void refuseLinks(const fs::path& root, const fs::path& path) {
  fs::path at = root;
  for (const auto& part : path.lexically_relative(root)) {
    at /= part;
    std::error_code ec;
    if (fs::is_symlink(fs::symlink_status(at, ec))) {
      throw std::runtime_error(at.string() +
                               " is a symbolic link: paths on the device never pass through one");
    }
  }
}

}  // namespace

fs::path devicePath(const fs::path& root, const YamlField& field) {
  return devicePath(root, field.string(), field);
}

fs::path devicePath(const fs::path& root, const std::string& relative, const YamlField& field) {
  if (relative.empty()) field.fail("the path is empty");
  const fs::path path(relative);
  if (path.is_absolute()) {
    field.fail("\"" + relative + "\" is absolute: write it relative to the device root (var/...)");
  }
  for (const auto& part : path) {
    if (part == "..") {
      field.fail("\"" + relative + "\" has a \"..\" component: paths on the device only go down");
    }
  }
  const fs::path full = (root / path).lexically_normal();
  try {
    refuseLinks(root, full);
  } catch (const std::runtime_error& e) {
    field.fail(e.what());
  }
  return full;
}

void makeDeviceDirectory(const fs::path& root, const fs::path& path) {
  refuseLinks(root, path);
  ErrorRef error;
  if (!createDirectories(path.string(), &error)) {
    throw std::runtime_error("cannot create " + path.string() + ": " + error->describe());
  }
  refuseLinks(root, path);  // a link that appeared meanwhile
}

void writeDeviceFile(const fs::path& root, const fs::path& path,
                     std::span<const std::uint8_t> bytes) {
  makeDeviceDirectory(root, path.parent_path());
  refuseLinks(root, path);
  ErrorRef error;
  if (!writeFileAtomically(path.string(), bytes, &error)) {
    throw std::runtime_error("cannot write " + path.string() + ": " + error->describe());
  }
}

void writeDevicePlist(const fs::path& root, const fs::path& path, const plist::Value& value,
                      bool xml) {
  std::string problem;
  auto bytes = plist::write(value, xml ? plist::Format::Xml : plist::Format::Binary, &problem);
  if (!bytes) throw std::runtime_error("cannot encode " + path.string() + ": " + problem);
  writeDeviceFile(root, path, *bytes);
}

}  // namespace appsync::host
