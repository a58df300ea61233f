#include "platform/plist/LibplistWriter.h"

#include "common/values/Dictionary.h"
#include "common/values/Utf8.h"
#include "platform/plist/LimitTexts.h"
#include "platform/plist/XmlScanner.h"

#include <bit>
#include <cmath>
#include <cstdlib>
#include <memory>
#include <optional>
#include <plist/plist.h>
#include <utility>

namespace vela::platform::plist {

namespace {

constexpr double kEpochSeconds = 978307200;    // of 2001-01-01 after 1970-01-01
constexpr double kFirstXmlDate = -30610224000; // 1000-01-01 00:00:00; libplist does not pad shorter years
constexpr double kXmlDatesEnd = 253402300800;  // 10000-01-01 00:00:00
constexpr char kUnsignedMarker = 0x14;         // of 16 bytes
constexpr char kDateMarker = 0x33;

struct NodeFree {
    void operator()(void* node) const { plist_free(node); }
};
using Node = std::unique_ptr<void, NodeFree>;

struct BufferFree {
    void operator()(char* buffer) const { std::free(buffer); } // NOLINT: libplist allocates with malloc
};

void appendBigEndian(std::string& bytes, std::uint64_t number) {
    for (unsigned shift = 64; shift > 0; shift -= 8) {
        bytes += static_cast<char>(static_cast<unsigned char>((number >> (shift - 8)) & 0xFFU));
    }
}

/// The node of a binary list whose one object has this marker and content.
Node nodeFromObject(char marker, const std::string& content) {
    std::string list = "bplist00";
    const std::size_t objectAt = list.size();
    list += marker;
    list += content;
    const std::size_t tableAt = list.size();
    list += static_cast<char>(objectAt);
    list += std::string("\0\0\0\0\0\0\1\1", 8); // unused, bytes of an offset and of a reference
    appendBigEndian(list, 1);                   // objects
    appendBigEndian(list, 0);                   // top
    appendBigEndian(list, tableAt);
    plist_t node = nullptr;
    plist_from_bin(list.data(), static_cast<std::uint32_t>(list.size()), &node);
    return Node(node);
}

/// Makes libplist's tree of a value. A function that fails answers null and has set the reason.
class TreeMaker {
public:
    explicit TreeMaker(PropertyListFormat format) : format_(format) {}

    Node make(ValueRef value, std::size_t depth);

    const std::string& reason() const { return reason_; }

private:
    Node makeLeaf(ValueRef value);
    Node makeString(std::string_view text);
    Node makeDate(Date date);
    Node makeArray(const Array& array, std::size_t depth);
    Node makeDictionary(const Dictionary& dictionary, std::size_t depth);
    bool isWritable(std::string_view text);
    Node fail(std::string reason) {
        reason_ = std::move(reason);
        return nullptr;
    }

