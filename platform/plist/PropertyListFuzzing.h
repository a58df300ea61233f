// What the fuzz targets of this folder require of every input. For fuzz targets only.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/plist/BinaryReader.h"
#include "platform/plist/LibplistComparison.h"
#include "platform/plist/PropertyListCodec.h"
#include "platform/plist/XmlReader.h"

#include <cmath>
#include <cstdlib>
#include <iostream>
#include <string>

namespace vela::platform::plist {

inline void require(bool holds, const std::string& what) {
    if (!holds) {
        std::cerr << what << '\n';
        std::abort();
    }
}

/// `value` as XML holds it: dates in whole seconds.
inline Value withWholeSeconds(ValueRef value) {
    if (value.isArray()) {
        ArrayBuilder builder;
        for (const ValueRef element : value.array()) {
            builder.add(withWholeSeconds(element));
        }
        return builder.build();
    }
    if (value.isDictionary()) {
        DictionaryBuilder builder;
        for (const auto& [key, inside] : value.dictionary()) {
            builder.add(key, withWholeSeconds(inside));
        }
        return builder.build();
    }
    return value.kind() == ValueKind::Date ? Value(Date{std::floor(value.date().seconds)}) : Value(value);
}

/// What is read is what libplist reads, and, written in any format that can hold it and read again, is the same.
inline void requireRoundTrip(const std::string& bytes, PropertyListFormat format) {
    // Wide enough for what small inputs become when shared objects are written out.
    constexpr PropertyListLimits kWrittenLimits{.bytes = 64 * 1024 * 1024, .depth = 128, .values = 65536};
    const PropertyListCodec codec;
    constexpr PropertyListLimits kLimits{.bytes = 64 * 1024, .depth = 32, .values = 1000};
    const auto value = format == PropertyListFormat::Binary ? readBinary(bytes, kLimits) : readXml(bytes, kLimits);
    if (!value) {
        require(value.failure().description.starts_with("property list: "), "a failure without words");
        return;
    }
    if (const auto difference = differenceFromLibplist(*value, bytes, format)) {
        require(false, "libplist differs: " + *difference);
    }
    for (const auto written : {PropertyListFormat::Xml, PropertyListFormat::Binary}) {
        if (const auto output = codec.write(*value, written)) {
            const auto again = codec.read(*output, kWrittenLimits);
            require(static_cast<bool>(again),
                    again ? "" : "what was written is refused: " + again.failure().description);
            const Value expected = written == PropertyListFormat::Xml ? withWholeSeconds(*value) : *value;
            require(*again == expected, "what was written is another value");
        }
    }
    const auto text = codec.write(*value, PropertyListFormat::Text);
    require(text && codec.read(*text, kWrittenLimits), "the text form is refused");
}

} // namespace vela::platform::plist
