// What values share: counted objects on the heap. Internal to this folder; everyone else uses Value.h and Dictionary.h.
//
// Every object begins with `Object`: a reference count and a size. A string or data object has its bytes behind it:
//
//     | references u32 | size u32 | bytes ... | zeros up to a multiple of 8 |
//
// An array or dictionary keeps its values as two arrays, so that one value takes nine bytes and equal objects can be
// compared by memcmp:
//
//     | references u32 | size u32 | shape (dictionary only) | payload u64 x size | kind u8 x size | zeros up to 8 |
#pragma once

#include <atomic>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>
#include <string_view>
#include <utility>

namespace vela {

enum class ValueKind : std::uint8_t {
    None, ///< no value: what a look-up answers for an absent key; never inside a container
    Boolean,
    Integer,  ///< signed 64 bits
    Unsigned, ///< only what lies above the signed range
    Real,     ///< double
    Real32,   ///< double that holds a 32-bit float exactly and is printed as one
    Date,     ///< seconds since 1970, double
    String,   ///< first of the kinds that are references
    Data,
    Array,
    Dictionary,
};

namespace detail {

struct Object {
    mutable std::atomic<std::uint32_t> references{1};
    std::uint32_t size = 0;
};

constexpr bool isReference(ValueKind kind) { return kind >= ValueKind::String; }

/// A string or data. The empty one is a null pointer.
struct BytesObject : Object {
    char* bytes() { return reinterpret_cast<char*>(this + 1); }
    const char* bytes() const { return reinterpret_cast<const char*>(this + 1); }
    std::string_view view() const { return {bytes(), size}; }
};

/// Bytes that a text of `size` takes, padding included.
constexpr std::size_t paddedBytes(std::size_t size) { return (size + 7) / 8 * 8; }

/// Copies `text` into a new object; null for none.
inline BytesObject* makeBytes(std::string_view text) {
    if (text.empty()) {
        return nullptr;
    }
    const std::size_t padded = paddedBytes(text.size());
    auto* object = ::new (::operator new(sizeof(BytesObject) + padded)) BytesObject;
    object->size = static_cast<std::uint32_t>(text.size());
    constexpr std::uint64_t kNone = 0;
    std::memcpy(object->bytes() + padded - sizeof(kNone), &kNone, sizeof(kNone));
    std::memcpy(object->bytes(), text.data(), text.size());
    return object;
}

inline std::uint64_t wordAt(const char* bytes) {
    std::uint64_t word = 0;
    std::memcpy(&word, bytes, sizeof(word));
    return word;
}

/// Whether `size` bytes (more than 0) are the same; up to 8 are followed by zeros to a multiple of 8.
inline bool sameBytes(const char* left, const char* right, std::uint32_t size) {
    if (size <= 8) {
        return wordAt(left) == wordAt(right);
    }
    const std::uint64_t ends = (wordAt(left) ^ wordAt(right)) | (wordAt(left + size - 8) ^ wordAt(right + size - 8));
    if (size <= 16) {
        return ends == 0;
    }
    if (size <= 32) {
        return (ends | (wordAt(left + 8) ^ wordAt(right + 8)) |
                (wordAt(left + size - 16) ^ wordAt(right + size - 16))) == 0;
    }
    return std::memcmp(left, right, size) == 0;
}

inline std::uint32_t halfWordAt(const char* bytes) {
    std::uint32_t halfWord = 0;
    std::memcpy(&halfWord, bytes, sizeof(halfWord));
    return halfWord;
}

/// Whether 4 to 8 bytes are the same, whatever follows them.
inline bool sameHalfWords(const char* left, const char* right, std::size_t size) {
    return ((halfWordAt(left) ^ halfWordAt(right)) | (halfWordAt(left + size - 4) ^ halfWordAt(right + size - 4))) == 0;
}

/// Whether two objects (null for none) hold the same bytes.
inline bool sameBytes(const BytesObject* left, const BytesObject* right) {
    if (left == nullptr || right == nullptr || left->size != right->size) {
        return left == right;
    }
    return sameBytes(left->bytes(), right->bytes(), left->size);
}

/// An array; a dictionary's object adds its shape (Dictionary.h). The empty one is a null pointer.
struct ArrayObject : Object {
    std::uint64_t* payloads() { return reinterpret_cast<std::uint64_t*>(this + 1); }
    const std::uint64_t* payloads() const { return reinterpret_cast<const std::uint64_t*>(this + 1); }
    ValueKind* kinds() { return reinterpret_cast<ValueKind*>(payloads() + size); }
    const ValueKind* kinds() const { return reinterpret_cast<const ValueKind*>(payloads() + size); }
};

struct ShapeObject;

struct DictionaryObject : Object {
    const ShapeObject* shape = nullptr;

