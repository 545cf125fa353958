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

  // A copy with one service replaced, the others shared: how a test puts a wrapper of one
  // service in front of an assembled platform.
  Platform with(TRHostFramework& service) const;
  Platform with(ARApplicationWorkspace& service) const;
  Platform with(KCInstallCoordination& service) const;
  Platform with(EMInstaller& service) const;
  Platform with(SWBackupService& service) const;
  Platform with(RSProfileConnection& service) const;
  Platform with(BZStoreService& service) const;
  Platform with(PVHomeScreen& service) const;
  Platform with(QIIconService& service) const;
  Platform with(AITransactionLog& service) const;
  Platform with(SystemServices& service) const;
};

inline Platform Platform::with(TRHostFramework& service) const {
  return {service, ar, kc, em, sw, rs, bz, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(ARApplicationWorkspace& service) const {
  return {tr, service, kc, em, sw, rs, bz, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(KCInstallCoordination& service) const {
  return {tr, ar, service, em, sw, rs, bz, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(EMInstaller& service) const {
  return {tr, ar, kc, service, sw, rs, bz, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(SWBackupService& service) const {
  return {tr, ar, kc, em, service, rs, bz, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(RSProfileConnection& service) const {
  return {tr, ar, kc, em, sw, service, bz, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(BZStoreService& service) const {
  return {tr, ar, kc, em, sw, rs, service, pv, qi, transactionLog, system, paths};
}
inline Platform Platform::with(PVHomeScreen& service) const {
  return {tr, ar, kc, em, sw, rs, bz, service, qi, transactionLog, system, paths};
}
inline Platform Platform::with(QIIconService& service) const {
  return {tr, ar, kc, em, sw, rs, bz, pv, service, transactionLog, system, paths};
}
inline Platform Platform::with(AITransactionLog& service) const {
  return {tr, ar, kc, em, sw, rs, bz, pv, qi, service, system, paths};
}
inline Platform Platform::with(SystemServices& service) const {
  return {tr, ar, kc, em, sw, rs, bz, pv, qi, transactionLog, service, paths};
}

}  // namespace appsync
