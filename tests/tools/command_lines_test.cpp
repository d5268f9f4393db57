#include "support/Program.h"
#include "support/Programs.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

// What the command lines of all programs have in common.
namespace {

using orva::test::Outcome;
using testing::HasSubstr;

using Arguments = std::vector<std::string>;

/// A program, and command lines for it. All but the first are wrong.
struct Example {
  std::string program;
  Arguments command;         ///< a valid command line that begins with a command
  std::string misspelled;    ///< its command
  Arguments lacksOperand;    ///< ends before an operand that is required
  std::string operand;       ///< this one
  Arguments lacksValue;      ///< ends with an option that needs a value
  Arguments surplusArgument; ///< ends with an argument that is too much
};

void PrintTo(const Example& example, std::ostream* stream) {
  *stream << example.program;
}

class CommandLines : public testing::TestWithParam<Example> {
protected:
  static Outcome Run(Arguments arguments) {
    arguments.insert(arguments.begin(), orva::test::ProgramPath(GetParam().program));
    return orva::test::Run(arguments);
  }

  /// Expects that the arguments are refused with `message` and the help of `command`.
  static void ExpectRefused(const Arguments& arguments, const std::string& message,
                            const std::string& command = "") {
    const std::string& program = GetParam().program;
    const Outcome outcome = Run(arguments);
    EXPECT_EQ(2, outcome.status);
    EXPECT_EQ("", outcome.output);
    EXPECT_EQ(program + ": " + message + "\nTry '" + program +
                  (command.empty() ? "" : ' ' + command) + " --help'.\n",
              outcome.error);
  }

  /// `arguments` with one more at the end.
  static Arguments With(Arguments arguments, const std::string& argument) {
    arguments.push_back(argument);
    return arguments;
  }
};

TEST_P(CommandLines, PrintHelp) {
  for (const std::string option : {"--help", "-h"}) {
    const Outcome help = Run({option});
    EXPECT_EQ(0, help.status);
    EXPECT_EQ("", help.error);
    EXPECT_THAT(help.output, HasSubstr("\nUsage: " + GetParam().program + " "));

    const std::string& command = GetParam().command.front();
    const Outcome more = Run({command, option});
    EXPECT_EQ(0, more.status);
    EXPECT_EQ("", more.error);
    EXPECT_THAT(more.output, HasSubstr("\nUsage: " + GetParam().program + " " + command));
  }
}

TEST_P(CommandLines, PrintHelpWithACommand) {
  const Outcome help = Run({"help"});
  EXPECT_EQ(0, help.status);
  EXPECT_EQ("", help.error);
  EXPECT_EQ(Run({"--help"}).output, help.output);
  EXPECT_THAT(help.output, HasSubstr("\n  help "));

  const std::string& command = GetParam().command.front();
  const Outcome more = Run({"help", command});
  EXPECT_EQ(0, more.status);
  EXPECT_EQ("", more.error);
  EXPECT_EQ(Run({command, "--help"}).output, more.output);

  ExpectRefused({"help", GetParam().misspelled}, "unknown command: '" + GetParam().misspelled +
                                                     "'; did you mean '" + command + "'?");
  ExpectRefused({"help", command, "more"}, "unexpected argument: 'more'", "help");
}

TEST_P(CommandLines, PrintTheVersion) {
  const Outcome outcome = Run({"--version"});
  EXPECT_EQ(0, outcome.status);
  EXPECT_EQ("", outcome.error);
  EXPECT_EQ(GetParam().program + " " PROGRAM_VERSION "\n", outcome.output);
}

TEST_P(CommandLines, NameUnknownOptions) {
  ExpectRefused({"--foo"}, "unknown option: --foo");
  ExpectRefused({"--foo=bar"}, "unknown option: --foo");
  ExpectRefused({"-x"}, "unknown option: -x");
  ExpectRefused({"--hepl"}, "unknown option: --hepl; did you mean '--help'?");
  const std::string& command = GetParam().command.front();
  ExpectRefused(With(GetParam().command, "--foo"), "unknown option: --foo", command);
  ExpectRefused({command, "--versoin"}, "unknown option: --versoin; did you mean '--version'?",
                command);
}

TEST_P(CommandLines, NameUnknownCommands) {
  ExpectRefused({"destroy", "all"}, "unknown command: 'destroy'");
  ExpectRefused({GetParam().misspelled}, "unknown command: '" + GetParam().misspelled +
                                             "'; did you mean '" + GetParam().command.front() +
                                             "'?");
}

TEST_P(CommandLines, NameMissingOperands) {
  const Arguments& arguments = GetParam().lacksOperand;
  ExpectRefused(arguments, GetParam().operand + " is required", arguments.front());
}

TEST_P(CommandLines, NameOptionsWithoutAValue) {
  const Arguments& arguments = GetParam().lacksValue;
  ExpectRefused(arguments, "option " + arguments.back() + " needs a value", arguments.front());
}

TEST_P(CommandLines, NameSurplusArguments) {
  const Arguments& arguments = GetParam().surplusArgument;
  ExpectRefused(arguments, "unexpected argument: '" + arguments.back() + "'", arguments.front());
}

TEST_P(CommandLines, EscapeControlCharacters) {
  ExpectRefused({"\x1b[31mred\n"}, R"(unknown command: '\x1b[31mred\x0a')");
}

INSTANTIATE_TEST_SUITE_P(
    Of, CommandLines,
    testing::Values(Example{.program = "zophotos",
                            .command = {"tree", "A"},
                            .misspelled = "teee",
                            .lacksOperand = {"find"},
                            .operand = "PATTERN",
                            .lacksValue = {"find", "--type"},
                            .surplusArgument = {"ls", "A", "B"}},
                    Example{.program = "orva-notify",
                            .command = {"send", "end", "/shares/A"},
                            .misspelled = "sned",
                            .lacksOperand = {"send", "end"},
                            .operand = "MOUNT",
                            .lacksValue = {"drop", "--wait"},
                            .surplusArgument = {"send", "end", "/shares/A", "/shares/B"}},
                    Example{.program = "orva-catalog",
                            .command = {"index", "/shares/A"},
                            .misspelled = "indx",
                            .lacksOperand = {"index"},
                            .operand = "MOUNT",
                            .lacksValue = {"generate", "--files"},
                            .surplusArgument = {"index", "/shares/A", "/shares/B"}}),
    [](const auto& example) {
      std::string name = example.param.program;
      std::erase(name, '-');
      return name;
    });

} // namespace
