#include "platform/plist/PropertyListCodec.h"

#include "common/values/Dictionary.h"
#include "common/values/TextPropertyList.h"
#include "common/values/TextualForm.h"
#include "platform/plist/BinaryReader.h"
#include "platform/plist/LibplistWriter.h"
#include "platform/plist/LimitTexts.h"
#include "platform/plist/XmlReader.h"

#include <algorithm>
#include <utility>
#include <variant>

namespace vela::platform {

namespace {

PropertyListFormat formatOf(std::string_view bytes) {
    constexpr std::string_view kByteOrderMark = "\xEF\xBB\xBF";
    if (bytes.starts_with("bplist00")) {
        return PropertyListFormat::Binary;
    }
    if (bytes.starts_with(kByteOrderMark)) {
        bytes.remove_prefix(kByteOrderMark.size());
    }
    bytes.remove_prefix(std::min(bytes.find_first_not_of(" \t\r\n"), bytes.size()));
    const bool xml = bytes.starts_with("<?") || bytes.starts_with("<!") || bytes.starts_with("<plist");
    return xml ? PropertyListFormat::Xml : PropertyListFormat::Text;
}

Result<Value> readText(std::string_view text, const PropertyListLimits& limits) {
    auto read = readTextPropertyList(text, {limits.bytes, limits.depth, limits.values});
    if (auto* const value = std::get_if<Value>(&read)) {
        return std::move(*value);
    }
    const auto& error = std::get<TextPropertyListError>(read);
    return Failure{0, "property list: line " + std::to_string(error.line) + ", column " + std::to_string(error.column) +
                          ": " + error.reason};
}

/// Whether `value` has at most `limit` containers inside each other.
bool isAtMostDeep(ValueRef value, std::size_t limit) {
    if (!value.isArray() && !value.isDictionary()) {
        return true;
    }
    if (limit == 0) {
        return false;
    }
    if (value.isArray()) {
        for (const ValueRef element : value.array()) {
            if (!isAtMostDeep(element, limit - 1)) {
                return false;
            }
        }
        return true;
    }
    for (const auto& [key, inside] : value.dictionary()) {
        if (!isAtMostDeep(inside, limit - 1)) {
            return false;
        }
    }
    return true;
}

Result<std::string> writeText(ValueRef value) {
    if (!value) {
        return Failure{0, "property list: there is no value"};
    }
    if (!isAtMostDeep(value, plist::kDeepestWritten)) {
        return Failure{0, "property list: " + plist::tooDeep(plist::kDeepestWritten)};
    }
    if (value.isArray() || value.isDictionary()) {
        return textualForm(value);
    }
    // A leaf by itself is shown without quotation marks; inside an array it has those that reading it needs.
    const std::string list = textualForm(Value(Array{Value(value)}));
    return list.substr(1, list.size() - 2);
}

} // namespace

Result<Value> PropertyListCodec::read(std::string_view bytes, const PropertyListLimits& limits) const {
    switch (formatOf(bytes)) {
    case PropertyListFormat::Binary:
        return plist::readBinary(bytes, limits);
    case PropertyListFormat::Xml:
        return plist::readXml(bytes, limits);
    case PropertyListFormat::Text:
        break;
    }
    return readText(bytes, limits);
}

Result<std::string> PropertyListCodec::write(ValueRef value, PropertyListFormat format) const {
    switch (format) {
    case PropertyListFormat::Binary:
        return plist::writeBinary(value);
    case PropertyListFormat::Xml:
        return plist::writeXml(value);
    case PropertyListFormat::Text:
        break;
    }
    return writeText(value);
}

} // namespace vela::platform
