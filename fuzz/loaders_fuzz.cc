// Fuzzes the todo-list and demoted-applications loaders and the todo-list writer on a
// host-supplied file: the loaders must agree with the codec and say exactly one thing about a
// bad file, and the writer must leave an unusable list byte-for-byte alone and otherwise write
// exactly the loaded list with its first matching record changed.
#include <stdlib.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "client/apps_client.h"
#include "runtime/fs/files.h"
#include "fuzz_support.h"
#include "runtime/plist/codec.h"
#include "platform/fake/fake_tr.h"
#include "state/todo_list.h"

namespace {

using namespace appsync;

using fuzz::fail;

const std::string& workDir() { return fuzz::workDir("loaders_fuzz"); }

FakeTRHost& host() {
  static FakeTRHost* tr = new FakeTRHost();  // outlives the exit handlers that may still log
  return *tr;
}

std::string prefixed(std::string_view message) {
  return std::string(kPluginBundleIdentifier) + "|" + std::string(message);
}

// What a loader should have said: nothing, or exactly one message.
void expectMessages(const std::vector<std::string>& expected, const char* loader) {
  if (host().logSink()->messages() != expected) {
    std::string got;
    for (const std::string& m : host().logSink()->messages()) got += "\n  " + m;
    fail("unexpected log lines from", std::string(loader) + got);
  }
  host().logSink()->clear();
}

// Equality that holds for NaN too (a file may hold NaN reals and dates): the same binary form.
bool identical(const plist::Value& a, const plist::Value& b) {
  std::optional<plist::Bytes> x = plist::writeBinary(a), y = plist::writeBinary(b);
  return x && y ? *x == *y : a == b;
}

template <typename Loaded>
void checkLoader(const std::optional<Loaded>& loaded, const ErrorRef& error, bool empty,
                 const std::optional<plist::Value>& parsed, const Loaded* expected,
                 const char* parseMessage, const char* shapeMessage, const char* loader) {
  if (empty || parsed) {
    if (error) fail("error set for a readable file by", loader);
  } else if (!error || error->domain != kPropertyListErrorDomain) {
    fail("no property-list error for an unparsable file from", loader);
  }
  if (empty) {
    if (loaded) fail("a value from an empty file by", loader);
    expectMessages({}, loader);
  } else if (!parsed) {
    if (loaded) fail("a value from an unparsable file by", loader);
    expectMessages({prefixed(parseMessage)}, loader);
  } else if (!expected) {
    if (loaded) fail("a value of the wrong root type from", loader);
    expectMessages({prefixed(shapeMessage)}, loader);
  } else {
    if (!loaded || !identical(plist::Value(*loaded), plist::Value(*expected)))
      fail("loaded value differs from the codec's", loader);
    expectMessages({}, loader);
  }
}

// The first run of identifier-like characters in the input, for inputs that load as no list.
std::string someWord(const std::uint8_t* data, std::size_t size) {
  std::string word;
  for (std::size_t i = 0; i < size; ++i) {
    const char c = static_cast<char>(data[i]);
    const bool wordChar = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                          (c >= '0' && c <= '9') || c == '.' || c == '-' || c == '_';
    if (wordChar) {
      word += c;
    } else if (word.size() >= 3) {
      return word;
    } else {
      word.clear();
    }
  }
  return word;
}

// The identifier of the last record that has one, so that lists with a repeated identifier
// check that the first record is the one changed.
std::optional<std::string> lastIdentifier(const plist::Array& list) {
  for (auto it = list.rbegin(); it != list.rend(); ++it) {
    const plist::Dict* record = it->dict();
    const std::string* id = record ? plist::stringAt(*record, kTodoIdentifierKey) : nullptr;
    if (id) return *id;
  }
  return std::nullopt;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = workDir() + "/ApplicationsSync.plist";
  const std::span<const std::uint8_t> input(data, size);
  if (!writeFileAtomically(path, input)) fail("cannot write the input file");
  host().logSink()->clear();

  std::optional<plist::Value> parsed = plist::parse(input);
  const bool empty = size == 0;

  ErrorRef todoError;
  std::optional<plist::Array> todo = AppsClient::_loadPlist(host(), path, &todoError);
  checkLoader(todo, todoError, empty, parsed, parsed ? parsed->array() : nullptr,
              "couldn't parse todo list", "todo list is not an array", "_loadPlist");

  ErrorRef demotedError;
  std::optional<plist::Dict> demoted =
      AppsClient::_loadDemotedAppsPlist(host(), path, &demotedError);
  checkLoader(demoted, demotedError, empty, parsed, parsed ? parsed->dict() : nullptr,
              "couldn't parse demoted apps list", "demoted apps list is not a dictionary",
              "_loadDemotedAppsPlist");

  // Two changes through one writer: the second reuses the list the first wrote.
  struct Change {
    std::string identifier;
    std::string state;
  };
  const std::vector<Change> changes = {
      {todo ? lastIdentifier(*todo).value_or("") : someWord(data, size), "DOWNLOADED"},
      {"com.example.app00001", "INSTALLED"},
  };
  TodoList writer(path, host());
  std::optional<plist::Array> model = todo;
  std::size_t applied = 0;
  for (const Change& change : changes) {
    writer.changeAssetID(change.identifier, change.state);
    if (!model) continue;
    if (plist::Dict* record = findTodoRecord(*model, change.identifier)) {
      record->set(std::string(kTodoOperationKey), change.state);
      ++applied;
    }
  }
  const std::optional<plist::Bytes> after = readFile(path);
  if (!after) fail("the todo list disappeared");
  if (applied == 0) {
    if (!std::equal(after->begin(), after->end(), input.begin(), input.end())) {
      fail("a list that was unusable or had no matching record was rewritten");
    }
  } else {
    std::string error;
    std::optional<plist::Bytes> expected = plist::writeBinary(plist::Value(*model), &error);
    if (!expected) fail("a loaded list cannot be written as binary", error);
    if (*after != *expected) fail("the rewritten list is not the loaded one with the changes");
  }
  if (writer.rewriteCount() != applied) fail("rewrites differ from changes made");
  // A usable list is read once: the writer keeps what it read or wrote while the file is that
  // version. A missing, empty or unusable list is read again by every change.
  const bool usable = todo && !todo->empty();
  if (writer.loadCount() != (usable ? 1u : 2u)) fail("unexpected number of reads");
  std::size_t logged = 0;
  for (const std::string& m : host().logSink()->messages()) {
    if (m.rfind(prefixed("Changing "), 0) == 0) ++logged;
  }
  if (logged != applied) fail("logged changes differ from changes made");
  host().logSink()->clear();
  return 0;
}
