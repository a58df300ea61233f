#include "platform/plist/BinaryLayout.h"

#include <algorithm>
#include <utility>

namespace vela::platform::plist {

namespace {

constexpr std::string_view kHeader = "bplist00";
constexpr std::size_t kTrailerBytes = 32;
constexpr std::size_t kLargestIntegerBytes = 8; // of an offset, a reference or a count
constexpr unsigned kCountFollows = 0xF;

unsigned char byteAt(std::string_view bytes, std::size_t offset) { return static_cast<unsigned char>(bytes[offset]); }

} // namespace

std::uint64_t bigEndian(std::string_view bytes, std::size_t offset, std::size_t count) {
    std::uint64_t number = 0;
    for (std::size_t index = 0; index < count; ++index) {
        number = (number << 8U) | byteAt(bytes, offset + index);
    }
    return number;
}

bool BinaryLayout::read() {
    if (!readTrailer()) {
        return false;
    }
    for (std::size_t index = 0; index < objects_.size(); ++index) {
        const std::size_t entryAt = tableAt_ + index * offsetBytes_;
        const std::uint64_t at = bigEndian(bytes_, entryAt, offsetBytes_);
        if (at < kHeader.size() || at >= tableAt_) {
            return failAt(entryAt, "this offset is outside the objects");
        }
        objects_[index].at = static_cast<std::size_t>(at);
        if (!readObject(objects_[index])) {
            return false;
        }
    }
    return checkDisjoint() && std::all_of(objects_.begin(), objects_.end(),
                                          [this](const BinaryObject& object) { return checkReferences(object); });
}

std::size_t BinaryLayout::reference(const BinaryObject& container, std::size_t index) const {
    return static_cast<std::size_t>(bigEndian(bytes_, container.content + index * referenceBytes_, referenceBytes_));
}

bool BinaryLayout::readTrailer() {
    if (!bytes_.starts_with(kHeader)) {
        return failAt(0, "the header \"bplist00\" is missing");
    }
    if (bytes_.size() < kHeader.size() + kTrailerBytes) {
        return failAt(bytes_.size(), "the trailer is missing");
    }
    const std::size_t trailerAt = bytes_.size() - kTrailerBytes;
    if (bigEndian(bytes_, trailerAt, 6) != 0) {
        return failAt(trailerAt, "the trailer's unused bytes are not zero");
    }
    offsetBytes_ = byteAt(bytes_, trailerAt + 6);
    referenceBytes_ = byteAt(bytes_, trailerAt + 7);
    if (offsetBytes_ == 0 || offsetBytes_ > kLargestIntegerBytes || referenceBytes_ == 0 ||
        referenceBytes_ > kLargestIntegerBytes) {
        return failAt(trailerAt + 6, "offsets and references have 1 to 8 bytes");
    }
    const std::uint64_t objects = bigEndian(bytes_, trailerAt + 8, 8);
    const std::uint64_t top = bigEndian(bytes_, trailerAt + 16, 8);
    const std::uint64_t tableAt = bigEndian(bytes_, trailerAt + 24, 8);
    if (tableAt < kHeader.size() || tableAt > trailerAt) {
        return failAt(trailerAt + 24, "the offset table is outside the bytes");
    }
    const std::uint64_t tableBytes = trailerAt - tableAt;
    if (objects == 0 || tableBytes % offsetBytes_ != 0 || objects != tableBytes / offsetBytes_) {
        return failAt(trailerAt + 8, "the number of objects is not that of the offset table");
    }
    if (top >= objects) {
        return failAt(trailerAt + 16, "there is no such top object");
    }
    tableAt_ = static_cast<std::size_t>(tableAt);
    top_ = static_cast<std::size_t>(top);
    objects_.resize(static_cast<std::size_t>(objects));
    return true;
}

bool BinaryLayout::readObject(BinaryObject& object) {
    const unsigned marker = byteAt(bytes_, object.at);
    object.content = object.at + 1;
    return readMarker(object, marker >> 4U, marker & 0xFU);
}

bool BinaryLayout::readMarker(BinaryObject& object, unsigned kind, unsigned low) {
    const auto sized = [&](BinaryKind is, std::size_t bytes) {
        object.kind = is;
        object.count = bytes;
        return setExtent(object, 1);
    };
    const auto counted = [&](BinaryKind is, std::size_t unitBytes) {
        object.kind = is;
        return readCount(object, low) && setExtent(object, unitBytes);
    };
    switch (kind) {
    case 0x0:
        if (low == 8 || low == 9) {
            return sized(low == 9 ? BinaryKind::True : BinaryKind::False, 0);
        }
        return failAt(object.at, low == 0 ? "null is not taken" : "unknown object");
    case 0x1:
        return low <= 4 ? sized(BinaryKind::Integer, std::size_t{1} << low) : failAt(object.at, "unknown integer");
    case 0x2:
        return low == 2 || low == 3 ? sized(BinaryKind::Real, std::size_t{1} << low)
                                    : failAt(object.at, "a real has 4 or 8 bytes");
    case 0x3:
        return low == 3 ? sized(BinaryKind::Date, 8) : failAt(object.at, "a date has 8 bytes");
    case 0x4:
        return counted(BinaryKind::Data, 1);
    case 0x5:
        return counted(BinaryKind::Ascii, 1);
    case 0x6:
        return counted(BinaryKind::Utf16, 2);
    case 0x8:
        return failAt(object.at, "an archiver's UID is not taken");
    case 0xA:
        return counted(BinaryKind::Array, referenceBytes_);
    case 0xC:
        return failAt(object.at, "a set is not taken");
    case 0xD:
        return counted(BinaryKind::Dictionary, 2 * referenceBytes_);
    default:
        return failAt(object.at, "unknown object");
    }
}

bool BinaryLayout::readCount(BinaryObject& object, unsigned low) {
    object.count = low;
    if (low != kCountFollows) {
        return true;
    }
    const std::size_t left = tableAt_ - object.content;
    const unsigned marker = left == 0 ? 0 : byteAt(bytes_, object.content);
    const std::size_t countBytes = std::size_t{1} << (marker & 0x3U);
    if (marker < 0x10 || marker > 0x13 || countBytes >= left) {
        return failAt(object.at, "the count of this object is malformed");
    }
    const std::uint64_t count = bigEndian(bytes_, object.content + 1, countBytes);
    if (count > bytes_.size()) {
        return failAt(object.at, "this object reaches beyond the objects");
    }
    object.count = static_cast<std::size_t>(count);
    object.content += 1 + countBytes;
    return true;
}

bool BinaryLayout::setExtent(BinaryObject& object, std::size_t unitBytes) {
    if (object.count > (tableAt_ - object.content) / unitBytes) {
        return failAt(object.at, "this object reaches beyond the objects");
    }
    object.end = object.content + object.count * unitBytes;
    return true;
}

bool BinaryLayout::checkReferences(const BinaryObject& container) {
    if (container.kind != BinaryKind::Array && container.kind != BinaryKind::Dictionary) {
        return true;
    }
    const std::size_t references = (container.end - container.content) / referenceBytes_;
    for (std::size_t index = 0; index < references; ++index) {
        const std::size_t at = container.content + index * referenceBytes_;
        if (bigEndian(bytes_, at, referenceBytes_) >= objects_.size()) {
            return failAt(at, "there is no object of this number");
        }
    }
    return true;
}

/// Objects inside each other would let few bytes stand for very many.
bool BinaryLayout::checkDisjoint() {
    std::vector<std::pair<std::size_t, std::size_t>> extents;
    extents.reserve(objects_.size());
    for (const BinaryObject& object : objects_) {
        extents.emplace_back(object.at, object.end);
    }
    std::sort(extents.begin(), extents.end());
    for (std::size_t index = 1; index < extents.size(); ++index) {
        if (extents[index].first < extents[index - 1].second) {
            return failAt(extents[index].first, "this object begins inside another one");
        }
    }
    return true;
}

bool BinaryLayout::failAt(std::size_t offset, std::string reason) {
    errorOffset_ = offset;
    errorReason_ = std::move(reason);
    return false;
}

} // namespace vela::platform::plist
