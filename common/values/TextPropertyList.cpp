#include "common/values/TextPropertyList.h"

#include "common/values/TextPlace.h"
#include "common/values/TextPropertyListScanner.h"

#include <optional>
#include <unordered_set>
#include <utility>

namespace vela {

namespace {

/// One value from one text. A reading function that fails answers none or false and has set the scanner's error.
class Reader {
public:
    Reader(std::string_view text, const TextPropertyListLimits& limits) : scanner_(text), limits_(limits) {}

    Value readTop();

    const detail::TextPropertyListScanner& scanner() const { return scanner_; }

private:
    struct Entries {
        DictionaryBuilder builder;
        std::unordered_set<const detail::KeyObject*> keys;
    };

    Value readStringsFile(const std::string& firstKey, std::size_t firstKeyAt);
    Value readValue();
    Value readContainer();
    Value readDictionary();
    Value readArray();
    bool readEntry(Entries& entries);
    bool readRestOfEntry(Entries& entries, const std::string& key, std::size_t keyAt);
    Value stringValue(const std::optional<std::string>& string);

    bool countValue();
    bool enter();

    detail::TextPropertyListScanner scanner_;
    TextPropertyListLimits limits_;
    std::size_t depth_ = 0;
    std::size_t values_ = 0;
};

/// The whole text: one value, or the entries of a strings file.
Value Reader::readTop() {
    if (!scanner_.skipSpace()) {
        return {};
    }
    if (scanner_.atEnd()) {
        scanner_.failHere("there is no value");
        return {};
    }
    const std::size_t start = scanner_.position();
    Value value;
    if (scanner_.atString()) {
        const auto string = scanner_.readString();
        if (!string || !scanner_.skipSpace()) {
            return {};
        }
        if (scanner_.at('=') || scanner_.at(';')) {
            return readStringsFile(*string, start);
        }
        value = stringValue(string);
    } else {
        value = readValue();
    }
    if (!value || !scanner_.skipSpace()) {
        return {};
    }
    if (!scanner_.atEnd()) {
        scanner_.failHere("there is something after the value");
        return {};
    }
    return value;
}

Value Reader::readStringsFile(const std::string& firstKey, std::size_t firstKeyAt) {
    Entries entries;
    if (!enter() || !countValue() || !readRestOfEntry(entries, firstKey, firstKeyAt) || !scanner_.skipSpace()) {
        return {};
    }
    while (!scanner_.atEnd()) {
        if (!readEntry(entries) || !scanner_.skipSpace()) {
            return {};
        }
    }
    return entries.builder.build();
}

/// The value that begins here, with no space before it.
Value Reader::readValue() {
    if (scanner_.at('{') || scanner_.at('(')) {
        return readContainer();
    }
    if (scanner_.at('<')) {
        const auto bytes = scanner_.readData();
        return bytes && countValue() ? Value(Data(*bytes)) : Value();
    }
    if (scanner_.atString()) {
        return stringValue(scanner_.readString());
    }
    scanner_.failExpecting("a value");
    return {};
}

Value Reader::readContainer() {
    if (!enter() || !countValue()) {
        return {};
    }
    const bool isDictionary = scanner_.at('{');
    scanner_.skip();
    Value container = isDictionary ? readDictionary() : readArray();
    --depth_;
    return container;
}

Value Reader::readDictionary() {
    Entries entries;
    while (scanner_.skipSpace()) {
        if (scanner_.at('}')) {
            scanner_.skip();
            return entries.builder.build();
        }
        if (!scanner_.atString()) {
            scanner_.failExpecting("a key or \"}\"");
            break;
        }
        if (!readEntry(entries)) {
            break;
        }
    }
    return {};
}

Value Reader::readArray() {
    ArrayBuilder builder;
    while (scanner_.skipSpace()) {
        if (scanner_.at(')')) {
            scanner_.skip();
            return builder.build();
        }
        Value value = readValue();
        if (!value || !scanner_.skipSpace()) {
            break;
        }
        builder.add(std::move(value));
        if (scanner_.at(',')) {
            scanner_.skip();
        } else if (!scanner_.at(')')) {
            scanner_.failExpecting("\",\" or \")\"");
            break;
        }
    }
    return {};
}

bool Reader::readEntry(Entries& entries) {
    if (!scanner_.atString()) {
        return scanner_.failExpecting("a key");
    }
    const std::size_t keyAt = scanner_.position();
    const auto key = scanner_.readString();
    return key && scanner_.skipSpace() && readRestOfEntry(entries, *key, keyAt);
}

/// What follows the key, through the ";".
bool Reader::readRestOfEntry(Entries& entries, const std::string& key, std::size_t keyAt) {
    const Key interned(key);
    if (!entries.keys.insert(interned.object()).second) {
        return scanner_.failAt(keyAt, "this key stands there already");
    }
    Value value;
    if (scanner_.at('=')) {
        scanner_.skip();
        value = scanner_.skipSpace() ? readValue() : Value();
    } else if (scanner_.at(';')) {
        value = stringValue(key);
    } else {
        return scanner_.failExpecting("\"=\" or \";\"");
    }
    if (!value || !scanner_.skipSpace()) {
        return false;
    }
    if (!scanner_.at(';')) {
        return scanner_.failExpecting("\";\"");
    }
    scanner_.skip();
    entries.builder.add(interned, std::move(value));
    return true;
}

Value Reader::stringValue(const std::optional<std::string>& string) {
    return string && countValue() ? Value(std::string_view(*string)) : Value();
}

bool Reader::countValue() {
    if (++values_ > limits_.values) {
        return scanner_.failHere("there are too many values, the limit \"values\" is " +
                                 std::to_string(limits_.values));
    }
    return true;
}

bool Reader::enter() {
    if (++depth_ > limits_.depth) {
        return scanner_.failHere("the containers stand too deep, the limit \"depth\" is " +
                                 std::to_string(limits_.depth));
    }
    return true;
}

TextPropertyListError errorAt(std::string_view text, std::size_t offset, std::string reason) {
    const TextPlace place = textPlaceAt(text, offset);
    return {place.line, place.column, std::move(reason)};
}

} // namespace

std::variant<Value, TextPropertyListError> readTextPropertyList(std::string_view text,
                                                                const TextPropertyListLimits& limits) {
    constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
    if (text.size() > limits.bytes) {
        return errorAt(text, 0,
                       "the text has " + std::to_string(text.size()) + " bytes, the limit \"bytes\" is " +
                           std::to_string(limits.bytes));
    }
    if (text.starts_with("\xFF\xFE") || text.starts_with("\xFE\xFF")) {
        return errorAt(text, 0, "the text is UTF-16, only UTF-8 is taken");
    }
    if (const auto offset = firstInvalidUtf8(text)) {
        return errorAt(text, *offset, "this is not UTF-8");
    }
    if (text.starts_with(kByteOrderMark)) {
        text.remove_prefix(kByteOrderMark.size());
    }
    Reader reader(text, limits);
    if (Value value = reader.readTop()) {
        return value;
    }
    return errorAt(text, reader.scanner().errorOffset(), reader.scanner().errorReason());
}

} // namespace vela
