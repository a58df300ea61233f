// "did you mean ...?" for names that no setting has. Pure functions.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace vela {

/// How many characters must be put in, taken out or replaced to turn one text into the other, capital letters aside.
/// Only the first 64 bytes count.
std::size_t editDistance(std::string_view left, std::string_view right);

/// `; did you mean log.level?`, or nothing when no setting is near. The same key in another section is near.
std::string settingSuggestion(std::string_view section, std::string_view key);

/// As `settingSuggestion`, for a section.
std::string sectionSuggestion(std::string_view section);

/// A name from outside, made fit for one line of a message: control characters escaped, cut after 80 bytes.
std::string displayedName(std::string_view name);

} // namespace vela
