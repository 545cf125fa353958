// One simulated device: every fake platform service, wired together over one root directory.
// Tests and the simulator build a client over platform().
#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "runtime/dispatch/clock.h"
#include "runtime/fs/paths.h"
#include "platform/fake/fake_ar.h"
#include "platform/fake/fake_bz.h"
#include "platform/fake/fake_em.h"
#include "platform/fake/fake_kc.h"
#include "platform/fake/fake_pv.h"
#include "platform/fake/fake_rs.h"
#include "platform/fake/fake_sw.h"
#include "platform/fake/fake_system.h"
#include "platform/fake/fake_tr.h"
#include "platform/fake/fake_transaction_log.h"
#include "platform/fake/state_fields.h"
#include "platform/icon/home_screen_icon_service.h"
#include "platform/platform.h"

namespace appsync {

class FakePlatform {
 public:
  struct Options {
    // A manual clock (tests) or the system clock (the simulator).
    bool manualClock = true;
    // The coordinated installation road (true) or the legacy road (false).
    bool coordination = false;
    // The running process's main bundle; the host daemon is "com.vantor.trc".
    std::string mainBundleIdentifier = "com.vantor.appsync.tests";
  };

  explicit FakePlatform(std::filesystem::path root);
  FakePlatform(std::filesystem::path root, Options options);
  FakePlatform(const FakePlatform&) = delete;
  FakePlatform& operator=(const FakePlatform&) = delete;

  // The device's saved state: one property list per service in `directory` (the simulator's
  // ROOT/.platform), XML. Saving twice with no change writes identical bytes; a file whose
  // bytes would not change is not rewritten. Throws StateFormatError ("FILE: field: problem")
  // or a std::runtime_error naming the file that cannot be written or read. Load into a fresh
  // platform made with loadOptions(directory): a service whose file is missing stays as the
  // platform was made, empty. A load that throws may leave some services loaded: the platform
  // is then to be discarded.
  void saveState(const std::filesystem::path& directory) const;
  void loadState(const std::filesystem::path& directory);
  // The options a device was created with, saved in `directory`/device.plist by saveState.
  // manualClock is not saved: it keeps its default, and the caller chooses the clock.
  static Options loadOptions(const std::filesystem::path& directory);

  const Platform& platform() const { return platform_; }
  const Paths& paths() const { return paths_; }
  Clock& clock() { return *clock_; }
  // Null when the platform runs on the system clock.
  ManualClock* manualClock() { return manualClock_; }
  // Every message the client logged.
  MemoryLogSink& log() { return *tr_.logSink(); }

  FakeTRHost& tr() { return tr_; }
  FakeARWorkspace& ar() { return ar_; }
  FakeKCInstallCoordination& kc() { return kc_; }
  FakeEMInstaller& em() { return em_; }
  FakeSWBackupService& sw() { return sw_; }
  FakeRSProfileConnection& rs() { return rs_; }
  FakeBZStoreService& bz() { return bz_; }
  FakePVHomeScreen& pv() { return pv_; }
  HomeScreenIconService& qi() { return qi_; }
  FakeTransactionLog& transactionLog() { return transactionLog_; }
  FakeSystemServices& system() { return system_; }

 private:
  const Options options_;
  Paths paths_;
  std::unique_ptr<Clock> ownedClock_;
  Clock* clock_;
  ManualClock* manualClock_ = nullptr;
  FakeTRHost tr_;
  FakeARWorkspace ar_;
  FakeKCInstallCoordination kc_;
  FakeEMInstaller em_;
  FakeSWBackupService sw_;
  FakeRSProfileConnection rs_;
  FakeBZStoreService bz_;
  FakePVHomeScreen pv_;
  HomeScreenIconService qi_;
  FakeTransactionLog transactionLog_;
  FakeSystemServices system_;
  Platform platform_;
};

}  // namespace appsync
