// The fake backup service: which applications the backup holds data for, and cancelled
// restores.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/fake/fake_service.h"
#include "platform/sw.h"

namespace appsync {

// Operations: "newManager", "restoreDataExistsForApplicationWithBundleID:size:" (can fail:
// false), "cancelApplicationRestoreWithBundleID:error:" (can fail: false and the error). Every
// manager shares the service's state and script.
class FakeSWBackupService final : public SWBackupService, public FakeService {
 public:
  FakeSWBackupService();

  // The backup holds `size` bytes of data for the application.
  void setRestoreData(const std::string& bundleID, std::uint64_t size);
  void removeRestoreData(const std::string& bundleID);
  // Identifiers passed to cancelApplicationRestoreWithBundleID (successful or not), in order.
  std::vector<std::string> cancelledRestores() const;

  // The whole state as a property list, and back (replacing everything, with no events; a
  // missing field is empty). loadState throws StateFormatError naming the bad field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);

  std::shared_ptr<SWManager> newManager() override;

 private:
  friend class FakeSWManager;
  bool restoreDataExists(const std::string& bundleID, std::uint64_t* size);
  bool cancelRestore(const std::string& bundleID, ErrorRef* error);

  mutable std::mutex mutex_;
  std::map<std::string, std::uint64_t> restoreData_;
  std::vector<std::string> cancelled_;
};

// A manager of the fake backup service, which must outlive it.
class FakeSWManager final : public SWManager {
 public:
  explicit FakeSWManager(FakeSWBackupService& service) : service_(service) {}
  bool restoreDataExistsForApplicationWithBundleID(const std::string& bundleID,
                                                   std::uint64_t* size) override {
    return service_.restoreDataExists(bundleID, size);
  }
  bool cancelApplicationRestoreWithBundleID(const std::string& bundleID, ErrorRef* error) override {
    return service_.cancelRestore(bundleID, error);
  }

 private:
  FakeSWBackupService& service_;
};

}  // namespace appsync
