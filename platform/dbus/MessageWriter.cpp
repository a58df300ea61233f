#include "platform/dbus/MessageWriter.h"

#include "common/values/Utf8.h"
#include "platform/dbus/Names.h"

#include <algorithm>
#include <bit>
#include <cassert>

namespace vela::platform::dbus {

namespace {

constexpr char kNativeOrder = std::endian::native == std::endian::little ? 'l' : 'B';
constexpr std::uint8_t kProtocolVersion = 1;
constexpr std::string_view kReplacement = "\xEF\xBF\xBD"; // U+FFFD

std::string repaired(std::string_view text) {
    std::string result;
    while (!text.empty()) {
        const Utf8Step step = utf8Step(text);
        const bool good = step.valid && step.codePoint != 0;
        result += good ? text.substr(0, step.bytes) : kReplacement;
        text.remove_prefix(step.bytes);
    }
    return result;
}

} // namespace

void MessageWriter::makeRoom() { buffer_.resize(std::max(end_ + position(), start_ + kFirstRoom)); }

void MessageWriter::begin(MessageType type, std::uint8_t flags, std::uint32_t serial) {
    assert(serial != 0);
    start_ = buffer_.size();
    end_ = start_;
    tooLarge_ = false;
    byte(static_cast<std::uint8_t>(kNativeOrder));
    byte(static_cast<std::uint8_t>(type));
    byte(flags);
    byte(kProtocolVersion);
    uint32(0); // body length: see finish
    uint32(serial);
    fields_ = openArray(8);
}

void MessageWriter::field(HeaderField code, std::string_view text, char type) {
    if (text.empty()) {
        return;
    }
    align(8);
    byte(static_cast<std::uint8_t>(code));
    signature({&type, 1});
    if (type == 'g') {
        signature(text);
    } else {
        validString(text);
    }
}

void MessageWriter::replySerialField(std::uint32_t serial) {
    assert(serial != 0);
    align(8);
    byte(static_cast<std::uint8_t>(HeaderField::ReplySerial));
    signature("u");
    uint32(serial);
}

void MessageWriter::endFields(std::string_view signature) {
    assert(isValidSignature(signature));
    field(HeaderField::Signature, signature, 'g');
    closeArray(fields_);
    align(8);
    bodyAt_ = position();
}

void MessageWriter::beginCall(const CallHeader& header) {
    assert(isValidObjectPath(header.path) && isValidMemberName(header.member));
    assert(header.interface.empty() || isValidInterfaceName(header.interface));
    assert(header.destination.empty() || isValidBusName(header.destination));
    begin(MessageType::MethodCall, header.replyExpected ? 0 : kNoReplyExpectedFlag, header.serial);
    field(HeaderField::Path, header.path, 'o');
    field(HeaderField::Interface, header.interface);
    field(HeaderField::Member, header.member);
    field(HeaderField::Destination, header.destination);
    endFields(header.signature);
}

void MessageWriter::beginSignal(const CallHeader& header) {
    assert(isValidObjectPath(header.path) && isValidMemberName(header.member) &&
           isValidInterfaceName(header.interface));
    begin(MessageType::Signal, kNoReplyExpectedFlag, header.serial);
    field(HeaderField::Path, header.path, 'o');
    field(HeaderField::Interface, header.interface);
    field(HeaderField::Member, header.member);
    field(HeaderField::Destination, header.destination);
    endFields(header.signature);
}

void MessageWriter::beginReturn(const ReplyHeader& header) {
    begin(MessageType::MethodReturn, kNoReplyExpectedFlag, header.serial);
    replySerialField(header.replySerial);
    field(HeaderField::Sender, header.sender);
    endFields(header.signature);
}

void MessageWriter::beginError(std::string_view name, ReplyHeader header) {
    assert(isValidInterfaceName(name));
    begin(MessageType::Error, kNoReplyExpectedFlag, header.serial);
    field(HeaderField::ErrorName, name);
    replySerialField(header.replySerial);
    field(HeaderField::Sender, header.sender);
    endFields(header.signature);
}

void MessageWriter::error(std::string_view name, std::string_view text, ReplyHeader header) {
    header.signature = "s";
    beginError(name, header);
    string(text);
    [[maybe_unused]] const bool fits = finish();
    assert(fits);
}

bool MessageWriter::finish() {
    const std::size_t bytes = position();
    const bool fits = !tooLarge_ && bytes <= kMaximumMessageBytes;
    if (fits) {
        put32(4, static_cast<std::uint32_t>(bytes - bodyAt_));
    } else {
        end_ = start_;
    }
    buffer_.resize(end_);
    return fits;
}

void MessageWriter::validString(std::string_view text) {
    uint32(static_cast<std::uint32_t>(text.size()));
    text.copy(take(text.size() + 1), text.size());
}

void MessageWriter::string(std::string_view text) {
    if (!isValidText(text)) [[unlikely]] {
        return validString(repaired(text));
    }
    validString(text);
}

MessageWriter::OpenArray MessageWriter::openArray(std::size_t elementAlignment) {
    uint32(0);
    OpenArray array;
    array.lengthAt = position() - sizeof(std::uint32_t);
    align(elementAlignment);
    array.elementsAt = position();
    return array;
}

void MessageWriter::closeArray(OpenArray array) {
    const std::size_t bytes = position() - array.elementsAt;
    tooLarge_ = tooLarge_ || bytes > kMaximumArrayBytes;
    put32(array.lengthAt, static_cast<std::uint32_t>(bytes));
}

void MessageWriter::data(std::string_view bytes) {
    tooLarge_ = tooLarge_ || bytes.size() > kMaximumArrayBytes;
    uint32(static_cast<std::uint32_t>(bytes.size()));
    append(bytes);
}

void MessageWriter::int64s(std::span<const std::int64_t> numbers) {
    const OpenArray array = openArray(alignof(std::int64_t));
    append({reinterpret_cast<const char*>(numbers.data()), numbers.size_bytes()});
    closeArray(array);
}

void MessageWriter::optionalInt64s(const std::optional<std::vector<std::int64_t>>& numbers) {
    const OpenArray array = openArray(4);
    if (numbers) {
        int64s(*numbers);
    }
    closeArray(array);
}

void MessageWriter::dictionary(const Dictionary& dictionary) {
    const OpenArray entries = openDictionary();
    for (const auto& [key, value] : dictionary) {
        this->key(key.text());
        variant(value);
    }
    closeArray(entries);
}

std::size_t MessageWriter::bytesOf(const Dictionary& dictionary) {
    std::string bytes;
    MessageWriter writer(bytes);
    writer.dictionary(dictionary);
    return writer.position();
}

void MessageWriter::array(const Array& array) {
    const OpenArray elements = openArray(1);
    for (const ValueRef value : array) {
        variant(value);
    }
    closeArray(elements);
}

void MessageWriter::variant(ValueRef value) {
    switch (value.kind()) {
    case ValueKind::Boolean:
        signature("b");
        return boolean(value.boolean());
    case ValueKind::Integer:
        return variantInt64(value.integer());
    case ValueKind::Unsigned:
        signature("t");
        return uint64(value.unsignedInteger());
    case ValueKind::Real:
    case ValueKind::Real32:
        signature("d");
        return real(value.real());
    case ValueKind::Date:
        signature("(sd)");
        align(8);
        string(kDateText);
        return real(value.date().seconds);
    case ValueKind::String:
        signature("s");
        return string(value.text());
    case ValueKind::Data:
        signature("ay");
        return data(value.bytes());
    case ValueKind::Array:
        signature("av");
        return array(value.array());
    case ValueKind::Dictionary:
        signature("a{sv}");
        return dictionary(value.dictionary());
    case ValueKind::None:
        break;
    }
    assert(false);
}

void MessageWriter::variantUint16(std::uint16_t value) {
    signature("q");
    uint16(value);
}

void MessageWriter::variantInt64(std::int64_t value) {
    signature("x");
    int64(value);
}

} // namespace vela::platform::dbus
