// Scripts are not compiled: what cannot be read would be found by whoever runs it.
#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <string>

#include "tests/helpers/temporary_directory.h"
#include "tests/linux/tidy/source_tree.h"

namespace spacekeep::tidy {
namespace {

/// How the interpreter of a script is asked to read it and not run it; empty for other files.
std::string readerOf(const SourceFile& file) {
  const std::string first = file.lines.empty() ? "" : file.lines.front().text;
  if (file.path.ends_with(".py"))
    return "python3 -c 'import ast, sys; ast.parse(open(sys.argv[1]).read())' ";
  if (first.starts_with("#!") && first.ends_with("bash")) return "bash -n ";
  if (first.starts_with("#!") && first.ends_with("/sh")) return "sh -n ";
  return "";
}

bool canBeRead(const std::string& reader, const std::string& path) {
  return std::system((reader + path).c_str()) == 0;
}

TEST(TidyScripts, CanAllBeRead) {
  int scripts = 0;
  for (const SourceFile& file : allTexts()) {
    const std::string reader = readerOf(file);
    if (reader.empty()) continue;
    ++scripts;
    EXPECT_TRUE(canBeRead(reader, SPACEKEEP_SOURCE_DIR "/" + file.path)) << file.path;
  }
  EXPECT_GE(scripts, 40);
}

TEST(TidyScripts, AnApostropheTooManyIsFound) {
  const test::TemporaryDirectory directory;
  for (const std::string name : {"a.py", "a"}) {
    const std::string path = directory / name;
    std::ofstream(path) << "#!/usr/bin/env bash\nfolders='the daemon's'\n";
    EXPECT_FALSE(canBeRead(readerOf(parsed(name, "#!/usr/bin/env bash\n")), path)) << name;
    std::ofstream(path) << "#!/usr/bin/env bash\nfolders='of the daemon'\n";
    EXPECT_TRUE(canBeRead(readerOf(parsed(name, "#!/usr/bin/env bash\n")), path)) << name;
  }
}

}  // namespace
}  // namespace spacekeep::tidy
