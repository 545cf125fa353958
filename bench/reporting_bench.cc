// The reporting walks over every installed application's store metadata file, on a device with
// 10,000 user applications whose files hold about 4 KB each: time per walk and how far the
// process's resident memory rises above where it stood before the walk. Each file is to be
// parsed and dropped before the next, so the rise must stay small whatever the number of apps.
// The device lies in TMPDIR (default /tmp): prepareForBackup's atomic rewrites cost what that
// file system charges for creating and replacing files. Two floors sit beside the walks: the
// registry listing the apps (its records are counted in every walk's memory), and the same files
// replaced unchanged (the file system's share of prepareForBackup).
#include <benchmark/benchmark.h>
#include <malloc.h>

#include <algorithm>
#include <chrono>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "bench_device.h"
#include "runtime/fs/files.h"
#include "runtime/plist/codec.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr int kApps = 10000;
constexpr int kAccounts = 4;
constexpr const char* kMetadataName = "CaravelMetadata.plist";
constexpr const char* kDownloadInfoKey = "com.vantor.CaravelStore.downloadInfo";

std::string format(const char* pattern, int value) {
  char text[160];
  std::snprintf(text, sizeof text, pattern, value);
  return text;
}

std::string account(int i) { return format("shopper%d@example.com", i % kAccounts); }

// Which of the flags the prepare-for-backup walk looks at an application has. About one app in
// eight has a pending automatic download, one in four already has the device-based flag, and
// one in five is device-based now.
bool autoDownloadPending(int i) { return i % 8 == 0; }
bool hasDeviceBasedEntry(int i) { return i % 4 == 0; }
bool deviceBased(int i) { return i % 5 == 0; }

// Paragraphs of store text, different per application (a binary file shares only equal strings).
std::string prose(int i, int sentences) {
  static const char* const kSentences[] = {
      "Build towns, trade goods and sail between islands in a calm strategy game. ",
      "Every season brings new quests, new crews and harbours to discover. ",
      "Play offline on long journeys; your progress follows you between devices. ",
      "Invite friends to a shared archipelago and race to finish the lighthouse first. ",
      "Hand-drawn maps, a gentle soundtrack and no timers that nag you to come back. ",
      "Over two hundred puzzles, from quick ferry routes to week-long trade empires. ",
  };
  std::string text = format("Harbour Tales %05d. ", i);
  for (int s = 0; s < sentences; ++s) text += kSentences[(i + s) % std::size(kSentences)];
  return text;
}

plist::Dict accountInfo(int i) {
  const int k = i % kAccounts;
  return plist::Dict{{"VantorID", account(i)},
                     {"PRPersonID", 1200000000 + 7919 * k},
                     {"AltPRID", format("000%d51-08-2f6e4c1a-9d3b-4e0f-b1c2-7a8e5d4c3b2a", k)},
                     {"FirstName", "Robin"},
                     {"LastName", format("Shopper%d", k)},
                     {"AccountStoreFront", "143443-4,29"},
                     {"DownloaderID", 0},
                     {"FamilyID", 21000000 + k},
                     {"PurchaserID", 1200000000 + 7919 * k}};
}

