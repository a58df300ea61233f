#include "platform/linux/LinuxProcessInformation.h"

#include "platform/linux/FileDescriptor.h"

#include <charconv>
#include <fcntl.h>
#include <optional>
#include <string_view>
#include <system_error>

namespace vela::platform {

namespace {

/// Far above the longest line of a process: some 50 numbers of at most 20 digits.
constexpr std::size_t kLongestStat = 8 * 1024;

std::optional<std::string> contentOf(const std::string& path) {
    const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    std::string content;
    if (!file || !readToEnd(file, content, kLongestStat) || content.size() > kLongestStat) {
        return std::nullopt;
    }
    return content;
}

template <class Number>
bool parse(std::string_view field, Number& number) {
    const auto result = std::from_chars(field.data(), field.data() + field.size(), number);
    return result.ec == std::errc() && result.ptr == field.data() + field.size();
}

/// The field at the start of `fields`, taken off with the space before it; empty when there is none.
std::string_view takeField(std::string_view& fields) {
    if (!fields.starts_with(' ')) {
        return {};
    }
    fields.remove_prefix(1);
    const std::string_view field = fields.substr(0, fields.find(' '));
    fields.remove_prefix(field.size());
    return field;
}

/// A line of <pid>/stat, numbered as proc(5) does:
///
///     1     2               3      4           5 ... 21    22               23 ...
///     pid   (command name)  state  parent pid  ...         start in ticks   ...      \n
///
/// A command name may hold anything, ")" and line ends too; nothing behind it does.
std::optional<ProcessRecord> parseStat(std::string_view line) {
    const auto nameBegin = line.find('(');
    const auto nameEnd = line.rfind(')');
    if (!line.ends_with('\n') || nameBegin == std::string_view::npos || nameEnd == std::string_view::npos ||
        nameEnd < nameBegin) {
        return std::nullopt;
    }
    ProcessRecord record;
    record.commandName = line.substr(nameBegin + 1, nameEnd - nameBegin - 1);
    if (!line.substr(0, nameBegin).ends_with(' ') || !parse(line.substr(0, nameBegin - 1), record.pid)) {
        return std::nullopt;
    }
    std::string_view fields = line.substr(nameEnd + 1, line.size() - nameEnd - 2);
    std::string_view field;
    for (int number = 3; number <= 22; ++number) {
        field = takeField(fields);
        if (field.empty() || (number == 4 && !parse(field, record.parent))) {
            return std::nullopt;
        }
    }
    if (!parse(field, record.startTimeTicks)) {
        return std::nullopt;
    }
    return record;
}

} // namespace

std::int32_t LinuxProcessInformation::ownPid() const { return getpid(); }

std::string LinuxProcessInformation::ownName() const {
    std::string name = contentOf(root_ + "/self/comm").value_or("");
    if (name.ends_with('\n')) {
        name.pop_back();
    }
    return name;
}

bool LinuxProcessInformation::read(std::int32_t pid, ProcessRecord& record) const {
    if (pid < 1) {
        return false;
    }
    const std::optional<std::string> line = contentOf(root_ + "/" + std::to_string(pid) + "/stat");
    std::optional<ProcessRecord> found = line ? parseStat(*line) : std::nullopt;
    if (!found || found->pid != pid) {
        return false;
    }
    record = std::move(*found);
    return true;
}

} // namespace vela::platform
