// Frames and headers.
#include "platform/dbus/MessageReader.h"

#include <bit>
#include <cstring>

namespace vela::platform::dbus {

namespace {

constexpr char kNativeOrder = std::endian::native == std::endian::little ? 'l' : 'B';
constexpr char kForeignOrder = std::endian::native == std::endian::little ? 'B' : 'l';
constexpr char kProtocolVersion = 1;

std::uint32_t wordAt(std::string_view bytes, std::size_t position) {
    std::uint32_t word = 0;
    std::memcpy(&word, bytes.data() + position, sizeof(word));
    return bytes.front() == kNativeOrder ? word : reversedBytes(word);
}

/// Whether the bytes that are there may begin a message.
bool mayBegin(std::string_view bytes) {
    return (bytes.empty() || bytes[0] == kNativeOrder || bytes[0] == kForeignOrder) &&
           (bytes.size() < 2 || bytes[1] != 0) && (bytes.size() < 4 || bytes[3] == kProtocolVersion);
}

/// Reads one header field's value into `header`; the type that its code demands stands before it.
void readField(WireReader& wire, std::uint8_t code, MessageHeader& header) {
    const std::string_view type = wire.variantSignature();
    if (wire.failed()) {
        return;
    }
    struct Text {
        std::string_view MessageHeader::*member;
        bool (*valid)(std::string_view);
    };
    // By the field's code, from Interface on; the rest is read below.
    static constexpr Text kTexts[] = {
        {&MessageHeader::interface, isValidInterfaceName}, {&MessageHeader::member, isValidMemberName},
        {&MessageHeader::errorName, isValidInterfaceName}, {},
        {&MessageHeader::destination, isValidBusName},     {&MessageHeader::sender, isValidBusName}};
    const auto demand = [&](std::string_view demanded) {
        return type == demanded || (wire.failMalformed("a header field is of the wrong type"), false);
    };
    switch (static_cast<HeaderField>(code)) {
    case HeaderField::Path:
        if (demand("o")) {
            header.path = wire.objectPath();
        }
        return;
    case HeaderField::Interface:
    case HeaderField::Member:
    case HeaderField::ErrorName:
    case HeaderField::Destination:
    case HeaderField::Sender: {
        const Text& text = kTexts[code - static_cast<std::uint8_t>(HeaderField::Interface)];
        if (demand("s") && (header.*text.member = wire.string(), !wire.failed()) && !text.valid(header.*text.member)) {
            wire.failMalformed("a name in the header has not the form of one");
        }
        return;
    }
    case HeaderField::ReplySerial:
        if (demand("u") && (header.replySerial = wire.number<std::uint32_t>(), header.replySerial == 0)) {
            wire.failMalformed("a reply serial is zero");
        }
        return;
    case HeaderField::Signature:
        if (demand("g")) {
            header.signature = wire.signature();
        }
        return;
    case HeaderField::UnixFds:
        if (demand("u") && wire.number<std::uint32_t>() != 0) {
            wire.failMalformed("file descriptors were not agreed upon");
        }
        return;
    }
    // Later versions of the protocol may have more.
    wire.skip(type);
}

void readFields(WireReader& wire, MessageHeader& header) {
    std::uint32_t seen = 0;
    const std::size_t end = wire.beginArray(8);
    while (wire.position() < end) {
        wire.align(8);
        const std::uint8_t code = wire.byte();
        if (code == 0) {
            return wire.failMalformed("a header field has the code 0");
        }
        if (code <= static_cast<std::uint8_t>(HeaderField::UnixFds)) {
            const std::uint32_t bit = 1U << code;
            if ((seen & bit) != 0) {
                return wire.failMalformed("a header field stands twice");
            }
            seen |= bit;
        }
        readField(wire, code, header);
    }
    wire.endArray(end);
    wire.align(8);
}

const char* faultOfFields(const MessageHeader& header) {
    if (header.path == "/org/freedesktop/DBus/Local" || header.interface == "org.freedesktop.DBus.Local") {
        return "a name is reserved";
    }
    if (header.signature.empty() && !header.body.empty()) {
        return "a body has no signature";
    }
    switch (header.type) {
    case MessageType::MethodCall:
        return header.path.empty() || header.member.empty() ? "a call has no path or no member" : nullptr;
    case MessageType::MethodReturn:
        return header.replySerial == 0 ? "a reply has no reply serial" : nullptr;
    case MessageType::Error:
        return header.replySerial == 0 || header.errorName.empty() ? "an error has no reply serial or no name"
                                                                   : nullptr;
    case MessageType::Signal:
        return header.path.empty() || header.interface.empty() || header.member.empty()
                   ? "a signal has no path, no interface or no member"
                   : nullptr;
    case MessageType::Invalid:
        break;
    }
    return nullptr;
}

} // namespace

Frame frameOf(std::string_view bytes) {
    Frame frame;
    if (!mayBegin(bytes)) {
        frame.state = Frame::State::Invalid;
        return frame;
    }
    if (bytes.size() < kFixedHeaderBytes) {
        return frame;
    }
    const std::uint64_t bodyBytes = wordAt(bytes, 4);
    const std::uint64_t fieldBytes = wordAt(bytes, 12);
    const std::uint64_t headerBytes = (kFixedHeaderBytes + fieldBytes + 7) & ~std::uint64_t{7};
    frame.type = static_cast<MessageType>(bytes[1]);
    frame.flags = static_cast<std::uint8_t>(bytes[2]);
    frame.serial = wordAt(bytes, 8);
    const bool valid =
        frame.serial != 0 && fieldBytes <= kMaximumArrayBytes && headerBytes + bodyBytes <= kMaximumMessageBytes;
    frame.state = valid ? Frame::State::Known : Frame::State::Invalid;
    frame.headerBytes = valid ? headerBytes : 0;
    frame.bytes = valid ? headerBytes + bodyBytes : 0;
    return frame;
}

std::optional<ProtocolError> MessageHeader::read(std::string_view message) {
    const Frame frame = frameOf(message);
    if (frame.state != Frame::State::Known || frame.bytes != message.size()) {
        return ProtocolError{kInconsistentMessageError, "a message's fixed header is wrong"};
    }
    *this = MessageHeader();
    type = frame.type;
    flags = frame.flags;
    serial = frame.serial;
    foreignOrder = message.front() == kForeignOrder;
    body = message.substr(frame.headerBytes);
    WireReader wire(message.substr(0, frame.headerBytes), foreignOrder);
    for (int word = 0; word < 3; ++word) {
        wire.number<std::uint32_t>(); // order to version, body length, serial
    }
    readFields(wire, *this);
    if (!wire.failed()) {
        if (const char* fault = faultOfFields(*this)) {
            wire.failMalformed(fault);
        }
    }
    return wire.error();
}

std::optional<ProtocolError> HeaderReader::read(std::string_view message) {
    constexpr std::size_t kOrderToVersion = 4;
    constexpr std::size_t kFieldsLength = 12; // behind the body's length and the serial
    const Frame frame = frameOf(message);
    const std::string_view header = message.substr(0, frame.headerBytes);
    const std::string_view body = message.substr(frame.headerBytes);
    const bool same = frame.state == Frame::State::Known && frame.bytes == message.size() &&
                      header.size() == last_.size() && body.empty() == header_.body.empty() &&
                      header.substr(0, kOrderToVersion) == std::string_view(last_).substr(0, kOrderToVersion) &&
                      header.substr(kFieldsLength) == std::string_view(last_).substr(kFieldsLength);
    if (same) {
        header_.serial = frame.serial;
        header_.body = body;
        return std::nullopt;
    }
    last_.clear();
    if (auto error = header_.read(message)) {
        return error;
    }
    constexpr std::size_t kLongestKept = 512;
    if (header.size() <= kLongestKept) {
        last_ = header;
        // The texts are to stand in the bytes that stay.
        for (std::string_view MessageHeader::*const text :
             {&MessageHeader::path, &MessageHeader::interface, &MessageHeader::member, &MessageHeader::errorName,
              &MessageHeader::destination, &MessageHeader::sender, &MessageHeader::signature}) {
            std::string_view& view = header_.*text;
            if (!view.empty()) {
                view =
                    std::string_view(last_).substr(static_cast<std::size_t>(view.data() - message.data()), view.size());
            }
        }
    }
    return std::nullopt;
}

} // namespace vela::platform::dbus
