// A look at TOML text before it is parsed, for what the parser cannot be given. Pure.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace vela::platform {

/// Why a text is not parsed, and the line that is to blame.
struct TomlRefusal {
    int line = 0; ///< from 1
    std::string reason;
};

/// Answers the first thing that is refused, or none:
/// - more than 16 dots in a line, outside texts and comments. Every dot of a name ("a.b.c") nests one table more,
///   which the parser does not bound and which is destroyed by recursion.
/// - more than 20,000 lines: the parser compares each name with the others.
/// - anything beyond ASCII outside texts and comments, which no TOML has: the parser's behaviour on it is undefined.
/// - a quotation mark inside a word (`2026-01"`), which no TOML has either, for the same reason.
/// - texts over several lines (three quotation marks), for that reason too, and because no setting has use for them.
std::optional<TomlRefusal> findTomlRefusal(std::string_view text);

} // namespace vela::platform