    std::uint64_t* payloads() { return reinterpret_cast<std::uint64_t*>(this + 1); }
    const std::uint64_t* payloads() const { return reinterpret_cast<const std::uint64_t*>(this + 1); }
    ValueKind* kinds() { return reinterpret_cast<ValueKind*>(payloads() + size); }
    const ValueKind* kinds() const { return reinterpret_cast<const ValueKind*>(payloads() + size); }
};

inline std::uint64_t payloadOf(const Object* object) { return reinterpret_cast<std::uintptr_t>(object); }
template <class Type>
Type* objectOf(std::uint64_t payload) {
    return reinterpret_cast<Type*>(static_cast<std::uintptr_t>(payload));
}

inline void retain(const Object* object) {
    if (object != nullptr) {
        object->references.fetch_add(1, std::memory_order_relaxed);
    }
}

/// Whether the caller gave back the last reference and must destroy the object.
inline bool releaseIsLast(const Object* object) {
    // A sole owner needs no read-modify-write: nobody else can add a reference.
    if (object->references.load(std::memory_order_acquire) == 1) {
        return true;
    }
    return object->references.fetch_sub(1, std::memory_order_acq_rel) == 1;
}

/// Bytes of the value's object and of all inside it; 0 for what is kept in the payload itself.
std::size_t memoryOf(ValueKind kind, std::uint64_t payload);

/// Destroys an object whose last reference is gone, and gives back what it refers to.
void destroy(ValueKind kind, std::uint64_t payload);

/// Bytes that `size` payloads and kinds take, padding included.
constexpr std::size_t blockBytes(std::uint32_t size) {
    return size * sizeof(std::uint64_t) + (size + 7U) / 8U * sizeof(std::uint64_t);
}

/// Eight kinds at once, from the place where kind number `slot` (a multiple of 8) stands.
inline std::uint64_t eightKinds(const ValueKind* kinds, std::uint32_t slot) {
    std::uint64_t eight = 0;
    std::memcpy(&eight, kinds + slot, sizeof(eight));
    return eight;
}

/// Zeros the padding behind the kinds of `size` values (not none).
inline void clearPadding(ValueKind* kinds, std::uint32_t size) {
    constexpr std::uint64_t kNone = 0;
    std::memcpy(kinds + (size - 1) / 8 * 8, &kNone, sizeof(kNone));
}

/// Calls `use(slot)` for every one of `size` kinds that is a reference.
template <class Use>
void forEachReference(const ValueKind* kinds, std::uint32_t size, const Use& use) {
    // Adding this lifts the kinds from String on, and no others, over 0x7F.
    constexpr std::uint64_t kLift = 0x0101010101010101U * (0x80U - static_cast<std::uint64_t>(ValueKind::String));
    constexpr std::uint64_t kHighBits = 0x8080808080808080U;
    for (std::uint32_t first = 0; first < size; first += 8) {
        std::uint64_t references = (eightKinds(kinds, first) + kLift) & kHighBits;
        for (; references != 0; references &= references - 1) {
            use(first + static_cast<std::uint32_t>(std::countr_zero(references)) / 8U);
        }
    }
}

inline void retainValue(ValueKind kind, std::uint64_t payload) {
    if (isReference(kind)) {
        retain(objectOf<const Object>(payload));
    }
}

inline void releaseValue(ValueKind kind, std::uint64_t payload) {
    if (isReference(kind) && payload != 0 && releaseIsLast(objectOf<const Object>(payload))) {
        destroy(kind, payload);
    }
}

/// Exact equality of two dictionaries; null is the empty one.
bool equalDictionaries(const DictionaryObject* left, const DictionaryObject* right);

/// Exact equality (see `ValueRef`).
bool equal(ValueKind leftKind, std::uint64_t left, ValueKind rightKind, std::uint64_t right);

} // namespace detail

} // namespace vela
