// Unpacking a package delivered as a zip archive: the archive holds one bundle folder NAME.app,
// which the fake registry installs like a bundle folder given directly. Every entry is checked
// before anything is written, so a hostile archive writes nothing.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace appsync::fake_ar {

// What one archive may unpack to. Archives over either bound are refused before anything is
// written, and bytes are counted again while writing, so sizes that lie are caught as well.
struct ArchiveLimits {
  std::uint64_t maxTotalBytes = std::uint64_t{1} << 30;  // 1 GiB, uncompressed
  std::uint64_t maxEntries = 65536;
};

// True for the path of a regular file named NAME.zip.
bool isPackageArchive(const std::string& path);

// Unpacks the archive at `archive` into `scratch` (which must not exist yet; it is created) and
// returns the path of the bundle folder in it. Refused, with *why set and only `scratch`
// possibly written, when the archive cannot be read, when an entry's name is absolute or has a
// ".." or "." component, when an entry is a link or anything but a file or folder, when the
// entries are not all inside one top-level folder NAME.app, or when the archive exceeds
// `limits`. The caller removes `scratch` in every case.
std::optional<std::string> unpackPackageArchive(const std::string& archive,
                                                const std::string& scratch,
                                                const ArchiveLimits& limits, std::string* why);

}  // namespace appsync::fake_ar
