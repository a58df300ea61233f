// Takes any bytes for messages: reads the header, then the arguments by the message's own signature as far as there are
// readers for them. What was read must come back the same after writing.
#include "platform/dbus/MessageReader.h"
#include "platform/dbus/MessageWriter.h"

#include <cstdint>
#include <cstdlib>

namespace {

using namespace vela;
using namespace vela::platform::dbus;

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

void requireText(const ProtocolError& error) {
    require(!error.text.empty() && error.text.size() < 400 && isValidText(error.text));
}

/// Reads one argument of the basic type `code`.
void readBasic(BodyReader& reader, char code) {
    switch (code) {
    case 'b':
        reader.boolean();
        break;
    case 'y':
        reader.byte();
        break;
    case 'n':
    case 'q':
        reader.uint16();
        break;
    case 'i':
    case 'u':
        reader.int32();
        break;
    case 'x':
    case 't':
        reader.uint64();
        break;
    case 'd':
        reader.real();
        break;
    case 's':
        require(isValidText(reader.string()));
        break;
    case 'o':
        reader.objectPath();
        break;
    default:
        require(code == 'g');
        require(isValidSignature(reader.signature()));
    }
}

/// Reads `original` back after writing, and compares the bytes of a second writing: equality of reals that are not
/// numbers is none of this test's affairs.
void requireRoundTrip(const Dictionary& original) {
    const auto write = [](const Dictionary& dictionary) {
        std::string bytes;
        MessageWriter writer(bytes);
        writer.beginCall({.serial = 1, .path = "/", .member = "m", .signature = "a{sv}"});
        writer.dictionary(dictionary);
        return writer.finish() ? bytes : std::string();
    };
    const std::string bytes = write(original);
    require(!bytes.empty());
    MessageHeader header;
    require(!header.read(bytes));
    BodyReader reader(header, 64);
    const Dictionary back = reader.dictionary();
    reader.finish();
    require(!reader.error() && write(back) == bytes);
}

void readBody(const MessageHeader& header) {
    BodyReader reader(header, 8);
    for (std::string_view rest = header.signature; !rest.empty();) {
        const std::size_t bytes = completeTypeBytes(rest);
        const std::string_view type = rest.substr(0, bytes);
        rest.remove_prefix(bytes);
        if (type == "a{sv}") {
            const Dictionary dictionary = reader.dictionary();
            if (!reader.error()) {
                requireRoundTrip(dictionary);
            }
        } else if (type == "aax") {
            reader.optionalInt64s();
        } else if (type == "ax") {
            reader.int64s();
        } else if (type == "aa{sv}") {
            reader.dictionaries();
        } else if (type == "ay") {
            reader.data();
        } else if (type == "v") {
            reader.variant();
        } else if (type.size() == 1 && type != "h") {
            readBasic(reader, type.front());
        } else {
            return;
        }
    }
    reader.finish();
    if (reader.error()) {
        requireText(*reader.error());
        require(reader.uint64() == 0 && reader.string().empty() && reader.dictionary().empty());
    }
}

void requireSame(const MessageHeader& one, const MessageHeader& other) {
    require(one.type == other.type && one.flags == other.flags && one.foreignOrder == other.foreignOrder &&
            one.serial == other.serial && one.replySerial == other.replySerial && one.path == other.path &&
            one.interface == other.interface && one.member == other.member && one.errorName == other.errorName &&
            one.destination == other.destination && one.sender == other.sender && one.signature == other.signature &&
            one.body.data() == other.body.data() && one.body.size() == other.body.size());
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    std::string_view rest(reinterpret_cast<const char*>(data), size);
    HeaderReader headers;
    while (true) {
        const Frame frame = frameOf(rest);
        if (frame.state != Frame::State::Known || frame.bytes > rest.size()) {
            return 0;
        }
        require(frame.bytes >= kFixedHeaderBytes && frame.headerBytes <= frame.bytes);
        MessageHeader header;
        const std::string_view message = rest.substr(0, frame.bytes);
        const auto error = header.read(message);
        for (int time = 0; time < 2; ++time) { // anew, and as a repetition
            require(headers.read(message).has_value() == error.has_value());
            if (!error) {
                requireSame(headers.header(), header);
            }
        }
        if (error) {
            requireText(*error);
            return 0;
        }
        readBody(header);
        rest.remove_prefix(frame.bytes);
    }
}
