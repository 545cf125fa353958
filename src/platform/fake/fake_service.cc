// Scripted failures and call counts of the fake services.
#include "platform/fake/fake_service.h"

#include <cstdio>
#include <cstdlib>
#include <utility>

namespace appsync {

FakeService::FakeService(std::string serviceName, std::string errorDomain,
                         std::initializer_list<OperationSpec> operations)
    : serviceName_(std::move(serviceName)), errorDomain_(std::move(errorDomain)) {
  for (const OperationSpec& op : operations) scripts_[std::string(op.name)].canFail = op.canFail;
}

FakeService::Script& FakeService::scriptFor(std::string_view operation, bool mustBeFailable) {
  auto it = scripts_.find(operation);
  if (it == scripts_.end() || (mustBeFailable && !it->second.canFail)) {
    std::fprintf(stderr,
                 "%s: %s operation \"%.*s\"; operations that can fail:", serviceName_.c_str(),
                 it == scripts_.end() ? "no" : "cannot fail the",
                 static_cast<int>(operation.size()), operation.data());
    for (const auto& [name, script] : scripts_) {
      if (script.canFail) std::fprintf(stderr, " %s", name.c_str());
    }
    std::fprintf(stderr, "\n");
    std::abort();
  }
  return it->second;
}

void FakeService::failOperation(std::string_view operation, ErrorRef error, int times) {
  std::lock_guard lock(mutex_);
  Script& script = scriptFor(operation, true);
  if (!error) {
    error = makeError(errorDomain_, 1,
                      serviceName_ + ": scripted failure of " + std::string(operation));
  }
  script.failing = times != 0;
  script.remaining = times;
  script.error = std::move(error);
}

void FakeService::succeedOperation(std::string_view operation) {
  std::lock_guard lock(mutex_);
  Script& script = scriptFor(operation, true);
  script.failing = false;
  script.error = nullptr;
}

std::size_t FakeService::callCount(std::string_view operation) const {
  std::lock_guard lock(mutex_);
  auto it = scripts_.find(operation);
  if (it == scripts_.end()) {
    std::fprintf(stderr, "%s: no operation \"%.*s\"\n", serviceName_.c_str(),
                 static_cast<int>(operation.size()), operation.data());
    std::abort();
  }
  return it->second.calls;
}

bool FakeService::knowsOperation(std::string_view operation) const {
  std::lock_guard lock(mutex_);
  auto it = scripts_.find(operation);
  return it != scripts_.end() && it->second.canFail;
}

std::vector<std::string> FakeService::operationNames() const {
  std::lock_guard lock(mutex_);
  std::vector<std::string> names;
  for (const auto& [name, script] : scripts_) {
    if (script.canFail) names.push_back(name);
  }
  return names;  // the map keeps them sorted
}

ErrorRef FakeService::beginCall(std::string_view operation) {
  std::lock_guard lock(mutex_);
  Script& script = scriptFor(operation, false);
  ++script.calls;
  if (!script.failing) return nullptr;
  ErrorRef error = script.error;
  if (script.remaining > 0 && --script.remaining == 0) {
    script.failing = false;
    script.error = nullptr;
  }
  return error;
}

std::int64_t FakeService::statusFor(const ErrorRef& error) {
  return error && error->code != 0 ? error->code : 1;
}

}  // namespace appsync
