#include "cli/StatusFacts.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <set>
#include <type_traits>

#include "cli/Settings.h"
#include "cli/SyncCommand.h"
#include "client/DebugServiceProxy.h"
#include "platform/Files.h"
#include "platform/Paths.h"
#include "platform/ProcessLock.h"
#include "records/TLDebugServiceKeys.h"

namespace cli {

namespace {

constexpr size_t kLockStatusBytes = 64;

// The value of a name in the daemon's metrics; 0 if missing.
int64_t metric(const std::string& metrics, const char* name) {
  const size_t at = metrics.find(name);
  return at == std::string::npos
             ? 0
             : std::strtoll(metrics.c_str() + at + std::strlen(name), nullptr, 10);
}

// Sets the field of this name, if there is one for values of this type.
template <typename Value, typename Fields>
void take(std::string_view key, const Value& value, const Fields& fields) {
  for (const auto& [name, field] : fields) {
    const auto* const number = std::get_if<std::decay_t<decltype(*field)>>(&value);
    if (number != nullptr && key == name) *field = *number;
  }
}

std::optional<IndexStatus> readIndexStatus(const Options& options, TLErrorOut error) {
  client::DebugServiceProxy service(options.runtimeDirectory, options.patience());
  const auto statistics =
      service.fetchStatsForIndexer(options.name, options.protectionClass, error);
  if (!statistics) return std::nullopt;
  IndexStatus status;
  const std::pair<std::string_view, int64_t*> fields[] = {
      {TLDebugServiceDocStoreNumOfItems, &status.stored},
      {TLDebugServiceTextStoreNumOfItems, &status.searchable},
      {TLDebugServiceTextStoreSize, &status.textBytes},
      {TLDebugServiceSaltTotalSuffixes, &status.suffixes},
      {TLDebugServiceSaltHotSuffixes, &status.hotSuffixes},
      {TLDebugServiceSaltVacuumNumOfPhases, &status.merges},
      {TLDebugServiceSaltScanPrefixSearched, &status.scans}};
  const std::pair<std::string_view, double*> times[] = {
      {TLDebugServiceSaltVacuumTimeSecs, &status.mergeSeconds},
      {TLDebugServiceSaltScanTimeSecs, &status.scanSeconds}};
  for (const auto& [key, value] : *statistics) {
    take(key, value, fields);
    take(key, value, times);
  }
  const auto metrics = service.fetchStatsForSalt(options.name, options.protectionClass, error);
  if (!metrics) return std::nullopt;
  status.merging = metrics->find("(IN PROGRESS)") != std::string::npos;
  status.deleted = metric(*metrics, "---- Deleted docs: ");
  return status;
}

Options withClass(Options options, const std::string& name) {
  options.protectionClass = name;
  return options;
}

ClassStatus readClass(const Options& options) {
  ClassStatus status;
  status.name = options.protectionClass;
  status.catalogue = mailsync::openCatalogue(syncSettings(options), &status.error);
  status.lastSync = mailsync::lastSync(syncSettings(options));
  status.isNew = isUnknownClass(options);
  if (!status.isNew) status.index = readIndexStatus(options, &status.error);
  status.disk = diskUse(options);
  status.watched = isWatched(options);
  return status;
}

std::vector<std::string> classesOf(const Options& options) {
  if (options.classGiven) return {options.protectionClass};
  const std::vector<std::string> onDisk = classesOnDisk(options);
  std::set<std::string> names(onDisk.begin(), onDisk.end());
  const auto settings = readSettings();
  if (const auto* const read = std::get_if<Settings>(&settings)) {
    for (const auto& [folder, name] : read->classes) names.insert(name);
  }
  names.insert(options.protectionClass);
  std::erase_if(names, [&](const std::string& name) {
    const Options one = withClass(options, name);
    return isUnknownClass(one) && !mailsync::hasCatalogue(syncSettings(one));
  });
  if (names.empty()) names.insert(options.protectionClass);
  return {names.begin(), names.end()};
}

}  // namespace

bool isWatched(const Options& options) {
  std::optional<TLError> failure;
  const std::string path = mailsync::watchLockPath(syncSettings(options));
  const auto lock = platform::ProcessLock::acquireShared(path, &failure);
  return lock == nullptr && failure->code == EWOULDBLOCK;
}

std::vector<ClassStatus> readClasses(const Options& options) {
  std::vector<ClassStatus> classes;
  for (const std::string& name : classesOf(options)) {
    classes.push_back(readClass(withClass(options, name)));
  }
  return classes;
}

std::optional<mailsync::Measurement> measureIndex(const Options& options) {
  const auto index = readIndexStatus(options, nullptr);
  if (!index) return std::nullopt;
  mailsync::Measurement measurement;
  measurement.messages = index->stored;
  measurement.scans = index->scans;
  measurement.scanSeconds = index->scanSeconds;
  measurement.merges = index->merges;
  measurement.mergeSeconds = index->mergeSeconds;
  if (const auto disk = diskUse(options)) {
    measurement.indexBytes = static_cast<int64_t>(disk->index);
    measurement.storeBytes = static_cast<int64_t>(disk->store);
  }
  return measurement;
}

// The text of the lock status file; without one the device counts as unlocked.
std::string lockStatus(const Options& options) {
  const std::string path = platform::joinPath(options.runtimeDirectory, "lock_status");
  if (!platform::fileExists(path)) return "unlocked";
  const auto text = platform::readFile(path, kLockStatusBytes, nullptr);
  if (!text) return "unknown";
  return text->starts_with("0") ? "unlocked" : "locked";
}

std::string timeText(int64_t seconds) {
  const auto time = static_cast<std::time_t>(seconds);
  std::tm parts{};
  char text[64] = "";
  localtime_r(&time, &parts);
  std::strftime(text, sizeof text, "%FT%T%z", &parts);
  return text;
}

}  // namespace cli
