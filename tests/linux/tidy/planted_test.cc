// The rules about whole files and functions, on files that break them, and on files that do not.
#include <gtest/gtest.h>

#include <string>

#include "tests/linux/tidy/code_text.h"
#include "tests/linux/tidy/structure.h"

namespace spacekeep::tidy {
namespace {

Files file(const std::string& path, const std::string& content) { return {parsed(path, content)}; }

std::string function(const std::string& head, std::size_t lines) {
  std::string body;
  for (std::size_t i = 2; i < lines; ++i) body += "    if (a) { step(); }\n";
  return head + " {\n" + body + "}\n";
}

TEST(TidyCodeText, CommentsAndTheInsidesOfLiteralsAreTakenAway) {
  EXPECT_EQ(codeTextOf("a(\"x // y\"); // z\nb();").code, "a(\"\"); \nb();");
  EXPECT_EQ(codeTextOf("a /* b\nc */ d").code, "a \n d");
  EXPECT_EQ(codeTextOf("c = '\"'; e();").code, "c = ''; e();");
  EXPECT_EQ(codeTextOf("n = 1'000'000; e();").code, "n = 1'000'000; e();");
  EXPECT_EQ(codeTextOf("t = R\"(a\n\"b)\" + c;").code, "t = \"\"\n + c;");
  EXPECT_EQ(codeTextOf("t = \"a\\\"b\" + c;").code, "t = \"\" + c;");
}

TEST(TidyCodeText, ALoneQuoteEndsWithItsLine) {
  EXPECT_EQ(codeTextOf("#error it's\nb();").code, "#error it''\nb();");
}

TEST(TidyCodeText, LinesWithCommentsAreKnown) {
  EXPECT_EQ(codeTextOf("a;\nb;  // c\n/* d\ne */").commented_lines,
            (std::set<std::size_t>{1, 2, 3}));
}

TEST(TidyPlanted, HeadersThatSayNothingOfThreadsAreFound) {
  EXPECT_NE(headersWithoutThreadSafety(file("a.h", "#pragma once\n")), "");
  EXPECT_NE(headersWithoutThreadSafety(file("a.h", "// Thread safety: ")), "");
  EXPECT_NE(headersWithoutThreadSafety(file("a.h", "")), "");
  EXPECT_EQ(headersWithoutThreadSafety(file("a.h", "// Thread safety: none.\n")), "");
  EXPECT_EQ(headersWithoutThreadSafety(file("a.cc", "int a;\n")), "");
}

TEST(TidyPlanted, HeadersWithoutGuardAreFound) {
  EXPECT_NE(headersWithoutGuard(file("a.h", "// #pragma once\nint a;")), "");
  EXPECT_EQ(headersWithoutGuard(file("a.h", "#pragma once\nint a;")), "");
}

TEST(TidyPlanted, HeadersThatNothingIncludesAreFound) {
  const Files header = file("support/a/b.h", "int b;");
  EXPECT_NE(headersThatNothingIncludes(header, file("x.cc", "#include \"support/c/b.h\"")), "");
  EXPECT_EQ(headersThatNothingIncludes(header, file("x.cc", "#include \"support/a/b.h\"")), "");
  EXPECT_EQ(headersThatNothingIncludes(file("sdk/include/spacekeep/c.h", ""),
                                       file("x.cc", "#include <spacekeep/c.h>")),
            "");
}

TEST(TidyPlanted, SourcesThatNothingBuildsAreFound) {
  EXPECT_NE(sourcesThatNothingBuilds(file("a/b.cc", ""), {"a/c.cc"}), "");
  EXPECT_EQ(sourcesThatNothingBuilds(file("a/b.cc", ""), {"a/b.cc"}), "");
  EXPECT_EQ(sourcesThatNothingBuilds(file("a/b.h", ""), {}), "");
}

TEST(TidyPlanted, IncludesBeyondTheDaemonsRoomsAreFound) {
  const std::set<std::string> headers = {"support/a.h", "support/linux/a.h"};
  const auto found = [&](const std::string& line) {
    return foreignIncludes(file("purge/a.cc", line), headers);
  };
  EXPECT_NE(found("#include <thread>"), "");
  EXPECT_NE(found("#include <systemd/sd-bus.h>"), "");
  EXPECT_NE(found("#include \"support/b.h\""), "");
  EXPECT_NE(found("#include \"support/linux/a.h\""), "");
  EXPECT_EQ(found("#include \"support/a.h\""), "");
  EXPECT_EQ(found("#include <vector>"), "");
  EXPECT_EQ(foreignIncludes(file("daemon/main.cc", "#include \"support/linux/a.h\""), headers), "");
}

TEST(TidyPlanted, FilesAndFunctionsThatAreTooLongAreFound) {
  EXPECT_NE(filesLongerThan(2, file("a.cc", "1\n2\n3\n")), "");
  EXPECT_EQ(filesLongerThan(3, file("a.cc", "1\n2\n3\n")), "");
  for (const std::string head : {"int f(int a)", "void A::f() const", "TEST(A, B)",
                                 "A::A()\n    : b_(3)", "auto f() -> B"}) {
    const std::string inside = "namespace n {\n" + function(head, 61) + "}\n";
    EXPECT_NE(functionsLongerThan(60, file("a.cc", inside)), "") << head;
    EXPECT_EQ(functionsLongerThan(61, file("a.cc", inside)), "") << head;
  }
  EXPECT_NE(functionsLongerThan(60, file("a.h", "class A {\n" + function("int f()", 61) + "};")),
            "");
  EXPECT_EQ(functionsLongerThan(60, file("a.h", function("class A", 100))), "");
  EXPECT_EQ(functionsLongerThan(60, file("a.cc", function("namespace n", 100))), "");
}

TEST(TidyPlanted, NumbersWithoutUnitsAreFound) {
  for (const std::string line :
       {"int timeout = 3;", "std::uint64_t first_wait_ = 3;", "constexpr double kLongPause = 3;",
        "f(std::size_t most_capacity)", "std::uint32_t elapsed() const;"}) {
    EXPECT_NE(namesWithoutUnit(file("a.h", line)), "") << line;
  }
  for (const std::string line :
       {"int timeout_seconds = 3;", "std::uint64_t waits_ = 3;", "double message = 3;",
        "Timeout timeout;", "// int timeout", "std::uint32_t elapsedNs() const;"}) {
    EXPECT_EQ(namesWithoutUnit(file("a.h", line)), "") << line;
  }
}

TEST(TidyPlanted, DescriptorsThatChildrenInheritAreFound) {
  for (const std::string line :
       {"fd = ::open(path, O_RDONLY);", "fd = ::open(path,\n  O_WRONLY | O_CREAT,\n 0600);",
        "socket(AF_UNIX, SOCK_STREAM, 0);", "eventfd(0, EFD_NONBLOCK);"}) {
    EXPECT_NE(inheritedDescriptors(file("a.cc", line)), "") << line;
  }
  for (const std::string line :
       {"fd = ::open(path, O_RDONLY | O_CLOEXEC);", "eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);",
        "fd = ::open(path,\n  O_WRONLY |\n  O_CLOEXEC);", "socket(AF_UNIX, SOCK_CLOEXEC, 0);"}) {
    EXPECT_EQ(inheritedDescriptors(file("a.cc", line)), "") << line;
  }
}

TEST(TidyPlanted, LogTextsThatStandTwiceAreFound) {
  const std::string once = "logProblem(\"%s it cannot be read\", f);\n";
  const std::string broken = "logTrace(\n    \"%s it cannot \"\n    \"be read\", f);\n";
  EXPECT_EQ(logTextsAtTwoPlaces(file("a.cc", once), {}), "");
  EXPECT_NE(logTextsAtTwoPlaces(file("a.cc", once + once), {}), "");
  EXPECT_NE(logTextsAtTwoPlaces(file("a.cc", once + broken), {}), "");
  EXPECT_EQ(logTextsAtTwoPlaces(file("a.cc", once + once), {"%s it cannot be read"}), "");
  EXPECT_EQ(
      logTextsAtTwoPlaces(file("a.cc", "logTrace(\"%s EXIT\", f);\nlogTrace(\"%s EXIT\");"), {}),
      "");
}

TEST(TidyPlanted, SleepsWithoutAReasonAreFound) {
  EXPECT_NE(sleepsWithoutReason(file("a.cc", "go();\nrt::sleepNs(3);")), "");
  EXPECT_NE(sleepsWithoutReason(file("a.cc", "::usleep(3);")), "");
  EXPECT_EQ(sleepsWithoutReason(file("a.cc", "rt::sleepNs(3);  // a second answer would come")),
            "");
  EXPECT_EQ(sleepsWithoutReason(file("a.cc", "while (!done) rt::sleepNs(3);")), "");
  EXPECT_EQ(sleepsWithoutReason(file("a.cc", "while (!done) {\n  rt::sleepNs(3);\n}")), "");
}

}  // namespace
}  // namespace spacekeep::tidy
