// Service descriptor files.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kSystem = "/System/Library/Spacekeep/";
constexpr const char* kInternal = "/QuorvelInternal/Library/Spacekeep/";

void addDescriptor(DaemonWorld& world, const std::string& path, const Dictionary& content) {
  world.world.files().addPlist(path, content);
}

TEST(Descriptors, PeriodicAloneGivesAPeriodicServiceThatDoesNotPurge) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist",
                  {{"SPACEKEEP_ID", "a"}, {"SPACEKEEP_SERVICES", Array{"PERIODIC"}}});
    world.start();
    const auto service = world.services().at("a");
    EXPECT_TRUE(service->doesPeriodic());
    EXPECT_FALSE(service->doesPurge());
  });
}

TEST(Descriptors, WithoutRolesAServicePurgesAndIsNotPeriodic) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist", {{"SPACEKEEP_ID", "a"}});
    world.start();
    const auto service = world.services().at("a");
    EXPECT_EQ(service->ID, "a");
    EXPECT_TRUE(service->doesPurge());
    EXPECT_FALSE(service->doesPeriodic());
    EXPECT_FALSE(service->doNotQuery());
    EXPECT_EQ(service->desiredNotifications(), std::nullopt);
    EXPECT_EQ(service->connection, nullptr);
    EXPECT_EQ(service->endpoint(), nullptr);
  });
}

TEST(Descriptors, AnEmptyListOfRolesGivesNeither) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist",
                  {{"SPACEKEEP_ID", "a"}, {"SPACEKEEP_SERVICES", Array{}}});
    world.start();
    EXPECT_FALSE(world.services().at("a")->doesPurge());
    EXPECT_FALSE(world.services().at("a")->doesPeriodic());
  });
}

TEST(Descriptors, BothRolesCanBeHeldAndUnknownOnesAreIgnored) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(
        world, std::string(kSystem) + "a.plist",
        {{"SPACEKEEP_ID", "a"}, {"SPACEKEEP_SERVICES", Array{"PURGE", "DANCE", "PERIODIC"}}});
    world.start();
    EXPECT_TRUE(world.services().at("a")->doesPurge());
    EXPECT_TRUE(world.services().at("a")->doesPeriodic());
  });
}

TEST(Descriptors, DoNotQueryMarksTheServiceEvenWhenItIsFalse) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist",
                  {{"SPACEKEEP_ID", "a"}, {"SPACEKEEP_DO_NOT_QUERY", false}});
    world.start();
    EXPECT_TRUE(world.services().at("a")->doNotQuery());
    EXPECT_TRUE(world.world.trace().hasLine("init marking a as DO_NOT_QUERY"));
  });
}

TEST(Descriptors, NotificationsAreKeptAsASet) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist",
                  {{"SPACEKEEP_ID", "a"}, {"SPACEKEEP_NOTIFICATIONS", Array{"two", "one", "two"}}});
    world.start();
    const auto service = world.services().at("a");
    EXPECT_EQ(service->desiredNotifications(), Value(Array{"one", "two"}));
    EXPECT_TRUE(service->desires("two"));
    EXPECT_FALSE(service->desires("three"));
    EXPECT_TRUE(world.world.trace().hasLine("init a desiredNotifications: [\"one\", \"two\"]"));
  });
}

TEST(Descriptors, WhatIsNoDictionaryIsLoggedAndSkippedAndSubdirectoriesAreRead) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.files().addText(std::string(kSystem) + "readme.txt", "no property list");
    world.world.files().addPlist(std::string(kSystem) + "array.plist", Array{"SPACEKEEP_ID"});
    world.world.files().addUnreadable(std::string(kSystem) + "locked", "permission denied");
    addDescriptor(world, std::string(kSystem) + "below/b.anything", {{"SPACEKEEP_ID", "b"}});
    world.start();
    EXPECT_EQ(world.services().size(), 1U);
    EXPECT_TRUE(world.services().contains("b"));
    // The text, the array, the unreadable file and the directory: each with its reason, and none
    // for the array alone, which is a document.
    EXPECT_EQ(
        world.world.trace().linesOfLevel(kLogProblem),
        (std::vector<std::string>{
            "scanPlistsAtPath property list parse failed: not a property list: it is not well "
            "formed",
            "scanPlistsAtPath property list parse failed: (none)",
            "scanPlistsAtPath property list parse failed: permission denied",
            "scanPlistsAtPath property list parse failed: not a regular file"}));
  });
}

