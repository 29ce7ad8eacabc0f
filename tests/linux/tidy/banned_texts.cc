// Ways of writing that went wrong here or elsewhere, and what to write instead.
#include "tests/linux/tidy/line_rules.h"

namespace spacekeep::tidy {
namespace {

LineRule rule(std::string name, Where where, Look look, std::string pattern, std::string instead) {
  LineRule made;
  made.name = std::move(name);
  made.where = where;
  made.look = look;
  made.pattern = std::move(pattern);
  made.instead = std::move(instead);
  return made;
}

std::vector<LineRule> aboutTheSeam() {
  LineRule headers = rule("HeadersOfThreadsAndClocks", Where::kOutsideSupport, Look::kCode,
                          "#include <(thread|mutex|condition_variable|shared_mutex|future|"
                          "semaphore|latch|barrier|random|chrono|pthread\\.h|stop_token)>",
                          "support/runtime/locks.h, support/runtime/runtime.h, support/queues/");
  headers.words = {"#include <"};
  headers.exceptions = {{"sdk/examples/", "a program of a user of the library"}};
  headers.planted = {"#include <mutex>", "#include <chrono>", "#include <random>"};
  headers.harmless = {"#include <atomic>", "#include \"support/runtime/locks.h\"",
                      "#include <chrono>  // tidy-allow: durations only"};

  LineRule clocks =
      rule("ClocksOfTheLibrary", Where::kProduction, Look::kCode,
           "(steady|system|high_resolution|file)_clock\\s*::\\s*now", "rt::ticks, rt::wallClockNs");
  clocks.words = {"_clock"};
  clocks.planted = {"auto t = std::chrono::steady_clock::now();"};
  clocks.harmless = {"my_clock::now();"};
  clocks.exceptions = {{"sdk/examples/", "a program of a user of the library"}};

  LineRule hashes = rule("OrderOfAHash", Where::kDaemonRooms, Look::kCode,
                         "unordered_(map|set|multimap|multiset)|std::hash\\b",
                         "an ordered container: the same seed must give the same run");
  hashes.words = {"unordered_", "std::hash"};
  hashes.planted = {"std::unordered_map<int, int> all;", "std::hash<int>{}(3);"};
  hashes.harmless = {"std::map<int, int> all;"};
  LineRule sim_hashes = hashes;
  sim_hashes.name = "OrderOfAHashAnywhere";
  sim_hashes.where = Where::kProduction;
  sim_hashes.exceptions = {
      {"services/cachedir/", "an index of millions; nothing depends on the order"}};

  LineRule addresses = rule("OrderOfAddresses", Where::kProduction, Look::kCode,
                            "std::(map|set|multimap|multiset)<(const )?[\\w:]+( const)?\\s?\\*",
                            "a key with an order of its own: addresses differ from run to run");
  addresses.words = {"*"};
  addresses.planted = {"std::map<Service*, int> all;", "std::set<const Service*> all;"};
  addresses.harmless = {"std::map<int, Service*> all;", "std::vector<Service*> all;"};
  addresses.exceptions = {{"sim/world/trace.h", "looked up for a number, never walked through"},
                          {"support/runtime/simulated/", "looked up, never walked through"}};
  return {headers, clocks, hashes, sim_hashes, addresses};
}

std::vector<LineRule> aboutOwners() {
  LineRule copies = rule("LambdasThatCaptureEverythingByCopy", Where::kAllCode, Look::kCode,
                         "\\[=[\\],]", "the names of what is captured");
  copies.words = {"[="};
  copies.planted = {"auto f = [=] { return a; };", "auto f = [=, &b] { return a; };"};
  copies.harmless = {"a[i] = 3;", "auto f = [&] { return a; };", "x = [](int) {};"};

  LineRule raw = rule("RawOwners", Where::kProduction, Look::kCode,
                      "(^|[^\\w.>])(new\\s+[\\w:(]|delete\\s+[\\w(*]|delete\\[\\])",
                      "std::make_unique, std::make_shared");
  raw.words = {"new ", "delete"};
  raw.exceptions = {
      {"daemon/shared_spacekeep.cc", "the one object is never released, except by tests"},
      {"support/runtime/threads/mutex.cc", "in place, so that no thread header is needed"},
      {"ctl/check_service/launched_service.cc", "a private constructor; owned at once"},
      {"support/runtime/simulated/", "kept on purpose until the process ends, or behind a seam"},
      {"support/preferences/linux/sqlite_suite.cc", "a private constructor; owned at once"},
      {"sdk/client_link.cc", "a private constructor; owned at once"}};
  raw.planted = {"auto* a = new Thing;", "return new (place) Thing;", "delete thing;",
                 "delete[] things;"};
  raw.harmless = {"Thing(const Thing&) = delete;", "newThing(3);", "#include <new>"};

  LineRule casts = rule("CastsAroundTheTypes", Where::kDaemonRooms, Look::kCode,
                        "\\b(reinterpret_cast|const_cast|dynamic_cast|goto|volatile|typeid)\\b",
                        "a type, a variant or a virtual member that says what is meant");
  casts.planted = {"auto* a = reinterpret_cast<A*>(b);", "goto done;",
                   "if (dynamic_cast<A*>(b)) return;"};
  casts.harmless = {"static_cast<int>(a);", "gotoDone();"};

  LineRule swallowed = rule("ExceptionsOfEveryKindCaught", Where::kProduction, Look::kCode,
                            "catch \\(\\.\\.\\.\\)", "the type that is expected");
  swallowed.words = {"catch"};
  swallowed.exceptions = {
      {"support/runtime/simulated/scheduler.cc", "an exception must not leave a fiber"},
      {"support/queues/serial_queue.cc", "thrown again once the queue is free"},
      {"sdk/served_service.cc", "the service author's code: the daemon is owed an answer"}};
  swallowed.planted = {"} catch (...) {"};
  swallowed.harmless = {"} catch (const std::exception& error) {"};

  LineRule thrown = rule("ExceptionsThrown", Where::kDaemonRooms, Look::kCode, "\\bthrow\\b",
                         "an answer that says what is wrong: errors are values");
  thrown.words = {"throw"};
  thrown.planted = {"throw Error{};", "  throw;"};
  thrown.harmless = {"noThrow();", "rethrown = 3;"};
  return {copies, raw, casts, swallowed, thrown};
}

std::vector<LineRule> aboutHeaders() {
  LineRule names = rule("WholeNamespacesTakenIn", Where::kAllCode, Look::kCode,
                        "^using namespace std\\s*;", "the names that are used");
  names.words = {"using namespace"};
  names.planted = {"using namespace std;"};
  names.harmless = {"  using namespace std;", "using namespace std::string_literals;",
                    "using std::string;"};

  LineRule defaults =
      rule("CasesForWhateverElse", Where::kDaemonRooms, Look::kCode, "\\bdefault\\s*:",
           "every case by its name: the compiler then says "
           "where a new one is missing");
  defaults.words = {"default"};
  defaults.planted = {"    default:", "default: return 3;"};
  defaults.harmless = {"Thing() = default;", "default_value = 3;"};

  LineRule null = rule("NullOfC", Where::kAllCode, Look::kCode, "\\bNULL\\b", "nullptr");
  null.words = {"NULL"};
  null.planted = {"Thing* a = NULL;"};
  null.harmless = {"sqlite(\"NOT NULL\");"};

  LineRule free_blocks = rule("BlocksThatOnlyRootMayUse", Where::kProduction, Look::kCode,
                              "\\b(f_bfree|f_bsize|f_ffree)\\b",
                              "f_bavail * f_frsize, f_favail: what a program without rights has");
  free_blocks.exceptions = {{"ctl/check_service/space_meter.cc", "blocks in use, by anybody"}};
  free_blocks.words = {"f_b", "f_ffree"};
  free_blocks.planted = {"return s.f_bfree * s.f_frsize;", "return s.f_bavail * s.f_bsize;"};
  free_blocks.harmless = {"return s.f_bavail * s.f_frsize;"};

  LineRule regexes = rule("RegularExpressionsOnForeignText", Where::kProduction, Look::kCode,
                          "std::(basic_)?regex|#include <regex>",
                          "a parser: std::regex recurses once per character of its input");
  regexes.words = {"regex"};
  regexes.planted = {"const std::regex r(text);", "#include <regex>"};
  regexes.harmless = {"regexText();"};
  return {names, defaults, null, free_blocks, regexes};
}

std::vector<LineRule> aboutQueues() {
  LineRule labels = rule("QueueLabelsOfTheirOwn", Where::kProduction, Look::kText,
                         "SerialQueue::create\\(\"(?!com\\.quorvel\\.spacekeep_[a-z])",
                         "\"com.quorvel.spacekeep_\" and the role: who watches queues finds all");
  labels.words = {"SerialQueue::create"};
  labels.exceptions = {{"sim/", "queues of the world around the daemon"}};
  labels.planted = {"SerialQueue::create(\"services.\" + id, global_);",
                    "SerialQueue::create(\"com.quorvel.spacekeep_\", global);"};
  labels.harmless = {"SerialQueue::create(\"com.quorvel.spacekeep_purge\", global);",
                     "SerialQueue::create(\"com.quorvel.spacekeep_services.\" + id, global);",
                     "SerialQueue::create(std::string label, ConcurrentQueue& global);"};
  return {labels};
}

std::vector<LineRule> aboutEveryText() {
  LineRule open = rule("ThingsLeftOpen", Where::kAllTexts, Look::kText,
                       "(^|[^A-Za-z])(TO"
                       "DO|FIX"
                       "ME|XX"
                       "X|HA"
                       "CK)\\b",
                       "the thing itself, or a sentence that says what is not done and why");
  open.words = {"TODO", "FIXME", "XXX", "HACK"};
  open.planted = {"// TODO: later", "# FIXME", "int a;  // XXX why"};
  open.harmless = {"mkstemp(\"/tmp/aXXXXXX\")", "a TODOLIST"};

  LineRule doctype = rule("DocumentTypesInPropertyLists", Where::kAllTexts, Look::kText,
                          "<!DOC"
                          "TYPE plist",
                          "none: a reader would have to fetch it");
  doctype.words = {"DOCTYPE"};
  doctype.planted = {
      "<!DOC"
      "TYPE plist PUBLIC \"\" \"\">"};
  doctype.harmless = {"<plist version=\"1.0\">"};

  LineRule machine = rule("PlacesOfOneMachine", Where::kAllTexts, Look::kText,
                          "(^|[\\s`(=:])[\"']?/(home|root|Users)/[A-Za-z0-9]",
                          "a path relative to the tree, or one that an installation has");
  machine.words = {"/home/", "/root/", "/Users/"};
  machine.planted = {"cd /home/me/spacekeep", "path = \"/root/x\"", "see `/Users/a`"};
  machine.harmless = {"place + \"/root \" + cache", "https://example.org/home/x"};

  LineRule chapters = rule("ChaptersOfAbsentBooks", Where::kAllTexts, Look::kText,
                           "(^|[\\s(])([Pp]art|[Cc]hapter|[Ii]ssue|[Tt]icket|[Bb]ug) #?[0-9]",
                           "the reason itself: the reader has this tree and nothing else");
  chapters.words = {"art ", "hapter ", "ssue ", "icket ", "ug "};
  chapters.planted = {"// see Part 3", "(issue 12)", "as chapter 4 says", "bug #17"};
  chapters.harmless = {"in part a 3", "RFC 8259, section 6", "debug 3"};

  LineRule conflict = rule("MergesLeftHalfDone", Where::kAllTexts, Look::kText,
                           "^(<{7}|>{7}|={7})( |$)", "one of the two sides");
  conflict.words = {"<<<<<<<", ">>>>>>>", "======="};
  conflict.planted = {"<<<<<<< ours", "=======", ">>>>>>> theirs"};
  conflict.harmless = {"==========", "a <<<<<<< b"};
  return {open, doctype, machine, chapters, conflict};
}

}  // namespace

std::vector<LineRule> bannedTexts() {
  std::vector<LineRule> all;
  for (const auto& group :
       {aboutTheSeam(), aboutOwners(), aboutHeaders(), aboutQueues(), aboutEveryText()}) {
    all.insert(all.end(), group.begin(), group.end());
  }
  return all;
}

}  // namespace spacekeep::tidy
