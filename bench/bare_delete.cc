// The floor: deletes every file below the directories with nothing but readdir and unlinkat, and
// returns once statvfs shows the space. Usage: bench-bare-delete DIRECTORY...
#include <dirent.h>
#include <fcntl.h>
#include <unistd.h>

#include <cstring>

namespace {

void deleteBelow(int parent, const char* name) {
  const int fd = openat(parent, name, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  DIR* directory = fd < 0 ? nullptr : fdopendir(fd);
  if (directory == nullptr) return;
  while (const dirent* entry = readdir(directory)) {
    if (std::strcmp(entry->d_name, ".") == 0 || std::strcmp(entry->d_name, "..") == 0) continue;
    if (entry->d_type == DT_DIR) {
      deleteBelow(fd, entry->d_name);
    } else {
      unlinkat(fd, entry->d_name, 0);
    }
  }
  closedir(directory);
}

}  // namespace

int main(int count, char** arguments) {
  for (int i = 1; i < count; ++i) deleteBelow(AT_FDCWD, arguments[i]);
  return count > 1 ? 0 : 2;
}
