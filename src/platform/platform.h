// Every platform service the client calls, handed to it at construction. No globals.
#pragma once

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
};

}  // namespace appsync
