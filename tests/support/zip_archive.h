// Zip archives for tests, written entry by entry as given: names are not checked, so a test can
// make hostile archives (names leading up, absolute names, links) as well as good packages.
#pragma once

#include <sys/stat.h>
#include <zip.h>

#include <stdexcept>
#include <string>
#include <vector>

namespace appsync::testing {

struct ZipEntry {
  enum class Kind { File, Folder, Link };
  std::string name;
  std::string content{};  // a file's bytes, a link's target
  Kind kind = Kind::File;
};

// Writes the archive at `path`, replacing any file there. Throws when libzip refuses.
inline void writeZip(const std::string& path, const std::vector<ZipEntry>& entries) {
  int openError = 0;
  zip_t* archive = zip_open(path.c_str(), ZIP_CREATE | ZIP_TRUNCATE, &openError);
  if (!archive) throw std::runtime_error("cannot create " + path);
  for (const ZipEntry& entry : entries) {
    zip_int64_t index = -1;
    if (entry.kind == ZipEntry::Kind::Folder) {
      index = zip_dir_add(archive, entry.name.c_str(), ZIP_FL_ENC_UTF_8);
    } else if (zip_source_t* source =
                   zip_source_buffer(archive, entry.content.data(), entry.content.size(), 0)) {
      index = zip_file_add(archive, entry.name.c_str(), source, ZIP_FL_ENC_UTF_8);
      if (index < 0) zip_source_free(source);
    }
    if (index >= 0 && entry.kind == ZipEntry::Kind::Link) {
      zip_file_set_external_attributes(archive, static_cast<zip_uint64_t>(index), 0, ZIP_OPSYS_UNIX,
                                       (S_IFLNK | 0777u) << 16);
    }
    if (index < 0) {
      zip_discard(archive);
      throw std::runtime_error("cannot add " + entry.name + " to " + path);
    }
  }
  if (zip_close(archive) != 0) {
    zip_discard(archive);
    throw std::runtime_error("cannot write " + path);
  }
}

}  // namespace appsync::testing
