// Property-list values: what messages, configurations and preferences are made of.
//
// Values are immutable once built and shared by reference; a copy is a pointer and a count. All types here may be
// copied, read and destroyed on any thread; one object must not be assigned while another thread uses that same object.
//
// - `Value` owns, `ValueRef` borrows (valid while the owner lives) and may be none.
// - `String` and `Data` are byte strings; a string's bytes are meant to be UTF-8. A string has an identity:
//   `isSameObject` tells whether two are the very same object, however they compare.
// - Equality is exact: an integer 1, a boolean true and a real 1.0 are three different values. Reals are equal when
// their
//   numbers are, whatever their width, and two that are not a number are equal. Dictionaries are equal whatever their
//   order of keys. `numericallyEqual` compares by number instead.
#pragma once

#include "common/values/Object.h"

#include <cassert>
#include <concepts>
#include <cstddef>
#include <limits>
#include <string_view>
#include <type_traits>
#include <utility>

namespace vela {

class Array;
class Dictionary;
class Value;

/// Seconds since 1970-01-01 00:00:00 UTC.
struct Date {
    double seconds = 0;

    friend bool operator==(Date, Date) = default;
};

namespace detail {

/// One counted reference to a string's or data's object.
class BytesReference {
public:
    BytesReference() = default;
    explicit BytesReference(std::string_view bytes) : object_(makeBytes(bytes)) {}
    explicit BytesReference(BytesObject* retained) : object_(retained) {}
    BytesReference(const BytesReference& other) : object_(other.object_) { retain(object_); }
    BytesReference(BytesReference&& other) noexcept : object_(std::exchange(other.object_, nullptr)) {}
    BytesReference& operator=(BytesReference other) noexcept {
        std::swap(object_, other.object_);
        return *this;
    }
    ~BytesReference() { releaseValue(ValueKind::String, payloadOf(object_)); }

    std::string_view view() const { return object_ == nullptr ? std::string_view() : object_->view(); }
    BytesObject* object() const { return object_; }
    BytesObject* take() { return std::exchange(object_, nullptr); }

private:
    BytesObject* object_ = nullptr;
};

} // namespace detail

class String {
public:
    /// The empty string.
    String() = default;
    /// A new object with a copy of `text`, of less than 4 GiB. All empty strings are one object.
    explicit String(std::string_view text) : bytes_(text) {}

    std::string_view view() const { return bytes_.view(); }
    bool isSameObject(const String& other) const { return bytes_.object() == other.bytes_.object(); }
    friend bool operator==(const String& left, const String& right) { return left.view() == right.view(); }

private:
    friend class Value;
    friend class ValueRef;
    explicit String(detail::BytesReference bytes) : bytes_(std::move(bytes)) {}

    detail::BytesReference bytes_;
};

class Data {
public:
    /// No bytes.
    Data() = default;
    /// A copy of `bytes`, of less than 4 GiB.
    explicit Data(std::string_view bytes) : bytes_(bytes) {}

    std::string_view view() const { return bytes_.view(); }
    friend bool operator==(const Data& left, const Data& right) { return left.view() == right.view(); }

private:
    friend class Value;
    friend class ValueRef;
    explicit Data(detail::BytesReference bytes) : bytes_(std::move(bytes)) {}

    detail::BytesReference bytes_;
};

/// A value that somebody else owns, or none.
class ValueRef {
public:
    ValueRef() = default;

    ValueKind kind() const { return kind_; }
    explicit operator bool() const { return kind_ != ValueKind::None; }
    bool isString() const { return kind_ == ValueKind::String; }
    bool isDictionary() const { return kind_ == ValueKind::Dictionary; }
    bool isArray() const { return kind_ == ValueKind::Array; }
    /// Booleans count: they are numbers 0 and 1.
    bool isNumber() const { return kind_ >= ValueKind::Boolean && kind_ <= ValueKind::Real32; }

    // The content of a value whose kind is known.
    bool boolean() const { return expect(ValueKind::Boolean), payload_ != 0; }
    std::int64_t integer() const { return expect(ValueKind::Integer), static_cast<std::int64_t>(payload_); }
    std::uint64_t unsignedInteger() const { return expect(ValueKind::Unsigned), payload_; }
    double real() const {
        assert(kind_ == ValueKind::Real || kind_ == ValueKind::Real32);
        return std::bit_cast<double>(payload_);
    }
    Date date() const { return expect(ValueKind::Date), Date{std::bit_cast<double>(payload_)}; }
    /// The text of a string; borrowed.
    std::string_view text() const { return expect(ValueKind::String), bytesView(); }
    /// The bytes of data; borrowed.
    std::string_view bytes() const { return expect(ValueKind::Data), bytesView(); }
    String string() const { return expect(ValueKind::String), String(sharedBytes()); }
    Data data() const { return expect(ValueKind::Data), Data(sharedBytes()); }
    Array array() const;
    Dictionary dictionary() const;

