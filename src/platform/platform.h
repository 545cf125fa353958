// Every platform service the client calls, handed to it at construction. No globals.
#pragma once

#include <type_traits>

#include "runtime/fs/paths.h"
#include "platform/ar.h"
#include "platform/bz.h"
#include "platform/em.h"
#include "platform/kc.h"
#include "platform/pv.h"
#include "platform/qi_icon_service.h"
#include "platform/rs.h"
#include "platform/sw.h"
#include "platform/system.h"
#include "platform/tr.h"
#include "platform/transaction_log.h"

namespace appsync {

// References only: whoever assembles the platform owns the services and keeps them alive for
// as long as any client uses them.
struct Platform {
  TRHostFramework& tr;
  ARApplicationWorkspace& ar;
  KCInstallCoordination& kc;
  EMInstaller& em;
  SWBackupService& sw;
  RSProfileConnection& rs;
  BZStoreService& bz;
  PVHomeScreen& pv;
  QIIconService& qi;
  AITransactionLog& transactionLog;
  SystemServices& system;
  const Paths& paths;

  // A copy with one service replaced, the others shared: how a test puts a wrapper of one
  // service in front of an assembled platform. `Service` derives from exactly one of the
  // service interfaces above.
  template <typename Service>
  Platform with(Service& service) const {
    static_assert(
        (std::is_base_of_v<TRHostFramework, Service> +
         std::is_base_of_v<ARApplicationWorkspace, Service> +
         std::is_base_of_v<KCInstallCoordination, Service> +
         std::is_base_of_v<EMInstaller, Service> + std::is_base_of_v<SWBackupService, Service> +
         std::is_base_of_v<RSProfileConnection, Service> +
         std::is_base_of_v<BZStoreService, Service> + std::is_base_of_v<PVHomeScreen, Service> +
         std::is_base_of_v<QIIconService, Service> + std::is_base_of_v<AITransactionLog, Service> +
         std::is_base_of_v<SystemServices, Service>) == 1,
        "with() takes one platform service");
    return {pick(service, tr),     pick(service, ar),
            pick(service, kc),     pick(service, em),
            pick(service, sw),     pick(service, rs),
            pick(service, bz),     pick(service, pv),
            pick(service, qi),     pick(service, transactionLog),
            pick(service, system), paths};
  }

 private:
  // `replacement` where it is a `Current`, else `current`.
  template <typename Current, typename Replacement>
  static Current& pick(Replacement& replacement, Current& current) {
    if constexpr (std::is_base_of_v<Current, Replacement>) {
      return replacement;
    } else {
      return current;
    }
  }
};

}  // namespace appsync
