// Reads D-Bus messages in either byte order out of bytes that anybody may have sent.
//
//     | order 'l'/'B' | type | flags | version 1 | body length u32 | serial u32 | fields a(yv) | zeros up to 8 | body |
//
// `frameOf` tells how long the message is that begins here, `MessageHeader::read` takes a whole message apart,
// `BodyReader` reads its arguments. Texts are views into the message. Confined to their owner's thread.
#pragma once

#include "common/values/Dictionary.h"
#include "platform/dbus/Names.h"
#include "platform/dbus/Protocol.h"
#include "platform/dbus/WireReader.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::dbus {

/// Bytes of the fixed part of a header, length of the fields included.
inline constexpr std::size_t kFixedHeaderBytes = 16;

/// What the start of a message says of its length.
struct Frame {
    enum class State : std::uint8_t {
        Incomplete, ///< fewer than kFixedHeaderBytes are there, and nothing is wrong with them
        Known,
        Invalid, ///< no message, or one beyond the protocol's limits
    };

    State state = State::Incomplete;
    std::size_t bytes = 0;       ///< of the whole message; at most kMaximumMessageBytes
    std::size_t headerBytes = 0; ///< of these, before the body
    // Of the fixed part, for messages that are refused unread.
    MessageType type = MessageType::Invalid;
    std::uint8_t flags = 0;
    std::uint32_t serial = 0;
};

/// `bytes` begins with a message, of which as much as is there.
Frame frameOf(std::string_view bytes);

/// A message's header. Texts are views into the message, checked for their form; absent ones are empty.
struct MessageHeader {
    MessageType type = MessageType::Invalid; ///< may be a number beyond Signal, to be ignored
    std::uint8_t flags = 0;
    bool foreignOrder = false; ///< the other byte order than this machine's
    std::uint32_t serial = 0;
    std::uint32_t replySerial = 0;
    std::string_view path;
    std::string_view interface;
    std::string_view member;
    std::string_view errorName;
    std::string_view destination;
    std::string_view sender;
    std::string_view signature;
    std::string_view body;

    bool replyExpected() const { return type == MessageType::MethodCall && (flags & kNoReplyExpectedFlag) == 0; }

    /// Reads the header of `message`, exactly one whole message. Answers what is wrong with it, or none: then all
    /// fields that its type demands are there.
    std::optional<ProtocolError> read(std::string_view message);
};

/// Reads the headers of a sender's messages, most of which say the same but for their serial and their length: such a
/// one costs a comparison. Texts are views into the message or into the reader, good until it reads the next one.
class HeaderReader {
public:
    /// As MessageHeader::read.
    std::optional<ProtocolError> read(std::string_view message);
    const MessageHeader& header() const { return header_; }

private:
    std::string last_; ///< bytes of the header that header_ was read from; empty for none
    MessageHeader header_;
};

/// Reads the arguments of a message one after another. The caller has compared the signature; a reader does not. After
/// the first error every read answers an empty value, so that one look at `error()` behind the last is enough.
class BodyReader {
public:
    /// The message outlives the reader. `depth` is the nesting that values may have: a dictionary of numbers has 1.
    explicit BodyReader(const MessageHeader& header, std::uint32_t depth = kDefaultDepth)
        : wire_(header.body, header.foreignOrder),
          depth_(depth) {}

    bool boolean() { return wire_.boolean(); }                       ///< b
    std::uint8_t byte() { return wire_.byte(); }                     ///< y
    std::int16_t int16() { return wire_.number<std::int16_t>(); }    ///< n
    std::uint16_t uint16() { return wire_.number<std::uint16_t>(); } ///< q
    std::int32_t int32() { return wire_.number<std::int32_t>(); }    ///< i
    std::uint32_t uint32() { return wire_.number<std::uint32_t>(); } ///< u
    std::int64_t int64() { return wire_.number<std::int64_t>(); }    ///< x
    std::uint64_t uint64() { return wire_.number<std::uint64_t>(); } ///< t
    double real() { return wire_.number<double>(); }                 ///< d
    std::string_view string() { return wire_.string(); }             ///< s
    std::string_view objectPath() { return wire_.objectPath(); }     ///< o
    std::string_view signature() { return wire_.signature(); }       ///< g
    std::string_view data() { return wire_.array(1); }               ///< ay
    /// ax
    std::vector<std::int64_t> int64s();
    /// aax as an optional list: no element is none, one is the list. More are kInvalidArgsError.
    std::optional<std::vector<std::int64_t>> optionalInt64s();
    /// a{sv}
    Dictionary dictionary();
    /// aa{sv}
    Array dictionaries();
    /// v
    Value variant();
    /// v of any type, which is checked and passed over.
    void skipVariant() { wire_.skip("v"); }

    /// Ends the body: what is left over is an error.
    void finish();
    /// The first error, or none.
    const std::optional<ProtocolError>& error() const { return wire_.error(); }

    static constexpr std::uint32_t kDefaultDepth = 32;

private:
    Value value(std::string_view type);
    Value valueOf(char code);
    Value date();
    Value array(std::string_view elementType);
    void entry(DictionaryBuilder& builder);
    Value unsupported(std::string_view type);
    bool enter();

    WireReader wire_;
    std::uint32_t depth_;       ///< limit
    std::uint32_t nesting_ = 0; ///< containers around the current value
    std::string_view key_;      ///< of the entry that is being read; for error texts
};

} // namespace vela::platform::dbus
