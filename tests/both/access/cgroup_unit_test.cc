#include "support/access/cgroup_unit.h"

#include <gtest/gtest.h>

namespace spacekeep::access {
namespace {

TEST(CgroupUnit, WhichUnitAGroupBelongsTo) {
  struct Case {
    const char* text;
    std::optional<std::string> unit;
  };
  const Case cases[] = {
      {"0::/system.slice/cache.service\n", "cache.service"},
      {"0::/system.slice/cache.service", "cache.service"},
      {"0::/system.slice/system-getty.slice/getty@tty1.service\n", "getty@tty1.service"},
      {"0::/top.service\n", "top.service"},
      {"0::/system.slice/_cpu.service\n", "cpu.service"},
      // Below its own group a service names groups as it likes.
      {"0::/system.slice/cache.service/other.service\n", "cache.service"},
      {"0::/user.slice/user-1000.slice/user@1000.service/app.slice/cache.service\n",
       "user@1000.service"},
      {"0::/user.slice/user-1000.slice/session-3.scope\n", std::nullopt},
      {"0::/user.slice/user-1000.slice/session-3.scope/cache.service\n", std::nullopt},
      {"0::/\n", std::nullopt},
      {"0::/init.scope\n", std::nullopt},
      {"0::/system.slice\n", std::nullopt},
      {"0::/system.slice/\n", std::nullopt},
      {"0::/../../system.slice/cache.service\n", std::nullopt},
      {"0::/system.slice/.service\n", std::nullopt},
      {"", std::nullopt},
      {"garbage", std::nullopt},
      // Only the hierarchy of the service manager counts.
      {"1:name=systemd:/system.slice/cache.service\n", std::nullopt},
      {"4:memory:/x.service\n0::/system.slice/cache.service\n", "cache.service"},
  };
  for (const Case& each : cases) {
    EXPECT_EQ(systemUnitFromCgroup(each.text), each.unit) << each.text;
  }
}

TEST(CgroupUnit, WhetherItIsTold) {
  for (const char* told : {"0::/\n", "0::/system.slice/cache.service\n", "0::/init.scope\n",
                           "4:memory:/x\n0::/system.slice\n", "0::/..name/cache.service\n"}) {
    EXPECT_TRUE(tellsUnit(told)) << told;
  }
  for (const char* untold : {"", "garbage", "1:name=systemd:/system.slice/cache.service\n",
                             "0::/..\n", "0::/../../system.slice/cache.service\n"}) {
    EXPECT_FALSE(tellsUnit(untold)) << untold;
  }
}

TEST(CgroupUnit, ANameLongerThanAUnitNameCanBeIsNone) {
  const std::string longest(247, 'a');
  EXPECT_EQ(systemUnitFromCgroup("0::/" + longest + ".service\n"), longest + ".service");
  EXPECT_EQ(systemUnitFromCgroup("0::/a" + longest + ".service\n"), std::nullopt);
}

}  // namespace
}  // namespace spacekeep::access
