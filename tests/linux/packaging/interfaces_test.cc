// What is installed about the interfaces is what the daemon declares.
#include <gtest/gtest.h>

#include "client/client_protocol.h"
#include "client/history_protocol.h"
#include "registry/service_protocol.h"
#include "tests/linux/packaging/packaging_world.h"

namespace spacekeep::packaging {
namespace {

TEST(Interfaces, TheInstalledDocumentsAreWhatTheDaemonDeclares) {
  std::set<fs::path> expected;
  for (const auto* interface :
       {&spacekeepClientInterface(), &spacekeepHistoryInterface(), &spacekeepServiceInterface()}) {
    const fs::path file = kSource / "packaging/dbus" / (std::string(interface->name) + ".xml");
    EXPECT_EQ(contentOf(file), ipc::introspectionXml(*interface)) << file;
    expected.insert(file);
  }
  const auto found = filesBelow(kSource / "packaging/dbus", ".xml");
  EXPECT_EQ(std::set<fs::path>(found.begin(), found.end()), expected);
}

/// Services are called by the daemon, and never over the bus.
TEST(Interfaces, TheBusLetsEveryInterfaceOfTheDaemonThroughAndNoOtherOfThisSystem) {
  const std::string policy = contentOf(kSource / "packaging/dbus/com.quorvel.Spacekeep.conf");
  for (const fs::path& document : filesBelow(kSource / "packaging/dbus", ".xml")) {
    const std::string interface = document.stem().string();
    const bool is_served = interface != std::string(spacekeepServiceInterface().name);
    EXPECT_EQ(policy.find("send_interface=\"" + interface + "\"") != std::string::npos, is_served)
        << interface;
  }
}

TEST(Interfaces, TheManualTellsOfEveryMethod) {
  const std::string page = contentOf(kSource / "packaging/man/spacekeep-protocol.7");
  for (const auto* interface :
       {&spacekeepClientInterface(), &spacekeepHistoryInterface(), &spacekeepServiceInterface()}) {
    for (const auto& method : interface->methods) {
      const std::string entry = ".It Fn " + std::string(method.name);
      EXPECT_NE(page.find(entry), std::string::npos) << entry;
      for (const auto& argument : method.in) {
        const std::string shown =
            "\"" + std::string(ipc::signatureOf(argument.kind)) + " " + std::string(argument.name);
        EXPECT_NE(page.find(shown, page.find(entry)), std::string::npos) << entry << shown;
      }
    }
  }
}

}  // namespace
}  // namespace spacekeep::packaging
