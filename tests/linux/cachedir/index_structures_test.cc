// The tables of the index against plain ones.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <random>
#include <set>

#include "services/cachedir/index/file_table.h"
#include "services/cachedir/index/folder_tree.h"

namespace spacekeep::cachedir {
namespace {

using testing::ElementsAre;

TEST(NameStore, NamesOfAllSizesComeBackAsTheyWere) {
  NameStore names;
  std::vector<NameStore::Place> places(256);
  const auto name = [](std::size_t size) {
    return std::string(size, static_cast<char>('a' + size % 26));
  };
  for (std::size_t size = 1; size <= 255; ++size) places[size] = names.keep(name(size));
  for (std::size_t size = 1; size <= 255; ++size) {
    EXPECT_EQ(names.at(places[size], size), name(size));
  }
}

TEST(NameStore, ComingAndGoingDoesNotGrowIt) {
  NameStore names;
  std::vector<NameStore::Place> places;
  for (int i = 0; i < 10000; ++i) places.push_back(names.keep("name-of-20-characters"));
  const std::size_t bytes = names.bytes();
  for (int round = 0; round < 50; ++round) {
    for (NameStore::Place& place : places) {
      names.release(place, 21);
      place = names.keep("name-of-19-character");
      names.release(place, 20);
      place = names.keep("name-of-20-characters");
    }
  }
  EXPECT_EQ(names.bytes(), bytes);
}

/// An order beside a sorted list, with the same changes.
class OrderBesideList {
 public:
  explicit OrderBesideList(unsigned seed) : random_(seed) {}

  void addOne(std::int64_t used_ns) {
    const std::uint32_t id = records_.make();
    records_[id].name_bytes = 1;
    records_[id].used_ns = used_ns;
    records_[id].blocks = static_cast<std::uint32_t>(random_() % 3);
    order_.insert(id);
    list_.emplace(used_ns, id);
  }
  void removeOne() {
    auto place = list_.begin();
    std::advance(place, static_cast<std::ptrdiff_t>(random_() % list_.size()));
    order_.erase(place->second);
    records_.release(place->second);
    list_.erase(place);
  }
  void assignAgain() {
    std::vector<std::uint32_t> ids;
    for (const auto& [used_ns, id] : list_) ids.push_back(id);
    std::ranges::shuffle(ids, random_);
    order_.assign(ids);
  }
  void compareUpTo(std::int64_t latest_ns) const {
    Amount expected;
    for (const auto& [used_ns, id] : list_) {
      if (used_ns > latest_ns) break;
      expected.bytes += records_[id].bytes();
      expected.files += records_[id].blocks > 0 ? 1U : 0U;
    }
    ASSERT_EQ(order_.upTo(latest_ns), expected) << latest_ns;
  }
  void compareOrder() const {
    auto expected = list_.begin();
    order_.forEach([&](std::uint32_t id) {
      EXPECT_EQ(id, expected->second);
      ++expected;
      return true;
    });
    EXPECT_EQ(expected, list_.end());
  }
  [[nodiscard]] std::size_t size() const { return list_.size(); }
  [[nodiscard]] std::size_t bytes() const { return order_.bytes(); }

