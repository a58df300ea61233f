// What records of the metrics service are made of: their base, and the reader, the writer and the text formatters that
// a record is handed. The wire format is protobuf's:
//
//     record = (tag value)...     tag = varint(field number * 8 + wire type)
//     wire type 0 varint, 1 eight bytes, 2 varint(length) and bytes, 3 group up to a tag of type 4, 5 four bytes
//
// A varint has 7 bits in each byte, lowest first, and bit 7 in all bytes but its last; it has ten bytes at most.
// One thread at a time.
#pragma once

#include "common/values/Dictionary.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace vela::telemmetrics {

enum class WireType : std::uint8_t {
    Varint = 0,
    EightBytes = 1,
    LengthDelimited = 2,
    StartGroup = 3,
    EndGroup = 4,
    FourBytes = 5,
};

struct Tag {
    std::uint64_t field;
    WireType wireType; ///< any number of 3 bits
};

/// Goes through bytes from outside, which outlive it. After an error there is nothing more to read.
class RecordReader {
public:
    explicit RecordReader(std::string_view bytes) : rest_(bytes) {}

    bool hasMore() const { return !failed_ && !rest_.empty(); }
    bool hasError() const { return failed_; }

    // Each answers none, and sets the error, where the bytes are cut off or malformed.
    std::optional<Tag> readTag();
    /// The lowest 64 bits.
    std::optional<std::uint64_t> readVarint();
    /// A length and so many bytes; borrowed.
    std::optional<std::string_view> readBytes();

    /// Skips the value after a tag of `wireType`, a group with all that is in it. Whether that worked.
    bool skip(WireType wireType);

private:
    bool skipBytes(std::uint64_t count);
    bool skipGroup();
    bool skipPlain(WireType wireType);
    bool fail();

    std::string_view rest_;
    bool failed_ = false;
};

/// Collects a record's bytes.
class RecordWriter {
public:
    void writeUnsigned(std::uint32_t field, std::uint64_t number);
    /// A negative number takes ten bytes.
    void writeSigned(std::uint32_t field, std::int32_t number);
    void writeBytes(std::uint32_t field, std::string_view bytes);

    const std::string& bytes() const { return bytes_; }

private:
    void writeTag(std::uint32_t field, WireType wireType);
    void writeVarint(std::uint64_t number);

    std::string bytes_;
};

/// Takes the fields of a record by name, for people to read.
class RecordTextFormatter {
public:
    virtual ~RecordTextFormatter() = default;

    virtual void beginObject(std::string_view name) = 0;
    virtual void endObject() = 0;
    virtual void format(std::string_view name, std::string_view text) = 0;
    virtual void format(std::string_view name, std::int32_t number) = 0;
    virtual void format(std::string_view name, std::uint64_t number) = 0;
};

/// Makes a dictionary of one record's fields, in the order given.
class RecordDictionaryFormatter final : public RecordTextFormatter {
public:
    void beginObject(std::string_view) override {}
    void endObject() override {}
    void format(std::string_view name, std::string_view text) override { fields_.add(name, text); }
    void format(std::string_view name, std::int32_t number) override { fields_.add(name, number); }
    void format(std::string_view name, std::uint64_t number) override { fields_.add(name, number); }

    /// The fields so far; the formatter is empty afterwards.
    Dictionary fields() { return fields_.build(); }

private:
    DictionaryBuilder fields_;
};

class Record {
public:
    virtual ~Record() = default;

    /// Sets the fields that are read and leaves the others as they are. Whether all bytes were well-formed.
    virtual bool readFrom(RecordReader& reader) = 0;
    virtual void writeTo(RecordWriter& writer) const = 0;
    virtual void formatText(RecordTextFormatter& formatter, std::string_view name) const = 0;

protected:
    Record() = default;
    Record(const Record&) = default;
    Record(Record&&) = default;
    Record& operator=(const Record&) = default;
    Record& operator=(Record&&) = default;
};

} // namespace vela::telemmetrics
