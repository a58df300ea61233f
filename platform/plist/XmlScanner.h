// Tags and texts of XML property lists, as XML 1.0 has them and no more than a property list needs: no internal subset,
// entities other than XML's own five, processing instructions or attributes but <plist version="">. Nothing outside the
// text is ever read. Confined to one reader; the text outlives it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vela::platform::plist {

/// Where `text` holds what XML must not: bytes that are not UTF-8, control characters, U+FFFE, U+FFFF.
std::optional<std::size_t> firstNonXml(std::string_view text);

struct XmlTag {
    enum class Kind : std::uint8_t { Open, Close, Empty };
    Kind kind;
    std::string_view name;
    std::size_t at; ///< offset of its "<"
};

/// One pass over one text without forbidden characters (`firstNonXml`). An operation that fails answers none or false
/// and has set the error.
class XmlScanner {
public:
    explicit XmlScanner(std::string_view text) : text_(text) {}

    bool atEnd() const { return position_ == text_.size(); }
    std::size_t position() const { return position_; }

    /// Goes past the declaration and the document type, to the root's tag.
    bool skipProlog();
    /// Goes past white space and comments.
    bool skipSpace();
    /// The tag that must stand here.
    std::optional<XmlTag> readTag();
    /// The text up to the end tag of `tag`, which it goes past: entities and CDATA resolved, comments left out, line
    /// ends turned into "\n".
    std::optional<std::string> readText(const XmlTag& tag);

    bool failAt(std::size_t offset, std::string reason);
    bool failHere(std::string reason) { return failAt(position_, std::move(reason)); }
    std::size_t errorOffset() const { return errorOffset_; }
    const std::string& errorReason() const { return errorReason_; }

private:
    bool startsWith(std::string_view start) const { return text_.substr(position_).starts_with(start); }
    bool take(std::string_view expected);
    bool takeSpaces();
    std::string_view takeName();
    std::optional<std::string_view> takeQuoted();
    std::optional<std::string_view> takePseudoAttribute(std::string_view name);

    bool skipDeclaration();
    bool skipDocumentType();
    bool skipExternalIdentifier();
    bool skipComment();
    bool readAttributes(const XmlTag& tag);
    bool readCharacterData(std::string& text);
    bool readReference(std::string& text);
    bool readCdata(std::string& text);

    std::string_view text_;
    std::size_t position_ = 0;
    std::size_t errorOffset_ = 0;
    std::string errorReason_;
};

} // namespace vela::platform::plist
