#include "cli/JsonReading.h"

#include "common/SettingValues.h"
#include "common/values/Dictionary.h"

#include <cstdint>
#include <nlohmann/json.hpp>
#include <optional>
#include <string>
#include <vector>

namespace vela {

namespace {

constexpr std::string_view kDataKey = "$data";
constexpr std::string_view kDateKey = "$date";

std::optional<int> base64Digit(char letter) {
    constexpr std::string_view kDigits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    const std::size_t digit = kDigits.find(letter);
    return digit == std::string_view::npos ? std::nullopt : std::optional(static_cast<int>(digit));
}

platform::Failure noBase64(std::string_view text, const std::string& reason) {
    return {0, "\"$data\" is not base64: " + shownValue(std::string(text)) + ' ' + reason};
}

/// The padding may be left out.
platform::Result<std::string> fromBase64(std::string_view padded) {
    constexpr std::size_t kGroup = 4;
    const std::string_view text = padded.substr(0, padded.find_last_not_of('=') + 1);
    const std::size_t padding = padded.size() - text.size();
    if (text.size() % kGroup == 1) {
        return noBase64(padded, "has " + std::to_string(text.size()) + " digits, one more than a multiple of 4");
    }
    if (padding != 0 && padding != (kGroup - text.size() % kGroup) % kGroup) {
        return noBase64(padded, "ends with \"=\", but not so that its length is the next multiple of 4");
    }
    std::string bytes;
    std::uint32_t collected = 0;
    unsigned bits = 0;
    for (const char letter : text) {
        const std::optional<int> digit = base64Digit(letter);
        if (!digit) {
            return noBase64(padded, "has other characters than A-Z, a-z, 0-9, +, / and a padding of =");
        }
        collected = (collected << 6U) | static_cast<std::uint32_t>(*digit);
        bits += 6;
        if (bits >= 8) {
            bits -= 8;
            bytes += static_cast<char>(collected >> bits & 0xFFU);
        }
    }
    return bytes;
}

/// `number` for a message: the beginning of a long one.
std::string shownNumber(std::string_view number) {
    constexpr std::size_t kShown = 80;
    return std::string(number.substr(0, kShown)) + (number.size() > kShown ? "..." : "");
}

bool isWholeNumber(std::string_view number) {
    return number.find_first_not_of("-0123456789") == std::string_view::npos;
}

/// Takes the parser's events and builds the value. Every event answers whether to go on.
class ValueHandler {
public:
    // Names and types are the parser's.
    // NOLINTBEGIN(readability-identifier-naming)
    using number_integer_t = nlohmann::json::number_integer_t;
    using number_unsigned_t = nlohmann::json::number_unsigned_t;
    using number_float_t = nlohmann::json::number_float_t;
    using string_t = nlohmann::json::string_t;
    using binary_t = nlohmann::json::binary_t;

    explicit ValueHandler(std::size_t depth) : depth_(depth) {}

    bool null() { return refuse("null is no value of a property list"); }
    bool boolean(bool value) { return put(value); }
    bool number_integer(number_integer_t value) { return put(value); }
    bool number_unsigned(number_unsigned_t value) { return put(value); }
    /// Whole numbers come here as well where 64 bits do not hold them.
    bool number_float(number_float_t value, const string_t& text) {
        return isWholeNumber(text) ? refuseNumber(text) : put(value);
    }
    bool string(string_t& value) { return put(std::string_view(value)); }
    bool binary(binary_t&) { return refuse("there are no bytes in JSON"); }
    bool start_object(std::size_t) { return open(true); }
    bool key(string_t& value) {
        levels_.back().key = value;
        return true;
    }
    bool end_object() {
        const Dictionary dictionary = levels_.back().dictionary->build();
        levels_.pop_back();
        return putObject(dictionary);
    }
    bool start_array(std::size_t) { return open(false); }
    bool end_array() {
        Array array = levels_.back().array.build();
        levels_.pop_back();
        return put(std::move(array));
    }
    bool parse_error(std::size_t position, const std::string& token, const nlohmann::detail::exception& exception) {
        constexpr int kNumberOverflow = 406;
        if (exception.id == kNumberOverflow) {
            return refuseNumber(token);
        }
        return refuse("no JSON at byte " + std::to_string(position));
    }
    // NOLINTEND(readability-identifier-naming)

    Value& value() { return value_; }
    const std::string& fault() const { return fault_; }

private:
    struct Level {
        std::unique_ptr<DictionaryBuilder> dictionary; ///< null in an array
        ArrayBuilder array;
        std::string key;
    };

    bool open(bool dictionary) {
        if (levels_.size() == depth_) {
            return refuse("more than " + std::to_string(depth_) + " containers inside each other");
        }
        levels_.push_back({dictionary ? std::make_unique<DictionaryBuilder>() : nullptr, {}, {}});
        return true;
    }

    bool put(Value value) {
        if (levels_.empty()) {
            value_ = std::move(value);
        } else if (levels_.back().dictionary != nullptr) {
            levels_.back().dictionary->add(std::string_view(levels_.back().key), std::move(value));
        } else {
            levels_.back().array.add(std::move(value));
        }
        return true;
    }

    bool putObject(const Dictionary& dictionary) {
        if (dictionary.size() == 1) {
            const ValueRef data = dictionary.find(kDataKey);
            const ValueRef date = dictionary.find(kDateKey);
            if (data.isString()) {
                const platform::Result<std::string> bytes = fromBase64(data.text());
                return bytes ? put(Data(*bytes)) : refuse(bytes.failure().description);
            }
            if (date.isNumber()) {
                return put(Date{date.doubleValue()});
            }
        }
        return put(dictionary);
    }

    bool refuseNumber(std::string_view text) {
        return refuse(shownNumber(text) + (isWholeNumber(text)
                                               ? " is no whole number from -9223372036854775808 to 18446744073709551615"
                                               : " is beyond the largest real, 1.7976931348623157e308"));
    }

    bool refuse(std::string fault) {
        fault_ = std::move(fault);
        return false;
    }

    std::size_t depth_;
    std::vector<Level> levels_;
    Value value_;
    std::string fault_;
};

} // namespace

platform::Result<Value> readJson(std::string_view text, std::size_t depth) {
    ValueHandler handler(depth);
    if (!nlohmann::json::sax_parse(text, &handler)) {
        return platform::Failure{0, handler.fault()};
    }
    return std::move(handler.value());
}

} // namespace vela