    // A number read as another kind of number; `otherwise` for what is no number.
    double doubleValue(double otherwise = 0) const;
    bool booleanValue(bool otherwise = false) const;
    /// Reals are cut toward zero and kept within the range; what is not a number gives 0.
    std::int64_t integerValue(std::int64_t otherwise = 0) const;

    /// Whether both are the very same object. Never true for numbers and dates, which have no identity.
    bool isSameObject(ValueRef other) const {
        return detail::isReference(kind_) && kind_ == other.kind_ && payload_ == other.payload_;
    }

    friend bool operator==(ValueRef left, ValueRef right) {
        return detail::equal(left.kind_, left.payload_, right.kind_, right.payload_);
    }

private:
    friend class Value;
    friend class Array;
    friend class Dictionary;
    friend std::size_t memoryOf(ValueRef value);
    ValueRef(ValueKind kind, std::uint64_t payload) : payload_(payload), kind_(kind) {}

    void expect([[maybe_unused]] ValueKind kind) const { assert(kind_ == kind); }
    std::string_view bytesView() const {
        return payload_ == 0 ? std::string_view() : detail::objectOf<const detail::BytesObject>(payload_)->view();
    }
    detail::BytesReference sharedBytes() const {
        auto* object = detail::objectOf<detail::BytesObject>(payload_);
        detail::retain(object);
        return detail::BytesReference(object);
    }

    std::uint64_t payload_ = 0;
    ValueKind kind_ = ValueKind::None;
};

/// Bytes of memory that `value` holds: its objects with everything inside them, also what it shares with other values,
/// without the allocator's own. Keys count where hardly any other dictionary has the same ones in the same order, so
/// the answer may be another one the next time.
inline std::size_t memoryOf(ValueRef value) { return detail::memoryOf(value.kind_, value.payload_); }

/// Whether two numbers (booleans among them) are equal as numbers, exactly; what is no number equals nothing.
bool numericallyEqual(ValueRef left, ValueRef right);

template <class Type>
concept ValueInteger =
    std::integral<Type> && !std::same_as<Type, bool> && !std::same_as<Type, char> && !std::same_as<Type, wchar_t> &&
    !std::same_as<Type, char8_t> && !std::same_as<Type, char16_t> && !std::same_as<Type, char32_t>;

class Value {
public:
    /// None.
    Value() = default;
    template <std::same_as<bool> Boolean>
    Value(Boolean boolean) : payload_(boolean ? 1 : 0),
                             kind_(ValueKind::Boolean) {}
    template <ValueInteger Integer>
    Value(Integer integer) : payload_(static_cast<std::uint64_t>(integer)),
                             kind_(ValueKind::Integer) {
        if constexpr (std::unsigned_integral<Integer> && sizeof(Integer) == sizeof(std::uint64_t)) {
            if (integer > static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
                kind_ = ValueKind::Unsigned;
            }
        }
    }
    Value(double real) : payload_(std::bit_cast<std::uint64_t>(real)), kind_(ValueKind::Real) {}
    Value(float real) : payload_(std::bit_cast<std::uint64_t>(static_cast<double>(real))), kind_(ValueKind::Real32) {}
    Value(Date date) : payload_(std::bit_cast<std::uint64_t>(date.seconds)), kind_(ValueKind::Date) {}
    /// A new string.
    Value(std::string_view text) : payload_(detail::payloadOf(detail::makeBytes(text))), kind_(ValueKind::String) {}
    Value(const char* text) : Value(std::string_view(text)) {}
    Value(String string) : payload_(detail::payloadOf(string.bytes_.take())), kind_(ValueKind::String) {}
    Value(Data data) : payload_(detail::payloadOf(data.bytes_.take())), kind_(ValueKind::Data) {}
    Value(Array array);
    Value(Dictionary dictionary);
    /// Shares what `borrowed` refers to.
    explicit Value(ValueRef borrowed) : payload_(borrowed.payload_), kind_(borrowed.kind_) {
        detail::retainValue(kind_, payload_);
    }

    Value(const Value& other) : payload_(other.payload_), kind_(other.kind_) { detail::retainValue(kind_, payload_); }
    Value(Value&& other) noexcept
        : payload_(std::exchange(other.payload_, 0)),
          kind_(std::exchange(other.kind_, ValueKind::None)) {}
    Value& operator=(Value other) noexcept {
        std::swap(payload_, other.payload_);
        std::swap(kind_, other.kind_);
        return *this;
    }
    ~Value() { detail::releaseValue(kind_, payload_); }

    operator ValueRef() const { return {kind_, payload_}; }
    ValueKind kind() const { return kind_; }
    explicit operator bool() const { return kind_ != ValueKind::None; }
    ValueRef ref() const { return *this; }

    friend bool operator==(const Value& left, const Value& right) { return left.ref() == right.ref(); }

private:
    friend class ArrayBuilder;
    friend class Dictionary;
    friend class DictionaryBuilder;

    /// Hands the reference on; the value is none afterwards.
    std::uint64_t take() {
        kind_ = ValueKind::None;
        return std::exchange(payload_, 0);
    }

    std::uint64_t payload_ = 0;
    ValueKind kind_ = ValueKind::None;
};

} // namespace vela
