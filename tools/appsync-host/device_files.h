// Files that appsync-host puts on a device for a description or a script: named by a path
// relative to the device root, and never written outside it.
#pragma once

#include <filesystem>
#include <span>
#include <string>

#include "runtime/plist/value.h"
#include "yaml_input.h"

namespace appsync::host {

// The place under `root` that the text of `field` names. The text must be relative ("var/...",
// not "/var/..."), without ".." components, and no directory on the way may be a symbolic link;
// otherwise an InputError names the field.
std::filesystem::path devicePath(const std::filesystem::path& root, const YamlField& field);
// The same check for a path formed by the simulator itself (`what` names it in the message).
std::filesystem::path devicePath(const std::filesystem::path& root, const std::string& relative,
                                 const YamlField& field);

// Writes `bytes` to `path` (under `root`) atomically, creating the directories on the way. A
// directory on the way, or the file itself, that is a symbolic link is refused. Failures are
// std::runtime_error naming the path.
void writeDeviceFile(const std::filesystem::path& root, const std::filesystem::path& path,
                     std::span<const std::uint8_t> bytes);
// A property list written as binary (the host computer's format) or XML.
void writeDevicePlist(const std::filesystem::path& root, const std::filesystem::path& path,
                      const plist::Value& value, bool xml = false);
// Creates `path` and its parents under `root`, refusing links on the way.
void makeDeviceDirectory(const std::filesystem::path& root, const std::filesystem::path& path);

}  // namespace appsync::host
