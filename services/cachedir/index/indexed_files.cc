#include "services/cachedir/index/indexed_files.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::size_t kFilesBetweenQuestions = 1024;

}  // namespace

void FileShower::show(std::uint32_t file, const FileVisitor& visit) {
  const FileRecord& record = index_.files().at(file);
  if (folders_.size() <= record.folder) folders_.resize(index_.folders().end());
  std::shared_ptr<const Folder>& folder = folders_[record.folder];
  if (!folder) {
    folder =
        std::make_shared<const Folder>(Folder{number_, index_.folders().at(record.folder).path});
  }
  visit(FoundFile{.folder = folder,
                  .name = index_.files().nameOf(file),
                  .inode = {roots_[number_].inode.device, record.inode},
                  .used_ns = record.used_ns,
                  .bytes = record.bytes(),
                  .links = record.links});
}

bool FileShower::showInOrder(const FileVisitor& visit, const CancelToken& cancel) {
  std::size_t count = 0;
  bool cancelled = false;
  index_.files().order().forEach([&](std::uint32_t file) {
    cancelled = count++ % kFilesBetweenQuestions == 0 && cancel.cancelled();
    if (!cancelled) show(file, visit);
    return !cancelled;
  });
  return !cancelled;
}

void FileShower::showLinked(const FileVisitor& visit) {
  for (const std::uint32_t file : index_.files().linked()) show(file, visit);
}

std::vector<RootIndex*> IndexedFiles::refreshed(const std::optional<CacheIndex::Use>& use,
                                                const CancelToken& cancel) {
  if (!use) return std::vector<RootIndex*>(roots_.size(), nullptr);
  CacheIndex::Refreshed answer = (*use)->refresh(roots_, CacheIndex::Effort::kIfReady, cancel);
  for (std::string& problem : answer.problems) problems_.push_back(std::move(problem));
  return std::move(answer.indexed);
}

bool IndexedFiles::forEachFile(const FileVisitor& visit, const CancelToken& cancel, Tally& tally) {
  const auto use = index_.acquire(kIndexWaitNs);
  const std::vector<RootIndex*> indexed = refreshed(use, cancel);
  for (std::size_t i = 0; i < roots_.size(); ++i) {
    if (indexed[i] == nullptr) {
      if (!walk_.walkRoot(i, visit, cancel, tally)) return false;
      continue;
    }
    FileShower shower(*indexed[i], roots_, i);
    if (!shower.showInOrder(visit, cancel)) return false;
    shower.showLinked(visit);
  }
  return !cancel.cancelled();
}

}  // namespace spacekeep::cachedir
