#include "platform/plist/XmlReader.h"

#include "common/values/Dictionary.h"
#include "common/values/TextPlace.h"
#include "platform/plist/LimitTexts.h"
#include "platform/plist/Scalars.h"
#include "platform/plist/XmlScanner.h"

#include <optional>
#include <unordered_set>
#include <utility>

namespace vela::platform::plist {

namespace {

/// A reading function that fails answers none or false and has set the scanner's error.
class Reader {
public:
    Reader(std::string_view text, const PropertyListLimits& limits) : scanner_(text), limits_(limits) {}

    Value readDocument();

    const XmlScanner& scanner() const { return scanner_; }

private:
    Value readValue(const XmlTag& tag);
    Value readContainer(const XmlTag& tag);
    Value readDictionary(const XmlTag& tag);
    Value readArray(const XmlTag& tag);
    Value readLeaf(const XmlTag& tag);
    Value readTruth(const XmlTag& tag, bool truth);
    std::optional<Key> readKey(const XmlTag& tag, std::unordered_set<const detail::KeyObject*>& keys);

    std::optional<XmlTag> nextTag();
    std::optional<std::string> contentOf(const XmlTag& tag);
    Value failAt(std::size_t offset, std::string reason) {
        scanner_.failAt(offset, std::move(reason));
        return {};
    }

