// The archive of recent answers: any bytes, then what validation makes of what came out.
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <variant>

#include "fuzz/helpers/promises.h"
#include "purgeable/recent_archive.h"
#include "support/values/plist.h"

namespace spacekeep::fuzz {
namespace {

Value documentOf(const Data& archive) {
  const auto parsed = parsePlist(archive.bytes);
  const auto* document = std::get_if<Value>(&parsed);
  require(document != nullptr, "an archive is a property list");
  return *document;
}

void requireStableArchive(const SpacekeepRecentInfo& record) {
  const Data archive = archivedRecentInfo(record);
  if (archive.bytes.empty()) return;
  const auto first = recentInfoFromArchive(archive);
  require(first.has_value(), "an archive that was written can be read");
  const Data again = archivedRecentInfo(*first);
  const auto second = recentInfoFromArchive(again);
  require(second.has_value(), "an archive that was read and written can be read");
  require(isSame(documentOf(again), documentOf(archivedRecentInfo(*second))),
          "an archive is stable from the second round on");
}

void requireAmountsOfEachService(SpacekeepRecentInfo& record) {
  for (const auto& [path, volume] : record.volumes()) {
    const auto amounts = record.amounts(path);
    require(amounts != nullptr, "a known volume has amounts");
    require(amounts->size() == volume.services.size(), "there is one amount per service");
    for (const auto& [service_id, service] : volume.services) {
      require(amounts->contains(service_id), "each service has its amount");
    }
  }
}

/// What is left is of use: nothing empty, and a second look finds nothing more to remove.
void requireSettled(SpacekeepRecentInfo& record, double age_limit_seconds,
                    const RecentInfoContext& context) {
  const std::int32_t verdict = record.validate(age_limit_seconds, 1 << 20, context);
  require((verdict == SpacekeepRecentInfo::kInvalid) == record.volumes().empty(),
          "only an empty record is invalid");
  for (const auto& [path, volume] : record.volumes()) {
    require(!volume.services.empty(), "a volume without services is removed");
    require(volume.timestamp.unix_ns <= context.now.unix_ns, "nothing is of the future");
  }
  const std::int32_t again = record.validate(age_limit_seconds, 1 << 20, context);
  require(again != SpacekeepRecentInfo::kChanged, "validation is done after one pass");
  requireAmountsOfEachService(record);
}

void examine(const SpacekeepRecentInfo& record, std::uint64_t freespace) {
  static constexpr std::int64_t kNow = 1'700'000'000'000'000'000;
  requireStableArchive(record);
  for (const std::int64_t now : {kNow, std::int64_t{0}, INT64_MAX, INT64_MIN}) {
    for (const double age_limit_seconds : {0.0, 86400.0, 1e300}) {
      SpacekeepRecentInfo copy = record;
      requireAmountsOfEachService(copy);
      requireSettled(
          copy, age_limit_seconds,
          {.now = Date{now}, .freespace = [freespace](const std::string&) { return freespace; }});
      copy.update("/data", "com.example.one", {.amount = 5, .timestamp = Date{now}}, freespace);
      requireAmountsOfEachService(copy);
    }
  }
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace spacekeep;
  const auto record = recentInfoFromArchive(Data{{data, data + size}});
  if (!record) return 0;
  fuzz::examine(*record,
                record->volumes().empty() ? 0 : record->volumes().begin()->second.freespace);
  fuzz::examine(*record, UINT64_MAX);
  return 0;
}
