// `stage: KIND`: what the host computer leaves on the device before or during a sync: the todo
// list, the icon layout, package directories with their store metadata and artwork, the
// last-sync and demoted-apps lists, the restore list, packages in the public staging folder, any
// raw file (for hostile input), and read-only files. Everything is written through
// device_files.h: under the root, never through a link. Property lists are written binary, as the
// host computer does.
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

#include "bundle_maker.h"
#include "device_files.h"
#include "platform/icon/png_codec.h"
#include "replay/action_table.h"
#include "replay/actions.h"
#include "replay/scratch_directory.h"
#include "runtime/plist/codec.h"

namespace appsync::host::replay {

namespace {

namespace fs = std::filesystem;

// A path the simulator forms (a fixed file, a package directory), checked like a script's:
// no link on the way. `field` is named when it is refused.
fs::path fixedPath(const StepContext& s, const std::string& path, const YamlField& field) {
  const fs::path relative = fs::path(path).lexically_relative(s.session.root());
  return devicePath(s.session.root(), relative.string(), field);
}

plist::Value readArray(const YamlField& field) {
  plist::Value value = field.plist();
  if (!value.array()) field.fail("expected a list");
  return value;
}

ActionResult writePlistAt(const StepContext& s, const std::string& path,
                          const plist::Value& value) {
  writeDevicePlist(s.session.root(), fixedPath(s, path, s.value), value);
  return std::nullopt;
}

// A square of one colour, derived from the identifier so that each app's artwork differs.
plist::Bytes artworkFor(const std::string& identifier) {
  const std::size_t hash = std::hash<std::string>{}(identifier);
  icon::Image image(64, 64);
  for (int y = 0; y < image.height; ++y) {
    for (int x = 0; x < image.width; ++x) {
      std::uint8_t* pixel = image.pixel(x, y);
      pixel[0] = static_cast<std::uint8_t>(hash);
      pixel[1] = static_cast<std::uint8_t>(hash >> 8);
      pixel[2] = static_cast<std::uint8_t>(hash >> 16);
      pixel[3] = 255;
    }
  }
  std::string why;
  auto png = icon::encodePng(image, &why);
  if (!png) throw StepFailed("cannot make the artwork of " + identifier + ": " + why);
  return *png;
}

std::string packageVersion(const StepContext& s) {
  auto field = s.step.optional("version");
  return field ? field->string() : std::string("1.0");
}

// CaravelStuff/ID with Info.plist, and CaravelMetadata.plist and CaravelArtwork when asked.
ActionResult stageApp(StepContext& s) {
  const YamlField idField = s.step["identifier"];
  const std::string identifier = idField.string();
  const auto directory = s.session.paths().packageDirectory(identifier);
  if (!directory) idField.fail("\"" + identifier + "\" would leave the sync folder");
  const fs::path& root = s.session.root();
  const fs::path dir = fixedPath(s, *directory, idField);
  plist::Dict info{{"BNBundleIdentifier", identifier},
                   {"BNBundleVersion", packageVersion(s)},
                   {"BNBundleDisplayName", s.step["name"].string()}};
  const auto metadata = s.step.optional("storeMetadata");
  const plist::Value storeMetadata = metadata ? plist::Value(readDict(*metadata)) : plist::Value();
  const auto artwork = s.step.optional("artwork");
  const bool withArtwork = artwork && artwork->boolean();

  makeDeviceDirectory(root, dir);
  writeDevicePlist(root, Paths::packageInfoPlist(dir.string()), info);
  if (metadata) writeDevicePlist(root, Paths::packageMetadata(dir.string()), storeMetadata);
  if (withArtwork)
    writeDeviceFile(root, Paths::packageArtwork(dir.string()), artworkFor(identifier));
  return std::nullopt;
}

// The restore list. A record's "CaravelMetadata" written as a mapping becomes the binary property
// list the host computer embeds there; data (`!data`) and anything else are written as given.
ActionResult stageRestoreList(StepContext& s) {
  const YamlField content = s.step["content"];
  plist::Value list = content.plist();
  if (plist::Dict* records = list.dict()) {
    for (auto& [bundleID, record] : *records) {
      plist::Dict* fields = record.dict();
      plist::Value* metadata = fields ? fields->find("CaravelMetadata") : nullptr;
      if (!metadata || !metadata->dict()) continue;
      std::string problem;
      std::optional<plist::Bytes> bytes = plist::writeBinary(*metadata, &problem);
      if (!bytes) content.fail(bundleID + ".CaravelMetadata: cannot be written: " + problem);
      *metadata = plist::Value(std::move(*bytes));
    }
  }
  return writePlistAt(s, s.session.paths().restoreList(), list);
}

// A bundle NAME.app (folder) or NAME.zip in the public staging folder; the result is its path.
ActionResult stagePackage(StepContext& s) {
  BundleFacts facts;
  facts.identifier = s.step["identifier"].string();
  facts.name = s.step["name"].string();
  facts.version = packageVersion(s);
  if (auto info = s.step.optional("info")) facts.extraInfo = readDict(*info);
  if (auto icon = s.step.optional("icon")) facts.withIcon = icon->boolean();

  const auto asField = s.step.optional("as");
  const auto fileField = s.step.optional("file");
  std::string kind = asField ? asField->string() : "";
  if (asField && kind != "folder" && kind != "zip") {
    asField->fail("unknown package kind \"" + kind + "\" (expected folder or zip)");
  }
  const std::string extension = fileField ? fs::path(fileField->string()).extension().string() : "";
  if (fileField && extension != ".app" && extension != ".zip") {
    fileField->fail("a package is a folder NAME.app or a zip archive NAME.zip");
  }
  if (kind.empty()) kind = extension == ".zip" ? "zip" : "folder";
  const std::string wanted = kind == "zip" ? ".zip" : ".app";
  if (fileField && extension != wanted) {
    fileField->fail("a " + kind + " package is named NAME" + wanted);
  }

  const fs::path& root = s.session.root();
  const fs::path staging = fixedPath(s, s.session.paths().publicStaging(), s.value);
  const fs::path target =
      fileField ? devicePath(staging, *fileField) : staging / (facts.name + wanted);
  makeDeviceDirectory(root, target.parent_path());
  ScratchDirectory scratch(root);
  const fs::path bundle = makeBundle(root, scratch.path(), facts);
  std::error_code ec;
  fs::remove_all(target, ec);  // a package staged before under that name is replaced
  if (kind == "zip") {
    zipBundle(root, bundle, target);
  } else {
    fs::rename(bundle, target);  // throws filesystem_error: the step fails
  }
  return plist::Value(shownPath(root, target.string()));
}

// Any file, relative to the root: a property list (binary) or raw text.
ActionResult stageFile(StepContext& s) {
  const fs::path& root = s.session.root();
  const fs::path path = devicePath(root, s.step["path"]);
  const auto plistField = s.step.optional("plist");
  const auto textField = s.step.optional("text");
  if (plistField && textField) textField->fail("give either `plist` or `text`, not both");
  if (!plistField && !textField) s.value.fail("give the file's `plist` or its `text`");
  if (plistField) {
    writeDevicePlist(root, path, plistField->plist());
  } else {
    const std::string text = textField->string();
    writeDeviceFile(root, path,
                    std::span(reinterpret_cast<const std::uint8_t*>(text.data()), text.size()));
  }
  return std::nullopt;
}

// Takes every write permission off an existing file, as a restore or a user may leave it. The
// path is checked like any other: under the root, no link on the way or at its end.
ActionResult makeReadOnly(StepContext& s) {
  const fs::path& root = s.session.root();
  const fs::path path = devicePath(root, s.step["path"]);
  if (!fs::is_regular_file(fs::symlink_status(path))) {
    throw StepFailed(shownPath(root, path.string()) + " is not a file");
  }
  fs::permissions(path, fs::perms::owner_write | fs::perms::group_write | fs::perms::others_write,
                  fs::perm_options::remove);  // throws filesystem_error: the step fails
  return std::nullopt;
}

const std::vector<ActionEntry>& stageTable() {
  static const std::vector<ActionEntry> table = {
      {"todo",
       {"list"},
       [](StepContext& s) {
         return writePlistAt(s, s.session.paths().todoList(), readArray(s.step["list"]));
       }},
      {"icon-layout",
       {"layout"},
       [](StepContext& s) {
         return writePlistAt(s, s.session.paths().iconLayout(), s.step["layout"].plist());
       }},
      {"app", {"identifier", "name", "version", "storeMetadata", "artwork"}, stageApp},
      {"last-sync",
       {"list"},
       [](StepContext& s) {
         return writePlistAt(s, s.session.paths().lastSyncAppState(), readArray(s.step["list"]));
       }},
      {"demoted",
       {"apps"},
       [](StepContext& s) {
         return writePlistAt(s, s.session.paths().demotedApps(), readDict(s.step["apps"]));
       }},
      {"restore-list", {"content"}, stageRestoreList},
      {"package", {"identifier", "name", "version", "as", "file", "info", "icon"}, stagePackage},
      {"file", {"path", "plist", "text"}, stageFile},
      {"read-only", {"path"}, makeReadOnly},
  };
  return table;
}

}  // namespace

ActionResult runHostComputer(StepContext& context) { return runFromTable(context, stageTable()); }

}  // namespace appsync::host::replay
