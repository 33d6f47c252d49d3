// SPDX-License-Identifier: Apache-2.0
// A number that keeps its kind, and compares by its value.
//
// Clients send booleans, integers and floats of two widths. The kind decides how a number is written; the value alone
// decides whether two numbers are equal, so that a client which sends first true and then 1 repeats itself.
#pragma once

#include <array>
#include <bit>
#include <concepts>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace foundation {

// Plain data, 16 bytes, immutable. Any thread.
class Number {
public:
    enum class Kind : std::uint8_t { Boolean, Signed64, Unsigned64, Float32, Float64 };

    constexpr Number() noexcept : Number(std::int64_t{0}) { }
    constexpr explicit Number(std::signed_integral auto value) noexcept : Number(Kind::Signed64, bitsOf(value)) { }
    constexpr explicit Number(std::unsigned_integral auto value) noexcept
        : Number(std::same_as<decltype(value), bool> ? Kind::Boolean : Kind::Unsigned64, value)
    {
    }
    constexpr explicit Number(float value) noexcept : Number(Kind::Float32, std::bit_cast<std::uint32_t>(value)) { }
    constexpr explicit Number(double value) noexcept : Number(Kind::Float64, std::bit_cast<std::uint64_t>(value)) { }

    [[nodiscard]] constexpr Kind kind() const noexcept { return kind_; }
    [[nodiscard]] constexpr bool isFloat() const noexcept { return kind_ >= Kind::Float32; }

    // False for zero, true for everything else (NaN too).
    [[nodiscard]] bool booleanValue() const noexcept;
    // Cut towards zero; a number out of range becomes the nearest end of the range, NaN becomes 0.
    [[nodiscard]] std::int64_t int64Value() const noexcept;
    [[nodiscard]] double doubleValue() const noexcept;

    // The value as an integer of that type, if the number is of an integer kind and in range.
    template <std::integral Integer> [[nodiscard]] std::optional<Integer> exactly() const noexcept;

    // Integers in decimal, booleans 1 and 0, floats the shortest decimal that reads back to the same
    // value of their kind.
    [[nodiscard]] std::string text() const;
    // Appends the text to `out`.
    template <typename Out> void appendText(Out& out) const;

    // Equal when the two stand for exactly the same number: true, 1 and 1.0 are equal, 2^53 + 1 and
    // the double 2^53 are not, and NaN does not equal anything.
    friend bool operator==(const Number& left, const Number& right) noexcept;

private:
    friend class Value;

    static constexpr std::size_t longestText = 32;
    // Writes the text to `out`, which has room for the longest text, and returns its end.
    char* writeText(char* out) const;

    constexpr Number(Kind kind, std::uint64_t bits) noexcept : kind_(kind), bits_(bits) { }
    static constexpr std::uint64_t bitsOf(std::int64_t value) noexcept { return static_cast<std::uint64_t>(value); }
    [[nodiscard]] constexpr std::int64_t signedBits() const noexcept { return static_cast<std::int64_t>(bits_); }

    Kind kind_;
    std::uint64_t bits_; // of the integer in two's complement, or of the float of either width
};

inline bool Number::booleanValue() const noexcept
{
    return isFloat() ? doubleValue() != 0 : bits_ != 0;
}

inline double Number::doubleValue() const noexcept
{
    switch (kind_) {
    case Kind::Float32: return std::bit_cast<float>(static_cast<std::uint32_t>(bits_));
    case Kind::Float64: return std::bit_cast<double>(bits_);
    case Kind::Unsigned64: return static_cast<double>(bits_);
    default: return static_cast<double>(signedBits());
    }
}

template <std::integral Integer> std::optional<Integer> Number::exactly() const noexcept
{
    const auto inRange = [](auto value) -> std::optional<Integer> {
        if (!std::in_range<Integer>(value))
            return std::nullopt;
        return static_cast<Integer>(value);
    };
    switch (kind_) {
    case Kind::Signed64: return inRange(signedBits());
    case Kind::Unsigned64: return inRange(bits_);
    default: return std::nullopt;
    }
}

template <typename Out> void Number::appendText(Out& out) const
{
    std::array<char, longestText> text;
    out.append(std::string_view(text.data(), writeText(text.data())));
}

} // namespace foundation
