#include "client/ValueEncoder.h"

#include "common/values/Utf8.h"
#include "platform/dbus/Names.h"
#include "platform/dbus/Protocol.h"

#include <cassert>
#include <cstring>
#include <string_view>

namespace vela::client {

namespace {

namespace dbus = platform::dbus;

constexpr std::string_view kReplacement = "\xEF\xBF\xBD"; // U+FFFD
constexpr std::string_view kEpochKey = "velareporting_timestamp";
constexpr std::string_view kSystemUptimeKey = "systemuptime_sec";
constexpr std::string_view kProcessUptimeKey = "processuptime_ms";

/// Calls `part` with the pieces of `text` after repair.
template <class Part>
void forEachRepairedPart(std::string_view text, const Part& part) {
    while (!text.empty()) {
        const Utf8Step step = utf8Step(text);
        const bool good = step.valid && step.codePoint != 0;
        part(good ? text.substr(0, step.bytes) : kReplacement);
        text.remove_prefix(step.bytes);
    }
}

/// The first step: counts and checks.
class Measuring {
public:
    explicit Measuring(std::size_t most) : most_(most) {}

    bool ended() const { return status_ != VelaReportingStatusOk; }
    void refuse() { status_ = VelaReportingStatusInvalidArgument; }
    Measure result() const { return {status_, position_}; }

    void align(std::size_t alignment) { position_ = (position_ + alignment - 1) & ~(alignment - 1); }
    template <class Number>
    void number(Number) {
        align(sizeof(Number));
        advance(sizeof(Number));
    }
    void signature(std::string_view code) { advance(code.size() + 2); }
    void text(const void* bytes, std::size_t size) {
        number(std::uint32_t{0});
        if (!readable(bytes, size)) {
            return;
        }
        const std::string_view text(static_cast<const char*>(bytes), size);
        std::size_t repaired = size;
        if (!dbus::isValidText(text)) [[unlikely]] {
            repaired = 0;
            forEachRepairedPart(text, [&repaired](std::string_view part) { repaired += part.size(); });
        }
        advance(repaired + 1);
    }
    void data(const void* bytes, std::size_t size) {
        number(std::uint32_t{0});
        if (readable(bytes, size)) {
            advance(size);
        }
    }
    std::size_t open(std::size_t elementAlignment) {
        number(std::uint32_t{0});
        align(elementAlignment);
        return 0;
    }
    void close(std::size_t /*lengthAt*/, std::size_t /*elementsAt*/) {}
    std::size_t position() const { return position_; }

private:
    bool readable(const void* bytes, std::size_t size) {
        if (bytes == nullptr && size != 0) {
            refuse();
        } else if (size > most_) {
            status_ = VelaReportingStatusTooLarge;
        }
        return !ended();
    }
    void advance(std::size_t bytes) {
        position_ += bytes;
        if (position_ > most_ && !ended()) {
            status_ = VelaReportingStatusTooLarge;
        }
    }

    std::size_t most_;
    std::size_t position_ = 0;
    VelaReportingStatus status_ = VelaReportingStatusOk;
};

/// The second step.
class Writing {
public:
    explicit Writing(std::span<std::byte> body) : body_(body) {}

    static constexpr bool ended() { return false; }
    static void refuse() { assert(false); }
    bool complete() const { return position_ == body_.size(); }

    void align(std::size_t alignment) {
        for (; (position_ & (alignment - 1)) != 0; ++position_) {
            body_[position_] = std::byte{0};
        }
    }
    template <class Number>
    void number(Number value) {
        align(sizeof(Number));
        put(&value, sizeof(value));
    }
    void signature(std::string_view code) {
        number(static_cast<std::uint8_t>(code.size()));
        put(code.data(), code.size());
        number(std::uint8_t{0});
    }
    void text(const void* bytes, std::size_t size) {
        const std::string_view text(static_cast<const char*>(bytes), size);
        if (dbus::isValidText(text)) [[likely]] {
            number(static_cast<std::uint32_t>(size));
            put(bytes, size);
        } else {
            number(std::uint32_t{0});
            const std::size_t from = position_;
            forEachRepairedPart(text, [this](std::string_view part) { put(part.data(), part.size()); });
            putLength(from - sizeof(std::uint32_t), position_ - from);
        }
        number(std::uint8_t{0});
    }
    void data(const void* bytes, std::size_t size) {
        number(static_cast<std::uint32_t>(size));
        put(bytes, size);
    }
    /// Where the length stands.
    std::size_t open(std::size_t elementAlignment) {
        number(std::uint32_t{0});
        const std::size_t lengthAt = position_ - sizeof(std::uint32_t);
        align(elementAlignment);
        return lengthAt;
    }
    void close(std::size_t lengthAt, std::size_t elementsAt) { putLength(lengthAt, position_ - elementsAt); }
    std::size_t position() const { return position_; }

private:
    void put(const void* bytes, std::size_t size) {
        assert(body_.size() - position_ >= size);
        if (size != 0) {
            std::memcpy(body_.data() + position_, bytes, size);
            position_ += size;
        }
    }
    void putLength(std::size_t at, std::size_t length) {
        const auto number = static_cast<std::uint32_t>(length);
        std::memcpy(body_.data() + at, &number, sizeof(number));
    }

