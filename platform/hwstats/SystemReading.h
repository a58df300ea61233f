// Reads the small files in which the kernel says its numbers, below a root folder, within a budget of files and time:
// what a sampling has spent, later readings of it do not get. The kernel makes the content while it is read, and may
// wait for a driver meanwhile: the budget's time is looked at between the files, and SystemSampler waits no longer than
// it may. Confined to one sampling.
#pragma once

#include "platform/Clock.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::hwstats {

class SystemReading {
public:
    static constexpr std::size_t kMostFiles = 2048;
    static constexpr std::chrono::milliseconds kMostTime{50};
    static constexpr std::size_t kMostFileBytes = 16'384;
    static constexpr std::size_t kMostNames = 1024;

    /// `root` is "" for this machine's own. Both outlive it.
    SystemReading(const std::string& root, const Clock& clock)
        : root_(root),
          clock_(clock),
          deadline_(clock.monotonicNow() + kMostTime) {}

    /// The text of a file without the spaces and line ends around it; none where there is no such file or the budget is
    /// spent.
    std::optional<std::string> read(const std::string& path);
    /// The number that is the whole text.
    std::optional<std::uint64_t> number(const std::string& path);
    /// The names in a folder that begin with `prefix`, "cpu2" before "cpu10".
    std::vector<std::string> list(const std::string& path, std::string_view prefix = {});
    /// The folders below a folder; links are none.
    std::vector<std::string> folders(const std::string& path);

    /// Whether something was not read because the budget was spent.
    bool spent() const { return spent_; }

private:
    std::vector<std::string> names(const std::string& path, std::string_view prefix, bool foldersOnly);
    bool spend();

    const std::string& root_;
    const Clock& clock_;
    const MonotonicTime deadline_;
    std::size_t files_ = 0;
    bool spent_ = false;
};

/// "folder/name".
inline std::string below(std::string_view folder, std::string_view name) {
    std::string path(folder);
    path.append("/").append(name);
    return path;
}

/// The number that is the whole of `text`.
std::optional<std::uint64_t> numberOf(std::string_view text);

/// `text` without the spaces and line ends around it.
std::string_view trimmed(std::string_view text);

} // namespace vela::platform::hwstats
