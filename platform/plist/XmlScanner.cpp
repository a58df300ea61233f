#include "platform/plist/XmlScanner.h"

#include "common/values/Utf8.h"

#include <algorithm>
#include <charconv>
#include <utility>

namespace vela::platform::plist {

namespace {

constexpr std::string_view kSpaces = " \t\r\n";
constexpr std::size_t kShownNameBytes = 40;

bool isNameCharacter(char character) {
    return (character >= 'A' && character <= 'Z') || (character >= 'a' && character <= 'z') ||
           (character >= '0' && character <= '9') || std::string_view("_:.-").find(character) != std::string_view::npos;
}

/// Of what XML lets a public identifier consist.
bool isPublicIdentifier(std::string_view text) {
    return text.find_first_not_of(
               "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789 \r\n-'()+,./:=?;!*#@$_%") ==
           std::string_view::npos;
}

bool isXmlCharacter(char32_t codePoint) {
    return codePoint == '\t' || codePoint == '\n' || codePoint == '\r' || (codePoint >= 0x20 && codePoint < 0xD800) ||
           (codePoint >= 0xE000 && codePoint < 0xFFFE) || (codePoint >= 0x10000 && codePoint <= 0x10FFFF);
}

/// Appends literal text, whose line ends XML reads as "\n" whatever they are.
void appendLiteral(std::string& text, std::string_view literal) {
    for (std::size_t index = 0; index < literal.size(); ++index) {
        if (literal[index] != '\r') {
            text += literal[index];
        } else if (index + 1 == literal.size() || literal[index + 1] != '\n') {
            text += '\n';
        }
    }
}

bool isUtf8Name(std::string_view encoding) {
    constexpr std::string_view kName = "utf-8";
    return std::equal(encoding.begin(), encoding.end(), kName.begin(), kName.end(), [](char left, char right) {
        return left == right || (right >= 'a' && left == static_cast<char>(right - 'a' + 'A'));
    });
}

std::string shown(std::string_view name) { return "<" + std::string(name.substr(0, kShownNameBytes)) + ">"; }

/// The code point that "#233" or "#xE9" names.
std::optional<char32_t> numericReference(std::string_view reference) {
    const bool hexadecimal = reference.starts_with("#x");
    const std::string_view digits = reference.substr(hexadecimal ? 2 : 1);
    std::uint32_t number = 0;
    const char* const end = digits.data() + digits.size();
    const auto [stop, error] = std::from_chars(digits.data(), end, number, hexadecimal ? 16 : 10);
    if (error != std::errc() || stop != end || !isXmlCharacter(number)) {
        return std::nullopt;
    }
    return number;
}

std::optional<char32_t> namedReference(std::string_view name) {
    struct Named {
        std::string_view name;
        char character;
    };
    constexpr Named kNamed[] = {{"lt", '<'}, {"gt", '>'}, {"amp", '&'}, {"quot", '"'}, {"apos", '\''}};
    for (const Named& named : kNamed) {
        if (named.name == name) {
            return static_cast<char32_t>(named.character);
        }
    }
    return std::nullopt;
}

} // namespace

std::optional<std::size_t> firstNonXml(std::string_view text) {
    std::size_t offset = 0;
    while (offset < text.size()) {
        const Utf8Step step = utf8Step(text.substr(offset));
        if (!step.valid || !isXmlCharacter(step.codePoint)) {
            return offset;
        }
        offset += step.bytes;
    }
    return std::nullopt;
}

bool XmlScanner::skipProlog() {
    if (startsWith("<?xml") && !skipDeclaration()) {
        return false;
    }
    if (!skipSpace()) {
        return false;
    }
    return !startsWith("<!DOCTYPE") || (skipDocumentType() && skipSpace());
}

bool XmlScanner::skipDeclaration() {
    take("<?xml");
    const auto version = takePseudoAttribute("version");
    if (!version || *version != "1.0") {
        return failHere("the XML declaration must say version=\"1.0\" first");
    }
    if (const auto encoding = takePseudoAttribute("encoding"); encoding && !isUtf8Name(*encoding)) {
        return failHere("the encoding is not UTF-8");
    }
    if (const auto standalone = takePseudoAttribute("standalone");
        standalone && *standalone != "yes" && *standalone != "no") {
        return failHere("standalone is \"yes\" or \"no\"");
    }
    takeSpaces();
    return take("?>") || failHere("the XML declaration is malformed");
}

bool XmlScanner::skipDocumentType() {
    take("<!DOCTYPE");
    if (!takeSpaces() || takeName() != "plist") {
        return failHere("the document type is not plist");
    }
    if (takeSpaces() && (startsWith("PUBLIC") || startsWith("SYSTEM"))) {
        if (!skipExternalIdentifier()) {
            return failHere("the document type is malformed");
        }
        takeSpaces();
    }
    if (startsWith("[")) {
        return failHere("a document type with declarations of its own is not taken");
    }
    return take(">") || failHere("the document type is malformed");
}

/// `PUBLIC "name" "address"` or `SYSTEM "address"`, which nobody looks up.
bool XmlScanner::skipExternalIdentifier() {
    if (take("PUBLIC")) {
        const auto name = takeSpaces() ? takeQuoted() : std::nullopt;
        if (!name || !isPublicIdentifier(*name)) {
            return false;
        }
    } else {
        take("SYSTEM");
    }
    return takeSpaces() && takeQuoted();
}

bool XmlScanner::skipSpace() {
    takeSpaces();
    while (startsWith("<!--")) {
        if (!skipComment()) {
            return false;
        }
        takeSpaces();
    }
    return true;
}

bool XmlScanner::skipComment() {
    const std::size_t end = text_.find("--", position_ + 4);
    if (end == std::string_view::npos) {
        return failHere("this comment has no end");
    }
    if (!text_.substr(end).starts_with("-->")) {
        return failAt(end, "\"--\" must not stand inside a comment");
    }
    position_ = end + 3;
    return true;
}

std::optional<XmlTag> XmlScanner::readTag() {
    XmlTag tag{XmlTag::Kind::Open, {}, position_};
    if (!take("<")) {
        failHere(atEnd() ? "the text ends where a tag is expected" : "a tag is expected here");
        return std::nullopt;
    }
    if (take("/")) {
        tag.kind = XmlTag::Kind::Close;
    }
    tag.name = takeName();
    if (tag.name.empty()) {
        failAt(tag.at, startsWith("?") ? "processing instructions are not taken" : "this is no tag of a property list");
        return std::nullopt;
    }
    if (tag.kind != XmlTag::Kind::Close && !readAttributes(tag)) {
        return std::nullopt;
    }
    takeSpaces();
    if (tag.kind == XmlTag::Kind::Open && take("/")) {
        tag.kind = XmlTag::Kind::Empty;
    }
    if (!take(">")) {
        failAt(tag.at, "the tag " + shown(tag.name) + " is malformed");
        return std::nullopt;
    }
    return tag;
}

/// A plist may say its version; everything else has no attributes.
bool XmlScanner::readAttributes(const XmlTag& tag) {
    const std::size_t start = position_;
    if (!takeSpaces() || takeName().empty()) {
        position_ = start;
        return true;
    }
    position_ = start;
    const auto version = tag.name == "plist" ? takePseudoAttribute("version") : std::nullopt;
    if (!version) {
        return failAt(start, shown(tag.name) + " does not take this attribute");
    }
    return *version == "1.0" || failAt(start, "the version is not 1.0");
}

std::optional<std::string> XmlScanner::readText(const XmlTag& tag) {
    std::string text;
    while (!atEnd()) {
        if (startsWith("</")) {
            const auto end = readTag();
            if (!end) {
                return std::nullopt;
            }
            if (end->name != tag.name) {
                failAt(end->at, shown(tag.name) + " must be closed first");
                return std::nullopt;
            }
            return text;
        }
        if (!readCharacterData(text)) {
            return std::nullopt;
        }
    }
    failAt(tag.at, shown(tag.name) + " has no end");
    return std::nullopt;
}

/// A stretch of plain text, a reference, a CDATA section or a comment.
bool XmlScanner::readCharacterData(std::string& text) {
    if (startsWith("&")) {
        return readReference(text);
    }
    if (startsWith("<!--")) {
        return skipComment();
    }
    if (startsWith("<![CDATA[")) {
        return readCdata(text);
    }
    if (startsWith("<")) {
        return failHere("only text may stand here");
    }
    const std::size_t end = std::min(text_.find_first_of("<&", position_), text_.size());
    const std::string_view literal = text_.substr(position_, end - position_);
    if (const std::size_t bad = literal.find("]]>"); bad != std::string_view::npos) {
        return failAt(position_ + bad, "\"]]>\" must not stand in text");
    }
    appendLiteral(text, literal);
    position_ = end;
    return true;
}

bool XmlScanner::readReference(std::string& text) {
    constexpr std::size_t kLongest = 64; // leading zeros may make a numeric one long; nobody writes so many
    const std::size_t end = text_.substr(position_, kLongest).find(';');
    if (end == std::string_view::npos) {
        return failHere("\"&\" begins a reference, and this one has no end");
    }
    const std::string_view reference = text_.substr(position_ + 1, end - 1);
    const auto character = reference.starts_with('#') ? numericReference(reference) : namedReference(reference);
    if (!character) {
        return failHere("this reference names no character");
    }
    appendUtf8(text, *character);
    position_ += end + 1;
    return true;
}

bool XmlScanner::readCdata(std::string& text) {
    constexpr std::string_view kStart = "<![CDATA[";
    const std::size_t start = position_ + kStart.size();
    const std::size_t end = text_.find("]]>", start);
    if (end == std::string_view::npos) {
        return failHere("this CDATA section has no end");
    }
    appendLiteral(text, text_.substr(start, end - start));
    position_ = end + 3;
    return true;
}

bool XmlScanner::failAt(std::size_t offset, std::string reason) {
    errorOffset_ = offset;
    errorReason_ = std::move(reason);
    return false;
}

bool XmlScanner::take(std::string_view expected) {
    if (!startsWith(expected)) {
        return false;
    }
    position_ += expected.size();
    return true;
}

/// Whether there were any.
bool XmlScanner::takeSpaces() {
    const std::size_t start = position_;
    position_ = std::min(text_.find_first_not_of(kSpaces, position_), text_.size());
    return position_ != start;
}

std::string_view XmlScanner::takeName() {
    const std::size_t start = position_;
    while (!atEnd() && isNameCharacter(text_[position_])) {
        ++position_;
    }
    return text_.substr(start, position_ - start);
}

std::optional<std::string_view> XmlScanner::takeQuoted() {
    if (!startsWith("\"") && !startsWith("'")) {
        return std::nullopt;
    }
    const std::size_t end = text_.find(text_[position_], position_ + 1);
    if (end == std::string_view::npos) {
        return std::nullopt;
    }
    const std::string_view content = text_.substr(position_ + 1, end - position_ - 1);
    position_ = end + 1;
    return content;
}

/// White space and ` name="..."`, or nothing taken.
std::optional<std::string_view> XmlScanner::takePseudoAttribute(std::string_view name) {
    const std::size_t start = position_;
    if (takeSpaces() && takeName() == name) {
        takeSpaces();
        if (take("=")) {
            takeSpaces();
            if (const auto content = takeQuoted()) {
                return content;
            }
        }
    }
    position_ = start;
    return std::nullopt;
}

} // namespace vela::platform::plist