    PropertyListFormat format_;
    std::string reason_;
};

Node TreeMaker::make(ValueRef value, std::size_t depth) {
    if (!value.isArray() && !value.isDictionary()) {
        return makeLeaf(value);
    }
    if (depth == kDeepestWritten) {
        return fail(tooDeep(kDeepestWritten));
    }
    return value.isArray() ? makeArray(value.array(), depth + 1) : makeDictionary(value.dictionary(), depth + 1);
}

Node TreeMaker::makeLeaf(ValueRef value) {
    switch (value.kind()) {
    case ValueKind::Boolean:
        return Node(plist_new_bool(value.boolean() ? 1 : 0));
    case ValueKind::Integer:
        return Node(plist_new_uint(static_cast<std::uint64_t>(value.integer())));
    case ValueKind::Unsigned: {
        std::string content;
        appendBigEndian(content, 0);
        appendBigEndian(content, value.unsignedInteger());
        return nodeFromObject(kUnsignedMarker, content);
    }
    case ValueKind::Real:
    case ValueKind::Real32:
        return Node(plist_new_real(value.real()));
    case ValueKind::Date:
        return makeDate(value.date());
    case ValueKind::String:
        return makeString(value.text());
    case ValueKind::Data: {
        const std::string_view bytes = value.bytes();
        return Node(plist_new_data(bytes.empty() ? "" : bytes.data(), bytes.size()));
    }
    case ValueKind::None:
    case ValueKind::Array:
    case ValueKind::Dictionary:
        break;
    }
    return fail("there is no value");
}

Node TreeMaker::makeString(std::string_view text) {
    return isWritable(text) ? Node(plist_new_string(std::string(text).c_str())) : nullptr;
}

Node TreeMaker::makeDate(Date date) {
    double seconds = date.seconds;
    if (!std::isfinite(seconds)) {
        return fail("a date is not a number");
    }
    if (format_ == PropertyListFormat::Xml) {
        seconds = std::floor(seconds);
        if (seconds < kFirstXmlDate || seconds >= kXmlDatesEnd) {
            return fail("a date lies outside the years 1000 to 9999");
        }
    }
    std::string content;
    appendBigEndian(content, std::bit_cast<std::uint64_t>(seconds - kEpochSeconds));
    return nodeFromObject(kDateMarker, content);
}

Node TreeMaker::makeArray(const Array& array, std::size_t depth) {
    Node node(plist_new_array());
    for (const ValueRef element : array) {
        Node child = make(element, depth);
        if (!child) {
            return nullptr;
        }
        plist_array_append_item(node.get(), child.release());
    }
    return node;
}

Node TreeMaker::makeDictionary(const Dictionary& dictionary, std::size_t depth) {
    Node node(plist_new_dict());
    for (const auto& [key, value] : dictionary) {
        Node child = isWritable(key.text()) ? make(value, depth) : nullptr;
        if (!child) {
            return nullptr;
        }
        plist_dict_set_item(node.get(), std::string(key.text()).c_str(), child.release());
    }
    return node;
}

bool TreeMaker::isWritable(std::string_view text) {
    if (!isValidUtf8(text)) {
        reason_ = "a string is not UTF-8";
    } else if (text.find('\0') != std::string_view::npos) {
        reason_ = "a string holds NUL";
    } else if (format_ == PropertyListFormat::Xml && firstNonXml(text)) {
        reason_ = "a string holds a character that XML forbids";
    } else {
        return true;
    }
    return false;
}

/// No reader needs the line, which names a document on somebody's server.
std::string withoutDocumentType(std::string xml) {
    const std::size_t begin = xml.find("<!DOCTYPE");
    const std::size_t end = begin == std::string::npos ? begin : xml.find('\n', begin);
    if (end != std::string::npos) {
        xml.erase(begin, end + 1 - begin);
    }
    return xml;
}

/// Only text can hold a CR, libplist ends its lines with LF; read back as it stands it would be a LF.
std::string withCarriageReturnsAsReferences(std::string_view xml) {
    std::string text;
    for (const char character : xml) {
        if (character == '\r') {
            text += "&#13;";
        } else {
            text += character;
        }
    }
    return text;
}

using Writer = void (*)(plist_t node, char** bytes, std::uint32_t* length);

Result<std::string> write(ValueRef value, PropertyListFormat format, Writer writer) {
    TreeMaker maker(format);
    const Node node = maker.make(value, 0);
    if (!node) {
        return Failure{0, "property list: " + maker.reason()};
    }
    char* bytes = nullptr;
    std::uint32_t length = 0;
    writer(node.get(), &bytes, &length);
    const std::unique_ptr<char, BufferFree> owner(bytes);
    if (bytes == nullptr) {
        return Failure{0, "property list: libplist wrote nothing"};
    }
    return std::string(bytes, length);
}

} // namespace

Result<std::string> writeXml(ValueRef value) {
    auto xml = write(value, PropertyListFormat::Xml, &plist_to_xml);
    if (!xml) {
        return xml;
    }
    std::string text = withoutDocumentType(*std::move(xml));
    return text.find('\r') != std::string::npos ? withCarriageReturnsAsReferences(text) : text;
}

Result<std::string> writeBinary(ValueRef value) { return write(value, PropertyListFormat::Binary, &plist_to_bin); }

} // namespace vela::platform::plist
