// Whatever happens to a directory, the index answers what a walk would answer.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <functional>
#include <random>

#include "services/cachedir/engine/unique_fd.h"
#include "tests/linux/cachedir/cache_world.h"
#include "tests/linux/cachedir/index_world.h"

namespace spacekeep::cachedir {
namespace {

/// Random changes to a directory, by the calls that programs use. Calls that fail, because what
/// they want is not there, are part of it.
class Changes {
 public:
  /// `look` brings the index up to date.
  Changes(std::string root, std::string outside, unsigned seed, std::function<void()> look)
      : root_(std::move(root)),
        outside_(std::move(outside)),
        random_(seed),
        look_(std::move(look)) {}

  void one() {
    switch (below(17)) {
      case 0:
      case 1:
      case 2:
        return write(file(), below(5) * 4096, O_TRUNC);
      case 3:
        return write(file(), 4096, O_APPEND);
      case 4:
      case 5:
        return remove(file());
      case 6:
        return make(folder());
      case 7:
        return remove(folder(), AT_REMOVEDIR);
      case 8:
        return rename(file(), file());
      case 9:
        return below(3) == 0 ? exchange(folder(), folder()) : rename(folder(), folder());
      case 10:
        return removeAll(folder());
      case 11:
        return age(file());
      case 12:
        return below(4) == 0 ? linkOutside(file()) : link(file(), file());
      case 13:
        return remove(outside_ + "/" + name());
      case 14:
        return below(2) == 0 ? moveOut() : rename(outside_ + "/" + name(), folder());
      case 15:
        return map(file());
      default:
        return below(2) == 0 ? makeWithoutName(file())
                             : static_cast<void>(!::symlink("/", file().c_str()));
    }
  }

  std::uint64_t done() const { return done_; }

 private:
  std::size_t below(std::size_t end) { return random_() % end; }
  std::string name() { return std::string(1, static_cast<char>('a' + below(6))); }
  std::string folder() {
    std::string path = root_;
    for (std::size_t depth = 1 + below(3); depth > 0; --depth) path += "/d" + name();
    return path;
  }
  std::string file() { return (below(4) == 0 ? root_ : folder()) + "/f" + name(); }
  void count(bool good) { done_ += good ? 1 : 0; }

  void make(const std::string& path) { count(::mkdir(path.c_str(), 0755) == 0); }
  void remove(const std::string& path, int flags = 0) {
    count(::unlinkat(AT_FDCWD, path.c_str(), flags) == 0);
  }
  void rename(const std::string& from, const std::string& to) {
    count(::rename(from.c_str(), to.c_str()) == 0);
  }
  void link(const std::string& from, const std::string& to) {
    count(::link(from.c_str(), to.c_str()) == 0);
  }
  /// Of the link itself no event tells, so the file is touched as well.
  void linkOutside(const std::string& from) {
    link(from, outside_ + "/" + name());
    age(from);
  }
  /// The directory may hold a link, made just now, to a file that stays: had nobody looked before
  /// it moves, this would be a link made outside.
  void moveOut() {
    look_();
    rename(folder(), outside_ + "/" + name());
  }
  void exchange(const std::string& one, const std::string& other) {
    count(::renameat2(AT_FDCWD, one.c_str(), AT_FDCWD, other.c_str(), RENAME_EXCHANGE) == 0);
  }
  void removeAll(const std::string& path) {
    std::error_code ignored;
    count(below(4) == 0 && std::filesystem::remove_all(path, ignored) > 0);
  }
  void write(const std::string& path, std::size_t bytes, int how) {
    const UniqueFd fd(::open(path.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | how, 0644));
    const std::string content(bytes, 'x');
    count(fd && ::write(fd.get(), content.data(), bytes) == static_cast<ssize_t>(bytes));
    if (below(2) == 0) age(path);
  }
  /// Both times, or one of them alone.
  void age(const std::string& path) {
    const std::int64_t then =
        rt::wallClockNs() / kNsPerSecond - static_cast<std::int64_t>(below(40) * 86400 + 3600);
    timespec times[2] = {{then, 0}, {then, 0}};
    const std::size_t which = below(4);
    if (which < 2) times[which].tv_nsec = UTIME_OMIT;
    count(::utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW) == 0);
  }
  /// Writes through a mapping, after the descriptor is closed.
  void map(const std::string& path) {
    UniqueFd fd(::open(path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW, 0644));
    if (!fd || ::ftruncate(fd.get(), 4 * 4096) != 0) return count(false);
    void* place = ::mmap(nullptr, 4 * 4096, PROT_READ | PROT_WRITE, MAP_SHARED, fd.get(), 0);
    fd.reset();
    if (place == MAP_FAILED) return count(false);
    static_cast<char*>(place)[below(4) * 4096] = 'y';
    count(::munmap(place, 4 * 4096) == 0);
  }
  void makeWithoutName(const std::string& path) {
    const UniqueFd fd(::open(root_.c_str(), O_TMPFILE | O_WRONLY, 0644));
    const std::string content(4096, 'z');
    if (!fd || ::write(fd.get(), content.data(), content.size()) != 4096) return count(false);
    const std::string self = "/proc/self/fd/" + std::to_string(fd.get());
    const bool linked =
        ::linkat(AT_FDCWD, self.c_str(), AT_FDCWD, path.c_str(), AT_SYMLINK_FOLLOW) == 0;
    count(linked && ::write(fd.get(), content.data(), content.size()) == 4096);
  }

  const std::string root_;
  const std::string outside_;
  std::mt19937 random_;
  const std::function<void()> look_;
  std::uint64_t done_ = 0;
};

struct Case {
  const char* kind;
  unsigned seed;
};

class IndexProperty : public testing::TestWithParam<Case> {};
INSTANTIATE_TEST_SUITE_P(On, IndexProperty,
                         testing::Values(Case{"tmpfs", 1}, Case{"tmpfs", 2}, Case{"tmpfs", 3},
                                         Case{"ext4", 4}, Case{"xfs", 5}, Case{"btrfs", 6}),
                         [](const auto& about) {
                           return std::string(about.param.kind) + std::to_string(about.param.seed);
                         });

TEST_P(IndexProperty, AfterAnyChangesTheIndexAnswersWhatAWalkAnswers) {
  const Volume volume(GetParam().kind);
  const std::string cache = volume / "cache";
  std::filesystem::create_directories(cache);
  std::filesystem::create_directories(volume / "outside");
  Rules rules = rulesFor(cache);
  rules.directories[0].keep = {"fe"};
  IndexWorld world(rules);
  world.compared();
  Changes changes(cache, volume / "outside", GetParam().seed, [&] { world.known(); });
  std::mt19937 batches(GetParam().seed);
  // On a file system that settles late, each answer looks at all that changed in a minute.
  const auto enough = [&changes](int batch) {
    return batch >= 1000 || (batch >= 200 && changes.done() > 1000);
  };
  for (int batch = 0; !enough(batch) && !HasFailure(); ++batch) {
    const auto size = 1 + batches() % 40;
    for (std::size_t i = 0; i < size; ++i) changes.one();
    if (std::string(GetParam().kind) != "tmpfs") volume.settle();
    world.known();
  }
  EXPECT_GT(changes.done(), 1000U) << "most calls failed: this tested little";
  EXPECT_EQ(world.index().history().losses, 0U);
}

}  // namespace
}  // namespace spacekeep::cachedir
