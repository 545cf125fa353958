// `call: OPERATION`: one operation of the host's client protocol, called as the host sync daemon
// calls it. The arguments are named fields; the answer is the step's result:
//   - a string, boolean or dictionary as the operation returns it;
//   - assets as dictionaries (asset_spec.h), sets as sorted arrays, accounts as
//     {vantorID, PRID, altPRID} (each only when set);
//   - an operation with an error out-parameter: {"returned": BOOL, "error": ERROR} ("error" only
//     when one was set), plus "progress": [fractions reported] when it takes a progress callback;
//   - an operation the client does not implement: "not implemented" (it is not called).
// Operations returning nothing give no result.
#include <algorithm>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/fake/fake_sw.h"
#include "platform/tr_client.h"
#include "replay/action_table.h"
#include "replay/actions.h"
#include "replay/asset_spec.h"

namespace appsync::host::replay {

namespace {

using Op = TRClientOperation;
// What a prepared call does once the client is known to implement it.
using Invocation = std::function<ActionResult(TRClient&)>;

struct HostCall {
  Op operation;
  std::vector<std::string_view> fields;
  // Reads the step's arguments (bad ones are InputErrors even when the client lacks the call).
  std::function<Invocation(StepContext&)> prepare;
};

// The fractions a progress callback reported; the callback may run on any thread, even after
// the call returned.
class ProgressRecord {
 public:
  static ProgressCallback callbackFor(const std::shared_ptr<ProgressRecord>& record) {
    return [record](double fraction) {
      std::lock_guard lock(record->mutex_);
      record->fractions_.emplace_back(fraction);
    };
  }
  plist::Array fractions() const {
    std::lock_guard lock(mutex_);
    return fractions_;
  }

