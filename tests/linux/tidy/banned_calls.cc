// What is not called here, and what is called instead.
#include "tests/linux/tidy/line_rules.h"

namespace spacekeep::tidy {
namespace {

LineRule calls(std::string name, Where where, std::vector<std::string> words, std::string instead) {
  LineRule rule;
  rule.name = std::move(name);
  rule.where = where;
  rule.words = std::move(words);
  rule.instead = std::move(instead);
  return rule;
}

std::vector<LineRule> ofTheCLibrary() {
  LineRule unbounded = calls("UnboundedCopies", Where::kAllCode,
                             {"strcpy", "strcat", "stpcpy", "strncpy", "strncat", "sprintf",
                              "vsprintf", "strtok", "alloca"},
                             "std::string and fmt::format");
  unbounded.planted = {"strcpy(a, b);", "  std::strncpy(a, b, 3);", "return ::sprintf(a, b);"};
  unbounded.harmless = {"text.gets(3);", "a->strcpy(b);",          "own::strcpy(b);",
                        "my_strcpy(b);", "log(\"strcpy(a, b)\");", "void strcpy(int);"};

  LineRule numbers = calls(
      "NumbersReadWithoutACheck", Where::kAllCode,
      {"atoi", "atol", "atoll", "atof", "strtol", "strtoll", "strtoul", "strtoull", "strtod",
       "strtof", "sscanf", "scanf", "stoi", "stol", "stoll", "stoul", "stoull", "stod", "stof"},
      "std::from_chars, and look at where it stopped");
  numbers.exceptions = {
      {"services/cachedir/bench/", "a measurement, started by hand"},
      {"services/cachedir/engine/", "lines of /proc, whose count of fields is looked at"},
      {"services/command/engine/in_use.cc", "lines of /proc, whose count of fields is looked at"},
      {"sim/program/jobs.cc", "lines of the program's own children, whose count is looked at"},
      {"tests/", "a test fails when what it reads is no number"},
      {"bench/", "a benchmark reads what it has written"}};
  numbers.planted = {"const int pid = std::atoi(text);", "x = strtoull(argv[2], nullptr, 10);",
                     "auto n = std::stoi(text);"};
  numbers.harmless = {"custom::stoi(text);", "std::from_chars(a, b, n);"};

  LineRule hidden = calls(
      "CallsWithHiddenState", Where::kAllCode,
      {"localtime", "gmtime", "ctime", "asctime", "getpwnam", "getgrnam", "getpwuid", "getgrgid",
       "tmpnam", "tempnam", "mktemp", "setjmp", "longjmp", "gethostbyname", "readdir_r"},
      "the variants with _r, mkstemp, errors as values");
  hidden.exceptions = {{"tests/", "one thread, before others are made"},
                       {"bench/", "one thread, before others are made"}};
  hidden.planted = {"auto* entry = ::getpwnam(name);", "std::localtime(&t);"};
  hidden.harmless = {"::getpwnam_r(name, &entry);", "askDatabase(name, &::getgrnam_r);"};

  LineRule memory = calls("RawMemory", Where::kDaemonRooms,
                          {"malloc", "calloc", "realloc", "free", "memcpy", "memmove", "memset",
                           "memcmp", "strlen", "strcmp", "strdup"},
                          "values and containers of the standard library");
  memory.planted = {"free(block);", "std::memcpy(a, b, n);", "if (::strcmp(a, b) == 0) return;"};
  memory.harmless = {"volume.free(block);", "std::uint64_t free(Volume volume);"};
  return {unbounded, numbers, hidden, memory};
}

std::vector<LineRule> ofProcesses() {
  LineRule processes = calls("NewProcesses", Where::kProduction,
                             {"system", "popen", "fork", "vfork", "execv", "execve", "execvp",
                              "execl", "posix_spawn", "posix_spawnp", "wordexp"},
                             "the service manager starts programs; the daemon starts none");
  processes.exceptions = {{"ctl/check_service/", "the tool starts the service that it checks"},
                          {"services/command/tool/", "caches that only their owner's tool cleans"},
                          {"sim/program/jobs.cc", "a seed runs in a process of its own"},
                          {"services/cachedir/bench/", "a measurement of a fresh process"}};
  processes.planted = {"std::system(command);", "const pid_t child = ::fork();"};
  processes.harmless = {"file.system(3);", "systemd(3);"};

  LineRule environment = calls("TheEnvironment", Where::kProduction,
                               {"getenv", "secure_getenv", "setenv", "unsetenv", "putenv"},
                               "a setting, or an argument of a tool: there is no environment "
                               "variable that the daemon looks at");
  environment.exceptions = {
      {"sdk/service_host.cc", "whoever starts a service may put another daemon in front of it"},
      {"services/command/base/user_folders.cc", "where a user keeps caches is said in this way"},
      {"ctl/check_service/", "where a tool may put its scratch files"},
      {"support/logging/linux/journal.cc", "the service manager says so where output goes"},
      {"ctl/style.cc", "NO_COLOR and the terminal's size are given to tools in this way"}};
  environment.planted = {"const char* home = std::getenv(name);", "::setenv(a, b, 1);"};

  LineRule ends =
      calls("AnEndWithoutAnAnswer", Where::kProduction,
            {"exit", "_exit", "quick_exit", "abort", "terminate", "raise", "assert", "signal",
             "sigaction"},
            "errors are values; rt::panic for what cannot be; only main ends a program");
  ends.exceptions = {{"support/runtime/", "where rt::panic ends the process"},
                     {"support/events/linux/linux_event_sources.cc", "the termination signal"},
                     {"support/logging/linux/standard_error.cc", "the signal of a closed output"},
                     {"ctl/check_service/", "a tool that cleans up after a signal, and a child"},
                     {"sdk/include/spacekeep/error.h",
                      "the one assertion of the library: a value "
                      "is taken that is not there"},
                     {"sim/program/jobs.cc", "a child ends without the parent's clean-up"},
                     {"services/cachedir/bench/", "a child ends without the parent's clean-up"}};
  ends.planted = {"std::exit(1);", "else abort();", "assert(value);", "::signal(SIGTERM, f);"};
  ends.harmless = {"app.exit(error);", "semaphore->signal();", "void signal();",
                   "static_assert(true);"};

  LineRule random =
      calls("UnseededRandomness", Where::kOutsideSupport,
            {"rand", "srand", "random", "srandom", "drand48", "lrand48", "getrandom", "getentropy"},
            "rt::randomNumber: the same seed must give the same run");
  random.planted = {"const int n = std::rand();", "return random() % 3;"};
  random.harmless = {"Random random(seed);", "world.random(3);"};
  return {processes, environment, ends, random};
}

std::vector<LineRule> ofDescriptors() {
  LineRule inherited = calls(
      "CallsWhoseDescriptorsAreInherited", Where::kProduction,
      {"pipe", "accept", "dup", "inotify_init", "epoll_create", "creat", "tmpfile", "mkstemp"},
      "the variants that take CLOEXEC: pipe2, accept4, F_DUPFD_CLOEXEC, "
      "inotify_init1, epoll_create1");
  inherited.planted = {"const int fd = ::accept(listener, nullptr, nullptr);", "::dup(fd);",
                       "if (pipe(ends) != 0) return;"};
  inherited.harmless = {"::accept4(fd, nullptr, nullptr, SOCK_CLOEXEC);",
                        "Authentication::accept(line);", "rule.accept(line);"};
  inherited.exceptions = {{"support/ipc/linux/authentication.cc", "a member with that name"},
                          {"sim/program/jobs.cc", "the children it starts are copies of itself"}};

  LineRule select = calls("SelectOnDescriptors", Where::kAllCode, {"select", "FD_SET", "FD_ZERO"},
                          "poll or epoll: from descriptor 1,024 on select writes beside its set");
  select.planted = {"::select(n, &set, nullptr, nullptr, nullptr);", "FD_SET(fd, &set);"};
  select.harmless = {"menu.select(3);"};

  LineRule bus = calls("BusCallsThatTrustTooMuch", Where::kAllCode,
                       {"sd_bus_set_anonymous", "sd_bus_set_trusted", "sd_bus_track_new",
                        "sd_bus_message_get_sender", "sd_bus_query_sender_creds"},
                       "the identity that was taken from the socket at accept");
  bus.exceptions = {{"tests/linux/events/", "a bus with a broker, where senders are its names"}};
  bus.planted = {"sd_bus_set_anonymous(bus, 1);", "  ::sd_bus_track_new(bus, &t, f, nullptr);"};
  return {inherited, select, bus};
}

std::vector<LineRule> ofThreadsAndClocks() {
  LineRule sleeps = calls("SleepsAndClocks", Where::kProduction,
                          {"usleep", "sleep", "nanosleep", "clock_nanosleep", "clock_gettime",
                           "gettimeofday", "time", "clock", "sleep_for", "sleep_until"},
                          "rt::sleepNs, rt::ticks, rt::wallClockNs");
  sleeps.exceptions = {{"support/runtime/", "the seam itself"}};
  sleeps.planted = {"::usleep(3);", "std::time(nullptr);", "clock_gettime(kind, &now);"};
  sleeps.harmless = {"service.time(3);", "rt::sleepNs(3);", "world.sleep(3);"};

  LineRule threads = calls("ThreadsOutsideTheSeam", Where::kProduction,
                           {"pthread_create", "pthread_mutex_lock", "pthread_cond_wait",
                            "pthread_mutex_unlock", "pthread_join", "pthread_detach"},
                           "support/runtime/locks.h, support/runtime/runtime.h, support/queues/");
  threads.exceptions = {{"support/runtime/", "the seam itself"}};
  threads.planted = {"pthread_create(&thread, nullptr, f, nullptr);"};

  LineRule detached = calls("DetachedThreads", Where::kProduction, {},
                            "join: what is not waited "
                            "for outlives what it uses");
  detached.look = Look::kCode;
  detached.pattern = "[.>]detach\\(\\)";
  detached.words = {"detach"};
  detached.exceptions = {
      {"support/queues/concurrent_queue.cc", "a worker counts itself out, and that is waited for"},
      {"support/ipc/linux/ipc_loop.cc", "signals its end, which the loop's owner waits for"},
      {"services/cachedir/engine/space_return.cc", "owns all that it uses, and has a deadline"}};
  detached.planted = {"thread.detach();", "  }).detach();"};
  detached.harmless = {"list.detached();"};
  return {sleeps, threads, detached};
}

std::vector<LineRule> ofOutput() {
  LineRule output = calls(
      "OutputBesideTheLog", Where::kDaemonRooms,
      {"printf", "fprintf", "puts", "fputs", "putchar", "perror", "syslog", "vprintf", "write"},
      "logProblem and logTrace");
  output.planted = {"std::printf(text);", "::perror(text);"};
  output.harmless = {"suite.write(text);", "logProblem(text);"};

  LineRule streams = output;
  streams.name = "StreamsBesideTheLog";
  streams.look = Look::kWords;
  streams.words = {"std::cout", "std::cerr", "std::clog", "std::endl"};
  streams.where = Where::kProduction;
  streams.instead = "logProblem and logTrace; in tools fmt::print";
  streams.planted = {"std::cout << text;", "out << std::endl;"};
  streams.harmless = {"own::cout << text;"};
  return {output, streams};
}

}  // namespace

std::vector<LineRule> bannedCalls() {
  std::vector<LineRule> all;
  for (const auto& group :
       {ofTheCLibrary(), ofProcesses(), ofDescriptors(), ofThreadsAndClocks(), ofOutput()}) {
    all.insert(all.end(), group.begin(), group.end());
  }
  return all;
}

}  // namespace spacekeep::tidy
