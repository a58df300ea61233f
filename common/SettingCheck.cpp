#include "common/SettingCheck.h"

#include "common/SettingValues.h"

#include <algorithm>

namespace vela {

namespace {

using platform::Failure;
using platform::Result;

/// Longest path that the system takes, without the byte that ends it.
constexpr std::size_t kPathBytes = 4095;

Failure wrongType(const SettingDescription& description, const SettingValue& value) {
    return {0, shownValue(value) + " is not " + allowedText(description)};
}

Result<SettingValue> checkNumber(const SettingDescription& description, std::int64_t number,
                                 const SettingValue& given) {
    if (number < description.least || number > description.most) {
        return Failure{0, shownValue(given) + " is outside " + rangeText(description)};
    }
    return SettingValue(number);
}

Result<SettingValue> checkByteSize(const SettingDescription& description, const SettingValue& value) {
    if (const auto* bytes = std::get_if<std::int64_t>(&value)) {
        return checkNumber(description, *bytes, value);
    }
    const auto* text = std::get_if<std::string>(&value);
    if (text == nullptr) {
        return wrongType(description, value);
    }
    const Result<std::int64_t> bytes = parseByteSize(*text);
    if (!bytes) {
        return bytes.failure();
    }
    return checkNumber(description, *bytes, value);
}

Result<SettingValue> checkChoice(const SettingDescription& description, const SettingValue& value) {
    const auto* text = std::get_if<std::string>(&value);
    if (text != nullptr && std::ranges::find(description.choices, *text) != description.choices.end()) {
        return value;
    }
    return Failure{0, shownValue(value) + " is none of " + choicesText(description)};
}

Result<SettingValue> checkPath(const SettingDescription& description, const SettingValue& value) {
    const auto* text = std::get_if<std::string>(&value);
    if (text == nullptr) {
        return wrongType(description, value);
    }
    if (text->empty()) {
        return Failure{0, "the path is empty"};
    }
    if (text->find('\0') != std::string::npos) {
        return Failure{0, shownValue(value) + " has a zero byte in it"};
    }
    if (text->size() > kPathBytes) {
        return Failure{0, "the path is longer than " + std::to_string(kPathBytes) + " bytes"};
    }
    return value;
}

Result<SettingValue> checkTexts(const SettingDescription& description, const SettingValue& value) {
    const auto* list = std::get_if<std::vector<std::string>>(&value);
    if (list == nullptr) {
        return wrongType(description, value);
    }
    for (const std::string& text : *list) {
        if (text.empty() || text.find('\0') != std::string::npos) {
            return Failure{0, quotedText(text) + " cannot be in the list"};
        }
        if (!description.choices.empty() && std::ranges::find(description.choices, text) == description.choices.end()) {
            return Failure{0, shownValue(text) + " is none of " + choicesText(description)};
        }
    }
    return value;
}

} // namespace

Result<SettingValue> checkSetting(const SettingDescription& description, const SettingValue& value) {
    switch (description.kind) {
    case SettingKind::Boolean:
        return std::holds_alternative<bool>(value) ? Result<SettingValue>(value) : wrongType(description, value);
    case SettingKind::Integer:
    case SettingKind::Milliseconds:
        if (const auto* number = std::get_if<std::int64_t>(&value)) {
            return checkNumber(description, *number, value);
        }
        return wrongType(description, value);
    case SettingKind::ByteSize:
        return checkByteSize(description, value);
    case SettingKind::Choice:
        return checkChoice(description, value);
    case SettingKind::Path:
        return checkPath(description, value);
    case SettingKind::TextList:
        return checkTexts(description, value);
    }
    return wrongType(description, value);
}

} // namespace vela
