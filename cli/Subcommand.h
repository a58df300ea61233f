// The subcommands of velactl: one entry of a table each. Nothing here is thread-safe; the program has one thread.
#pragma once

#include <functional>
#include <iosfwd>
#include <span>
#include <string_view>

namespace vela {

// What velactl exits with.
constexpr int kDone = 0;
constexpr int kFailed = 1;
constexpr int kWrongUsage = 2;
constexpr int kNoService = 3;

/// Where a subcommand reads and prints.
struct Console {
    std::istream& in;
    std::ostream& out;
    std::ostream& error;
    bool terminal = false; ///< whether `out` is one
    bool colour = false;   ///< whether `out` understands colours and its user wants them
    /// Whether nobody reads `out` any more; null where nobody can tell.
    std::function<bool()> isReaderGone = nullptr;
};

struct Subcommand {
    std::string_view name;
    std::string_view arguments; ///< as a usage line names them
    std::string_view summary;
    int (*run)(std::span<const std::string_view> arguments, Console& console);
};

/// All of them, in the order of `velactl --help`.
std::span<const Subcommand> subcommands();

/// Runs what `arguments` (without the program's name) ask for.
int runVelactl(std::span<const std::string_view> arguments, Console& console);

/// Says what is wrong with a subcommand's arguments, and how to use it. Answers kWrongUsage.
int refuseUsage(std::string_view subcommand, std::string_view reason, Console& console);

int runStatus(std::span<const std::string_view> arguments, Console& console);
int runSessions(std::span<const std::string_view> arguments, Console& console);
int runCall(std::span<const std::string_view> arguments, Console& console);
int runRun(std::span<const std::string_view> arguments, Console& console);
int runDeliveries(std::span<const std::string_view> arguments, Console& console);
int runDefaults(std::span<const std::string_view> arguments, Console& console);
int runNotify(std::span<const std::string_view> arguments, Console& console);
int runDrivers(std::span<const std::string_view> arguments, Console& console);
int runSettings(std::span<const std::string_view> arguments, Console& console);
int runTrace(std::span<const std::string_view> arguments, Console& console);
int runPlist(std::span<const std::string_view> arguments, Console& console);

} // namespace vela
