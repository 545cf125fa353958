// The fake backup service and its managers.
#include "platform/fake/fake_sw.h"

namespace appsync {

namespace {
constexpr std::string_view kNewManager = "newManager";
constexpr std::string_view kExists = "restoreDataExistsForApplicationWithBundleID:size:";
constexpr std::string_view kCancel = "cancelApplicationRestoreWithBundleID:error:";
constexpr std::string_view kBackupErrorDomain = "SWBackupErrorDomain";
}  // namespace

FakeSWBackupService::FakeSWBackupService()
    : FakeService("FakeSWBackupService", std::string(kBackupErrorDomain),
                  {{kNewManager, false}, {kExists, true}, {kCancel, true}}) {}

void FakeSWBackupService::setRestoreData(const std::string& bundleID, std::uint64_t size) {
  std::lock_guard lock(mutex_);
  restoreData_[bundleID] = size;
}

void FakeSWBackupService::removeRestoreData(const std::string& bundleID) {
  std::lock_guard lock(mutex_);
  restoreData_.erase(bundleID);
}

std::vector<std::string> FakeSWBackupService::cancelledRestores() const {
  std::lock_guard lock(mutex_);
  return cancelled_;
}

std::shared_ptr<SWManager> FakeSWBackupService::newManager() {
  beginCall(kNewManager);
  return std::make_shared<FakeSWManager>(*this);
}

bool FakeSWBackupService::restoreDataExists(const std::string& bundleID, std::uint64_t* size) {
  if (beginCall(kExists)) return false;
  std::lock_guard lock(mutex_);
  auto it = restoreData_.find(bundleID);
  if (it == restoreData_.end()) return false;
  if (size) *size = it->second;
  return true;
}

bool FakeSWBackupService::cancelRestore(const std::string& bundleID, ErrorRef* error) {
  ErrorRef failure = beginCall(kCancel);
  std::lock_guard lock(mutex_);
  cancelled_.push_back(bundleID);
  if (failure) {
    setError(error, failure);
    return false;
  }
  return true;
}

}  // namespace appsync