 private:
  std::mt19937 random_;
  FileRecords records_;
  AgeOrder order_{records_};
  std::set<std::pair<std::int64_t, std::uint32_t>> list_;
};

TEST(AgeOrder, SumsAndOrderAreThoseOfASortedList) {
  OrderBesideList both(7);
  std::mt19937 random(8);
  // A few instants only at first, so that many files share one.
  for (int step = 0; step < 30000; ++step) {
    const auto used_ns = static_cast<std::int64_t>(random() % (step < 15000 ? 40 : 1000000));
    const bool shrinking = step / 5000 % 3 == 1;
    if (both.size() > 0 && random() % 10 < (shrinking ? 8U : 3U)) {
      both.removeOne();
    } else {
      both.addOne(used_ns);
    }
    if (step % 7 == 0) both.compareUpTo(static_cast<std::int64_t>(random() % 1000010) - 5);
    if (step % 7 == 1) both.compareUpTo(static_cast<std::int64_t>(random() % 45) - 2);
    if (step == 20000) both.assignAgain();
    if (HasFatalFailure()) return;
  }
  EXPECT_GT(both.size(), 3000U);
  both.compareOrder();
}

TEST(AgeOrder, MemoryIsGivenBackWhenMostIsGone) {
  OrderBesideList both(9);
  for (int i = 0; i < 20000; ++i) both.addOne(i);
  const std::size_t full = both.bytes();
  while (both.size() > 200) both.removeOne();
  EXPECT_LT(both.bytes(), full / 10);
  both.compareOrder();
}

FileState stateOf(std::uint64_t inode, std::int64_t used_ns, std::uint64_t blocks = 8,
                  std::uint64_t links = 1) {
  return {.inode = inode, .used_ns = used_ns, .bytes = blocks * 512, .links = links};
}

TEST(FileTable, RandomChangesFindWhatAPlainMapFinds) {
  FileTable table;
  std::map<std::pair<std::uint32_t, std::string>, FileState> plain;
  std::mt19937 random(11);
  for (int step = 0; step < 40000; ++step) {
    const auto folder = static_cast<std::uint32_t>(random() % 5);
    const std::string name = "n" + std::to_string(random() % 700);
    if (random() % 3 == 0) {
      const std::uint32_t file = table.find(folder, name);
      ASSERT_EQ(file == kNoId, !plain.contains({folder, name}));
      if (file != kNoId) table.erase(file);
      plain.erase({folder, name});
    } else {
      const FileState state = stateOf(folder * 1000 + std::stoul(name.substr(1)),
                                      static_cast<std::int64_t>(random() % 1000), random() % 4,
                                      random() % 20 == 0 ? 2 : 1);
      const bool fresh = !plain.contains({folder, name});
      ASSERT_EQ(table.put(folder, name, state, 1) == FileTable::Put::kNew, fresh);
      plain[{folder, name}] = state;
    }
  }
  Amount expected;
  std::size_t linked = 0;
  for (const auto& [place, state] : plain) {
    const std::uint32_t file = table.find(place.first, place.second);
    ASSERT_NE(file, kNoId);
    EXPECT_EQ(table.at(file).used_ns, state.used_ns);
    EXPECT_EQ(table.nameOf(file), place.second);
    EXPECT_EQ(table.findInode(state.inode), state.links == 1 ? file : kNoId);
    if (state.links > 1) {
      ++linked;
    } else if (state.used_ns <= 500) {
      expected.bytes += state.bytes;
      expected.files += state.bytes > 0 ? 1U : 0U;
    }
  }
  EXPECT_EQ(table.size(), plain.size());
  EXPECT_EQ(table.linked().size(), linked);
  EXPECT_EQ(table.order().upTo(500), expected);
}

TEST(FileTable, AFileThatNoRecordCanHoldIsRefused) {
  FileTable table;
  constexpr std::uint64_t kTwoTib = 1ULL << 32;  // in units of 512 bytes
  EXPECT_EQ(table.put(0, "huge", stateOf(1, 1, kTwoTib), 1), FileTable::Put::kTooBig);
  EXPECT_EQ(table.find(0, "huge"), kNoId);
  EXPECT_EQ(table.put(0, "large", stateOf(2, 1, kTwoTib - 1), 1), FileTable::Put::kNew);
  EXPECT_EQ(table.order().upTo(1).bytes, (kTwoTib - 1) * 512);
}

TEST(FileTable, AFileCostsNoMoreThanStated) {
  FileTable table;
  constexpr std::uint32_t kFiles = 200000;
  table.beginFilling();
  for (std::uint32_t i = 0; i < kFiles; ++i) {
    const std::string name = "thumbnail-" + std::to_string(100000 + i) + ".bin";  // 20 bytes
    ASSERT_EQ(table.put(i / 1000, name, stateOf(i, i), 1), FileTable::Put::kNew);
  }
  table.endFilling();
  EXPECT_LE(table.bytes() / kFiles, 88U);
}

TEST(FolderTree, WhatIsBelowIsToldByPathNotByBeginning) {
  FolderTree tree;
  const std::uint32_t root = tree.add("");
  for (const char* path : {"a", "a-b", "a/x", "a/x/y", "ab", "b"}) tree.add(path);
  const auto paths = [&tree](const std::vector<std::uint32_t>& ids) {
    std::vector<std::string> found;
    for (const std::uint32_t id : ids) found.push_back(tree.at(id).path);
    return found;
  };
  EXPECT_THAT(paths(tree.withAllBelow(tree.find("a"))), ElementsAre("a", "a/x", "a/x/y"));
  EXPECT_THAT(paths(tree.directlyIn(root)), ElementsAre("a", "a-b", "ab", "b"));
  EXPECT_THAT(paths(tree.directlyIn(tree.find("a"))), ElementsAre("a/x"));
  EXPECT_THAT(paths(tree.from("a/x")), ElementsAre("a/x", "a/x/y", "ab", "b"));
  const std::uint32_t dropped = tree.find("a/x/y");
  tree.drop(dropped);
  EXPECT_EQ(tree.find("a/x/y"), FolderTree::kNone);
  EXPECT_NE(tree.add("a/x/y"), dropped) << "the number is not free yet";
  tree.release(dropped);
  EXPECT_EQ(tree.add("c"), dropped);
}

}  // namespace
}  // namespace spacekeep::cachedir
