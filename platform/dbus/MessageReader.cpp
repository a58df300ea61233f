// The arguments.
#include "platform/dbus/MessageReader.h"

#include <cassert>
#include <utility>

namespace vela::platform::dbus {

namespace {

/// Whether the contract's table of values has this complete type.
bool isSupported(std::string_view type) {
    if (type.size() == 1) {
        return type.front() != 'h' && type.front() != 'v';
    }
    if (type.front() != 'a') {
        return type == "(sd)";
    }
    const std::string_view element = type.substr(1);
    return element == "v" || element == "{sv}" || isSupported(element);
}

} // namespace

std::vector<std::int64_t> BodyReader::int64s() {
    std::vector<std::int64_t> numbers;
    const std::size_t end = wire_.beginArray(8);
    if (wire_.failed()) {
        return numbers;
    }
    numbers.reserve((end - wire_.position()) / sizeof(std::int64_t));
    while (wire_.position() < end) {
        numbers.push_back(wire_.number<std::int64_t>());
    }
    wire_.endArray(end);
    return numbers;
}

std::optional<std::vector<std::int64_t>> BodyReader::optionalInt64s() {
    std::optional<std::vector<std::int64_t>> list;
    const std::size_t end = wire_.beginArray(4);
    while (wire_.position() < end) {
        if (list) {
            wire_.fail(kInvalidArgsError, "the list of reporter IDs, \"aax\", has more than one element");
            return std::nullopt;
        }
        list = int64s();
    }
    wire_.endArray(end);
    return list;
}

bool BodyReader::enter() {
    if (nesting_ >= depth_) {
        wire_.fail(kLimitsExceededError,
                   "limits.value_depth is " + std::to_string(depth_) + ": a value is nested more deeply");
        return false;
    }
    ++nesting_;
    return true;
}

Dictionary BodyReader::dictionary() {
    if (!enter()) {
        return {};
    }
    DictionaryBuilder builder;
    const std::size_t end = wire_.beginArray(8);
    while (wire_.position() < end) {
        entry(builder);
    }
    wire_.endArray(end);
    --nesting_;
    return wire_.failed() ? Dictionary() : builder.build();
}

Array BodyReader::dictionaries() {
    ArrayBuilder builder;
    const std::size_t end = wire_.beginArray(4);
    while (wire_.position() < end) {
        builder.add(dictionary());
    }
    wire_.endArray(end);
    return wire_.failed() ? Array() : builder.build();
}

void BodyReader::entry(DictionaryBuilder& builder) {
    wire_.align(8);
    const std::string_view key = wire_.string();
    const std::string_view outer = std::exchange(key_, key);
    Value value = variant();
    key_ = outer;
    if (!wire_.failed()) {
        builder.add(key, std::move(value));
    }
}

Value BodyReader::variant() {
    const std::string_view type = wire_.variantSignature();
    if (type.size() == 1 && type.front() != 'h' && type.front() != 'v') [[likely]] {
        return valueOf(type.front());
    }
    if (wire_.failed()) {
        return {};
    }
    return isSupported(type) ? value(type) : unsupported(type);
}

Value BodyReader::unsupported(std::string_view type) {
    wire_.fail(kInvalidArgsError, "the value of " + quoted(key_) + " is of the type " + quoted(type) +
                                      ", which no property-list value has");
    return {};
}

Value BodyReader::value(std::string_view type) {
    if (type.size() == 1) {
        return type.front() == 'v' ? variant() : valueOf(type.front());
    }
    return type.front() == 'a' ? array(type.substr(1)) : date();
}

Value BodyReader::valueOf(char code) {
    switch (code) {
    case 'b':
        return wire_.boolean();
    case 'y':
        return wire_.byte();
    case 'n':
        return wire_.number<std::int16_t>();
    case 'q':
        return wire_.number<std::uint16_t>();
    case 'i':
        return wire_.number<std::int32_t>();
    case 'u':
        return wire_.number<std::uint32_t>();
    case 'x':
        return wire_.number<std::int64_t>();
    case 't':
        return wire_.number<std::uint64_t>();
    case 'd':
        return wire_.number<double>();
    case 's':
        return wire_.string();
    case 'o':
        return wire_.objectPath();
    default:
        assert(code == 'g');
        return wire_.signature();
    }
}

Value BodyReader::date() {
    wire_.align(8);
    const std::string_view text = wire_.string();
    const auto seconds = wire_.number<double>();
    if (text != kDateText && !wire_.failed()) {
        wire_.fail(kInvalidArgsError, "the value of " + quoted(key_) + " is a struct that begins with " + quoted(text) +
                                          " where a date begins with \"date\"");
    }
    return Date{seconds};
}

Value BodyReader::array(std::string_view elementType) {
    if (elementType == "y") {
        return Data(wire_.array(1));
    }
    if (elementType == "{sv}") {
        return dictionary();
    }
    if (!enter()) {
        return {};
    }
    ArrayBuilder builder;
    const std::size_t end = wire_.beginArray(alignmentOf(elementType.front()));
    while (wire_.position() < end) {
        Value element = value(elementType);
        if (wire_.failed()) {
            return {};
        }
        builder.add(std::move(element));
    }
    wire_.endArray(end);
    --nesting_;
    return wire_.failed() ? Value() : Value(builder.build());
}

void BodyReader::finish() {
    if (!wire_.failed() && wire_.remaining() != 0) {
        wire_.failMalformed("a body is longer than its signature says");
    }
}

} // namespace vela::platform::dbus
