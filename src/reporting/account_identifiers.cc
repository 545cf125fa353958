// Which store accounts the installed applications were obtained with, as the store metadata
// file beside each application records them. What the files say is reported, not checked.
#include <cmath>

#include "client/apps_client.h"
#include "reporting/store_metadata.h"

namespace appsync {

namespace {

constexpr std::string_view kTopLevelAccountKey = "vantorId";
constexpr std::string_view kDownloadInfoKey = "com.vantor.CaravelStore.downloadInfo";
constexpr std::string_view kAccountInfoKey = "accountInfo";
constexpr std::string_view kNestedAccountKey = "VantorID";
constexpr std::string_view kPersonIDKey = "PRPersonID";
constexpr std::string_view kAltPersonIDKey = "AltPRID";

// Looks up keys of the metadata expecting one type each. An absent dictionary or key yields
// nothing silently; a value of another type yields nothing and is reported under its label.
class TypedLookup {
 public:
  explicit TypedLookup(const LogCategory& typeErrors) : typeErrors_(typeErrors) {}

  const plist::Dict* dict(const plist::Dict* in, std::string_view key,
                          std::string_view label) const {
    const plist::Value* value = present(in, key);
    if (!value) return nullptr;
    if (!value->dict()) unexpectedType(label);
    return value->dict();
  }

  std::optional<std::string> string(const plist::Dict* in, std::string_view key,
                                    std::string_view label) const {
    const plist::Value* value = present(in, key);
    if (!value) return std::nullopt;
    if (!value->string()) {
      unexpectedType(label);
      return std::nullopt;
    }
    return *value->string();
  }

  // Integers, and reals cut to a whole number, that fit a signed 64-bit integer.
  std::optional<std::int64_t> number(const plist::Dict* in, std::string_view key,
                                     std::string_view label) const {
    const plist::Value* value = present(in, key);
    if (!value) return std::nullopt;
    if (value->integer()) return value->int64();
    if (const double* real = value->real()) {
      // 2^63 is exact as a double; anything at or above it (or NaN) does not fit.
      if (std::isfinite(*real) && *real >= -9223372036854775808.0 &&
          *real < 9223372036854775808.0) {
        return static_cast<std::int64_t>(*real);
      }
      return std::nullopt;
    }
    unexpectedType(label);
    return std::nullopt;
  }

 private:
  static const plist::Value* present(const plist::Dict* in, std::string_view key) {
    return in ? in->find(key) : nullptr;
  }
  void unexpectedType(std::string_view label) const {
    logMessage(typeErrors_, LogLevel::Error, "unexpected type for %{public}@", label);
  }

  const LogCategory& typeErrors_;
};

}  // namespace

std::set<std::string> AppsClient::vantorIDsForAssets() {
  logDefault("%s|getting id's for assets");
  const TypedLookup lookup(platform_.tr.TRGetLogCategory(kTypeCheckLogCategory));
  std::set<std::string> identifiers;
  forEachApplicationMetadata(
      platform_.ar, platform_.paths.root(),
      [&](const ARApplicationProxy& application, const std::optional<std::string>& path,
          std::optional<StoreMetadata>& metadata) {
        const plist::Dict* root = metadata ? &metadata->root : nullptr;

        std::optional<std::string> older = lookup.string(root, kTopLevelAccountKey, "vantorID");
        const plist::Dict* downloadInfo = lookup.dict(root, kDownloadInfoKey, "downloadInfo");
        const plist::Dict* accountInfo = lookup.dict(downloadInfo, kAccountInfoKey, "accountInfo");
        std::optional<std::string> newer =
            lookup.string(accountInfo, kNestedAccountKey, "VantorID");

        if (older && newer) {
          if (*older != *newer) {
            logDefault("%s|mismatched VantorID keys for %{public}@: %{public}@ vs %{public}@",
                       application.applicationIdentifier, *older, *newer);
          }
          identifiers.insert(*older);
          identifiers.insert(*newer);
        } else if (older || newer) {
          identifiers.insert(older ? *older : *newer);
        } else {
          logDefault("%s|unknown VantorID for %{public}@ (plist at %{public}@)",
                     application.applicationIdentifier, path);
        }
      });
  logDefault("%s|Returning vantor ID set: %{public}@",
             plist::Array(identifiers.begin(), identifiers.end()));
  return identifiers;
}

std::vector<TRMutableAccountInfo> AppsClient::accountsForAssets() {
  logDefault("%s|getting accounts for assets");
  const TypedLookup lookup(platform_.tr.TRGetLogCategory(kTypeCheckLogCategory));
  std::vector<TRMutableAccountInfo> accounts;
  std::set<std::string> seen;
  forEachApplicationMetadata(
      platform_.ar, platform_.paths.root(),
      [&](const ARApplicationProxy&, const std::optional<std::string>&,
          std::optional<StoreMetadata>& metadata) {
        const plist::Dict* root = metadata ? &metadata->root : nullptr;

        const plist::Dict* downloadInfo = lookup.dict(root, kDownloadInfoKey, "downloadInfo");
        const plist::Dict* accountInfo = lookup.dict(downloadInfo, kAccountInfoKey, "accountInfo");
        std::optional<std::string> identifier =
            lookup.string(accountInfo, kNestedAccountKey, "VantorID");
        if (!identifier) identifier = lookup.string(root, kTopLevelAccountKey, "vantorID");
        // The first application found for an account supplies its record.
        if (!identifier || !seen.insert(*identifier).second) return;

        TRMutableAccountInfo account;
        account.setPRID(lookup.number(accountInfo, kPersonIDKey, "PRPersonID"));
        account.setVantorID(identifier);
        account.setAltPRID(lookup.string(accountInfo, kAltPersonIDKey, "AltPRID"));
        accounts.push_back(std::move(account));
      });
  std::string described = "(";
  for (const TRMutableAccountInfo& account : accounts) {
    if (described.size() > 1) described += ", ";
    described += account.describe();
  }
  described += ")";
  logDefault("%s|Returning accountInfo: %{public}@", described);
  return accounts;
}

}  // namespace appsync
