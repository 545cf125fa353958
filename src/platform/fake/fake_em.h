// The fake low-level installer: the list of applications it has uninstalled.
#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/em.h"
#include "platform/fake/fake_service.h"

namespace appsync {

// Operations: "EmplaceLookupUninstalled" (can fail: null), "EmplaceClearUninstalled" (can fail:
// the error's code as status, nothing forgotten).
class FakeEMInstaller final : public EMInstaller, public FakeService {
 public:
  FakeEMInstaller();

  // Adds an identifier to the uninstalled list (once; the list keeps the order of addition).
  void addUninstalled(const std::string& identifier);
  std::vector<std::string> uninstalled() const;
  // The identifiers of each EmplaceClearUninstalled call, in call order.
  std::vector<std::vector<std::string>> clearCalls() const;

  // The whole state as a property list, and back (replacing everything, with no events; a
  // missing field is empty). loadState throws StateFormatError naming the bad field.
  plist::Dict saveState() const;
  void loadState(const StateFields& state);

  // A fresh dictionary identifier -> {} that the caller owns.
  std::unique_ptr<plist::Dict> EmplaceLookupUninstalled(const plist::Dict* options) override;
  // Forgets exactly the given identifiers (unknown ones are ignored).
  int EmplaceClearUninstalled(const std::vector<std::string>& identifiers,
                              const plist::Dict* options) override;

 private:
  mutable std::mutex mutex_;
  std::vector<std::string> uninstalled_;
  std::vector<std::vector<std::string>> clearCalls_;
};

}  // namespace appsync
