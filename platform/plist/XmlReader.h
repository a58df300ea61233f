// Reader of XML property lists: one <plist> with one value. Pure function.
//
// | element | content |
// | --- | --- |
// | dict | <key> and value by turns, no key twice |
// | array | values |
// | string, key | text |
// | integer, real, date, data | see Scalars.h |
// | true, false | nothing |
//
// Comments may stand wherever XML lets them, CDATA sections in text. Integers above the signed range are unsigned.
#pragma once

#include "platform/PropertyListReading.h"

namespace vela::platform::plist {

/// Takes linear time. A failure names line and column.
Result<Value> readXml(std::string_view text, const PropertyListLimits& limits);

} // namespace vela::platform::plist
