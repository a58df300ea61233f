#include "platform/plist/LibplistComparison.h"

#include "common/values/Dictionary.h"

#include <cmath>
#include <cstdlib>
#include <limits>
#include <memory>
#include <plist/plist.h>

namespace vela::platform::plist {

namespace {

using Difference = std::optional<std::string>;

struct Free {
    void operator()(void* memory) const { std::free(memory); } // NOLINT: libplist allocates with malloc
};
struct NodeFree {
    void operator()(void* node) const { plist_free(node); }
};

Difference compare(ValueRef value, plist_t node, const std::string& path);

bool sameReal(double left, double right) { return left == right || (std::isnan(left) && std::isnan(right)); }

std::string_view untilNul(std::string_view text) { return text.substr(0, text.find('\0')); }

bool sameDate(double seconds, plist_t node) {
    constexpr double kEpochSeconds = 978307200;
    const double ours = seconds - kEpochSeconds;
    if (std::abs(ours) >= std::numeric_limits<std::int32_t>::max()) {
        return true;
    }
    std::int32_t whole = 0;
    std::int32_t microseconds = 0;
    plist_get_date_val(node, &whole, &microseconds);
    return std::abs(ours - whole) <= 1;
}

bool sameString(std::string_view text, plist_t node) {
    std::uint64_t length = 0;
    const char* const bytes = plist_get_string_ptr(node, &length);
    // Read from UTF-16, its length may be wrong behind NUL.
    return bytes != nullptr && untilNul(text) == untilNul(std::string_view(bytes, length));
}

bool sameData(std::string_view ours, plist_t node) {
    std::uint64_t length = 0;
    const char* const bytes = plist_get_data_ptr(node, &length);
    return ours.size() == length && (length == 0 || ours == std::string_view(bytes, length));
}

bool sameInteger(std::uint64_t ours, plist_t node) {
    std::uint64_t theirs = 0;
    plist_get_uint_val(node, &theirs);
    return plist_get_node_type(node) == PLIST_UINT && ours == theirs;
}

bool sameLeaf(ValueRef value, plist_t node) {
    const plist_type type = plist_get_node_type(node);
    switch (value.kind()) {
    case ValueKind::Boolean: {
        std::uint8_t truth = 0;
        plist_get_bool_val(node, &truth);
        return type == PLIST_BOOLEAN && (truth != 0) == value.boolean();
    }
    case ValueKind::Integer:
        return sameInteger(static_cast<std::uint64_t>(value.integer()), node);
    case ValueKind::Unsigned:
        return sameInteger(value.unsignedInteger(), node);
    case ValueKind::Real:
    case ValueKind::Real32: {
        double real = 0;
        plist_get_real_val(node, &real);
        return type == PLIST_REAL && sameReal(real, value.real());
    }
    case ValueKind::Date:
        return type == PLIST_DATE && sameDate(value.date().seconds, node);
    case ValueKind::String:
        return type == PLIST_STRING && sameString(value.text(), node);
    case ValueKind::Data:
        return type == PLIST_DATA && sameData(value.bytes(), node);
    default:
        return false;
    }
}

Difference compareArray(const Array& array, plist_t node, const std::string& path) {
    if (plist_get_node_type(node) != PLIST_ARRAY || plist_array_get_size(node) != array.size()) {
        return path + ": not an array of as many values";
    }
    plist_array_iter iterator = nullptr;
    plist_array_new_iter(node, &iterator);
    const std::unique_ptr<void, Free> owner(iterator);
    for (std::size_t index = 0; index < array.size(); ++index) {
        plist_t element = nullptr;
        plist_array_next_item(node, iterator, &element);
        if (auto difference = compare(array[index], element, path + "/" + std::to_string(index))) {
            return difference;
        }
    }
    return std::nullopt;
}

bool isComparable(const Dictionary& dictionary) {
    for (const auto& [key, value] : dictionary) {
        if (key == "CF$UID" || key.text().find('\0') != std::string_view::npos) {
            return false;
        }
    }
    return true;
}

Difference compareDictionary(const Dictionary& dictionary, plist_t node, const std::string& path) {
    if (!isComparable(dictionary)) {
        return std::nullopt;
    }
    if (plist_get_node_type(node) != PLIST_DICT || plist_dict_get_size(node) != dictionary.size()) {
        return path + ": not a dictionary of as many entries";
    }
    plist_dict_iter iterator = nullptr;
    plist_dict_new_iter(node, &iterator);
    const std::unique_ptr<void, Free> owner(iterator);
    for (const auto& [key, value] : dictionary) {
        char* theirKey = nullptr;
        plist_t theirValue = nullptr;
        plist_dict_next_item(node, iterator, &theirKey, &theirValue);
        const std::unique_ptr<char, Free> keyOwner(theirKey);
        if (theirKey == nullptr || key.text() != theirKey) {
            return path + ": another key in the place of " + std::string(key.text());
        }
        if (auto difference = compare(value, theirValue, path + "/" + theirKey)) {
            return difference;
        }
    }
    return std::nullopt;
}

Difference compare(ValueRef value, plist_t node, const std::string& path) {
    if (value.isArray()) {
        return compareArray(value.array(), node, path);
    }
    if (value.isDictionary()) {
        return compareDictionary(value.dictionary(), node, path);
    }
    return sameLeaf(value, node) ? std::nullopt : Difference(path + ": another leaf");
}

bool hasEmptyString(ValueRef value) {
    if (value.isArray()) {
        for (const ValueRef element : value.array()) {
            if (hasEmptyString(element)) {
                return true;
            }
        }
    } else if (value.isDictionary()) {
        for (const auto& [key, inside] : value.dictionary()) {
            if (key.text().empty() || hasEmptyString(inside)) {
                return true;
            }
        }
    }
    return value.isString() && value.text().empty();
}

} // namespace

std::optional<std::string> differenceFromLibplist(ValueRef value, std::string_view bytes, PropertyListFormat format) {
    const auto length = static_cast<std::uint32_t>(bytes.size());
    plist_t node = nullptr;
    if (format == PropertyListFormat::Binary) {
        plist_from_bin(bytes.data(), length, &node);
    } else {
        if (bytes.find('\r') != std::string_view::npos || bytes.find("<key/>") != std::string_view::npos) {
            return std::nullopt;
        }
        plist_from_xml(bytes.data(), length, &node);
    }
    const std::unique_ptr<void, NodeFree> owner(node);
    if (node != nullptr) {
        return compare(value, node, "");
    }
    return format == PropertyListFormat::Binary && hasEmptyString(value) ? std::nullopt
                                                                         : Difference("libplist refuses it");
}

} // namespace vela::platform::plist
