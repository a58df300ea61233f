#include "platform/plist/BinaryReader.h"

#include "common/values/Dictionary.h"
#include "common/values/Utf8.h"
#include "platform/plist/BinaryLayout.h"
#include "platform/plist/LimitTexts.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <unordered_set>
#include <utility>
#include <vector>

namespace vela::platform::plist {

namespace {

constexpr double kEpochSeconds = 978307200; // of 2001-01-01 after 1970-01-01

/// What one object became. Containers stay New until something refers to them.
struct Built {
    enum class State : std::uint8_t { New, Building, Done };
    State state = State::New;
    Value value;
    std::size_t values = 1; ///< in it and itself, shared ones as often as they are used
    std::size_t bytes = 0;  ///< of its strings, keys and data, counted likewise
    std::size_t height = 0; ///< containers inside each other
};

/// A building function that fails answers none or false and has set the error.
class Reader {
public:
    Reader(std::string_view bytes, const BinaryLayout& layout, const PropertyListLimits& limits)
        : bytes_(bytes),
          layout_(layout),
          limits_(limits),
          built_(layout.objects().size()) {}

    Value read();

    std::size_t errorOffset() const { return errorOffset_; }
    const std::string& errorReason() const { return errorReason_; }

private:
    bool buildLeaf(std::size_t index);
    Value leafOf(const BinaryObject& object);
    Value integerOf(const BinaryObject& object);
    Value realOf(const BinaryObject& object);
    Value dateOf(const BinaryObject& object);
    Value asciiOf(const BinaryObject& object);
    Value utf16Of(const BinaryObject& object);

    const Built* build(std::size_t index, std::size_t depth);
    bool buildContainer(Built& built, const BinaryObject& object, std::size_t depth);
    Value arrayOf(Built& built, const BinaryObject& object, std::size_t depth);
    Value dictionaryOf(Built& built, const BinaryObject& object, std::size_t depth);
    bool charge(Built& container, const Built& part, const BinaryObject& object);

    std::string_view contentOf(const BinaryObject& object) const {
        return bytes_.substr(object.content, object.end - object.content);
    }
    Value failAt(const BinaryObject& object, std::string reason) {
        errorOffset_ = object.at;
        errorReason_ = std::move(reason);
        return {};
    }