// A store metadata file as the store leaves it after a purchase: the item, its artist, genre,
// price and text, the supported devices and languages, and the download's account.
plist::Dict storeMetadata(int i) {
  plist::Array versionIds;
  for (int v = 0; v < 24; ++v) versionIds.push_back(840000000 + 1000 * v + i);
  plist::Array languages;
  for (const char* code :
       {"EN", "DE", "FR", "ES", "IT", "JA", "KO", "NL", "PT", "RU", "SV", "ZH"}) {
    languages.push_back(code);
  }
  plist::Dict metadata{
      {"itemId", 1400000000 + i},
      {"itemName", format("Harbour Tales %05d", i)},
      {"artistName", format("Lighthouse Games %d", i % 97)},
      {"artistId", 900000 + i % 97},
      {"playlistName", format("Lighthouse Games %d", i % 97)},
      {"genre", "Games"},
      {"genreId", 6014},
      {"subgenres", plist::Array{plist::Dict{{"genre", "Strategy"}, {"genreId", 7017}},
                                 plist::Dict{{"genre", "Simulation"}, {"genreId", 7015}}}},
      {"releaseDate", "2024-03-14T07:00:00Z"},
      {"purchaseDate", plist::Date{7.5e8 + 3600.0 * i}},
      {"priceDisplay", "$2.99"},
      {"price", 2.99},
      {"currency", "USD"},
      {"kind", "software"},
      {"softwareVersionBundleId", format("com.example.harbour%05d", i)},
      {"bundleVersion", format("4.12.%d", i % 40)},
      {"bundleShortVersionString", "4.12"},
      {"softwareVersionExternalIdentifier", 840000000 + 23000 + i},
      {"softwareVersionExternalIdentifiers", std::move(versionIds)},
      {"softwareSupportedDeviceIds", plist::Array{2, 4, 9}},
      {"requiredCapabilities", plist::Array{"arm64", "metal", "gamekit", "opengles-3"}},
      {"languages", std::move(languages)},
      {"advisories", plist::Array{"Infrequent/Mild Cartoon or Fantasy Violence",
                                  "Infrequent/Mild Simulated Gambling", "Unrestricted Web Access"}},
      {"contentRating", plist::Dict{{"label", "9+"}, {"rank", 300}, {"system", "store"}}},
      {"copyright", format("(c) 2024 Lighthouse Games %d", i % 97)},
      {"description", prose(i, 20)},
      {"releaseNotes", prose(i + 3, 7)},
      {"artworkURL", format("https://cdn.example.com/art/harbour%05d/1024x1024bb.png", i)},
      {"sellerURL", format("https://lighthouse-games.example.com/harbour%05d", i)},
      {"gameCenterEnabled", i % 3 == 0},
      {"hasOrEverHasHadIAP", i % 2 == 0},
      {"is-purchased-redownload", i % 6 == 0},
      {kDownloadInfoKey,
       plist::Dict{{"accountInfo", accountInfo(i)},
                   {"purchaseDate", plist::Date{7.5e8 + 3600.0 * i}},
                   {"storeCohort", format("10|date=%d00&sf=143443&pgtp=Purchases&prpg=Account"
                                          "&ctxt=Updates&issc=1&reason=user-initiated",
                                          1700000 + i)}}},
  };
  // Some files still carry the identifier in its older top-level place.
  if (i % 10 == 0) metadata.set("vantorId", account(i));
  if (i % 8 <= 1) metadata.set("is-auto-download", autoDownloadPending(i));
  if (hasDeviceBasedEntry(i)) metadata.set("DeviceBasedBLK", i % 8 == 0);
  return metadata;
}

// Written in place rather than through a temporary file: replacing 10,000 files just before the
// walks would leave as many freed inodes behind, which the file system then skips over while
// prepareForBackup creates its own temporary files, and the walk would pay for the set-up.
bool writeNewFile(const std::string& path, const plist::Bytes& bytes) {
  std::ofstream file(path, std::ios::binary | std::ios::trunc);
  file.write(reinterpret_cast<const char*>(bytes.data()),
             static_cast<std::streamsize>(bytes.size()));
  file.close();
  return static_cast<bool>(file);
}

// The device, built once per process: 10,000 installed user applications, each container
// holding its store metadata file, with a pristine copy of every file kept aside so that
// prepareForBackup's rewrites can be undone.
class ReportingDevice {
 public:
  ReportingDevice() {
    if (!device_.made()) return;
    pristine_ = device_.root() / "pristine";
    fs::create_directories(pristine_);
    FakeARWorkspace& registry = device_.device().ar();
    for (int i = 0; i < kApps; ++i) {
      const std::string id = format("com.example.harbour%05d", i);
      std::optional<std::string> container = registry.containerDirectoryFor(id);
      if (!container || !createDirectories(*container)) return;
      const std::string file = *container + "/" + kMetadataName;
      std::optional<plist::Bytes> bytes = plist::writeBinary(storeMetadata(i));
      if (!bytes || !writeNewFile(file, *bytes) || !copyFile(file, pristineCopy(i).string())) {
        return;
      }
      metadataBytes_ += bytes->size();
      files_.push_back(file);
      registry.putApplication({.identifier = id,
                               .version = format("4.12.%d", i % 40),
                               .name = format("Harbour Tales %05d", i),
                               .containerDirectory = container,
                               .staticDiskUsage = 48u * 1024 * 1024,
                               .hasMIDBasedSINF = deviceBased(i)});
    }
    device_.openClient();
  }

