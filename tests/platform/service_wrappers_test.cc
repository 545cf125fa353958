// Forwarding wrappers: a platform made of wrappers alone still reaches every fake, and calls
// of the same shape reach their own counterpart.
#include <gtest/gtest.h>

#include "platform/ar_wrapper.h"
#include "platform/bz_wrapper.h"
#include "platform/em_wrapper.h"
#include "platform/fake/fake_platform.h"
#include "platform/kc_wrapper.h"
#include "platform/pv_wrapper.h"
#include "platform/qi_icon_service_wrapper.h"
#include "platform/rs_wrapper.h"
#include "platform/sw_wrapper.h"
#include "platform/system_wrapper.h"
#include "platform/tr_wrapper.h"
#include "platform/transaction_log_wrapper.h"
#include "support/temp_dir.h"

namespace appsync {
namespace {

Platform withAll(const Platform& platform) { return platform; }
template <typename Wrapper, typename... Rest>
Platform withAll(const Platform& platform, Wrapper& wrapper, Rest&... rest) {
  return withAll(platform.with(wrapper), rest...);
}

TEST(ServiceWrappersTest, EachCallReachesItsOwnCounterpart) {
  testing::TempDir root;
  FakePlatform device(root.path());
  TRHostFrameworkWrapper tr(device.tr());
  ARApplicationWorkspaceWrapper ar(device.ar());
  KCInstallCoordinationWrapper kc(device.kc());
  EMInstallerWrapper em(device.em());
  SWBackupServiceWrapper sw(device.sw());
  RSProfileConnectionWrapper rs(device.rs());
  BZStoreServiceWrapper bz(device.bz());
  PVHomeScreenWrapper pv(device.pv());
  QIIconServiceWrapper qi(device.qi());
  AITransactionLogWrapper transactionLog(device.transactionLog());
  SystemServicesWrapper system(device.system());
  const Platform wrapped =
      withAll(device.platform(), tr, ar, kc, em, sw, rs, bz, pv, qi, transactionLog, system);

  // Operations that share a signature: a forwarder calling the wrong one would still compile.
  ARApplicationWorkspaceObserverProtocol observer;
  wrapped.ar.addObserver(&observer);
  EXPECT_EQ(device.ar().observerCount(), 1u);
  wrapped.ar.removeObserver(&observer);
  EXPECT_EQ(device.ar().observerCount(), 0u);

  EXPECT_FALSE(wrapped.ar.installApplication(root / "missing.app", {}));
  ErrorRef error;
  EXPECT_FALSE(wrapped.ar.installApplication(root / "missing.app", {}, &error));
  EXPECT_TRUE(error);
  const auto calls = device.ar().installCalls();
  ASSERT_EQ(calls.size(), 2u);
  EXPECT_TRUE(calls[0].placeholder);
  EXPECT_FALSE(calls[1].placeholder);

  device.system().setMainBundleIdentifier("com.example.main");
  EXPECT_EQ(wrapped.system.mainBundleIdentifier(), "com.example.main");
  EXPECT_EQ(wrapped.system.temporaryDirectory(), root / "tmp");
}

}  // namespace
}  // namespace appsync
