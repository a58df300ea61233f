#include "common/values/Value.h"

#include "common/values/Dictionary.h"

#include <cmath>
#include <cstring>

namespace vela {

namespace detail {

namespace {

template <class Container>
void destroyContainer(Container* object) {
    forEachReference(object->kinds(), object->size,
                     [object](std::uint32_t slot) { releaseValue(object->kinds()[slot], object->payloads()[slot]); });
    const std::size_t bytes = sizeof(Container) + blockBytes(object->size);
    object->~Container();
    ::operator delete(object, bytes);
}

bool isReal(ValueKind kind) { return kind == ValueKind::Real || kind == ValueKind::Real32; }

// Equal as numbers, or both not a number: what a message repeats is a repeat.
bool sameReal(double left, double right) { return left == right || (std::isnan(left) && std::isnan(right)); }

bool equalBytes(std::uint64_t left, std::uint64_t right) {
    return sameBytes(objectOf<const BytesObject>(left), objectOf<const BytesObject>(right));
}

bool haveSameKinds(const ValueKind* left, const ValueKind* right, std::uint32_t size) {
    std::uint64_t difference = 0;
    for (std::uint32_t first = 0; first < size; first += 8) {
        difference |= eightKinds(left, first) ^ eightKinds(right, first);
    }
    return difference == 0;
}

// Kinds that differ: a real of another width may still be equal. Out of line, as the usual case needs none of it.
[[gnu::noinline]] bool equalSlotBySlot(const ValueKind* leftKinds, const std::uint64_t* left,
                                       const ValueKind* rightKinds, const std::uint64_t* right, std::uint32_t size) {
    for (std::uint32_t slot = 0; slot < size; ++slot) {
        if (!equal(leftKinds[slot], left[slot], rightKinds[slot], right[slot])) {
            return false;
        }
    }
    return true;
}

// Both blocks belong to containers of `size` values. The usual ones have the same kinds, so that most values are equal
// or different by their payloads alone.
bool equalBlocks(const ValueKind* leftKinds, const std::uint64_t* left, const ValueKind* rightKinds,
                 const std::uint64_t* right, std::uint32_t size) {
    if (!haveSameKinds(leftKinds, rightKinds, size)) {
        return equalSlotBySlot(leftKinds, left, rightKinds, right, size);
    }
    for (std::uint32_t slot = 0; slot < size; ++slot) {
        if (left[slot] == right[slot]) {
            continue;
        }
        const ValueKind kind = leftKinds[slot];
        if (kind == ValueKind::String ? !equalBytes(left[slot], right[slot])
                                      : !equal(kind, left[slot], kind, right[slot])) {
            return false;
        }
    }
    return true;
}

bool equalArrays(const ArrayObject* left, const ArrayObject* right) {
    if (left == right) {
        return true;
    }
    if (left == nullptr || right == nullptr || left->size != right->size) {
        return false;
    }
    return equalBlocks(left->kinds(), left->payloads(), right->kinds(), right->payloads(), left->size);
}

// Kept out of line, so that the usual case, one shape, has nothing to save on the stack.
[[gnu::noinline]] bool equalWhateverTheOrder(const DictionaryObject* left, const DictionaryObject* right) {
    if (left->size != right->size) {
        return false;
    }
    for (std::uint32_t slot = 0; slot < left->size; ++slot) {
        const std::uint32_t other = right->shape->slotOf(left->shape->keys()[slot].object());
        if (other == kNoSlot ||
            !equal(left->kinds()[slot], left->payloads()[slot], right->kinds()[other], right->payloads()[other])) {
            return false;
        }
    }
    return true;
}

} // namespace

bool equalDictionaries(const DictionaryObject* left, const DictionaryObject* right) {
    if (left == right) {
        return true;
    }
    if (left == nullptr || right == nullptr) {
        return false;
    }
    if (left->shape != right->shape) {
        return equalWhateverTheOrder(left, right);
    }
    return equalBlocks(left->kinds(), left->payloads(), right->kinds(), right->payloads(), left->size);
}

void destroy(ValueKind kind, std::uint64_t payload) {
    switch (kind) {
    case ValueKind::Array:
        destroyContainer(objectOf<ArrayObject>(payload));
        return;
    case ValueKind::Dictionary: {
        auto* object = objectOf<DictionaryObject>(payload);
        releaseShape(object->shape);
        destroyContainer(object);
        return;
    }
    default: {
        auto* object = objectOf<BytesObject>(payload);
        const std::size_t bytes = sizeof(BytesObject) + paddedBytes(object->size);
        object->~BytesObject();
        ::operator delete(object, bytes);
        return;
    }
    }
}

bool equal(ValueKind leftKind, std::uint64_t left, ValueKind rightKind, std::uint64_t right) {
    if (leftKind != rightKind) {
        return isReal(leftKind) && isReal(rightKind) &&
               sameReal(std::bit_cast<double>(left), std::bit_cast<double>(right));
    }
    if (left == right) {
        return true;
    }
    switch (leftKind) {
    case ValueKind::Real:
    case ValueKind::Real32:
    case ValueKind::Date:
        return sameReal(std::bit_cast<double>(left), std::bit_cast<double>(right));
    case ValueKind::String:
    case ValueKind::Data:
        return equalBytes(left, right);
    case ValueKind::Array:
        return equalArrays(objectOf<const ArrayObject>(left), objectOf<const ArrayObject>(right));
    case ValueKind::Dictionary:
        return equalDictionaries(objectOf<const DictionaryObject>(left), objectOf<const DictionaryObject>(right));
    default:
        return false;
    }
}

} // namespace detail

namespace {

/// Those of keys that hardly any other dictionary has; the caches of a few threads may refer to them as well.
std::size_t bytesOfOwnKeys(const detail::ShapeObject* shape) {
    constexpr std::uint32_t kFew = 16;
    return shape->references.load(std::memory_order_relaxed) <= kFew ? shape->bytes : 0;
}

template <class Container>
std::size_t memoryOfContainer(const Container* object) {
    if (object == nullptr) {
        return 0;
    }
    std::size_t bytes = sizeof(Container) + detail::blockBytes(object->size);
    detail::forEachReference(object->kinds(), object->size, [object, &bytes](std::uint32_t slot) {
        bytes += detail::memoryOf(object->kinds()[slot], object->payloads()[slot]);
    });
    if constexpr (std::is_same_v<Container, detail::DictionaryObject>) {
        bytes += bytesOfOwnKeys(object->shape);
    }
    return bytes;
}

} // namespace

std::size_t detail::memoryOf(ValueKind kind, std::uint64_t payload) {
    switch (kind) {
    case ValueKind::String:
    case ValueKind::Data: {
        const auto* object = objectOf<const BytesObject>(payload);
        return object == nullptr ? 0 : sizeof(BytesObject) + paddedBytes(object->size);
    }
    case ValueKind::Array:
        return memoryOfContainer(objectOf<const ArrayObject>(payload));
    case ValueKind::Dictionary:
        return memoryOfContainer(objectOf<const DictionaryObject>(payload));
    default:
        return 0;
    }
}

Array ValueRef::array() const {
    expect(ValueKind::Array);
    auto* object = detail::objectOf<detail::ArrayObject>(payload_);
    detail::retain(object);
    return Array(object);
}

Dictionary ValueRef::dictionary() const {
    expect(ValueKind::Dictionary);
    auto* object = detail::objectOf<detail::DictionaryObject>(payload_);
    detail::retain(object);
    return Dictionary(object);
}

double ValueRef::doubleValue(double otherwise) const {
    switch (kind_) {
    case ValueKind::Boolean:
    case ValueKind::Unsigned:
        return static_cast<double>(payload_);
    case ValueKind::Integer:
        return static_cast<double>(integer());
    case ValueKind::Real:
    case ValueKind::Real32:
        return real();
    default:
        return otherwise;
    }
}

bool ValueRef::booleanValue(bool otherwise) const {
    if (!isNumber()) {
        return otherwise;
    }
    return kind_ == ValueKind::Real || kind_ == ValueKind::Real32 ? real() != 0 : payload_ != 0;
}

std::int64_t ValueRef::integerValue(std::int64_t otherwise) const {
    constexpr auto kSmallest = std::numeric_limits<std::int64_t>::min();
    constexpr auto kLargest = std::numeric_limits<std::int64_t>::max();
    switch (kind_) {
    case ValueKind::Boolean:
    case ValueKind::Integer:
        return static_cast<std::int64_t>(payload_);
    case ValueKind::Unsigned:
        return kLargest;
    case ValueKind::Real:
    case ValueKind::Real32: {
        const double number = real();
        if (std::isnan(number)) {
            return 0;
        }
        if (number >= 0x1p63) {
            return kLargest;
        }
        return number < -0x1p63 ? kSmallest : static_cast<std::int64_t>(number);
    }
    default:
        return otherwise;
    }
}

namespace {

// Numbers that are no reals: the sign and the magnitude's 64 bits say all.
bool isBelowZero(ValueRef number) { return number.kind() == ValueKind::Integer && number.integer() < 0; }

bool realEqualsInteger(double real, ValueRef number) {
    if (real != std::trunc(real)) {
        return false; // also what is not a number
    }
    if (number.kind() == ValueKind::Unsigned) {
        return real >= 0 && real < 0x1p64 && static_cast<std::uint64_t>(real) == number.unsignedInteger();
    }
    return real >= -0x1p63 && real < 0x1p63 && static_cast<std::int64_t>(real) == number.integerValue();
}

bool isRealNumber(ValueRef value) { return value.kind() == ValueKind::Real || value.kind() == ValueKind::Real32; }

} // namespace

bool numericallyEqual(ValueRef left, ValueRef right) {
    if (!left.isNumber() || !right.isNumber()) {
        return false;
    }
    if (isRealNumber(left) && isRealNumber(right)) {
        return left.real() == right.real();
    }
    if (isRealNumber(left)) {
        return realEqualsInteger(left.real(), right);
    }
    if (isRealNumber(right)) {
        return realEqualsInteger(right.real(), left);
    }
    const bool oneIsUnsigned = left.kind() == ValueKind::Unsigned || right.kind() == ValueKind::Unsigned;
    if (oneIsUnsigned && left.kind() != right.kind()) {
        return false; // what is kept as unsigned lies above every other integer
    }
    if (oneIsUnsigned) {
        return left.unsignedInteger() == right.unsignedInteger();
    }
    return isBelowZero(left) == isBelowZero(right) && left.integerValue() == right.integerValue();
}

} // namespace vela
