#include "backends/TelemRecord.h"

namespace vela::telemmetrics {

namespace {

constexpr unsigned kWireTypeBits = 3;
constexpr std::uint64_t kWireTypeMask = (1U << kWireTypeBits) - 1;
constexpr std::size_t kLongestVarint = 10;

} // namespace

std::optional<Tag> RecordReader::readTag() {
    const std::optional<std::uint64_t> tag = readVarint();
    if (!tag) {
        return std::nullopt;
    }
    return Tag{*tag >> kWireTypeBits, static_cast<WireType>(*tag & kWireTypeMask)};
}

std::optional<std::uint64_t> RecordReader::readVarint() {
    std::uint64_t number = 0;
    for (std::size_t i = 0; i < kLongestVarint && i < rest_.size(); ++i) {
        const auto byte = static_cast<unsigned char>(rest_[i]);
        // Of the tenth byte only the lowest bit has a place.
        number |= static_cast<std::uint64_t>(byte & 0x7FU) << (7 * i);
        if ((byte & 0x80U) == 0) {
            rest_.remove_prefix(i + 1);
            return number;
        }
    }
    fail();
    return std::nullopt;
}

std::optional<std::string_view> RecordReader::readBytes() {
    const std::optional<std::uint64_t> length = readVarint();
    if (!length) {
        return std::nullopt;
    }
    const std::string_view bytes = rest_;
    if (!skipBytes(*length)) {
        return std::nullopt;
    }
    return bytes.substr(0, static_cast<std::size_t>(*length));
}

bool RecordReader::skip(WireType wireType) {
    return wireType == WireType::StartGroup ? skipGroup() : skipPlain(wireType);
}

bool RecordReader::skipPlain(WireType wireType) {
    constexpr std::uint64_t kFour = 4;
    constexpr std::uint64_t kEight = 8;
    switch (wireType) {
    case WireType::Varint:
        return readVarint().has_value();
    case WireType::EightBytes:
        return skipBytes(kEight);
    case WireType::LengthDelimited:
        return readBytes().has_value();
    case WireType::FourBytes:
        return skipBytes(kFour);
    default:
        return fail();
    }
}

bool RecordReader::skipGroup() {
    // Counted, not called again for every group inside: bytes from outside choose how deep that goes.
    for (std::size_t depth = 1; depth != 0;) {
        const std::optional<Tag> tag = readTag();
        if (!tag) {
            return false;
        }
        if (tag->wireType == WireType::StartGroup) {
            ++depth;
        } else if (tag->wireType == WireType::EndGroup) {
            --depth;
        } else if (!skipPlain(tag->wireType)) {
            return false;
        }
    }
    return true;
}

bool RecordReader::skipBytes(std::uint64_t count) {
    if (count > rest_.size()) {
        return fail();
    }
    rest_.remove_prefix(static_cast<std::size_t>(count));
    return true;
}

bool RecordReader::fail() {
    failed_ = true;
    return false;
}

void RecordWriter::writeUnsigned(std::uint32_t field, std::uint64_t number) {
    writeTag(field, WireType::Varint);
    writeVarint(number);
}

void RecordWriter::writeSigned(std::uint32_t field, std::int32_t number) {
    // The sign goes through all 64 bits, so that a reader of 64-bit numbers reads the same.
    writeUnsigned(field, static_cast<std::uint64_t>(std::int64_t{number}));
}

void RecordWriter::writeBytes(std::uint32_t field, std::string_view bytes) {
    writeTag(field, WireType::LengthDelimited);
    writeVarint(bytes.size());
    bytes_ += bytes;
}

void RecordWriter::writeTag(std::uint32_t field, WireType wireType) {
    writeVarint(std::uint64_t{field} << kWireTypeBits | static_cast<std::uint64_t>(wireType));
}

void RecordWriter::writeVarint(std::uint64_t number) {
    constexpr std::uint64_t kMore = 0x80;
    for (; number >= kMore; number >>= 7U) {
        bytes_ += static_cast<char>(static_cast<unsigned char>(number | kMore));
    }
    bytes_ += static_cast<char>(number);
}

} // namespace vela::telemmetrics