  bool ok() const { return device_.ok(); }
  AppsClient& client() { return device_.client(); }
  FakePlatform& device() { return device_.device(); }
  const std::string& metadataFile(int i) const { return files_[i]; }
  double averageFileBytes() const { return static_cast<double>(metadataBytes_) / kApps; }
  std::uint64_t logLines() const { return device_.logLines(); }

  // Puts every metadata file back as it was built.
  bool restore() {
    std::error_code ec;
    for (int i = 0; i < kApps; ++i) {
      fs::copy_file(pristineCopy(i), files_[i], fs::copy_options::overwrite_existing, ec);
      if (ec) return false;
    }
    return true;
  }

 private:
  fs::path pristineCopy(int i) const { return pristine_ / format("%05d.plist", i); }

  bench::TempDevice device_{"reporting_bench"};
  fs::path pristine_;
  std::vector<std::string> files_;
  std::size_t metadataBytes_ = 0;
};

ReportingDevice& reportingDevice() {
  static ReportingDevice instance;
  return instance;
}

// A "Name:   123 kB" line of /proc/self/status, in kB; -1 when it cannot be read.
long statusKb(const char* name) {
  std::ifstream status("/proc/self/status");
  std::string line;
  const std::string prefix = std::string(name) + ":";
  while (std::getline(status, line)) {
    if (line.compare(0, prefix.size(), prefix) == 0) return std::atol(line.c_str() + prefix.size());
  }
  return -1;
}

// Peak resident memory of one walk above the resident memory just before it. Freed heap is
// handed back first, and the kernel's peak is brought down to the current size ("5" to
// clear_refs), so that the peak read afterwards is the walk's own.
class PeakGrowth {
 public:
  bool start() {
    ::malloc_trim(0);
    std::ofstream clear("/proc/self/clear_refs");
    clear << "5";
    clear.close();
    before_ = statusKb("VmRSS");
    return clear && before_ >= 0;
  }
  // The growth in MiB, or a negative number when the peak cannot be read.
  double stop() const {
    const long peak = statusKb("VmHWM");
    return peak < 0 ? -1 : static_cast<double>(peak - before_) / 1024.0;
  }

 private:
  long before_ = 0;
};

// Runs `walk` once per iteration, timing it and measuring its memory; `check` (not timed) runs
// after each walk and returns what is wrong, if anything.
template <typename Walk, typename Check>
void measureWalks(benchmark::State& state, ReportingDevice& device, Walk walk, Check check) {
  double worstGrowth = 0;
  double slowestSeconds = 0;
  for (auto _ : state) {
    state.PauseTiming();
    PeakGrowth growth;
    if (!growth.start()) {
      state.SkipWithError("cannot reset or read the peak resident memory");
      break;
    }
    state.ResumeTiming();
    const auto start = std::chrono::steady_clock::now();
    walk();
    const std::chrono::duration<double> took = std::chrono::steady_clock::now() - start;
    state.PauseTiming();
    const double grown = growth.stop();
    const std::string problem = check();
    state.ResumeTiming();
    if (grown < 0 || !problem.empty()) {
      state.SkipWithError(problem.empty() ? "cannot read the peak resident memory"
                                          : problem.c_str());
      break;
    }
    worstGrowth = std::max(worstGrowth, grown);
    slowestSeconds = std::max(slowestSeconds, took.count());
  }
  state.counters["peak_growth_MB"] = worstGrowth;
  // The time reported is the mean; the target is for every walk.
  state.counters["slowest_ms"] = slowestSeconds * 1000;
  state.counters["apps"] = kApps;
  state.counters["file_KB"] = device.averageFileBytes() / 1024.0;
}

// The floor under every walk: the registry handing out its 10,000 application records, with a
// callback that does nothing.
void BM_ReportingRegistryOnly(benchmark::State& state) {
  ReportingDevice& device = reportingDevice();
  if (!device.ok()) return state.SkipWithError("cannot build the device");
  int seen = 0;
  measureWalks(
      state, device,
      [&] {
        seen = 0;
        device.device().ar().enumerateBundlesOfType(
            ARBundleTypeApplications,
            [&](const std::shared_ptr<const ARBundleProxy>&, bool*) { ++seen; });
      },
      [&] { return seen == kApps ? std::string() : "the registry did not list every app"; });
}
BENCHMARK(BM_ReportingRegistryOnly)->Iterations(3)->UseRealTime()->Unit(benchmark::kMillisecond);

