// What every fake service shares: scripted failures by operation name, and call counts.
#pragma once

#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "runtime/error.h"
#include "runtime/plist/value.h"

namespace appsync {

class StateFields;

// Operations are named as the platform names them: the selector for methods
// ("installApplication:withOptions:error:"), the function name for functions
// ("EmplaceClearUninstalled"). Each fake lists its names in its header. A name the fake does not
// know, or failing an operation that has no way to report failure, is a programming error of
// the test and aborts with a message listing the valid names.
class FakeService {
 public:
  // Every call of `operation` fails from now on, or only the next `times` calls. The call
  // reports `error`; when none is given, an error of the service's domain with code 1 and a
  // description naming the operation. Operations that return a status return the error's code.
  static constexpr int kEveryCall = -1;
  void failOperation(std::string_view operation, ErrorRef error = nullptr, int times = kEveryCall);
  // Calls of `operation` succeed again.
  void succeedOperation(std::string_view operation);
  // How many times `operation` has been called (failed calls included).
  std::size_t callCount(std::string_view operation) const;

  const std::string& serviceName() const { return serviceName_; }

  // The scripts as saved state: operation name -> {"calls", "failing"?: {"error", "times"?}}
  // ("times" absent: every call fails), for every operation called or failing. loadScripts
  // replaces every count and script; an operation the state does not name has no calls and
  // succeeds. Throws StateFormatError for an operation this service does not have, or a failure
  // of one that cannot fail.
  plist::Dict saveScripts() const;
  void loadScripts(const StateFields& scripts);

  // Whether failOperation and succeedOperation take `operation`: the service has it and it can
  // fail. Lets a caller with names from outside (a script) refuse a bad one instead of aborting.
  bool knowsOperation(std::string_view operation) const;
  // The operations failOperation takes, sorted.
  std::vector<std::string> operationNames() const;

 protected:
  struct OperationSpec {
    std::string_view name;
    bool canFail;
  };
  FakeService(std::string serviceName, std::string errorDomain,
              std::initializer_list<OperationSpec> operations);
  ~FakeService() = default;
  FakeService(const FakeService&) = delete;
  FakeService& operator=(const FakeService&) = delete;

  // Counts one call of `operation` and returns the failure scripted for it (never a null error
  // when failing), or null when the call is to go ahead.
  ErrorRef beginCall(std::string_view operation);
  // The status an operation reports for `error`: its code, or 1 when the code is 0.
  static std::int64_t statusFor(const ErrorRef& error);

 private:
  struct Script {
    bool canFail = false;
    std::size_t calls = 0;
    bool failing = false;
    int remaining = kEveryCall;
    ErrorRef error;
  };
  Script& scriptFor(std::string_view operation, bool mustBeFailable);

  const std::string serviceName_;
  const std::string errorDomain_;
  mutable std::mutex mutex_;  // leaf lock: nothing is called while it is held
  std::map<std::string, Script, std::less<>> scripts_;
};

}  // namespace appsync
