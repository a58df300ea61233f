// Words of the old text form of property lists: strings, data, and the space and comments between them. Internal to
// this folder. Confined to one reader; the text outlives it.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace vela::detail {

/// One pass over one text, which is valid UTF-8. An operation that fails answers none or false and has set the error.
class TextPropertyListScanner {
public:
    explicit TextPropertyListScanner(std::string_view text) : text_(text) {}

    bool atEnd() const { return position_ == text_.size(); }
    bool at(char character) const { return !atEnd() && text_[position_] == character; }
    bool atString() const;
    std::size_t position() const { return position_; }

    /// Goes past one character.
    void skip() { ++position_; }
    /// Goes past white space and comments.
    bool skipSpace();
    /// The string that begins here.
    std::optional<std::string> readString();
    /// The bytes between the "<" that stands here and its ">".
    std::optional<std::string> readData();

    // The first failure, as an offset and a reason; all of them answer false.
    bool failAt(std::size_t offset, std::string reason);
    bool failHere(std::string reason) { return failAt(position_, std::move(reason)); }
    bool failExpecting(const std::string& what);
    std::size_t errorOffset() const { return errorOffset_; }
    const std::string& errorReason() const { return errorReason_; }

private:
    bool startsWith(std::string_view start) const { return text_.substr(position_).starts_with(start); }
    std::optional<std::string> readQuoted();
    bool readEscape(std::string& string);
    bool readOctal(std::string& string);
    bool readUnicode(std::string& string);
    std::optional<char32_t> readUnicodeUnit();

    std::string_view text_;
    std::size_t position_ = 0;
    std::size_t errorOffset_ = 0;
    std::string errorReason_;
};

} // namespace vela::detail
