// Saved state of the scripted failures and call counts of a fake service.
#include "platform/fake/fake_service.h"
#include "platform/fake/state_fields.h"

namespace appsync {

plist::Dict FakeService::saveScripts() const {
  std::lock_guard lock(mutex_);
  plist::Dict state;
  for (const auto& [name, script] : scripts_) {
    // An operation never called and not failing is left out: it loads as such.
    if (script.calls == 0 && !script.failing) continue;
    plist::Dict entry{{"calls", plist::Integer::fromUnsigned(script.calls)}};
    if (script.failing) {
      plist::Dict failing{{"error", errorState(*script.error)}};
      if (script.remaining != kEveryCall) failing.set("times", script.remaining);
      entry.set("failing", std::move(failing));
    }
    state.set(name, std::move(entry));
  }
  return state;
}

void FakeService::loadScripts(const StateFields& scripts) {
  std::lock_guard lock(mutex_);
  std::map<std::string, Script, std::less<>> loaded;
  for (const auto& [name, script] : scripts_) loaded[name].canFail = script.canFail;
  for (const auto& entry : scripts.dict()) {
    auto it = loaded.find(entry.key);
    if (it == loaded.end()) scripts.fail(entry.key, "not an operation of " + serviceName_);
    const StateFields fields = scripts.child(entry.key);
    Script& script = it->second;
    script.calls = fields.unsignedInteger("calls");
    const std::optional<StateFields> failing = fields.optionalChild("failing");
    if (!failing) continue;
    if (!script.canFail) fields.fail("failing", "the operation cannot fail");
    script.failing = true;
    script.error = failing->error("error");
    if (failing->has("times")) {
      const std::int32_t times = failing->int32("times");
      if (times < 1) failing->fail("times", "expected a positive count");
      script.remaining = times;
    }
  }
  scripts_ = std::move(loaded);
}

}  // namespace appsync
