// The action table and the readings several families of actions share.
#include "replay/action_table.h"

#include <limits>
#include <stdexcept>

#include "runtime/plist/codec.h"

namespace appsync::host::replay {

ActionResult runFromTable(StepContext& context, std::span<const ActionEntry> table) {
  const std::string name = context.value.string();
  const ActionEntry* found = nullptr;
  std::vector<std::string> known;
  for (const ActionEntry& entry : table) {
    if (entry.name == name) found = &entry;
    known.emplace_back(entry.name);
  }
  if (!found) {
    context.value.fail("unknown " + context.selector + " \"" + name +
                       "\" (expected one of: " + joinNames(known) + ")");
  }
  std::vector<std::string> allowed(std::begin(kStepKeys), std::end(kStepKeys));
  allowed.push_back(context.selector);
  allowed.insert(allowed.end(), found->fields.begin(), found->fields.end());
  context.step.allowOnly(allowed);
  try {
    return found->run(context);
  } catch (const InputError&) {
    throw;
  } catch (const StepFailed&) {
    throw;
  } catch (const std::runtime_error& e) {
    throw StepFailed(e.what());
  }
}

std::string joinNames(const std::vector<std::string>& names) {
  std::string text;
  for (const std::string& name : names) text += (text.empty() ? "" : ", ") + name;
  return text;
}

ErrorRef readError(const YamlField& field) {
  field.allowOnly({"domain", "code", "description", "recoverable"});
  auto error = std::make_shared<Error>();
  error->domain = field["domain"].string();
  error->code = field["code"].integer();
  if (auto description = field.optional("description")) {
    error->userInfo.set(std::string(kErrorDescriptionKey), description->string());
  }
  if (auto recoverable = field.optional("recoverable")) {
    error->userInfo.set("recoverable", recoverable->boolean());
  }
  return error;
}

plist::Value errorValue(const ErrorRef& error) {
  plist::Dict value{{"domain", error->domain}, {"code", error->code}};
  if (const plist::Value* description = error->userInfo.find(kErrorDescriptionKey)) {
    value.set("description", *description);
  }
  if (error->underlying) value.set("underlying", errorValue(error->underlying));
  return value;
}

std::uint32_t readUInt32(const YamlField& field) {
  const std::uint64_t value = field.unsignedInteger();
  if (value > std::numeric_limits<std::uint32_t>::max()) {
    field.fail("expected an unsigned integer of at most 4294967295");
  }
  return static_cast<std::uint32_t>(value);
}

std::int32_t readInt32(const YamlField& field) {
  const std::int64_t value = field.integer();
  if (value < std::numeric_limits<std::int32_t>::min() ||
      value > std::numeric_limits<std::int32_t>::max()) {
    field.fail("expected an integer from -2147483648 to 2147483647");
  }
  return static_cast<std::int32_t>(value);
}

plist::Dict readDict(const YamlField& field) {
  plist::Value value = field.plist();
  if (!value.dict()) field.fail("expected a mapping");
  return std::move(*value.dict());
}

plist::Bytes readData(const YamlField& field) {
  plist::Value value = field.plist();
  if (!value.data()) field.fail("expected data (!data followed by base64)");
  return *value.data();
}

plist::Bytes readDataOrPlist(const YamlField& field) {
  plist::Value value = field.plist();
  if (const plist::Bytes* bytes = value.data()) return *bytes;
  std::string problem;
  auto bytes = plist::writeBinary(value, &problem);
  if (!bytes) field.fail("cannot be written as a property list: " + problem);
  return *bytes;
}

std::string clientPath(const std::filesystem::path& root, const std::string& text) {
  std::string base = root.string();
  while (base.size() > 1 && base.back() == '/') base.pop_back();
  return base + (text.starts_with('/') ? "" : "/") + text;
}

std::string shownPath(const std::filesystem::path& root, const std::string& path) {
  const std::filesystem::path full(path);
  const std::filesystem::path relative = full.lexically_relative(root);
  if (relative.empty() || *relative.begin() == "..") return path;
  return relative.string();
}

}  // namespace appsync::host::replay
