// Icon lookup in a bundle: Info.plist keys, file variants, choice by size.
#include "platform/icon/icon_lookup.h"

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <span>

#include "runtime/plist/codec.h"
#include "platform/icon/png_codec.h"

namespace appsync::icon {
namespace {

constexpr const char* kIconsKey = "BNBundleIcons";
constexpr const char* kTabletIconsKey = "BNBundleIcons~tablet";
constexpr const char* kPrimaryIconKey = "BNBundlePrimaryIcon";
constexpr const char* kIconFilesKey = "BNBundleIconFiles";
constexpr const char* kIconFileKey = "BNBundleIconFile";

constexpr const char* kVariantSuffixes[] = {"",        "@2x",        "@3x",
                                            "~tablet", "@2x~tablet", "@3x~tablet"};

void addName(std::vector<std::string>& names, const std::string& name) {
  if (std::find(names.begin(), names.end(), name) == names.end()) names.push_back(name);
}

void addNames(std::vector<std::string>& names, const plist::Array* array) {
  if (!array) return;
  for (const plist::Value& v : *array) {
    if (const std::string* s = v.string()) addName(names, *s);
  }
}

// BNBundleIcons-style dictionary -> BNBundlePrimaryIcon -> BNBundleIconFiles.
void addPrimaryIconNames(std::vector<std::string>& names, const plist::Dict& info,
                         const char* iconsKey) {
  const plist::Dict* icons = plist::dictAt(info, iconsKey);
  const plist::Dict* primary = icons ? plist::dictAt(*icons, kPrimaryIconKey) : nullptr;
  if (primary) addNames(names, plist::arrayAt(*primary, kIconFilesKey));
}

bool isSafeName(const std::string& name) {
  return !name.empty() && name != "." && name != ".." &&
         name.find_first_of(std::string_view("/\0", 2)) == std::string::npos;
}

// True when the entry `name` of `bundleDir` is a regular file that, with symbolic links
// resolved, lies inside the bundle: a link in a bundle must not make the renderer read files
// elsewhere. `name` is one path component (no "/", not "." or ".."), so an entry that is not a
// link lies inside the bundle as it stands; only a link has its target resolved and compared.
bool isBundleFile(const std::string& bundleDir, const std::string& name) {
  namespace fs = std::filesystem;
  if (bundleDir.empty()) return false;  // no bundle, and not the working directory either
  const fs::path path = fs::path(bundleDir) / name;
  std::error_code ec;
  const fs::file_status entry = fs::symlink_status(path, ec);
  if (ec) return false;
  if (fs::is_regular_file(entry)) return true;
  if (!fs::is_symlink(entry) || !fs::is_regular_file(path, ec)) return false;
  const fs::path base = fs::canonical(bundleDir, ec);
  if (ec) return false;
  const fs::path target = fs::canonical(path, ec);
  if (ec) return false;
  return std::mismatch(base.begin(), base.end(), target.begin(), target.end()).first == base.end();
}

bool readWholeFile(const std::string& path, std::size_t limit, std::vector<std::uint8_t>* out,
                   std::string* why) {
  std::error_code ec;
  const std::uintmax_t size = std::filesystem::file_size(path, ec);
  if (ec) {
    *why = path + ": " + ec.message();
    return false;
  }
  if (size > limit) {
    *why = path + ": file of " + std::to_string(size) + " bytes is over the limit of " +
           std::to_string(limit);
    return false;
  }
  std::ifstream in(path, std::ios::binary);
  if (!in) {
    *why = path + ": cannot be opened";
    return false;
  }
  out->resize(static_cast<std::size_t>(size));
  in.read(reinterpret_cast<char*>(out->data()), static_cast<std::streamsize>(size));
  if (static_cast<std::uintmax_t>(in.gcount()) != size) {
    *why = path + ": read error";
    return false;
  }
  return true;
}

struct Candidate {
  std::string path;
  std::vector<std::uint8_t> bytes;
  std::uint32_t shorterSide;
  std::uint64_t area;
};

// Tries one tier's names; appends what went wrong with each file to `problems`.
std::optional<BundleIcon> chooseFromTier(const std::string& bundleDir,
                                         const std::vector<std::string>& names, int targetSize,
                                         std::vector<std::string>& problems, bool* anyFile) {
  std::vector<std::string> paths;
  for (const std::string& name : names) {
    for (std::string& path : iconFileCandidates(bundleDir, name)) {
      if (std::find(paths.begin(), paths.end(), path) == paths.end()) {
        paths.push_back(std::move(path));
      }
    }
  }
  std::vector<Candidate> candidates;
  for (const std::string& path : paths) {
    *anyFile = true;
    Candidate c{path, {}, 0, 0};
    std::string problem;
    if (!readWholeFile(path, kMaxIconFileBytes, &c.bytes, &problem)) {
      problems.push_back(problem);
      continue;
    }
    const std::optional<PngHeader> header = readPngHeader(c.bytes, &problem);
    if (!header) {
      problems.push_back(path + ": " + problem);
      continue;
    }
    c.shorterSide = std::min(header->width, header->height);
    c.area = std::uint64_t{header->width} * header->height;
    candidates.push_back(std::move(c));
  }
  // Big enough ones first, smallest of those first; then the too-small ones, largest first.
  const auto target = static_cast<std::uint32_t>(std::max(targetSize, 0));
  std::stable_sort(candidates.begin(), candidates.end(),
                   [target](const Candidate& a, const Candidate& b) {
                     const bool aFits = a.shorterSide >= target;
                     const bool bFits = b.shorterSide >= target;
                     if (aFits != bFits) return aFits;
                     if (a.shorterSide != b.shorterSide) {
                       return aFits ? a.shorterSide < b.shorterSide : a.shorterSide > b.shorterSide;
                     }
                     return aFits ? a.area < b.area : a.area > b.area;
                   });
  for (Candidate& c : candidates) {
    std::string problem;
    std::optional<Image> image = decodePng(c.bytes, &problem);
    if (image) return BundleIcon{std::move(c.path), std::move(*image)};
    problems.push_back(c.path + ": " + problem);
  }
  return std::nullopt;
}

std::string joined(const std::vector<std::string>& items, const char* separator) {
  std::string out;
  for (const std::string& item : items) {
    if (!out.empty()) out += separator;
    out += item;
  }
  return out;
}

}  // namespace

std::vector<std::vector<std::string>> iconNameTiers(const plist::Dict& info, DeviceIdiom idiom) {
  std::vector<std::string> phone;
  addPrimaryIconNames(phone, info, kIconsKey);
  addNames(phone, plist::arrayAt(info, kIconFilesKey));
  if (const std::string* single = plist::stringAt(info, kIconFileKey)) addName(phone, *single);

  std::vector<std::string> tablet;
  addPrimaryIconNames(tablet, info, kTabletIconsKey);

  std::vector<std::vector<std::string>> tiers;
  if (idiom == DeviceIdiom::Tablet) std::swap(phone, tablet);
  if (!phone.empty()) tiers.push_back(std::move(phone));
  if (!tablet.empty()) tiers.push_back(std::move(tablet));
  return tiers;
}

std::vector<std::string> iconFileCandidates(const std::string& bundleDir, const std::string& name) {
  std::vector<std::string> files;
  if (!isSafeName(name)) return files;
  std::string base = name;
  if (base.size() > 4 && base.ends_with(".png")) base.resize(base.size() - 4);
  for (const char* suffix : kVariantSuffixes) {
    const std::string file = base + suffix + ".png";
    if (isBundleFile(bundleDir, file)) {
      files.push_back((std::filesystem::path(bundleDir) / file).string());
    }
  }
  return files;
}

std::optional<BundleIcon> findBundleIcon(const std::string& bundleDir, int targetSize,
                                         DeviceIdiom idiom, std::string* why) {
  std::string problem;
  auto failWith = [why](std::string message) -> std::optional<BundleIcon> {
    if (why) *why = std::move(message);
    return std::nullopt;
  };
  const std::string infoPath = (std::filesystem::path(bundleDir) / "Info.plist").string();
  if (!isBundleFile(bundleDir, "Info.plist")) return failWith("no Info.plist in " + bundleDir);
  std::vector<std::uint8_t> infoBytes;
  if (!readWholeFile(infoPath, plist::kMaxInputSize, &infoBytes, &problem)) {
    return failWith(problem);
  }
  plist::ParseError parseError;
  const std::optional<plist::Value> info = plist::parse(infoBytes, &parseError);
  if (!info) return failWith(infoPath + ": " + parseError.message);
  if (!info->dict()) return failWith(infoPath + ": the root is not a dictionary");

  const std::vector<std::vector<std::string>> tiers = iconNameTiers(*info->dict(), idiom);
  if (tiers.empty()) return failWith(infoPath + " names no icon files");

  std::vector<std::string> problems;
  bool anyFile = false;
  for (const std::vector<std::string>& names : tiers) {
    std::optional<BundleIcon> icon =
        chooseFromTier(bundleDir, names, targetSize, problems, &anyFile);
    if (icon) return icon;
  }
  if (!anyFile) {
    std::vector<std::string> all;
    for (const auto& names : tiers) all.insert(all.end(), names.begin(), names.end());
    return failWith("none of the icon files named in Info.plist (" + joined(all, ", ") +
                    ") exists in " + bundleDir);
  }
  return failWith("no icon file of " + bundleDir + " decodes: " + joined(problems, "; "));
}

}  // namespace appsync::icon
