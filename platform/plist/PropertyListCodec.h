// Property lists in their three formats. Thread-safe and without state.
//
// Reading is ours for all of them: the check of the bytes has to take them apart anyway, and libplist 2.2 would lose
// the sign of integers, the width of reals and dates beyond 32 bits of seconds, ends the process at a string with NUL,
// writes shared objects out without limit and tells nothing but that it failed. It writes XML and binary
// (LibplistWriter.h), so the tests read what another implementation wrote; they also compare our trees with those of
// its readers.
//
// | format | told by | reader |
// | --- | --- | --- |
// | binary | "bplist00" | BinaryReader.h |
// | XML | "<?", "<!" or "<plist" first, after a byte order mark and white space | XmlReader.h |
// | text | anything else | common/values/TextPropertyList.h |
#pragma once

#include "platform/PropertyListReading.h"

namespace vela::platform {

class PropertyListCodec : public PropertyListReading {
public:
    /// Failures: "property list: line 3, column 7: ...", in binary ones "property list: byte 17: ...".
    Result<Value> read(std::string_view bytes, const PropertyListLimits& limits = {}) const override;

    /// Strings must be UTF-8 without NUL, containers at most 128 deep. What XML and binary cannot hold, see
    /// LibplistWriter.h. As text every leaf but data becomes a string, and invalid UTF-8 U+FFFD.
    Result<std::string> write(ValueRef value, PropertyListFormat format) const override;
};

} // namespace vela::platform
