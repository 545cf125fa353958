// The store service: refresh of purchase receipts.
#pragma once

#include <functional>
#include <memory>

#include "runtime/error.h"

namespace appsync {

class BZSoftwareLibrary {
 public:
  virtual ~BZSoftwareLibrary() = default;
  // Returns at once; `completion` runs exactly once, on a thread of the service's choosing,
  // with the error or null on success.
  virtual void refreshReceiptsWithCompletionBlock(std::function<void(ErrorRef)> completion) = 0;
};

class BZStoreService {
 public:
  virtual ~BZStoreService() = default;
  virtual std::shared_ptr<BZSoftwareLibrary> newSoftwareLibrary() = 0;
};

}  // namespace appsync
