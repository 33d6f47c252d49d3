// A number that remembers what kind of number it was, and compares by what it is worth.
//
// Clients send booleans, integers and floats of two widths. The kind decides how a number is
// written; the value alone decides whether two numbers are equal, so that a client which sends 1 where
// it sent true before has not said anything new.
#pragma once

#include <concepts>
#include <cstdint>
#include <optional>
#include <string>
#include <utility>

namespace foundation {

// Plain data, 16 bytes, immutable. Any thread.
class Number {
public:
    enum class Kind : std::uint8_t { Boolean, Signed64, Unsigned64, Float32, Float64 };

    constexpr Number() noexcept : Number(std::int64_t{0}) { }
    constexpr explicit Number(std::same_as<bool> auto value) noexcept : kind_(Kind::Boolean), signed_(value) { }
    constexpr explicit Number(std::signed_integral auto value) noexcept : kind_(Kind::Signed64), signed_(value) { }
    constexpr explicit Number(std::unsigned_integral auto value) noexcept
        requires(!std::same_as<decltype(value), bool>)
        : kind_(Kind::Unsigned64),
          unsigned_(value)
    {
    }
    constexpr explicit Number(float value) noexcept : kind_(Kind::Float32), float32_(value) { }
    constexpr explicit Number(double value) noexcept : kind_(Kind::Float64), float64_(value) { }

    [[nodiscard]] constexpr Kind kind() const noexcept { return kind_; }
    [[nodiscard]] constexpr bool isFloat() const noexcept { return kind_ >= Kind::Float32; }

    // False for zero, true for everything else (NaN too).
    [[nodiscard]] bool booleanValue() const noexcept;
    // Cut towards zero; what is out of range becomes the nearest end, NaN becomes 0.
    [[nodiscard]] std::int64_t int64Value() const noexcept;
    [[nodiscard]] double doubleValue() const noexcept;

    // The value as an integer of that type, when it is a whole number in its range and not a boolean.
    template <std::integral Integer> [[nodiscard]] std::optional<Integer> exactly() const noexcept;

    // Integers in decimal, booleans 1 and 0, floats the shortest decimal that reads back to the same
    // value of their kind.
    [[nodiscard]] std::string text() const;
    void appendText(std::string& out) const;

    // Equal when the two stand for exactly the same number: true, 1 and 1.0 are equal, 2^53 + 1 and
    // the double 2^53 are not, NaN equals nothing.
    friend bool operator==(const Number& left, const Number& right) noexcept;

private:
    friend class Value;

    Kind kind_;
    union {
        std::int64_t signed_; // booleans too
        std::uint64_t unsigned_;
        float float32_;
        double float64_;
    };
};

template <std::integral Integer> std::optional<Integer> Number::exactly() const noexcept
{
    const auto inRange = [](auto value) -> std::optional<Integer> {
        if (!std::in_range<Integer>(value))
            return std::nullopt;
        return static_cast<Integer>(value);
    };
    switch (kind_) {
    case Kind::Signed64: return inRange(signed_);
    case Kind::Unsigned64: return inRange(unsigned_);
    default: return std::nullopt;
    }
}

} // namespace foundation
