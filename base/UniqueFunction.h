#pragma once

#include <cstddef>
#include <new>
#include <type_traits>
#include <utility>

namespace tamblo {

template <typename Signature, std::size_t InlineBytes = 48> class UniqueFunction;

/// A callable that is moved, never copied, and may hold what cannot be copied. A target of up to
/// `InlineBytes` bytes lies in the object itself, so that queueing work allocates nothing. Calling an empty
/// one is a fault; test it first. A call does not consume the target.
template <typename Result, typename... Arguments, std::size_t InlineBytes>
class UniqueFunction<Result(Arguments...), InlineBytes> {
public:
    UniqueFunction() noexcept = default;
    UniqueFunction(std::nullptr_t) noexcept {}

    template <typename Target>
        requires(!std::is_same_v<std::remove_cvref_t<Target>, UniqueFunction> &&
                 std::is_invocable_r_v<Result, std::remove_cvref_t<Target>&, Arguments...>)
    UniqueFunction(Target&& target) {
        using Stored = std::remove_cvref_t<Target>;
        if constexpr (fits<Stored>) {
            new (storage_) Stored(std::forward<Target>(target));
            operations_ = &inlineOperations<Stored>;
        } else {
            new (storage_) Stored*(new Stored(std::forward<Target>(target)));
            operations_ = &heapOperations<Stored>;
        }
    }

    UniqueFunction(UniqueFunction&& other) noexcept { takeFrom(other); }
    UniqueFunction& operator=(UniqueFunction&& other) noexcept {
        if (this != &other) {
            reset();
            takeFrom(other);
        }
        return *this;
    }
    ~UniqueFunction() { reset(); }

    explicit operator bool() const noexcept { return operations_ != nullptr; }
    Result operator()(Arguments... arguments) {
        return operations_->call(storage_, std::forward<Arguments>(arguments)...);
    }
    void reset() noexcept {
        if (operations_ != nullptr) {
            std::exchange(operations_, nullptr)->destroy(storage_);
        }
    }

private:
    struct Operations {
        Result (*call)(void*, Arguments...);
        void (*moveTo)(void* from, void* to) noexcept;
        void (*destroy)(void*) noexcept;
    };

    template <typename Stored>
    static constexpr bool
        fits = sizeof(Stored) <= InlineBytes &&
               alignof(Stored) <= alignof(std::max_align_t) && std::is_nothrow_move_constructible_v<Stored>;

    template <typename Stored>
    static constexpr Operations inlineOperations{
        [](void* storage, Arguments... arguments) -> Result {
            return static_cast<Result>(
                (*static_cast<Stored*>(storage))(std::forward<Arguments>(arguments)...));
        },
        [](void* from, void* to) noexcept {
            new (to) Stored(std::move(*static_cast<Stored*>(from)));
            static_cast<Stored*>(from)->~Stored();
        },
        [](void* storage) noexcept { static_cast<Stored*>(storage)->~Stored(); },
    };

    template <typename Stored>
    static constexpr Operations heapOperations{
        [](void* storage, Arguments... arguments) -> Result {
            return static_cast<Result>(
                (**static_cast<Stored**>(storage))(std::forward<Arguments>(arguments)...));
        },
        [](void* from, void* to) noexcept { new (to) Stored*(*static_cast<Stored**>(from)); },
        [](void* storage) noexcept { delete *static_cast<Stored**>(storage); },
    };

    void takeFrom(UniqueFunction& other) noexcept {
        operations_ = std::exchange(other.operations_, nullptr);
        if (operations_ != nullptr) {
            operations_->moveTo(other.storage_, storage_);
        }
    }

    alignas(std::max_align_t) std::byte storage_[InlineBytes];
    const Operations* operations_ = nullptr;
};

} // namespace tamblo
