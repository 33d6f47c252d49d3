// SPDX-License-Identifier: Apache-2.0
// Shared ownership of immutable objects, one pointer wide.
//
// Strings, arrays and dictionaries are shared by every value that holds them: copying a value is
// one atomic increment. `std::shared_ptr` would be two pointers wide with a second allocation, and the service copies
// nothing as often as values.
#pragma once

#include <atomic>
#include <cstdint>
#include <utility>

namespace foundation {

// The count that every shared object starts with. Objects begin with one owner.
class ReferenceCounted {
public:
    ReferenceCounted() = default;
    ReferenceCounted(const ReferenceCounted&) = delete;
    ReferenceCounted& operator=(const ReferenceCounted&) = delete;

    void retain() const noexcept { owners_.fetch_add(1, std::memory_order_relaxed); }

    // True if this was the last owner, and the object must be destroyed.
    [[nodiscard]] bool release() const noexcept { return owners_.fetch_sub(1, std::memory_order_acq_rel) == 1; }

private:
    mutable std::atomic<std::uint32_t> owners_{1};
};

// An owning pointer to a `ReferenceCounted` object that knows how to `destroy` itself. Any thread.
template <typename Object> class Reference {
public:
    constexpr Reference() noexcept = default;

    // Takes over the first owner of a new object; null gives an empty reference.
    static Reference adopt(const Object* object) noexcept
    {
        Reference reference;
        reference.object_ = object;
        return reference;
    }

    Reference(const Reference& other) noexcept : object_(other.object_)
    {
        if (object_ != nullptr)
            object_->retain();
    }
    Reference(Reference&& other) noexcept : object_(std::exchange(other.object_, nullptr)) { }
    Reference& operator=(Reference other) noexcept
    {
        std::swap(object_, other.object_);
        return *this;
    }
    ~Reference()
    {
        if (object_ != nullptr && object_->release())
            Object::destroy(object_);
    }

    [[nodiscard]] const Object* get() const noexcept { return object_; }
    const Object& operator*() const noexcept { return *object_; }
    const Object* operator->() const noexcept { return object_; }
    explicit operator bool() const noexcept { return object_ != nullptr; }

    // Gives up the ownership; the caller must `adopt` the object again.
    [[nodiscard]] const Object* leak() noexcept { return std::exchange(object_, nullptr); }

private:
    const Object* object_ = nullptr;
};

} // namespace foundation
