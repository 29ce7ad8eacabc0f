#include "tests/linux/command/command_world.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "services/command/rules/rule_reader.h"

namespace spacekeep::command {
namespace {

std::string fileWith(const std::string& content) {
  return cachedir::ruleFile("<key>SPACEKEEP_ID</key><string>com.example.cache</string>" + content);
}

}  // namespace

std::string shellTool(const std::string& body) {
  const std::string path = temporaryDirectory() + "/tool";
  std::ofstream(path) << "#!/bin/sh\n" << body << "\n";
  EXPECT_EQ(::chmod(path.c_str(), 0755), 0);
  return path;
}

Rule ruleFrom(const std::string& content, const UserFolders* folders) {
  auto rules = readRules({.files = {fileWith(content)}, .folders = {}, .only = {}}, folders);
  if (const auto* error = std::get_if<cachedir::RuleError>(&rules)) {
    ADD_FAILURE() << error->text;
    return {};
  }
  return std::get<std::vector<Rule>>(rules).front();
}

std::string errorOf(const std::string& content, const UserFolders* folders) {
  const std::string file = fileWith(content);
  auto rules = readRules({.files = {file}, .folders = {}, .only = {}}, folders);
  const auto* error = std::get_if<cachedir::RuleError>(&rules);
  if (error == nullptr) return "";
  EXPECT_TRUE(error->text.starts_with(file + ": ")) << error->text;
  return "FILE" + error->text.substr(file.size());
}

std::string arrayOf(const std::vector<std::string>& texts) {
  std::string array = "<array>";
  for (const std::string& text : texts) array += "<string>" + text + "</string>";
  return array + "</array>";
}

UserFolders homeAt(const std::string& home) {
  auto folders = foldersBelow(::geteuid(), "somebody", home,
                              [](const char*) { return std::optional<std::string>(); });
  EXPECT_TRUE(std::holds_alternative<UserFolders>(folders));
  return std::get<UserFolders>(folders);
}

Went freeFrom(const Cache& cache, const Request& request) {
  Went went;
  went.result = cache.free(request, CancelToken(),
                           [&went](const std::string& what, std::optional<std::uint64_t> bytes) {
                             went.what.push_back(what);
                             went.sum += bytes.value_or(0);
                           });
  EXPECT_EQ(went.sum, went.result.bytes);
  return went;
}

Went freeAsForetold(const Cache& cache, Request request) {
  request.dry_run = true;
  const Went foretold = freeFrom(cache, request);
  request.dry_run = false;
  Went went = freeFrom(cache, request);
  EXPECT_EQ(went.what, foretold.what);
  EXPECT_EQ(went.result.bytes, foretold.result.bytes);
  return went;
}

}  // namespace spacekeep::command