 private:
  mutable std::mutex mutex_;
  plist::Array fractions_;
};

plist::Value statusResult(bool returned, const ErrorRef& error,
                          const std::shared_ptr<ProgressRecord>& progress = nullptr) {
  plist::Dict result{{"returned", returned}};
  if (error) result.set("error", errorValue(error));
  if (progress) result.set("progress", progress->fractions());
  return result;
}

plist::Value sortedArray(const std::set<std::string>& values) {
  plist::Array array(values.begin(), values.end());  // a std::set is already in order
  return array;
}

plist::Value assetsValue(const std::vector<std::shared_ptr<TRAsset>>& assets,
                         const std::filesystem::path& root) {
  plist::Array array;
  for (const auto& asset : assets) {
    if (asset) array.emplace_back(assetValue(*asset, root));
  }
  return array;
}

plist::Value accountValue(const TRMutableAccountInfo& account) {
  plist::Dict dict;
  if (account.vantorID()) dict.set("vantorID", *account.vantorID());
  if (account.PRID()) dict.set("PRID", *account.PRID());
  if (account.altPRID()) dict.set("altPRID", *account.altPRID());
  return dict;
}

ErrorRef optionalError(const StepContext& c) {
  auto field = c.step.optional("error");
  return field ? readError(*field) : nullptr;
}

std::shared_ptr<TRAsset> assetOf(const StepContext& c) {
  return readAsset(c.step["asset"], c.session.root());
}

// A path the backup system asks about, handed over as written (under the root).
std::string backupPath(const StepContext& c) {
  return clientPath(c.session.root(), c.step["path"].string());
}

// Runs `run` with a backup manager of the device's backup service (made without counting a
// call of the service's newManager).
Invocation withBackupManager(StepContext& c, std::function<bool(TRClient&, SWManager*)> run) {
  auto manager = std::make_shared<FakeSWManager>(c.session.device().sw());
  return [manager, run](TRClient& client) -> ActionResult {
    return plist::Value(run(client, manager.get()));
  };
}

// Calls initiateAssetDownloadsWithCompletion and waits for its completion, which the protocol
// runs exactly once. {"error": ERROR} or {}.
ActionResult initiateDownloads(TRClient& client) {
  struct Outcome {
    std::mutex mutex;
    std::condition_variable done;
    std::optional<ErrorRef> error;
  };
  auto outcome = std::make_shared<Outcome>();
  client.initiateAssetDownloadsWithCompletion([outcome](ErrorRef error) {
    std::lock_guard lock(outcome->mutex);
    outcome->error = std::move(error);
    outcome->done.notify_all();
  });
  std::unique_lock lock(outcome->mutex);
  outcome->done.wait(lock, [&] { return outcome->error.has_value(); });
  plist::Dict result;
  if (*outcome->error) result.set("error", errorValue(*outcome->error));
  return plist::Value(std::move(result));
}

Invocation noResult(std::function<void(TRClient&)> run) {
  return [run](TRClient& client) -> ActionResult {
    run(client);
    return std::nullopt;
  };
}

const std::vector<HostCall>& hostCalls() {
  static const std::vector<HostCall> calls = {
      {Op::currentSyncAnchor,
       {},
       [](StepContext&) -> Invocation {
         return [](TRClient& c) -> ActionResult { return plist::Value(c.currentSyncAnchor()); };
       }},
      {Op::prepareForSyncWithHostAnchor,
       {"hostAnchor"},
       [](StepContext& s) -> Invocation {
         std::string anchor = s.step["hostAnchor"].string();
         return [anchor](TRClient& c) -> ActionResult {
           auto progress = std::make_shared<ProgressRecord>();
           ErrorRef error;
           bool ok = c.prepareForSyncWithHostAnchor(anchor, ProgressRecord::callbackFor(progress),
                                                    &error);
           return statusResult(ok, error, progress);
         };
       }},
      {Op::prepareForSyncWithHostAnchorHostAuthIdentifierHostVersion,
       {"hostAnchor", "hostAuthIdentifier", "hostVersion"},
       [](StepContext& s) -> Invocation {
         std::string anchor = s.step["hostAnchor"].string();
         std::uint32_t auth = readUInt32(s.step["hostAuthIdentifier"]);
         std::string version = s.step["hostVersion"].string();
         return [anchor, auth, version](TRClient& c) -> ActionResult {
           auto progress = std::make_shared<ProgressRecord>();
           ErrorRef error;
           bool ok = c.prepareForSyncWithHostAnchor(anchor, auth, version,
                                                    ProgressRecord::callbackFor(progress), &error);
           return statusResult(ok, error, progress);
         };
       }},
      {Op::reconcileSync,
       {"syncType", "newAnchor"},
       [](StepContext& s) -> Invocation {
         std::uint32_t type = readUInt32(s.step["syncType"]);
         std::string anchor = s.step["newAnchor"].string();
         return [type, anchor](TRClient& c) -> ActionResult {
           auto progress = std::make_shared<ProgressRecord>();
           ErrorRef error;
           bool ok = c.reconcileSync(type, anchor, ProgressRecord::callbackFor(progress), &error);
           return statusResult(ok, error, progress);
         };
       }},
      {Op::syncEndedWithSuccess,
       {"success"},
       [](StepContext& s) -> Invocation {
         bool success = s.step["success"].boolean();
         return noResult([success](TRClient& c) { c.syncEndedWithSuccess(success); });
       }},
      {Op::reconcileRestoreOfType,
       {"restoreType"},
       [](StepContext& s) -> Invocation {
         std::int32_t type = readInt32(s.step["restoreType"]);
         return [type](TRClient& c) -> ActionResult {
           ErrorRef error;
           bool ok = c.reconcileRestoreOfType(type, &error);
           return statusResult(ok, error);
         };
       }},
      {Op::reconcileRestoreWithError,
       {},
       [](StepContext&) -> Invocation {
         return [](TRClient& c) -> ActionResult {
           ErrorRef error;
           bool ok = c.reconcileRestoreWithError(&error);
           return statusResult(ok, error);
         };
       }},
      {Op::restoreEndedWithError,
       {"error"},
       [](StepContext& s) -> Invocation {
         ErrorRef error = optionalError(s);
         return noResult([error](TRClient& c) { c.restoreEndedWithError(error); });
       }},
      {Op::cancelSyncOperations,
       {},
       [](StepContext&) { return noResult([](TRClient& c) { c.cancelSyncOperations(); }); }},
      {Op::registerMessageHandlersWithLink,
       {},
       [](StepContext&) {
         // The host's message link has no stand-in: the client gets none.
         return noResult([](TRClient& c) { c.registerMessageHandlersWithLink(nullptr); });
       }},
      {Op::installedAssets,
       {},
       [](StepContext&) -> Invocation {
         return [](TRClient& c) -> ActionResult { return plist::Value(c.installedAssets()); };
       }},
      {Op::outstandingAssetTransfers,
       {},
       [](StepContext& s) -> Invocation {
         std::filesystem::path root = s.session.root();
         return [root](TRClient& c) -> ActionResult {
           return assetsValue(c.outstandingAssetTransfers(), root);
         };
       }},
      {Op::outstandingAssetTransfersWithDownloadManager,
       {},
       [](StepContext& s) -> Invocation {
         // The host's download manager has no stand-in: the client gets none.
         std::filesystem::path root = s.session.root();
         return [root](TRClient& c) -> ActionResult {
           return assetsValue(c.outstandingAssetTransfersWithDownloadManager(nullptr), root);
         };
       }},
      {Op::assetTransferSucceeded,
       {"asset", "succeeded", "error"},
       [](StepContext& s) -> Invocation {
         auto a = assetOf(s);
         bool succeeded = s.step["succeeded"].boolean();
         ErrorRef error = optionalError(s);
         return noResult(
             [a, succeeded, error](TRClient& c) { c.assetTransfer(a, succeeded, error); });
       }},
      {Op::assetTransferUpdatedProgress,
       {"asset", "progress"},
       [](StepContext& s) -> Invocation {
         auto a = assetOf(s);
         double progress = s.step["progress"].real();
         return noResult([a, progress](TRClient& c) { c.assetTransfer(a, progress); });
       }},
      {Op::assetTransferEndedWithSuccess,
       {"success"},
       [](StepContext& s) -> Invocation {
         bool success = s.step["success"].boolean();
         return noResult([success](TRClient& c) { c.assetTransferEndedWithSuccess(success); });
       }},
      {Op::assetInstallSucceeded,
       {"asset"},
       [](StepContext& s) -> Invocation {
         auto a = assetOf(s);
         return noResult([a](TRClient& c) { c.assetInstallSucceeded(a); });
       }},
      {Op::assetInstallFailed,
       {"asset", "error"},
       [](StepContext& s) -> Invocation {
         auto a = assetOf(s);
         ErrorRef error = optionalError(s);
         return noResult([a, error](TRClient& c) { c.assetInstallFailed(a, error); });
       }},
      {Op::metadataUpdate,
       {"metadata", "asset", "newAnchor"},
       [](StepContext& s) -> Invocation {
         plist::Dict metadata = readDict(s.step["metadata"]);
         auto a = assetOf(s);
         std::string anchor = s.step["newAnchor"].string();
         return noResult(
             [metadata, a, anchor](TRClient& c) { c.metadataUpdate(metadata, a, anchor); });
       }},
      {Op::prioritizeAsset,
       {"asset"},
       [](StepContext& s) -> Invocation {
         auto a = assetOf(s);
         return noResult([a](TRClient& c) { c.prioritizeAsset(a); });
       }},
      {Op::initiateAssetDownloadsWithCompletion,
       {},
       [](StepContext&) -> Invocation { return initiateDownloads; }},
      {Op::clearSyncData,
       {},
       [](StepContext&) { return noResult([](TRClient& c) { c.clearSyncData(); }); }},
      {Op::installedAssetMetrics,
       {},
       [](StepContext&) -> Invocation {
         return [](TRClient& c) -> ActionResult { return plist::Value(c.installedAssetMetrics()); };
       }},
      {Op::vantorIDsForAssets,
       {},
       [](StepContext&) -> Invocation {
         return [](TRClient& c) -> ActionResult { return sortedArray(c.vantorIDsForAssets()); };
       }},
      {Op::accountsForAssets,
       {},
       [](StepContext&) -> Invocation {
         return [](TRClient& c) -> ActionResult {
           plist::Array accounts;
           for (const auto& account : c.accountsForAssets()) {
             accounts.push_back(accountValue(account));
           }
           return plist::Value(std::move(accounts));
         };
       }},
      {Op::disabledAssetTypes,
       {},
       [](StepContext&) -> Invocation {
         // No set at all gives no result; an empty set is [].
         return [](TRClient& c) -> ActionResult {
           auto types = c.disabledAssetTypes();
           if (!types) return std::nullopt;
           return sortedArray(*types);
         };
       }},
      {Op::prepareForBackup,
       {},
       [](StepContext&) { return noResult([](TRClient& c) { c.prepareForBackup(); }); }},
      {Op::backupEnded,
       {},
       [](StepContext&) { return noResult([](TRClient& c) { c.backupEnded(); }); }},
      {Op::pathsToBackup,
       {},
       [](StepContext& s) -> Invocation {
         std::filesystem::path root = s.session.root();
         return [root](TRClient& c) -> ActionResult {
           std::vector<std::string> include, exclude;
           c.pathsToBackup(&include, &exclude);
           auto shown = [&root](const std::vector<std::string>& paths) {
             plist::Array array;
             for (const auto& path : paths) array.emplace_back(shownPath(root, path));
             return array;
           };
           return plist::Value(plist::Dict{{"pathsToBackup", shown(include)},
                                           {"pathsNotToBackup", shown(exclude)}});
         };
       }},
      {Op::shouldRestoreFile,
       {"path"},
       [](StepContext& s) {
         std::string path = backupPath(s);
         return withBackupManager(s, [path](TRClient& c, SWManager* manager) {
           return c.shouldRestoreFile(path, manager);
         });
       }},
      {Op::shouldBackgroundRestorePath,
       {"path"},
       [](StepContext& s) {
         std::string path = backupPath(s);
         return withBackupManager(s, [path](TRClient& c, SWManager* manager) {
           return c.shouldBackgroundRestorePath(path, manager);
         });
       }},
      {Op::shouldBackgroundRestoreFile,
       {"path"},
       [](StepContext& s) {
         std::string path = backupPath(s);
         return withBackupManager(s, [path](TRClient& c, SWManager* manager) {
           return c.shouldBackgroundRestoreFile(path, manager);
         });
       }},
  };
  return calls;
}

const std::vector<ActionEntry>& callTable() {
  static const std::vector<ActionEntry> table = [] {
    std::vector<ActionEntry> specs;
    specs.push_back({"supportedDataclasses", {}, [](StepContext& s) -> ActionResult {
                       std::vector<std::string> names = s.session.client().supportedDataclasses();
                       return plist::Value(plist::Array(names.begin(), names.end()));
                     }});
    for (const HostCall& call : hostCalls()) {
      specs.push_back(
          {operationName(call.operation), call.fields, [call](StepContext& s) -> ActionResult {
             Invocation invoke = call.prepare(s);
             TRClient& client = s.session.client();
             if (!client.respondsTo(call.operation)) {
               return plist::Value("not implemented");
             }
             return invoke(client);
           }});
    }
    return specs;
  }();
  return table;
}

}  // namespace

ActionResult runHostCall(StepContext& context) { return runFromTable(context, callTable()); }

}  // namespace appsync::host::replay
