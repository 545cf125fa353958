// The fake store service.
#include "platform/fake/fake_bz.h"

namespace appsync {

namespace {
constexpr std::string_view kNewLibrary = "newSoftwareLibrary";
}  // namespace

FakeBZStoreService::FakeBZStoreService()
    : FakeService("FakeBZStoreService", "BZStoreErrorDomain",
                  {{kNewLibrary, false}, {kRefresh, true}}) {}

std::shared_ptr<BZSoftwareLibrary> FakeBZStoreService::newSoftwareLibrary() {
  beginCall(kNewLibrary);
  return std::make_shared<FakeBZSoftwareLibrary>(*this);
}

void FakeBZStoreService::refresh(std::function<void(ErrorRef)> completion) {
  ErrorRef error = beginCall(kRefresh);
  if (!completion) return;
  callbacks_.post(
      [completion = std::move(completion), error = std::move(error)] { completion(error); });
}

}  // namespace appsync
