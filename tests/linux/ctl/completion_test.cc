// The completions, by the shells themselves.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <string>
#include <vector>

#include "tests/linux/ctl/tool_test.h"

namespace spacekeep::ctl {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::IsSupersetOf;
using testing::Not;

std::vector<std::string> linesOf(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream stream(text);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

class Completion : public ToolTest {
 protected:
  ~Completion() override {
    daemon_.stop();
    std::remove(scriptFile().c_str());
  }

  void serveState() {
    daemon_.on("clientGetState", [](const ipc::Arguments&, const ipc::Responder& responder) {
      responder.reply({ipc::OptionalValue(Value(Dictionary{{"mine", 1}, {"two words", 2}}))});
    });
    daemon_.start();
  }
  [[nodiscard]] std::string scriptFile() const { return directory_.path() + "/script"; }
  [[nodiscard]] std::string socketOption() const { return "--socket " + directory_.daemonSocket(); }
  static std::string completions() {
    return std::string(SPACEKEEP_SOURCE_DIR) + "/packaging/completions";
  }

  /// What bash offers after `words`, of which the last is the one being typed ("" for a fresh one).
  std::vector<std::string> inBash(const std::string& words) {
    std::ofstream(scriptFile()) << "source " << completions() << "/spacekeepctl.bash\n"
                                << "PATH=" << SPACEKEEP_BUILD_DIR << "/ctl:$PATH\n"
                                << "COMP_WORDS=(spacekeepctl " << words << ")\n"
                                << "COMP_CWORD=$((${#COMP_WORDS[@]} - 1))\n"
                                << "_spacekeepctl spacekeepctl\n"
                                << "((${#COMPREPLY[@]})) && printf \"%s\\n\" \"${COMPREPLY[@]}\"\n"
                                << "exit 0\n";
    const Finished run = runShell("bash --norc " + scriptFile(), errFile());
    EXPECT_EQ(run.exit_code, 0);
    EXPECT_THAT(run.err, IsEmpty()) << words;
    return linesOf(run.out);
  }

  /// Waits until an interactive zsh has made `completed` of `typed`. Empty when it did, else what
  /// it made.
  std::string inZsh(const std::string& typed, const std::string& completed) {
    std::ofstream(scriptFile())
        << "zmodload zsh/zpty || exit 2\n"
        << "zpty z zsh -f -i\n"
        << "zpty -w z \"PROMPT=; TERM=dumb; PATH=" << SPACEKEEP_BUILD_DIR << "/ctl:\\$PATH; fpath=("
        << completions() << " \\$fpath); autoload -U compinit; compinit -u -D; print READ\\Y\"\n"
        << "zpty -r z out \"*READY*\"\n"
        << "zpty -w -n z $'" << typed << "\\t'\n"
        << "zpty -r z out \"*" << completed << "*\" && exit 0\n"
        << "print -r -- \"${(V)out}\"; exit 1\n";
    const Finished run = runShell("timeout 200 zsh -f " + scriptFile(), errFile());
    return run.exit_code == 0 ? ""
                              : "exit " + std::to_string(run.exit_code) + ": " + run.out + run.err;
  }
};

TEST_F(Completion, BashOffersCommands) {
  EXPECT_THAT(inBash("\"\""),
              ElementsAre("status", "explain", "history", "report", "doctor", "purge", "query",
                          "state", "volumes", "cancel", "check-service"));
  EXPECT_THAT(inBash("q"), ElementsAre("query"));
  EXPECT_THAT(inBash("--json q"), ElementsAre("query"));
  EXPECT_THAT(inBash("state \"\""), ElementsAre("get", "set", "unset", "list"));
  EXPECT_THAT(inBash("cancel \"\""), IsEmpty());
}

TEST_F(Completion, BashOffersTheOptionsOfTheCommand) {
  EXPECT_THAT(inBash("-"), ElementsAre("--version", "--json", "--socket", "--help"));
  EXPECT_THAT(inBash("query /data --"),
              ElementsAre("--itemized", "--urgency", "--json", "--socket", "--help"));
  EXPECT_THAT(inBash("status --"), ElementsAre("--volume", "--json", "--socket", "--help"));
  EXPECT_THAT(inBash("doctor --r"), ElementsAre("--root"));
  EXPECT_THAT(inBash("report --html x --s"), ElementsAre("--since", "--socket"));
  EXPECT_THAT(inBash("purge --w"), ElementsAre("--wait-all"));
  EXPECT_THAT(inBash("state set --f"), ElementsAre("--force"));
  EXPECT_THAT(inBash("state get --f"), IsEmpty());
  EXPECT_THAT(inBash("volumes --n"), ElementsAre("--names"));
  EXPECT_THAT(inBash("check-service --in-use /tmp --n"), ElementsAre("--no-purge"));
}

TEST_F(Completion, BashOffersValuesOfOptions) {
  EXPECT_THAT(inBash("query --urgency \"\""), ElementsAre("1", "2", "3", "4"));
  EXPECT_THAT(inBash("query --urgency = 3"), ElementsAre("3"));
  EXPECT_THAT(inBash("query --urgency ="), ElementsAre("1", "2", "3", "4"));
  EXPECT_THAT(inBash("state set k v --type n"), ElementsAre("number"));
  EXPECT_THAT(inBash("purge --timeout \"\""), IsEmpty());
  EXPECT_THAT(inBash("--socket /etc/passw"), IsSupersetOf({"/etc/passwd"}));
  EXPECT_THAT(inBash("report --html /etc/passw"), IsSupersetOf({"/etc/passwd"}));
}

TEST_F(Completion, BashOffersTheVolumesOfThisMachine) {
  const auto volumes = linesOf(ctl("volumes --names").out);
  ASSERT_THAT(volumes, Not(IsEmpty()));
  EXPECT_EQ(inBash("purge \"\""), volumes);
  EXPECT_EQ(inBash("explain \"\""), volumes);
  EXPECT_EQ(inBash("status --volume \"\""), volumes);
  EXPECT_EQ(inBash("query --urgency 4 \"\""), volumes);
  EXPECT_THAT(inBash("query /no/such/volume"), IsEmpty());
  EXPECT_THAT(inBash("purge /data \"\""), IsEmpty());
}

TEST_F(Completion, BashOffersTheKeysOfTheDaemonThatTheLineNames) {
  serveState();
  EXPECT_THAT(inBash(socketOption() + " state get m"), ElementsAre("mine"));
  EXPECT_THAT(inBash(socketOption() + " state unset tw"), ElementsAre("two\\ words"));
  EXPECT_THAT(inBash(socketOption() + " state set \"two\\\\ w\""), ElementsAre("two\\ words"));
  EXPECT_THAT(inBash("--socket = " + directory_.daemonSocket() + " state get m"),
              ElementsAre("mine"));
  EXPECT_THAT(inBash(socketOption() + " state list \"\""), IsEmpty());
}

TEST_F(Completion, BashKnowsTheKeysThatMeanSomethingWithoutADaemon) {
  EXPECT_THAT(inBash(socketOption() + " state get SPACEKEEP_LOW"),
              ElementsAre("SPACEKEEP_LOW_SPACE_BYTES", "SPACEKEEP_LOW_SPACE_INODES_PERCENT",
                          "SPACEKEEP_LOW_SPACE_PERCENT"));
  EXPECT_THAT(inBash("state set SPACEKEEP_CACHE_ENABLED \"\""), ElementsAre("true", "false"));
  EXPECT_THAT(inBash("state set SPACEKEEP_LOW_SPACE_BYTES \"\""), IsEmpty());
}

TEST_F(Completion, BashOffersFilesAndVolumesForACheckAndProgramsForItsCommand) {
  EXPECT_THAT(inBash("check-service --data /etc/passw"), IsSupersetOf({"/etc/passwd"}));
  EXPECT_EQ(inBash("check-service --volume \"\""), linesOf(ctl("volumes --names").out));
  EXPECT_THAT(inBash("check-service --volume / -- mkto"), IsEmpty());
  EXPECT_THAT(inBash("check-service --volume / -- mktem"), IsSupersetOf({"mktemp"}));
  EXPECT_THAT(inBash("check-service --volume / -- mktemp --so"), IsEmpty());
}

/// Every option that bash offers is one that the tool knows for that command.
TEST_F(Completion, EveryOptionThatIsOfferedStandsInTheHelp) {
  for (const std::string command :
       {"status", "explain", "history", "report", "doctor", "purge", "query", "state set",
        "state list", "state get", "volumes", "cancel", "check-service"}) {
    const std::string help = ctl(command + " --help").out;
    for (const auto& option : inBash(command + " --")) {
      EXPECT_NE(help.find(option), std::string::npos) << command << " " << option;
    }
  }
}

TEST_F(Completion, ZshCompletesCommandsOptionsAndKeys) {
  serveState();
  EXPECT_EQ(inZsh("spacekeepctl q", "spacekeepctl query "), "");
  EXPECT_EQ(inZsh("spacekeepctl query --it", "--itemized"), "");
  EXPECT_EQ(inZsh("spacekeepctl doc", "spacekeepctl doctor "), "");
  EXPECT_EQ(inZsh("spacekeepctl status --v", "--volume"), "");
  EXPECT_EQ(inZsh("spacekeepctl report --ht", "--html"), "");
  EXPECT_EQ(inZsh("spacekeepctl check-service --no", "--no-purge"), "");
  EXPECT_EQ(inZsh("spacekeepctl state set SPACEKEEP_C", "SPACEKEEP_CACHE_ENABLED "), "");
  EXPECT_EQ(inZsh("spacekeepctl state set SPACEKEEP_FINISH_EARLY t", "SPACEKEEP_FINISH_EARLY true"),
            "");
  EXPECT_EQ(inZsh("spacekeepctl " + socketOption() + " state get mi", "state get mine"), "");
}

}  // namespace
}  // namespace spacekeep::ctl
