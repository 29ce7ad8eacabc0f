#include "tests/linux/system/sandbox.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <utility>

#include "support/runtime/runtime.h"

namespace spacekeep::system_test {
namespace {

namespace fs = std::filesystem;

void shell(const std::string& command) {
  if (std::system(command.c_str()) != 0) throw std::runtime_error("failed: " + command);
}

/// Mounts made by this process are its own from here on, and go with it.
void leaveTheMachinesMounts() {
  static const bool done = [] {
    if (unshare(CLONE_NEWNS) != 0 ||
        mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
      throw std::runtime_error("these tests need root: they mount file systems of their own");
    }
    return true;
  }();
  static_cast<void>(done);
}

std::string slurp(const std::string& path) {
  std::ifstream stream(path);
  std::ostringstream text;
  text << stream.rdbuf();
  return text.str();
}

bool waitUntil(const std::function<bool()>& condition) {
  for (int i = 0; i < 6000; ++i) {
    if (condition()) return true;
    rt::sleepNs(10'000'000);
  }
  return false;
}

pid_t launch(const std::vector<std::string>& command, const std::string& output_path) {
  std::vector<char*> arguments;
  arguments.reserve(command.size() + 1);
  for (const std::string& word : command) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  const pid_t pid = fork();
  if (pid != 0) return pid;
  const int out = open(output_path.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
  dup2(out, 1);
  dup2(out, 2);
  const int null = open("/dev/null", O_RDONLY);
  dup2(null, 0);
  execvp(arguments[0], arguments.data());
  _exit(127);
}

int statusOf(int raw) { return WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw); }

}  // namespace

Process::Process(Process&& other) noexcept : pid_(std::exchange(other.pid_, -1)) {}

Process& Process::operator=(Process&& other) noexcept {
  std::swap(pid_, other.pid_);
  return *this;
}

Process::~Process() {
  if (pid_ <= 0) return;
  kill(pid_, SIGKILL);
  waitpid(pid_, nullptr, 0);
}

void Process::signal(int number) const { kill(pid_, number); }

int Process::wait() {
  int raw = 0;
  waitpid(pid_, &raw, 0);
  pid_ = -1;
  return statusOf(raw);
}

bool Process::running() {
  if (pid_ <= 0) return false;
  int raw = 0;
  if (waitpid(pid_, &raw, WNOHANG) == 0) return true;
  pid_ = -1;
  return false;
}

Sandbox::Sandbox() {
  leaveTheMachinesMounts();
  char name[] = "/tmp/spacekeep-test-XXXXXX";
  if (mkdtemp(name) == nullptr) throw std::runtime_error("no temporary directory");
  directory_ = name;
  fs::create_directories(directory_ + "/volumes");
}

Sandbox::~Sandbox() {
  holder_ = Process();
  for (const auto& entry : fs::directory_iterator(directory_ + "/volumes")) {
    umount2(entry.path().c_str(), MNT_DETACH);
  }
  std::error_code ignored;
  fs::remove_all(directory_, ignored);
}

void Sandbox::addVolume(const std::string& name, const std::string& type, unsigned size_mib) {
  const std::string point = volume(name);
  fs::create_directories(point);
  if (type == "tmpfs") {
    shell("mount -t tmpfs -o size=" + std::to_string(size_mib) + "M tmpfs " + point);
    return;
  }
  const std::string image = directory_ + "/" + name + ".img";
  shell("truncate -s " + std::to_string(size_mib) + "M " + image);
  shell("mkfs." + type + (type == "ext4" ? " -q -m 0 " : " -q ") + image + " >/dev/null");
  shell("mount -o loop " + image + " " + point);
}

void Sandbox::start() {
  const std::string log = directory_ + "/holder.log";
  holder_ = Process(launch(
      {std::string(SPACEKEEP_SOURCE_DIR) + "/tests/sandbox/enter", directory_, SPACEKEEP_BUILD_DIR,
       "--", "/bin/sh", "-c", "echo ready >/tmp/ready; exec sleep 3600"},
      log));
  if (!waitUntil([this] { return fs::exists(outside("/tmp/ready")) || !holder_.running(); }) ||
      !holder_.running()) {
    throw std::runtime_error("the sandbox did not start: " + slurp(log));
  }
}

std::string Sandbox::outside(const std::string& inside) const {
  return "/proc/" + std::to_string(holder_.pid()) + "/root" + inside;
}

std::string Sandbox::volume(const std::string& name) const {
  return directory_ + "/volumes/" + name;
}

void Sandbox::write(const std::string& inside, const std::string& content) const {
  fs::create_directories(fs::path(outside(inside)).parent_path());
  std::ofstream(outside(inside)) << content;
}

std::string Sandbox::read(const std::string& inside) const { return slurp(outside(inside)); }

Process Sandbox::spawn(const std::vector<std::string>& command, const std::string& log, uid_t uid,
                       gid_t gid) const {
  const std::string target = std::to_string(holder_.pid());
  std::vector<std::string> whole = {"nsenter", "--mount", "--root", "--wdns=/", "--target", target};
  if (uid != 0 || gid != 0) {
    whole.insert(whole.end(), {"setpriv", "--reuid=" + std::to_string(uid),
                               "--regid=" + std::to_string(gid), "--clear-groups"});
  }
  whole.insert(whole.end(), command.begin(), command.end());
  return Process(launch(whole, outside("/tmp/" + log)));
}

Output Sandbox::run(const std::vector<std::string>& command) const {
  static int count = 0;
  const std::string log = "run-" + std::to_string(++count) + ".log";
  Process process = spawn(command, log);
  const int status = process.wait();
  return {status, read("/tmp/" + log)};
}

Process Sandbox::startDaemon() const {
  write("/etc/spacekeep/log.plist",
        "<plist version=\"1.0\"><dict><key>LogLevel</key><integer>5</integer></dict></plist>");
  // What an earlier daemon wrote must not speak for this one.
  fs::remove(outside("/tmp/daemon.log"));
  Process daemon = spawn({"/programs/daemon/spacekeepd"}, "daemon.log");
  if (!waitForText("/tmp/daemon.log", "open for business")) {
    throw std::runtime_error("the daemon did not start: " + daemonLog());
  }
  return daemon;
}

bool Sandbox::waitForText(const std::string& inside, const std::string& text) const {
  return waitUntil([&] { return read(inside).find(text) != std::string::npos; });
}

}  // namespace spacekeep::system_test
