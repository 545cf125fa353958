// Fuzzes the restore state store on a hostile RestoreState.plist: reads answer what the file
// holds, a write leaves an unusable file (or one of another shape) byte-for-byte alone and
// otherwise writes exactly the old contents plus the property, and a clean removes exactly the
// identifier (the file goes when nothing usable is left).
#include <stdlib.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <optional>
#include <string>

#include "runtime/fs/files.h"
#include "fuzz_support.h"
#include "runtime/plist/codec.h"
#include "state/restore_state_store.h"

namespace {

using namespace appsync;

using fuzz::fail;

const std::string& workDir() { return fuzz::workDir("restore_state_fuzz"); }

std::optional<plist::Bytes> contents(const std::string& path) {
  return fileExists(path) ? readFile(path) : std::nullopt;
}

// The root dictionary the store would work on, or absent when the bytes are not one.
std::optional<plist::Dict> rootOf(const std::optional<plist::Bytes>& bytes) {
  if (!bytes) return std::nullopt;
  std::optional<plist::Value> value = plist::parse(*bytes);
  if (!value || !value->dict()) return std::nullopt;
  return std::move(*value->dict());
}

// root[identifier][version][key] by hand.
std::optional<plist::Value> lookup(const std::optional<plist::Dict>& root,
                                   const std::string& identifier,
                                   const std::optional<std::string>& version,
                                   const std::string& key) {
  if (!root || !version) return std::nullopt;
  const plist::Dict* versions = plist::dictAt(*root, identifier);
  const plist::Dict* properties = versions ? plist::dictAt(*versions, *version) : nullptr;
  const plist::Value* value = properties ? properties->find(key) : nullptr;
  if (!value) return std::nullopt;
  return *value;
}

// What the file should hold after `root` is written back: its XML, or the old bytes when XML
// cannot carry it (the write then fails and leaves the file as it was).
std::optional<plist::Bytes> written(const plist::Dict& root,
                                    const std::optional<plist::Bytes>& before) {
  std::optional<std::string> xml = plist::writeXml(plist::Value(root));
  if (!xml) return before;
  return plist::Bytes(xml->begin(), xml->end());
}

void expectFile(const std::string& path, const std::optional<plist::Bytes>& expected,
                const char* after) {
  const std::optional<plist::Bytes> actual = contents(path);
  if (actual != expected) {
    fail(expected ? (actual ? "unexpected contents after" : "file removed by") : "file kept by",
         after);
  }
}

// Equality that holds for NaN too (a file may hold NaN reals and dates): the same binary form.
bool identical(const std::optional<plist::Value>& a, const std::optional<plist::Value>& b) {
  if (!a || !b) return !a && !b;
  std::optional<plist::Bytes> x = plist::writeBinary(*a), y = plist::writeBinary(*b);
  return x && y ? *x == *y : *a == *b;
}

void checkProperty(RestoreStateStore& store, const std::string& path, const std::string& identifier,
                   const std::optional<std::string>& version, const std::string& key) {
  const std::optional<plist::Value> expected =
      lookup(rootOf(contents(path)), identifier, version, key);
  if (!identical(store.property(key, identifier, version), expected)) fail("property() differs");
}

void checkSetProperty(RestoreStateStore& store, const std::string& path, plist::Value value,
                      const std::string& identifier, const std::optional<std::string>& version,
                      const std::string& key) {
  const std::optional<plist::Bytes> before = contents(path);
  std::optional<plist::Dict> root = before ? rootOf(before) : plist::Dict();
  std::optional<plist::Bytes> expected = before;
  if (root && version) {
    if (!root->contains(identifier)) root->set(identifier, plist::Dict());
    plist::Dict* versions = root->find(identifier)->dict();
    if (versions && !versions->contains(*version)) versions->set(*version, plist::Dict());
    plist::Dict* properties = versions ? versions->find(*version)->dict() : nullptr;
    if (properties) {
      properties->set(key, value);
      expected = written(*root, before);
    }
  }
  store.setProperty(std::move(value), key, identifier, version);
  expectFile(path, expected, "setProperty");
}

void checkClean(RestoreStateStore& store, const std::string& path, const std::string& identifier) {
  const std::optional<plist::Bytes> before = contents(path);
  std::optional<plist::Bytes> expected;
  if (before) {
    std::optional<plist::Dict> root = rootOf(before);
    if (root) root->erase(identifier);
    if (root && !root->empty()) expected = written(*root, before);
  }
  store.clean(identifier);
  expectFile(path, expected, "clean");
}

// The first key of `dict` whose value is a dictionary, if any.
std::optional<std::string> firstDictKey(const plist::Dict* dict) {
  if (!dict) return std::nullopt;
  for (const auto& entry : *dict) {
    if (entry.value.dict()) return entry.key;
  }
  return std::nullopt;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = workDir() + "/RestoreState.plist";
  if (!writeFileAtomically(path, {data, size})) fail("cannot write the input file");
  RestoreStateStore store(path);

  // An identifier and version the file already holds, when it holds any, and fixed ones.
  const std::optional<plist::Dict> root = rootOf(contents(path));
  const std::string identifier =
      firstDictKey(root ? &*root : nullptr).value_or("com.example.restored");
  const plist::Dict* versions = root ? plist::dictAt(*root, identifier) : nullptr;
  const std::optional<std::string> version = firstDictKey(versions).value_or("1.0");
  const std::string key(kRestoreStatePathKey);
  const std::string other = "com.example.other";

  checkProperty(store, path, identifier, version, key);
  checkProperty(store, path, identifier, std::nullopt, key);
  checkProperty(store, path, other, "2.0", key);

  checkSetProperty(store, path, plist::Value("/var/mobile/Media/Downloads/a.zip"), identifier,
                   std::nullopt, key);
  checkSetProperty(store, path, plist::Value("/var/mobile/Media/Downloads/a.zip"), identifier,
                   version, key);
  checkProperty(store, path, identifier, version, key);
  checkSetProperty(store, path, plist::Value(plist::Dict{{"n", 1}}), other, "2.0", "extra");

  checkClean(store, path, identifier);
  checkProperty(store, path, identifier, version, key);
  checkClean(store, path, other);
  // Whatever is left, a write on top of it (or on no file) must read back.
  checkSetProperty(store, path, plist::Value("/x.zip"), other, "3.0", key);
  checkProperty(store, path, other, "3.0", key);
  return 0;
}
