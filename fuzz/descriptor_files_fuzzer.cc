// Service descriptor files: the daemon of a real platform walks a directory whose files hold anything,
// and declares what it finds.
#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "daemon/descriptors.h"
#include "daemon/spacekeep.h"
#include "fuzz/helpers/fuzzed_files.h"
#include "fuzz/helpers/piece_reader.h"
#include "fuzz/helpers/promises.h"
#include "registry/service_protocol.h"
#include "support/ipc/linux/connector.h"
#include "support/linux/linux_platform.h"

namespace spacekeep {
namespace {

using fuzz::require;

const std::vector<std::string> kWords{
    "SPACEKEEP_ID", "SPACEKEEP_SERVICES", "SPACEKEEP_DO_NOT_QUERY", "SPACEKEEP_NOTIFICATIONS",
    "PURGE",        "PERIODIC",           "com.example.one",        ""};
const std::array<std::string, 4> kNames{"a.plist", "b", "below/c.plist", "below/deeper/d"};

/// One for all inputs: it is only asked to look again. Its files are in a directory of its own.
class World {
 public:
  static World& instance() {
    static auto* world = new World;  // threads run in it until the process ends
    return *world;
  }
  [[nodiscard]] fuzz::FuzzedDirectory& directory() { return directory_; }

  [[nodiscard]] DescribedServices scan(std::size_t& documents) {
    DescribedServices found;
    daemon_->scanPlistsAtPath(directory_.path() + "/", [&](const Dictionary& descriptor) {
      ++documents;
      collectService(descriptor, found);
    });
    return found;
  }

 private:
  [[nodiscard]] LinuxPaths paths() const {
    const std::string& here = own_.path();
    return {.socket = here + "/socket",
            .services_directory = here + "/services",
            .metrics_file = here + "/metrics",
            .state_directory = here + "/state",
            .vendor_directory = here,
            .administrator_directory = here};
  }

  test::TemporaryDirectory own_;
  fuzz::FuzzedDirectory directory_;
  LinuxPlatform platform_{spacekeepServiceInterface(), paths()};
  std::shared_ptr<Spacekeep> daemon_ = Spacekeep::create(platform_.platform(), own_.path());
};

void requireSound(const DescribedServices& found, std::size_t documents, std::size_t files) {
  require(documents <= files, "a file declares at most one service");
  require(found.service_ids.size() <= documents, "a document declares at most one service");
  const std::set<std::string> ids(found.service_ids.begin(), found.service_ids.end());
  require(ids.size() == found.services.size(), "each ID that was found has its service");
  for (const auto& [service_id, service] : found.services) {
    require(ids.contains(service_id) && service->ID == service_id, "a service is under its own ID");
    require(service->connection == nullptr && service->endpoint() == nullptr,
            "a declared service is not connected");
    const std::string name = ipc::declaredSocketName(service_id);
    require(name.find('/') == std::string::npos && !name.starts_with('.'),
            "an ID leads nowhere but into the directory of the services");
    const auto names = service->desiredNotifications();
    require(!names || names->array() != nullptr, "what a service wants to be told is a list");
  }
}

void examine(fuzz::PieceReader input) {
  World& world = World::instance();
  std::size_t files = 0;
  for (; files < 8 && !input.usedUp(); ++files) {
    const std::uint8_t place = input.byte();
    const std::string& name = kNames.at(place % kNames.size());
    if (place >= 0xf0) {
      world.directory().link("link" + std::to_string(files), place % 2 == 0 ? "a.plist" : ".");
    } else {
      world.directory().write(name, fuzz::fileContent(input, kWords));
    }
  }
  std::size_t documents = 0;
  const DescribedServices found = world.scan(documents);
  std::size_t again = 0;
  require(world.scan(again).service_ids == found.service_ids && again == documents,
          "a second look finds the same");
  world.directory().clear();
  requireSound(found, documents, files);
}

}  // namespace
}  // namespace spacekeep

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string input = spacekeep::fuzz::textOfInput(data, size);
  spacekeep::examine(spacekeep::fuzz::PieceReader(input));
  return 0;
}