TEST(Descriptors, TheDoubledSlashesOfThePathsAreKept) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist", {{"SPACEKEEP_ID", "a"}});
    addDescriptor(world, std::string(kInternal) + "b.plist", {{"SPACEKEEP_ID", "b"}});
    world.start();
    EXPECT_EQ(world.world.trace().linesWithFormat("%s looking at: %@"),
              (std::vector<std::string>{
                  "scanPlistsAtPath looking at: //System/Library/Spacekeep//a.plist",
                  "scanPlistsAtPath looking at: /QuorvelInternal/Library/Spacekeep//b.plist"}));
  });
}

TEST(Descriptors, WithoutAnIdADocumentIsDroppedWithoutAMessage) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "a.plist",
                  {{"SPACEKEEP_SERVICES", Array{"PURGE"}}});
    world.start();
    EXPECT_TRUE(world.services().empty());
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(Descriptors, AnIdThatIsNoStringIsLoggedAndTheFileSkipped) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "number.plist", {{"SPACEKEEP_ID", 5}});
    addDescriptor(world, std::string(kSystem) + "list.plist", {{"SPACEKEEP_ID", Array{"a"}}});
    addDescriptor(world, std::string(kSystem) + "b.plist", {{"SPACEKEEP_ID", "b"}});
    world.start();
    EXPECT_EQ(world.daemons(), std::set<std::string>{"b"});
    EXPECT_EQ(world.services().size(), 1U);
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem),
              (std::vector<std::string>{
                  "scanPlistsAtPath the ID in //System/Library/Spacekeep//number.plist is no "
                  "string: 5",
                  "scanPlistsAtPath the ID in //System/Library/Spacekeep//list.plist is no string: "
                  "[\"a\"]"}));
  });
}

TEST(Descriptors, OfTwoFilesWithOneIdInADirectoryTheLaterOneWins) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kSystem) + "z.plist", {{"SPACEKEEP_ID", "twin"}});
    addDescriptor(world, std::string(kSystem) + "a.plist",
                  {{"SPACEKEEP_ID", "twin"}, {"SPACEKEEP_SERVICES", Array{"PERIODIC"}}});
    world.start();
    EXPECT_EQ(world.services().size(), 1U);
    EXPECT_TRUE(world.services().at("twin")->doesPeriodic());
    EXPECT_EQ(world.daemons(), std::set<std::string>{"twin"});
  });
}

TEST(Descriptors, TheSecondDirectoryWinsOverTheFirst) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    addDescriptor(world, std::string(kInternal) + "a.plist",
                  {{"SPACEKEEP_ID", "twin"}, {"SPACEKEEP_SERVICES", Array{"PERIODIC"}}});
    addDescriptor(world, std::string(kSystem) + "z.plist", {{"SPACEKEEP_ID", "twin"}});
    world.start();
    EXPECT_EQ(world.services().size(), 1U);
    EXPECT_TRUE(world.services().at("twin")->doesPeriodic());
    EXPECT_FALSE(world.services().at("twin")->doesPurge());
    EXPECT_EQ(world.daemons(), std::set<std::string>{"twin"});
  });
}

TEST(Descriptors, BothEncodingsAreRead) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.files().addText(std::string(kSystem) + "xml.plist",
                                "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                                "<plist version=\"1.0\"><dict><key>SPACEKEEP_ID</key>"
                                "<string>xml</string></dict></plist>\n");
    addDescriptor(world, std::string(kSystem) + "binary.plist", {{"SPACEKEEP_ID", "binary"}});
    world.start();
    EXPECT_EQ(world.daemons(), (std::set<std::string>{"binary", "xml"}));
  });
}

}  // namespace
}  // namespace spacekeep::test
