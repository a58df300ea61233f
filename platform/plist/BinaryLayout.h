// Where the objects of a binary property list stand, checked: nothing that a reader may then ask for lies outside the
// bytes. Immutable once made; the bytes outlive it.
//
// | "bplist00" | objects ... | offset table | trailer of 32 bytes |
//
// Trailer: 6 zero bytes, size of an offset (1), size of a reference (1), then big-endian u64: number of objects, index
// of the top object, start of the offset table, which reaches to the trailer.
//
// An object is a marker byte, kind in the high and count in the low half, and its content:
//
// | marker | object | content |
// | --- | --- | --- |
// | 08, 09 | false, true | |
// | 10 to 14 | integer | 2^count bytes; 1 to 4 bytes unsigned, 8 and 16 signed |
// | 22, 23 | real | float or double |
// | 33 | date | double, seconds since 2001-01-01 00:00:00 UTC |
// | 4c | data | count bytes |
// | 5c | string | count ASCII characters |
// | 6c | string | count UTF-16 code units |
// | Ac | array | count references |
// | Dc | dictionary | count references to keys, then count to values |
//
// A count of F says that an integer object with the count follows the marker. Numbers are big-endian.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace vela::platform::plist {

/// `count` bytes (at most 8) at `offset`, as a big-endian number.
std::uint64_t bigEndian(std::string_view bytes, std::size_t offset, std::size_t count);

enum class BinaryKind : std::uint8_t { False, True, Integer, Real, Date, Data, Ascii, Utf16, Array, Dictionary };

struct BinaryObject {
    BinaryKind kind = BinaryKind::False;
    std::size_t at = 0;      ///< offset of the marker
    std::size_t content = 0; ///< offset of what follows marker and count
    std::size_t count = 0;   ///< bytes of a number or data, characters, code units, values or entries
    std::size_t end = 0;     ///< offset behind it
};

class BinaryLayout {
public:
    explicit BinaryLayout(std::string_view bytes) : bytes_(bytes) {}

    /// Finds and checks everything: header, trailer, each object's kind and extent, references in range, no object
    /// inside another. False, with the error set, for anything wrong.
    bool read();

    const std::vector<BinaryObject>& objects() const { return objects_; }
    std::size_t top() const { return top_; }
    /// The object that the reference number `index` of a container names.
    std::size_t reference(const BinaryObject& container, std::size_t index) const;

    std::size_t errorOffset() const { return errorOffset_; }
    const std::string& errorReason() const { return errorReason_; }

private:
    bool readTrailer();
    bool readObject(BinaryObject& object);
    bool readMarker(BinaryObject& object, unsigned kind, unsigned low);
    bool readCount(BinaryObject& object, unsigned low);
    bool setExtent(BinaryObject& object, std::size_t unitBytes);
    bool checkReferences(const BinaryObject& container);
    bool checkDisjoint();
    bool failAt(std::size_t offset, std::string reason);

    std::string_view bytes_;
    std::size_t offsetBytes_ = 0;
    std::size_t referenceBytes_ = 0;
    std::size_t tableAt_ = 0;
    std::size_t top_ = 0;
    std::vector<BinaryObject> objects_;
    std::size_t errorOffset_ = 0;
    std::string errorReason_;
};

} // namespace vela::platform::plist
