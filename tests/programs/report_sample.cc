// Writes the page of "spacekeepctl report" with made-up content: report-sample ENTRIES [empty|hostile].
// For looking at the page in a browser, and for measuring how long it takes to come up.
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <random>
#include <string>

#include "ctl/report/html_page.h"
#include "ctl/report/report_data.h"

namespace spacekeep::ctl {
namespace {

constexpr std::int64_t kMadeNs = 1'795'000'000'000'000'000;
constexpr std::int64_t kGiB = std::int64_t{1} << 30;

const char* const kServices[] = {"com.quorvel.Spacekeep.apt",
                                 "com.quorvel.Spacekeep.journal",
                                 "org.example.photos",
                                 "com.quorvel.Spacekeep.user-caches",
                                 "org.example.maps",
                                 "org.example.mail",
                                 "com.quorvel.Spacekeep.docker-images",
                                 "org.example.music"};
const char* const kHostile[] = {
    "</script><script>document.title='broken'</script>",
    "\"><img src=x onerror=\"document.title='broken'\">",
    "<!-- <script>",
    "gpj.\u202Eexe.photo",
    "quote \" and ' and \\ and & &lt;",
    "__proto__",
    "line\nbreak\u2028and\ttab",
    "a.very.long.name.without.any.space.in.it.that.goes.on.and.on.and.on.and.on.and.on"};

class Sample {
 public:
  Sample(int entries, const std::string& kind) : entries_(entries), hostile_(kind == "hostile") {
    if (kind == "empty") return;
    addVolume("/", 60 * kGiB, 3 * kGiB, 524'288'000, 1);
    addVolume("/home", 400 * kGiB, 91 * kGiB, 524'288'000, 5);
    addVolume(hostile_ ? "/media/<b>stick</b>\u202E" : "/boot", kGiB / 2, kGiB / 90, 26'000'000,
              0.001);
  }

  ReportData make() {
    ReportData data{.host = hostile_ ? "<i>host</i>" : "kitchen",
                    .made_ns = kMadeNs,
                    .wanted = {},
                    .status = {.volumes = volumes_, .survey = survey_},
                    .history = {}};
    for (int number = entries_; number > 0; --number) {
      data.history.entries.emplace_back(entry(number));
    }
    return data;
  }

 private:
  std::uint64_t upTo(std::uint64_t limit) { return random_() % limit; }
  std::string service(std::size_t index) {
    return hostile_ ? kHostile[index % std::size(kHostile)]
                    : kServices[index % std::size(kServices)];
  }

  void addVolume(const std::string& path, std::int64_t size, std::int64_t free, std::int64_t low,
                 double scale) {
    const bool is_low = free < low;
    volumes_.volumes.push_back(
        {.volume = path,
         .file_system = 0,
         .space = {.size_bytes = static_cast<std::uint64_t>(size),
                   .available_bytes = static_cast<std::uint64_t>(free),
                   .inodes = 1'000'000,
                   .available_inodes = 800'000},
         .thresholds = {.low_bytes = static_cast<std::uint64_t>(low),
                        .very_low_bytes = static_cast<std::uint64_t>(low / 3),
                        .low_inodes = 50'000,
                        .very_low_inodes = 16'000},
         .level = is_low ? SpaceLevel::kLow : SpaceLevel::kEnough});
    VolumeOffers offers{.volume = path, .detail = VolumeOffers::Detail::kServices};
    for (std::size_t i = 0; i < std::size(kServices); ++i) {
      ServiceOffers one{.id = service(i), .bytes = {}};
      for (std::size_t u = 0; u < kUrgencies; ++u) {
        const auto bytes =
            static_cast<std::int64_t>(scale * static_cast<double>(kGiB) /
                                      static_cast<double>(i * i + 1) * static_cast<double>(u + 1));
        one.bytes[u] = bytes;
        offers.total_bytes[u] += bytes;
      }
      offers.services.push_back(one);
    }
    survey_.volumes.push_back(offers);
  }

  /// The oldest is number 1; one every ten minutes.
  Dictionary entry(int number) {
    const auto& volume = volumes_.volumes[upTo(2)];
    const std::int64_t date_ns = kMadeNs - (entries_ - number) * 600'000'000'000;
    const std::uint64_t begin = volume.space.available_bytes + upTo(volume.space.size_bytes / 9);
    const std::uint64_t asked = (1 + upTo(40)) * 50'000'000;
    const bool is_short = upTo(7) == 0;
    const std::uint64_t freed = is_short ? asked / 3 : asked + upTo(9'000'000);
    Dictionary services;
    for (std::uint64_t i = upTo(4) + 1; i > 0; --i) services.set(service(upTo(8)), freed / (i + 1));
    Dictionary made{{"SPACEKEEP_ENTRY", number},
                    {"SPACEKEEP_DATE", Value(Date{date_ns})},
                    {"SPACEKEEP_KIND", number % 9 == 0   ? "daily pass"
                                       : number % 5 == 0 ? "low space"
                                                         : "purge"},
                    {"SPACEKEEP_VOLUME", volume.volume},
                    {"SPACEKEEP_AMOUNT", asked},
                    {"SPACEKEEP_URGENCY_LIMIT", 3},
                    {"SPACEKEEP_URGENCY", 1 + upTo(3)},
                    {"SPACEKEEP_FREESPACE_BEGIN", begin},
                    {"SPACEKEEP_FREESPACE_END", begin + freed},
                    {"SPACEKEEP_AMOUNT_FREED", freed},
                    {"SPACEKEEP_AMOUNT_REPORTED", freed},
                    {"SPACEKEEP_REPORTING_SERVICES", services},
                    {"SPACEKEEP_ELAPSED_TIME", static_cast<double>(upTo(9000)) / 1000}};
    if (number % 9 != 0 && number % 5 != 0) made.set("SPACEKEEP_CLIENT", client());
    if (is_short && number % 9 != 0) addShortness(made);
    return made;
  }

  Dictionary client() {
    if (hostile_) return {{"SPACEKEEP_UID", 0}, {"SPACEKEEP_PROGRAM", kHostile[upTo(8)]}};
    return {{"SPACEKEEP_UID", upTo(2) * 1000},
            {"SPACEKEEP_PID", 100 + upTo(9000)},
            {"SPACEKEEP_PROGRAM", upTo(2) == 0 ? "spacekeepctl" : "installer"},
            {"SPACEKEEP_UNIT", "update.service"}};
  }

  void addShortness(Dictionary& made) {
    const char* const reasons[] = {"no services", "no answer in time", "nothing more to give",
                                   "cancelled", "refused: <b>bad</b> request"};
    const std::string why = reasons[upTo(5)];
    made.set("SPACEKEEP_WHY_SHORT", why);
    if (why == "no answer in time") {
      made.set("SPACEKEEP_SERVICES_INFLIGHT", Array{service(upTo(8)), service(upTo(8))});
    }
  }

  const int entries_;
  const bool hostile_;
  std::mt19937_64 random_{42};  // tidy-allow: the same page each time
  VolumeReport volumes_;
  Survey survey_;
};

}  // namespace
}  // namespace spacekeep::ctl

int main(int argc, char** argv) {
  using namespace spacekeep::ctl;
  const int entries = argc > 1 ? std::atoi(argv[1]) : 1000;
  const std::string page = pageWith(jsonOf(Sample(entries, argc > 2 ? argv[2] : "").make()));
  return std::fwrite(page.data(), 1, page.size(), stdout) == page.size() ? 0 : 1;
}
