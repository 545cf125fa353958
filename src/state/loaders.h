// The two loaders every reader of a todo list or of the demoted-applications list goes
// through: they accept XML and binary, and reduce every problem to "absent" plus at most one
// error-level message in the plugin's category.
#pragma once

#include <optional>
#include <string>

#include "platform/tr.h"
#include "runtime/fs/files.h"
#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync {

// The todo list (or the last-sync list) at `path`: its root array, or absent when the file is
// missing, empty, not a property list or not an array. *error (may be null) receives a read or
// parse error; a wrong root type sets nothing. *identity (when given) receives the identity of
// the file that was read.
std::optional<plist::Array> loadTodoList(TRHostFramework& tr, const std::string& path,
                                         ErrorRef* error, FileIdentity* identity = nullptr);
// The demoted-applications list at `path`: its root dictionary, or absent likewise.
std::optional<plist::Dict> loadDemotedAppsList(TRHostFramework& tr, const std::string& path,
                                               ErrorRef* error);

}  // namespace appsync