    XmlScanner scanner_;
    PropertyListLimits limits_;
    std::size_t depth_ = 0;
    std::size_t values_ = 0;
};

bool closes(const XmlTag& tag, const XmlTag& open) { return tag.kind == XmlTag::Kind::Close && tag.name == open.name; }

Value Reader::readDocument() {
    if (!scanner_.skipProlog()) {
        return {};
    }
    const auto root = scanner_.readTag();
    if (!root) {
        return {};
    }
    if (root->name != "plist" || root->kind == XmlTag::Kind::Close) {
        return failAt(root->at, "the root is not <plist>");
    }
    const auto first = root->kind == XmlTag::Kind::Empty ? root : nextTag();
    if (!first) {
        return {};
    }
    if (root->kind == XmlTag::Kind::Empty || closes(*first, *root)) {
        return failAt(first->at, "there is no value");
    }
    Value value = readValue(*first);
    const auto end = value ? nextTag() : std::nullopt;
    if (!end) {
        return {};
    }
    if (!closes(*end, *root)) {
        return failAt(end->at, "</plist> is expected here, a property list is one value");
    }
    if (!scanner_.skipSpace()) {
        return {};
    }
    return scanner_.atEnd() ? value : failAt(scanner_.position(), "there is something after </plist>");
}

/// The value whose start tag was just read.
Value Reader::readValue(const XmlTag& tag) {
    if (tag.kind == XmlTag::Kind::Close) {
        return failAt(tag.at, "a value is expected here");
    }
    if (++values_ > limits_.values) {
        return failAt(tag.at, tooManyValues(limits_.values));
    }
    if (tag.name == "dict" || tag.name == "array") {
        return readContainer(tag);
    }
    if (tag.name == "true" || tag.name == "false") {
        return readTruth(tag, tag.name == "true");
    }
    return readLeaf(tag);
}

Value Reader::readContainer(const XmlTag& tag) {
    if (++depth_ > limits_.depth) {
        return failAt(tag.at, tooDeep(limits_.depth));
    }
    Value value;
    if (tag.kind == XmlTag::Kind::Empty) {
        value = tag.name == "dict" ? Value(Dictionary()) : Value(Array());
    } else {
        value = tag.name == "dict" ? readDictionary(tag) : readArray(tag);
    }
    --depth_;
    return value;
}

Value Reader::readDictionary(const XmlTag& tag) {
    DictionaryBuilder builder;
    std::unordered_set<const detail::KeyObject*> keys;
    while (const auto next = nextTag()) {
        if (closes(*next, tag)) {
            return builder.build();
        }
        const auto key = readKey(*next, keys);
        const auto valueTag = key ? nextTag() : std::nullopt;
        if (!valueTag) {
            break;
        }
        if (closes(*valueTag, tag)) {
            return failAt(valueTag->at, "the last key has no value");
        }
        Value value = readValue(*valueTag);
        if (!value) {
            break;
        }
        builder.add(*key, std::move(value));
    }
    return {};
}

std::optional<Key> Reader::readKey(const XmlTag& tag, std::unordered_set<const detail::KeyObject*>& keys) {
    if (tag.name != "key" || tag.kind == XmlTag::Kind::Close) {
        failAt(tag.at, "<key> or </dict> is expected here");
        return std::nullopt;
    }
    const auto text = contentOf(tag);
    if (!text) {
        return std::nullopt;
    }
    Key key(*text);
    if (!keys.insert(key.object()).second) {
        failAt(tag.at, "this key stands there already");
        return std::nullopt;
    }
    return key;
}

Value Reader::readArray(const XmlTag& tag) {
    ArrayBuilder builder;
    while (const auto next = nextTag()) {
        if (closes(*next, tag)) {
            return builder.build();
        }
        Value value = readValue(*next);
        if (!value) {
            break;
        }
        builder.add(std::move(value));
    }
    return {};
}

Value Reader::readTruth(const XmlTag& tag, bool truth) {
    if (tag.kind == XmlTag::Kind::Open) {
        const auto end = scanner_.readTag();
        if (!end) {
            return {};
        }
        if (!closes(*end, tag)) {
            return failAt(end->at, "a truth value holds nothing");
        }
    }
    return truth;
}

Value Reader::readLeaf(const XmlTag& tag) {
    if (tag.name == "key") {
        return failAt(tag.at, "<key> stands in dictionaries only, before its value");
    }
    if (tag.name != "string" && tag.name != "integer" && tag.name != "real" && tag.name != "date" &&
        tag.name != "data") {
        return failAt(tag.at, "this element is unknown in property lists");
    }
    const auto text = contentOf(tag);
    if (!text) {
        return {};
    }
    if (tag.name == "string") {
        return std::string_view(*text);
    }
    if (tag.name == "integer") {
        const auto integer = parseInteger(*text);
        return integer ? *integer : failAt(tag.at, "this is no integer of 64 bits");
    }
    if (tag.name == "real") {
        const auto real = parseReal(*text);
        return real ? Value(*real) : failAt(tag.at, "this is no real number within range");
    }
    if (tag.name == "date") {
        const auto date = parseDate(*text);
        return date ? Value(*date) : failAt(tag.at, "this is no date of the form 2026-11-21T02:43:25Z");
    }
    const auto bytes = parseBase64(*text);
    return bytes ? Value(Data(*bytes)) : failAt(tag.at, "this is no base64");
}

/// The tag after white space and comments.
std::optional<XmlTag> Reader::nextTag() {
    if (!scanner_.skipSpace()) {
        return std::nullopt;
    }
    return scanner_.readTag();
}

std::optional<std::string> Reader::contentOf(const XmlTag& tag) {
    return tag.kind == XmlTag::Kind::Empty ? std::string() : scanner_.readText(tag);
}

Failure failureAt(std::string_view text, std::size_t offset, const std::string& reason) {
    const TextPlace place = textPlaceAt(text, offset);
    return {0, "property list: line " + std::to_string(place.line) + ", column " + std::to_string(place.column) + ": " +
                   reason};
}

} // namespace

Result<Value> readXml(std::string_view text, const PropertyListLimits& limits) {
    constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
    if (text.size() > limits.bytes) {
        return failureAt(text, 0, tooManyBytes(text.size(), limits.bytes));
    }
    if (const auto offset = firstNonXml(text)) {
        return failureAt(text, *offset, "this is not UTF-8 or a character that XML forbids");
    }
    if (text.starts_with(kByteOrderMark)) {
        text.remove_prefix(kByteOrderMark.size());
    }
    Reader reader(text, limits);
    if (Value value = reader.readDocument()) {
        return value;
    }
    return failureAt(text, reader.scanner().errorOffset(), reader.scanner().errorReason());
}

} // namespace vela::platform::plist
