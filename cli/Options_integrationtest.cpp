// What velactl takes, and what its help, its page and its completion say that it takes.
#include "cli/PackagedFile_integrationtest.h"
#include "cli/Subcommand.h"
#include "testing/RunProgram.h"

#include <algorithm>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <regex>
#include <set>
#include <sstream>

namespace vela {
namespace {

using ::testing::HasSubstr;
using ::testing::StartsWith;

/// Names of long options in `text`, but not that of the help, which all have.
std::set<std::string> optionsIn(const std::string& text) {
    std::set<std::string> options;
    const std::regex option("--[a-z]+");
    for (std::sregex_iterator found(text.begin(), text.end(), option), end; found != end; ++found) {
        options.insert(found->str());
    }
    options.erase("--help");
    return options;
}

/// A subcommand, or one of those that trace has: what is typed, and how its usage goes on.
struct Typed {
    std::vector<std::string> words;
    std::string arguments;

    std::string text() const { return words.size() == 1 ? words[0] : words[0] + " " + words[1]; }
};

std::vector<Typed> everySubcommand() {
    std::vector<Typed> all;
    for (const Subcommand& subcommand : subcommands()) {
        const std::string name(subcommand.name);
        if (name != "trace") {
            all.push_back({{name}, std::string(subcommand.arguments)});
            continue;
        }
        std::string_view rest = subcommand.arguments;
        while (!rest.empty()) {
            const std::size_t bar = std::min(rest.find(" | "), rest.size());
            const std::string one(rest.substr(0, bar));
            all.push_back({{name, one.substr(0, one.find(' '))}, one});
            rest.remove_prefix(std::min(bar + 3, rest.size()));
        }
    }
    return all;
}

/// Whether the subcommand knows the option, asked with one behind it that none knows.
bool takes(const Typed& subcommand, const std::string& option) {
    std::vector<std::string_view> words(subcommand.words.begin(), subcommand.words.end());
    words.insert(words.end(), {option, "--no-such", "--no-such"}); // the first may be its value
    std::istringstream in;
    std::ostringstream out;
    std::ostringstream error;
    Console console{in, out, error};
    EXPECT_EQ(runVelactl(words, console), kWrongUsage) << subcommand.text();
    EXPECT_THAT(error.str(), StartsWith("velactl: there is no option --")) << subcommand.text();
    return error.str().find("no option --no-such;") != std::string::npos;
}

/// Every option that is named anywhere, as far as the subcommand takes it.
std::set<std::string> optionsOf(const Typed& subcommand) {
    std::string named =
        contentOf(VELA_PACKAGING "/completion/velactl") + plainText(contentOf(VELA_PACKAGING "/man/velactl.1"));
    for (const Subcommand& other : subcommands()) {
        named += other.arguments;
    }
    std::set<std::string> options = optionsIn(named);
    std::erase_if(options, [&](const std::string& option) { return !takes(subcommand, option); });
    return options;
}

TEST(VelactlOptionsTest, TheUsageNamesEveryOptionThatIsTakenAndNoOther) {
    const std::vector<Typed> all = everySubcommand();
    ASSERT_EQ(all.size(), subcommands().size() + 1);
    for (const Typed& subcommand : all) {
        EXPECT_EQ(optionsIn(subcommand.arguments), optionsOf(subcommand)) << subcommand.text();
    }
}

TEST(VelactlOptionsTest, TheManPageNamesEveryOptionThatIsTakenAndNoOther) {
    const std::string page = plainText(contentOf(VELA_PACKAGING "/man/velactl.1"));
    for (const Typed& subcommand : everySubcommand()) {
        const std::set<std::string> options = optionsOf(subcommand);
        const std::size_t synopsis = page.find("\n.B velactl " + subcommand.text() + "\n");
        ASSERT_NE(synopsis, std::string::npos) << subcommand.text();
        EXPECT_EQ(optionsIn(page.substr(synopsis, page.find("\n.br\n", synopsis) - synopsis)), options)
            << subcommand.text();
        const std::size_t section = page.find("\n.SS velactl " + subcommand.text() + "\n");
        ASSERT_NE(section, std::string::npos) << subcommand.text();
        const std::string description = page.substr(section, page.find("\n.S", section + 1) - section);
        for (const std::string& option : options) {
            EXPECT_THAT(description, HasSubstr(option)) << subcommand.text();
        }
    }
}

TEST(VelactlOptionsTest, TheCompletionOffersEveryOptionThatIsTakenAndNoOther) {
    if (!std::filesystem::exists("/bin/bash")) {
        GTEST_SKIP() << "bash is not installed";
    }
    for (const Typed& subcommand : everySubcommand()) {
        std::vector<std::string> words{
            "/bin/bash", "-c",
            R"(source "$0"; COMP_WORDS=(velactl "$@" --); COMP_CWORD=$(($# + 1)); _velactl; echo "${COMPREPLY[@]}")",
            VELA_PACKAGING "/completion/velactl"};
        words.insert(words.end(), subcommand.words.begin(), subcommand.words.end());
        if (subcommand.words[0] == "defaults") {
            words.emplace_back("read"); // the verb that has options of its own
        }
        const testing::ProgramRun offered = testing::runProgram(words, {"PATH=/usr/bin:/bin"});
        EXPECT_EQ(offered.status, 0) << offered.error;
        EXPECT_EQ(optionsIn(offered.out), optionsOf(subcommand)) << subcommand.text();
        EXPECT_THAT(offered.out, HasSubstr("--help")) << subcommand.text();
    }
}

} // namespace
} // namespace vela
