// The todo-list and demoted-applications loaders.
#include "state/loaders.h"

#include "runtime/fs/files.h"
#include "runtime/log/log.h"
#include "runtime/plist/codec.h"

namespace appsync {

namespace {

// Reads and parses `path`; absent without a message when the file is missing or empty, absent
// with `parseMessage` when it is not a property list.
std::optional<plist::Value> loadValue(TRHostFramework& tr, const std::string& path, ErrorRef* error,
                                      std::string_view parseMessage, FileIdentity* identity) {
  auto bytes = readFile(path, error, identity);
  if (!bytes || bytes->empty()) return std::nullopt;
  plist::ParseError parseError;
  auto value = plist::parse(*bytes, &parseError);
  if (!value) {
    setError(error, makeError(kPropertyListErrorDomain, 1, parseError.message, path));
    pluginLog(tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Error, parseMessage);
    return std::nullopt;
  }
  return value;
}

}  // namespace

std::optional<plist::Array> loadTodoList(TRHostFramework& tr, const std::string& path,
                                         ErrorRef* error, FileIdentity* identity) {
  auto value = loadValue(tr, path, error, "%s|couldn't parse todo list", identity);
  if (!value) return std::nullopt;
  if (plist::Array* array = value->array()) return std::move(*array);
  pluginLog(tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Error,
            "%s|todo list is not an array");
  return std::nullopt;
}

std::optional<plist::Dict> loadDemotedAppsList(TRHostFramework& tr, const std::string& path,
                                               ErrorRef* error) {
  auto value = loadValue(tr, path, error, "%s|couldn't parse demoted apps list", nullptr);
  if (!value) return std::nullopt;
  if (plist::Dict* dict = value->dict()) return std::move(*dict);
  pluginLog(tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Error,
            "%s|demoted apps list is not a dictionary");
  return std::nullopt;
}

}  // namespace appsync