    std::string_view bytes_;
    const BinaryLayout& layout_;
    PropertyListLimits limits_;
    std::vector<Built> built_;
    std::size_t errorOffset_ = 0;
    std::string errorReason_;
};

bool isContainer(const BinaryObject& object) {
    return object.kind == BinaryKind::Array || object.kind == BinaryKind::Dictionary;
}

Value Reader::read() {
    for (std::size_t index = 0; index < built_.size(); ++index) {
        if (!isContainer(layout_.objects()[index]) && !buildLeaf(index)) {
            return {};
        }
    }
    const BinaryObject& top = layout_.objects()[layout_.top()];
    Built whole{Built::State::Building, {}, 0, 0, 0};
    const Built* const built = build(layout_.top(), 0);
    return built != nullptr && charge(whole, *built, top) ? built->value : Value();
}

bool Reader::buildLeaf(std::size_t index) {
    Built& built = built_[index];
    built.value = leafOf(layout_.objects()[index]);
    built.state = Built::State::Done;
    if (built.value.kind() == ValueKind::String) {
        built.bytes = built.value.ref().text().size();
    } else if (built.value.kind() == ValueKind::Data) {
        built.bytes = built.value.ref().bytes().size();
    }
    return static_cast<bool>(built.value);
}

Value Reader::leafOf(const BinaryObject& object) {
    switch (object.kind) {
    case BinaryKind::False:
        return false;
    case BinaryKind::True:
        return true;
    case BinaryKind::Integer:
        return integerOf(object);
    case BinaryKind::Real:
        return realOf(object);
    case BinaryKind::Date:
        return dateOf(object);
    case BinaryKind::Data:
        return Data(contentOf(object));
    case BinaryKind::Ascii:
        return asciiOf(object);
    case BinaryKind::Utf16:
        return utf16Of(object);
    case BinaryKind::Array:
    case BinaryKind::Dictionary:
        break;
    }
    return {};
}

Value Reader::integerOf(const BinaryObject& object) {
    if (object.count == 16) {
        if (bigEndian(bytes_, object.content, 8) != 0) {
            return failAt(object, "this integer of 16 bytes does not fit 64 bits");
        }
        return bigEndian(bytes_, object.content + 8, 8);
    }
    const std::uint64_t bits = bigEndian(bytes_, object.content, object.count);
    return static_cast<std::int64_t>(bits);
}

Value Reader::realOf(const BinaryObject& object) {
    const std::uint64_t bits = bigEndian(bytes_, object.content, object.count);
    if (object.count == sizeof(float)) {
        return std::bit_cast<float>(static_cast<std::uint32_t>(bits));
    }
    return std::bit_cast<double>(bits);
}

Value Reader::dateOf(const BinaryObject& object) {
    const auto seconds = std::bit_cast<double>(bigEndian(bytes_, object.content, object.count));
    return std::isfinite(seconds) ? Value(Date{seconds + kEpochSeconds}) : failAt(object, "this date is not a number");
}

Value Reader::asciiOf(const BinaryObject& object) {
    const std::string_view text = contentOf(object);
    return asciiPrefix(text) == text.size() ? Value(text) : failAt(object, "this string is not ASCII");
}

Value Reader::utf16Of(const BinaryObject& object) {
    std::string text;
    for (std::size_t at = object.content; at < object.end; at += 2) {
        auto unit = static_cast<char32_t>(bigEndian(bytes_, at, 2));
        if (unit >= 0xD800 && unit < 0xE000) {
            const auto low = at + 2 < object.end ? static_cast<char32_t>(bigEndian(bytes_, at + 2, 2)) : U'\0';
            if (unit >= 0xDC00 || low < 0xDC00 || low >= 0xE000) {
                return failAt(object, "this string is not UTF-16");
            }
            unit = 0x10000 + ((unit - 0xD800) << 10U) + (low - 0xDC00);
            at += 2;
        }
        appendUtf8(text, unit);
    }
    return std::string_view(text);
}

/// The object made, inside `depth` containers; null for a failure.
const Built* Reader::build(std::size_t index, std::size_t depth) {
    Built& built = built_[index];
    const BinaryObject& object = layout_.objects()[index];
    if (built.state == Built::State::Building) {
        failAt(object, "this container is inside itself");
        return nullptr;
    }
    const std::size_t height = built.state == Built::State::New ? 1 : built.height;
    if (height != 0 && depth + height > limits_.depth) {
        failAt(object, tooDeep(limits_.depth));
        return nullptr;
    }
    if (built.state == Built::State::New && !buildContainer(built, object, depth)) {
        return nullptr;
    }
    return &built;
}

bool Reader::buildContainer(Built& built, const BinaryObject& object, std::size_t depth) {
    built.state = Built::State::Building;
    built.height = 1;
    built.value = object.kind == BinaryKind::Array ? arrayOf(built, object, depth) : dictionaryOf(built, object, depth);
    built.state = Built::State::Done;
    return static_cast<bool>(built.value);
}

Value Reader::arrayOf(Built& built, const BinaryObject& object, std::size_t depth) {
    ArrayBuilder builder;
    for (std::size_t index = 0; index < object.count; ++index) {
        const Built* const element = build(layout_.reference(object, index), depth + 1);
        if (element == nullptr || !charge(built, *element, object)) {
            return {};
        }
        builder.add(element->value);
    }
    return builder.build();
}

Value Reader::dictionaryOf(Built& built, const BinaryObject& object, std::size_t depth) {
    DictionaryBuilder builder;
    std::unordered_set<const detail::KeyObject*> keys;
    for (std::size_t index = 0; index < object.count; ++index) {
        const std::size_t keyIndex = layout_.reference(object, index);
        const Built& keyObject = built_[keyIndex];
        if (keyObject.value.kind() != ValueKind::String) {
            return failAt(object, "a key of this dictionary is not a string");
        }
        const Key key(keyObject.value.ref().text());
        if (!keys.insert(key.object()).second) {
            return failAt(object, "a key of this dictionary stands there twice");
        }
        const Built* const value = build(layout_.reference(object, object.count + index), depth + 1);
        const Built keyCost{Built::State::Done, {}, 0, keyObject.bytes, 0};
        if (value == nullptr || !charge(built, keyCost, object) || !charge(built, *value, object)) {
            return {};
        }
        builder.add(key, value->value);
    }
    return builder.build();
}

/// Adds what `part` costs to its container, within the limits.
bool Reader::charge(Built& container, const Built& part, const BinaryObject& object) {
    container.values += part.values;
    container.bytes += part.bytes;
    container.height = std::max(container.height, part.height + 1);
    if (container.values > limits_.values) {
        failAt(object, tooManyValues(limits_.values));
        return false;
    }
    if (container.bytes / kExpandedBytesFactor > limits_.bytes) {
        failAt(object, "strings and data have more bytes together than " + std::to_string(kExpandedBytesFactor) +
                           " times the limit \"bytes\", which is " + std::to_string(limits_.bytes));
        return false;
    }
    return true;
}

Failure failureAt(std::size_t offset, const std::string& reason) {
    return {0, "property list: byte " + std::to_string(offset) + ": " + reason};
}

} // namespace

Result<Value> readBinary(std::string_view bytes, const PropertyListLimits& limits) {
    if (bytes.size() > limits.bytes) {
        return failureAt(0, tooManyBytes(bytes.size(), limits.bytes));
    }
    BinaryLayout layout(bytes);
    if (!layout.read()) {
        return failureAt(layout.errorOffset(), layout.errorReason());
    }
    Reader reader(bytes, layout, limits);
    if (Value value = reader.read()) {
        return value;
    }
    return failureAt(reader.errorOffset(), reader.errorReason());
}

} // namespace vela::platform::plist
