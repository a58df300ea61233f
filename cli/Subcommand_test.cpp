#include "cli/Subcommand.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <set>
#include <sstream>

namespace vela {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

struct Outcome {
    int status = -1;
    std::string out;
    std::string error;
};

Outcome run(const std::vector<std::string_view>& arguments, const std::string& input = "", bool terminal = false) {
    std::istringstream in(input);
    std::ostringstream out;
    std::ostringstream error;
    Console console{in, out, error, terminal, terminal};
    const int status = runVelactl(arguments, console);
    return {status, out.str(), error.str()};
}

TEST(VelactlTest, TheHelpNamesEverySubcommand) {
    const Outcome help = run({"--help"});
    EXPECT_EQ(help.status, kDone);
    EXPECT_THAT(help.out, StartsWith("usage: velactl SUBCOMMAND [ARGUMENT]...\n"));
    for (const Subcommand& subcommand : subcommands()) {
        EXPECT_THAT(help.out, HasSubstr("velactl " + std::string(subcommand.name) + " "));
    }
}

TEST(VelactlTest, EverySubcommandExplainsItself) {
    std::set<std::string_view> names;
    for (const Subcommand& subcommand : subcommands()) {
        EXPECT_TRUE(names.insert(subcommand.name).second) << subcommand.name;
        const Outcome help = run({subcommand.name, "--help"});
        EXPECT_EQ(help.status, kDone);
        EXPECT_EQ(help.out, "usage: velactl " + std::string(subcommand.name) + " " + std::string(subcommand.arguments) +
                                "\n\n" + std::string(subcommand.summary) + "\n");
    }
}

TEST(VelactlTest, TheVersionIsPrinted) { EXPECT_EQ(run({"--version"}).out, "velactl " VELA_VERSION "\n"); }

TEST(VelactlTest, WrongUsageIsOneLineAndTwo) {
    EXPECT_EQ(run({}).status, kWrongUsage);
    EXPECT_EQ(run({}).error, "velactl: a subcommand is missing; see velactl --help\n");
    EXPECT_EQ(run({"setings"}).status, kWrongUsage);
    EXPECT_EQ(run({"setings"}).error, "velactl: there is no subcommand setings; see velactl --help\n");
    EXPECT_EQ(run({"--verbose"}).error, "velactl: there is no subcommand --verbose; see velactl --help\n");
    EXPECT_EQ(run({"settings", "--jsn"}).status, kWrongUsage);
    EXPECT_THAT(run({"settings", "--jsn"}).error,
                StartsWith("velactl: there is no option --jsn; usage: velactl settings ["));
    EXPECT_THAT(run({"settings", "x"}).error, StartsWith("velactl: there is nothing to do with \"x\"; usage: "));
    EXPECT_EQ(run({"settings", "--example", "--json"}).status, kWrongUsage);
}

TEST(VelactlTest, ThereIsAShortWordForHelp) {
    EXPECT_EQ(run({"-h"}).status, kDone);
    EXPECT_EQ(run({"-h"}).out, run({"--help"}).out);
    EXPECT_EQ(run({"status", "-h"}).status, kDone);
    EXPECT_EQ(run({"status", "-h"}).out, run({"status", "--help"}).out);
    EXPECT_EQ(run({"trace", "emit", "-h"}).out, run({"trace", "--help"}).out);
}

TEST(VelactlTest, NothingFollowsHelpAndVersion) {
    for (const std::string_view option : {"--help", "-h", "--version"}) {
        const Outcome refused = run({option, "x"});
        EXPECT_EQ(refused.status, kWrongUsage) << option;
        EXPECT_EQ(refused.out, "") << option;
        EXPECT_EQ(refused.error, "velactl: there is nothing to do with \"x\"; see velactl --help\n") << option;
    }
}

TEST(VelactlCallTest, OperationsAreListed) {
    const Outcome list = run({"call"});
    EXPECT_EQ(list.status, kDone);
    EXPECT_THAT(list.out, HasSubstr("\n  sendMessage MESSAGE CATEGORY TYPE [REPORTER-IDS]\n"));
    EXPECT_EQ(run({"call", "--"}).out, list.out);
}

TEST(VelactlCallTest, OperationsAreJsonLines) {
    const Outcome list = run({"call", "--json"});
    EXPECT_EQ(list.status, kDone);
    EXPECT_EQ(list.error, "");
    EXPECT_THAT(list.out, StartsWith(R"({"operation":"createReportingSession","arguments":["REPORTER-ID"],)"
                                     R"("signature":"x","reply_signature":"b"})"
                                     "\n"));
    EXPECT_THAT(list.out, HasSubstr("\n"
                                    R"({"operation":"getAllReporters","arguments":[],)"
                                    R"("signature":"","reply_signature":"ax"})"
                                    "\n"));
    EXPECT_EQ(std::ranges::count(list.out, '\n'), 11);
}

TEST(VelactlCallTest, WhatStandsBehindTheMarkIsAnOperationAndItsArguments) {
    EXPECT_THAT(run({"call", "--", "reporterID", "x"}).error, StartsWith("velactl: argument 1: "));
    EXPECT_THAT(run({"call", "--", "--json"}).error, StartsWith("velactl: there is no operation \"--json\"; usage: "));
    EXPECT_THAT(run({"call", "reporterID", "--jsn"}).error, StartsWith("velactl: there is no option --jsn; usage: "));
}

TEST(VelactlDefaultsTest, WhatIsMissingOrTooMuchIsNamed) {
    const auto reason = [](std::vector<std::string_view> words) {
        words.insert(words.begin(), "defaults");
        const Outcome refused = run(words);
        EXPECT_EQ(refused.status, kWrongUsage);
        EXPECT_THAT(refused.error, HasSubstr("; usage: velactl defaults (read DOMAIN [KEY] [--json] | write "));
        return refused.error.substr(0, refused.error.find("; usage: "));
    };
    EXPECT_EQ(reason({}), "velactl: read, write or delete is missing");
    EXPECT_EQ(reason({"list"}), "velactl: there is no \"list\", but read, write and delete");
    EXPECT_EQ(reason({"read"}), "velactl: read: a domain is missing");
    EXPECT_EQ(reason({"read", "d", "k", "v"}), "velactl: read: there is nothing to do with \"v\"");
    EXPECT_EQ(reason({"write"}), "velactl: write: a domain is missing");
    EXPECT_EQ(reason({"write", "d"}), "velactl: write: a key is missing");
    EXPECT_EQ(reason({"write", "d", "k"}), "velactl: write: a value is missing");
    EXPECT_EQ(reason({"write", "d", "k", "v", "w"}), "velactl: write: there is nothing to do with \"w\"");
    EXPECT_EQ(reason({"delete"}), "velactl: delete: a domain is missing");
    EXPECT_EQ(reason({"delete", "d", "k", "v"}), "velactl: delete: there is nothing to do with \"v\"");
    EXPECT_EQ(reason({"delete", "d", "--json"}), "velactl: delete has nothing to print: --json goes with read");
}

TEST(VelactlPlistTest, WrongUsageIsTwo) {
    EXPECT_EQ(run({"plist"}).status, kWrongUsage);
    EXPECT_EQ(run({"plist", "a", "b"}).status, kWrongUsage);
    EXPECT_EQ(run({"plist", "a", "--to", "yaml"}).status, kWrongUsage);
    EXPECT_THAT(run({"plist", "a", "--to", "yaml"}).error, StartsWith("velactl: there is no form \"yaml\"; usage: "));
}

TEST(VelactlPlistTest, TextBecomesJsonWhenNoFormIsGiven) {
    const Outcome shown = run({"plist", "-"}, "{a = 1; b = (x, \"y z\");}");
    EXPECT_EQ(shown.error, "");
    EXPECT_EQ(shown.status, kDone);
    EXPECT_EQ(shown.out, "{\n  \"a\": \"1\",\n  \"b\": [\n    \"x\",\n    \"y z\"\n  ]\n}\n");
}

TEST(VelactlPlistTest, EveryFormIsReadBackFromTheOthers) {
    const std::string text = "{a = 1; b = (x, \"y z\");}";
    const Outcome json = run({"plist", "-"}, text);
    for (const char* form : {"xml", "binary", "text"}) {
        const Outcome written = run({"plist", "-", "--to", form}, text);
        ASSERT_EQ(written.status, kDone) << form << written.error;
        EXPECT_EQ(run({"plist", "-", "--to", "json"}, written.out).out, json.out) << form;
    }
    EXPECT_THAT(run({"plist", "-", "--to", "xml"}, text).out, StartsWith("<?xml"));
    EXPECT_THAT(run({"plist", "-", "--to", "binary"}, text).out, StartsWith("bplist00"));
}

TEST(VelactlPlistTest, NumbersAndDatesKeepTheirKindInXml) {
    const std::string xml = run({"plist", "-", "--to", "xml"}, "{a = 1;}").out;
    std::string numbers = xml;
    numbers.replace(numbers.find("<string>1</string>"), 18, "<integer>1</integer>");
    EXPECT_EQ(run({"plist", "-"}, numbers).out, "{\n  \"a\": 1\n}\n");
}

TEST(VelactlPlistTest, ABadFileIsOneLineAndOne) {
    const Outcome bad = run({"plist", "-"}, "{a = ");
    EXPECT_EQ(bad.status, kFailed);
    EXPECT_EQ(bad.out, "");
    EXPECT_THAT(bad.error, StartsWith("velactl: -: property list: "));
    EXPECT_EQ(bad.error.find('\n'), bad.error.size() - 1);
    EXPECT_EQ(run({"plist", "/nowhere/at/all.plist"}).status, kFailed);
    EXPECT_THAT(run({"plist", "/nowhere/at/all.plist"}).error, StartsWith("velactl: /nowhere/at/all.plist: "));
}

TEST(VelactlPlistTest, ABinaryListIsNotForATerminal) {
    EXPECT_EQ(run({"plist", "-", "--to", "binary"}, "{a = 1;}", true).status, kWrongUsage);
    EXPECT_EQ(run({"plist", "-", "--to", "xml"}, "{a = 1;}", true).status, kDone);
}

} // namespace
} // namespace vela
