// SPDX-License-Identifier: Apache-2.0
// The names of events, each kept once: a kind is the one or two names of a message.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <unordered_map>

namespace platform {

// One thread at a time.
class EventKinds {
public:
    [[nodiscard]] static StoreExpected<EventKinds> open(SqliteConnection& connection);

    // The ID of the names; those that are new are kept with the running transaction. No second name: empty.
    [[nodiscard]] StoreExpected<std::int64_t> idOf(std::string_view name, std::string_view secondName);
    // Forgets what it looked up, because a transaction was dropped.
    void rolledBack() { ids_.clear(); }

private:
    struct Names {
        std::string name;
        std::string secondName;
    };
    struct NamesView {
        std::string_view name;
        std::string_view secondName;
        NamesView(std::string_view first, std::string_view second) : name(first), secondName(second) { }
        NamesView(const Names& names) : name(names.name), secondName(names.secondName) { }
    };
    struct Hash {
        using is_transparent = void;
        std::size_t operator()(const NamesView& names) const noexcept
        {
            constexpr std::hash<std::string_view> hash;
            return hash(names.name) * 31 + hash(names.secondName);
        }
    };
    struct Equal {
        using is_transparent = void;
        bool operator()(const NamesView& left, const NamesView& right) const noexcept
        {
            return left.name == right.name && left.secondName == right.secondName;
        }
    };

    [[nodiscard]] StoreExpected<std::int64_t> lookUp(std::string_view name, std::string_view secondName) const;

    SqliteStatement select_;
    SqliteStatement insert_;
    std::unordered_map<Names, std::int64_t, Hash, Equal> ids_; // as many as there are kinds of messages
};

} // namespace platform
