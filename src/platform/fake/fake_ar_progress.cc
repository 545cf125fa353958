// The fake application registry's install progress: one progress object per application and
// phase, the application's current one, and the phases reported finished.
#include "platform/fake/fake_ar.h"

namespace appsync {

std::shared_ptr<ARInstallProgress> FakeARWorkspace::progressLocked(const std::string& identifier,
                                                                   std::uint64_t phase) {
  Entry* e = findLocked(identifier);
  if (!e || !e->record.isApplication) return nullptr;
  std::shared_ptr<ARInstallProgress>& progress = progress_[{identifier, phase}];
  if (!progress) {
    progress = std::make_shared<ARInstallProgress>(identifier);
    progress->setInstallPhase(phase);
  }
  e->currentProgress = progress;
  return progress;
}

std::shared_ptr<ARInstallProgress> FakeARWorkspace::installProgress(const std::string& identifier,
                                                                    std::uint64_t phase) {
  std::lock_guard lock(mutex_);
  return progressLocked(identifier, phase);
}

std::shared_ptr<ARInstallProgress> FakeARWorkspace::installProgressForApplication(
    const ARApplicationProxy& proxy, std::uint64_t phase) {
  if (beginCall(kProgress)) return nullptr;
  std::lock_guard lock(mutex_);
  return progressLocked(proxy.applicationIdentifier, phase);
}

void FakeARWorkspace::installPhaseFinishedForProgress(
    const std::shared_ptr<ARInstallProgress>& progress) {
  beginCall(kPhaseFinished);
  std::lock_guard lock(mutex_);
  finishedPhases_.push_back(progress);
}

std::shared_ptr<ARInstallProgress> FakeARWorkspace::currentInstallProgress(
    const std::string& identifier) const {
  std::lock_guard lock(mutex_);
  const Entry* e = findLocked(identifier);
  return e ? e->currentProgress : nullptr;
}

std::vector<std::shared_ptr<ARInstallProgress>> FakeARWorkspace::finishedPhases() const {
  std::lock_guard lock(mutex_);
  return finishedPhases_;
}

}  // namespace appsync