// The floor under prepareForBackup: the file system's cost of replacing, atomically and with
// the same bytes, the files that walk rewrites (about 4,000 of the 10,000), read them included.
void BM_ReportingRewriteOnly(benchmark::State& state) {
  ReportingDevice& device = reportingDevice();
  if (!device.ok()) return state.SkipWithError("cannot build the device");
  int rewritten = 0;
  measureWalks(
      state, device,
      [&] {
        rewritten = 0;
        for (int i = 0; i < kApps; ++i) {
          if (!hasDeviceBasedEntry(i) && !deviceBased(i) && !autoDownloadPending(i)) continue;
          std::optional<plist::Bytes> bytes = readFile(device.metadataFile(i));
          if (bytes && writeFileAtomically(device.metadataFile(i), *bytes)) ++rewritten;
        }
      },
      [&] { return rewritten > 0 ? std::string() : "no file was rewritten"; });
  state.counters["files_rewritten"] = rewritten;
}
BENCHMARK(BM_ReportingRewriteOnly)->Iterations(3)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ReportingVantorIDs(benchmark::State& state) {
  ReportingDevice& device = reportingDevice();
  if (!device.ok()) return state.SkipWithError("cannot build the device");
  std::set<std::string> ids;
  measureWalks(
      state, device, [&] { ids = device.client().vantorIDsForAssets(); },
      [&] {
        return ids.size() == kAccounts && ids.count(account(1)) ? std::string()
                                                                : "wrong account identifiers";
      });
}
BENCHMARK(BM_ReportingVantorIDs)->Iterations(3)->UseRealTime()->Unit(benchmark::kMillisecond);

void BM_ReportingAccounts(benchmark::State& state) {
  ReportingDevice& device = reportingDevice();
  if (!device.ok()) return state.SkipWithError("cannot build the device");
  std::vector<TRMutableAccountInfo> accounts;
  measureWalks(
      state, device, [&] { accounts = device.client().accountsForAssets(); },
      [&] { return accounts.size() == kAccounts ? std::string() : "wrong number of accounts"; });
}
BENCHMARK(BM_ReportingAccounts)->Iterations(3)->UseRealTime()->Unit(benchmark::kMillisecond);

// Every iteration starts from the files as built: after each walk (not timed) its rewrites are
// checked on two apps and every file is put back.
void BM_ReportingPrepareForBackup(benchmark::State& state) {
  ReportingDevice& device = reportingDevice();
  if (!device.ok()) return state.SkipWithError("cannot build the device");
  const std::uint64_t linesBefore = device.logLines();
  measureWalks(
      state, device, [&] { device.client().prepareForBackup(); },
      [&]() -> std::string {
        auto read = [&](int i) {
          std::optional<plist::Bytes> bytes = readFile(device.metadataFile(i));
          std::optional<plist::Value> value = bytes ? plist::parse(*bytes) : std::nullopt;
          return value && value->dict() ? *value->dict() : plist::Dict();
        };
        const plist::Dict cleared = read(8);  // auto-download pending, flag entry, not device-based
        const plist::Dict flagged = read(5);  // device-based, no flag entry before
        const plist::Value* flag = cleared.find("DeviceBasedBLK");
        const plist::Value* added = flagged.find("DeviceBasedBLK");
        if (cleared.contains("is-auto-download") || !flag || flag->boolean() == nullptr ||
            *flag->boolean() || !added || added->boolean() == nullptr || !*added->boolean()) {
          return "the metadata files were not brought up to date";
        }
        return device.restore() ? std::string() : "cannot restore the metadata files";
      });
  state.counters["log_lines"] = static_cast<double>(device.logLines() - linesBefore) /
                                static_cast<double>(std::max<std::int64_t>(state.iterations(), 1));
}
BENCHMARK(BM_ReportingPrepareForBackup)
    ->Iterations(3)
    ->UseRealTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