    std::span<std::byte> body_;
    std::size_t position_ = 0;
};

/// An array, with `elements` between its ends.
template <class Sink, class Elements>
void array(Sink& sink, std::size_t elementAlignment, const Elements& elements) {
    const std::size_t lengthAt = sink.open(elementAlignment);
    const std::size_t elementsAt = sink.position();
    elements();
    sink.close(lengthAt, elementsAt);
}

template <class Sink>
void value(Sink& sink, const VelaReportingValue& value, unsigned depth);

template <class Sink>
void entries(Sink& sink, std::span<const VelaReportingField> fields, unsigned depth) {
    for (const VelaReportingField& field : fields) {
        if (sink.ended()) {
            return;
        }
        sink.align(8);
        sink.text(field.key, field.keySize);
        value(sink, field.value, depth);
    }
}

/// An array or a dictionary, which stands `depth` deep.
template <class Sink>
void container(Sink& sink, const VelaReportingValue& content, unsigned depth) {
    const bool isArray = content.kind == VelaReportingKindArray;
    const bool missing = isArray ? content.as.array.values == nullptr && content.as.array.count != 0
                                 : content.as.dictionary.fields == nullptr && content.as.dictionary.count != 0;
    if (missing || depth > kMostDepth) {
        return sink.refuse();
    }
    if (!isArray) {
        sink.signature("a{sv}");
        return array(sink, 8, [&] {
            entries(sink, {content.as.dictionary.fields, content.as.dictionary.count}, depth);
        });
    }
    sink.signature("av");
    array(sink, 1, [&] {
        for (std::size_t index = 0; index < content.as.array.count && !sink.ended(); ++index) {
            value(sink, content.as.array.values[index], depth);
        }
    });
}

/// A variant in a container that stands `depth` deep.
template <class Sink>
void value(Sink& sink, const VelaReportingValue& value, unsigned depth) {
    switch (value.kind) {
    case VelaReportingKindBoolean:
        sink.signature("b");
        return sink.number(value.as.boolean ? std::uint32_t{1} : std::uint32_t{0});
    case VelaReportingKindInteger:
        sink.signature("x");
        return sink.number(value.as.integer);
    case VelaReportingKindUnsigned:
        sink.signature("t");
        return sink.number(value.as.unsignedInteger);
    case VelaReportingKindDouble:
        sink.signature("d");
        return sink.number(value.as.real);
    case VelaReportingKindText:
        sink.signature("s");
        return sink.text(value.as.bytes.bytes, value.as.bytes.size);
    case VelaReportingKindData:
        sink.signature("ay");
        return sink.data(value.as.bytes.bytes, value.as.bytes.size);
    case VelaReportingKindDate:
        sink.signature("(sd)");
        sink.align(8);
        sink.text(dbus::kDateText.data(), dbus::kDateText.size());
        return sink.number(value.as.real);
    case VelaReportingKindArray:
    case VelaReportingKindDictionary:
        return container(sink, value, depth + 1);
    default:
        return sink.refuse();
    }
}

/// Whether one of `fields` has this key. Most keys differ in their length already.
bool has(std::span<const VelaReportingField> fields, std::string_view key) {
    for (const VelaReportingField& field : fields) {
        if (field.keySize == key.size() && field.key != nullptr &&
            std::memcmp(field.key, key.data(), key.size()) == 0) {
            return true;
        }
    }
    return false;
}

/// An entry of a key and a type of our own.
template <class Sink, class Number>
void stamp(Sink& sink, std::string_view key, std::string_view code, Number number) {
    sink.align(8);
    sink.text(key.data(), key.size());
    sink.signature(code);
    sink.number(number);
}

template <class Sink>
void stamps(Sink& sink, const MessageArguments& arguments) {
    if (!has(arguments.fields, kEpochKey)) {
        stamp(sink, kEpochKey, "d", arguments.stamps.epochSeconds);
    }
    if (!has(arguments.fields, kSystemUptimeKey)) {
        stamp(sink, kSystemUptimeKey, "i", arguments.stamps.systemUptimeSeconds);
    }
    if (!has(arguments.fields, kProcessUptimeKey)) {
        stamp(sink, kProcessUptimeKey, "x", arguments.stamps.processUptimeMilliseconds);
    }
}

template <class Sink>
void message(Sink& sink, const MessageArguments& arguments) {
    array(sink, 8, [&] {
        entries(sink, arguments.fields, 1);
        stamps(sink, arguments);
    });
    sink.number(arguments.category);
    sink.number(arguments.type);
    array(sink, 4, [&] {
        if (arguments.toAll) {
            return;
        }
        array(sink, 8, [&] {
            for (const std::int64_t reporterID : arguments.reporterIDs) {
                if (sink.ended()) {
                    return;
                }
                sink.number(reporterID);
            }
        });
    });
}

template <class Sink>
void configuration(Sink& sink, const ConfigurationArguments& arguments) {
    array(sink, 8, [&] { entries(sink, arguments.fields, 1); });
    sink.number(arguments.reporterID);
}

} // namespace

Measure measure(const MessageArguments& arguments, std::size_t most) {
    Measuring sink(most);
    message(sink, arguments);
    return sink.result();
}

Measure measure(const ConfigurationArguments& arguments, std::size_t most) {
    Measuring sink(most);
    configuration(sink, arguments);
    return sink.result();
}

void write(const MessageArguments& arguments, std::span<std::byte> body) {
    Writing sink(body);
    message(sink, arguments);
    assert(sink.complete());
}

void write(const ConfigurationArguments& arguments, std::span<std::byte> body) {
    Writing sink(body);
    configuration(sink, arguments);
    assert(sink.complete());
}

} // namespace vela::client
