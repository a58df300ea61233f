// A move-only callable with room for its captures inside it: what work items, completions and handlers are made of.
// Callables of up to 48 bytes that move without throwing are kept in place; larger ones are allocated once.
// Not thread-safe: one owner at a time.
#pragma once

#include <cassert>
#include <cstddef>
#include <functional>
#include <new>
#include <type_traits>
#include <utility>

namespace vela::platform {

template <class Signature>
class UniqueFunction;

template <class Result, class... Arguments>
class UniqueFunction<Result(Arguments...)> {
public:
    UniqueFunction() = default;
    UniqueFunction(std::nullptr_t) {}

    template <class Callable,
              class = std::enable_if_t<!std::is_same_v<std::decay_t<Callable>, UniqueFunction> &&
                                       std::is_invocable_r_v<Result, std::decay_t<Callable>&, Arguments...>>>
    UniqueFunction(Callable&& callable) {
        using Stored = std::decay_t<Callable>;
        if constexpr (fitsInPlace<Stored>()) {
            ::new (static_cast<void*>(storage_)) Stored(std::forward<Callable>(callable));
            operations_ = &kInPlaceOperations<Stored>;
        } else {
            ::new (static_cast<void*>(storage_)) Stored*(new Stored(std::forward<Callable>(callable)));
            operations_ = &kAllocatedOperations<Stored>;
        }
    }

    UniqueFunction(UniqueFunction&& other) noexcept { take(other); }
    UniqueFunction& operator=(UniqueFunction&& other) noexcept {
        if (this != &other) {
            reset();
            take(other);
        }
        return *this;
    }
    UniqueFunction(const UniqueFunction&) = delete;
    UniqueFunction& operator=(const UniqueFunction&) = delete;
    ~UniqueFunction() { reset(); }

    explicit operator bool() const { return operations_ != nullptr; }

    /// Calls the callable, which must be there.
    Result operator()(Arguments... arguments) {
        assert(operations_ != nullptr);
        return operations_->call(storage_, std::forward<Arguments>(arguments)...);
    }

    /// Destroys the callable and what it captured.
    void reset() {
        if (operations_ != nullptr) {
            std::exchange(operations_, nullptr)->destroy(storage_);
        }
    }

private:
    static constexpr std::size_t kInPlaceBytes = 48;

    struct Operations {
        Result (*call)(void*, Arguments&&...);
        void (*moveAndDestroy)(void* from, void* to) noexcept;
        void (*destroy)(void*) noexcept;
    };

    template <class Stored>
    static constexpr bool fitsInPlace() {
        constexpr std::size_t kBytes = sizeof(Stored);
        return kBytes <= kInPlaceBytes && alignof(Stored) <= alignof(std::max_align_t) &&
               std::is_nothrow_move_constructible_v<Stored>;
    }

    template <class Stored>
    static Result invoke(Stored& callable, Arguments&&... arguments) {
        if constexpr (std::is_void_v<Result>) {
            std::invoke(callable, std::forward<Arguments>(arguments)...);
        } else {
            return std::invoke(callable, std::forward<Arguments>(arguments)...);
        }
    }

    template <class Stored>
    static constexpr Operations kInPlaceOperations = {
        [](void* storage, Arguments&&... arguments) -> Result {
            return invoke(*static_cast<Stored*>(storage), std::forward<Arguments>(arguments)...);
        },
        [](void* from, void* to) noexcept {
            ::new (to) Stored(std::move(*static_cast<Stored*>(from)));
            static_cast<Stored*>(from)->~Stored();
        },
        [](void* storage) noexcept { static_cast<Stored*>(storage)->~Stored(); },
    };

    template <class Stored>
    static constexpr Operations kAllocatedOperations = {
        [](void* storage, Arguments&&... arguments) -> Result {
            return invoke(**static_cast<Stored**>(storage), std::forward<Arguments>(arguments)...);
        },
        [](void* from, void* to) noexcept { ::new (to) Stored*(*static_cast<Stored**>(from)); },
        [](void* storage) noexcept { delete *static_cast<Stored**>(storage); },
    };

    void take(UniqueFunction& other) noexcept {
        operations_ = std::exchange(other.operations_, nullptr);
        if (operations_ != nullptr) {
            operations_->moveAndDestroy(other.storage_, storage_);
        }
    }

    const Operations* operations_ = nullptr;
    alignas(std::max_align_t) std::byte storage_[kInPlaceBytes];
};

} // namespace vela::platform
