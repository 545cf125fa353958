// AppsClient: the plugin's one long-lived object. The host creates it and calls it through the
// client protocol for the dataclass "Application"; the platform calls it back as a registry
// observer and as the install-coordination delegate. Its operations are implemented in the
// file of the concern they belong to; this header is the map.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/platform.h"
#include "platform/tr_client.h"
#include "runtime/dispatch/delayed_work.h"
#include "runtime/dispatch/group.h"
#include "runtime/dispatch/operation_queue.h"
#include "runtime/dispatch/serial_queue.h"
#include "runtime/guarded.h"
#include "runtime/log/log.h"
#include "state/loaders.h"
#include "state/restore_state_store.h"
#include "state/todo_list.h"

namespace appsync {

// The host daemon's main bundle identifier: inside it the client listens for start-up.
inline constexpr std::string_view kHostDaemonBundleIdentifier = "com.vantor.trc";
inline constexpr std::string_view kHostStartupNotification =
    "com.vantor.trc.TRStartupCompleteNotification";
inline constexpr std::string_view kInstallObserverServiceName =
    "com.vantor.trc.zpc.icappobserverdelegate";
inline constexpr std::string_view kAccessQueueLabel = "com.vantor.kel.Trellis.AppSync";
inline constexpr std::string_view kRestoreQueueLabel = "com.vantor.kel.Trellis.AppRestore";
inline constexpr std::size_t kMaxConcurrentInstalls = 10;
// How long after a denied termination assertion an install is tried again.
inline constexpr std::chrono::seconds kInstallRetryDelay{30};

class AppsClient : public TRClient,
                   public ARApplicationWorkspaceObserverProtocol,
                   public KCAppInstallObserverDelegate {
 public:
  // Builds every field, registers with the registry, initialises the transaction log, chooses
  // the installation road and, inside the host daemon, listens for its start-up notification.
  explicit AppsClient(const Platform& platform);
  // Logs unfinished work and unregisters from every service (each waits for its callbacks in
  // flight). Installs already running finish; queued installs that have not started and retries
  // still waiting are dropped, leaving their package, todo state and placeholder for the next
  // sync. Nothing that holds the client outlives it.
  ~AppsClient() override;
  AppsClient(const AppsClient&) = delete;
  AppsClient& operator=(const AppsClient&) = delete;

  // ---- Client protocol ------------------------------------------------------------------------
  std::vector<std::string> supportedDataclasses() override;
  bool respondsTo(TRClientOperation operation) const override;

  // ---- Session entry (sync/session_entry.cc) -------------------------------------------------
  // "NO_APP_SYNC_ANCHOR": the client keeps no anchor.
  std::string currentSyncAnchor() override;
  // True; nothing to prepare.
  bool prepareForSyncWithHostAnchor(const std::string& hostAnchor,
                                    ProgressCallback progressCallback, ErrorRef* error) override;
  using TRClient::prepareForSyncWithHostAnchor;
  // Tells the home screen a sync starts, makes the work area and, for restore type 2, restores
  // the apps of the host's restore list. Always true; *error is left absent.
  bool reconcileRestoreOfType(std::int32_t restoreType, ErrorRef* error) override;

  // ---- Start-up ------------------------------------------------------------------------------
  // The notification-center callback for the host's start-up notification; `observer` is the
  // client. Does nothing when it is absent.
  static void _handleTRCStartupCompletedNotification(void* center, void* observer,
                                                     const std::string& name, const void* object,
                                                     const plist::Dict* userInfo);
  // Creates the install-coordination observer, at most once.
  void setupInstallCoordinatorObserver();

  // ---- Accessors used across the client -------------------------------------------------------
  std::uint32_t _getAndResetNumAppInstallsAttempted();
  // Counts one call of the registry's install operation (relaxed atomic add).
  void _countAppInstallAttempt() {
    _numAppInstallsAttempted.fetch_add(1, std::memory_order_relaxed);
  }
  bool _appInstallationAllowed();
  bool _appRemovalAllowed();

  // ---- Property-list loaders ---------------------------------------------------------------
  // The todo list (or the last-sync list) at `path`: its root array, or absent when the file is
  // missing, empty, not a property list or not an array. *error receives a read or parse error.
  static std::optional<plist::Array> _loadPlist(TRHostFramework& tr, const std::string& path,
                                                ErrorRef* error) {
    return loadTodoList(tr, path, error);
  }
  // The demoted-applications list at `path`: its root dictionary, or absent likewise.
  static std::optional<plist::Dict> _loadDemotedAppsPlist(TRHostFramework& tr,
                                                          const std::string& path,
                                                          ErrorRef* error) {
    return loadDemotedAppsList(tr, path, error);
  }

  // ---- Inventory of vanished apps (sync/installed_assets.cc) ----------------------------------
  // {"_Deleted": [{"BNBundleIdentifier": ID}, ...]}: the apps the installer lists as uninstalled
  // and the last-sync apps no longer installed, except those the previous sync's todo list still
  // works on. Replaces _uninstalledApps when the installer answers.
  plist::Dict installedAssets() override;

  // ---- Reconciliation (sync/reconcile.cc) ------------------------------------------------------
  // Takes the host's staging area over as the sync folder, performs the todo list's removals,
  // tells the home screen that a sync starts and hands it the icon layout. False (and *error)
  // only when the work area cannot be made or the staging area cannot be taken over.
  bool reconcileSync(std::uint32_t syncType, const std::string& newAnchor,
                     ProgressCallback progressCallback, ErrorRef* error) override;

  // ---- Sync end and clearing (sync/sync_end.cc) ------------------------------------------------
  // After a successful sync: stamps the work area, clears from the installer exactly the apps
  // installedAssets reported, removes the last-sync list. After a failed one: nothing.
  void syncEndedWithSuccess(bool success) override;
  // Removes the work area, every placeholder app, and the installer's whole uninstalled list.
  void clearSyncData() override;

  // ---- Todo states (sync/todo_states.cc) -----------------------------------------------------
  // Records `toDo` as the "operation" of the first todo record of `assetID`. Any thread.
  void changeAssetID(const std::string& assetID, const std::string& toDo);

  // ---- Restore state store (transfer/restore_state.cc) ---------------------------------------
  std::optional<plist::Value> _restoreStatePropertyForKey(
      const std::string& key, const std::string& identifier,
      const std::optional<std::string>& version);
  void _setRestoreStatePropertyValue(const plist::Value& value, const std::string& forKey,
                                     const std::string& identifier,
                                     const std::optional<std::string>& version);
  void cleanRestoreStateForIdentifier(const std::string& identifier);

  // ---- Install queue (transfer/install_queue.cc) ---------------------------------------------
  // Legacy road: queues the install of the delivered package at the asset's path on
  // _installOperationQueue, inside _installGroup. Returns at once.
  void _enqueueAssetInstall(const std::shared_ptr<TRAsset>& asset);
  // Takes the termination assertion and installs the package. A denied assertion schedules a
  // new attempt kInstallRetryDelay later and leaves the package; any other outcome removes it.
  void _performAssetInstall(const std::shared_ptr<TRAsset>& asset);
  // Records "INSTALLED" and drops the restore state.
  void assetInstallSucceeded(const std::shared_ptr<TRAsset>& asset) override;
  // A recoverable failure (a restore's always is) keeps the todo state and the placeholder; any
  // other records "FAILED" and removes the application. Drops the restore state either way.
  void assetInstallFailed(const std::shared_ptr<TRAsset>& asset,
                          const ErrorRef& withError) override;
  // False on the coordinated road, and for errors of the installer or the registry.
  bool _isRecoverableError(const ErrorRef& error);
  // The registry's loading-phase progress of the application; null on the coordinated road.
  std::shared_ptr<ARInstallProgress> _progressForAssetIdentifier(const std::string& identifier);
  // The "operation" of the first todo record of `identifier`.
  std::optional<std::string> _operationStateForIdentifier(const std::string& identifier);

  // ---- Transfer completion (transfer/transfer_completion.cc) ---------------------------------
  // The host's progress (0 to 1) for one transfer: the registry's install progress in units of
  // 1000 (legacy road) or the coordinated progress; the transfer counts as outstanding.
  void assetTransfer(const std::shared_ptr<TRAsset>& asset, double updatedProgress) override;
  // One transfer ended. A delivered package is installed (or, for a restore with backup data,
  // kept until its data part arrives); an upload is marked "SENT"; a failed transfer leaves the
  // placeholder when recoverable or for a restore, and removes it otherwise.
  void assetTransfer(const std::shared_ptr<TRAsset>& asset, bool succeeded,
                     const ErrorRef& withError) override;
  // The transfer phase is over: waits for every legacy install, tells the home screen, refreshes
  // the store receipts after installs, and settles the transfers that never ended.
  void assetTransferEndedWithSuccess(bool success) override;

  // ---- Home screen (homescreen/) -------------------------------------------------------------
  // Tells the home screen that a sync starts (true) or is done (false).
  static void _notifyPavilion(const Platform& platform, bool starting);
  // Hands the icon layout of the sync folder to the home screen, unless it is missing or empty.
  static void _sendIconLayoutToPavilion(const Platform& platform);
  // Orders candidate records (identifier -> record) by the home screen's icon order; items
  // placed by that order are removed from `items`, the others follow in identifier order.
  static plist::Array _orderTheItems(const Platform& platform, plist::Dict& items);
  // Renders the bundle's home-screen icon to a PNG file at `saveTo`. True when it was written.
  static bool _makeIconFromBundlePath(const Platform& platform,
                                      const std::optional<std::string>& bundlePath,
                                      const std::string& saveTo);

  // ---- Restore placeholders (restore/placeholders*.cc) ----------------------------------------
  // TEMP/com.vantor.trc.Apps/ID.app; absent for an identifier that would leave that directory.
  std::optional<std::string> placeholderAppPathForBundleIdentifier(const std::string& bundleID);
  bool createPlaceHolderPath(const std::string& path, const std::string& forBundleIdentifier,
                             const FileAttributes& withAttributes);
  bool writeIconData(const std::optional<plist::Bytes>& iconData, const std::string& atPath,
                     std::uint64_t* returningFileSize, const std::string& forBundleIdentifier,
                     const FileAttributes& withAttributes);
  // The restore road for one application of the restore list.
  bool _processCaravelRestoreInfoForApp(const std::string& bundleID,
                                        const plist::Bytes& caravelMetaData,
                                        const std::optional<plist::Bytes>& sinfData,
                                        const std::optional<plist::Bytes>& iconData);
  // The sync road: a placeholder for an asset the host is about to send.
  void _createPlaceHolderApplication(const std::shared_ptr<TRAsset>& asset);

  // ---- Coordinators and promises (coordination/coordinators.cc, promises.cc) -----------------
  // Everything below is made, looked up and cancelled under kAppSyncCoordinationClient, on the
  // caller's thread; the caller owns what is returned. Null means nothing could be had.
  //
  // The updating (existingApp) or initiating coordinator of `bundleID`, found or created. One
  // made by another client is refused (null). *error (when given) receives the service's error,
  // which may be null also when the result is.
  std::shared_ptr<KCAppInstallCoordinator>
  _initiatingOrUpdatingAppInstallCoordinatorForBundleIdentifier(const std::string& bundleID,
                                                                bool existingApp,
                                                                bool createIfNotExisting,
                                                                ErrorRef* error);
  // A new, unconfigured placeholder.
  std::shared_ptr<KCPlaceholder> _placeHolderForBundleIdentifier(const std::string& bundleID,
                                                                 const std::string& name,
                                                                 std::uint64_t installType);
  // The complete icon promise "ID-Icon" for the file at `transferPath`, attached to
  // `andAddToPlaceHolder`; cancelled (30 for an app install, 29 for a restore) when it cannot
  // be attached.
  std::shared_ptr<KCPromisedTransferToPath> _createIconPromiseForBundleIdentifier(
      const std::string& bundleID, const std::string& transferPath, std::uint64_t diskSpaceNeeded,
      const std::shared_ptr<KCPlaceholder>& andAddToPlaceHolder, bool forAppInstall);
  // The incomplete asset promise "ID-Asset" (with a transfer path when `atPath` is given),
  // attached to the coordinator; cancelled with 30 when it cannot be attached.
  std::shared_ptr<KCPromisedTransferToPath> _createAppAssetPromiseForBundleIdentifier(
      const std::string& bundleID, const std::optional<std::string>& atPath,
      const std::shared_ptr<KCAppInstallCoordinator>& andAddToCoordinatinator);
  // A complete user-data promise "ID-UserData", attached to nothing.
  std::shared_ptr<KCPromisedOutOfBandTransfer> _userDataPromiseForBundleIdentifier(
      const std::string& bundleID);
  // A restore placeholder, configured to completion from the store metadata, SINF and icon;
  // its directory and icon file are written first and stay on disk whatever happens. Cancelled
  // with 29 when a configuration step fails.
  std::shared_ptr<KCPlaceholder> _placeHolderForBundleIdentifier(
      const std::string& bundleID, const plist::Dict& withCaravelMetadata,
      const std::optional<plist::Bytes>& sinfData, const std::optional<plist::Bytes>& iconData,
      std::uint64_t demotionStatus);

  // ---- Restore from the host's restore list (restore/restore_info.cc) ------------------------
  // Hands every app of the restore list to the client's road, waits a bounded time for the
  // coordinated placeholders, then moves the list to its log copy so that it is processed once.
  void _processCaravelRestoreInfo();

  // ---- Coordinated restore (coordination/coordinated_restore.cc) ------------------------------
  // A restoring coordinator with a complete user-data promise and a restore placeholder; the
  // store daemon downloads the package (not for a demoted app). True when the service has all
  // the client has to give. A failure cancels with TRError 29 and releases the app's count.
  bool prepareAppForRestoreUsingCoordination(const std::string& bundleID,
                                             const plist::Bytes& caravelMetadata,
                                             const std::optional<plist::Bytes>& sinfData,
                                             const std::optional<plist::Bytes>& iconData,
                                             std::uint64_t demotionStatus);
  bool _prepareDemotedAppForRestoreWithBundleId(const std::string& bundleID,
                                                const plist::Bytes& caravelMetadata,
                                                const std::optional<plist::Bytes>& sinfData,
                                                const std::optional<plist::Bytes>& iconData,
                                                std::uint64_t demotionStatus);
  bool _prepareNonDemotedAppForRestoreWithBundleId(const std::string& bundleID,
                                                   const plist::Bytes& caravelMetadata,
                                                   const std::optional<plist::Bytes>& sinfData,
                                                   const std::optional<plist::Bytes>& iconData);

  // ---- Coordinator and registry events (coordination/coordinator_events.cc) -------------------
  // Delivered on the services' threads, possibly several at once and twice (observer and
  // delegate) inside the host daemon.
  void coordinatorDidInstallPlaceholder(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) override;
  // Marks the todo list "INSTALLED" (or "FAILED" when the coordinator carries an error) and
  // drops the app's restore state.
  void coordinatorDidCompleteSuccessfully(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) override;
  // Asks the host to send the app's package first, when the host can.
  void coordinatorShouldPrioritize(
      const std::shared_ptr<KCAppInstallCoordinator>& coordinator) override;
  // Records the app as cancelled and, the first time, stops its transfer when the host can.
  void coordinator(const std::shared_ptr<KCAppInstallCoordinator>& coordinator,
                   const ErrorRef& canceledWithReason, std::uint64_t client) override;
  void promiseDidBeginFulfillmentWithIdentifier(std::uint64_t identifier) override;
  // Legacy road: a cancelled restore install is reported as a failed transfer (TRError 2).
  void applicationInstallsDidCancel(const ARProxyList& proxies) override;

  // ---- Restore placeholder wait (coordination/restore_wait.cc) --------------------------------
  // Each runs one synchronous work item on _restoreQueue; never call them from that queue.
  //
  // A placeholder promise is (about to be) handed to a restoring coordinator: the app is counted
  // until its placeholder is installed or its coordinator cancelled. Counted once.
  void dataMigratorSetPlaceHolderPromiseForRestoreAppBundle(const std::string& bundleID);
  // The service installed the app's placeholder: releases its count, unless the wait is over.
  void icDidInstallPlaceHolderForAppBundle(const std::string& bundleID);
  // The app's restore failed: releases its count, if it has one, wait or no wait.
  void dataMigratorCancelledCoordinatorForRestoreAppBundle(const std::string& bundleID);
  // The number of apps counted now.
  std::int64_t restoringPlaceholderCount();

  // ---- Coordinated sync install (coordination/coordinated_install.cc) -------------------------
  // Readies a coordinator for a package the host is about to send: install options, SPR
  // promises, an asset promise without a path and a placeholder. False means the package must
  // not be requested; what this run obtained is then cancelled.
  bool prepareAppForInstallUsingCoordination(const std::shared_ptr<TRAsset>& asset,
                                             bool existingApp);
  // Moves the asset promise along with the host's download progress. False when there is no
  // usable coordinator or the promise is already complete.
  bool updateTransferProgressForApp(const std::shared_ptr<TRAsset>& asset, bool existingApp);
  // Completes the asset promise with the delivered package, or cancels the coordinator with
  // the transfer's error.
  void transferCompleteForApp(const std::shared_ptr<TRAsset>& asset, const ErrorRef& withError,
                              bool isExistingApp);
  // After an unsuccessful asset sync, cancels the coordinator of every outstanding item.
  void assetSyncFinishedWithStatus(bool status, const std::set<std::string>& outstandingItems);
  // Asks the service to remove the application; returns at once, the outcome is only logged.
  void uninstallAppUsingCoordination(const std::string& bundleID);

  // ---- Placeholder lookup (restore/placeholder_lookup.cc) -------------------------------------
  using ProxyBlock =
      std::function<void(const std::shared_ptr<const ARApplicationProxy>& proxy, bool* stop)>;
  bool _placeholderExistsForApplication(const std::string& bundleID);
  void _enumeratePlaceholdersWithBlock(const ProxyBlock& block);
  std::set<std::string> _getSystemAppPlaceholders();

  // ---- Outstanding transfers (transfer/outstanding_transfers.cc) ------------------------------
  // The packages the host is to send, in download order: the todo list's installs and the
  // placeholders on the device, less the installs the registry already runs and what the skip
  // rules leave out; each readied on the client's road. Not on _accessQueue.
  std::vector<std::shared_ptr<TRAsset>> outstandingAssetTransfers() override;

  // ---- Reporting (reporting/) ----------------------------------------------------------------
  // {"_Count", "_PhysicalSize", "_PurgeableSize"} of the user's installed applications.
  plist::Dict installedAssetMetrics() override;
  // The store account identifiers, and one account record per identifier, read from each
  // installed application's store metadata file.
  std::set<std::string> vantorIDsForAssets() override;
  std::vector<TRMutableAccountInfo> accountsForAssets() override;
  // {"Application"} when the restrictions forbid both installing and removing applications.
  std::optional<std::set<std::string>> disabledAssetTypes() override;
  // Brings each installed application's store metadata file up to date before a backup.
  void prepareForBackup() override;

  // ---- Facts for tests and the simulator -----------------------------------------------------
  bool useInstallCoordinator() const { return _useInstallCoordinator; }
  bool hasInstallCoordinatorObserver() const;
  bool finishedWaitingForPlaceHolderInstalls();
  // Whether the awaited placeholders' set, count and group agree, read in one restore-queue item.
  bool restoreWaitIsConsistent();
  // Blocks until no legacy install is queued, running or waiting for its retry.
  void waitForInstalls() { _installGroup->wait(); }
  // Blocks until no legacy install is queued or running and no retry is due or running; retries
  // whose time has not come stay. True when there was such work to wait for.
  bool waitForRunnableInstalls();
  std::string describe() const;

 private:
  // Tests reach the fields that no landed operation fills yet through this.
  friend struct AppsClientTestAccess;

  // Messages of the client. Category 8 unless named; the "%s|" prefix is filled in.
  template <typename... Args>
  void logDefault(std::string_view format, const Args&... args) const {
    pluginLog(platform_.tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Default, format,
              args...);
  }
  template <typename... Args>
  void logError(std::string_view format, const Args&... args) const {
    pluginLog(platform_.tr.TRGetLogCategory(kAppSyncLogCategory), LogLevel::Error, format, args...);
  }

  // Reconciliation's steps (sync/reconcile.cc).
  // Removes the previous sync folder, makes the work area and moves the staging area into it as
  // the sync folder. False (and *error) when the work area cannot be made or the staging area
  // cannot be taken over; *nothingStaged is set when there is no staging area.
  bool _replaceSyncFolderWithStagingArea(ErrorRef* error, bool* nothingStaged);
  // Removes the apps the todo list's "remove" records name, on the client's road.
  void _performDeletions(const plist::Array& toDoList);

  // The restore list's steps (restore/restore_info.cc): each app handed to the client's road,
  // then the bounded wait for the placeholders counted meanwhile.
  void _restoreApplicationsOfRestoreList(const plist::Dict& restoreInfo);
  void _waitForRestorePlaceholderInstalls();

  // The two outcomes of one transfer (transfer/transfer_completion.cc). `progress` is the
  // registry's install progress (legacy road) or null.
  void _transferSucceeded(const std::shared_ptr<TRAsset>& asset,
                          const std::shared_ptr<ARInstallProgress>& progress, bool existingApp);
  void _transferFailed(const std::shared_ptr<TRAsset>& asset, const ErrorRef& error,
                       const std::shared_ptr<ARInstallProgress>& progress, bool existingApp,
                       bool userCancelled);

  const Platform platform_;

  // Fields. "Writer" names who may change a field after construction.

  // Identifiers the installer reported as uninstalled. Writer: installedAssets (replace),
  // syncEndedWithSuccess (clear). No guard.
  std::optional<std::vector<std::string>> _uninstalledApps;
  // One member per legacy install in flight. Writer: the install queue (enter, leave).
  std::unique_ptr<Group> _installGroup;
  // One member per restoring app whose placeholder is awaited. Enter/leave on _restoreQueue.
  std::unique_ptr<Group> _restorePlaceHoldersWaitGroup;
  // Installs attempted since the last read. Atomic add by the install queue; exchanged with 0
  // by _getAndResetNumAppInstallsAttempted.
  std::atomic<std::uint32_t> _numAppInstallsAttempted{0};
  // Assets whose transfer reported progress and has not ended. Writer: transfer completion, on
  // the host's thread and (a cancelled restore install) the registry's.
  Guarded<std::set<std::string>> _outstandingPFTTransfers;
  // Runs the legacy install operations, at most kMaxConcurrentInstalls at once.
  std::unique_ptr<OperationQueue> _installOperationQueue;
  // Runs the retries of denied installs once their time comes, on the platform's clock.
  std::unique_ptr<DelayedWorkQueue> globalQueue_;
  // Set when teardown begins: installs that have not started are left for the next sync.
  std::atomic<bool> tearingDown_{false};
  // The backup service's manager, kept for the client's lifetime.
  std::shared_ptr<SWManager> _backupManager;
  // Apps whose transfer updates an installed app. Guard: _accessQueue. Writers: outstanding
  // transfers (add, coordinated road), transfer completion (remove, empty).
  std::set<std::string> _updatingApps;
  // Apps whose install the user cancelled. Guard: _accessQueue. Writers: coordinator events
  // (add), transfer completion (remove, empty).
  std::set<std::string> _userCancelledApps;
  // Restoring apps whose placeholder install is awaited. Guard: _restoreQueue.
  std::set<std::string> _placeholdersForRestoringApps;
  // The installation road, fixed at construction: coordinated (true) or legacy (false).
  bool _useInstallCoordinator = false;
  // True once nobody waits for placeholder installs. Guard: _restoreQueue.
  bool _finishedWaitingForPlaceHolderInstalls = false;
  std::unique_ptr<SerialQueue> _accessQueue;
  std::unique_ptr<SerialQueue> _restoreQueue;
  // Delivers coordinator events. Writer: setupInstallCoordinatorObserver, teardown.
  std::shared_ptr<KCAppInstallObserver> _appInstallObserver;
  // Members of _restorePlaceHoldersWaitGroup. Changed on _restoreQueue.
  std::int64_t _restoringPlaceholderCount = 0;

  // Whether the client runs inside the host daemon; fixed at construction.
  const bool insideHostDaemon_;

  // The todo list's writer and the restore state store, each with its own lock.
  TodoList todoList_;
  RestoreStateStore restoreStateStore_;

  // Guards _appInstallObserver and creatingObserver_ only; never held across a call into a
  // service, so a delivery that asks about the observer cannot wait on a creation or a
  // teardown that waits on it.
  mutable std::mutex observerMutex_;
  // True while setupInstallCoordinatorObserver creates the observer outside the lock.
  bool creatingObserver_ = false;
};

}  // namespace appsync
