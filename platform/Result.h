// A value or the reason why there is none, for operations on outside data and the operating system.
#pragma once

#include <cassert>
#include <string>
#include <utility>
#include <variant>

namespace vela::platform {

/// Why an operation failed.
struct Failure {
    int code = 0;            ///< the operating system's error number, or 0 where it has none
    std::string description; ///< for a person: what failed, where, and which limit was passed
};

template <class Type>
class [[nodiscard]] Result {
public:
    Result(Type value) : content_(std::in_place_index<0>, std::move(value)) {}
    Result(Failure failure) : content_(std::in_place_index<1>, std::move(failure)) {}

    explicit operator bool() const { return content_.index() == 0; }
    const Type& operator*() const& { return value(); }
    Type&& operator*() && { return std::move(value()); }
    const Type* operator->() const { return &value(); }

    // What is asked for must be there: in a release build anything else ends the program.
    const Failure& failure() const noexcept {
        assert(content_.index() == 1);
        return std::get<1>(content_);
    }

private:
    const Type& value() const noexcept {
        assert(content_.index() == 0);
        return std::get<0>(content_);
    }
    Type& value() noexcept {
        assert(content_.index() == 0);
        return std::get<0>(content_);
    }

    std::variant<Type, Failure> content_;
};

/// What an operation without a value answers when it worked.
struct Done {};

} // namespace vela::platform
