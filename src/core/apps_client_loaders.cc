// The two loaders every reader of a todo list or of the demoted-applications list goes
// through: they accept XML and binary, and reduce every problem to "absent" plus one message.
#include "core/apps_client.h"
#include "core/fs/files.h"
#include "core/plist/codec.h"

namespace appsync {

namespace {

// Reads and parses `path`; absent without a message when the file is missing or empty, absent
// with `parseMessage` when it is not a property list.
std::optional<plist::Value> loadValue(TRHostFramework& tr, const std::string& path,
                                      ErrorRef* error, std::string_view parseMessage) {
  auto bytes = readFile(path, error);
  if (!bytes || bytes->empty()) return std::nullopt;
  plist::ParseError parseError;
  auto value = plist::parse(*bytes, &parseError);
  if (!value) {
    setError(error, makeError(kPropertyListErrorDomain, 1, parseError.message, path));
    pluginLog(tr.TRGetLogCategory(8), LogLevel::Error, parseMessage);
    return std::nullopt;
  }
  return value;
}

}  // namespace

std::optional<plist::Array> AppsClient::_loadPlist(TRHostFramework& tr, const std::string& path,
                                                   ErrorRef* error) {
  auto value = loadValue(tr, path, error, "%s|couldn't parse todo list");
  if (!value) return std::nullopt;
  if (plist::Array* array = value->array()) return std::move(*array);
  pluginLog(tr.TRGetLogCategory(8), LogLevel::Error, "%s|todo list is not an array");
  return std::nullopt;
}

std::optional<plist::Dict> AppsClient::_loadDemotedAppsPlist(TRHostFramework& tr,
                                                             const std::string& path,
                                                             ErrorRef* error) {
  auto value = loadValue(tr, path, error, "%s|couldn't parse demoted apps list");
  if (!value) return std::nullopt;
  if (plist::Dict* dict = value->dict()) return std::move(*dict);
  pluginLog(tr.TRGetLogCategory(8), LogLevel::Error, "%s|demoted apps list is not a dictionary");
  return std::nullopt;
}

}  // namespace appsync
